// What goes, in which order, and what is claimed for it, on each kind of file system.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class Freeing : public testing::TestWithParam<const char*> {
 protected:
  Volume volume_{GetParam()};
};
INSTANTIATE_TEST_SUITE_P(On, Freeing, testing::Values("ext4", "xfs", "btrfs", "tmpfs"),
                         [](const auto& about) { return about.param; });

TEST_P(Freeing, TheLeastRecentlyUsedGoFirstAndItStopsAtTheAmount) {
  for (int i = 0; i < 10; ++i) {
    // Neither the order of names nor that of creation is the order of use.
    writeFile(volume_ / ("d" + std::to_string(i % 3) + "/f" + std::to_string(i)), kMiB,
              100 + (i * 7) % 10);
  }
  volume_.settle();
  const Observed seen = freeIn(volume_.path(), 2 * kMiB + 1);
  EXPECT_THAT(seen.paths, ElementsAre(volume_ / "d1/f7", volume_ / "d1/f4", volume_ / "d1/f1"));
  EXPECT_EQ(seen.result.files, 3U);
  EXPECT_EQ(seen.result.bytes, 3 * kMiB);
  EXPECT_FALSE(exists(volume_ / "d1/f7"));
  EXPECT_TRUE(exists(volume_ / "d0/f0"));
}

TEST_P(Freeing, WhatIsClaimedIsWhatTheFileSystemHasBackWhenTheAnswerComes) {
  for (int i = 0; i < 60; ++i) {
    writeFile(volume_ / ("f" + std::to_string(i)), kMiB + static_cast<std::uint64_t>(i) * 8192,
              100 - i);
  }
  volume_.settle();
  const std::uint64_t before = volume_.freeBytes();
  const Observed seen = freeIn(volume_.path(), 40 * kMiB);
  const std::uint64_t back = volume_.freeBytes() - before;
  EXPECT_GE(seen.result.bytes, 40 * kMiB);
  EXPECT_LE(seen.result.bytes, 42 * kMiB);
  EXPECT_GE(back, seen.result.bytes);
  EXPECT_LE(back, seen.result.bytes + kMiB / 2);  // metadata of the file system's own
}

TEST_P(Freeing, AReadCountsAsUseAsAWriteDoes) {
  writeFile(volume_ / "read", kMiB, 200);
  writeFile(volume_ / "older", kMiB, 100);
  const timespec times[2] = {{.tv_sec = 0, .tv_nsec = UTIME_NOW},
                             {.tv_sec = 0, .tv_nsec = UTIME_OMIT}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (volume_ / "read").c_str(), times, 0), 0);
  volume_.settle();
  EXPECT_THAT(freeIn(volume_.path(), kMiB, 1).paths, ElementsAre(volume_ / "older"));
}

TEST_P(Freeing, EachUrgencyTakesYoungerFilesThanTheOneBefore) {
  const std::vector<std::pair<const char*, double>> files = {
      {"days31", 31},         {"days29", 29},         {"days8", 8}, {"days6", 6},
      {"hours25", 25.0 / 24}, {"hours23", 23.0 / 24}, {"now", 0},   {"tomorrow", -1}};
  for (const auto& [name, days] : files) writeFile(volume_ / name, kMiB, days);
  volume_.settle();
  CacheCleaner cleaner(rulesFor(volume_.path()));
  EXPECT_THAT(cleaner.estimate({}).bytes, ElementsAre(kMiB, 3 * kMiB, 5 * kMiB, 8 * kMiB));
  const std::size_t expected[] = {1, 2, 2, 3};
  for (int urgency = 1; urgency <= 4; ++urgency) {
    const Observed seen = freeWith(cleaner, {.amount = 100 * kMiB, .urgency = urgency});
    EXPECT_THAT(seen.paths, SizeIs(expected[urgency - 1])) << "urgency " << urgency;
  }
  EXPECT_THAT(cleaner.estimate({}).bytes, ElementsAre(0, 0, 0, 0));
}

TEST_P(Freeing, ASparseFileCountsForItsBlocksAlone) {
  {
    const UniqueFd fd(::open((volume_ / "sparse").c_str(), O_WRONLY | O_CREAT, 0644));
    const std::string block(kMiB, 'x');
    ASSERT_EQ(::pwrite(fd.get(), block.data(), kMiB, 0), static_cast<ssize_t>(kMiB));
    ASSERT_EQ(::ftruncate(fd.get(), 4096LL * 1024 * 1024), 0);
  }
  setAge(volume_ / "sparse", 50);
  volume_.settle();
  const std::uint64_t before = volume_.freeBytes();
  const Observed seen = freeIn(volume_.path(), 4096 * kMiB);
  EXPECT_EQ(seen.result.bytes, kMiB);
  EXPECT_EQ(volume_.freeBytes() - before, kMiB);
}

