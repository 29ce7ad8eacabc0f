#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <sstream>
#include <string>

namespace spacekeep::sdk {
namespace {

std::string contentOf(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(std::string(SPACEKEEP_SOURCE_DIR) + "/" + path).rdbuf();
  return text.str();
}

struct Shown {
  const char* document;
  const char* language;
  const char* example;
};

constexpr Shown kShort[] = {{"docs/write-a-client.md", "cpp", "make_room.cc"},
                            {"docs/write-a-client.md", "python", "make_room.py"},
                            {"docs/write-a-service.md", "cpp", "thumbnails.cc"},
                            {"docs/write-a-service.md", "python", "thumbnails.py"}};
constexpr Shown kLong[] = {{"docs/sdk.md", "cpp", "thumbnail_cache.cc"},
                           {"docs/sdk.md", "cpp", "on_demand.cc"}};

std::string exampleOf(const Shown& shown) {
  return contentOf(std::string("sdk/examples/") + shown.example);
}

void expectShown(const Shown& shown) {
  const std::string source = exampleOf(shown);
  ASSERT_GT(source.size(), 400U) << shown.example;
  const std::string block = std::string("```") + shown.language + "\n" + source + "```";
  EXPECT_NE(contentOf(shown.document).find(block), std::string::npos)
      << shown.document << " does not show sdk/examples/" << shown.example << " as it is";
}

TEST(SdkDocumentation, ShowsTheExamplesThatAreBuiltAsTheyAre) {
  for (const auto& shown : kShort) expectShown(shown);
  for (const auto& shown : kLong) expectShown(shown);
}

TEST(SdkDocumentation, ThirtyLinesAreEnoughForAClientAndForAService) {
  for (const auto& shown : kShort) {
    const std::string source = exampleOf(shown);
    EXPECT_LE(std::count(source.begin(), source.end(), '\n'), 30) << shown.example;
  }
}

TEST(SdkDocumentation, PublicHeadersIncludeNothingThatIsNotInstalled) {
  for (const auto* header : {"client", "service", "error"}) {
    const std::string source = contentOf(std::string("sdk/include/spacekeep/") + header + ".h");
    ASSERT_GT(source.size(), 500U);
    EXPECT_EQ(source.find("#include \""), std::string::npos) << header;
  }
  // This one is installed as <spacekeep/value.h>.
  EXPECT_EQ(contentOf("support/values/value.h").find("#include \""), std::string::npos);
}

}  // namespace
}  // namespace spacekeep::sdk
