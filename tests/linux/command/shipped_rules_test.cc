// The rules that ship, on the layouts that the programs' own documents and sources describe. The
// same rules on what the programs themselves have written: ./dev caches.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>

#include "services/command/rules/rule_files.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

using testing::Contains;
using testing::IsEmpty;
using testing::UnorderedElementsAreArray;

std::vector<Rule> shipped(const std::string& kind, const UserFolders* folders) {
  auto rules = readRules({.files = {}, .folders = {kShipped + "/" + kind}, .only = {}}, folders);
  if (const auto* error = std::get_if<cachedir::RuleError>(&rules)) ADD_FAILURE() << error->text;
  return std::get<std::vector<Rule>>(std::move(rules));
}

/// A file of 64 KiB, unused for so many days.
struct Item {
  std::string path;  // below the home directory, or of the machine
  double days = 0;
  int goes_at = 0;  // the mildest urgency; 0: never
};

constexpr std::uint64_t kItemBytes = 64 * 1024;
constexpr int kNever = 0;

struct Layout {
  std::string rule;
  std::vector<Item> items;
};

void PrintTo(const Layout& layout, std::ostream* out) { *out << layout.rule; }

const std::string kHash = "0123456789abcdef0123456789abcdef";

const Layout kLayouts[] = {
    {"thumbnails",
     {{".cache/thumbnails/normal/" + kHash + ".png", 100, 1},
      {".cache/thumbnails/large/" + kHash + ".png", 40, 2},
      {".cache/thumbnails/fail/gnome-thumbnail-factory/" + kHash + ".png", 10, 3},
      {".cache/thumbnails/x-large/" + kHash + ".png", 1, 4},
      {".thumbnails/normal/" + kHash + ".png", 100, 1},
      {"Pictures/a.png", 1000, kNever}}},
    {"firefox",
     {{".cache/mozilla/firefox/abc.default-release/cache2/entries/" + kHash, 40, 1},
      {".cache/mozilla/firefox/xyz.work/cache2/entries/" + kHash, 3, 3},
      {".cache/mozilla/firefox/xyz.work/cache2/doomed/123", 1, 3},
      {".cache/thunderbird/q.default/cache2/entries/" + kHash, 0.1, 4},
      {".cache/mozilla/firefox/abc.default-release/cache2/index", 40, kNever},
      {".cache/mozilla/firefox/abc.default-release/startupCache/scriptCache.bin", 40, kNever},
      {".mozilla/firefox/abc.default-release/places.sqlite", 400, kNever}}},
    {"chromium",
     {{".cache/chromium/Default/Cache/Cache_Data/0a1b2c3d4e5f6071_0", 40, 1},
      {".cache/google-chrome/Profile 1/Cache/Cache_Data/0a1b2c3d4e5f6071_1", 10, 2},
      {".cache/google-chrome/Default/Code Cache/js/0a1b2c3d4e5f6071_0", 2, 3},
      {".cache/BraveSoftware/Brave-Browser/Default/Cache/Cache_Data/00_s", 0.1, 4},
      {".cache/chromium/Default/Cache/Cache_Data/index", 400, kNever},
      {".cache/chromium/Default/Cache/Cache_Data/index-dir/the-real-index", 400, kNever},
      {".cache/chromium/Default/Cache/Cache_Data/data_1", 400, kNever},
      {".cache/chromium/Default/Cache/Cache_Data/f_00001a", 400, kNever},
      {".config/chromium/Default/History", 400, kNever}}},
    {"pip",
     {{".cache/pip/http-v2/a/b/c/d/e/abcde", 100, 1},
      {".cache/pip/http-v2/a/b/c/d/f/abcdf.body", 40, 2},
      {".cache/pip/http/a/b/c/d/e/abcde", 10, 3},
      {".cache/pip/wheels/a/b/c/d/x-1.0-py3-none-any.whl", 1, 4},
      {".cache/pip/selfcheck/abc", 400, kNever},
      {".config/pip/pip.conf", 400, kNever}}},
    {"npm",
     {{".npm/_cacache/content-v2/sha512/aa/bb/cc", 100, 1},
      {".npm/_cacache/content-v2/sha512/aa/bb/dd", 40, 2},
      {".npm/_logs/2024-01-01T00_00_00_000Z-debug-0.log", 10, 3},
      {".npm/_cacache/content-v2/sha1/ee/ff/00", 1, 4},
      {".npm/_cacache/index-v5/aa/bb/cc", 400, kNever},
      {".npm/_npx/abc/node_modules/x/index.js", 400, kNever},
      {".npmrc", 400, kNever}}},
    {"cargo",
     {{".cargo/registry/src/index.crates.io-6f17/a-1.0.0/src/lib.rs", 100, 1},
      {".cargo/registry/src/index.crates.io-6f17/a-1.0.0/.cargo-ok", 95, 1},
      {".cargo/registry/src/index.crates.io-6f17/b-1.0.0/src/lib.rs", 100, 2},
      {".cargo/registry/src/index.crates.io-6f17/b-1.0.0/Cargo.toml", 40, 2},
      {".cargo/registry/cache/index.crates.io-6f17/a-1.0.0.crate", 20, 3},
      {".cargo/registry/cache/index.crates.io-6f17/b-1.0.0.crate", 2, 4},
      {".cargo/registry/cache/index.crates.io-6f17/c-1.0.0.crate", 0.1, kNever},
      {".cargo/registry/index/index.crates.io-6f17/.cache/a/b", 400, kNever},
      {".cargo/bin/tool", 400, kNever},
      {".cargo/credentials.toml", 400, kNever}}},
    {"go",
     {{".cache/go-build/00/" + kHash + "-a", 6, 1},
      {".cache/go-build/00/" + kHash + "-d", 4, 2},
      {".cache/go-build/ff/" + kHash + "-d", 2, 3},
      {".cache/go-build/ff/" + kHash + "-a", 0.1, 4},
      {".cache/go-build/trim.txt", 400, kNever},
      {".cache/go-build/README", 400, kNever},
      {"go/bin/tool", 400, kNever}}},
    {"fontconfig",
     {{".cache/fontconfig/" + kHash + "-le64.cache-7", 100, 1},
      {".cache/fontconfig/" + kHash + "-le64.cache-8", 40, 2},
      {".cache/fontconfig/" + kHash + "-le64.cache-9", 10, 4},
      {".cache/fontconfig/CACHEDIR.TAG", 400, kNever},
      {".config/fontconfig/fonts.conf", 400, kNever}}},
    {"crash-reports",
     {{".mozilla/firefox/Crash Reports/pending/a.dmp", 40, 1},
      {".mozilla/firefox/Crash Reports/submitted/bp-a.txt", 20, 2},
      {".config/mozilla/firefox/Crash Reports/pending/b.dmp", 10, 3},
      {".config/mozilla/firefox/Crash Reports/submitted/bp-b.txt", 4, 4},
      {".config/mozilla/firefox/Crash Reports/submit.log", 400, kNever},
      {".cache/drkonqi/crash/a", 4, 4},
      {".mozilla/firefox/Crash Reports/InstallTime2024", 400, kNever}}},
    {"user-caches",
     {{".cache/some-program/a", 200, 1},
      {".cache/some-program/deep/er/b", 190, 1},
      {".cache/another/a", 200, 3},
      {".cache/another/b", 40, 3},
      {".cache/daily/a", 400, kNever},
      {".cache/daily/b", 1, kNever},
      {".cache/marked/.spacekeep-keep", 400, kNever},
      {".cache/marked/a", 400, kNever},
      {".cache/pip/http-v2/a", 400, kNever},
      {".cache/mozilla/firefox/x/cache2/index", 400, kNever},
      {".cache/single-file", 400, kNever},
      {".local/share/some-program/a", 400, kNever}}}};

