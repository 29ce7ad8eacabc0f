#include "ctl/style.h"

#include <gtest/gtest.h>

#include <map>
#include <string>

namespace spacekeep::ctl {
namespace {

using Variables = std::map<std::string, std::string>;

Style styleWith(std::optional<std::size_t> window_columns, const Variables& variables) {
  return styleFor(window_columns, [&variables](const char* name) -> const char* {
    const auto found = variables.find(name);
    return found == variables.end() ? nullptr : found->second.c_str();
  });
}

struct WidthCase {
  std::optional<std::size_t> window;
  Variables variables;
  std::size_t columns;
};

TEST(Style, TheWidthIsTheTerminalsUnlessColumnsSaysOtherwise) {
  const WidthCase cases[] = {
      {{}, {}, 80},
      {120, {}, 120},
      {120, {{"COLUMNS", "60"}}, 60},
      {{}, {{"COLUMNS", "60"}}, 60},
      {120, {{"COLUMNS", ""}}, 120},
      {120, {{"COLUMNS", "wide"}}, 120},
      {120, {{"COLUMNS", "0"}}, 120},
      {120, {{"COLUMNS", "60x"}}, 120},
      {0, {}, 80},      // a terminal that does not know its size
      {3, {}, 20},      // nothing can be shown on less
      {9999, {}, 400},  // and nobody reads more
      {120, {{"COLUMNS", "99999999999999999999999"}}, 120},
  };
  for (const auto& c : cases) EXPECT_EQ(styleWith(c.window, c.variables).columns, c.columns);
}

TEST(Style, ColourAndBlocksNeedATerminalThatCanShowThem) {
  const Variables utf8{{"LANG", "C.UTF-8"}, {"TERM", "xterm"}};
  EXPECT_TRUE(styleWith(80, utf8).colour);
  EXPECT_TRUE(styleWith(80, utf8).blocks);
  EXPECT_TRUE(styleWith(80, utf8).terminal);
  EXPECT_FALSE(styleWith({}, utf8).colour);
  EXPECT_FALSE(styleWith({}, utf8).blocks);
  EXPECT_FALSE(styleWith({}, utf8).terminal);
  EXPECT_FALSE(styleWith(80, {{"TERM", "dumb"}}).colour);
  EXPECT_FALSE(styleWith(80, {{"NO_COLOR", "1"}}).colour);
  EXPECT_TRUE(styleWith(80, {{"NO_COLOR", ""}}).colour);
  EXPECT_FALSE(styleWith(80, {{"LANG", "C.UTF-8"}, {"LC_ALL", "C"}}).blocks);
  EXPECT_TRUE(styleWith(80, {{"LANG", "C"}, {"LC_CTYPE", "de_DE.utf8"}}).blocks);
  EXPECT_FALSE(styleWith(80, {}).blocks);
}

TEST(Style, ColourGoesAroundTheTextAndNothingIsColouredWithout) {
  const Style colourful{.colour = true};
  EXPECT_EQ(coloured("low", Colour::kYellow, colourful), "\x1b[33mlow\x1b[0m");
  EXPECT_EQ(coloured("low", Colour::kNone, colourful), "low");
  EXPECT_EQ(coloured("", Colour::kRed, colourful), "");
  EXPECT_EQ(coloured("low", Colour::kYellow, {}), "low");
}

TEST(Style, ABarShowsTheLeastAndIsFullOnlyForAll) {
  EXPECT_EQ(bar(0, 10, {}), "..........");
  EXPECT_EQ(bar(0.0001, 10, {}), "#.........");
  EXPECT_EQ(bar(0.5, 10, {}), "#####.....");
  EXPECT_EQ(bar(0.9999, 10, {}), "#########.");
  EXPECT_EQ(bar(1, 10, {}), "##########");
  EXPECT_EQ(bar(7, 4, {}), "####");
  EXPECT_EQ(bar(-1, 4, {}), "....");
  EXPECT_EQ(bar(0.5, 0, {}), "");
  EXPECT_EQ(bar(0.5, 4, {.blocks = true}), "\u2588\u2588\u2591\u2591");
}

}  // namespace
}  // namespace spacekeep::ctl
