// Damaged documents: whatever comes in, the parser answers with a value that can be written and
// read again, or with a reason. Run with the sanitizers, it also shows that nothing leaks or is
// overrun.
#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "support/values/plist.h"
#include "support/values/text.h"

namespace spacekeep {
namespace {

using Bytes = std::vector<std::uint8_t>;

std::vector<Bytes> seeds() {
  Array many;
  for (int i = 0; i < 150; ++i) many.push_back(i * i);
  const Dictionary everything{{"text", "abc"},
                              {"wide", "\xf0\x9f\x98\x80 \xc3\xa9"},
                              {"list", Array{1, -2, UINT64_MAX, true}},
                              {"date", Date{1'700'000'000'000'000'000}},
                              {"data", Data{{1, 2, 3}}},
                              {"real", 2.5},
                              {"inner", Dictionary{{"a", Array{Dictionary{{"b", Array{}}}}}}}};
  const std::string xml =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?><plist version=\"1.0\"><!-- c "
      "--><dict><key>text</key><string>a&lt;b<![CDATA[<x>]]></string>"
      "<key>list</key><array><integer>-1</integer><integer>18446744073709551615</integer><true/"
      "><false/><real>2.5</real></array>"
      "<key>date</key><date>2020-02-29T12:00:00Z</date><key>data</key><data>AAECAw==</"
      "data><key>inner</key><dict><key>a</key><array/></dict></dict></plist>";
  return {binaryPlist(everything), binaryPlist(many), binaryPlist(Value(0.5)),
          Bytes(xml.begin(), xml.end())};
}

const std::vector<std::string>& tokens() {
  static const std::vector<std::string> list{
      "<array>",  "</array>", "<dict>", "</dict>", "<key>", "</key>", "<!--", "-->",   "<![CDATA[",
      "]]>",      "<?",       "?>",     "<true/>", "&amp;", "&#x41;", "&#0;", "&",     "<string/>",
      "</plist>", "<data>",   "\"",     "'",       ">",     "<",      "/",    "<uid>", "<integer>"};
  return list;
}

class Mutator {
 public:
  explicit Mutator(std::uint64_t seed) : random_(seed) {}

  Bytes mutate(Bytes document) {
    for (std::size_t steps = 1 + below(4); steps > 0 && !document.empty(); --steps) step(document);
    return document;
  }

 private:
  std::size_t below(std::size_t bound) { return static_cast<std::size_t>(random_() % bound); }

  void step(Bytes& document) {
    const std::size_t at = below(document.size());
    const auto place = document.begin() + static_cast<std::ptrdiff_t>(at);
    const auto stop =
        document.begin() +
        static_cast<std::ptrdiff_t>(at + below(std::min<std::size_t>(40, document.size() - at)));
    switch (below(7)) {
      case 0:
        *place = static_cast<std::uint8_t>(random_());
        break;
      case 1:
        *place = static_cast<std::uint8_t>(*place ^ (1u << below(8)));
        break;
      case 2:
        document.erase(place, stop);
        break;
      case 3: {
        const Bytes copy(place, stop);
        document.insert(document.begin() + static_cast<std::ptrdiff_t>(below(document.size())),
                        copy.begin(), copy.end());
        break;
      }
      case 4: {
        const std::string& token = tokens()[below(tokens().size())];
        document.insert(place, token.begin(), token.end());
        break;
      }
      case 5:  // the trailer and object table of the binary encoding
        document[document.size() - 1 - below(std::min<std::size_t>(48, document.size()))] =
            static_cast<std::uint8_t>(random_() % 2 == 0 ? 0xff : below(16));
        break;
      case 6:
        *place =
            std::array<std::uint8_t, 8>{0x00, 0x0f, 0x1f, 0x4f, 0x5f, 0x6f, 0xaf, 0xdf}[below(8)];
        break;
    }
  }

  std::mt19937_64 random_;
};

// NaN is not equal to itself, so values are compared by their text.
void checkAnswer(const Bytes& document) {
  const auto result = parsePlist(document);
  if (const auto* error = std::get_if<PlistError>(&result)) {
    EXPECT_TRUE(error->reason.starts_with("not a property list: "));
    return;
  }
  const Value& value = std::get<Value>(result);
  const auto again = parsePlist(binaryPlist(value));
  ASSERT_TRUE(std::holds_alternative<Value>(again)) << textOf(value);
  EXPECT_EQ(textOf(std::get<Value>(again)), textOf(value));
}

TEST(PlistMutations, EveryDamagedDocumentIsAnsweredWithAValueOrAReason) {
  std::size_t accepted = 0;
  std::size_t refused = 0;
  for (const Bytes& seed : seeds()) {
    ASSERT_FALSE(seed.empty());
    for (std::uint64_t number = 0; number < 2500; ++number) {
      const Bytes document = Mutator(number).mutate(seed);
      SCOPED_TRACE(number);
      checkAnswer(document);
      (std::holds_alternative<Value>(parsePlist(document)) ? accepted : refused) += 1;
    }
  }
  // Both ways were taken often, so the mutations neither all miss nor all hit.
  EXPECT_GT(accepted, 500u);
  EXPECT_GT(refused, 2000u);
}

TEST(PlistMutations, RandomBytesAreRefused) {
  std::mt19937_64 random(1);
  for (int round = 0; round < 2000; ++round) {
    Bytes document(random() % 200);
    std::generate(document.begin(), document.end(),
                  [&random] { return static_cast<std::uint8_t>(random()); });
    if (round % 2 == 0) document.insert(document.begin(), {'b', 'p', 'l', 'i', 's', 't', '0', '0'});
    EXPECT_TRUE(std::holds_alternative<PlistError>(parsePlist(document))) << round;
  }
}

}  // namespace
}  // namespace spacekeep
