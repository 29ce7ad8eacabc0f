// Each file that is installed is in exactly one package, and each package asks for files that are there.
#include <fnmatch.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <map>

#include "tests/linux/packaging/packaging_world.h"

namespace spacekeep::packaging {
namespace {

/// Where Debian puts things that other builds put elsewhere.
std::string asHere(std::string pattern) {
  const auto replace = [&pattern](const std::string& front, const std::string& with) {
    if (pattern.starts_with(front)) pattern = with + pattern.substr(front.size());
  };
  replace("lib/systemd", "usr/lib/systemd");
  replace("usr/lib/*/", "usr/lib/");
  return pattern;
}

bool covers(const std::string& pattern, const std::string& file) {
  return fnmatch(pattern.c_str(), file.c_str(), FNM_PATHNAME) == 0 ||
         fnmatch((pattern + "/*").c_str(), file.c_str(), FNM_PATHNAME | FNM_LEADING_DIR) == 0;
}

/// Package to the patterns of what it holds.
std::map<std::string, std::vector<std::string>> packages() {
  std::map<std::string, std::vector<std::string>> found;
  for (const fs::path& file : filesBelow(kSource / "debian", ".install")) {
    for (const std::string& line : linesOf(file)) {
      found[file.stem().string()].push_back(asHere(line));
    }
  }
  return found;
}

class InstalledFiles : public testing::Test {
 protected:
  void SetUp() override {
    const Finished install = run("DESTDIR=" + workshop_.path().string() + " cmake --install " +
                                 kBuild.string() + " --prefix /usr");
    ASSERT_EQ(install.exit_code, 0) << install.out;
    for (const fs::path& file : filesBelow(workshop_.path())) {
      files_.insert(file.lexically_relative(workshop_.path()).string());
    }
    ASSERT_FALSE(files_.empty());
  }

  Workshop workshop_;
  std::set<std::string> files_;
};

TEST_F(InstalledFiles, EachIsInExactlyOnePackage) {
  for (const std::string& file : files_) {
    std::set<std::string> owners;
    for (const auto& [package, patterns] : packages()) {
      for (const std::string& pattern : patterns) {
        if (covers(pattern, file)) owners.insert(package);
      }
    }
    EXPECT_EQ(owners.size(), 1U) << file << " is in " << testing::PrintToString(owners);
  }
}

TEST_F(InstalledFiles, EachPatternOfAPackageFindsSomething) {
  ASSERT_EQ(packages().size(), 4U);
  for (const auto& [package, patterns] : packages()) {
    for (const std::string& pattern : patterns) {
      const bool used = std::ranges::any_of(
          files_, [&pattern](const std::string& file) { return covers(pattern, file); });
      EXPECT_TRUE(used) << package << ": " << pattern;
    }
  }
}

TEST_F(InstalledFiles, NothingIsInstalledIntoEtc) {
  for (const std::string& file : files_) EXPECT_FALSE(file.starts_with("etc/")) << file;
}

// What is linked with a library that has a sanitizer in it has to bring that along.
#if defined(__SANITIZE_ADDRESS__)
constexpr const char* kSanitizers = "-fsanitize=address,undefined";
#elif defined(__SANITIZE_THREAD__)
constexpr const char* kSanitizers = "-fsanitize=thread";
#else
constexpr const char* kSanitizers = "";
#endif

TEST_F(InstalledFiles, AClientAndAServiceAreBuiltFromThemByCMakeAndByPkgConfig) {
  const std::string root = workshop_.path().string();
  const std::string examples = (kSource / "sdk/examples").string();
  const Finished by_pkg_config =
      run("cd " + root + " && export PKG_CONFIG_PATH=" + root + "/usr/lib/pkgconfig && c++ " +
          kSanitizers + " " + examples +
          "/make_room.cc -o by-pkg-config $(pkg-config --define-variable=prefix=" + root +
          "/usr --define-variable=includedir=" + root +
          "/usr/include --define-variable=libdir=" + root + "/usr/lib --cflags --libs spacekeep)");
  EXPECT_EQ(by_pkg_config.exit_code, 0) << by_pkg_config.out;
  const Finished tried = run(root + "/by-pkg-config; test $? = 1");
  EXPECT_EQ(tried.exit_code, 0) << tried.out;  // it has no volume /data, or no daemon, and says so

  fs::create_directory(workshop_.path() / "project");
  std::ofstream(workshop_.path() / "project/CMakeLists.txt")
      << "cmake_minimum_required(VERSION 3.25)\nproject(outside CXX)\n"
      << "find_package(spacekeep 0.1 REQUIRED)\nadd_executable(service " << examples
      << "/thumbnail_cache.cc)\ntarget_link_libraries(service PRIVATE spacekeep::spacekeep)\n";
  const Finished by_cmake =
      run("cd " + root + "/project && export CXXFLAGS=" + kSanitizers +
          " && cmake -B build -DCMAKE_PREFIX_PATH=" + root + "/usr . && cmake --build build");
  EXPECT_EQ(by_cmake.exit_code, 0) << by_cmake.out;
  EXPECT_TRUE(fs::exists(workshop_.path() / "project/build/service"));
}

}  // namespace
}  // namespace spacekeep::packaging
