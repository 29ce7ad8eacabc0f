// Amounts in what tools print.
#include "services/command/engine/output_amount.h"

#include <gtest/gtest.h>

namespace spacekeep::command {
namespace {

TEST(SizeAtBeginning, UnitsAreReadAsToolsWriteThem) {
  EXPECT_EQ(sizeAtBeginning("12", 1024), 12U);
  EXPECT_EQ(sizeAtBeginning("12 bytes", 1024), 12U);
  EXPECT_EQ(sizeAtBeginning("  3K", 1024), 3072U);
  EXPECT_EQ(sizeAtBeginning("1.5G in the file system.", 1024), 1610612736U);
  EXPECT_EQ(sizeAtBeginning("1.2GB", 1000), 1200000000U);
  EXPECT_EQ(sizeAtBeginning("300 kB,", 1000), 300000U);
  EXPECT_EQ(sizeAtBeginning("2 MiB", 1000), 2097152U);
  EXPECT_EQ(sizeAtBeginning("7 files", 1024), 7U) << "a word apart is not a unit";
}

TEST(SizeAtBeginning, WhatIsNoSizeIsNone) {
  for (const char* text : {"", "x", "-5", ".5", "12xyz", "1e5", "99999999999T", "nan", "inf"}) {
    EXPECT_EQ(sizeAtBeginning(text, 1024), std::nullopt) << text;
  }
}

TEST(AmountIn, WhatStandsAfterTheTextIsAddedUpOverAllLines) {
  const AmountInOutput how{AmountInOutput::Kind::kAfter, "space:", 0, 1000};
  EXPECT_EQ(amountIn("a\nReclaimed space: 1MB\nother space: 2kB\n", how), 1002000U);
  EXPECT_EQ(amountIn("nothing to do\n", how), 0U);
  EXPECT_EQ(amountIn("space: much\n", how), std::nullopt);
}

TEST(AmountIn, AColumnMayHaveAHeading) {
  const AmountInOutput how{AmountInOutput::Kind::kColumn, "", 2, 1024};
  EXPECT_EQ(amountIn("NAME SIZE\na 1K\nb\t2K x\n\n", how), 3072U);
  EXPECT_EQ(amountIn("a 1K\nb\n", how), std::nullopt);
  EXPECT_EQ(amountIn("", how), 0U);
}

TEST(PathsIn, OnlyAbsolutePathsAfterTheTextCount) {
  EXPECT_EQ(pathsIn("would remove /a/b\nwould remove c\n/d\nwould remove /e/\r\n", "would remove "),
            (std::set<std::string>{"/a/b", "/e"}));
  EXPECT_EQ(pathsIn("/x\n", ""), std::set<std::string>{"/x"});
}

}  // namespace
}  // namespace spacekeep::command
