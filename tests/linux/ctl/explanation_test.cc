#include "ctl/explanation.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <string>

namespace spacekeep::ctl {
namespace {

using testing::Contains;
using testing::HasSubstr;
using testing::Not;

constexpr std::uint64_t kGiB = 1ULL << 30;
constexpr std::uint64_t kMiB = 1ULL << 20;
constexpr std::int64_t kSignedMiB = 1LL << 20;

VolumeFacts factsOf(const VolumeSpace& space) {
  VolumeFacts facts;
  const SpaceThresholds thresholds = spaceThresholds(space, facts.settings);
  facts.sample = {.volume = "/data",
                  .space = space,
                  .thresholds = thresholds,
                  .level = spaceLevel(space, thresholds, SpaceLevel::kEnough)};
  facts.offers.volume = "/data";
  return facts;
}

VolumeFacts lowFacts() {
  return factsOf({.size_bytes = 100 * kGiB, .available_bytes = 400 * kMiB});
}

/// `ids` could give that many MiB each, `more_at_four` more at the highest urgency.
void offer(VolumeFacts& facts, const std::vector<std::string>& ids, std::int64_t mib,
           std::int64_t more_at_four = 0) {
  facts.offers.detail = VolumeOffers::Detail::kServices;
  for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
    const std::int64_t bytes = (mib + (urgency == 4 ? more_at_four : 0)) * kSignedMiB;
    Dictionary answer;
    for (const auto& id : ids) answer.set(id, bytes);
    answer.set("SPACEKEEP_TOTAL_AVAILABLE", bytes * static_cast<std::int64_t>(ids.size()));
    addAnswer(facts.offers, urgency, answer);
  }
}

void declare(VolumeFacts& facts, const std::string& id, bool purges, bool do_not_query = false) {
  facts.declared.emplace(id, DeclaredService{.path = "/d/" + id + ".plist",
                                             .id = id,
                                             .purges = purges,
                                             .periodic = !purges,
                                             .do_not_query = do_not_query});
}

std::vector<std::string> textsOf(const VolumeFacts& facts) {
  std::vector<std::string> texts;
  for (const auto& paragraph : explanationOf(facts)) texts.push_back(paragraph.text);
  return texts;
}

TEST(Explanation, AVolumeThatIsShortIsExplainedFromThresholdToWayOut) {
  VolumeFacts facts = lowFacts();
  offer(facts, {"photos"}, 400);
  EXPECT_EQ(
      textOf(explanationOf(facts), {}),
      "/data is low: less than 500.0 MiB free.\n"
      "  Space: 400.0 MiB of 100.0 GiB can still be used. It is low below 500.0 MiB, the smaller "
      "of 5 % of its size (5.0 GiB) and 500.0 MiB, and very low below 166.6 MiB, a third of that. "
      "Once it is low it stays so until 750.0 MiB are free.\n"
      "  Inodes: the file system makes them as it needs them.\n"
      "  While the volume is short, the daemon asks the services for 250.0 MiB at a time, from "
      "urgency 1 up to 3, and waits at each for at most 300 s. It waits out every urgency even "
      "when that is there earlier, and other purges stand behind it (spacekeepctl state set "
      "SPACEKEEP_FINISH_EARLY true changes that).\n"
      "  What could be freed:\n"
      "    urgency 1: 400.0 MiB, from photos (400.0 MiB)\n"
      "    urgency 2: 400.0 MiB, from photos (400.0 MiB)\n"
      "    urgency 3: 400.0 MiB, from photos (400.0 MiB)\n"
      "    urgency 4: 400.0 MiB, from photos (400.0 MiB)\n"
      "  To be short no longer it takes 350.0 MiB more. The services could give that at urgency "
      "3.\n");
}

TEST(Explanation, AVolumeThatIsNotShortNeedsNothing) {
  const auto texts = textsOf(factsOf({.size_bytes = 100 * kGiB,
                                      .available_bytes = 50 * kGiB,
                                      .inodes = 1000,
                                      .available_inodes = 900}));
  EXPECT_EQ(texts[0], "/data is not short of space.");
  EXPECT_EQ(texts[2],
            "Inodes: 900 of 1,000 are free. It is low below 50, 5 % of them, and very low below "
            "17.");
  EXPECT_EQ(texts[3], "The daemon does nothing by itself here as long as the volume is not short.");
  EXPECT_EQ(texts.size(), 4U);
}

TEST(Explanation, WhereOnlyTheHighestUrgencyIsEnoughItSaysWhoHasToAskForIt) {
  VolumeFacts facts = lowFacts();
  offer(facts, {"photos"}, 100, 300);
  EXPECT_THAT(textsOf(facts),
              Contains("To be short no longer it takes 350.0 MiB more. At urgency 3, as far as the "
                       "daemon goes by itself, 250.0 MiB of it are missing. Urgency 4, which "
                       "somebody has to ask for (spacekeepctl purge --urgency 4), would be "
                       "enough."));
}

TEST(Explanation, WhereNothingIsEnoughSomebodyHasToRemoveSomething) {
  VolumeFacts facts = lowFacts();
  offer(facts, {"photos"}, 1);
  EXPECT_THAT(textsOf(facts), Contains(HasSubstr("349.0 MiB of it are missing. Not even the "
                                                 "highest urgency is enough")));
}

TEST(Explanation, AVolumeThatIsShortOfInodesOnlyMakesNoPromise) {
  VolumeFacts facts = factsOf({.size_bytes = 100 * kGiB,
                               .available_bytes = 50 * kGiB,
                               .inodes = 1000,
                               .available_inodes = 10});
  offer(facts, {"photos"}, 1000);
  const auto texts = textsOf(facts);
  EXPECT_EQ(texts[0], "/data is very low: fewer than 17 inodes free.");
  EXPECT_THAT(texts, Contains(HasSubstr("has room but too many files")));
  EXPECT_THAT(texts, Not(Contains(HasSubstr("To be short no longer"))));
}

TEST(Explanation, FinishEarlyIsTold) {
  VolumeFacts facts = lowFacts();
  facts.finish_early = true;
  EXPECT_THAT(textsOf(facts), Contains(HasSubstr("It ends as soon as that is there")));
}

TEST(Explanation, ThreeOfManyAreNamedTheLargestFirst) {
  VolumeFacts facts = lowFacts();
  facts.offers.detail = VolumeOffers::Detail::kServices;
  addAnswer(facts.offers, 1,
            {{"a", 1},
             {"b", 5},
             {"c", 3},
             {"d", 4},
             {"e", 2},
             {"f", 0},
             {"SPACEKEEP_TOTAL_AVAILABLE", 15}});
  EXPECT_THAT(textsOf(facts),
              Contains("urgency 1: 15 B, from b (5 B), d (4 B), c (3 B) and 2 more"));
}

TEST(Silence, EachReasonIsNamed) {
  VolumeFacts facts = lowFacts();
  offer(facts, {"answers"}, 1);
  addAnswer(facts.offers, 1, {{"empty", 0}});
  for (int urgency = 2; urgency <= kUrgencies; ++urgency) {
    addAnswer(facts.offers, urgency, {{"empty", 0}});
  }
  declare(facts, "answers", true);
  declare(facts, "hidden", true, true);
  declare(facts, "periodic", false);
  declare(facts, "silent", true);
  declare(facts, "unreachable", true);
  facts.missing_sockets.emplace("unreachable", "/run/x.sock");
  const auto list = silenceOf(facts);
  std::vector<std::string> texts;
  for (const auto& paragraph : list) texts.push_back(paragraph.text);
  EXPECT_EQ(
      texts,
      (std::vector<std::string>{
          "Who gives nothing, and why:",
          "hidden is not asked how much it has (/d/hidden.plist says SPACEKEEP_DO_NOT_QUERY); "
          "purges ask it to give all the same",
          "periodic takes no part in purges (/d/periodic.plist gives it the role PERIODIC "
          "only)",
          "silent is declared in /d/silent.plist and has not answered",
          "unreachable cannot be reached: its socket /run/x.sock is missing",
          "with nothing on this volume: empty"}));
}

TEST(Silence, WithoutTheRightToAskNobodyIsCalledSilent) {
  VolumeFacts facts = lowFacts();
  declare(facts, "unknown", true);
  facts.offers.detail = VolumeOffers::Detail::kTotals;
  EXPECT_TRUE(silenceOf(facts).empty());
}

TEST(Silence, AnAnswerThatIsMissingAtOneUrgencyIsTold) {
  VolumeFacts facts = lowFacts();
  offer(facts, {"a"}, 1);
  facts.offers.services[0].bytes[1] = std::nullopt;
  const auto list = silenceOf(facts);
  ASSERT_EQ(list.size(), 2U);
  EXPECT_EQ(list[1].text, "a has not answered at every urgency, or not with a number");
}

TEST(Explanation, OnATerminalItFits) {
  VolumeFacts facts = lowFacts();
  offer(facts, {"photos"}, 1);
  const std::string text = textOf(explanationOf(facts), {.columns = 40, .terminal = true});
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t end = text.find('\n', at);
    EXPECT_LE(end - at, 40U) << text.substr(at, end - at);
    at = end + 1;
  }
}

}  // namespace
}  // namespace spacekeep::ctl
