#include "sim/world/simulated_service.h"

#include <algorithm>
#include <utility>

#include "sim/world/simulated_connection.h"
#include "support/runtime/locks.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

constexpr std::string_view kPurge = "servicePurge";

std::string tokenOf(const Dictionary& info) {
  const Value* token = info.find("SPACEKEEP_TOKEN");
  return token == nullptr ? std::string() : textOf(*token);
}

std::uint64_t percentOf(std::uint64_t bytes, std::uint32_t percent) {
  return bytes / 100 * percent + bytes % 100 * percent / 100;
}

}  // namespace

SimulatedService::SimulatedService(std::string id, ServiceBehaviour behaviour, Trace& trace,
                                   DelayLine& delays, SimulatedVolumes& volumes)
    : id_(std::move(id)),
      trace_(trace),
      delays_(delays),
      volumes_(volumes),
      behaviour_(std::move(behaviour)) {}

std::vector<RecordedCall> SimulatedService::calls() const {
  const std::scoped_lock lock(mutex_);
  return records_;
}

std::vector<RecordedCall> SimulatedService::callsOf(std::string_view member) const {
  std::vector<RecordedCall> matching = calls();
  std::erase_if(matching, [&](const RecordedCall& call) { return call.member != member; });
  return matching;
}

std::size_t SimulatedService::callCount(std::string_view member) const {
  return callsOf(member).size();
}

std::uint64_t SimulatedService::askedTwiceAtOnce() const {
  const std::scoped_lock lock(mutex_);
  return asked_twice_;
}

std::uint64_t SimulatedService::ownedBytes(const std::string& volume) const {
  const std::scoped_lock lock(mutex_);
  const auto found = behaviour_.owns.find(volume);
  std::uint64_t sum = 0;
  if (found == behaviour_.owns.end()) return sum;
  for (const std::uint64_t bytes : found->second) sum += bytes;
  return sum;
}

void SimulatedService::setBehaviour(ServiceBehaviour behaviour) {
  const std::scoped_lock lock(mutex_);
  behaviour_ = std::move(behaviour);
}

ServiceBehaviour SimulatedService::behaviour() const {
  const std::scoped_lock lock(mutex_);
  return behaviour_;
}

void SimulatedService::receive(IncomingCall incoming) {
  const std::string_view member = incoming.method->name;
  CallBehaviour behaviour;
  std::uint64_t call = 0;
  {
    const std::scoped_lock lock(mutex_);
    // What was still under way when the connection ended reaches nobody, also not a new process.
    if (incoming.connection->ended()) return;
    behaviour = behaviourFor(member);
    if (alive_ && behaviour.answer != Answer::kFailsBeforeCall) {
      const std::size_t record = recordArrival(incoming);
      call = records_[record].call;
      const bool held = behaviour.answer == Answer::kNever;
      open_.emplace(call, OpenCall{record, std::move(incoming), behaviour, held});
    }
  }
  if (call == 0) {
    incoming.fail(behaviour.end);
  } else if (behaviour.answer != Answer::kNever) {
    answerLater(call, behaviour.delay_ns);
  }
  if (call != 0 && member == "serviceCancelPurge") stopPurges();
}

std::size_t SimulatedService::recordArrival(const IncomingCall& incoming) {
  RecordedCall record;
  record.call = trace_.nextCall();
  record.member = incoming.method->name;
  record.arrived_ns = trace_.nowNs();
  for (const ipc::Argument& argument : incoming.arguments) {
    if (const auto* urgency = std::get_if<std::int32_t>(&argument)) record.urgency = *urgency;
    if (const auto* info = std::get_if<Dictionary>(&argument)) record.info = *info;
  }
  record.amount = unsignedAt(record.info, "SPACEKEEP_AMOUNT");
  const std::string token = tokenOf(record.info);
  if (record.member == kPurge) {
    asked_twice_ += static_cast<std::uint64_t>(
        std::count_if(records_.begin(), records_.end(), [&](const RecordedCall& other) {
          return other.member == kPurge && other.state == RecordedCall::State::kOpen &&
                 tokenOf(other.info) == token;
        }));
  }
  trace_.add(ServiceAsked{id_, record.member, record.call, record.urgency, record.amount, token,
                          record.info});
  records_.push_back(std::move(record));
  return records_.size() - 1;
}

