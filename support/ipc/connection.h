// Thread safety: every member may be called from any thread. Handlers run later, on the global
// concurrent queue, never from within the call that set them off.
//
// A connection to a service and the proxies made from it. The daemon's own code knows connections
// only by these interfaces; sd-bus stands behind them in production, an in-process peer in the
// simulation.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "support/ipc/arguments.h"

namespace spacekeep::ipc {

/// Why a call or a connection failed, in words for a person.
struct Error {
  std::string name;  ///< D-Bus error name
  std::string text;
};

/// Calls the remote object. For each call exactly one of two things happens: `reply` runs once with
/// the described out-arguments, or the proxy's error handler runs (once per failed call).
class RemoteProxy {
 public:
  using ReplyHandler = std::function<void(Arguments)>;
  using ErrorHandler = std::function<void(const Error&)>;

  virtual ~RemoteProxy() = default;
  /// Waits for the answer without any time limit.
  virtual void call(std::string_view member, Arguments arguments, ReplyHandler reply) = 0;
};

class Connection {
 public:
  using Handler = std::function<void()>;

  virtual ~Connection() = default;

  // Set-up, before resume().
  /// The connection ended for good while its peer's process lives, or by invalidate().
  virtual void setInvalidationHandler(Handler handler) = 0;
  /// The peer's process has died.
  virtual void setInterruptionHandler(Handler handler) = 0;
  virtual void setRemoteInterface(const InterfaceDescription& interface) = 0;
  /// Starts the traffic; calls made before are held until then.
  virtual void resume() = 0;

  /// `on_error` gets every failure of a call made through this proxy, including calls made after
  /// the connection has ended.
  [[nodiscard]] virtual std::shared_ptr<RemoteProxy> remoteProxy(
      RemoteProxy::ErrorHandler on_error) = 0;

  /// Ends the connection. Pending calls fail. The second call does nothing.
  virtual void invalidate() = 0;
  /// Every further call fails. True some time before the handler runs.
  [[nodiscard]] virtual bool ended() const = 0;
};

/// Makes connections to services.
class Connector {
 public:
  virtual ~Connector() = default;
  /// From the descriptor that a service passed at check-in. Not resumed. Never null: a descriptor
  /// that is unusable gives a connection whose calls fail.
  [[nodiscard]] virtual std::shared_ptr<Connection> connectionFromEndpoint(
      SharedDescriptor endpoint) = 0;
  /// The connection to a service that is declared by a descriptor file, opened on first use, shared
  /// and resumed. Null when the ID is no safe file name or nobody listens.
  [[nodiscard]] virtual std::shared_ptr<Connection> connectionToDeclared(
      const std::string& service_id, const InterfaceDescription& interface) = 0;
};

}  // namespace spacekeep::ipc
