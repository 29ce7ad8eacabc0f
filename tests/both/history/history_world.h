// Thread safety: used by one test at a time.
//
// A world that keeps a history, with or without a daemon in it.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/spacekeep.h"
#include "history/history.h"
#include "history/history_keys.h"
#include "operations/info_keys.h"
#include "sim/world/world.h"
#include "support/runtime/guarded.h"

namespace spacekeep::test {

inline constexpr unsigned kSchedules = 50;
inline constexpr std::uint64_t kSecond = 1'000'000'000;
/// On real threads this is a few seconds, which a busy machine may need.
inline constexpr std::uint64_t kPatienceNs = 3'600'000'000'000;

/// What came of asking for a page.
struct PageAnswer {
  std::optional<Dictionary> page;
  std::string failure;

  [[nodiscard]] std::vector<Dictionary> entries() const {
    std::vector<Dictionary> all;
    const Value* entries = page ? page->find(keys::kEntries) : nullptr;
    if (entries == nullptr || entries->array() == nullptr) return all;
    for (const Value& entry : *entries->array()) all.push_back(*entry.dictionary());
    return all;
  }
};

struct HistoryWorld {
  HistoryWorld() { world.volumes().add("/", 1'000'000'000, 0); }
  ~HistoryWorld() { world.shutDown(); }
  HistoryWorld(const HistoryWorld&) = delete;
  HistoryWorld& operator=(const HistoryWorld&) = delete;

  void start() { daemon = Spacekeep::create(world.platform()); }

  PageAnswer page(History& history, const Dictionary& request = {}) {
    const auto answer = std::make_shared<rt::Guarded<std::optional<PageAnswer>>>();
    history.page(
        request,
        [answer](Dictionary page) {
          answer->set(PageAnswer{std::move(page), ""});
        },
        [answer](std::string why) {
          answer->set(PageAnswer{std::nullopt, std::move(why)});
        });
    EXPECT_TRUE(eventually([&] { return answer->get().has_value(); }));
    return answer->get().value_or(PageAnswer());
  }

  /// The entries as a client with the right sees them.
  std::vector<Dictionary> entries(const Dictionary& request = {}) {
    const auto reader = world.client("reader", {"ITEMIZED_PURGEABLE_ENTITLEMENT"});
    return PageAnswer{world.call(reader, "clientHistory", {request})->wait(), ""}.entries();
  }

  [[nodiscard]] bool eventually(const std::function<bool()>& condition) {
    return world.eventually(condition, kPatienceNs);
  }
  [[nodiscard]] std::vector<std::string> problems() const {
    return world.trace().linesOfLevel(kLogProblem);
  }

  mutable sim::World world{sim::World::Options{.keeps_history = true}};
  std::shared_ptr<Spacekeep> daemon;
};

inline Dictionary numbered(int number) { return {{keys::kVolume, "/"}, {"N", number}}; }

}  // namespace spacekeep::test
