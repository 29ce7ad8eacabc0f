// Every manual page is well formed, and tells of every option of its program.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <regex>

#include "tests/linux/packaging/packaging_world.h"

namespace spacekeep::packaging {
namespace {

using testing::HasSubstr;
using testing::IsEmpty;

const fs::path kManuals = kSource / "packaging/man";

std::string asRead(const fs::path& page) {
  const Finished text = run("mandoc -T ascii -O width=400 " + page.string());
  EXPECT_EQ(text.exit_code, 0) << text.out;
  return std::regex_replace(text.out, std::regex(".\x08"), "");
}

TEST(Manuals, NoPageHasAnythingToWarnOf) {
  const auto pages = filesBelow(kManuals);
  ASSERT_FALSE(pages.empty());
  for (const fs::path& page : pages) {
    const Finished lint = run("mandoc -T lint -W warning " + page.string());
    EXPECT_EQ(lint.exit_code, 0) << page;
    EXPECT_THAT(lint.out, IsEmpty()) << page;
  }
}

TEST(Manuals, EveryProgramHasAPageWithAllOfItsOptions) {
  const std::pair<const char*, const char*> programs[] = {
      {"services/spacekeep-cachedir", "spacekeep-cachedir.8"},
      {"services/spacekeep-command", "spacekeep-command.8"}};
  for (const auto& [program, page] : programs) {
    const std::string text = asRead(kManuals / page);
    const std::string help = run((kBuild / program).string() + " --help").out;
    const std::regex option("--[a-z-]+");
    const std::sregex_iterator end;
    std::sregex_iterator found(help.begin(), help.end(), option);
    ASSERT_NE(found, end) << program;
    for (; found != end; ++found) EXPECT_THAT(text, HasSubstr(found->str())) << page;
  }
}

TEST(Manuals, EveryPageThatAPageRefersToShipsOrIsOfTheSystem) {
  const std::set<std::string> of_the_system = {"systemd.socket 5"};
  const std::regex reference(R"(\n\.Xr ([a-z.-]+ [0-9]))");
  for (const fs::path& page : filesBelow(kManuals)) {
    const std::string text = contentOf(page);
    for (std::sregex_iterator found(text.begin(), text.end(), reference), end; found != end;
         ++found) {
      std::string name = (*found)[1];
      if (of_the_system.contains(name)) continue;
      name[name.rfind(' ')] = '.';
      EXPECT_TRUE(fs::exists(kManuals / name)) << page << " refers to " << name;
    }
  }
}

TEST(Manuals, ThePageOfTheDaemonTellsOfEveryFieldOfTheJournal) {
  const std::string text = asRead(kManuals / "spacekeepd.8");
  const std::string source = contentOf(kSource / "support/logging/linux/journal.cc");
  const std::regex field("addField\\(datagram, \"([A-Z_]+)\"");
  std::size_t fields = 0;
  for (std::sregex_iterator found(source.begin(), source.end(), field), end; found != end;
       ++found, ++fields) {
    EXPECT_THAT(text, HasSubstr((*found)[1].str()));
  }
  EXPECT_EQ(fields, 7U);
}

}  // namespace
}  // namespace spacekeep::packaging
