#include "ctl/volume_report.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "tests/linux/ctl/volume_samples.h"

namespace spacekeep::ctl {
namespace {

VolumeSample healthy() {
  return sampleOf("/data", {.size_bytes = 100 * kGiB,
                            .available_bytes = 25 * kGiB,
                            .inodes = 1'000'000,
                            .available_inodes = 900'000});
}

TEST(VolumeReport, ABlockPerVolumeWithSpaceInodesAndThresholds) {
  EXPECT_EQ(blocksOf({.volumes = {healthy()}}, {}),
            "/data  ok\n"
            "  space   ######################........  25.0 GiB free of 100.0 GiB\n"
            "          low below 500.0 MiB, very low below 166.6 MiB\n"
            "  inodes  ###...........................  900,000 free of 1,000,000\n"
            "          low below 50,000, very low below 17,000\n");
}

TEST(VolumeReport, WhereThereIsNoRoomBarAndNumbersStandBelowEachOther) {
  EXPECT_EQ(blocksOf({.volumes = {healthy()}}, {.columns = 40, .terminal = true}),
            "/data  ok\n"
            "  space   ######################........\n"
            "          25.0 GiB free of 100.0 GiB\n"
            "          low below 500.0 MiB, very low\n"
            "          below 166.6 MiB\n"
            "  inodes  ###...........................\n"
            "          900,000 free of 1,000,000\n"
            "          low below 50,000, very low\n"
            "          below 17,000\n");
}

TEST(VolumeReport, LowAndVeryLowInWordsAndColours) {
  const auto low = sampleOf("/low", {.size_bytes = 100 * kGiB, .available_bytes = 400 * kMiB});
  const auto very_low =
      sampleOf("/worse", {.size_bytes = 100 * kGiB, .available_bytes = 100 * kMiB});
  EXPECT_EQ(blocksOf({.volumes = {low, very_low}}, {.terminal = true, .colour = true}),
            "/low  \x1b[33mlow\x1b[0m\n"
            "  space   \x1b[33m#############################.\x1b[0m  400.0 MiB free of 100.0 GiB\n"
            "\x1b[2m          low below 500.0 MiB, very low below 166.6 MiB\x1b[0m\n"
            "\n"
            "/worse  \x1b[31mvery low\x1b[0m\n"
            "  space   \x1b[31m#############################.\x1b[0m  100.0 MiB free of 100.0 GiB\n"
            "\x1b[2m          low below 500.0 MiB, very low below 166.6 MiB\x1b[0m\n");
}

TEST(VolumeReport, AVolumeThatIsOnlyShortOfInodesIsLowAndItsSpaceIsGreen) {
  const auto sample = sampleOf("/many", {.size_bytes = 100 * kGiB,
                                         .available_bytes = 50 * kGiB,
                                         .inodes = 1000,
                                         .available_inodes = 49});
  const std::string text = blocksOf({.volumes = {sample}}, {.terminal = true, .colour = true});
  EXPECT_NE(text.find("/many  \x1b[33mlow\x1b[0m\n"), std::string::npos) << text;
  EXPECT_NE(text.find("  space   \x1b[32m"), std::string::npos) << text;
  EXPECT_NE(text.find("  inodes  \x1b[33m"), std::string::npos) << text;
}

TEST(VolumeReport, WithoutVolumesThereIsASentence) {
  EXPECT_EQ(blocksOf({}, {}), "There is no local volume here.\n");
}

TEST(VolumeReport, APathWithControlCharactersCannotWriteToTheTerminal) {
  auto sample = healthy();
  sample.volume = "/a\x1b[2J";
  EXPECT_EQ(blocksOf({.volumes = {sample}}, {}).find('\x1b'), std::string::npos);
}

TEST(VolumeReport, TheJsonHoldsAllNumbers) {
  EXPECT_EQ(jsonOf(VolumeReport{.volumes = {healthy()}, .default_thresholds = true}),
            R"({"default_thresholds":true,"volumes":[{"free_bytes":26843545600,)"
            R"("free_inodes":900000,"inodes":1000000,"low_bytes":524288000,"low_inodes":50000,)"
            R"("size_bytes":107374182400,"state":"ok","very_low_bytes":174762666,)"
            R"("very_low_inodes":17000,"volume":"/data"}]})");
}

}  // namespace
}  // namespace spacekeep::ctl
