// A service: gives up thumbnails; those of the last week at urgency 4 only.
#include <spacekeep/service.h>

#include <filesystem>

namespace fs = std::filesystem;
using namespace spacekeep::sdk;

struct Thumbnails : Service {
  Answer purgeable(const Job& job) override { return walk(job, UINT64_MAX, false); }
  Answer purge(const Job& job) override { return walk(job, job.amount, true); }
  static Answer walk(const Job& job, std::uint64_t limit, bool removes) {
    Answer answer;
    std::error_code error;
    const auto latest = std::chrono::file_clock::now() - std::chrono::days(job.urgency < 4 ? 7 : 0);
    const fs::path folder = job.volume == "/data" ? "/data/thumbnails" : "";
    for (const auto& file : fs::directory_iterator(folder, error)) {
      if (answer.amount >= limit || job.cancellation.cancelled()) break;
      const auto size = file.file_size(error);
      if (error || file.last_write_time(error) > latest || error) continue;
      if (!removes || fs::remove(file, error)) answer.amount += size;
    }
    return answer;
  }
};

int main() {
  auto host = ServiceHost::checkIn("org.example.thumbnails", std::make_shared<Thumbnails>());
  return host ? (host->waitUntilStopped(), 0) : 1;
}
