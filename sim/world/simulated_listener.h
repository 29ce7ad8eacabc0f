// Thread safety: every member may be called from any thread.
//
// The daemon's socket without a socket: takes the served interface and lets tests call it as a
// given peer, on the threads and in the order that ServeMode promises.
#pragma once

#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "sim/world/simulated_peer.h"
#include "sim/world/trace.h"
#include "support/ipc/served.h"
#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

/// A call of a client and what has come of it.
class ClientCall {
 public:
  enum class State {
    kOpen,
    kAnswered,
    kFailed,   ///< refused with an error
    kDropped,  ///< the daemon let go of it and never answers
  };

  ClientCall(Trace& trace, std::string member);

  [[nodiscard]] State state() const;
  [[nodiscard]] ipc::Arguments answer() const;
  /// The first dictionary of the answer; none without an answer or when it holds none.
  [[nodiscard]] std::optional<Dictionary> dictionary() const;
  /// How often an answer was given. More than 1 is a fault of the daemon.
  [[nodiscard]] unsigned answers() const;
  [[nodiscard]] std::string error() const;
  [[nodiscard]] std::uint64_t answeredNs() const;  ///< virtual time since the world began

  /// Waits until it is no longer open, then answers as dictionary().
  std::optional<Dictionary> wait();
  /// False when it is still open after that time.
  [[nodiscard]] bool waitForNs(std::uint64_t duration_ns);

  // For the listener.
  [[nodiscard]] std::uint64_t number() const { return number_; }
  void reply(ipc::Arguments arguments);
  void fail(const ipc::Error& error);
  void drop();

 private:
  void finish(State state);

  Trace& trace_;
  const std::string member_;
  const std::uint64_t number_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  State state_ = State::kOpen;
  ipc::Arguments answer_;
  std::string error_;
  unsigned answers_ = 0;
  std::uint64_t answered_ns_ = 0;
  CountingSemaphore finished_{0};
};

/// What stands behind the ipc::Listener that the daemon holds; lives as long as the world.
class SimulatedListener {
 public:
  SimulatedListener(ConcurrentQueue& global, Trace& trace) : global_(global), trace_(trace) {}

  /// What Platform::makeListener answers with.
  [[nodiscard]] std::unique_ptr<ipc::Listener> makeListener(ipc::ServedInterface interface);

  [[nodiscard]] bool made() const;
  [[nodiscard]] bool resumed() const;
  [[nodiscard]] std::string requiredEntitlement() const;
  /// Whether the peer would be accepted.
  [[nodiscard]] bool accepts(const SimulatedPeer& peer) const;

  /// Sends the call and returns at once. A peer that is not accepted, a listener that is not
  /// resumed, an unknown member and arguments of the wrong kinds fail the call.
  std::shared_ptr<ClientCall> call(const std::shared_ptr<SimulatedPeer>& peer,
                                   std::string_view member, ipc::Arguments arguments);

  /// Accepts nothing any more and lets go of the calls that wait.
  void abandon();

 private:
  class Handle;
  struct Lane {
    std::size_t running = 0;
    std::deque<Task> waiting;
  };

  [[nodiscard]] const ipc::ServedMethod* servedMethod(std::string_view member) const;
  [[nodiscard]] std::string refusal(const SimulatedPeer& peer, std::string_view member,
                                    const ipc::Arguments& arguments) const;
  [[nodiscard]] Task serving(std::shared_ptr<SimulatedPeer> peer, const ipc::ServedMethod& method,
                             ipc::Arguments arguments, const std::shared_ptr<ClientCall>& call);
  void runInOrder(const std::shared_ptr<SimulatedPeer>& peer, Task task);
  void runInLane(const ipc::ServedMethod& method, Task task);
  void startLaneTask(const std::string& lane, Task task);
  void laneTaskEnded(const std::string& lane);

  ConcurrentQueue& global_;
  Trace& trace_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::optional<ipc::ServedInterface> served_;
  std::string required_entitlement_;
  bool resumed_ = false;
  std::map<std::string, Lane> lanes_;
  std::map<std::string, std::shared_ptr<SerialQueue>> in_order_;  // by peer name
};

}  // namespace spacekeep::sim
