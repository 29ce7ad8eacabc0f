#include "ctl/status_report.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "tests/linux/ctl/volume_samples.h"

namespace spacekeep::ctl {
namespace {

VolumeSample low() {
  return sampleOf("/data", {.size_bytes = 100 * kGiB,
                            .available_bytes = 400 * kMiB,
                            .inodes = 1'000'000,
                            .available_inodes = 900'000});
}

VolumeOffers offersOfData() {
  VolumeOffers offers{.volume = "/data", .detail = VolumeOffers::Detail::kServices};
  const std::int64_t mib = kMiB;
  for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
    addAnswer(offers, urgency,
              {{"com.example.photos", urgency * mib},
               {"com.example.music", urgency == 4 ? 100 * mib : 0},
               {"com.example.empty", 0},
               {"SPACEKEEP_TOTAL_AVAILABLE", urgency * mib + (urgency == 4 ? 100 * mib : 0)},
               {"SPACEKEEP_VOLUME", "/data"}});
  }
  sortOffers(offers);
  return offers;
}

StatusReport report() {
  return {.volumes = {.volumes = {low()}}, .survey = {.volumes = {offersOfData()}, .problem = {}}};
}

TEST(StatusReport, ABlockPerVolumeWithWhoCouldGiveHowMuchAtWhichUrgency) {
  EXPECT_EQ(textOf(report(), {}),
            "/data  low: less than 500.0 MiB free\n"
            "  space   #############################.  400.0 MiB free of 100.0 GiB\n"
            "  inodes  ###...........................  900,000 free of 1,000,000\n"
            "  could be freed         urgency 1   urgency 2   urgency 3   urgency 4\n"
            "    com.example.music          0 B         0 B         0 B   100.0 MiB\n"
            "    com.example.photos     1.0 MiB     2.0 MiB     3.0 MiB     4.0 MiB\n"
            "    in total               1.0 MiB     2.0 MiB     3.0 MiB   104.0 MiB\n"
            "    1 more service has nothing here\n"
            "\n"
            "1 volume, short of space; 3.0 MiB could be freed at urgency 3, the default, and 104.0 "
            "MiB at urgency 4\n");
}

TEST(StatusReport, OnANarrowTerminalAmountsStandBelowTheirService) {
  EXPECT_EQ(textOf(report(), {.columns = 40, .terminal = true}),
            "/data  low: less than 500.0 MiB free\n"
            "  space   #############################.\n"
            "          400.0 MiB free of 100.0 GiB\n"
            "  inodes  ###...........................\n"
            "          900,000 free of 1,000,000\n"
            "  could be freed\n"
            "    com.example.music\n"
            "      urgency 1: 0 B, 2: 0 B, 3: 0 B,\n"
            "      4: 100.0 MiB\n"
            "    com.example.photos\n"
            "      urgency 1: 1.0 MiB, 2: 2.0 MiB,\n"
            "      3: 3.0 MiB, 4: 4.0 MiB\n"
            "    in total\n"
            "      urgency 1: 1.0 MiB, 2: 2.0 MiB,\n"
            "      3: 3.0 MiB, 4: 104.0 MiB\n"
            "    1 more service has nothing here\n"
            "\n"
            "1 volume, short of space; 3.0 MiB could\n"
            "be freed at urgency 3, the default, and\n"
            "104.0 MiB at urgency 4\n");
}

TEST(StatusReport, NoLineIsWiderThanTheTerminal) {
  // Numbers that are longer than a line of less stand alone in it.
  for (std::size_t columns = 40; columns <= 120; ++columns) {
    const std::string text = textOf(report(), {.columns = columns, .terminal = true});
    for (std::size_t at = 0; at < text.size();) {
      const std::size_t end = text.find('\n', at);
      EXPECT_LE(end - at, columns) << text.substr(at, end - at);
      at = end + 1;
    }
  }
}

TEST(StatusReport, TotalsAloneHaveNoServices) {
  VolumeOffers offers{.volume = "/data", .detail = VolumeOffers::Detail::kTotals};
  for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
    addAnswer(offers, urgency,
              {{"com.example.photos", 5}, {"SPACEKEEP_TOTAL_AVAILABLE", 1000 * urgency}});
  }
  EXPECT_EQ(offersText(offers, {}),
            "  could be freed   urgency 1   urgency 2   urgency 3   urgency 4\n"
            "    in total          1000 B     1.9 KiB     2.9 KiB     3.9 KiB\n");
}

TEST(StatusReport, WhoHasNotAnsweredAtAnUrgencyHasAQuestionMarkThere) {
  VolumeOffers offers{.volume = "/data", .detail = VolumeOffers::Detail::kServices};
  addAnswer(offers, 1, {{"a", "many"}, {"SPACEKEEP_TOTAL_AVAILABLE", 0}});
  addAnswer(offers, 4, {{"a", 7}, {"SPACEKEEP_TOTAL_AVAILABLE", 7}});
  EXPECT_EQ(offersText(offers, {}),
            "  could be freed   urgency 1   urgency 2   urgency 3   urgency 4\n"
            "    a                      ?           ?           ?         7 B\n"
            "    in total             0 B         0 B         0 B         7 B\n");
}

TEST(StatusReport, NobodyHasAnything) {
  VolumeOffers offers{.volume = "/data", .detail = VolumeOffers::Detail::kServices};
  addAnswer(offers, 1, {{"a", 0}, {"SPACEKEEP_TOTAL_AVAILABLE", 0}});
  for (int urgency = 2; urgency <= kUrgencies; ++urgency) addAnswer(offers, urgency, {{"a", 0}});
  EXPECT_EQ(offersText(offers, {}), "  nothing could be freed\n");
}

TEST(StatusReport, WithoutOffersThereAreTheVolumesAlone) {
  const StatusReport alone{
      .volumes = {.volumes = {low(),
                              sampleOf("/b", {.size_bytes = kGiB, .available_bytes = kGiB})}},
      .survey = {}};
  EXPECT_EQ(textOf(alone, {}),
            "/data  low: less than 500.0 MiB free\n"
            "  space   #############################.  400.0 MiB free of 100.0 GiB\n"
            "  inodes  ###...........................  900,000 free of 1,000,000\n"
            "\n"
            "/b  ok\n"
            "  space   ..............................  1.0 GiB free of 1.0 GiB\n"
            "\n"
            "2 volumes, 1 of them short of space\n");
}

TEST(StatusReport, TheThresholdThatMakesAVolumeShortIsNamed) {
  EXPECT_EQ(shortageOf(low()), "less than 500.0 MiB free");
  EXPECT_EQ(shortageOf(sampleOf("/a", {.size_bytes = 100 * kGiB, .available_bytes = kMiB})),
            "less than 166.6 MiB free");
  EXPECT_EQ(shortageOf(sampleOf("/a", {.size_bytes = 100 * kGiB,
                                       .available_bytes = 50 * kGiB,
                                       .inodes = 1000,
                                       .available_inodes = 49})),
            "fewer than 50 inodes free");
  EXPECT_EQ(shortageOf(sampleOf("/a", {.size_bytes = 100 * kGiB,
                                       .available_bytes = 400 * kMiB,
                                       .inodes = 1000,
                                       .available_inodes = 1})),
            "less than 500.0 MiB free, fewer than 17 inodes free");
  EXPECT_EQ(shortageOf(sampleOf("/a", {.size_bytes = kGiB, .available_bytes = kGiB})), "");
}

TEST(StatusReport, SomebodyWhoWasLateIsToldOf) {
  StatusReport late = report();
  late.survey.volumes[0].somebody_was_late = true;
  EXPECT_NE(textOf(late, {}).find("somebody took longer to answer than the daemon waits"),
            std::string::npos);
}

TEST(StatusReport, NamesWithControlCharactersCannotWriteToTheTerminal) {
  StatusReport evil = report();
  evil.volumes.volumes[0].volume = evil.survey.volumes[0].volume = "/a\x1b[2J";
  evil.survey.volumes[0].services[0].id = "b\x1b[2J";
  for (const std::size_t columns : {40U, 80U}) {
    EXPECT_EQ(textOf(evil, {.columns = columns, .terminal = true}).find('\x1b'), std::string::npos);
  }
}

TEST(StatusReport, TheJsonHoldsAllNumbers) {
  VolumeOffers offers{.volume = "/b", .detail = VolumeOffers::Detail::kServices};
  addAnswer(offers, 1, {{"a", 5}, {"SPACEKEEP_TOTAL_AVAILABLE", 5}});
  const StatusReport one{
      .volumes = {.volumes = {sampleOf("/b", {.size_bytes = 1000, .available_bytes = 1})}},
      .survey = {.volumes = {offers}, .problem = SurveyProblem{ExitCode::kFailed, "why"}}};
  EXPECT_EQ(
      jsonOf(one),
      R"({"default_thresholds":false,"volumes":[{"free_bytes":1,"free_inodes":0,"inodes":0,)"
      R"("low_bytes":50,"low_inodes":0,"offers":{"detail":"services","somebody_was_late":false,)"
      R"("urgencies":[{"services":[{"bytes":5,"id":"a"}],"total_bytes":5,"urgency":1},)"
      R"({"services":[{"id":"a"}],"total_bytes":0,"urgency":2},)"
      R"({"services":[{"id":"a"}],"total_bytes":0,"urgency":3},)"
      R"({"services":[{"id":"a"}],"total_bytes":0,"urgency":4}]},"short_of":["space"],)"
      R"("size_bytes":1000,"state":"very low","very_low_bytes":16,"very_low_inodes":0,)"
      R"("volume":"/b"}],"why_incomplete":"why"})");
}

}  // namespace
}  // namespace spacekeep::ctl
