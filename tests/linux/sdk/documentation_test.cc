#include <gmock/gmock.h>
#include <gtest/gtest.h>

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

TEST(SdkDocumentation, ShowsTheExamplesThatAreBuiltAsTheyAre) {
  const std::string document = contentOf("docs/sdk.md");
  for (const auto* example : {"make_room", "thumbnail_cache", "on_demand"}) {
    const std::string source = contentOf(std::string("sdk/examples/") + example + ".cc");
    ASSERT_GT(source.size(), 500U) << example;
    EXPECT_NE(document.find("```cpp\n" + source + "```"), std::string::npos)
        << "docs/sdk.md does not show sdk/examples/" << example << ".cc as it is";
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
