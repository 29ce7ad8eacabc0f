#include "support/values/plist.h"

#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <limits>

#include "support/values/text.h"

namespace spacekeep {
namespace {

using Bytes = std::vector<std::uint8_t>;

Bytes bytesOf(std::string_view text) { return Bytes(text.begin(), text.end()); }

std::string xml(std::string_view content) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" +
         std::string(content) + "</plist>\n";
}

std::optional<Value> parsed(std::string_view document) {
  auto result = parsePlist(bytesOf(document));
  if (auto* error = std::get_if<PlistError>(&result)) {
    EXPECT_NE(error->reason, "");
    return std::nullopt;
  }
  return std::get<Value>(std::move(result));
}

std::string refusal(const Bytes& document) {
  const auto result = parsePlist(document);
  const auto* error = std::get_if<PlistError>(&result);
  return error == nullptr ? "accepted" : error->reason;
}

std::string refusal(std::string_view document) { return refusal(bytesOf(document)); }

std::optional<Value> roundTrip(const Value& value) {
  const Bytes encoded = binaryPlist(value);
  auto result = parsePlist(encoded);
  if (auto* back = std::get_if<Value>(&result)) return *back;
  return std::nullopt;
}

Value nested(int depth) {
  Value value = 1;
  for (int i = 0; i < depth; ++i)
    value = i % 2 == 0 ? Value(Array{value}) : Value(Dictionary{{"k", value}});
  return value;
}

std::string repeated(std::string_view text, int times) {
  std::string out;
  for (int i = 0; i < times; ++i) out += text;
  return out;
}

TEST(PlistXml, ADescriptorParsesWithoutADocumentType) {
  const auto value = parsed(xml(R"(<dict>
    <key>SPACEKEEP_ID</key><string>com.example.&amp;cache</string>
    <key>SPACEKEEP_SERVICES</key><array><string>PURGE</string><string>PERIODIC</string></array>
    <key>SPACEKEEP_DO_NOT_QUERY</key><false/>
    <key>N</key><integer>-12</integer><key>R</key><real>1.5</real>
    <key>D</key><data>AAEC</data><key>T</key><date>2001-01-01T00:00:01Z</date>
    <!-- a comment <array> -->
  </dict>)"));
  ASSERT_TRUE(value);
  EXPECT_EQ(*value, Value(Dictionary{{"SPACEKEEP_ID", "com.example.&cache"},
                                     {"SPACEKEEP_SERVICES", Array{"PURGE", "PERIODIC"}},
                                     {"SPACEKEEP_DO_NOT_QUERY", false},
                                     {"N", -12},
                                     {"R", 1.5},
                                     {"D", Data{{0, 1, 2}}},
                                     {"T", Date{978'307'201'000'000'000}}}))
      << textOf(*value);
}

TEST(PlistXml, HeaderAndOuterTagAreNotNeeded) {
  EXPECT_EQ(parsed("<dict><key>A</key><true/></dict>"), Value(Dictionary{{"A", true}}));
  EXPECT_EQ(parsed("\xef\xbb\xbf" + xml("<string>x</string>")), Value("x"));
  EXPECT_EQ(parsed(xml("<array/>")), Value(Array{}));
  EXPECT_EQ(parsed(xml("<dict/>")), Value(Dictionary{}));
  EXPECT_EQ(parsed(xml("<string/>")), Value(""));
}

TEST(PlistXml, IntegersKeepTheirFullRange) {
  struct Case {
    const char* text;
    Value value;
  };
  for (const Case& each : {Case{"0", 0}, Case{"-1", -1}, Case{"9223372036854775807", INT64_MAX},
                           Case{"-9223372036854775808", INT64_MIN},
                           Case{"9223372036854775808", std::uint64_t{1} << 63},
                           Case{"18446744073709551615", UINT64_MAX}, Case{" 7\n", 7},
                           Case{"0x1F", 31}, Case{"+5", 5}}) {
    const auto value =
        parsed(xml("<array><integer>" + std::string(each.text) + "</integer></array>"));
    ASSERT_TRUE(value) << each.text;
    EXPECT_EQ(*value, Value(Array{each.value})) << each.text << " gave " << textOf(*value);
  }
}

TEST(PlistXml, NumbersAndDatesThatAreNoneAreRefused) {
  for (const char* text : {"", "abc", "1.5", "18446744073709551616", "-9223372036854775809", "010",
                           "1 2", "--1", "0x", "-", "99999999999999999999999", "1<!-- -->2"}) {
    EXPECT_NE(refusal(xml("<integer>" + std::string(text) + "</integer>")).find("an integer"),
              std::string::npos)
        << text;
  }
  for (const char* text : {"", "x", "1,5", "1e999", "1.5.5"}) {
    EXPECT_NE(refusal(xml("<real>" + std::string(text) + "</real>")).find("a real"),
              std::string::npos)
        << text;
  }
  for (const char* text : {"", "yesterday", "2001-02-30T00:00:00Z", "2001-01-01T24:00:00Z",
                           "2001-01-01T00:00:00", "2001-1-01T00:00:00Z", "9999-01-01T00:00:00Z",
                           "0000-01-01T00:00:00Z", "2001-01-01 00:00:00Z"}) {
    EXPECT_NE(refusal(xml("<date>" + std::string(text) + "</date>")).find("a date"),
              std::string::npos)
        << text;
  }
  EXPECT_NE(refusal(xml("<integer/>")).find("an integer"), std::string::npos);
}

TEST(PlistXml, DatesOutsideThirtyTwoBitsOfSecondsAreKept) {
  for (const auto& [text, seconds] : {std::pair{"1700-01-01T00:00:00Z", -8520336000L},
                                      std::pair{"2200-12-31T23:59:59Z", 7289654399L},
                                      std::pair{"1999-12-31T23:59:59Z", 946684799L}}) {
    EXPECT_EQ(parsed(xml("<date>" + std::string(text) + "</date>")),
              Value(Date{seconds * 1'000'000'000}))
        << text;
  }
}

TEST(PlistXml, WhatIsNoPropertyListIsRefused) {
  for (const char* text : {"",
                           " ",
                           "\n",
                           "hello world\n",
                           "<",
                           "<>",
                           "< >",
                           "<plist>",
                           "<plist/>",
                           "<plist></plist>",
                           "<html></html>",
                           "<dict>",
                           "<dict></array>",
                           "</dict>",
                           "<dict><string>v</string></dict>",
                           "<dict><key>k</key></dict>",
                           "<dict><key>a</key><key>b</key><true/></dict>",
                           "<array><true/>",
                           "<string>a",
                           "<string>&unknown;</string>",
                           "<!-->--><true/>",
                           "<!-- a -- b --><true/>",
                           "<!--",
                           "<!x",
                           "<?xml",
                           "<![CDATA[",
                           "<true",
                           "<string a=\"><array>\">",
                           "<array a='><array>'/>",
                           "{ a = b; }",
                           "[1, 2]",
                           "{\"a\": 1}"}) {
    EXPECT_NE(refusal(text), "accepted") << text;
    EXPECT_NE(refusal(xml(text)), "accepted") << text;
  }
}

TEST(PlistXml, TextThatIsNotUnicodeIsRefused) {
  EXPECT_EQ(refusal("<string>\xff</string>"), "not a property list: it is not UTF-8 text");
  EXPECT_EQ(refusal(std::string_view("<string>a\0b</string>", 20)),
            "not a property list: it holds a zero byte");
  EXPECT_NE(refusal("<string>&#xD800;</string>"), "accepted");
  EXPECT_NE(refusal(std::string_view("\xff\xfe<\0p\0", 6)), "accepted");
}

TEST(PlistXml, EntitiesOfADocumentTypeAreRefused) {
  EXPECT_EQ(refusal("<!X [<!ENTITY a \"aaaa\">]><string>&a;</string>"),
            "not a property list: a declaration holds declarations of its own");
}

TEST(PlistXml, NestingIsBounded) {
  const std::string deepest =
      repeated("<array>", kMaxPlistDepth) + repeated("</array>", kMaxPlistDepth);
  EXPECT_EQ(refusal(xml(deepest)), "accepted");
  EXPECT_EQ(refusal(xml("<array>" + deepest + "</array>")),
            "not a property list: it is nested too deep");
  EXPECT_EQ(refusal(repeated("<array>", 500'000)), "not a property list: it is nested too deep");
  EXPECT_EQ(refusal(repeated("<dict><key>k</key>", 200'000)),
            "not a property list: it is nested too deep");
  // Closing tags that only look like some must not make room for more opening ones.
  EXPECT_EQ(refusal(repeated("<array><!-- </array> -->", 100'000)),
            "not a property list: it is nested too deep");
  EXPECT_EQ(refusal(repeated("<array><string><![CDATA[</array>]]></string>", 40'000)),
            "not a property list: it is nested too deep");
  EXPECT_EQ(refusal(repeated("<array><?</array>?>", 100'000)),
            "not a property list: it is nested too deep");
}

TEST(PlistXml, SizeAndNumberOfValuesAreBounded) {
  const int most = static_cast<int>(kMaxPlistValues) - 2;  // the array and the outer tag count too
  EXPECT_EQ(refusal(xml("<array>" + repeated("<true/>", most) + "</array>")), "accepted");
  EXPECT_EQ(refusal(xml("<array>" + repeated("<true/>", most + 1) + "</array>")),
            "not a property list: it holds too many values");
  const std::string frame = "<string></string>";
  EXPECT_EQ(refusal("<string>" + std::string(kMaxPlistBytes - frame.size(), 'x') + "</string>"),
            "accepted");
  EXPECT_EQ(refusal("<string>" + std::string(kMaxPlistBytes - frame.size() + 1, 'x') + "</string>"),
            "not a property list: it is too large");
}

TEST(PlistBinary, EveryKindComesBack) {
  const Dictionary everything{{"text", "a \xc3\xa9 \xf0\x9f\x98\x80"},
                              {"empty", ""},
                              {"yes", true},
                              {"no", false},
                              {"data", Data{{0, 255, 1}}},
                              {"no data", Data{}},
                              {"date", Date{1'700'000'000'000'000'000}},
                              {"list", Array{1, "x", Array{}, Dictionary{}}},
                              {"real", 0.1},
                              {"", Dictionary{{"a", -5}}}};
  const auto back = roundTrip(everything);
  ASSERT_TRUE(back);
  EXPECT_EQ(*back, Value(everything)) << textOf(*back);
  const auto* yes = back->dictionary()->find("yes");
  EXPECT_NE(yes->boolean(), nullptr);
  EXPECT_EQ(roundTrip(Value("top")), Value("top"));
  EXPECT_EQ(roundTrip(Value(true)), Value(true));
}

TEST(PlistBinary, NumbersKeepTheirFullRange) {
  for (const Value& number :
       {Value(0), Value(-1), Value(255), Value(256), Value(65536), Value(INT32_MIN),
        Value(INT64_MIN), Value(INT64_MAX), Value(std::uint64_t{1} << 63), Value(UINT64_MAX),
        Value(UINT64_MAX - 1)}) {
    EXPECT_EQ(roundTrip(number), number) << textOf(number);
    EXPECT_EQ(roundTrip(Array{number, Dictionary{{"k", number}}}),
              Value(Array{number, Dictionary{{"k", number}}}));
  }
  for (const double number : {0.0, -0.0, 1.0, 0.1, 1e308, 5e-324,
                              std::numeric_limits<double>::infinity(), -1e-7, std::nan("")}) {
    const auto back = roundTrip(number);
    ASSERT_TRUE(back);
    ASSERT_TRUE(std::holds_alternative<double>(back->storage()));
    EXPECT_EQ(std::bit_cast<std::uint64_t>(*back->asDouble()),
              std::bit_cast<std::uint64_t>(number));
  }
}

TEST(PlistBinary, DatesInTheFirstAndLastFractionOfASecondOfTheRangeAreKept) {
  for (const double unix_seconds : {-9'223'372'036.7, 9'223'372'036.7}) {
    const double seconds = unix_seconds - 978'307'200;
    Bytes document = bytesOf("bplist00\x33");
    for (int shift = 56; shift >= 0; shift -= 8) {
      document.push_back(static_cast<std::uint8_t>(std::bit_cast<std::uint64_t>(seconds) >> shift));
    }
    const std::uint8_t table = static_cast<std::uint8_t>(document.size());
    document.insert(document.end(), {8, 0, 0, 0, 0, 0, 0, 1, 1});
    for (const std::uint8_t number : {std::uint8_t{1}, std::uint8_t{0}, table}) {
      document.insert(document.end(), {0, 0, 0, 0, 0, 0, 0, number});
    }
    const auto result = parsePlist(document);
    const auto* value = std::get_if<Value>(&result);
    ASSERT_TRUE(value != nullptr && value->date() != nullptr) << unix_seconds;
    // Doubles of this size are about two microseconds apart.
    EXPECT_NEAR(static_cast<double>(value->date()->unix_ns), unix_seconds * 1e9, 10'000);
  }
}

TEST(PlistBinary, DatesAreCloseAfterOneRoundAndStableAfterThat) {
  for (const std::int64_t unix_ns :
       {std::int64_t{0}, std::int64_t{-1}, std::int64_t{1'700'000'000'123'456'789},
        std::int64_t{-1'234'567'891'234'567'891}, std::int64_t{978'307'200'000'000'001}, INT64_MAX,
        INT64_MIN}) {
    const auto once = roundTrip(Date{unix_ns});
    ASSERT_TRUE(once && once->date() != nullptr) << unix_ns;
    // 2^-20 of a second is the worst spacing of doubles in the range; the ends are one second
    // inside.
    const bool at_end = unix_ns == INT64_MAX || unix_ns == INT64_MIN;
    EXPECT_LT(std::abs(static_cast<double>(once->date()->unix_ns) - static_cast<double>(unix_ns)),
              at_end ? 1e9 : 1000)
        << unix_ns;
    EXPECT_EQ(roundTrip(*once), once);
  }
}

TEST(PlistBinary, CharactersThatCannotBeKeptAreMarked) {
  EXPECT_EQ(roundTrip(Value(std::string("a\0b", 3))), Value("a\xef\xbf\xbd"
                                                            "b"));
  EXPECT_EQ(roundTrip(Value("x\xff")), Value("x\xef\xbf\xbd"));
  EXPECT_EQ(roundTrip(Value("plain, d\xc3\xa9j\xc3\xa0 vu, \xff\xc3, plain again\x7f")),
            Value("plain, d\xc3\xa9j\xc3\xa0 vu, \xef\xbf\xbd\xef\xbf\xbd, plain again\x7f"));
}

TEST(PlistBinary, WhatCouldNotBeReadBackIsNotWritten) {
  EXPECT_EQ(roundTrip(nested(kMaxPlistDepth)), nested(kMaxPlistDepth));
  EXPECT_TRUE(binaryPlist(nested(kMaxPlistDepth + 1)).empty());
  EXPECT_TRUE(binaryPlist(nested(1000)).empty());
  EXPECT_FALSE(binaryPlist(Array(kMaxPlistValues - 1, Value(1))).empty());
  EXPECT_TRUE(binaryPlist(Array(kMaxPlistValues, Value(1))).empty());
  EXPECT_TRUE(binaryPlist(Data{Bytes(kMaxPlistBytes, 1)}).empty());
  EXPECT_FALSE(binaryPlist(Data{Bytes(kMaxPlistBytes - 100, 1)}).empty());
  // Equal strings are written once; unfolded again they would pass the limit of the reader.
  EXPECT_TRUE(binaryPlist(Array(20, Value(std::string(1'000'000, 'x')))).empty());
}

// A binary document from its parts: objects one after the other, one-byte references.
Bytes document(const std::vector<Bytes>& objects, std::uint8_t root = 0) {
  Bytes out = bytesOf("bplist00");
  Bytes offsets;
  for (const Bytes& object : objects) {
    offsets.push_back(static_cast<std::uint8_t>(out.size() >> 8));
    offsets.push_back(static_cast<std::uint8_t>(out.size()));
    out.insert(out.end(), object.begin(), object.end());
  }
  const std::size_t table = out.size();
  out.insert(out.end(), offsets.begin(), offsets.end());
  Bytes trailer(32, 0);
  trailer[6] = 2;
  trailer[7] = 1;
  trailer[15] = static_cast<std::uint8_t>(objects.size());
  trailer[23] = root;
  trailer[30] = static_cast<std::uint8_t>(table >> 8);
  trailer[31] = static_cast<std::uint8_t>(table);
  out.insert(out.end(), trailer.begin(), trailer.end());
  return out;
}

TEST(PlistBinary, HandMadeDocumentsParse) {
  EXPECT_EQ(refusal(document({{0x09}})), "accepted");
  EXPECT_EQ(std::get<Value>(parsePlist(document({{0xd1, 1, 2}, {0x51, 'k'}, {0x10, 200}}))),
            Value(Dictionary{{"k", 200}}));
  EXPECT_EQ(std::get<Value>(parsePlist(document({{0x62, 0xd8, 0x3d, 0xde, 0x00}}))),
            Value("\xf0\x9f\x98\x80"));
  EXPECT_EQ(std::get<Value>(parsePlist(document({{0x22, 0x3f, 0xc0, 0, 0}}))), Value(1.5));
}

TEST(PlistBinary, NullsUidsSetsAndUnknownKindsAreRefused) {
  EXPECT_EQ(refusal(document({{0x00}})), "not a property list: it holds a null");
  EXPECT_EQ(refusal(document({{0xa1, 1}, {0x80, 5}})), "not a property list: it holds a UID");
  for (const int marker : {0x01, 0x0f, 0x70, 0x90, 0xb0, 0xc0, 0xe0, 0xf0}) {
    EXPECT_EQ(refusal(document({{static_cast<std::uint8_t>(marker)}})),
              "not a property list: it holds a value of an unknown kind")
        << marker;
  }
}

TEST(PlistBinary, DamagedObjectsAreRefused) {
  for (const Bytes& object :
       std::vector<Bytes>{{0x15},
                          {0x13, 1, 2},
                          {0x24},
                          {0x21, 1, 2},
                          {0x32, 0, 0, 0, 0},
                          {0x33, 0},
                          {0x45, 1},
                          {0x52, 'a', 0},
                          {0x51, 0x80},
                          {0x5f},
                          {0x5f, 0x09},
                          {0x5f, 0x13, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 1},
                          {0x61, 0, 0},
                          {0x61, 0xd8, 0x00},
                          {0x61, 0xdc, 0x00},
                          {0x6f, 0x13, 0x80, 0, 0, 0, 0, 0, 0, 1, 0, 65},
                          {0xa2, 0},
                          {0xd1, 0},
                          {0xa1, 9},
                          {0xd1, 0, 0},
                          {0xaf, 0x13, 0x7f, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff},
                          {0x14, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0},
                          {0x33, 0x7f, 0xf8, 0, 0, 0, 0, 0, 0},
                          {0x33, 0x7f, 0xe0, 0, 0, 0, 0, 0, 0}}) {
    EXPECT_NE(refusal(document({object})), "accepted") << testing::PrintToString(object);
  }
}

TEST(PlistBinary, CyclesAndUnfoldingAreBounded) {
  EXPECT_EQ(refusal(document({{0xa1, 0}})), "not a property list: it is nested too deep");
  EXPECT_EQ(refusal(document({{0xa1, 1}, {0xa1, 0}})),
            "not a property list: it is nested too deep");
  std::vector<Bytes> doubling;  // 2^30 values when unfolded
  for (std::uint8_t i = 1; i <= 30; ++i) doubling.push_back({0xa2, i, i});
  doubling.push_back({0x09});
  EXPECT_EQ(refusal(document(doubling)), "not a property list: it holds too many values");
  std::vector<Bytes> shared_text{{0xaf, 0x11, 0x02, 0x58}, {0x5f, 0x11, 0x75, 0x30}};
  shared_text[0].insert(shared_text[0].end(), 600, 1);
  shared_text[1].insert(shared_text[1].end(), 30000, 'x');
  EXPECT_EQ(refusal(document(shared_text)), "not a property list: it unfolds to too many bytes");
}

/// An array that names one text 512 times.
Bytes textNamedOften(std::size_t text_bytes) {
  std::vector<Bytes> objects{{0xaf, 0x11, 0x02, 0x00}, {0x5f, 0x11}};
  objects[0].insert(objects[0].end(), 512, 1);
  objects[1].push_back(static_cast<std::uint8_t>(text_bytes >> 8));
  objects[1].push_back(static_cast<std::uint8_t>(text_bytes & 0xff));
  objects[1].insert(objects[1].end(), text_bytes, 'x');
  return document(objects);
}

TEST(PlistBinary, UnfoldsToSixteenMebibytesAndNotAByteMore) {
  // With the byte that each name takes: 512 times 32 KiB.
  EXPECT_EQ(refusal(textNamedOften(32'767)), "accepted");
  EXPECT_EQ(refusal(textNamedOften(32'768)), "not a property list: it unfolds to too many bytes");
}

TEST(PlistBinary, EveryPrefixOfADocumentIsRefused) {
  const Bytes whole =
      binaryPlist(Dictionary{{"a", Array{1, UINT64_MAX, "text"}}, {"b", Date{5}}, {"c", 0.5}});
  ASSERT_EQ(refusal(whole), "accepted");
  for (std::size_t length = 0; length < whole.size(); ++length) {
    EXPECT_NE(refusal(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length))),
              "accepted")
        << length;
  }
}

TEST(PlistBinary, ADamagedTrailerIsRefused) {
  const Bytes good = document({{0xa1, 1}, {0x09}});
  const std::size_t trailer = good.size() - 32;
  for (const auto& [place, value] :
       {std::pair{6, 0}, std::pair{6, 9}, std::pair{7, 0}, std::pair{7, 255}, std::pair{8, 255},
        std::pair{15, 0}, std::pair{15, 200}, std::pair{16, 128}, std::pair{23, 2},
        std::pair{24, 255}, std::pair{31, 0}, std::pair{30, 255}}) {
    Bytes bad = good;
    bad[trailer + static_cast<std::size_t>(place)] = static_cast<std::uint8_t>(value);
    EXPECT_NE(refusal(bad), "accepted") << place << " = " << value;
  }
}

}  // namespace
}  // namespace spacekeep
