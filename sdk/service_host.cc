#include <spacekeep/service.h>
#include <stdlib.h>

#include <functional>
#include <memory>
#include <utility>

#include "sdk/check_in_loop.h"
#include "sdk/engine.h"
#include "sdk/host_control.h"
#include "sdk/served_service.h"
#include "sdk/socket_loop.h"

namespace spacekeep::sdk {
namespace {

/// Whoever starts a service may put another daemon in front of it, which takes no word of the
/// program's own. Not so in a program with more rights than its starter (secure_getenv(3)).
std::string daemonSocketOf(const CheckInOptions& options) {
  const char* given = secure_getenv("SPACEKEEP_SOCKET");
  const bool left_open = options.socket_path == kDefaultSocketPath;
  return left_open && given != nullptr && *given != '\0' ? given : options.socket_path;
}

}  // namespace

class ServiceHost::Impl {
 public:
  using Serve = std::function<void(Impl&)>;

  Impl(std::shared_ptr<Service> service, const ServiceOptions& options)
      : control(std::make_shared<HostControl>(options.on_status)),
        served(
            std::make_shared<ServedService>(std::move(service), options.handlers, engine.queue)) {}
  ~Impl() {
    control->stop();
    if (supervisor_.joinable()) supervisor_.join();
    served->cancelAll();
    served->waitUntilIdle();  // a handler answers through the engine
  }
  Impl(const Impl&) = delete;
  Impl& operator=(const Impl&) = delete;

  void start(Serve serve) {
    supervisor_ = rt::Thread("spacekeep-host", [this, serve = std::move(serve)] {
      serve(*this);
      control->report(HostState::kStopped);
      control->markEnded();
    });
  }

  Engine engine;
  const std::shared_ptr<HostControl> control;
  const std::shared_ptr<ServedService> served;

 private:
  rt::Thread supervisor_;
};

ServiceHost::ServiceHost(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
ServiceHost::ServiceHost(ServiceHost&&) noexcept = default;
ServiceHost& ServiceHost::operator=(ServiceHost&&) noexcept = default;
ServiceHost::~ServiceHost() = default;

Result<ServiceHost> ServiceHost::checkIn(std::string id, std::shared_ptr<Service> service,
                                         CheckInOptions options) {
  if (id.empty()) return Error{ErrorKind::kInvalidArgument, "a service needs an ID to check in"};
  if (!service) return Error{ErrorKind::kInvalidArgument, "there is no service to check in"};
  options.socket_path = daemonSocketOf(options);
  auto impl = std::make_unique<Impl>(std::move(service), options);
  impl->start([id = std::move(id), options = std::move(options)](Impl& self) {
    CheckInLoop(id, options, self.engine, self.control, self.served).run();
  });
  return ServiceHost(std::move(impl));
}

Result<ServiceHost> ServiceHost::serveSocket(std::shared_ptr<Service> service,
                                             SocketOptions options) {
  if (!service) return Error{ErrorKind::kInvalidArgument, "there is no service to serve"};
  auto listening = listeningSocket(options);
  if (!listening) return listening.error();
  auto impl = std::make_unique<Impl>(std::move(service), options);
  impl->start([socket = std::move(*listening), options = std::move(options)](Impl& self) {
    SocketLoop(socket, options, self.engine, self.control, self.served).run();
  });
  return ServiceHost(std::move(impl));
}

HostStatus ServiceHost::status() const { return impl_->control->status(); }
void ServiceHost::stop() { impl_->control->stop(); }
void ServiceHost::waitUntilStopped() { impl_->control->waitUntilEnded(); }

}  // namespace spacekeep::sdk
