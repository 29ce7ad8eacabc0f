#include "sim/world/trace.h"

#include <cstdio>
#include <utility>

#include "support/logging/log.h"
#include "support/runtime/locks.h"
#include "support/timebase.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

std::uint64_t ticksToNs(std::uint64_t ticks) {
  const auto base = rt::timebase();
  if (!base) return ticks;
  return ticks * base->numerator / base->denominator;
}

std::string numberOrNone(const std::optional<std::uint64_t>& number) {
  return number ? std::to_string(*number) : "(none)";
}

struct BodyText {
  std::string operator()(const LogLine& line) const {
    return "log " + std::to_string(line.level) + "  " + textOfLine(line);
  }
  std::string operator()(const ServiceAsked& asked) const {
    return "asked " + asked.service + " " + asked.member + " #" + std::to_string(asked.call) +
           " urgency " + std::to_string(asked.urgency) + " amount " + numberOrNone(asked.amount) +
           (asked.token.empty() ? "" : " token " + asked.token) +
           (asked.member == "serviceNotify" ? " " + textOf(asked.info) : "");
  }
  std::string operator()(const ServiceAnswered& answered) const {
    return "answered " + answered.service + " " + answered.member + " #" +
           std::to_string(answered.call) + " amount " + numberOrNone(answered.amount) + " freed " +
           std::to_string(answered.freed);
  }
  std::string operator()(const ServiceCallFailed& failed) const {
    return "failed " + failed.service + " " + failed.member + " #" + std::to_string(failed.call);
  }
  std::string operator()(const FreeSpaceIs& space) const {
    return "free " + space.volume + " " + std::to_string(space.free);
  }
  std::string operator()(const StatisticSent& sent) const {
    const bool distribution = sent.kind == StatisticSent::Kind::kDistribution;
    return "statistic " + sent.key + " " +
           (distribution ? std::to_string(sent.value) : std::to_string(sent.count));
  }
  std::string operator()(const ClientAsked& asked) const {
    std::string text = "client #" + std::to_string(asked.call) + " " + asked.client + " calls " +
                       asked.member + " " + (asked.info ? textOf(*asked.info) : "") + asked.text;
    if (asked.value) text += " = " + textOf(*asked.value);
    return text;
  }
  std::string operator()(const ClientAnswered& answered) const {
    const std::string who = "client #" + std::to_string(answered.call) + " gets ";
    if (answered.value) return who + textOf(*answered.value);
    return who + (answered.answer ? textOf(*answered.answer) : "(no dictionary)");
  }
  std::string operator()(const WorldChanged& changed) const { return "world " + changed.what; }
  std::string operator()(const FreeSpaceLooked& look) const {
    return "looks at " + look.volume + " " + std::to_string(look.free);
  }
  std::string operator()(const ClientRefused& refused) const {
    return "client #" + std::to_string(refused.call) + " is refused: " + refused.error;
  }
  std::string operator()(const ClientDropped& dropped) const {
    return "client #" + std::to_string(dropped.call) + " is never answered";
  }
  std::string operator()(const LifeBegan& life) const {
    return "life " + std::to_string(life.life) + " begins, wall clock " +
           std::to_string(life.wall_clock_ns);
  }
  std::string operator()(const LifeEnded& life) const {
    return "life " + std::to_string(life.life) + (life.killed ? " is killed" : " ends");
  }
  std::string operator()(const ClockJumped& jump) const {
    return "wall clock jumps by " + std::to_string(jump.by_ns);
  }
  std::string operator()(const DiskWritten& written) const {
    return "disk " + written.suite + " " + textOf(written.contents);
  }
  std::string operator()(const DiskRefused& refused) const {
    return "disk refuses " + refused.suite + ": " + refused.reason;
  }
  std::string operator()(const StreamEventSent& sent) const {
    std::string text = "stream event " + textOf(sent.event) + ", low:";
    for (const std::string& volume : sent.low_volumes) text += " " + volume;
    return text;
  }
  std::string operator()(const KeepAliveIs& keep) const {
    return "keep-alive " + std::to_string(keep.open);
  }
  std::string operator()(const ActivityRan& ran) const {
    return "activity in state " + std::to_string(ran.state);
  }
};

}  // namespace