class ShippedUserRule : public testing::TestWithParam<Layout> {
 protected:
  ShippedUserRule() {
    std::filesystem::create_directory(home_);
    folders_ = homeAt(home_);
    for (Rule& rule : shipped("user", &folders_)) {
      if (rule.name == GetParam().rule) cache_ = makeCache(std::move(rule), &folders_);
    }
    for (const Item& item : GetParam().items)
      writeFile(home_ + "/" + item.path, kItemBytes, item.days);
    for (const Item& item : GetParam().items) setAge(home_ + "/" + item.path, item.days);
  }
  [[nodiscard]] std::uint64_t bytesUpTo(int urgency) const {
    return kItemBytes * static_cast<std::uint64_t>(
                            std::ranges::count_if(GetParam().items, [urgency](const Item& item) {
                              return item.goes_at != kNever && item.goes_at <= urgency;
                            }));
  }
  [[nodiscard]] Request request(int urgency) const {
    return {.amount = 1 << 30, .urgency = urgency, .volume = volume_.path()};
  }
  void expectOnlyThoseUpTo(int urgency) const {
    for (const Item& item : GetParam().items) {
      const bool goes = item.goes_at != kNever && item.goes_at <= urgency;
      EXPECT_EQ(exists(home_ + "/" + item.path), !goes)
          << item.path << " after urgency " << urgency;
    }
  }
  Volume volume_{"tmpfs"};
  const std::string home_ = volume_ / "home";
  UserFolders folders_;
  std::unique_ptr<Cache> cache_;
};

