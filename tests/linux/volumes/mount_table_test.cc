// A mount table that cannot be read.
#include "support/volumes/linux/mount_table.h"

#include <gtest/gtest.h>

#include "tests/helpers/log_capture.h"

namespace spacekeep {
namespace {

TEST(MountTable, ThatCannotBeReadIsLoggedEachTimeAndHoldsNothing) {
  const test::LogCapture log;
  MountTable mounts("/nowhere/mountinfo");
  EXPECT_TRUE(mounts.current()->empty());
  EXPECT_TRUE(mounts.current()->empty());
  EXPECT_EQ(log.countExact(kLogProblem,
                           "readAgain cannot read the mount table /nowhere/mountinfo: No such file "
                           "or directory"),
            2U);
}

}  // namespace
}  // namespace spacekeep
