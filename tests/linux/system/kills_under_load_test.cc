// The daemon is killed at any moment while everything goes on at once, ten thousand times if asked
// to. After each restart what was answered is there, and services come back by themselves.
//
// SPACEKEEP_KILLS=10000 makes the run longer than the few kills of every day;
// SPACEKEEP_KILLS_SIDE_BY_SIDE sets how many daemons live at once.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "support/runtime/runtime.h"
#include "tests/linux/system/kills_under_load_world.h"
#include "tests/linux/system/state_client.h"

namespace spacekeep::system_test {
namespace {

constexpr int kEverydayKills = 40;
constexpr int kEverydaySideBySide = 4;
constexpr std::uint64_t kMs = 1'000'000;
constexpr std::uint64_t kKillsPerProgress = 200;
/// A daemon starts in some 20 ms on a quiet machine; these are many at once on a busy one.
constexpr std::uint64_t kSlowestFirstAnswerMs = 10'000;

int numberFrom(const char* variable, int otherwise) {
  const char* text = std::getenv(variable);
  return text == nullptr ? otherwise : std::max(1, std::atoi(text));
}

struct Figures {
  std::uint64_t kills = 0;
  std::uint64_t before_the_first_answer = 0;
  std::uint64_t ended_by_itself = 0;
  std::uint64_t restarts_looked_at = 0;
  std::uint64_t stuck = 0;
  std::uint64_t slowest_first_answer_ms = 0;
  std::uint64_t slowest_all_back_ms = 0;

  void add(const Figures& other) {
    kills += other.kills;
    before_the_first_answer += other.before_the_first_answer;
    ended_by_itself += other.ended_by_itself;
    restarts_looked_at += other.restarts_looked_at;
    stuck += other.stuck;
    slowest_first_answer_ms = std::max(slowest_first_answer_ms, other.slowest_first_answer_ms);
    slowest_all_back_ms = std::max(slowest_all_back_ms, other.slowest_all_back_ms);
  }
};

/// One daemon after another in one world.
class Lives {
 public:
  Lives(LoadedWorld& world, unsigned seed) : world_(world), random_(seed) {}

  Figures live(int kills) {
    world_.startLoad();
    for (int kill = 0; kill < kills && figures_.stuck == 0; ++kill) {
      world_.startDaemon();
      // Every other life may end while the daemon starts or services check in.
      if (kill % 2 == 0) {
        rt::sleepNs(random_() % (150 * kMs));
        ++figures_.before_the_first_answer;
      } else {
        lookAtTheRestart();
        rt::sleepNs(random_() % (100 * kMs));  // the kill comes at any moment
      }
      if (!world_.killDaemon()) endedByItself();
      ++figures_.kills;
      if (figures_.kills % kKillsPerProgress == 0) showProgress();
      world_.renewOneService();
    }
    return figures_;
  }

 private:
  void showProgress() const {
    std::fprintf(stderr, "%llu kills here, %llu answered writes, %llu stuck\n",
                 static_cast<unsigned long long>(figures_.kills),
                 static_cast<unsigned long long>(world_.answeredWrites()),
                 static_cast<unsigned long long>(figures_.stuck));
  }
  void lookAtTheRestart() {
    const std::uint64_t start_ms = monotonicMs();
    if (!world_.waitForFirstAnswer()) return isStuck("no answer to a read of the state");
    const std::uint64_t first_ms = monotonicMs() - start_ms;
    if (!world_.waitUntilAllServicesArePurged()) return isStuck("not every service is back");
    if (!world_.waitForWholeQuery()) return isStuck("no query names every service");
    ++figures_.restarts_looked_at;
    figures_.slowest_first_answer_ms = std::max(figures_.slowest_first_answer_ms, first_ms);
    figures_.slowest_all_back_ms = std::max(figures_.slowest_all_back_ms, monotonicMs() - start_ms);
  }
  void isStuck(const std::string& why) {
    ++figures_.stuck;
    ADD_FAILURE() << why << " after kill " << figures_.kills << ": " << world_.daemonLog();
  }
  void endedByItself() {
    ++figures_.ended_by_itself;
    ADD_FAILURE() << "the daemon ended by itself before kill " << figures_.kills << ": "
                  << world_.daemonLog();
  }

