// What a test must not do: pass without having looked, or wait for time to go by.
#include "tests/linux/tidy/line_rules.h"

namespace spacekeep::tidy {
namespace {

LineRule rule(std::string name, std::string pattern, std::vector<std::string> words,
              std::string instead) {
  LineRule made;
  made.name = std::move(name);
  made.where = Where::kTests;
  made.look = Look::kCode;
  made.pattern = std::move(pattern);
  made.words = std::move(words);
  made.instead = std::move(instead);
  return made;
}

}  // namespace

std::vector<LineRule> testRules() {
  LineRule truths = rule("TestsOfWhatIsAlwaysTrue",
                         "_(TRUE|FALSE)\\((true|false|0|1)\\)|SUCCEED\\(\\)|"
                         "_(EQ|GE|LE)\\((\\d+)U?, \\4U?\\)|_GE\\(.*, 0[Uu]+\\);",
                         {"EXPECT_", "ASSERT_", "SUCCEED"}, "an expectation that can fail");
  truths.planted = {"EXPECT_TRUE(true);", "ASSERT_FALSE(false);", "SUCCEED();", "EXPECT_EQ(1, 1);",
                    "EXPECT_GE(list.size(), 0U);"};
  truths.harmless = {"EXPECT_TRUE(truth);", "EXPECT_EQ(1, n);", "EXPECT_GE(list.size(), 10U);",
                     "EXPECT_GE(a, 0);"};

  LineRule disabled = rule("TestsThatAreSwitchedOff", "\\bDISABLED_|#if 0\\b", {"DISABLED_", "#if"},
                           "a test that runs, or none");
  disabled.planted = {"TEST(A, DISABLED_B) {", "#if 0"};
  disabled.harmless = {"#if defined(A)", "NOT_DISABLED;"};

  LineRule skipped = rule("TestsSkippedWithoutAReason", "GTEST_SKIP\\(\\)\\s*;", {"GTEST_SKIP"},
                          "GTEST_SKIP() << \"what is missing\"");
  skipped.planted = {"GTEST_SKIP();", "if (!root) GTEST_SKIP() ;"};
  skipped.harmless = {"GTEST_SKIP() << \"needs root\";"};

  LineRule unseen = rule("CommandsWhoseEndIsNotLookedAt", "^\\s*(std::|::)?system\\(", {"system("},
                         "the helper that looks at the exit status");
  unseen.planted = {"std::system(command);", "  ::system(command);"};
  unseen.harmless = {"if (std::system(command) != 0) fail();", "file_system(3);"};
  return {truths, disabled, skipped, unseen};
}

}  // namespace spacekeep::tidy
