// The services of a plan: who they are and how they behave.
#include "operations/info_keys.h"
#include "sim/scenarios/system_draw.h"

namespace spacekeep::sim {
namespace {

Answer drawAnswer(Draw& draw) {
  if (draw.chance(Fault::kSilentServices, 25)) return Answer::kNever;
  if (draw.chance(Fault::kFailingCalls, 30)) {
    return draw.random.percent(50) ? Answer::kFailsBeforeCall : Answer::kFailsDuringCall;
  }
  if (draw.chance(Fault::kOddAnswers, 30)) {
    return draw.random.oneOf<Answer>(
        {Answer::kRepliesWithoutAmount, Answer::kRepliesWithText, Answer::kRepliesNothing});
  }
  return Answer::kReplies;
}

CallBehaviour drawCall(Draw& draw) {
  CallBehaviour call;
  call.answer = drawAnswer(draw);
  if (draw.random.percent(30)) call.delay_ns = kMs * draw.random.between(1, 50);
  if (draw.chance(Fault::kSlowServices, 50)) call.delay_ns = drawSystemDelay(draw.random);
  if (draw.random.percent(50)) call.end = ConnectionEnd::kInterrupted;
  return call;
}

CallBehaviour drawPurgeCall(Draw& draw) {
  CallBehaviour call = drawCall(draw);
  if (draw.random.percent(25)) call.percent_given = draw.random.oneOf<std::uint32_t>({0, 50, 99});
  if (draw.chance(Fault::kGenerousServices, 50)) {
    call.percent_given = draw.random.oneOf<std::uint32_t>({101, 130, 250});
  }
  if (draw.chance(Fault::kLyingServices, 60)) {
    call.percent_reported = draw.random.oneOf<std::uint32_t>({0, 60, 100, 180});
    call.reported_extra = draw.random.oneOf<std::uint64_t>({0, 0, 1, 5000});
  }
  if (draw.chance(Fault::kLateSpace, 60)) {
    call.space_returns_after_ns = drawSystemDelay(draw.random);
  }
  return call;
}

bool claimsMoreThanItFrees(const CallBehaviour& call) {
  return call.percent_reported > 100 || call.reported_extra > 0 || call.space_returns_after_ns > 0;
}

void drawPurgeCalls(Draw& draw, ServiceBehaviour& behaviour) {
  behaviour.purge.clear();
  const std::uint64_t steps = draw.random.between(1, 3);
  for (std::uint64_t step = 0; step < steps; ++step) behaviour.purge.push_back(drawPurgeCall(draw));
  // The last entry stands for every later call, see the header for claims without end.
  if (claimsMoreThanItFrees(behaviour.purge.back())) behaviour.purge.emplace_back();
}

ServiceBehaviour drawBehaviour(Draw& draw) {
  ServiceBehaviour behaviour;
  for (const PlannedVolume& volume : draw.plan.volumes) {
    if (volume.path == "/" || draw.random.percent(40)) {
      behaviour.owns[volume.path] = drawOwnedBytes(draw.random, draw.about_bytes);
    }
  }
  drawPurgeCalls(draw, behaviour);
  behaviour.purgeable = drawCall(draw);
  behaviour.periodic = drawCall(draw);
  behaviour.periodic_amount = draw.random.below(draw.about_bytes);
  if (draw.chance(Fault::kSlowServices, 40)) behaviour.ping.delay_ns = drawSystemDelay(draw.random);
  if (draw.chance(Fault::kSilentPing, 50)) behaviour.ping.answer = Answer::kNever;
  if (draw.chance(Fault::kSilentServices, 20)) behaviour.cancel.answer = Answer::kNever;
  if (draw.chance(Fault::kFailingCalls, 20)) behaviour.notify.answer = Answer::kFailsBeforeCall;
  behaviour.cancel_stops_purge = draw.random.percent(30);
  behaviour.answers_twice = draw.chance(Fault::kDoubleAnswers, 60);
  if (draw.chance(Fault::kOptOuts, 40)) behaviour.opt_out = draw.random.percent(50);
  return behaviour;
}

Array drawNotifications(Draw& draw) {
  if (draw.random.percent(70)) return {Value(keys::kCacheEnabled)};
  return {Value("colour"), Value(keys::kFinishEarly)};
}

Dictionary drawDescriptor(Draw& draw) {
  Dictionary keys;
  switch (draw.random.below(6)) {
    case 0:
      keys.set(keys::kServiceRoles, Array{Value("PERIODIC")});
      break;
    case 1:
      keys.set(keys::kServiceRoles, Array{Value("PURGE"), Value("PERIODIC")});
      break;
    case 2:
      keys.set(keys::kServiceRoles, Array{Value("PURGE")});
      break;
    default:
      break;
  }
  if (draw.random.percent(12)) keys.set(keys::kDoNotQuery, draw.random.percent(50));
  if (draw.random.percent(30)) keys.set(keys::kNotifications, drawNotifications(draw));
  return keys;
}

}  // namespace

// The registry is ordered by ID; the IDs are not in the order of the plan.
std::string idOfService(std::size_t index) {
  return std::string(1, static_cast<char>('a' + (index * 5 + 3) % 8)) + "-cache";
}

OwnedBytes drawOwnedBytes(Random& random, std::uint64_t about_bytes) {
  OwnedBytes owned{};
  for (std::size_t urgency = 1; urgency < owned.size(); ++urgency) {
    if (random.percent(60)) owned[urgency] = random.below(about_bytes + 1);
  }
  return owned;
}

Dictionary drawCheckIn(Draw& draw) {
  Dictionary info{{keys::kRolePurge, draw.random.percent(85)}};
  if (draw.random.percent(25)) info.set(keys::kRolePeriodic, draw.random.percent(70));
  if (draw.random.percent(30)) info.set(keys::kNotifications, drawNotifications(draw));
  return info;
}

void drawServices(Draw& draw) {
  const std::size_t services = draw.random.between(1, draw.random.percent(70) ? 4 : 6);
  for (std::size_t index = 0; index < services; ++index) {
    SystemService service;
    service.id = idOfService(index);
    if (draw.random.percent(60)) {
      service.descriptor = drawDescriptor(draw);
    } else {
      service.check_in_info = drawCheckIn(draw);
      if (draw.random.percent(40)) service.check_in_after_ns = drawSystemDelay(draw.random);
    }
    service.behaviour = drawBehaviour(draw);
    draw.plan.services.push_back(std::move(service));
  }
}

void drawBadDescriptors(Draw& draw) {
  if (!draw.on(Fault::kBadDescriptors)) return;
  const std::uint64_t count = draw.random.between(1, 3);
  for (std::uint64_t i = 0; i < count; ++i) {
    BadDescriptor bad;
    bad.kind = draw.random.oneOf<BadDescriptor::Kind>(
        {BadDescriptor::Kind::kNoPropertyList, BadDescriptor::Kind::kNoDictionary,
         BadDescriptor::Kind::kNoId, BadDescriptor::Kind::kIdIsNoString,
         BadDescriptor::Kind::kUnreadable, BadDescriptor::Kind::kSecondOfId});
    bad.file_name = "bad-" + std::to_string(i) + ".plist";
    bad.of_id = idOfService(draw.random.below(draw.plan.services.size() + 1));
    draw.plan.bad_descriptors.push_back(bad);
  }
}

}  // namespace spacekeep::sim
