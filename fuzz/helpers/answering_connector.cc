#include "fuzz/helpers/answering_connector.h"

#include <cstdint>
#include <utility>

#include "fuzz/helpers/promises.h"
#include "registry/service_protocol.h"

namespace spacekeep::fuzz {
namespace {

// Not sooner: a service that is asked again at once, whatever it says, would never let time pass.
constexpr std::uint64_t kLeastDelayNs = 100'000'000;

class AnsweringConnection final : public ipc::Connection {
 public:
  explicit AnsweringConnection(AnsweringConnector& services) : services_(services) {}

  void setInvalidationHandler(Handler) override {}
  void setInterruptionHandler(Handler) override {}
  void setRemoteInterface(const ipc::InterfaceDescription&) override {}
  void resume() override {}
  void invalidate() override {}
  [[nodiscard]] bool ended() const override { return false; }
  std::shared_ptr<ipc::RemoteProxy> remoteProxy(ipc::RemoteProxy::ErrorHandler on_error) override {
    return std::make_shared<Proxy>(services_, std::move(on_error));
  }

 private:
  class Proxy final : public ipc::RemoteProxy {
   public:
    Proxy(AnsweringConnector& services, ErrorHandler on_error)
        : services_(services), on_error_(std::move(on_error)) {}
    void call(std::string_view member, ipc::Arguments arguments, ReplyHandler reply) override {
      const ipc::MethodDescription* method = spacekeepServiceInterface().method(member);
      require(method != nullptr, "only what services have is called");
      require(ipc::matches(method->in, arguments), "services are given what they expect");
      services_.receive(*method, std::move(reply), on_error_);
    }

   private:
    AnsweringConnector& services_;
    const ErrorHandler on_error_;
  };

  AnsweringConnector& services_;
};

}  // namespace

std::shared_ptr<ipc::Connection> AnsweringConnector::connectionFromEndpoint(ipc::SharedDescriptor) {
  return std::make_shared<AnsweringConnection>(*this);
}

std::shared_ptr<ipc::Connection> AnsweringConnector::connectionToDeclared(
    const std::string&, const ipc::InterfaceDescription&) {
  return input_.byte() >= 240 ? nullptr : std::make_shared<AnsweringConnection>(*this);
}

void AnsweringConnector::receive(const ipc::MethodDescription& method,
                                 ipc::RemoteProxy::ReplyHandler reply,
                                 ipc::RemoteProxy::ErrorHandler on_error) {
  // The wait for a silent ping has no end, as it is meant to be.
  const std::uint8_t choice = method.name == "servicePing" ? std::uint8_t{0} : input_.byte();
  if (choice >= 240) {
    unanswered_.push_back(std::move(reply));
    return;
  }
  const std::uint64_t delay_ns = kLeastDelayNs + input_.byte() * std::uint64_t{30'000'000};
  if (choice >= 224) {
    world_.after(delay_ns, [on_error = std::move(on_error)] {
      if (on_error) on_error({"com.example.Error", "fuzzed"});
    });
    return;
  }
  if (choice % 4 == 1) world_.volumes().giveBack("/", input_.byte() * std::uint64_t{50'000});
  world_.after(delay_ns, [reply = std::move(reply), answer = answer(method)] { reply(answer); });
}

ipc::Arguments AnsweringConnector::answer(const ipc::MethodDescription& method) {
  if (method.out.empty()) return {};
  if (input_.byte() >= 224) return {ipc::OptionalDictionary()};
  Dictionary answer = input_.dictionary();
  const std::uint8_t amount = input_.byte();
  if (amount < 192) answer.set("SPACEKEEP_AMOUNT", amount * std::uint64_t{40'000});
  return {ipc::OptionalDictionary(std::move(answer))};
}

}  // namespace spacekeep::fuzz