TEST_P(Freeing, NothingAskedNothingDone) {
  writeFile(volume_ / "f", kMiB);
  for (const int urgency : {-1, 0, 1, 4, 5}) {
    const std::uint64_t amount = urgency >= 1 && urgency <= 4 ? 0 : kMiB;
    EXPECT_EQ(freeIn(volume_.path(), amount, urgency).result.bytes, 0U);
  }
  EXPECT_TRUE(exists(volume_ / "f"));
}

TEST_P(Freeing, EmptyFilesGiveNothingAndStay) {
  writeFile(volume_ / "empty", 0);
  EXPECT_THAT(freeIn(volume_.path(), kMiB).paths, IsEmpty());
  EXPECT_TRUE(exists(volume_ / "empty"));
}

TEST_P(Freeing, SeveralPassesOverMoreFilesThanFitKeepTheOrder) {
  for (int i = 0; i < 50; ++i) {
    writeFile(volume_ / ("f" + std::to_string(i)), 8192, 100 + (i * 17) % 50);
  }
  volume_.settle();
  CacheCleaner cleaner(rulesFor(volume_.path()), {.max_files = 7});
  const Observed few = freeWith(cleaner, {.amount = 20 * 8192, .urgency = 4});
  CacheCleaner all(rulesFor(volume_.path()));
  const Observed rest = freeWith(all, {.amount = kMiB, .urgency = 4});
  ASSERT_THAT(few.paths, SizeIs(20));
  ASSERT_THAT(rest.paths, SizeIs(30));
  for (int i = 0; i < 50; ++i) {
    // Age 149 goes first; 17 has the inverse 3 modulo 50.
    const std::string expected = volume_ / ("f" + std::to_string(((49 - i) * 3) % 50));
    EXPECT_EQ(i < 20 ? few.paths[static_cast<std::size_t>(i)]
                     : rest.paths[static_cast<std::size_t>(i - 20)],
              expected);
  }
}

TEST_P(Freeing, ADryRunNamesTheVeryFilesAndDeletesNone) {
  for (int i = 0; i < 20; ++i) {
    writeFile(volume_ / ("f" + std::to_string(i)), 64 * 1024, 100 + (i * 7) % 20);
  }
  const UniqueFd held(::open((volume_ / "f17").c_str(), O_RDONLY));
  volume_.settle();
  const std::uint64_t before = volume_.freeBytes();
  CacheCleaner cleaner(rulesFor(volume_.path()), {.max_files = 4});
  const FreeRequest request{.amount = 10 * 64 * 1024, .urgency = 4, .dry_run = true};
  const Observed dry = freeWith(cleaner, request);
  EXPECT_EQ(volume_.freeBytes(), before);
  for (int i = 0; i < 20; ++i) EXPECT_TRUE(exists(volume_ / ("f" + std::to_string(i))));
  const Observed real = freeWith(cleaner, {.amount = 10 * 64 * 1024, .urgency = 4});
  EXPECT_EQ(dry.paths, real.paths);
  EXPECT_EQ(dry.result.bytes, real.result.bytes);
  EXPECT_EQ(real.result.bytes, 10U * 64 * 1024);
}

TEST_P(Freeing, KeptPatternsStayAndEmptiedDirectoriesGoWhenAsked) {
  for (const char* name : {"a/b/one", "a/two", "a/index.db", "models/x/three", "c/d/e/four"}) {
    writeFile(volume_ / name, 64 * 1024);
  }
  Rules rules = rulesFor(volume_ / "");
  rules.directories[0].path.pop_back();
  rules.directories[0].keep = {"*.db", "models/*"};
  rules.directories[0].remove_empty_directories = true;
  volume_.settle();
  CacheCleaner cleaner(rules);
  const Observed seen = freeWith(cleaner, {.amount = 100 * kMiB, .urgency = 4});
  EXPECT_EQ(seen.result.files, 3U);
  EXPECT_EQ(seen.result.directories, 4U);
  EXPECT_TRUE(exists(volume_ / "a/index.db"));
  EXPECT_TRUE(exists(volume_ / "models/x/three"));
  EXPECT_FALSE(exists(volume_ / "a/b"));
  EXPECT_FALSE(exists(volume_ / "c"));
  EXPECT_TRUE(exists(volume_.path()));
}

TEST_P(Freeing, TheDailyPassTakesWhatIsPastItsSpanAndNothingWithoutOne) {
  writeFile(volume_ / "old", kMiB, 91);
  writeFile(volume_ / "old_empty", 0, 91);
  writeFile(volume_ / "young", kMiB, 89);
  volume_.settle();
  Rules rules = rulesFor(volume_.path());
  CacheCleaner silent(rules);
  FreeRequest daily;
  daily.periodic = true;
  EXPECT_THAT(freeWith(silent, daily).paths, IsEmpty());
  rules.directories[0].periodic_unused_seconds = 90 * kSecondsPerDay;
  CacheCleaner tidy(rules);
  const Observed seen = freeWith(tidy, daily);
  EXPECT_THAT(seen.paths, testing::UnorderedElementsAre(volume_ / "old", volume_ / "old_empty"));
  EXPECT_EQ(seen.result.bytes, kMiB);
}

}  // namespace
}  // namespace spacekeep::cachedir
