// Thread safety: every member may be called from any thread.
//
// The process of one service: receives calls of SpacekeepServiceProtocol, owns bytes on volumes,
// and answers as its behaviour says. It records every call.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "sim/world/delay_line.h"
#include "sim/world/service_behaviour.h"
#include "sim/world/simulated_volumes.h"
#include "sim/world/trace.h"
#include "support/ipc/arguments.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

class SimulatedConnection;

/// What the trace says of a service, after its ID, whose ping will never be answered.
inline constexpr const char* kPingLost = "never answers a ping: its connection has ended";

/// Each answer with a dictionary holds its RecordedCall::call under this key.
inline constexpr const char* kCallKey = "SIMULATED_CALL";

struct RecordedCall {
  enum class State { kOpen, kAnswered, kFailed };

  std::uint64_t call = 0;  ///< as in the trace
  std::string member;
  std::int32_t urgency = 0;             ///< 0 for members without one
  Dictionary info;                      ///< empty for members without one
  std::optional<std::uint64_t> amount;  ///< "SPACEKEEP_AMOUNT" of info
  std::uint64_t arrived_ns = 0;         ///< virtual time since the world began
  State state = State::kOpen;
  std::uint64_t ended_ns = 0;
  std::uint64_t freed = 0;                ///< bytes given up
  std::optional<std::uint64_t> reported;  ///< bytes the answer spoke of
};

/// A call as the connection hands it over. Exactly one of the two is to be called, once.
struct IncomingCall {
  const SimulatedConnection* connection = nullptr;
  const ipc::MethodDescription* method = nullptr;
  ipc::Arguments arguments;
  std::function<void(ipc::Arguments)> reply;
  std::function<void(ConnectionEnd)> fail;  ///< ends the whole connection
};

class SimulatedService : public std::enable_shared_from_this<SimulatedService> {
 public:
  SimulatedService(std::string id, ServiceBehaviour behaviour, Trace& trace, DelayLine& delays,
                   SimulatedVolumes& volumes);

  [[nodiscard]] const std::string& id() const { return id_; }

  // Looking at what happened.
  [[nodiscard]] std::vector<RecordedCall> calls() const;
  [[nodiscard]] std::vector<RecordedCall> callsOf(std::string_view member) const;
  [[nodiscard]] std::size_t callCount(std::string_view member) const;
  /// How often a purge call arrived while one with the same token was still open. 0 is right.
  [[nodiscard]] std::uint64_t askedTwiceAtOnce() const;
  /// Bytes that it still owns on the volume, all urgencies together.
  [[nodiscard]] std::uint64_t ownedBytes(const std::string& volume) const;

  // Changing the world.
  void setBehaviour(ServiceBehaviour behaviour);
  [[nodiscard]] ServiceBehaviour behaviour() const;
  /// Its data grow, at the cost of the volume; by less when there is no room.
  void grow(const std::string& volume, std::size_t urgency, std::uint64_t bytes);
  /// Answers every call that is held (Answer::kNever) as if its behaviour had been kReplies.
  void answerHeldCalls();
  /// Answers held pings, and every further one at once. Other held calls stay held.
  void answerPingsFromNowOn();
  /// The process dies: its connections are interrupted, calls fail until it is started again.
  void die();
  void start();
  /// It closes its connections and lives on.
  void closeConnections();
  [[nodiscard]] bool alive() const;
  /// Forgets held calls and connections without a word, so that nothing keeps anything alive.
  void abandon();

  // For connections.
  /// For the trace: the daemon waits for ever for an answer to a ping.
  void pingLost();
  void receive(IncomingCall incoming);
  void connected(const std::shared_ptr<SimulatedConnection>& connection);
  /// The calls that came over it are given up.
  void connectionEnded(const SimulatedConnection* connection);

 private:
  struct OpenCall {
    std::size_t record = 0;
    IncomingCall incoming;
    CallBehaviour behaviour;
    bool held = false;
  };

  std::size_t recordArrival(const IncomingCall& incoming);
  [[nodiscard]] CallBehaviour behaviourFor(std::string_view member);
  void answerLater(std::uint64_t call, std::uint64_t delay_ns);
  void end(std::uint64_t call);
  void stopPurges();
  void finish(OpenCall open);
  void endConnections(ConnectionEnd how);
  [[nodiscard]] std::uint64_t giveUp(const RecordedCall& record, const CallBehaviour& behaviour);
  [[nodiscard]] Dictionary answerTo(RecordedCall& record, const CallBehaviour& behaviour);

  const std::string id_;
  Trace& trace_;
  DelayLine& delays_;
  SimulatedVolumes& volumes_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  ServiceBehaviour behaviour_;
  std::vector<RecordedCall> records_;
  std::map<std::uint64_t, OpenCall> open_;  // by call
  std::size_t purge_calls_ = 0;
  std::uint64_t asked_twice_ = 0;
  bool alive_ = true;
  std::vector<std::weak_ptr<SimulatedConnection>> connections_;
};

}  // namespace spacekeep::sim