TEST_P(ShippedUserRule, TakesAtEachUrgencyWhatItSaysAndNothingElse) {
  ASSERT_NE(cache_, nullptr);
  const Offer offer = cache_->offer(volume_.path(), CancelToken());
  EXPECT_EQ(offer.note, "");
  for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
    EXPECT_EQ(offer.bytes[static_cast<std::size_t>(urgency - 1)], bytesUpTo(urgency)) << urgency;
    const Went went = freeAsForetold(*cache_, request(urgency));
    EXPECT_EQ(went.result.bytes, bytesUpTo(urgency) - bytesUpTo(urgency - 1));
    EXPECT_THAT(went.result.problems, IsEmpty());
    expectOnlyThoseUpTo(urgency);
  }
}

TEST_P(ShippedUserRule, KeepsWhatIsInUseAtTheHighestUrgency) {
  ASSERT_NE(cache_, nullptr);
  const auto held = std::ranges::find_if(GetParam().items,
                                         [](const Item& item) { return item.goes_at != kNever; });
  const std::string path = home_ + "/" + held->path;
  const cachedir::Holder holder([&path] { return ::open(path.c_str(), O_RDONLY) >= 0; });
  static_cast<void>(freeAsForetold(*cache_, request(4)));
  EXPECT_TRUE(exists(path));
}

std::string nameOfRule(const testing::TestParamInfo<Layout>& info) {
  std::string name = info.param.rule;
  std::erase(name, '-');
  return name;
}
INSTANTIATE_TEST_SUITE_P(RecordedLayout, ShippedUserRule, testing::ValuesIn(kLayouts), nameOfRule);

class ShippedRules : public testing::Test {
 protected:
  const UserFolders folders_ = homeAt(temporaryDirectory());
};

TEST_F(ShippedRules, EachSaysWhatItIsWhatItTakesWhatIsLostAndWhoSaysSo) {
  for (const char* kind : {"system", "user"}) {
    const bool user = std::string(kind) == "user";
    for (const Rule& rule : shipped(kind, user ? &folders_ : nullptr)) {
      EXPECT_FALSE(rule.description.empty()) << rule.name;
      EXPECT_FALSE(rule.loses.empty()) << rule.name;
      EXPECT_FALSE(rule.source.empty()) << rule.name;
      EXPECT_FALSE(rule.takes[3].empty()) << rule.name;
      EXPECT_EQ(rule.service_id,
                "com.quorvel.spacekeep." + std::string(user ? "user." : "") + rule.name);
      EXPECT_TRUE(rule.purges) << rule.name;
    }
  }
}

TEST_F(ShippedRules, WhatIsOffIsOffAndTheRestIsOn) {
  std::vector<std::string> off;
  for (const Rule& rule : shipped("system", nullptr)) {
    if (!rule.enabled) off.push_back("system/" + rule.name);
  }
  for (const Rule& rule : shipped("user", &folders_)) {
    if (!rule.enabled) off.push_back("user/" + rule.name);
  }
  EXPECT_THAT(off, UnorderedElementsAreArray({"system/docker-images", "system/flatpak-runtimes",
                                              "system/podman-images", "user/flatpak-runtimes",
                                              "user/podman-images", "user/trash"}));
}

TEST_F(ShippedRules, EachIsDescribedWithItsDefault) {
  std::ifstream stream(SPACEKEEP_SOURCE_DIR "/docs/caches.md");
  const std::string text{std::istreambuf_iterator<char>(stream), {}};
  for (const char* kind : {"system", "user"}) {
    const bool user = std::string(kind) == "user";
    for (const Rule& rule : shipped(kind, user ? &folders_ : nullptr)) {
      const std::string row = "| `" + std::string(kind) + "/" + rule.name + "` | " +
                              (rule.enabled ? "on" : "off") + " |";
      EXPECT_NE(text.find(row), std::string::npos) << row;
    }
  }
}

