#include "ctl/progress.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <optional>
#include <string>

#include "ctl/progress_display.h"

namespace spacekeep::ctl {
namespace {

struct EstimateCase {
  double elapsed_seconds;
  int urgency;
  double seconds_left;
  bool over;
};

void expectEstimates(const PurgePlan& plan, std::initializer_list<EstimateCase> cases) {
  for (const auto& c : cases) {
    const auto estimate = estimateUrgency(plan, c.elapsed_seconds);
    EXPECT_EQ(estimate.urgency, c.urgency) << c.elapsed_seconds;
    EXPECT_DOUBLE_EQ(estimate.seconds_left, c.seconds_left) << c.elapsed_seconds;
    EXPECT_EQ(estimate.all_waits_over, c.over) << c.elapsed_seconds;
  }
}

TEST(Progress, WithoutATimeoutTheUrgenciesWaitTwoFourAndSixSeconds) {
  expectEstimates({.asked_bytes = 1, .urgency_limit = 3, .timeout_seconds = {}},
                  {{0, 1, 12, false},
                   {1.5, 1, 10.5, false},
                   {2, 2, 10, false},
                   {5.5, 2, 6.5, false},
                   {6, 3, 6, false},
                   {11.5, 3, 0.5, false},
                   {12, 3, 0, true},
                   {100, 3, 0, true}});
}

TEST(Progress, AnOwnTimeoutHoldsForEveryUrgency) {
  expectEstimates({.asked_bytes = 1, .urgency_limit = 2, .timeout_seconds = 10},
                  {{0, 1, 20, false}, {9, 1, 11, false}, {10, 2, 10, false}, {20, 2, 0, true}});
}

TEST(Progress, TheTextTellsSpaceUrgencyAndTimeLeft) {
  const PurgePlan plan{.asked_bytes = 500 << 20, .urgency_limit = 3, .timeout_seconds = {}};
  EXPECT_EQ(progressText(plan, 5.2, 12 << 20),
            "12.0 MiB of 500.0 MiB gained, urgency 2 of 3, at most 7 s left");
  EXPECT_EQ(progressText(plan, 0, std::nullopt),
            "500.0 MiB asked for, urgency 1 of 3, at most 12 s left");
  EXPECT_EQ(progressText(plan, 13, 0),
            "0 B of 500.0 MiB gained, waiting for the daemon (it may be busy with other purges)");
}

TEST(Progress, AwayFromATerminalThereIsOneLinePerUrgencyAndOneForTheRest) {
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::tmpfile(), &std::fclose);
  ASSERT_NE(file, nullptr);
  {
    ProgressDisplay display(ProgressDisplay::Kind::kLines,
                            {.asked_bytes = 1024, .urgency_limit = 2, .timeout_seconds = {}},
                            "/nowhere/at/all", file.get(), 80);
    for (const double elapsed_seconds : {0.0, 0.2, 1.9, 2.0, 2.2, 5.0, 6.0, 7.0})
      display.show(elapsed_seconds);
  }
  std::rewind(file.get());
  char text[1024] = {};
  const auto size = std::fread(text, 1, sizeof text - 1, file.get());
  EXPECT_EQ(std::string(text, size),
            "1.0 KiB asked for, urgency 1 of 2, at most 6 s left\n"
            "1.0 KiB asked for, urgency 2 of 2, at most 4 s left\n"
            "1.0 KiB asked for, waiting for the daemon (it may be busy with other purges)\n");
}

TEST(Progress, OnATerminalTheLineRenewsItselfAndGoesAway) {
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::tmpfile(), &std::fclose);
  ASSERT_NE(file, nullptr);
  {
    ProgressDisplay display(ProgressDisplay::Kind::kTerminal,
                            {.asked_bytes = 1024, .urgency_limit = 1, .timeout_seconds = {}},
                            "/nowhere/at/all", file.get(), 80);
    display.show(0);
    display.show(0.5);
  }
  std::rewind(file.get());
  char text[1024] = {};
  const auto size = std::fread(text, 1, sizeof text - 1, file.get());
  EXPECT_EQ(std::string(text, size),
            "\r\x1b[K1.0 KiB asked for, urgency 1 of 1, at most 2 s left"
            "\r\x1b[K1.0 KiB asked for, urgency 1 of 1, at most 2 s left"
            "\r\x1b[K");
}

TEST(Progress, OnANarrowTerminalTheLineIsCutSoThatItCanRenewItself) {
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::tmpfile(), &std::fclose);
  ASSERT_NE(file, nullptr);
  {
    ProgressDisplay display(ProgressDisplay::Kind::kTerminal,
                            {.asked_bytes = 1024, .urgency_limit = 1, .timeout_seconds = {}},
                            "/nowhere/at/all", file.get(), 40);
    display.show(0);
  }
  std::rewind(file.get());
  char text[1024] = {};
  const auto size = std::fread(text, 1, sizeof text - 1, file.get());
  EXPECT_EQ(std::string(text, size), "\r\x1b[K1.0 KiB asked for,..., at most 2 s left\r\x1b[K");
}

}  // namespace
}  // namespace spacekeep::ctl
