#include "support/values/value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace spacekeep {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();
constexpr double kTwoTo63 = 9223372036854775808.0;

TEST(ValueNumbers, AsUnsignedCutsFractionsAndSaturates) {
  struct Case {
    Value value;
    std::uint64_t expected;
  };
  for (const Case& each :
       {Case{5, 5}, Case{-1, 0}, Case{INT64_MIN, 0}, Case{UINT64_MAX, UINT64_MAX},
        Case{INT64_MAX, INT64_MAX}, Case{2.99, 2}, Case{-0.5, 0}, Case{-kInfinity, 0},
        Case{std::nan(""), 0}, Case{kInfinity, UINT64_MAX}, Case{1e300, UINT64_MAX},
        Case{2 * kTwoTo63, UINT64_MAX}, Case{kTwoTo63, std::uint64_t{1} << 63}}) {
    EXPECT_EQ(each.value.asUnsigned(), each.expected);
  }
}

TEST(ValueNumbers, AsSignedCutsFractionsAndSaturatesAtBothEnds) {
  struct Case {
    Value value;
    std::int64_t expected;
  };
  for (const Case& each :
       {Case{-5, -5}, Case{UINT64_MAX, INT64_MAX}, Case{7u, 7}, Case{-2.99, -2},
        Case{kInfinity, INT64_MAX}, Case{-kInfinity, INT64_MIN}, Case{std::nan(""), 0},
        Case{kTwoTo63, INT64_MAX}, Case{-kTwoTo63, INT64_MIN}, Case{-1e30, INT64_MIN}}) {
    EXPECT_EQ(each.value.asSigned(), each.expected);
  }
}

TEST(ValueNumbers, OtherKindsAreNoNumbers) {
  for (const Value& value : {Value("12"), Value(true), Value(Data{{1}}), Value(Date{1}),
                             Value(Array{1}), Value(Dictionary{{"A", 1}})}) {
    EXPECT_FALSE(value.isNumber());
    EXPECT_EQ(value.asUnsigned(), std::nullopt);
    EXPECT_EQ(value.asSigned(), std::nullopt);
    EXPECT_EQ(value.asDouble(), std::nullopt);
  }
}

TEST(ValueNumbers, TruthOfEachKind) {
  EXPECT_TRUE(Value(true).truth());
  EXPECT_FALSE(Value(false).truth());
  for (const Value& value : {Value(1), Value(-1), Value(1u), Value(0.1), Value(std::nan(""))}) {
    EXPECT_TRUE(value.truth());
  }
  for (const Value& value : {Value(0), Value(0u), Value(0.0), Value(-0.0), Value("true"),
                             Value("1"), Value(Array{1}), Value(Data{{1}}), Value(Date{1})}) {
    EXPECT_FALSE(value.truth());
  }
}

TEST(ValueEquality, NumbersCompareByValueAcrossTheirKinds) {
  EXPECT_EQ(Value(1), Value(1u));
  EXPECT_EQ(Value(1u), Value(1.0));
  // Numbers that as a double would be others.
  EXPECT_EQ(Value(INT64_MAX), Value(static_cast<std::uint64_t>(INT64_MAX)));
  EXPECT_EQ(Value(static_cast<std::uint64_t>(INT64_MAX)), Value(INT64_MAX));
  EXPECT_EQ(Value(-1.0), Value(-1));
  EXPECT_EQ(Value(0), Value(-0.0));
  EXPECT_EQ(Value(INT64_MIN), Value(-kTwoTo63));
  EXPECT_EQ(Value(std::uint64_t{1} << 63), Value(kTwoTo63));
}

TEST(ValueEquality, NearbyNumbersOfDifferentKindsAreNotEqual) {
  const std::int64_t beyond_doubles = (std::int64_t{1} << 53) + 1;
  EXPECT_NE(Value(beyond_doubles), Value(static_cast<double>(beyond_doubles)));
  EXPECT_NE(Value(INT64_MAX), Value(kTwoTo63));
  EXPECT_NE(Value(INT64_MIN), Value(kTwoTo63));
  EXPECT_NE(Value(UINT64_MAX), Value(2 * kTwoTo63));
  EXPECT_NE(Value(0u), Value(2 * kTwoTo63));
  EXPECT_NE(Value(std::uint64_t{1} << 63), Value(2 * kTwoTo63));
  EXPECT_NE(Value(UINT64_MAX), Value(-1));
  EXPECT_NE(Value(1), Value(1.5));
  EXPECT_NE(Value(0), Value(std::nan("")));
  EXPECT_NE(Value(std::nan("")), Value(std::nan("")));
}

