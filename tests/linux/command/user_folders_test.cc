// Whose directories a user's service looks into.
#include "services/command/base/user_folders.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <map>

#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class UserFoldersTest : public testing::Test {
 protected:
  [[nodiscard]] std::variant<UserFolders, std::string> find(
      const std::map<std::string, std::string>& variables, uid_t uid = ::geteuid()) const {
    return foldersBelow(uid, "somebody", home_, [&variables](const char* name) {
      const auto found = variables.find(name);
      return found == variables.end() ? std::nullopt : std::optional(found->second);
    });
  }
  const std::string home_ = temporaryDirectory();
};

TEST_F(UserFoldersTest, WithoutVariablesTheUsualOnesAreTaken) {
  const auto folders = std::get<UserFolders>(find({}));
  EXPECT_EQ(folders.cache, home_ + "/.cache");
  EXPECT_EQ(folders.data, home_ + "/.local/share");
  EXPECT_EQ(folders.config, home_ + "/.config");
  EXPECT_EQ(folders.state, home_ + "/.local/state");
  EXPECT_THAT(folders.runtime, IsEmpty());
  EXPECT_THAT(folders.problems, IsEmpty());
}

TEST_F(UserFoldersTest, AVariableThatNamesAnOwnDirectoryCounts) {
  const std::string own = temporaryDirectory();
  EXPECT_EQ(std::get<UserFolders>(find({{"XDG_CACHE_HOME", own}})).cache, own);
}

TEST_F(UserFoldersTest, AVariableThatIsRelativeOrNamesAnothersDirectoryDoesNot) {
  const std::string others = temporaryDirectory();
  ASSERT_EQ(::chown(others.c_str(), 12345, 12345), 0);
  const auto folders =
      std::get<UserFolders>(find({{"XDG_CACHE_HOME", others}, {"XDG_DATA_HOME", "data"}}));
  EXPECT_EQ(folders.cache, home_ + "/.cache");
  EXPECT_EQ(folders.data, home_ + "/.local/share");
  EXPECT_THAT(folders.problems,
              ElementsAre("XDG_CACHE_HOME=" + others +
                          ": not a directory of this user; the usual one is taken"));
}

TEST_F(UserFoldersTest, AnOwnFolderThatBelongsToSomebodyElseIsLeftAlone) {
  cachedir::run("mkdir " + home_ + "/.cache && chown 12345 " + home_ + "/.cache");
  const auto folders = std::get<UserFolders>(find({}));
  EXPECT_EQ(filledIn("$XDG_CACHE_HOME/x", &folders), "/nonexistent/x");
  EXPECT_THAT(folders.problems,
              ElementsAre(home_ + "/.cache: belongs to somebody else; nothing is done there"));
}

TEST_F(UserFoldersTest, AVariableThatNamesTheHomeDirectoryOrOneAboveItDoesNotCount) {
  cachedir::run("mkdir -p " + home_ + "/inner/home && ln -s inner/home " + home_ + "/link");
  const auto in = [&](const std::string& value) {
    const auto variable = [&value](const char* name) {
      return std::string(name) == "XDG_CACHE_HOME" ? std::optional(value) : std::nullopt;
    };
    return std::get<UserFolders>(
        foldersBelow(::geteuid(), "somebody", home_ + "/inner/home", variable));
  };
  const std::string usual = home_ + "/inner/home/.cache";
  for (const char* wrong : {"/inner/home", "/inner/home/", "/inner", "/link", ""}) {
    EXPECT_EQ(in(home_ + wrong).cache, usual) << wrong;
    EXPECT_THAT(in(home_ + wrong).problems,
                ElementsAre("XDG_CACHE_HOME=" + home_ + wrong +
                            ": holds the home directory; the usual one is taken"));
  }
  EXPECT_EQ(in("/").cache, usual);
  EXPECT_EQ(in(home_ + "/inner/home/x").cache, home_ + "/inner/home/x");
  EXPECT_EQ(in(home_ + "/inner/hom").cache, home_ + "/inner/hom");
}

TEST_F(UserFoldersTest, ACacheFolderThatIsALinkToTheHomeDirectoryIsLeftAlone) {
  ASSERT_EQ(::symlink(".", (home_ + "/.cache").c_str()), 0);
  const auto folders = std::get<UserFolders>(find({}));
  EXPECT_EQ(folders.cache, "/nonexistent");
  EXPECT_THAT(folders.problems,
              ElementsAre(home_ + "/.cache: holds the home directory; nothing is done there"));
}

TEST_F(UserFoldersTest, ACacheFolderThatHoldsOneOfTheOthersIsLeftAlone) {
  for (const char* other : {"XDG_DATA_HOME", "XDG_CONFIG_HOME", "XDG_STATE_HOME"}) {
    const auto folders = std::get<UserFolders>(
        find({{"XDG_CACHE_HOME", home_ + "/x"}, {other, home_ + "/x/deep/y"}}));
    EXPECT_EQ(folders.cache, "/nonexistent");
    EXPECT_THAT(folders.problems, ElementsAre(home_ + "/x: the cache folder holds " + home_ +
                                              "/x/deep/y; nothing is done there"));
  }
  EXPECT_THAT(std::get<UserFolders>(
                  find({{"XDG_CACHE_HOME", home_ + "/x"}, {"XDG_DATA_HOME", home_ + "/xy"}}))
                  .problems,
              IsEmpty());
}

TEST_F(UserFoldersTest, AHomeOfSomebodyElseIsRefused) {
  EXPECT_EQ(
      std::get<std::string>(find({}, 12345)),
      "the home directory \"" + home_ + "\" does not belong to somebody; nothing is done there");
}

TEST_F(UserFoldersTest, ACacheThatWasMovedElsewhereIsFollowedOnce) {
  const std::string elsewhere = temporaryDirectory();
  ASSERT_EQ(::symlink(elsewhere.c_str(), (home_ + "/.cache").c_str()), 0);
  EXPECT_EQ(std::get<UserFolders>(find({})).cache, elsewhere);
}

TEST_F(UserFoldersTest, WithoutAUserOnlyAbsolutePathsAreFilledIn) {
  EXPECT_EQ(filledIn("~/x", nullptr), std::nullopt);
  EXPECT_EQ(filledIn("/x", nullptr), "/x");
  EXPECT_EQ(filledIn("a~/x", nullptr), "a~/x");
}

}  // namespace
}  // namespace spacekeep::command
