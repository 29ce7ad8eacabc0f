// What the world does to the daemon in a plan: services that come and go, space, events, clocks,
// the disk.
#include "operations/info_keys.h"
#include "sim/scenarios/system_draw.h"
#include "support/events/events.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kCacheThresholdBytes = 5'242'880;

template <class What>
PlannedAction& add(Draw& draw, What what) {
  PlannedAction action;
  action.life = static_cast<unsigned>(draw.random.below(draw.lives));
  action.at_ns = draw.random.percent(60) ? drawSystemDelay(draw.random) : drawMoment(draw.random);
  action.what = std::move(what);
  return draw.plan.actions.emplace_back(std::move(action));
}

ServiceAction actionOf(Draw& draw, ServiceAction::Kind kind) {
  ServiceAction action;
  action.kind = kind;
  action.service = draw.plan.services[draw.random.below(draw.plan.services.size())].id;
  return action;
}

void drawEnd(Draw& draw) {
  const bool dies = draw.random.percent(60);
  ServiceAction end =
      actionOf(draw, dies ? ServiceAction::Kind::kDies : ServiceAction::Kind::kCloses);
  const PlannedAction ended = add(draw, end);
  if (draw.random.percent(40)) return;
  end.kind = dies ? ServiceAction::Kind::kStarts : ServiceAction::Kind::kChecksIn;
  if (!dies) end.info = drawCheckIn(draw);
  PlannedAction& back = add(draw, end);
  back.life = ended.life;
  back.at_ns = ended.at_ns + drawSystemDelay(draw.random);
}

void drawRegrowth(Draw& draw) {
  ServiceAction action = actionOf(draw, ServiceAction::Kind::kRegrows);
  action.volume = draw.volume();
  action.bytes = draw.random.below(draw.about_bytes + 1);
  action.urgency = draw.random.between(1, 4);
  add(draw, action);
}

// Much space taken while few bytes are needed means thousands of small requests, one after another.
std::uint64_t drawWritten(Draw& draw) {
  if (draw.random.percent(15)) return kCacheThresholdBytes - 1 + draw.random.below(3);
  return draw.random.between(1, draw.about_bytes * 2);
}

Dictionary drawEvent(Draw& draw) {
  if (draw.chance(Fault::kOddEvents, 20)) return {};
  if (draw.chance(Fault::kOddEvents, 20)) return {{kEventFlagsKey, "low"}};
  if (draw.chance(Fault::kOddEvents, 20)) return {{kEventFlagsKey, 1U}};
  return {{kEventFlagsKey, draw.random.oneOf<std::uint64_t>(
                               {kVqLowDisk, kVqVeryLowDisk, kVqLowDisk | kVqVeryLowDisk})}};
}

std::vector<std::string> drawLowVolumes(Draw& draw) {
  std::vector<std::string> low;
  for (const PlannedVolume& volume : draw.plan.volumes) {
    if (draw.random.percent(60)) low.push_back(volume.path);
  }
  return low;
}

void drawLowSpace(Draw& draw) {
  const std::uint64_t events = draw.random.percent(60) ? 1 : 2;
  for (std::uint64_t i = 0; i < events; ++i) {
    add(draw, LowSpaceAction{drawLowVolumes(draw), drawEvent(draw)});
  }
}

void drawDaily(Draw& draw) {
  DailyAction daily;
  if (draw.chance(Fault::kOddEvents, 40)) {
    daily.state = static_cast<ActivityState>(draw.random.below(6));
  }
  const PlannedAction first = add(draw, daily);
  if (!draw.chance(Fault::kOddEvents, 50)) return;
  PlannedAction& second = add(draw, DailyAction{});
  second.life = first.life;
  second.at_ns = first.at_ns + draw.random.oneOf<std::uint64_t>({0, 1, kSecond, 15 * kSecond});
}

std::int64_t drawJump(Random& random) {
  constexpr std::int64_t kS = 1'000'000'000;
  const std::int64_t by =
      random.oneOf<std::int64_t>({1, kS, 119 * kS, 120 * kS, 120 * kS + 1, 121 * kS, 3600 * kS,
                                  86'400 * kS, 40 * 365 * 86'400 * kS});
  return random.percent(50) ? by : -by;
}

void drawDiskFailure(Draw& draw) {
  const PlannedAction fails = add(
      draw, DiskAction{draw.random.percent(50) ? "no space left on device" : "input/output error"});
  if (draw.random.percent(25)) return;
  PlannedAction& works = add(draw, DiskAction{});
  works.life = fails.life;
  works.at_ns = fails.at_ns + drawSystemDelay(draw.random);
}

/// As often as that, while the fault is switched on.
std::uint64_t times(Draw& draw, Fault fault, std::uint64_t most) {
  return draw.on(fault) ? draw.random.between(1, most) : 0;
}

}  // namespace

std::uint64_t drawSystemDelay(Random& random) {
  switch (random.below(10)) {
    case 0:
    case 1:
    case 2:
      return 0;
    case 3:
    case 4:
      return kMs * random.between(1, 200);
    case 5:
      return kSecond * random.between(1, 3);
    case 6:
      return kSecond * random.oneOf<std::uint64_t>({2, 6, 10, 12, 15});
    case 7:
      return kMs * random.between(100, 9000);
    case 8:
      return kSecond * random.between(5, 40);
    default:
      return 1;
  }
}

std::uint64_t drawMoment(Random& random) {
  if (random.percent(50)) return drawSystemDelay(random);
  const std::uint64_t base = random.oneOf<std::uint64_t>({60, 119, 120, 120, 121, 300}) * kSecond;
  return base - 1 + random.below(3);
}

void drawServiceActions(Draw& draw) {
  for (std::uint64_t i = times(draw, Fault::kDyingServices, 2); i > 0; --i) drawEnd(draw);
  for (std::uint64_t i = times(draw, Fault::kSecondCheckIns, 2); i > 0; --i) {
    ServiceAction again = actionOf(draw, ServiceAction::Kind::kChecksIn);
    again.info = drawCheckIn(draw);
    add(draw, again);
  }
  for (std::uint64_t i = times(draw, Fault::kRegrownData, 3); i > 0; --i) drawRegrowth(draw);
  if (draw.chance(Fault::kMissingRights, 40)) {
    ServiceAction intrudes = actionOf(draw, ServiceAction::Kind::kIntrudes);
    intrudes.info = drawCheckIn(draw);
    add(draw, intrudes);
  }
}

void drawWorldActions(Draw& draw) {
  for (std::uint64_t i = times(draw, Fault::kForeignWrites, 4); i > 0; --i) {
    add(draw, SpaceAction{draw.volume(), drawWritten(draw), draw.random.percent(35)});
  }
  if (draw.random.percent(25)) drawLowSpace(draw);
  if (draw.random.percent(20)) drawDaily(draw);
  for (std::uint64_t i = times(draw, Fault::kClockJumps, 2); i > 0; --i) {
    add(draw, ClockAction{drawJump(draw.random)});
  }
  if (draw.on(Fault::kFailingDisk)) drawDiskFailure(draw);
}

}  // namespace spacekeep::sim