  LoadedWorld& world_;
  std::mt19937 random_;
  Figures figures_;
};

struct Sums {
  std::uint64_t writes = 0;
  std::uint64_t lost = 0;
  std::uint64_t purges = 0;
  std::uint64_t queries = 0;
  std::uint64_t check_ins = 0;
};

Sums sumsOf(const std::vector<std::unique_ptr<LoadedWorld>>& worlds) {
  Sums sums;
  for (const auto& world : worlds) {
    sums.writes += world->answeredWrites();
    sums.lost += world->lostWrites();
    sums.purges += world->counts().purges;
    sums.queries += world->counts().queries;
    sums.check_ins += world->counts().check_ins;
  }
  return sums;
}

void print(const Figures& figures, const Sums& sums) {
  const auto number = [](std::uint64_t value) { return static_cast<unsigned long long>(value); };
  std::printf(
      "%llu kills (%llu of them within 150 ms of the start), %llu restarts looked at, "
      "%llu stuck, %llu daemons that ended by themselves\n"
      "%llu answered writes, %llu lost; under load %llu purges, %llu queries, %llu check-ins\n"
      "longest from restart to the first good answer %llu ms, to all services back, purged and "
      "queried %llu ms\n",
      number(figures.kills), number(figures.before_the_first_answer),
      number(figures.restarts_looked_at), number(figures.stuck), number(figures.ended_by_itself),
      number(sums.writes), number(sums.lost), number(sums.purges), number(sums.queries),
      number(sums.check_ins), number(figures.slowest_first_answer_ms),
      number(figures.slowest_all_back_ms));
}

Figures liveSideBySide(const std::vector<std::unique_ptr<LoadedWorld>>& worlds, int kills) {
  std::mutex mutex;
  Figures all;
  std::vector<std::thread> drivers;
  const int each = (kills + static_cast<int>(worlds.size()) - 1) / static_cast<int>(worlds.size());
  for (std::size_t i = 0; i < worlds.size(); ++i) {
    drivers.emplace_back([&mutex, &all, each, i, &world = *worlds[i]] {
      const Figures figures = Lives(world, 20'240'301 + static_cast<unsigned>(i)).live(each);
      const std::scoped_lock lock(mutex);
      all.add(figures);
    });
  }
  for (std::thread& driver : drivers) driver.join();
  return all;
}

TEST(KillsUnderLoad, LoseNoAnsweredWriteAndServicesComeBackByThemselves) {
  std::vector<std::unique_ptr<LoadedWorld>> worlds;
  const int side_by_side = numberFrom("SPACEKEEP_KILLS_SIDE_BY_SIDE", kEverydaySideBySide);
  for (int i = 0; i < side_by_side; ++i) worlds.push_back(std::make_unique<LoadedWorld>());
  const Figures figures = liveSideBySide(worlds, numberFrom("SPACEKEEP_KILLS", kEverydayKills));
  const Sums sums = sumsOf(worlds);
  print(figures, sums);
  EXPECT_EQ(figures.stuck, 0U);
  EXPECT_EQ(figures.ended_by_itself, 0U);
  EXPECT_EQ(sums.lost, 0U);
  EXPECT_LT(figures.slowest_first_answer_ms, kSlowestFirstAnswerMs);
  EXPECT_GT(figures.restarts_looked_at, 0U);
  EXPECT_GT(sums.writes, figures.kills);
  EXPECT_GT(sums.purges, 0U);
  EXPECT_GT(sums.queries, 0U);
  EXPECT_GT(sums.check_ins, 0U);
}

}  // namespace
}  // namespace spacekeep::system_test
