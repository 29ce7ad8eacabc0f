// Thread safety: confined to the IPC thread.
//
// Everybody who calls over one connection to a bus. A unique name is never given to anybody else while
// the bus runs, so who it belongs to is asked once and remembered as long as there is room.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "support/ipc/linux/broker_link.h"
#include "support/ipc/linux/bus_caller.h"
#include "support/ipc/linux/held_calls.h"
#include "support/ipc/linux/server_context.h"

namespace spacekeep::ipc {

class BusCallers {
 public:
  BusCallers(std::shared_ptr<ServerContext> context, BrokerLink& link);
  ~BusCallers() { clear(); }
  BusCallers(const BusCallers&) = delete;
  BusCallers& operator=(const BusCallers&) = delete;

  void take(sd_bus_message* call, std::size_t bytes);
  /// Answers a call that was not read.
  void tellLeftOut(const LeftOut& message);
  void clear();
  /// Those remembered.
  [[nodiscard]] std::size_t size() const { return callers_.size(); }

 private:
  using Callers = std::map<std::string, std::shared_ptr<BusCaller>, std::less<>>;

  void lookUp(const std::string& name, sd_bus_message* call, std::size_t bytes);
  void found(const std::string& name, sd_bus_message* answer);
  void refuse(sd_bus_message* call, const char* error_name, const std::string& text);
  void refuseAll(HeldCalls calls, const char* error_name, const std::string& text);
  bool makeRoom(uid_t uid);
  bool forgetIdle(const std::function<bool(const BusCaller&)>& may_be_forgotten);

  const std::shared_ptr<ServerContext> context_;
  BrokerLink& link_;
  HeldBudget budget_;
  Callers callers_;
  std::map<std::string, HeldCalls, std::less<>> unknown_;  // until the broker has told who they are
  std::size_t unknown_bytes_ = 0;
  std::uint64_t uses_ = 0;
};

}  // namespace spacekeep::ipc