Trace::Trace(TraceStart start)
    : start_ticks_(rt::ticks()),
      start_ns_(start.at_ns),
      is_over_(start.is_over),
      last_call_(start.last_call) {
  events_.reserve(512);
}

std::uint64_t Trace::nowNs() const { return start_ns_ + ticksToNs(rt::ticks() - start_ticks_); }

void Trace::add(EventBody body) {
  if (is_over_ != nullptr && is_over_()) return;
  // Each thread has slots of its own, so their address tells threads apart.
  const void* thread = &rt::threadSlot(rt::ThreadSlot::kPoolWorker);
  const std::scoped_lock lock(mutex_);
  const unsigned number =
      threads_.emplace(thread, static_cast<unsigned>(threads_.size())).first->second;
  events_.push_back({nowNs(), number, std::move(body), queueNumber()});
}

unsigned Trace::queueNumber() {
  const SerialQueue* queue = SerialQueue::current();
  if (queue == nullptr) return 0;
  const auto next = static_cast<unsigned>(queues_.size()) + 1;
  return queues_.emplace(queue->weak_from_this(), next).first->second;
}

std::vector<Event> Trace::events() const {
  const std::scoped_lock lock(mutex_);
  return events_;
}

std::vector<Event> Trace::take() {
  const std::scoped_lock lock(mutex_);
  return std::exchange(events_, {});
}

std::uint64_t Trace::nextCall() {
  const std::scoped_lock lock(mutex_);
  return ++last_call_;
}

std::vector<std::string> Trace::linesWithFormat(std::string_view format) const {
  std::vector<std::string> lines;
  for (const Event& event : events()) {
    const auto* line = std::get_if<LogLine>(&event.body);
    if (line != nullptr && line->format == format) lines.push_back(textOfLine(*line));
  }
  return lines;
}

std::vector<std::string> Trace::linesOfLevel(std::int32_t level) const {
  std::vector<std::string> lines;
  for (const Event& event : events()) {
    const auto* line = std::get_if<LogLine>(&event.body);
    if (line != nullptr && line->level == level) lines.push_back(textOfLine(*line));
  }
  return lines;
}

bool Trace::hasLine(std::string_view filled_text) const {
  for (const Event& event : events()) {
    const auto* line = std::get_if<LogLine>(&event.body);
    if (line != nullptr && textOfLine(*line) == filled_text) return true;
  }
  return false;
}

std::string textOfLine(const LogLine& line) {
  std::vector<LogArgument> arguments;
  arguments.reserve(line.fields.size());
  for (const LogField& field : line.fields) {
    if (const auto* value = std::get_if<Value>(&field)) {
      arguments.emplace_back(value);
    } else if (std::holds_alternative<std::monostate>(field)) {
      arguments.emplace_back(static_cast<const Value*>(nullptr));
    } else if (const auto* text = std::get_if<std::string>(&field)) {
      arguments.emplace_back(std::string_view(*text));
    } else if (const auto* number = std::get_if<std::int64_t>(&field)) {
      arguments.emplace_back(*number);
    } else if (const auto* amount = std::get_if<std::uint64_t>(&field)) {
      arguments.emplace_back(*amount);
    } else {
      arguments.emplace_back(std::get<double>(field));
    }
  }
  return formatLogLine(line.format.c_str(), arguments);
}

std::string textOfEvent(const Event& event) {
  char time[32];
  std::snprintf(time, sizeof time, "%12.6f  ", static_cast<double>(event.at_ns) / 1e9);
  return time + std::visit(BodyText{}, event.body);
}

}  // namespace spacekeep::sim