CallBehaviour SimulatedService::behaviourFor(std::string_view member) {
  if (member == kPurge) {
    if (behaviour_.purge.empty()) return {};
    return behaviour_.purge[std::min(purge_calls_++, behaviour_.purge.size() - 1)];
  }
  if (member == "servicePurgeable") return behaviour_.purgeable;
  if (member == "servicePeriodic") return behaviour_.periodic;
  if (member == "servicePing") return behaviour_.ping;
  if (member == "serviceCancelPurge") return behaviour_.cancel;
  return behaviour_.notify;
}

void SimulatedService::answerLater(std::uint64_t call, std::uint64_t delay_ns) {
  if (delay_ns == 0) {
    end(call);
    return;
  }
  delays_.after(delay_ns, [self = shared_from_this(), call] { self->end(call); });
}

void SimulatedService::end(std::uint64_t call) {
  OpenCall open;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = open_.find(call);
    if (found == open_.end()) return;
    open = std::move(found->second);
    open_.erase(found);
  }
  finish(std::move(open));
}

void SimulatedService::finish(OpenCall open) {
  Dictionary answer;
  const bool fails = open.behaviour.answer == Answer::kFailsDuringCall;
  bool twice = false;
  {
    const std::scoped_lock lock(mutex_);
    twice = behaviour_.answers_twice;
    RecordedCall& record = records_[open.record];
    record.ended_ns = trace_.nowNs();
    record.state = fails ? RecordedCall::State::kFailed : RecordedCall::State::kAnswered;
    if (record.member == kPurge) record.freed = giveUp(record, open.behaviour);
    answer = answerTo(record, open.behaviour);
    if (fails) {
      trace_.add(ServiceCallFailed{id_, record.member, record.call});
    } else {
      trace_.add(
          ServiceAnswered{id_, record.member, record.call, record.reported, record.freed, answer});
    }
  }
  if (fails) {
    open.incoming.fail(open.behaviour.end);
    return;
  }
  ipc::Arguments out;
  if (!open.incoming.method->out.empty()) {
    const bool nothing = open.behaviour.answer == Answer::kRepliesNothing;
    out.emplace_back(nothing ? ipc::OptionalDictionary() : ipc::OptionalDictionary(answer));
  }
  if (twice) open.incoming.reply(out);
  open.incoming.reply(std::move(out));
}

std::uint64_t SimulatedService::giveUp(const RecordedCall& record, const CallBehaviour& behaviour) {
  const std::string* volume = stringAt(record.info, "SPACEKEEP_VOLUME");
  if (volume == nullptr) return 0;
  const auto owned = behaviour_.owns.find(*volume);
  if (owned == behaviour_.owns.end()) return 0;
  std::uint64_t wanted = percentOf(record.amount.value_or(0), behaviour.percent_given);
  std::uint64_t given = 0;
  for (std::size_t urgency = 1; urgency < owned->second.size(); ++urgency) {
    if (record.urgency < static_cast<std::int32_t>(urgency)) break;
    const std::uint64_t part = std::min(wanted, owned->second[urgency]);
    owned->second[urgency] -= part;
    wanted -= part;
    given += part;
  }
  if (given != 0) volumes_.giveBack(*volume, given, behaviour.space_returns_after_ns);
  return given;
}

Dictionary SimulatedService::answerTo(RecordedCall& record, const CallBehaviour& behaviour) {
  Dictionary answer;
  std::uint64_t amount = 0;
  if (record.member == kPurge) {
    amount = percentOf(record.freed, behaviour.percent_reported) + behaviour.reported_extra;
  } else if (record.member == "servicePeriodic") {
    amount = behaviour_.periodic_amount;
  } else if (record.member == "servicePurgeable") {
    const std::string* volume = stringAt(record.info, "SPACEKEEP_VOLUME");
    const auto owned = volume == nullptr ? behaviour_.owns.end() : behaviour_.owns.find(*volume);
    if (owned != behaviour_.owns.end()) {
      for (std::size_t urgency = 1; urgency < owned->second.size(); ++urgency) {
        if (record.urgency >= static_cast<std::int32_t>(urgency)) amount += owned->second[urgency];
      }
    }
    if (behaviour_.opt_out) answer.set("SPACEKEEP_OPT_OUT", *behaviour_.opt_out);
  }
  if (behaviour.answer == Answer::kReplies || behaviour.answer == Answer::kNever) {
    record.reported = amount;
    answer.set("SPACEKEEP_AMOUNT", amount);
  } else if (behaviour.answer == Answer::kRepliesWithText) {
    answer.set("SPACEKEEP_AMOUNT", "plenty");
  }
  // Log lines show answers, so this tells which call a line is about.
  answer.set(kCallKey, record.call);
  return answer;
}