TEST(ValueEquality, OtherKindsAreEqualOnlyToTheirOwn) {
  EXPECT_NE(Value(true), Value(1));
  EXPECT_NE(Value("1"), Value(1));
  EXPECT_NE(Value(Date{1}), Value(1));
  EXPECT_NE(Value(Array{}), Value(Dictionary{}));
  EXPECT_NE(Value(""), Value(Data{}));
  EXPECT_EQ(Value(Array{1, "a", true}), Value(Array{1.0, "a", true}));
  EXPECT_NE(Value(Array{1, 2}), Value(Array{2, 1}));
  EXPECT_EQ(Value(Dictionary{{"A", 1}, {"B", 2u}}), Value(Dictionary{{"B", 2}, {"A", 1.0}}));
  EXPECT_NE(Value(Dictionary{{"A", 1}}), Value(Dictionary{{"A", 1}, {"B", 2}}));
}

TEST(Dictionaries, KeysAreKeptInByteOrderHoweverTheyAreAdded) {
  Dictionary dictionary;
  for (const char* key : {"b", "a", "\xc3\xa9", "B", "", "ab"}) dictionary.set(key, key);
  std::vector<std::string> keys;
  for (const auto& [key, value] : dictionary) {
    keys.push_back(key);
    EXPECT_EQ(*value.string(), key);
  }
  EXPECT_EQ(keys, (std::vector<std::string>{"", "B", "a", "ab", "b", "\xc3\xa9"}));
}

TEST(Dictionaries, AKeyGivenTwiceKeepsItsLastValue) {
  const Dictionary dictionary{{"A", 1}, {"B", 2}, {"A", 3}};
  EXPECT_EQ(dictionary.size(), 2u);
  EXPECT_EQ(*dictionary.find("A"), Value(3));
}

TEST(Dictionaries, FindAndRemoveTellWhatWasThere) {
  Dictionary dictionary{{"A", 1}, {"C", 3}};
  EXPECT_EQ(dictionary.find("B"), nullptr);
  EXPECT_EQ(dictionary.find("D"), nullptr);
  EXPECT_FALSE(dictionary.remove("B"));
  EXPECT_TRUE(dictionary.remove("A"));
  EXPECT_FALSE(dictionary.remove("A"));
  EXPECT_FALSE(dictionary.contains("A"));
  EXPECT_EQ(dictionary.size(), 1u);
  dictionary.clear();
  EXPECT_TRUE(dictionary.empty());
  EXPECT_EQ(dictionary.begin(), dictionary.end());
}

TEST(Dictionaries, AgreeWithAReferenceOverManyOperations) {
  Dictionary dictionary;
  std::vector<std::optional<int>> reference(50);
  std::uint32_t state = 12345;
  for (int step = 0; step < 5000; ++step) {
    state = state * 1664525 + 1013904223;
    const std::size_t slot = (state >> 8) % reference.size();
    const std::string key(1 + slot % 7, static_cast<char>('a' + slot / 7));
    if (state >> 30 == 0) {
      EXPECT_EQ(dictionary.remove(key), reference[slot].has_value());
      reference[slot].reset();
    } else {
      dictionary.set(key, step);
      reference[slot] = step;
    }
    const Value* found = dictionary.find(key);
    ASSERT_EQ(found != nullptr, reference[slot].has_value());
    if (found != nullptr) {
      EXPECT_EQ(*found, Value(*reference[slot]));
    }
  }
}

TEST(RequestReaders, AValueOfAnotherKindCountsAsAbsent) {
  const Dictionary info{{"NUMBER", 2.7}, {"TEXT", "t"}, {"YES", true}, {"NO", false}, {"ZERO", 0}};
  EXPECT_EQ(unsignedAt(info, "NUMBER"), 2u);
  EXPECT_EQ(unsignedAt(info, "TEXT"), std::nullopt);
  EXPECT_EQ(unsignedAt(info, "YES"), std::nullopt);
  EXPECT_EQ(unsignedAt(info, "ABSENT"), std::nullopt);
  ASSERT_NE(stringAt(info, "TEXT"), nullptr);
  EXPECT_EQ(*stringAt(info, "TEXT"), "t");
  EXPECT_EQ(stringAt(info, "NUMBER"), nullptr);
  EXPECT_EQ(stringAt(info, "ABSENT"), nullptr);
  EXPECT_TRUE(truthAt(info, "YES"));
  EXPECT_TRUE(truthAt(info, "NUMBER"));
  for (const char* key : {"NO", "ZERO", "TEXT", "ABSENT"}) EXPECT_FALSE(truthAt(info, key)) << key;
}

}  // namespace
}  // namespace spacekeep
