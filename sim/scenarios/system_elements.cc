// A plan as a row of elements that can be taken away one by one, and its text.
#include <array>
#include <string>

#include "sim/scenarios/system_scenario.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

std::string secondsOf(std::uint64_t ns) { return std::to_string(static_cast<double>(ns) / 1e9); }

std::string textOf(Answer answer) {
  switch (answer) {
    case Answer::kReplies:
      return "replies";
    case Answer::kRepliesWithoutAmount:
      return "replies without amount";
    case Answer::kRepliesWithText:
      return "replies with text";
    case Answer::kRepliesNothing:
      return "replies nothing";
    case Answer::kFailsBeforeCall:
      return "fails before the call";
    case Answer::kFailsDuringCall:
      return "fails during the call";
    case Answer::kNever:
      return "never answers";
  }
  return {};
}

std::string textOf(const CallBehaviour& call) {
  std::string text = textOf(call.answer);
  if (call.delay_ns != 0) text += " after " + secondsOf(call.delay_ns);
  if (call.percent_given != 100) text += ", gives " + std::to_string(call.percent_given) + "%";
  if (call.percent_reported != 100) {
    text += ", reports " + std::to_string(call.percent_reported) + "%";
  }
  if (call.reported_extra != 0) text += " + " + std::to_string(call.reported_extra);
  if (call.space_returns_after_ns != 0) {
    text += ", space back after " + secondsOf(call.space_returns_after_ns);
  }
  return text;
}

bool isPlain(const CallBehaviour& call) { return textOf(call) == textOf(CallBehaviour{}); }

std::string textOf(const ServiceBehaviour& behaviour) {
  std::string text;
  for (const auto& [volume, owned] : behaviour.owns) {
    text += ", owns on " + volume;
    for (std::size_t urgency = 1; urgency < owned.size(); ++urgency) {
      text += " " + std::to_string(owned[urgency]);
    }
  }
  for (const CallBehaviour& call : behaviour.purge) {
    if (!isPlain(call) || behaviour.purge.size() > 1) text += "; purge: " + textOf(call);
  }
  if (!isPlain(behaviour.purgeable)) text += "; purgeable: " + textOf(behaviour.purgeable);
  if (!isPlain(behaviour.periodic)) text += "; periodic: " + textOf(behaviour.periodic);
  if (!isPlain(behaviour.ping)) text += "; ping: " + textOf(behaviour.ping);
  if (!isPlain(behaviour.cancel)) text += "; cancel: " + textOf(behaviour.cancel);
  if (!isPlain(behaviour.notify)) text += "; notify: " + textOf(behaviour.notify);
  if (behaviour.cancel_stops_purge) text += "; a cancel stops its purge";
  if (behaviour.answers_twice) text += "; answers twice";
  if (behaviour.opt_out) text += "; opts out with " + textOf(*behaviour.opt_out);
  if (behaviour.periodic_amount != 0) {
    text += "; periodic amount " + std::to_string(behaviour.periodic_amount);
  }
  return text;
}

std::string textOf(const SystemService& service) {
  const std::string how = service.descriptor
                              ? " declared " + textOf(*service.descriptor)
                              : " checks in after " + secondsOf(service.check_in_after_ns) + " " +
                                    textOf(service.check_in_info);
  return "service " + service.id + how + textOf(service.behaviour);
}

std::string textOf(const BadDescriptor& descriptor) {
  static constexpr std::array kKinds{"no property list",        "no dictionary", "no ID",
                                     "an ID that is no string", "unreadable",    "second of "};
  return "descriptor " + descriptor.file_name + ": " +
         kKinds[static_cast<std::size_t>(descriptor.kind)] + descriptor.of_id;
}

