// Thread safety: one test at a time.
//
// The check of a service as a process, on a volume of its own in a mount namespace of its own. Needs
// root.
#pragma once

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {

/// A service that was built with AddressSanitizer would keep what it has given back for a while,
/// which is not the growth that is looked for.
inline constexpr const char* kNoQuarantine =
    "quarantine_size_mb=0:thread_local_quarantine_size_kb=0";

class CheckServiceTest : public ToolTest {
 protected:
  CheckServiceTest() { ::setenv("ASAN_OPTIONS", kNoQuarantine, 1); }
  ~CheckServiceTest() override {
    std::remove(scriptFile().c_str());
    std::remove((directory_.path() + "/rules.plist").c_str());
    std::remove(volume().c_str());
  }

  [[nodiscard]] std::string volume() const { return directory_.path() + "/volume"; }
  [[nodiscard]] std::string cache() const { return volume() + "/cache"; }
  [[nodiscard]] std::string scriptFile() const { return directory_.path() + "/script"; }
  static std::string program(const std::string& name) {
    return std::string(SPACEKEEP_BUILD_DIR) + "/" + name;
  }
  /// How a service is checked on the volume, up to the service itself.
  [[nodiscard]] std::string checking(const std::string& options) const {
    return toolPath() + " check-service --volume " + volume() + " " + options + " ";
  }
  [[nodiscard]] std::string badService(const std::string& fault) const {
    return "-- " + program("tests/bad-service") + " " + fault + " " + volume() + " " + cache();
  }

  /// Runs `lines` with a fresh tmpfs at volume() that holds `files` cached files of 20 KiB.
  Finished onVolume(int files, const std::string& lines) {
    std::ofstream(scriptFile()) << "set -e\n"
                                << "mkdir -p " << volume() << "\n"
                                << "mount -t tmpfs -o size=200M cache " << volume() << "\n"
                                << "mkdir " << cache() << "\n"
                                << fill(cache(), files) << lines << "\n";
    // With processes of its own too: a service that looks through /proc for files in use would
    // otherwise go through those of the whole machine at each request.
    return runShell(
        "unshare --mount --propagation private --pid --fork --mount-proc bash " + scriptFile(),
        errFile());
  }
  static std::string fill(const std::string& folder, int files) {
    return "head -c " + std::to_string(files * 20480) + " /dev/zero | split -b 20480 -a 4 -d - " +
           folder + "/item-\n";
  }

  /// The names of the checks of which that was said: "ok", "FAILED", "not applicable".
  static std::vector<std::string> checksThatWere(const std::string& word, const std::string& out) {
    const std::regex line("(\\S+) +" + word + "\\b.*");
    std::vector<std::string> names;
    std::istringstream lines(out);
    std::smatch match;
    for (std::string text; std::getline(lines, text);) {
      if (std::regex_match(text, match, line)) names.push_back(match[1]);
    }
    return names;
  }
};

}  // namespace spacekeep::ctl
