// Pages of entries: what is asked, how much fits, and where the next one goes on.
#include "history/page.h"

#include <gtest/gtest.h>

#include <string>

#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::history {
namespace {

StoredEntry stored(std::uint64_t number, Dictionary entry = {}) {
  return {.number = number, .entry = std::move(entry)};
}

TEST(HistoryRequest, WithoutKeysAsksForTheNewestHundredOfAllVolumes) {
  EXPECT_EQ(rangeOf({}).before, std::nullopt);
  EXPECT_EQ(rangeOf({}).volume, std::nullopt);
  EXPECT_EQ(limitOf({}), 100U);
}

TEST(HistoryRequest, NamesWhereToGoOnWhichVolumeAndHowMany) {
  const Dictionary request{{keys::kBefore, 12}, {keys::kVolume, "/data"}, {keys::kLimit, 7}};
  EXPECT_EQ(rangeOf(request).before, 12U);
  EXPECT_EQ(rangeOf(request).volume, "/data");
  EXPECT_EQ(limitOf(request), 7U);
}

TEST(HistoryRequest, OfOtherKindsCountsAsAbsent) {
  const Dictionary request{{keys::kBefore, "12"}, {keys::kVolume, 3}, {keys::kLimit, true}};
  EXPECT_EQ(rangeOf(request).before, std::nullopt);
  EXPECT_EQ(rangeOf(request).volume, std::nullopt);
  EXPECT_EQ(limitOf(request), 100U);
}

TEST(HistoryRequest, ForNoneOrTooManyIsBroughtIntoBounds) {
  EXPECT_EQ(limitOf({{keys::kLimit, 0}}), 1U);
  EXPECT_EQ(limitOf({{keys::kLimit, -5}}), 1U);
  EXPECT_EQ(limitOf({{keys::kLimit, 1000}}), 1000U);
  EXPECT_EQ(limitOf({{keys::kLimit, UINT64_MAX}}), 1000U);
}

TEST(Page, HoldsTheEntriesWithTheirNumbersInTheOrderShown) {
  Page page(10);
  EXPECT_TRUE(page.take(stored(9, {{keys::kKind, "purge"}})));
  EXPECT_TRUE(page.take(stored(8)));
  EXPECT_EQ(
      std::move(page).answer(),
      (Dictionary{{keys::kEntries, Array{Dictionary{{keys::kEntry, 9}, {keys::kKind, "purge"}},
                                         Dictionary{{keys::kEntry, 8}}}}}));
}

TEST(Page, OfNothingIsAnEmptyList) {
  EXPECT_EQ(Page(10).answer(), (Dictionary{{keys::kEntries, Array{}}}));
}

TEST(Page, ThatIsFullSaysWhereToGoOn) {
  Page page(2);
  EXPECT_TRUE(page.take(stored(9)));
  EXPECT_TRUE(page.take(stored(8)));
  EXPECT_FALSE(page.take(stored(7)));
  const Dictionary answer = std::move(page).answer();
  EXPECT_EQ(*answer.find(keys::kNext), Value(8));
  EXPECT_EQ(answer.find(keys::kEntries)->array()->size(), 2U);
}

TEST(Page, ThatIsJustFilledByTheLastEntryDoesNotGoOn) {
  Page page(2);
  EXPECT_TRUE(page.take(stored(2)));
  EXPECT_TRUE(page.take(stored(1)));
  EXPECT_FALSE(std::move(page).answer().contains(keys::kNext));
}

TEST(Page, EndsBeforeItGetsTooLargeForAMessage) {
  const Dictionary entry{{keys::kKind, std::string(1000, 'x')}};
  Page page(1000, 5000);
  std::uint64_t number = 100;
  while (page.take(stored(number, entry))) --number;
  const Dictionary answer = std::move(page).answer();
  EXPECT_EQ(answer.find(keys::kEntries)->array()->size(), 4U);
  EXPECT_EQ(*answer.find(keys::kNext), Value(97));
  EXPECT_LE(wireBytesAtMost(*answer.find(keys::kEntries)), 5000U + 24U);
}

TEST(Page, MayBeFullToTheLastByte) {
  const std::size_t entry_bytes =
      wireBytesAtMost(Dictionary{{keys::kKind, "x"}, {keys::kEntry, 1}});
  Page page(10, 2 * entry_bytes);
  EXPECT_TRUE(page.take(stored(9, {{keys::kKind, "x"}})));
  EXPECT_TRUE(page.take(stored(8, {{keys::kKind, "x"}})));
  EXPECT_FALSE(page.take(stored(7, {{keys::kKind, "x"}})));
}

TEST(Page, TakesItsFirstEntryWhateverItsSize) {
  Page page(10, 100);
  EXPECT_TRUE(page.take(stored(1, {{keys::kKind, std::string(1000, 'x')}})));
}

TEST(WireBytes, GrowWithWhatIsInside) {
  const std::size_t number = wireBytesAtMost(Value(1));
  EXPECT_EQ(wireBytesAtMost(Value("1234567")), number + 7);
  EXPECT_EQ(wireBytesAtMost(Value(Data{{1, 2, 3}})), number + 3);
  EXPECT_EQ(wireBytesAtMost(Value(Array{1, 2})), 3 * number);
  EXPECT_GE(wireBytesAtMost(Value(Dictionary{{"key", 1}})), 2 * number + 3);
}

}  // namespace
}  // namespace spacekeep::history
