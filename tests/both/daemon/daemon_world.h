// Thread safety: used by one test at a time.
//
// A world with a daemon object in it.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "sim/world/world.h"
#include "support/timebase.h"

namespace spacekeep::test {

/// Schedules per test; on real threads it is far fewer.
inline constexpr unsigned kSchedules = 50;
/// On real threads this is a few seconds, which a busy machine may need.
inline constexpr std::uint64_t kPatienceNs = 3'600'000'000'000;

struct DaemonWorld {
  DaemonWorld() {
    const rt::Timebase timebase = *rt::timebase();
    gTimebaseConversion = static_cast<double>(timebase.numerator) / timebase.denominator;
    world.volumes().add("/", 1'000'000'000, 0);
  }
  ~DaemonWorld() { world.shutDown(); }
  DaemonWorld(const DaemonWorld&) = delete;
  DaemonWorld& operator=(const DaemonWorld&) = delete;

  void start() { daemon = Spacekeep::create(platform); }

  [[nodiscard]] ServiceMap services() const { return daemon->mutableServices(); }
  [[nodiscard]] std::set<std::string> daemons() const {
    std::set<std::string> copy;
    daemon->daemons_queue()->sync([&] { copy = daemon->daemons(); });
    return copy;
  }
  [[nodiscard]] std::size_t lines(std::string_view format) const {
    return world.trace().linesWithFormat(format).size();
  }

  [[nodiscard]] bool eventually(const std::function<bool()>& condition) {
    return world.eventually(condition, kPatienceNs);
  }

  mutable sim::World world;
  Platform& platform = world.platform();
  std::shared_ptr<Spacekeep> daemon;
};

}  // namespace spacekeep::test
