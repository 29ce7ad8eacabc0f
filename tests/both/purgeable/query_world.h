// Thread safety: used by one test at a time.
//
// A daemon with services that are asked what they could free.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "purgeable/purgeable_operation.h"
#include "tests/both/client/state_world.h"

namespace spacekeep::test {

inline constexpr std::uint64_t kMs = 1'000'000;
inline constexpr std::uint64_t kSecond = 1'000'000'000;

struct QueryWorld : StateWorld {
  using Operation = std::shared_ptr<SpacekeepPurgeableOperation>;

  /// A query as the dispatch makes it, on "/" unless `info` says another volume.
  [[nodiscard]] Operation make(Dictionary info = {}) {
    if (!info.contains(keys::kVolume)) info.set(keys::kVolume, "/");
    return makeOperation<SpacekeepPurgeableOperation>(platform, std::move(info),
                                                      *daemon->copyServices(), daemon);
  }

  /// Runs it to its end. The completion must have run once by then.
  static Dictionary run(SpacekeepPurgeableOperation& operation) {
    const auto outcomes = std::make_shared<rt::Guarded<std::vector<Dictionary>>>();
    operation.startOperation([outcomes](const Dictionary& outcome) {
      outcomes->update([&](std::vector<Dictionary>& list) { list.push_back(outcome); });
    });
    EXPECT_EQ(outcomes->get().size(), 1U);
    return outcomes->get().empty() ? Dictionary() : outcomes->get().front();
  }
  Dictionary query(Dictionary info = {}) { return run(*make(std::move(info))); }

  /// What the daemon remembers from now on.
  void remember(SpacekeepRecentInfo record) {
    setSync(shared(std::move(record)), keys::kRecentServiceStats);
  }
  /// The amounts that the daemon remembers for `volume`.
  Dictionary remembered(const std::string& volume = "/") {
    Dictionary amounts;
    const auto known = record();
    const SpacekeepRecentVolumeInfo* entry = known ? known->volume(volume) : nullptr;
    if (entry == nullptr) return amounts;
    for (const auto& [id, service] : entry->services) amounts.set(id, service.amount);
    return amounts;
  }

  /// Log lines of the format, filled.
  [[nodiscard]] std::vector<std::string> filled(std::string_view format) const {
    return world.trace().linesWithFormat(format);
  }
};

/// Answers a query as `answer` says, `delay_ns` after it came, and owns `bytes` on "/".
inline sim::ServiceBehaviour answersQueries(sim::Answer answer, std::uint64_t bytes = 0,
                                            std::uint64_t delay_ns = 0) {
  sim::ServiceBehaviour behaviour = sim::ownsBytes("/", bytes);
  behaviour.purgeable = sim::CallBehaviour{.answer = answer, .delay_ns = delay_ns};
  return behaviour;
}

/// Owns `bytes` on "/" and says so `delay_ns` after it was asked.
inline sim::ServiceBehaviour couldFree(std::uint64_t bytes, std::uint64_t delay_ns = 0) {
  return answersQueries(sim::Answer::kReplies, bytes, delay_ns);
}

/// The result of a query on "/" with these amounts.
inline Dictionary resultOf(Dictionary amounts, std::int64_t total) {
  amounts.set(keys::kTotalAvailable, total);
  amounts.set(keys::kVolume, "/");
  return amounts;
}

}  // namespace spacekeep::test
