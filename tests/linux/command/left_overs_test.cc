// What a cancel or a crash left of directories that were to go as a whole.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "services/command/engine/opt_out.h"
#include "tests/linux/command/directory_world.h"

namespace spacekeep::command {
namespace {

using testing::IsEmpty;

class LeftOvers : public WholeDirectories {};

TEST_F(LeftOvers, WhatWasLeftIsKeptWhileItIsInUseAndGetsItsNameBackIfThatIsFree) {
  const std::function<bool(const std::string&)> uses[] = {
      [](const std::string& left) { return ::open((left + "/f").c_str(), O_RDONLY) >= 0; },
      [](const std::string& left) {
        return ::flock(::open((left + "/f").c_str(), O_RDONLY), LOCK_SH) == 0;
      },
      [](const std::string& left) { return ::chdir(left.c_str()) == 0; },
      [](const std::string& left) { return ::open(left.c_str(), O_DIRECTORY) >= 0; },
      [](const std::string& left) { return ::mkfifo((left + "/pipe").c_str(), 0600) == 0; }};
  for (const auto& use : uses) {
    writeFile(leftOf("free") + "/f", kMiB, 1);
    writeFile(leftOf("taken") + "/f", kMiB, 1);
    writeFile(volume_ / "all/taken/new", kMiB, 0);
    volume_.settle();
    {
      const cachedir::Holder holder([&] { return use(leftOf("free")); });
      const cachedir::Holder another([&] { return use(leftOf("taken")); });
      EXPECT_THAT(cache()->free(request(1), CancelToken(), {}).problems, IsEmpty());
    }
    EXPECT_TRUE(exists(volume_ / "all/free/f"));
    EXPECT_TRUE(exists(leftOf("taken") + "/f"));
    EXPECT_TRUE(exists(volume_ / "all/taken/new"));
    cachedir::run("rm -rf " + (volume_ / "all/free") + " " + leftOf("taken"));
  }
}

TEST_F(LeftOvers, AfterACancelTheRestNeverGetsItsNameBackAndGoesOnceNobodyUsesIt) {
  const std::string rest = leftOf("oldest", kHalfPrefix);
  const CancelToken once_it_goes([&rest] { return exists(rest); });
  EXPECT_EQ(cache()->free(request(1), once_it_goes, {}).bytes, 0U);
  ASSERT_TRUE(exists(rest + "/g"));
  EXPECT_FALSE(exists(volume_ / "all/oldest"));
  {
    const cachedir::Holder holder([&rest] { return ::open((rest + "/g").c_str(), O_RDONLY) >= 0; });
    EXPECT_EQ(cache()->free(request(1), CancelToken(), {}).bytes, kMiB) << "of another one";
    EXPECT_TRUE(exists(rest + "/g"));
    EXPECT_FALSE(exists(volume_ / "all/oldest"));
  }
  EXPECT_EQ(cache()->free(request(3), CancelToken(), {}).bytes, 4 * kMiB);
  EXPECT_FALSE(exists(rest));
}

TEST_F(LeftOvers, TheAnswerComesOnceTheFileSystemShowsAlsoWhatWasLeft) {
  const Volume volume("btrfs");
  for (int i = 0; i < 50; ++i) {
    writeFile(volume / "all/" + kGoingPrefix + "x/" + std::to_string(i), kMiB);
  }
  volume.settle();
  const auto all = makeCache(
      ruleFrom(directory(volume / "all/*", "<key>WHOLE_DIRECTORIES</key><true/>")), nullptr);
  const std::uint64_t before = volume.freeBytes();
  Request on = request(1);
  on.volume = volume.path();
  EXPECT_EQ(all->free(on, CancelToken(), {}).bytes, 50 * kMiB);
  EXPECT_GE(volume.freeBytes(), before + 50 * kMiB);
}

TEST_F(LeftOvers, WhatWasLeftOnAnotherVolumeStaysAndDoesNotCount) {
  const Volume other("tmpfs");
  writeFile(leftOf("gone") + "/f", kMiB, 1);
  Request elsewhere = request(4);
  elsewhere.volume = other.path();
  EXPECT_EQ(cache()->free(elsewhere, CancelToken(), {}).bytes, 0U);
  EXPECT_TRUE(exists(leftOf("gone") + "/f"));
}

TEST_F(LeftOvers, WhatACrashLeftIsFinishedFirstAndCounts) {
  const std::string left = leftOf("gone");
  writeFile(left + "/f", kMiB, 1);
  volume_.settle();
  const Went went{cache()->free(request(1, kMiB), CancelToken(), {}), {}, 0};
  EXPECT_EQ(went.result.bytes, kMiB);
  EXPECT_FALSE(exists(left));
  EXPECT_TRUE(exists(volume_ / "all/oldest")) << "the rest of the last one was enough";
}

TEST_F(LeftOvers, WhatWasLeftGoesAlsoWhereNoOtherDirectoryIs) {
  const std::string left = volume_ / ("alone/" + std::string(kGoingPrefix) + "x");
  writeFile(left + "/f", kMiB, 1);
  volume_.settle();
  const auto alone = makeCache(
      ruleFrom(directory(volume_ / "al*e/*", "<key>WHOLE_DIRECTORIES</key><true/>")), nullptr);
  EXPECT_EQ(alone->free(request(1), CancelToken(), {}).bytes, kMiB);
  EXPECT_FALSE(exists(left));
}

TEST_F(LeftOvers, WhatWasLeftIsKeptByNameOrMarkerAndGetsItsNameBackIfNothingHadGone) {
  for (const char* name : {"kept", "marked"}) {
    for (const char* prefix : {kGoingPrefix, kHalfPrefix}) {
      writeFile(leftOf(name, prefix) + "/f", kMiB, 1);
    }
  }
  for (const char* prefix : {kGoingPrefix, kHalfPrefix}) {
    writeFile(leftOf("marked", prefix) + "/" + kOptOutMarker, 0);
  }
  volume_.settle();
  const auto keeping = cache("<key>KEEP</key>" + arrayOf({"kept", "old*", "mixed"}));
  EXPECT_EQ(keeping->free(request(4), CancelToken(), {}).bytes, 0U);
  for (const char* name : {"kept", "marked"}) {
    EXPECT_TRUE(exists(volume_ / "all" + "/" + name + "/f"));
    EXPECT_TRUE(exists(leftOf(name, kHalfPrefix) + "/f"));
  }
}

TEST_F(LeftOvers, WhatWasLeftOfADirectoryOfAnotherPatternIsNoneOfTheRules) {
  writeFile(leftOf("oth\\er") + "/f", kMiB, 1);
  volume_.settle();
  for (const char* pattern : {"all/o?d*", "all/.*", "all/oth"}) {
    const auto another = makeCache(
        ruleFrom(directory(volume_ / pattern, "<key>WHOLE_DIRECTORIES</key><true/>")), nullptr);
    static_cast<void>(another->free(request(4), CancelToken(), {}));
    EXPECT_TRUE(exists(leftOf("oth\\er") + "/f")) << pattern;
  }
  const auto its_own = makeCache(
      ruleFrom(directory(volume_ / "all/oth\\er", "<key>WHOLE_DIRECTORIES</key><true/>")), nullptr);
  EXPECT_EQ(its_own->free(request(1), CancelToken(), {}).bytes, kMiB);
}

TEST_F(LeftOvers, TwoThatWereLeftOfOneNameBothGoAtOnce) {
  writeFile(leftOf("gone") + "/f", kMiB, 1);
  writeFile(leftOf("gone", kHalfPrefix) + "/f", kMiB, 1);
  volume_.settle();
  EXPECT_EQ(cache()->free(request(1, 2 * kMiB), CancelToken(), {}).bytes, 2 * kMiB);
  EXPECT_FALSE(exists(leftOf("gone")));
}

TEST_F(LeftOvers, WhatWasLeftIsLookedForInTheVeryFoldersWhateverTheirNames) {
  const std::string left = std::string("/") + kHalfPrefix + "x";
  for (const char* folder : {"each/a", "each/[ab]", "each/?"}) {
    writeFile(volume_ / folder + left + "/f", kMiB, 1);
    writeFile(volume_ / folder + "/present/f", kMiB, 1);
  }
  volume_.settle();
  const auto each = makeCache(
      ruleFrom(directory(volume_ / "each/*/*", "<key>WHOLE_DIRECTORIES</key><true/>")), nullptr);
  EXPECT_EQ(each->free(request(1), CancelToken(), {}).bytes, 3 * kMiB);
  for (const char* folder : {"each/a", "each/[ab]", "each/?"}) {
    EXPECT_FALSE(exists(volume_ / folder + left));
  }
}

TEST_F(LeftOvers, OneWhosePathLeadsElsewhereMeanwhileStays) {
  const std::string first = leftOf("a", kHalfPrefix) + "/f";
  const std::string second = leftOf("b", kHalfPrefix) + "/f";
  writeFile(first, kMiB);
  writeFile(second, kMiB);
  const cachedir::Holder holder([&second] { return ::open(second.c_str(), O_RDONLY) >= 0; });
  const CancelToken once_the_first_is_gone([&] {
    if (!exists(first) && !exists(volume_ / "moved")) {
      cachedir::run("mv " + (volume_ / "all") + " " + (volume_ / "moved"));
      writeFile(second, kMiB);
    }
    return false;
  });
  static_cast<void>(cache()->free(request(4, kMiB), once_the_first_is_gone, {}));
  EXPECT_TRUE(exists(volume_ / "moved" + second.substr((volume_ / "all").size())));
  EXPECT_TRUE(exists(second)) << "of the next request";
}

}  // namespace
}  // namespace spacekeep::command
