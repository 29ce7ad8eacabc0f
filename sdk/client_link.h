// Thread safety: every member may be called from any thread.
//
// One connection to the daemon with its pending calls: every call ends exactly once, by an answer,
// a failure, its deadline or the end of the connection.
#pragma once

#include <spacekeep/client.h>

#include <functional>
#include <memory>
#include <string>
#include <variant>

#include "sdk/engine.h"
#include "support/ipc/connection.h"
#include "support/queues/waiting.h"

namespace spacekeep::sdk {

class ClientLink {
 public:
  using End = std::variant<ipc::Arguments, Error>;
  using EndHandler = std::function<void(End)>;

  [[nodiscard]] static Result<std::unique_ptr<ClientLink>> open(ClientOptions options);
  /// Ends the connection, and returns once the handler of every call has run.
  ~ClientLink();
  ClientLink(const ClientLink&) = delete;
  ClientLink& operator=(const ClientLink&) = delete;

  [[nodiscard]] bool connected() const;
  /// `on_end` runs once, on a worker thread, later.
  void call(const std::string& member, ipc::Arguments arguments, Deadline deadline,
            EndHandler on_end);

 private:
  struct Shared;
  class Call;

  explicit ClientLink(ClientOptions options);

  Engine engine_;
  std::shared_ptr<Shared> shared_;
  std::shared_ptr<ipc::Connection> connection_;
};

}  // namespace spacekeep::sdk
