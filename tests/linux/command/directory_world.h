// Thread safety: one test at a time.
//
// Directories that a rule gives up by file or as a whole, on a volume of their own.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "services/command/engine/directory_cache.h"
#include "services/command/engine/left_overs.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {

/// The content of a rule for the directories at `path`.
inline std::string directory(const std::string& path, const std::string& more = "") {
  return "<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" + path + "</string>" + more +
         "</dict></array>";
}

class DirectoryCacheTest : public testing::Test {
 protected:
  [[nodiscard]] Request request(int urgency, std::uint64_t amount = 100 * kMiB) const {
    return {.amount = amount, .urgency = urgency, .volume = volume_.path()};
  }
  [[nodiscard]] std::array<std::uint64_t, 4> offered(const Cache& cache) const {
    return cache.offer(volume_.path(), CancelToken()).bytes;
  }
  Volume volume_{"ext4"};
};

class WholeDirectories : public DirectoryCacheTest {
 protected:
  void SetUp() override {
    writeFile(volume_ / "all/oldest/deep/f", kMiB, 300);
    writeFile(volume_ / "all/oldest/g", kMiB, 250);
    writeFile(volume_ / "all/older/f", kMiB, 220);
    writeFile(volume_ / "all/mixed/old", kMiB, 300);
    writeFile(volume_ / "all/mixed/young", kMiB, 2);
    volume_.settle();
  }
  [[nodiscard]] std::unique_ptr<Cache> cache(const std::string& more = "") const {
    return makeCache(
        ruleFrom(directory(volume_ / "all/*", "<key>WHOLE_DIRECTORIES</key><true/>" + more)),
        nullptr);
  }
  /// Frees at `urgency`, and has `happen` run once the first directory has gone; all that went.
  [[nodiscard]] std::vector<std::string> goneWhile(int urgency,
                                                   const std::function<void()>& happen) const {
    std::vector<std::string> gone;
    const auto visit = [&](const std::string& what, std::optional<std::uint64_t>) {
      gone.push_back(what);
      if (gone.size() == 1) happen();
    };
    static_cast<void>(cache()->free(request(urgency), CancelToken(), visit));
    return gone;
  }
  /// What an earlier request left of the directory of that name.
  [[nodiscard]] std::string leftOf(const std::string& name,
                                   const char* prefix = kGoingPrefix) const {
    return volume_ / ("all/" + std::string(prefix) + name);
  }
};

}  // namespace spacekeep::command