struct ActionText {
  std::string operator()(const CallAction& call) const {
    std::string text = call.client + " (";
    for (const std::string& right : call.rights) text += right + " ";
    text += ") calls " + call.member + " " + call.key;
    if (call.value) text += " = " + textOf(*call.value);
    return call.info.empty() ? text : text + textOf(call.info);
  }
  std::string operator()(const SpaceAction& space) const {
    return std::string(space.frees ? "space comes back" : "somebody writes") + " on " +
           space.volume + ": " + std::to_string(space.bytes);
  }
  std::string operator()(const LowSpaceAction& low) const {
    std::string text = "event " + textOf(low.event) + ", low:";
    for (const std::string& volume : low.volumes) text += " " + volume;
    return text;
  }
  std::string operator()(const DailyAction& daily) const {
    return "activity in state " + std::to_string(static_cast<int>(daily.state));
  }
  std::string operator()(const ClockAction& clock) const {
    return "the wall clock jumps by " + std::to_string(static_cast<double>(clock.by_ns) / 1e9);
  }
  std::string operator()(const DiskAction& disk) const {
    return disk.failure.empty() ? "the disk works" : "the disk fails: " + disk.failure;
  }
  std::string operator()(const ServiceAction& action) const {
    static constexpr std::array kKinds{" dies",        " closes its connections",
                                       " starts",      " checks in again ",
                                       " owns more: ", " intrudes"};
    std::string text = action.service + kKinds[static_cast<std::size_t>(action.kind)];
    if (!action.info.empty()) text += textOf(action.info);
    if (action.bytes != 0) {
      text += std::to_string(action.bytes) + " on " + action.volume + " at urgency " +
              std::to_string(action.urgency);
    }
    return text;
  }
};

std::string textOf(const PlannedAction& action) {
  return "life " + std::to_string(action.life) + ", after " + secondsOf(action.at_ns) + ": " +
         std::visit(ActionText{}, action.what);
}

std::string textOf(const PlannedCrash& crash) {
  return "killed at step " + std::to_string(crash.at_step) + ", down for " +
         secondsOf(crash.down_for_ns) +
         (crash.store_refuses_to_open ? ", then the store cannot be opened" : "");
}

/// Calls `with` with the vector that holds the element and its place there.
template <class Plan, class With>
void findElement(Plan& plan, std::size_t index, const With& with) {
  const auto in = [&](auto& row) {
    if (index < row.size()) {
      with(row, index);
      return true;
    }
    index -= row.size();
    return false;
  };
  (void)(in(plan.services) || in(plan.bad_descriptors) || in(plan.actions) || in(plan.crashes));
}

}  // namespace

std::string_view nameOf(Fault fault) {
  static constexpr std::array<std::string_view, kFaultCount> kNames{
      "ForeignWrites", "LateSpace",   "SlowServices", "SilentServices", "LyingServices",
      "Generous",      "OddAnswers",  "FailingCalls", "DoubleAnswers",  "DyingServices",
      "SecondCheckIn", "RegrownData", "OptOuts",      "BadDescriptors", "MissingRights",
      "OddRequests",   "FailingDisk", "Crashes",      "ClockJumps",     "OddEvents",
      "SilentPing"};
  return kNames[static_cast<std::size_t>(fault)];
}

std::size_t elementCount(const SystemPlan& plan) {
  return plan.services.size() + plan.bad_descriptors.size() + plan.actions.size() +
         plan.crashes.size();
}

SystemPlan withoutElement(const SystemPlan& plan, std::size_t index) {
  SystemPlan smaller = plan;
  findElement(smaller, index, [](auto& row, std::size_t place) {
    row.erase(row.begin() + static_cast<std::ptrdiff_t>(place));
  });
  return smaller;
}

std::string textOfElement(const SystemPlan& plan, std::size_t index) {
  std::string text;
  findElement(plan, index, [&](const auto& row, std::size_t place) { text = textOf(row[place]); });
  return text;
}

std::string textOf(const SystemPlan& plan) {
  std::string text = "parallelism " + std::to_string(plan.parallelism) + ", faults:";
  for (const Fault fault : plan.faults) text += " " + std::string(nameOf(fault));
  text += "\n";
  for (const PlannedVolume& volume : plan.volumes) {
    text += "volume " + volume.path + " " + std::to_string(volume.free_bytes) + " of " +
            std::to_string(volume.size_bytes) + " free\n";
  }
  for (std::size_t index = 0; index < elementCount(plan); ++index) {
    text += textOfElement(plan, index) + "\n";
  }
  return text;
}

}  // namespace spacekeep::sim
