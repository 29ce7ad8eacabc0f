// Files that are dated outside of the years that nanoseconds on the wall clock can tell.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr time_t kYear2300 = 10'413'792'000;
constexpr time_t kYear1600 = -11'676'096'000;

void date(const std::string& path, time_t seconds) {
  const timespec times[2] = {{seconds, 0}, {seconds, 0}};
  ASSERT_EQ(::utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  struct stat facts {};
  ASSERT_EQ(::stat(path.c_str(), &facts), 0);
  ASSERT_EQ(facts.st_mtim.tv_sec, seconds);
}

TEST(FarTimes, AFileDatedFarAheadIsTheYoungest) {
  const Volume volume("tmpfs");
  writeFile(volume / "ahead", kMiB);
  writeFile(volume / "today", kMiB, 0);
  date(volume / "ahead", kYear2300);
  EXPECT_THAT(CacheCleaner(rulesFor(volume.path())).estimate({}).bytes,
              ElementsAre(0, 0, 0, 2 * kMiB));
  EXPECT_THAT(freeIn(volume.path(), 2 * kMiB, 3).paths, IsEmpty());
  EXPECT_THAT(freeIn(volume.path(), 2 * kMiB, 4).paths,
              ElementsAre(volume / "today", volume / "ahead"));
}

TEST(FarTimes, AFileDatedFarBackIsTheOldestAndTheDailyPassTakesItOnlyWhereItHasASpan) {
  const Volume volume("tmpfs");
  writeFile(volume / "back", kMiB);
  writeFile(volume / "old", kMiB);
  date(volume / "back", kYear1600);
  CacheCleaner cleaner(rulesFor(volume.path()));
  EXPECT_THAT(freeWith(cleaner, {.periodic = true}).paths, IsEmpty());
  EXPECT_THAT(freeIn(volume.path(), 2 * kMiB, 1).paths,
              ElementsAre(volume / "back", volume / "old"));
}

}  // namespace
}  // namespace spacekeep::cachedir
