// What clients ask of the daemon in a plan.
#include <array>

#include "client/entitlements.h"
#include "operations/info_keys.h"
#include "sim/scenarios/system_draw.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::sim {
namespace {

using Rights = std::set<std::string, std::less<>>;

struct Caller {
  std::string name;
  Rights rights;
};

// Most clients hold what they need; the others every mix of it, also nothing.
Rights drawRights(Draw& draw) {
  static constexpr std::array kAll{entitlements::kPurge, entitlements::kPurgeable,
                                   entitlements::kItemizedPurgeable, entitlements::kService};
  Rights rights;
  const bool mixed = draw.chance(Fault::kMissingRights, 60);
  for (const std::string_view right : kAll) {
    if (!mixed || draw.random.percent(40)) rights.emplace(right);
  }
  return rights;
}

void drawUrgency(Draw& draw, Dictionary& info) {
  const bool first = draw.random.percent(70);
  const char* key = first ? keys::kUrgency : keys::kUrgencyLimit;
  if (draw.random.percent(80)) info.set(key, draw.random.between(1, 4));
  if (draw.chance(Fault::kOddRequests, 30)) {
    info.set(key, draw.random.oneOf<std::int64_t>({0, -1, 5, 9, std::int64_t{1} << 40}));
  }
  if (draw.chance(Fault::kOddRequests, 15)) info.set(key, "2");
  if (draw.chance(Fault::kOddRequests, 15)) info.set(keys::kUrgencyLimit, 1);
}

void drawOddVolume(Draw& draw, Dictionary& info) {
  if (!draw.chance(Fault::kOddRequests, 15)) return;
  switch (draw.random.below(3)) {
    case 0:
      info.set(keys::kVolume, "/nowhere");
      return;
    case 1:
      info.set(keys::kVolume, 7);
      return;
    default:
      info.remove(keys::kVolume);
      return;
  }
}

// Shares stay large enough for a purge to be over after some dozens of requests.
std::uint64_t drawAmount(Draw& draw) {
  const bool space_moves =
      draw.on(Fault::kForeignWrites) || draw.on(Fault::kLateSpace) || draw.on(Fault::kRegrownData);
  if (!space_moves && draw.random.percent(15)) {
    return draw.random.below(draw.plan.services.size() + 2);  // around one byte for each
  }
  if (draw.random.percent(10)) return draw.about_bytes * 1000;
  return draw.random.between(draw.about_bytes / 4, draw.about_bytes * 3);
}

// The log tells purges apart by what they need.
std::uint64_t drawOwnAmount(Draw& draw) {
  std::uint64_t amount = drawAmount(draw);
  while (!draw.amounts.insert(amount).second) ++amount;
  return amount;
}

Dictionary drawPurgeRequest(Draw& draw, std::size_t index) {
  Dictionary info{{keys::kVolume, draw.volume()}, {keys::kAmount, drawOwnAmount(draw)}};
  if (draw.random.percent(70)) info.set(keys::kToken, "purge-" + std::to_string(index));
  drawUrgency(draw, info);
  if (draw.random.percent(30)) info.set(keys::kFinishEarly, draw.random.percent(80));
  if (draw.random.percent(20)) {
    info.set(keys::kPurgeTimeout, draw.random.oneOf<std::uint64_t>({0, 1, 3, 10, 300, 1000}));
  }
  if (draw.chance(Fault::kOddRequests, 10)) info.set(keys::kAmount, "much");
  if (draw.chance(Fault::kOddRequests, 8)) info.remove(keys::kAmount);
  if (draw.chance(Fault::kOddRequests, 8)) info.set(keys::kFinishEarly, "yes");
  if (draw.chance(Fault::kOddRequests, 8)) info.set(keys::kPurgeTimeout, "long");
  drawOddVolume(draw, info);
  return info;
}

Dictionary drawQuery(Draw& draw) {
  Dictionary info{{keys::kVolume, draw.volume()}};
  drawUrgency(draw, info);
  drawOddVolume(draw, info);
  return info;
}

Value drawValue(Draw& draw) {
  switch (draw.random.below(8)) {
    case 0:
      return draw.random.percent(50);
    case 1:
      return draw.random.below(100);
    case 2:
      return -static_cast<std::int64_t>(draw.random.below(100));
    case 3:
      return static_cast<double>(draw.random.below(100)) / 4;
    case 4:
      return Data{{1, 2, static_cast<std::uint8_t>(draw.random.below(256))}};
    case 5:
      return Date{static_cast<std::int64_t>(draw.random.below(1'000'000)) * 1'000'000'000};
    case 6:
      return Array{Value("a"), Value(draw.random.below(10)), Value(Dictionary{{"b", true}})};
    default:
      return "text-" + std::to_string(draw.random.below(100));
  }
}

std::string drawKey(Draw& draw) {
  static const std::array<std::string, 5> kActedOn{keys::kCacheEnabled, keys::kFinishEarly,
                                                   kLowSpaceBytesKey, kLowSpacePercentKey,
                                                   kLowSpaceInodesPercentKey};
  if (draw.chance(Fault::kOddRequests, 15)) {
    return draw.random.oneOf<const char*>({"", keys::kUserDefaults, keys::kRecentServiceStats});
  }
  if (draw.random.percent(50)) return kActedOn[draw.random.below(kActedOn.size())];
  return draw.random.oneOf<const char*>({"colour", "size"});
}

// A fitting value for the keys that the daemon acts on, as often as not.
std::optional<Value> drawStateValue(Draw& draw, const std::string& key) {
  if (draw.random.percent(15)) return std::nullopt;
  if (draw.random.percent(60)) {
    if (key == keys::kCacheEnabled || key == keys::kFinishEarly) return draw.random.percent(50);
    if (key == kLowSpaceBytesKey) return draw.random.below(1'000'000'000);
    if (key == kLowSpacePercentKey || key == kLowSpaceInodesPercentKey) {
      return draw.random.below(60);
    }
  }
  return drawValue(draw);
}

CallAction drawStateCall(Draw& draw, bool sets) {
  CallAction call;
  call.member = sets ? "clientSetState" : "clientGetState";
  call.key = !sets && draw.random.percent(15) ? keys::kUserDefaults : drawKey(draw);
  if (sets) call.value = drawStateValue(draw, call.key);
  return call;
}

Dictionary drawCancel(Draw& draw) {
  Dictionary which;
  if (!draw.chance(Fault::kOddRequests, 30)) {
    which.set(keys::kToken, "purge-" + std::to_string(draw.random.below(3)));
  }
  return which;
}

CallAction drawCall(Draw& draw, std::size_t index) {
  CallAction call;
  const std::uint64_t kind = draw.random.below(100);
  if (kind < 26) {
    call.member = "clientPurge";
    call.info = drawPurgeRequest(draw, index);
  } else if (kind < 46) {
    call.member = "clientPurgeableSpace";
    call.info = drawQuery(draw);
  } else if (kind < 62) {
    call.member = "clientItemizedPurgeableSpace";
    call.info = drawQuery(draw);
  } else if (kind < 70) {
    call.member = "clientCancelPurge";
    call.info = drawCancel(draw);
  } else {
    call = drawStateCall(draw, kind < 86);
  }
  return call;
}

}  // namespace

void drawClientActions(Draw& draw) {
  std::vector<Caller> callers;
  const std::size_t clients = draw.random.between(1, 3);
  for (std::size_t i = 0; i < clients; ++i) {
    callers.push_back({"client-" + std::to_string(i), drawRights(draw)});
  }
  const std::size_t calls = draw.random.between(2, 8) + (draw.lives - 1) * 3;
  for (std::size_t i = 0; i < calls; ++i) {
    PlannedAction action;
    CallAction call = drawCall(draw, i);
    const Caller& caller = callers[draw.random.below(callers.size())];
    call.client = caller.name;
    call.rights = caller.rights;
    action.life = static_cast<unsigned>(draw.random.below(draw.lives));
    if (draw.random.percent(60)) action.at_ns = drawMoment(draw.random);
    action.what = std::move(call);
    draw.plan.actions.push_back(std::move(action));
  }
}

}  // namespace spacekeep::sim
