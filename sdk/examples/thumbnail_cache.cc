// A service: owns a directory of thumbnails, of which any can be made again.
#include <spacekeep/service.h>

#include <csignal>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <system_error>
#include <utility>

namespace fs = std::filesystem;
using spacekeep::sdk::Answer;
using spacekeep::sdk::HostStatus;
using spacekeep::sdk::Job;
using spacekeep::sdk::ServiceHost;

class ThumbnailCache : public spacekeep::sdk::Service {
 public:
  explicit ThumbnailCache(fs::path directory) : directory_(std::move(directory)) {}

  Answer purgeable(const Job& job) override {
    Answer answer;
    if (job.volume != "/data") return answer;  // the thumbnails are nowhere else
    std::error_code error;
    for (const auto& entry : fs::directory_iterator(directory_, error)) {
      answer.amount += sizeOf(entry);
    }
    return answer;
  }

  Answer purge(const Job& job) override {
    Answer answer;
    if (job.volume != "/data") return answer;
    std::error_code error;
    for (const auto& entry : fs::directory_iterator(directory_, error)) {
      if (answer.amount >= job.amount || job.cancellation.cancelled()) break;
      const auto size = sizeOf(entry);
      if (fs::remove(entry.path(), error)) answer.amount += size;
    }
    return answer;
  }

 private:
  static std::uint64_t sizeOf(const fs::directory_entry& entry) {
    std::error_code error;
    const auto size = entry.is_regular_file(error) ? entry.file_size(error) : 0;
    return error ? 0 : size;
  }

  const fs::path directory_;
};

int main() {
  // Before any thread starts, so that every thread leaves these signals to sigwait().
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  sigprocmask(SIG_BLOCK, &signals, nullptr);

  spacekeep::sdk::CheckInOptions options;
  options.on_status = [](const HostStatus& status) {
    std::fprintf(stderr, "%s %s\n", textOf(status.state), status.text.c_str());
  };
  auto host = ServiceHost::checkIn("org.example.thumbnails",
                                   std::make_shared<ThumbnailCache>("/data/thumbnails"), options);
  if (!host) return std::fprintf(stderr, "%s\n", host.error().text.c_str()), 1;

  int signal = 0;
  sigwait(&signals, &signal);
  host->stop();
  host->waitUntilStopped();
  return 0;
}
