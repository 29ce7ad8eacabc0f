// Thread safety: descriptions are constant once a listener was made from them; PeerConnection is
// immutable.
//
// What a process serves on its connections: for each method a handler, and on what thread it runs.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/arguments.h"
#include "support/ipc/connection.h"

namespace spacekeep::access {
class PeerIdentity;
}

namespace spacekeep::ipc {

/// The accepted connection on which a call arrived.
class PeerConnection {
 public:
  virtual ~PeerConnection() = default;
  [[nodiscard]] virtual const access::PeerIdentity& identity() const = 0;
};

/// The connection of the call that the running thread serves; null outside of a handler.
[[nodiscard]] PeerConnection* currentConnection();

/// Sets currentConnection() for its scope.
class ServingScope {
 public:
  explicit ServingScope(PeerConnection* connection);
  ~ServingScope();
  ServingScope(const ServingScope&) = delete;
  ServingScope& operator=(const ServingScope&) = delete;

 private:
  void* previous_;
};

/// Answers one call, from any thread, at most once. Dropped without an answer, the caller gets
/// none.
struct Responder {
  std::function<void(Arguments)> reply;
  std::function<void(const Error&)> fail;
};

enum class ServeMode {
  kInOrder,  ///< one after another per connection, in order of arrival: for handlers that only
             ///< enqueue
  kLane,  ///< side by side on the global queue, at most `lane_width` of one lane at once, the rest
          ///< waiting in order of arrival: for handlers that block
};

struct ServedMethod {
  std::string_view name;
  ServeMode mode = ServeMode::kInOrder;
  std::string_view lane;  ///< lanes are shared by name
  std::size_t lane_width = 64;
  /// Served by the thread that reads the messages: for handlers that are over in microseconds
  /// unless they have to wait for a queue.
  bool brief = false;
  /// Of all calls of one user that say so, one is served at a time, until it is answered: for work
  /// that goes through one queue of the process, so that no user's backlog holds up another user.
  bool turn_per_user = false;
  std::function<void(Arguments, Responder)> serve;
};

struct ServedInterface {
  const InterfaceDescription* description = nullptr;
  std::vector<ServedMethod> methods;  ///< one per described method, those beside it included
};

/// What is wrong with it, empty when each described method has exactly one usable handler.
[[nodiscard]] std::string problemOf(const ServedInterface& interface);

/// Accepts connections of entitled peers and serves an interface on them.
class Listener {
 public:
  virtual ~Listener() = default;
  /// Peers without this entitlement are refused when they connect. Before resume().
  virtual void setRequiredEntitlement(std::string entitlement) = 0;
  virtual void resume() = 0;
};

}  // namespace spacekeep::ipc
