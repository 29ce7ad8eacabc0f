// Thread safety: confined to the IPC thread.
//
// The server on a message bus, for programs that expect it there under a name: the same interface, to
// the same rights and within the same limits as on its socket. Where there is no bus, or it goes away,
// this waits for one to appear; that costs nothing, and nothing else depends on it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "support/ipc/linux/broker_link.h"
#include "support/ipc/linux/bus_callers.h"
#include "support/ipc/linux/bus_options.h"
#include "support/ipc/linux/server_context.h"
#include "support/ipc/linux/socket_watch.h"

namespace spacekeep::ipc {

class BusFront final : public BrokerLink::Owner {
 public:
  BusFront(std::shared_ptr<ServerContext> context, BusOptions options);
  ~BusFront() override;
  BusFront(const BusFront&) = delete;
  BusFront& operator=(const BusFront&) = delete;

  void start() { connect(); }

  void brokerNamed(bool has_name) override;
  void brokerCall(sd_bus_message* call, std::size_t bytes) override;
  void brokerLeftOut(const LeftOut& message) override;
  void brokerEnded(const std::string& why) override;

 private:
  /// One connection to the bus, with those who call over it.
  struct Session {
    Session(const std::shared_ptr<ServerContext>& context, BusFront& front);
    BrokerLink link;
    BusCallers callers;
  };

  static int onPauseEnd(sd_event_source*, std::uint64_t usec, void* self);
  void connect();
  void waitForBus(int error);
  void pause(std::uint64_t duration_ns);
  void endPause();
  void retire();
  void tell(const std::string& problem);
  [[nodiscard]] std::uint64_t nowUsec() const;

  const std::shared_ptr<ServerContext> context_;
  const BusOptions options_;
  SocketWatch watch_;
  std::unique_ptr<Session> session_;
  sd_event_source* timer_ = nullptr;
  std::uint64_t pause_ns_;
  unsigned refusals_ = 0;         // by a socket that is there, since it appeared
  std::uint64_t named_usec_ = 0;  // when the name was there; 0 before
  std::string told_;              // the last problem in the log
};

}  // namespace spacekeep::ipc
