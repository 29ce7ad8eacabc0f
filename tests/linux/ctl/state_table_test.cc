#include "ctl/state_table.h"

#include <gtest/gtest.h>

#include <string>

namespace spacekeep::ctl {
namespace {

const Dictionary kState{{"SPACEKEEP_CACHE_ENABLED", false},
                        {"SPACEKEEP_LOW_SPACE_BYTES", 262'144'000},
                        {"SPACEKEEP_RECENT_SERVICE_STATS", Data{{1, 2, 3}}},
                        {"mine", Array{1, "two"}}};

TEST(StateTable, KeysWithValuesMeaningsAndDefaults) {
  EXPECT_EQ(stateTableOf(kState, {}),
            "SPACEKEEP_CACHE_ENABLED             false\n"
            "  whether caches are wanted; a change is told to the services that ask\n"
            "SPACEKEEP_FINISH_EARLY              (false)\n"
            "  whether a purge ends once the amount is reached, unless it says itself\n"
            "SPACEKEEP_LOW_SPACE_BYTES           262144000 (250.0 MiB)\n"
            "  a volume with more than this available is never low\n"
            "SPACEKEEP_LOW_SPACE_INODES_PERCENT  (5)\n"
            "  a volume is low below this percentage of its inodes\n"
            "SPACEKEEP_LOW_SPACE_PERCENT         (5)\n"
            "  a volume is low below this percentage of its size\n"
            "SPACEKEEP_RECENT_SERVICE_STATS      <3 bytes>\n"
            "  the daemon's memory of answers; unset, the next query asks everybody\n"
            "mine                                [1, \"two\"]\n"
            "\n"
            "In parentheses: not set, so this default holds.\n");
}

TEST(StateTable, OnANarrowTerminalValuesStandBelowTheirKeys) {
  const std::string beginning =
      "SPACEKEEP_CACHE_ENABLED\n"
      "  false\n"
      "  whether caches are wanted; a change is\n"
      "  told to the services that ask\n"
      "SPACEKEEP_FINISH_EARLY\n"
      "  (false)\n"
      "  whether a purge ends once the amount\n"
      "  is reached, unless it says itself\n";
  const std::string table = stateTableOf(kState, {.columns = 40, .terminal = true});
  EXPECT_EQ(table.substr(0, beginning.size()), beginning);
}

TEST(StateTable, OnATerminalALongValueIsShortenedAndInAPipeItIsNot) {
  const Dictionary state{{"mine", std::string(300, 'x')}};
  EXPECT_EQ(stateTableOf(state, {.columns = 80, .terminal = true}).find(std::string(60, 'x')),
            std::string::npos);
  EXPECT_NE(stateTableOf(state, {}).find(std::string(300, 'x')), std::string::npos);
}

TEST(StateTable, KeysAndValuesOfOthersCannotWriteToTheTerminal) {
  const Dictionary state{{"evil\x1b[2J", "\x1b[2J"}};
  EXPECT_EQ(stateTableOf(state, {}).find('\x1b'), std::string::npos);
}

}  // namespace
}  // namespace spacekeep::ctl
