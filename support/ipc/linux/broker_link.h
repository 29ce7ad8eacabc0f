// Thread safety: confined to the IPC thread.
//
// The connection to a message bus: greets its broker, asks it for a name, asks it who senders are,
// and hands on the calls that come. Once it has ended it is of no further use.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <string>

#include "support/ipc/linux/bus_link.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/owned_message.h"

namespace spacekeep::ipc {

class BrokerLink final : public BusLink::Owner {
 public:
  class Owner {
   public:
    virtual ~Owner() = default;
    /// The broker knows this process; it has the name, or waits for whoever has it to give it up.
    virtual void brokerNamed(bool has_name) = 0;
    /// The message is good during the call only.
    virtual void brokerCall(sd_bus_message* call, std::size_t bytes) = 0;
    virtual void brokerLeftOut(const LeftOut& message) = 0;
    /// Nothing follows. The owner may not destroy the link within.
    virtual void brokerEnded(const std::string& why) = 0;
  };
  /// The broker's answer, which may be an error.
  using Answer = std::function<void(sd_bus_message* answer)>;

  BrokerLink(IpcLoop& loop, Owner& owner, std::string name, const LinkLimits& limits,
             std::size_t queued_bytes_per_user);

  /// Over a duplicate of a socket that is connected to the broker.
  void start(int fd) { link_.start(fd, 0); }
  void close() { link_.close(); }
  /// For making messages. Null until the broker is there, and once the link has ended.
  [[nodiscard]] sd_bus* bus() const { return link_.ended() ? nullptr : link_.bus(); }

  /// Who the sender is. The answer does not come when the link ends before.
  void askForCredentials(const std::string& sender, Answer answer);
  /// An answer to a call of that user. Dropped when far too much of that user's is queued: its calls
  /// go unanswered, and nobody else's.
  void send(sd_bus_message* message, std::size_t bytes, uid_t uid);
  /// What the broker has not taken yet of the answers to that user.
  [[nodiscard]] std::size_t queuedBytes(uid_t uid);

  void linkReady() override;
  void linkMessage(sd_bus_message* message) override;
  void linkLeftOut(const LeftOut& message) override { owner_.brokerLeftOut(message); }
  void linkEnded(LinkEnd end, const std::string& why) override;

 private:
  struct Queued {
    uid_t uid;
    std::size_t bytes;
  };
  OwnedMessage question(const char* member);
  void ask(OwnedMessage question, Answer answer);
  void askForName();
  void named(sd_bus_message* answer);
  void fromBroker(sd_bus_message* message, std::uint8_t type);
  bool transmit(sd_bus_message* message, Queued queued, std::uint64_t* serial);
  void forgetTaken();
  void refused(const std::string& what, sd_bus_message* answer);
  void fail(const std::string& why);

  Owner& owner_;
  const std::string name_;
  const std::size_t queued_bytes_per_user_;
  BusLink link_;
  std::map<std::uint64_t, Answer> asked_;
  std::deque<Queued> queued_;
  std::map<uid_t, std::size_t> queued_bytes_;  // no zeros
};

}  // namespace spacekeep::ipc