void SimulatedService::stopPurges() {
  std::vector<OpenCall> stopped;
  {
    const std::scoped_lock lock(mutex_);
    if (!behaviour_.cancel_stops_purge) return;
    for (auto call = open_.begin(); call != open_.end();) {
      if (records_[call->second.record].member != kPurge) {
        ++call;
        continue;
      }
      call->second.behaviour = CallBehaviour{.percent_given = 0};
      stopped.push_back(std::move(call->second));
      call = open_.erase(call);
    }
  }
  for (OpenCall& open : stopped) finish(std::move(open));
}

void SimulatedService::answerHeldCalls() {
  std::vector<std::uint64_t> held;
  {
    const std::scoped_lock lock(mutex_);
    for (const auto& [call, open] : open_) {
      if (open.held) held.push_back(call);
    }
  }
  for (const std::uint64_t call : held) end(call);
}

void SimulatedService::answerPingsFromNowOn() {
  std::vector<std::uint64_t> pings;
  {
    const std::scoped_lock lock(mutex_);
    behaviour_.ping = CallBehaviour{};
    for (const auto& [call, open] : open_) {
      if (records_[open.record].member == "servicePing") pings.push_back(call);
    }
  }
  for (const std::uint64_t call : pings) end(call);
}

void SimulatedService::grow(const std::string& volume, std::size_t urgency, std::uint64_t bytes) {
  const std::uint64_t taken = volumes_.write(volume, bytes);
  const std::scoped_lock lock(mutex_);
  behaviour_.owns[volume].at(urgency) += taken;
  trace_.add(WorldChanged{id_ + " owns " + std::to_string(taken) + " more on " + volume});
}

void SimulatedService::pingLost() { trace_.add(WorldChanged{id_ + " " + kPingLost}); }

void SimulatedService::die() {
  {
    const std::scoped_lock lock(mutex_);
    alive_ = false;
  }
  trace_.add(WorldChanged{id_ + " dies"});
  endConnections(ConnectionEnd::kInterrupted);
}

void SimulatedService::start() {
  const std::scoped_lock lock(mutex_);
  alive_ = true;
  trace_.add(WorldChanged{id_ + " starts"});
}

void SimulatedService::closeConnections() {
  trace_.add(WorldChanged{id_ + " closes its connections"});
  endConnections(ConnectionEnd::kInvalidated);
}

bool SimulatedService::alive() const {
  const std::scoped_lock lock(mutex_);
  return alive_;
}

void SimulatedService::connectionEnded(const SimulatedConnection* connection) {
  std::vector<OpenCall> dropped;
  const std::scoped_lock lock(mutex_);
  for (auto call = open_.begin(); call != open_.end();) {
    if (call->second.incoming.connection != connection) {
      ++call;
      continue;
    }
    RecordedCall& record = records_[call->second.record];
    record.state = RecordedCall::State::kFailed;
    record.ended_ns = trace_.nowNs();
    trace_.add(ServiceCallFailed{id_, record.member, record.call});
    dropped.push_back(std::move(call->second));
    call = open_.erase(call);
  }
}

void SimulatedService::endConnections(ConnectionEnd how) {
  std::vector<std::weak_ptr<SimulatedConnection>> connections;
  {
    const std::scoped_lock lock(mutex_);
    connections.swap(connections_);
  }
  for (const auto& weak : connections) {
    if (const auto connection = weak.lock()) connection->end(how);
  }
}

void SimulatedService::connected(const std::shared_ptr<SimulatedConnection>& connection) {
  const std::scoped_lock lock(mutex_);
  std::erase_if(connections_, [](const auto& weak) { return weak.expired(); });
  connections_.push_back(connection);
}

void SimulatedService::abandon() {
  std::map<std::uint64_t, OpenCall> dropped;
  const std::scoped_lock lock(mutex_);
  dropped.swap(open_);
  connections_.clear();
}

}  // namespace spacekeep::sim
