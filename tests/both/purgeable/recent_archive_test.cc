// The record of recent answers as bytes and back.
#include "purgeable/recent_archive.h"

#include <gtest/gtest.h>

#include <variant>

#include "support/values/plist.h"

namespace spacekeep::test {
namespace {

constexpr std::int64_t kNow = 1'763'706'896'123'456'000;

SpacekeepRecentInfo sample() {
  return SpacekeepRecentInfo(
      {{"/",
        {.services = {{"cache", {.amount = 5, .timestamp = Date{kNow}}},
                      {"text", {.amount = "plenty", .timestamp = Date{kNow - 1'000}}}},
         .freespace = UINT64_MAX,
         .timestamp = Date{kNow - 2'000},
         .volumeName = "/"}},
       {"/data", {.services = {}, .freespace = 0, .timestamp = Date{0}, .volumeName = "/data"}}});
}

/// The document of the sample's archive, to be bent.
Dictionary document() {
  const auto parsed = parsePlist(archivedRecentInfo(sample()).bytes);
  return *std::get<Value>(parsed).dictionary();
}
Data bytesOf(const Dictionary& bent) { return Data{binaryPlist(bent)}; }

/// The document with one value replaced (or taken away) along a path of keys.
Dictionary bent(const Dictionary& outer, const std::vector<std::string>& path,
                const std::optional<Value>& value, std::size_t depth = 0) {
  Dictionary copy = outer;
  const std::string& key = path[depth];
  if (depth + 1 < path.size()) {
    copy.set(key, bent(*outer.find(key)->dictionary(), path, value, depth + 1));
  } else if (value) {
    copy.set(key, *value);
  } else {
    copy.remove(key);
  }
  return copy;
}

TEST(RecentArchive, ARecordComesBackEqual) {
  const SpacekeepRecentInfo record = sample();
  EXPECT_EQ(recentInfoFromArchive(archivedRecentInfo(record)), record);
}

TEST(RecentArchive, AnEmptyRecordComesBackEqual) {
  EXPECT_EQ(recentInfoFromArchive(archivedRecentInfo({})), SpacekeepRecentInfo());
}

TEST(RecentArchive, EqualRecordsHaveEqualBytes) {
  EXPECT_EQ(archivedRecentInfo(sample()), archivedRecentInfo(sample()));
}

TEST(RecentArchive, AmountsOfEveryKindComeBackAsTheyCame) {
  const Value amounts[] = {
      0, -5, UINT64_MAX, 0.25, true, "text", Data{{0, 255}}, Array{1, "a"}, Dictionary{{"k", 1}}};
  for (const Value& amount : amounts) {
    const SpacekeepRecentInfo record(
        {{"/",
          {.services = {{"cache", {.amount = amount, .timestamp = Date{kNow}}}},
           .freespace = 1,
           .timestamp = Date{kNow},
           .volumeName = "/"}}});
    EXPECT_EQ(recentInfoFromArchive(archivedRecentInfo(record)), record);
  }
}

TEST(RecentArchive, EveryMicrosecondComesBackAsItself) {
  for (std::int64_t step = 0; step < 1'000; ++step) {
    const Date date{kNow + step * 1'000};
    const SpacekeepRecentInfo record(
        {{"/", {.services = {}, .freespace = 1, .timestamp = date, .volumeName = "/"}}});
    ASSERT_EQ(recentInfoFromArchive(archivedRecentInfo(record)), record) << date.unix_ns;
  }
}

TEST(RecentArchive, DatesBefore1970ComeBackAsThemselves) {
  for (const std::int64_t unix_ns :
       {-1'000L, -1'297'999'999'000'000L, -1'613'425'601'000'001'000L}) {
    const SpacekeepRecentInfo record({{"/", {.services = {}, .timestamp = Date{unix_ns}}}});
    const auto back = recentInfoFromArchive(archivedRecentInfo(record));
    ASSERT_TRUE(back.has_value()) << unix_ns;
    EXPECT_EQ(back->volume("/")->timestamp, Date{unix_ns});
  }
  EXPECT_EQ(recentDate(-1), Date{-1'000});
  EXPECT_EQ(recentDate(INT64_MIN), Date{INT64_MIN + 808});
}

TEST(RecentArchive, TheBytesDescribeThemselves) {
  const Dictionary archive = document();
  EXPECT_EQ(*archive.find("format"), Value("SpacekeepRecentInfo"));
  EXPECT_EQ(*archive.find("version"), Value(1));
  EXPECT_EQ(archive.find("volumes")->dictionary()->size(), 2U);
}

TEST(RecentArchive, GarbageIsNoRecord) {
  EXPECT_EQ(recentInfoFromArchive(Data{}), std::nullopt);
  EXPECT_EQ(recentInfoFromArchive(Data{{1, 2, 3}}), std::nullopt);
  EXPECT_EQ(recentInfoFromArchive(Data{binaryPlist(Value(Array{1}))}), std::nullopt);
  EXPECT_EQ(recentInfoFromArchive(bytesOf({})), std::nullopt);
}

TEST(RecentArchive, EveryArchiveThatIsCutShortIsNoRecordOrTheSame) {
  const Data whole = archivedRecentInfo(sample());
  for (std::size_t size = 0; size < whole.bytes.size(); ++size) {
    const Data cut{{whole.bytes.begin(), whole.bytes.begin() + static_cast<std::ptrdiff_t>(size)}};
    EXPECT_EQ(recentInfoFromArchive(cut), std::nullopt) << size;
  }
}

TEST(RecentArchive, AnotherVersionIsNoRecord) {
  for (const Value& version : {Value(0), Value(2), Value("1"), Value(true)}) {
    EXPECT_EQ(recentInfoFromArchive(bytesOf(bent(document(), {"version"}, version))), std::nullopt);
  }
}

TEST(RecentArchive, AnotherFormatIsNoRecord) {
  EXPECT_EQ(recentInfoFromArchive(bytesOf(bent(document(), {"format"}, Value("Other")))),
            std::nullopt);
}

TEST(RecentArchive, AMissingPartIsNoRecord) {
  const std::vector<std::vector<std::string>> paths = {
      {"format"},
      {"version"},
      {"volumes"},
      {"volumes", "/", "freespace"},
      {"volumes", "/", "timestamp"},
      {"volumes", "/", "volumeName"},
      {"volumes", "/", "services"},
      {"volumes", "/", "services", "cache", "amount"},
      {"volumes", "/", "services", "cache", "timestamp"}};
  for (const auto& path : paths) {
    const auto archive = bytesOf(bent(document(), path, std::nullopt));
    EXPECT_EQ(recentInfoFromArchive(archive), std::nullopt) << path.back();
  }
}

TEST(RecentArchive, APartOfAnotherKindIsNoRecord) {
  const std::vector<std::pair<std::vector<std::string>, Value>> cases = {
      {{"format"}, 1},
      {{"volumes"}, Array{}},
      {{"volumes", "/"}, "text"},
      {{"volumes", "/", "freespace"}, "many"},
      {{"volumes", "/", "timestamp"}, 5},
      {{"volumes", "/", "volumeName"}, 5},
      {{"volumes", "/", "services"}, Array{}},
      {{"volumes", "/", "services", "cache"}, 5},
      {{"volumes", "/", "services", "cache", "timestamp"}, "today"}};
  for (const auto& [path, value] : cases) {
    const auto archive = bytesOf(bent(document(), path, value));
    EXPECT_EQ(recentInfoFromArchive(archive), std::nullopt) << path.back();
  }
}

TEST(RecentArchive, ARecordTooLargeForADocumentHasNoBytes) {
  std::map<std::string, SpacekeepRecentServiceInfo> services;
  for (std::size_t i = 0; i < kMaxPlistValues / 5; ++i) {
    services.emplace(std::to_string(i), SpacekeepRecentServiceInfo{1, Date{kNow}});
  }
  const SpacekeepRecentInfo record({{"/",
                                     {.services = std::move(services),
                                      .freespace = 1,
                                      .timestamp = Date{kNow},
                                      .volumeName = "/"}}});
  EXPECT_TRUE(archivedRecentInfo(record).bytes.empty());
}

}  // namespace
}  // namespace spacekeep::test
