// What is gathered of the kernel's events, and what that costs.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/index/event_inbox.h"
#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

constexpr WatchOwner kOwner{0, 7};

class Inbox : public testing::Test {
 protected:
  void open(EventInbox::Bounds bounds) { inbox_ = std::make_unique<EventInbox>(bounds); }
  int watch(const std::string& path, WatchOwner owner = kOwner, std::uint64_t settle_ns = 0) {
    const UniqueFd fd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const EventInbox::Added added = inbox_->add(fd.get(), owner, settle_ns);
    EXPECT_EQ(added.outcome, EventInbox::Outcome::kWatched);
    return added.watch;
  }
  void touch(const std::string& name) { writeFile(path_ + "/" + name, 1, 0); }
  /// The names told of the one directory; everything else is empty.
  std::vector<std::string> names() {
    EventInbox::Taken taken = inbox_->take({true});
    EXPECT_FALSE(taken.lost);
    if (taken.changed.empty()) return {};
    EXPECT_EQ(taken.changed.size(), 1U);
    EXPECT_EQ(taken.changed[0].owner, kOwner);
    EXPECT_FALSE(taken.changed[0].whole);
    return taken.changed[0].names;
  }

  const Volume volume_{"tmpfs"};
  const std::string path_ = volume_.path();
  std::unique_ptr<EventInbox> inbox_ =
      std::make_unique<EventInbox>(EventInbox::Bounds{.own_thread = false});
};

TEST_F(Inbox, ANameIsToldOnceHoweverMuchHappenedToIt) {
  watch(path_);
  for (int i = 0; i < 50; ++i) touch("a");
  touch("b");
  EXPECT_THAT(names(), UnorderedElementsAre("a", "b"));
  EXPECT_THAT(names(), IsEmpty());
}

TEST_F(Inbox, AReadAndAChangeOfOneTimeAloneAreTold) {
  touch("read");
  touch("accessed");
  touch("modified");
  touch("quiet");
  watch(path_);
  char byte = 0;
  const UniqueFd fd(::open((path_ + "/read").c_str(), O_RDONLY | O_CLOEXEC));
  ASSERT_EQ(::read(fd.get(), &byte, 1), 1);
  const timespec accessed[2] = {{1, 0}, {0, UTIME_OMIT}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (path_ + "/accessed").c_str(), accessed, 0), 0);
  const timespec modified[2] = {{0, UTIME_OMIT}, {1, 0}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (path_ + "/modified").c_str(), modified, 0), 0);
  EXPECT_THAT(names(), UnorderedElementsAre("read", "accessed", "modified"));
}

TEST_F(Inbox, ListingADirectoryIsNoNews) {
  std::filesystem::create_directory(path_ + "/inner");
  watch(path_);
  watch(path_ + "/inner");
  for (const auto& each : std::filesystem::recursive_directory_iterator(path_)) {
    static_cast<void>(each);
  }
  EXPECT_THAT(names(), IsEmpty());
}

