// The daemon's own part of the state in a real file: beside what clients keep there, and beside
// another program that writes it.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/linux/preferences/suite_world.h"

namespace spacekeep::test {
namespace {

constexpr const char* kKey = keys::kRecentServiceStats;

/// A daemon with its state in SQLite, whose late writes come when the test says so.
struct FileWorld : StateWorld {
  FileWorld() {
    platform.openPreferencesSuite = [this](const std::string&) { return open(directory); };
    platform.after = [this](std::uint64_t, Task task) { late.push_back(std::move(task)); };
    start();
  }
  /// Answers how many there were.
  std::size_t makeLateWrites() {
    std::vector<Task> due;
    daemon->defaults_queue()->sync([&] { due.swap(late); });
    for (const Task& task : due) task();
    daemon->defaults_queue()->sync([] {});
    return due.size();
  }
  [[nodiscard]] std::optional<Value> inFile(const std::string& key) const {
    const auto state = fetch(directory, keys::kUserDefaults);
    const Dictionary* dictionary = state ? state->dictionary() : nullptr;
    const Value* value = dictionary == nullptr ? nullptr : dictionary->find(key);
    return value == nullptr ? std::nullopt : std::optional(*value);
  }

  const TemporaryDirectory directory;
  std::vector<Task> late;  // confined to defaults_queue
};

TEST(LateRecord, ThatDoesNotFitBesideWhatClientsKeepIsRememberedAndInNobodysWay) {
  FileWorld world;
  // Of one text that stands several times a property list holds one.
  for (const char letter : {'a', 'b', 'c', 'd', 'e'}) {
    ASSERT_TRUE(world.set(std::string("large ") + letter, Value(std::string(800 * 1024, letter))));
  }
  const SpacekeepRecentInfo record = recordOf("/", "cache", std::string(200 * 1024, 'y'));
  const Value archive = archivedRecentInfo(record);
  world.setSync(shared(record), kKey);
  EXPECT_EQ(world.makeLateWrites(), 1U);
  EXPECT_EQ(world.lines("%s recent statistics are not on the disk: %@"), 1U);
  EXPECT_EQ(world.record(), record);
  EXPECT_TRUE(world.get(kKey) == archive);
  EXPECT_TRUE(world.set("small", Value(1)));
  EXPECT_EQ(world.inFile("small"), Value(1));
  EXPECT_EQ(world.inFile(kKey), std::nullopt);
  EXPECT_EQ(world.record(), record);
  EXPECT_TRUE(world.set("large a", std::nullopt));
  EXPECT_GE(world.makeLateWrites(), 1U);
  EXPECT_TRUE(world.inFile(kKey) == archive);
  EXPECT_EQ(world.record(), record);
}

TEST(LateRecord, StandsBesideWhatAnotherProgramHasWrittenMeanwhile) {
  FileWorld world;
  EXPECT_TRUE(world.set("ours", Value(1)));
  const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
  const Value archive = archivedRecentInfo(record);
  world.setSync(shared(record), kKey);
  EXPECT_EQ(world.get(kKey), archive);
  store(world.directory, keys::kUserDefaults, Dictionary{{"ours", 2}, {"theirs", 3}});
  EXPECT_EQ(world.get("ours"), Value(2));
  EXPECT_EQ(world.get("theirs"), Value(3));
  world.makeLateWrites();
  EXPECT_EQ(fetch(world.directory, keys::kUserDefaults),
            Value(Dictionary{{kKey, archive}, {"ours", 2}, {"theirs", 3}}));
}

}  // namespace
}  // namespace spacekeep::test
