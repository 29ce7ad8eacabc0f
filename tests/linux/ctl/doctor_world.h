// Thread safety: one test at a time.
//
// A root directory in which all is well, until a test plants something.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "ctl/doctor/groups.h"
#include "support/events/launch_file.h"
#include "support/events/linux/event_files.h"
#include "support/events/linux/linux_activity_host.h"
#include "support/ipc/linux/sockets.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl::doctor {

inline std::string plist(const std::string& content) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + content +
         "</plist>\n";
}
inline std::string dict(const std::string& content) {
  return plist("<dict>" + content + "</dict>");
}
inline std::string entry(const std::string& key, const std::string& value) {
  return "<key>" + key + "</key>" + value;
}
inline std::string text(const std::string& value) { return "<string>" + value + "</string>"; }

/// Severity, name and subject of each finding that is not good news.
inline std::vector<std::string> badNews(const Group& group) {
  std::vector<std::string> list;
  for (const auto& finding : group.findings) {
    switch (finding.severity) {
      case Severity::kOk:
        break;
      case Severity::kAdvice:
        list.push_back("advice " + finding.check);
        break;
      case Severity::kProblem:
        list.push_back("problem " + finding.check);
        break;
      case Severity::kUnseen:
        list.push_back("unseen " + finding.check);
        break;
    }
  }
  return list;
}

inline std::string allTexts(const Group& group) {
  std::string all;
  for (const auto& finding : group.findings) all += finding.text + ". " + finding.advice + "\n";
  return all;
}

class DoctorTest : public ToolTest {
 protected:
  DoctorTest() {
    for (const char* directory :
         {"run/spacekeep/services", "var/lib/spacekeep", "usr/lib/spacekeep/entitlements.d",
          "usr/lib/spacekeep/launch.d", "etc/spacekeep/entitlements.d", "etc/spacekeep/launch.d",
          "System/Library/Spacekeep", "QuorvelInternal/Library/Spacekeep", "proc/self"}) {
      std::filesystem::create_directories(path(directory));
    }
    tighten(root());
    chmod(path("var/lib/spacekeep").c_str(), 0700);
    const std::string source = SPACEKEEP_SOURCE_DIR "/packaging/";
    for (const char* file :
         {"10-root.plist", "20-spacekeep.plist", "30-spacekeep-services.plist"}) {
      write("usr/lib/spacekeep/entitlements.d/" + std::string(file),
            contentOf(source + "entitlements.d/" + file));
    }
    write("usr/lib/spacekeep/launch.d/com.quorvel.Spacekeep.daily.plist",
          contentOf(source + "launch.d/com.quorvel.Spacekeep.daily.plist"));
    write("var/lib/spacekeep/reserve", "");
    ran(0);
    write("proc/self/mountinfo", contentOf("/proc/self/mountinfo"));
  }
  ~DoctorTest() override {
    daemon_.stop();
    std::filesystem::remove_all(root());
  }

  [[nodiscard]] std::string root() const { return directory_.path() + "/root"; }
  [[nodiscard]] std::string path(const std::string& inside) const { return root() + "/" + inside; }
  void write(const std::string& inside, const std::string& content) const {
    std::ofstream(path(inside)) << content;
    chmod(path(inside).c_str(), 0644);
  }
  void descriptor(const std::string& name, const std::string& content) const {
    write("System/Library/Spacekeep/" + name, dict(content));
  }
  /// Only the owner may write, whatever the umask of whoever runs the tests says.
  static void tighten(const std::string& directory) {
    for (const auto& each : std::filesystem::recursive_directory_iterator(directory)) {
      chmod(each.path().c_str(), 0755);
    }
  }
  /// The last daily pass was due so long ago.
  void ran(std::uint64_t seconds_ago) const {
    const Clocks now = readSystemClocks();
    const RunRecord record{.wall_ns = now.wall_ns,
                           .boot_ns = now.boot_ns,
                           .boot_id = now.boot_id,
                           .elapsed_ns = seconds_ago * 1'000'000'000};
    EXPECT_EQ(saveRunRecord(path("var/lib/spacekeep/com.quorvel.Spacekeep.daily.run"), record),
              std::nullopt);
  }

  [[nodiscard]] Place place() const { return placeAt(root(), directory_.daemonSocket()); }
  /// As if the daemon had answered that.
  [[nodiscard]] Contact contact(Contact::Outcome outcome, Dictionary state = {}) const {
    return {.outcome = outcome,
            .common = {.socket_path = directory_.daemonSocket()},
            .state = std::move(state)};
  }
  [[nodiscard]] Contact noDaemon() const { return contact(Contact::Outcome::kNone); }

  /// Answers reads of the settings, and every itemized query with `ids`.
  void startDaemon(const std::vector<std::string>& ids = {}) {
    daemon_.on("clientGetState", [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply({ipc::OptionalValue(Value(Dictionary{}))});
    });
    daemon_.on("clientItemizedPurgeableSpace",
               [ids](const ipc::Arguments&, const ipc::Responder& responder) {
                 Dictionary answer{{"SPACEKEEP_TOTAL_AVAILABLE", 0}};
                 for (const auto& id : ids) answer.set(id, 0);
                 responder.reply(sdk::outcome(answer));
               });
    daemon_.start();
  }
  /// A service's socket at which somebody listens as long as the test lives.
  void listenFor(const std::string& id) {
    std::string why;
    listening_.push_back(
        ipc::bindListeningSocket(path("run/spacekeep/services/" + id + ".sock"), 0600, why));
    EXPECT_NE(listening_.back(), nullptr) << why;
  }

  std::vector<ipc::SharedDescriptor> listening_;
};

}  // namespace spacekeep::ctl::doctor
