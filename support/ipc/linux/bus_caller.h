// Thread safety: confined to the IPC thread; other threads may hold weak references.
//
// One connection to the bus whose calls are served here. What it may not have served yet waits here,
// since everybody's calls come over one socket, which is read whatever this one does.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "support/ipc/linux/broker_link.h"
#include "support/ipc/linux/call_server.h"
#include "support/ipc/linux/held_calls.h"

namespace spacekeep::ipc {

class BusCaller final : public CallServer {
 public:
  /// `name`: its unique name on the bus. `link` and `budget` are good until end().
  BusCaller(std::shared_ptr<ServerContext> context, std::shared_ptr<AcceptedPeer> peer,
            std::string name, BrokerLink& link, HeldBudget& budget);
  ~BusCaller() override { end(); }

  /// Serves the call, now or when its user may go on; or refuses it.
  void take(sd_bus_message* call, std::size_t bytes);
  /// Nothing is served or answered any more.
  void end();
  /// Nothing of it waits or is at work.
  [[nodiscard]] bool isIdle() const { return held_.empty() && unanswered() == 0; }

  std::uint64_t last_use = 0;  ///< its owner's

 private:
  sd_bus* bus() override { return link_ == nullptr ? nullptr : link_->bus(); }
  void send(sd_bus_message* message, std::size_t bytes) override;
  [[nodiscard]] std::string answerProblem(std::size_t bytes) const override;
  [[nodiscard]] std::string methodProblem(const MethodDescription& method) const override;
  [[nodiscard]] const char* destination() const override { return name_.c_str(); }

  bool mustWait();
  void serveHeld();
  void serve(sd_bus_message* call, std::size_t bytes);
  [[nodiscard]] const std::string& refusal();

  const std::string name_;
  BrokerLink* link_;
  HeldBudget* budget_;
  HeldCalls held_;
  bool waiting_ = false;
  std::optional<std::string> refusal_;  // once it was asked; empty when there is none
};

/// What callers are told who want to pass a descriptor. `socket` may be empty.
[[nodiscard]] std::string useTheSocketInstead(const std::string& socket);

}  // namespace spacekeep::ipc