/// The names directly below the user's cache directory that a rule looks into.
void collectNames(const cachedir::Rules& rules, const std::string& cache,
                  std::vector<std::string>& names) {
  for (const auto& directory : rules.directories) {
    if (!directory.path.starts_with(cache + "/")) continue;
    const std::string rest = directory.path.substr(cache.size() + 1);
    names.push_back(rest.substr(0, rest.find('/')));
  }
}

TEST_F(ShippedRules, TheRuleForAllOtherCachesLeavesWhatAnotherRuleNames) {
  std::vector<std::string> named;
  std::vector<std::string> kept;
  for (const Rule& rule : shipped("user", &folders_)) {
    if (rule.name == "user-caches") {
      kept = std::get<DirectoryCaches>(rule.cache).whole.directories.front().keep;
    } else if (const auto* directories = std::get_if<DirectoryCaches>(&rule.cache)) {
      collectNames(directories->files, folders_.cache, named);
      collectNames(directories->whole, folders_.cache, named);
    } else {
      collectNames(std::get<ToolCache>(rule.cache).measured, folders_.cache, named);
    }
  }
  EXPECT_GE(named.size(), 10U);
  for (const std::string& name : named) EXPECT_THAT(kept, Contains(name));
}

TEST_F(ShippedRules, TheSystemsDirectoriesGiveByAgeWhatIsDescribed) {
  // Each of these rules with its directories below a volume of the test's own.
  const Volume volume("tmpfs");
  const std::map<std::string, std::vector<Item>> layouts = {
      {"apt",
       {{"/var/cache/apt/archives/a_1_amd64.deb", 40, 1},
        {"/var/cache/apt/archives/b_1_amd64.deb", 10, 2},
        {"/var/cache/apt/archives/c_1_amd64.deb", 2, 3},
        {"/var/cache/apt/archives/d_1_amd64.deb", 0.1, 4},
        {"/var/cache/apt/archives/lock", 400, kNever},
        {"/var/cache/apt/archives/partial/e_1_amd64.deb", 400, kNever},
        {"/var/lib/apt/lists/x_InRelease", 400, kNever}}},
      {"coredumps",
       {{"/var/lib/systemd/coredump/core.a.0.zst", 20, 1},
        {"/var/lib/systemd/coredump/core.b.0.zst", 4, 3},
        {"/var/lib/systemd/coredump/core.c.0.zst", 0.5, kNever}}},
      {"crash-reports",
       {{"/var/crash/_usr_bin_x.0.crash", 40, 1},
        {"/var/crash/202401010000/dump.202401010000", 20, 2},
        {"/var/crash/_usr_bin_y.0.crash", 4, 4},
        {"/var/crash/kdump_lock", 400, kNever},
        {"/var/crash/kexec_cmd", 400, kNever}}},
      {"snap-downloads",
       {{"/var/lib/snapd/cache/" + kHash, 40, 1}, {"/var/lib/snapd/snaps/x_1.snap", 400, kNever}}}};
  int tried = 0;
  for (Rule& rule : shipped("system", nullptr)) {
    const auto layout = layouts.find(rule.name);
    if (layout == layouts.end()) continue;
    ++tried;
    for (auto& each : std::get<DirectoryCaches>(rule.cache).files.directories) {
      each.path = volume.path() + each.path;
    }
    rule.locks.clear();
    rule.not_while.clear();
    for (const Item& item : layout->second) {
      writeFile(volume.path() + item.path, kItemBytes, item.days);
    }
    const auto cache = makeCache(std::move(rule), nullptr);
    for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
      static_cast<void>(
          freeAsForetold(*cache, {.amount = 1 << 30, .urgency = urgency, .volume = volume.path()}));
      for (const Item& item : layout->second) {
        const bool goes = item.goes_at != kNever && item.goes_at <= urgency;
        EXPECT_EQ(exists(volume.path() + item.path), !goes) << item.path << " at " << urgency;
      }
    }
  }
  EXPECT_EQ(tried, 4);
}

}  // namespace
}  // namespace spacekeep::command
