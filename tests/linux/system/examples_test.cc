// The programs that the documentation shows, as they stand there, in front of the real daemon.
#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {
namespace {

using Command = std::vector<std::string>;

constexpr int kFiles = 30;
constexpr int kFileBytes = 1 << 20;
constexpr int kWantedBytes = 20'000'000;

/// The first block of code in that language.
std::string codeIn(const std::string& document, const std::string& language) {
  std::ostringstream text;
  text << std::ifstream(std::string(SPACEKEEP_SOURCE_DIR) + "/docs/" + document).rdbuf();
  const std::string fence = "```" + language + "\n";
  const std::size_t begin = text.str().find(fence);
  if (begin == std::string::npos) return "";
  const std::size_t from = begin + fence.size();
  return text.str().substr(from, text.str().find("```", from) - from);
}

enum class Language { kCpp, kPython };

class Examples : public testing::TestWithParam<std::tuple<Language, Language>> {
 protected:
  void SetUp() override {
    sandbox_.addVolume("data", "tmpfs", 64);
    sandbox_.start();
    const Output mounted = sandbox_.run(
        {"sh", "-c", "mkdir /data && mount --bind /volumes/data /data && mkdir /data/thumbnails"});
    ASSERT_EQ(mounted.status, 0) << mounted.text;
    for (int i = 0; i < kFiles; ++i) {
      std::ofstream(thumbnails() / std::to_string(i)) << std::string(kFileBytes, 'x');
    }
    const Output aged = sandbox_.run({"sh", "-c", "touch -d '60 days ago' /data/thumbnails/*"});
    ASSERT_EQ(aged.status, 0) << aged.text;
    daemon_ = sandbox_.startDaemon();
  }

  [[nodiscard]] std::filesystem::path thumbnails() const {
    return std::filesystem::path(sandbox_.volume("data")) / "thumbnails";
  }
  [[nodiscard]] int filesLeft() const {
    return static_cast<int>(std::distance(std::filesystem::directory_iterator(thumbnails()), {}));
  }
  /// The program of that language that `document` shows.
  [[nodiscard]] Command program(Language language, const std::string& document,
                                const std::string& name) const {
    if (language == Language::kCpp) return {"/programs/sdk/example_" + name};
    const std::string path = "/tmp/" + name + ".py";
    sandbox_.write(path, codeIn(document, "python"));
    return {"env", "PYTHONPATH=/source/sdk/python", "/usr/bin/python3", "-B", path};
  }

  /// Whether the service is registered, soon.
  [[nodiscard]] bool isKnown(const std::string& service_id) const {
    for (int i = 0; i < 300; ++i) {
      const Output answer =
          sandbox_.run({"/programs/ctl/spacekeepctl", "query", "/data", "--itemized"});
      if (answer.text.find(service_id) != std::string::npos) return true;
    }
    return false;
  }

  Sandbox sandbox_;
  Process daemon_;
};

TEST_P(Examples, AClientGetsRoomFromAService) {
  const auto [service_language, client_language] = GetParam();
  Process service =
      sandbox_.spawn(program(service_language, "write-a-service.md", "thumbnails"), "service.log");
  ASSERT_TRUE(isKnown("org.example.thumbnails")) << sandbox_.read("/tmp/service.log");
  const Output made = sandbox_.run(program(client_language, "write-a-client.md", "make_room"));
  EXPECT_EQ(made.status, 0) << made.text << sandbox_.read("/tmp/service.log");
  EXPECT_NE(made.text.find(" bytes were freed\n"), std::string::npos) << made.text;
  const int gone_bytes = (kFiles - filesLeft()) * kFileBytes;
  EXPECT_GE(gone_bytes, kWantedBytes);
  EXPECT_LT(gone_bytes, kWantedBytes + 2 * kFileBytes);
  service.signal(SIGTERM);
  const int status = service.wait();
  EXPECT_EQ(status, service_language == Language::kPython ? 0 : 128 + SIGTERM);
}

INSTANTIATE_TEST_SUITE_P(InCppAndPython, Examples,
                         testing::Combine(testing::Values(Language::kCpp, Language::kPython),
                                          testing::Values(Language::kCpp, Language::kPython)));

TEST(ExamplesWithoutADaemon, SayThatNobodyListens) {
  Sandbox sandbox;
  sandbox.start();
  sandbox.write("/tmp/make_room.py", codeIn("write-a-client.md", "python"));
  const Output python = sandbox.run(
      {"env", "PYTHONPATH=/source/sdk/python", "/usr/bin/python3", "-B", "/tmp/make_room.py"});
  EXPECT_EQ(python.status, 1);
  EXPECT_EQ(python.text.find("make_room: nobody listens at /run/spacekeep/spacekeep.sock"), 0U)
      << python.text;
  const Output cpp = sandbox.run({"/programs/sdk/example_make_room"});
  EXPECT_EQ(cpp.status, 1);
  EXPECT_NE(cpp.text.find("/run/spacekeep/spacekeep.sock"), std::string::npos) << cpp.text;
}

}  // namespace
}  // namespace spacekeep::system_test
