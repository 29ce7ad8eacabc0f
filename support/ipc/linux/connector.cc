#include "support/ipc/linux/connector.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <utility>

#include "support/ipc/linux/connection_core.h"
#include "support/ipc/linux/sockets.h"
#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

constexpr std::size_t kMaxServiceIdBytes = 64;

/// What callers hold. The core itself is given up on the IPC thread.
class BusConnection final : public Connection, public std::enable_shared_from_this<BusConnection> {
 public:
  BusConnection(IpcLoop& loop, ConcurrentQueue& global, SharedDescriptor descriptor,
                const ConnectionLimits& limits)
      : inbox_(loop.inbox()),
        core_(std::make_shared<ConnectionCore>(loop, global, std::move(descriptor), limits)) {}
  ~BusConnection() override {
    inbox_->post([core = std::move(core_)] { core->abandon(); });
  }

  void setInvalidationHandler(Handler handler) override {
    core_->setInvalidationHandler(std::move(handler));
  }
  void setInterruptionHandler(Handler handler) override {
    core_->setInterruptionHandler(std::move(handler));
  }
  void setRemoteInterface(const InterfaceDescription& interface) override {
    core_->setRemoteInterface(interface);
  }
  void resume() override { core_->resume(); }
  void invalidate() override { core_->invalidate(); }
  [[nodiscard]] bool ended() const override { return core_->ended(); }
  std::shared_ptr<RemoteProxy> remoteProxy(RemoteProxy::ErrorHandler on_error) override {
    return std::make_shared<Proxy>(shared_from_this(), std::move(on_error));
  }

 private:
  class Proxy final : public RemoteProxy {
   public:
    Proxy(std::shared_ptr<BusConnection> connection, ErrorHandler on_error)
        : connection_(std::move(connection)),
          on_error_(std::make_shared<const ErrorHandler>(std::move(on_error))) {}
    void call(std::string_view member, Arguments arguments, ReplyHandler reply) override {
      connection_->core_->call(member, std::move(arguments), std::move(reply), on_error_);
    }

   private:
    const std::shared_ptr<BusConnection> connection_;
    const ConnectionCore::SharedErrorHandler on_error_;
  };

  const std::shared_ptr<IpcLoop::Inbox> inbox_;
  std::shared_ptr<ConnectionCore> core_;
};

bool isSafeCharacter(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '.' ||
         c == '_' || c == '-';
}

/// What speaks against trusting the sockets in the directory, empty when nothing.
std::string directoryProblem(const std::string& directory) {
  struct stat status {};
  if (::lstat(directory.c_str(), &status) != 0) return std::strerror(errno);
  if (!S_ISDIR(status.st_mode)) return "it is not a directory";
  if (status.st_uid != 0 && status.st_uid != ::geteuid()) return "it belongs to another user";
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) return "others may write to it";
  return "";
}

}  // namespace

/// Shared with the handlers of the connections, which may run after the connector is gone.
struct LinuxConnector::Declared {
  rt::Mutex mutex;
  std::map<std::string, std::shared_ptr<Connection>> connections;  // protected by mutex

  void drop(const std::string& service_id, const Connection* ended) {
    std::shared_ptr<Connection> dropped;  // destroyed without the lock
    const std::scoped_lock lock(mutex);
    const auto found = connections.find(service_id);
    if (found == connections.end() || found->second.get() != ended) return;
    dropped = std::move(found->second);
    connections.erase(found);
  }
};

std::shared_ptr<Connection> connectionFromDescriptor(IpcLoop& loop, ConcurrentQueue& global,
                                                     SharedDescriptor descriptor,
                                                     ConnectionLimits limits) {
  return std::make_shared<BusConnection>(loop, global, std::move(descriptor), limits);
}

std::shared_ptr<Connection> connectToPath(IpcLoop& loop, ConcurrentQueue& global,
                                          const std::string& path, std::string& why,
                                          ConnectionLimits limits) {
  SharedDescriptor connected = connectSocket(path, why);
  if (connected == nullptr) return nullptr;
  return connectionFromDescriptor(loop, global, std::move(connected), limits);
}

std::string declaredSocketName(const std::string& service_id) {
  const bool safe = !service_id.empty() && service_id.size() <= kMaxServiceIdBytes &&
                    service_id.front() != '.' &&
                    std::all_of(service_id.begin(), service_id.end(), isSafeCharacter);
  return safe ? service_id + ".sock" : "";
}

LinuxConnector::LinuxConnector(IpcLoop& loop, ConcurrentQueue& global,
                               std::string services_directory, ConnectionLimits limits)
    : loop_(loop),
      global_(global),
      services_directory_(std::move(services_directory)),
      limits_(limits),
      declared_(std::make_shared<Declared>()) {}

LinuxConnector::~LinuxConnector() = default;

std::shared_ptr<Connection> LinuxConnector::connectionFromEndpoint(SharedDescriptor endpoint) {
  return connectionFromDescriptor(loop_, global_, std::move(endpoint), limits_);
}

std::shared_ptr<Connection> LinuxConnector::connectionToDeclared(
    const std::string& service_id, const InterfaceDescription& interface) {
  constexpr const char* kOperation = "connectionToDeclared";
  const std::string name = declaredSocketName(service_id);
  if (name.empty()) {
    logProblem("%s \"%@\" is no safe file name, so it has no socket", kOperation, service_id);
    return nullptr;
  }
  std::shared_ptr<Connection> dropped;  // destroyed without the lock
  const std::scoped_lock lock(declared_->mutex);
  if (const auto open = declared_->connections.find(service_id);
      open != declared_->connections.end()) {
    if (!open->second->ended()) return open->second;
    // A service that ends when it is idle is started again by a new connection.
    dropped = std::move(open->second);
    declared_->connections.erase(open);
  }
  if (const std::string wrong = directoryProblem(services_directory_); !wrong.empty()) {
    logProblem("%s The directory %@ cannot be trusted: %@", kOperation, services_directory_, wrong);
    return nullptr;
  }
  std::string why;
  auto connection = connectToPath(loop_, global_, services_directory_ + "/" + name, why, limits_);
  if (connection == nullptr) {
    logProblem("%s %@", kOperation, why);
    return nullptr;
  }
  const auto drop = [declared = std::weak_ptr(declared_), service_id, ended = connection.get()] {
    if (const auto alive = declared.lock()) alive->drop(service_id, ended);
  };
  connection->setInvalidationHandler(drop);
  connection->setInterruptionHandler(drop);
  connection->setRemoteInterface(interface);
  connection->resume();
  declared_->connections.emplace(service_id, connection);
  return connection;
}

}  // namespace spacekeep::ipc
