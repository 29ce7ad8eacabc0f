// A directory that is removed with all that is in it, and what that gives back.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "services/command/engine/remove_tree.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

class RemoveTree : public testing::Test {
 protected:
  [[nodiscard]] Removed remove(const Volume& volume,
                               const CancelToken& cancel = CancelToken()) const {
    volume.settle();
    const cachedir::UniqueFd fd(::open(volume.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return removeTree(fd.get(), "tree", cancel);
  }
};

TEST_F(RemoveTree, AFileCountsOnceAndOnlyWithItsLastName) {
  const Volume volume("tmpfs");
  writeFile(volume / "tree/alone", kMiB);
  writeFile(volume / "tree/twice", kMiB);
  writeFile(volume / "tree/below/elsewhere", kMiB);
  ASSERT_EQ(::link((volume / "tree/twice").c_str(), (volume / "tree/below/twice").c_str()), 0);
  ASSERT_EQ(::link((volume / "tree/below/elsewhere").c_str(), (volume / "stays").c_str()), 0);
  const Removed removed = remove(volume);
  EXPECT_TRUE(removed.all);
  EXPECT_EQ(removed.bytes, 2 * kMiB);
  EXPECT_FALSE(exists(volume / "tree"));
  EXPECT_TRUE(exists(volume / "stays"));
}

TEST_F(RemoveTree, WhatHadGoneBeforeIsNotCounted) {
  const Volume volume("tmpfs");
  const Removed removed = remove(volume);
  EXPECT_TRUE(removed.all);
  EXPECT_EQ(removed.bytes, 0U);
}

TEST_F(RemoveTree, BlocksThatAFileElsewhereSharesAreNotCounted) {
  const Volume volume("xfs");
  writeFile(volume / "tree/own", kMiB);
  writeFile(volume / "tree/shared", kMiB);
  cachedir::run("cp --reflink=always " + (volume / "tree/shared") + " " + (volume / "copy"));
  const Removed removed = remove(volume);
  EXPECT_TRUE(removed.all);
  EXPECT_EQ(removed.bytes, kMiB);
}

TEST_F(RemoveTree, WhatSomebodyHasOpenIsNotCounted) {
  const Volume volume("tmpfs");
  writeFile(volume / "tree/own", kMiB);
  writeFile(volume / "tree/open", kMiB);
  const cachedir::Holder holder(
      [&volume] { return ::open((volume / "tree/open").c_str(), O_RDONLY) >= 0; });
  EXPECT_EQ(remove(volume).bytes, kMiB);
}

TEST_F(RemoveTree, AfterACancelWhatHadGoneCounts) {
  const Volume volume("tmpfs");
  for (const char* name : {"tree/a", "tree/b", "tree/c"}) writeFile(volume / name, kMiB);
  int questions = 0;
  const Removed removed = remove(volume, CancelToken([&questions] { return ++questions > 2; }));
  EXPECT_FALSE(removed.all);
  EXPECT_EQ(removed.bytes, 2 * kMiB);
  EXPECT_TRUE(remove(volume).all) << "a later call goes on";
}

}  // namespace
}  // namespace spacekeep::command