TEST_F(Inbox, WhatIsOpenIsToldAgainUntilItIsClosed) {
  touch("a");
  watch(path_);
  UniqueFd fd(::open((path_ + "/a").c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_THAT(names(), ElementsAre("a"));
  EXPECT_THAT(names(), ElementsAre("a"));
  fd.reset();
  EXPECT_THAT(names(), ElementsAre("a"));
  EXPECT_THAT(names(), IsEmpty());
}

TEST_F(Inbox, WhatHasNotSettledIsToldAgain) {
  watch(path_, kOwner, 50 * kNsPerMs);
  touch("a");
  EXPECT_THAT(names(), ElementsAre("a"));
  const std::uint64_t begin = rt::ticks();
  while (!names().empty()) ASSERT_LT(elapsedNs(begin), 10'000 * kNsPerMs);
  EXPECT_GT(elapsedNs(begin), 40 * kNsPerMs);
}

TEST_F(Inbox, TooManyNamesInOneDirectoryMakeItChangedAsAWhole) {
  open({.max_names_of_one = 10, .own_thread = false});
  std::filesystem::create_directory(path_ + "/other");
  watch(path_);
  watch(path_ + "/other", {0, 8});
  for (int i = 0; i < 11; ++i) touch("f" + std::to_string(i));
  touch("other/g");
  const EventInbox::Taken taken = inbox_->take({true});
  ASSERT_EQ(taken.changed.size(), 2U);
  EXPECT_TRUE(taken.changed[0].whole);
  EXPECT_THAT(taken.changed[0].names, IsEmpty());
  EXPECT_FALSE(taken.changed[1].whole);
  EXPECT_THAT(taken.changed[1].names, ElementsAre("g"));
  touch("f3");
  EXPECT_THAT(names(), ElementsAre("f3")) << "from then on by name again";
}

TEST_F(Inbox, TooManyNamesInAllMakeEveryDirectoryChangedAsAWhole) {
  open({.max_names = 20, .own_thread = false});
  for (std::uint32_t i = 0; i < 3; ++i) {
    std::filesystem::create_directory(path_ + "/d" + std::to_string(i));
    watch(path_ + "/d" + std::to_string(i), {0, i});
  }
  for (int i = 0; i < 21; ++i) touch("d" + std::to_string(i % 3) + "/f" + std::to_string(i));
  for (const Changed& each : inbox_->take({true}).changed) EXPECT_TRUE(each.whole);
  touch("d1/again");
  const EventInbox::Taken taken = inbox_->take({true});
  ASSERT_EQ(taken.changed.size(), 1U);
  EXPECT_THAT(taken.changed[0].names, ElementsAre("again"));
}

TEST_F(Inbox, AnOverflowOfTheKernelsQueueIsToldOnceAndEndsAllWatches) {
  std::uint64_t queued = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> queued;
  ASSERT_GT(queued, 0U);
  open({.max_names = 1 << 20, .max_names_of_one = 1 << 20, .own_thread = false});
  watch(path_);
  // Making, opening, writing, closing, dating: at least three events each.
  for (std::uint64_t i = 0; i < queued / 2; ++i) touch("f" + std::to_string(i));
  EXPECT_TRUE(inbox_->take({true}).lost);
  EXPECT_EQ(inbox_->watches(), 0U);
  const EventInbox::Taken after = inbox_->take({true});
  EXPECT_FALSE(after.lost);
  EXPECT_THAT(after.changed, IsEmpty());
  watch(path_);
  touch("again");
  EXPECT_THAT(names(), ElementsAre("again"));
}

TEST_F(Inbox, NoMoreWatchesThanAllowed) {
  open({.max_watches = 1, .own_thread = false});
  std::filesystem::create_directory(path_ + "/inner");
  const int first = watch(path_);
  const UniqueFd inner(::open((path_ + "/inner").c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(inbox_->add(inner.get(), {0, 1}, 0).outcome, EventInbox::Outcome::kNoRoom);
  inbox_->remove(first);
  EXPECT_EQ(inbox_->add(inner.get(), {0, 1}, 0).outcome, EventInbox::Outcome::kWatched);
}

TEST_F(Inbox, ADirectoryThatIsWatchedAlreadyTellsForWhom) {
  watch(path_);
  const UniqueFd again(::open(path_.c_str(), O_RDONLY | O_CLOEXEC));
  const EventInbox::Added added = inbox_->add(again.get(), {3, 4}, 0);
  EXPECT_EQ(added.outcome, EventInbox::Outcome::kTaken);
  EXPECT_EQ(added.taken_by, kOwner);
}

TEST_F(Inbox, OneRootsNewsStayUntilThatRootIsAsked) {
  std::filesystem::create_directory(path_ + "/other");
  watch(path_ + "/other", {1, 0});
  touch("other/a");
  EXPECT_THAT(inbox_->take({true}).changed, IsEmpty());
  EXPECT_THAT(inbox_->take({true, false}).changed, IsEmpty());
  EXPECT_EQ(inbox_->take({false, true}).changed.size(), 1U);
}

TEST_F(Inbox, ItsThreadSleepsWhileNothingHappensAndWakesSeldomWhileMuchDoes) {
  open({});
  watch(path_);
  const std::uint64_t begin = rt::ticks();
  std::uint64_t made = 0;
  // Until it has woken several times, whatever else the machine does meanwhile; never so much
  // between two times that the kernel would have to throw events away.
  for (std::uint64_t woken = 0, since = 0; woken < 5;) {
    if (since < 1000) {
      touch("f" + std::to_string(made++ % 100));
      ++since;
    } else {
      ::sched_yield();
    }
    const std::uint64_t now = inbox_->wakeUps();
    if (now != woken) since = 0;
    woken = now;
    ASSERT_LT(elapsedNs(begin), 60'000 * kNsPerMs);
  }
  // Counted before the time is taken: this thread may stand still for long in between.
  const std::uint64_t woken = inbox_->wakeUps();
  const std::uint64_t pauses = elapsedNs(begin) / EventInbox::kPauseNs;
  EXPECT_LE(woken, pauses + 1);
  EXPECT_GT(made, 20U);
  EXPECT_EQ(names().size(), std::min<std::uint64_t>(made, 100));
}

TEST_F(Inbox, ItsThreadFollowsOverALoss) {
  open({});
  watch(path_);
  {
    const Volume other("tmpfs");
    watch(other.path(), {1, 8});
  }
  // A file system that went away costs what an overflow costs, and it is certain: more events than
  // the kernel keeps, faster than the thread reads them, come only by chance.
  const std::uint64_t begin = rt::ticks();
  while (inbox_->watches() > 0) {
    ::sched_yield();
    ASSERT_LT(elapsedNs(begin), 60'000 * kNsPerMs);
  }
  EXPECT_TRUE(inbox_->take({true}).lost);
  watch(path_);
  // More often than it is told to look at another descriptor.
  for (int round = 0; round < 4; ++round) {
    const std::uint64_t woken = inbox_->wakeUps();
    touch("again");
    while (inbox_->wakeUps() == woken) {
      ::sched_yield();
      ASSERT_LT(elapsedNs(begin), 120'000 * kNsPerMs);
    }
  }
  EXPECT_THAT(names(), ElementsAre("again"));
}

}  // namespace
}  // namespace spacekeep::cachedir
