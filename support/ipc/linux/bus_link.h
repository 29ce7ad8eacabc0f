// Thread safety: confined to the IPC thread.
//
// One D-Bus connection over one unix stream socket: authentication, the sd_bus object, and the
// limits on what the peer may send and leave unread. Both ends of the system stand on it; what the
// messages mean is its owner's business.
#pragma once

#include <sys/types.h>
#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>

#include "support/ipc/arguments.h"
#include "support/ipc/linux/authentication.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/look_ahead.h"

namespace spacekeep::ipc {

struct LinkLimits {
  std::uint64_t authentication_ns;
  std::size_t message_bytes;
  std::size_t queued_messages;
  std::size_t queued_bytes;
};

enum class LinkEnd {
  kPeerLeft,  ///< the peer closed its end or is gone
  kRefused,   ///< this side cut it off: authentication, a limit, a broken message
};

class BusLink {
 public:
  class Owner {
   public:
    virtual ~Owner() = default;
    /// Authenticated; messages may be sent from now on.
    virtual void linkReady() = 0;
    /// Asked before anything is read, the authentication included. After a false nothing is read and
    /// no end is noticed until resumeReading().
    virtual bool linkMayRead() { return true; }
    /// The message is good during the call only.
    virtual void linkMessage(sd_bus_message* message) = 0;
    /// Over a bus only.
    virtual void linkLeftOut(const LeftOut&) {}
    /// Nothing follows. Never called after close(). The owner may not destroy the link within.
    virtual void linkEnded(LinkEnd end, const std::string& why) = 0;
  };

  BusLink(IpcLoop& loop, Owner& owner, Authentication::Role role, const LinkLimits& limits,
          Traffic traffic = Traffic::kOfOnePeer);
  ~BusLink();
  BusLink(const BusLink&) = delete;
  BusLink& operator=(const BusLink&) = delete;

  /// Begins to authenticate over a duplicate of `fd`. Failures of any kind are told by linkEnded,
  /// also within this call.
  /// Only a client that says so can send descriptors. One that does trusts its server.
  void start(int fd, uid_t peer_uid, bool sends_descriptors = false);
  [[nodiscard]] bool ready() const { return bus_ != nullptr; }
  [[nodiscard]] bool ended() const { return ended_; }
  /// Within linkMessage: the size of the message, or the most that it can be.
  [[nodiscard]] std::size_t messageBytes() const;
  /// Sent, and not taken by the other end yet.
  [[nodiscard]] std::size_t queuedMessages() const { return queued_sizes_.size(); }
  /// For making messages. Null until ready.
  [[nodiscard]] sd_bus* bus() const { return bus_; }

  /// Sends or queues the message; `bytes` is its estimated size. Answers its serial, none when it
  /// was not sent. A peer that leaves too much unread is cut off. To one that takes nothing any more
  /// it counts as sent: the end is told once what the peer said before is read.
  std::optional<std::uint64_t> send(sd_bus_message* message, std::size_t bytes);
  /// May follow a linkMayRead that said no, also when the link has ended.
  void resumeReading();
  /// Closes without telling the owner. Safe within its callbacks.
  void close();

 private:
  static int onIo(sd_event_source*, int fd, std::uint32_t events, void* self);
  static int onTimeout(sd_event_source*, std::uint64_t usec, void* self);
  static int onMessage(sd_bus_message* message, void* self, sd_bus_error*);

  bool watch();
  void authenticate();
  bool open();
  bool takeBus();
  void process();
  bool processOnce();
  void writeQueued();
  void stopWriting();
  bool readOn();
  bool readNext();
  [[nodiscard]] LookAheadRules rules() const;
  bool readJudged();
  bool leaveOut();
  bool readWithDescriptors();
  bool messageWasDropped(std::size_t available);
  void updateEvents();
  [[nodiscard]] bool bringsCalls() const;
  [[nodiscard]] int quietPriority() const;
  void setPriority(bool waits_behind_others);
  void forgetWritten();
  void end(LinkEnd how, const std::string& why);
  void release();

  IpcLoop& loop_;
  Owner& owner_;
  const Authentication::Role role_;
  const LinkLimits limits_;
  const Traffic traffic_;
  SharedDescriptor socket_;  // until the bus owns it
  std::unique_ptr<Authentication> authentication_;
  sd_event_source* io_ = nullptr;
  sd_event_source* timer_ = nullptr;
  sd_bus* bus_ = nullptr;
  int fd_ = -1;     // for everything but what sd-bus reads
  int input_ = -1;  // another one of the same socket, for that
  std::uint32_t events_ = 0;
  bool waits_behind_others_ = false;
  bool sends_descriptors_ = false;
  bool processing_ = false;
  bool ended_ = false;
  bool peer_hung_up_ = false;
  bool only_reads_ = false;  // the peer takes nothing any more
  bool header_is_incomplete_ = false;
  bool in_message_ = false;       // its header was judged, it has not arrived as a whole
  std::size_t message_size_ = 0;  // of that message
  std::size_t message_read_ = 0;  // of it, what sd-bus has read at least
  std::uint64_t left_out_ = 0;    // bytes that are still to be left out
  std::deque<std::size_t> queued_sizes_;
  std::size_t queued_bytes_ = 0;
  std::uint64_t lost_ = 0;  // messages that were to be sent since it only reads
};

}  // namespace spacekeep::ipc
