// Each rule about a line, three times: the tree keeps it, a planted fault is found, and what only
// looks like one is not. A rule that cannot fail proves nothing.
#include <gtest/gtest.h>

#include <algorithm>
#include <set>
#include <string>
#include <vector>

#include "tests/linux/tidy/line_rules.h"

namespace spacekeep::tidy {
namespace {

TEST(TidyRules, AreKeptByTheTree) {
  for (const LineRule& rule : lineRules()) {
    const auto files = filesOf(rule);
    EXPECT_FALSE(files.empty()) << rule.name << " looks at nothing";
    std::string found;
    for (const SourceFile* file : files) found += brokenBy(rule, *file);
    EXPECT_EQ(found, "") << rule.name << "; instead: " << rule.instead
                         << "\nwhere it is right all the same: // tidy-allow: REASON";
  }
}

TEST(TidyRules, FindWhatIsPlanted) {
  for (const LineRule& rule : lineRules()) {
    EXPECT_FALSE(rule.planted.empty()) << rule.name;
    for (const std::string& line : rule.planted) {
      EXPECT_NE(brokenBy(rule, parsed("planted.cc", line)), "") << rule.name << ": " << line;
    }
  }
}

TEST(TidyRules, LeaveAloneWhatOnlyLooksLikeIt) {
  for (const LineRule& rule : lineRules()) {
    for (const std::string& line : rule.harmless) {
      EXPECT_EQ(brokenBy(rule, parsed("harmless.cc", line)), "") << rule.name << ": " << line;
    }
    if (rule.look == Look::kText) continue;
    for (const std::string& line : rule.planted) {
      EXPECT_EQ(brokenBy(rule, parsed("a.cc", "// " + line)), "") << rule.name << ": // " << line;
    }
  }
}

TEST(TidyRules, DoNotSeeALineThatIsAllowedWithAReason) {
  for (const LineRule& rule : lineRules()) {
    const std::string line = rule.planted.front();
    EXPECT_EQ(brokenBy(rule, parsed("a.cc", line + "  // tidy-allow: shown here")), "") << line;
    EXPECT_NE(brokenBy(rule, parsed("a.cc", line + "  // tidy-allow")), "") << line;
  }
}

TEST(TidyRules, SayWhatToUseInsteadAndWhyAnExceptionIsOne) {
  std::set<std::string> names;
  for (const LineRule& rule : lineRules()) {
    EXPECT_TRUE(names.insert(rule.name).second) << rule.name << " stands twice";
    EXPECT_FALSE(rule.instead.empty()) << rule.name;
    const auto& files = placeOf(rule);
    for (const Exception& exception : rule.exceptions) {
      EXPECT_FALSE(exception.reason.empty()) << rule.name << ": " << exception.path_prefix;
      const bool exists = std::any_of(files.begin(), files.end(), [&](const SourceFile& file) {
        return file.path.starts_with(exception.path_prefix);
      });
      EXPECT_TRUE(exists) << rule.name << " excepts " << exception.path_prefix << ": not there";
    }
  }
  EXPECT_GE(names.size(), 30U);
}

}  // namespace
}  // namespace spacekeep::tidy
