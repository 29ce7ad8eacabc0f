// The number behind a pidfd: whatever is not plainly the number of a process that is there is none.
#include "support/access/fdinfo_pid.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>

namespace spacekeep::access {
namespace {

std::string fdinfo(const std::string& line) {
  return "pos:\t0\nflags:\t02000002\nmnt_id:\t15\nino:\t1\n" + line + "\nNSpid:\t77\n";
}

TEST(FdinfoPid, TheNumberOnThePidLineIsTheProcess) {
  EXPECT_EQ(pidFromFdinfo(fdinfo("Pid:\t1234")), 1234);
  EXPECT_EQ(pidFromFdinfo(fdinfo("Pid: \t 7")), 7);
  EXPECT_EQ(pidFromFdinfo("ino:\t1\nPid:\t2147483647"), 2'147'483'647) << "the text ends with it";
}

TEST(FdinfoPid, AProcessThatIsGoneOrOutOfSightHasNone) {
  EXPECT_EQ(pidFromFdinfo(fdinfo("Pid:\t-1")), std::nullopt);
  EXPECT_EQ(pidFromFdinfo(fdinfo("Pid:\t0")), std::nullopt);
}

TEST(FdinfoPid, ANumberThatIsNotWholeIsNone) {
  for (const char* line : {"Pid:\t12x", "Pid:\t12 34", "Pid:\tx12", "Pid:\t", "Pid:", "Pid:\t+5",
                           "Pid:\t0x10", "Pid:\t2147483648", "Pid:\t99999999999999999999"}) {
    EXPECT_EQ(pidFromFdinfo(fdinfo(line)), std::nullopt) << line;
  }
}

TEST(FdinfoPid, ALineThatOnlyEndsLikeItIsNotTaken) {
  EXPECT_EQ(pidFromFdinfo("ino:\t1\nNSpid:\t77\n"), std::nullopt);
  EXPECT_EQ(pidFromFdinfo("ino:\t1\nTPid:\t77\n"), std::nullopt);
  EXPECT_EQ(pidFromFdinfo(""), std::nullopt);
}

}  // namespace
}  // namespace spacekeep::access
