// Many services in one process, each with its own connection, until it is ended.
// Usage: soak-services checked-in|crashing|declared PREFIX COUNT FILES_PER_SECOND VOLUME...
//
// Of ten services seven are honest, two are slow and one is silent now and then; they take the
// volumes in turn. A crashing process ends in the middle of a purge now and then. Declared ones listen
// where the daemon looks for them.
#include <fmt/format.h>
#include <spacekeep/service.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "soak/cache.h"

namespace sdk = spacekeep::sdk;

namespace {

soak::Manners mannersOf(std::size_t number) {
  const std::size_t place = number % 10;
  if (place == 9) return soak::Manners::kSilent;
  return place >= 7 ? soak::Manners::kSlow : soak::Manners::kHonest;
}

int listenAt(const std::string& path) {
  ::unlink(path.c_str());
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path.c_str());
  if (::bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(fd, 64) != 0) {
    std::perror(path.c_str());
    std::exit(1);
  }
  return fd;
}

struct Options {
  std::string kind;
  std::string prefix;
  std::size_t count = 0;
  double files_per_second = 0;
  std::vector<std::string> volumes;
};

class Services {
 public:
  explicit Services(Options options) : options_(std::move(options)) {
    for (std::size_t i = 0; i < options_.count; ++i) {
      const std::string& volume = options_.volumes[i % options_.volumes.size()];
      caches_.push_back(std::make_shared<soak::Cache>(volume, volume + "/" + idOf(i), mannersOf(i),
                                                      options_.kind == "crashing"));
    }
  }

  bool start() {
    for (std::size_t i = 0; i < caches_.size(); ++i) {
      auto host = options_.kind == "declared" ? listen(i) : checkIn(i);
      if (!host) return false;
      hosts_.push_back(std::move(*host));
    }
    return true;
  }

  /// Until the process is ended.
  [[noreturn]] void growForEver() {
    auto next = std::chrono::steady_clock::now();
    const std::chrono::duration<double> pause(1 / options_.files_per_second);
    for (std::size_t i = 0;; ++i) {
      caches_[i % caches_.size()]->grow();
      // A process that ended before the daemon had its pong would hold up the registry for good.
      soak::Cache::allowCrashes(serving_ == caches_.size());
      next += std::chrono::duration_cast<std::chrono::steady_clock::duration>(pause);
      std::this_thread::sleep_until(next);
    }
  }

 private:
  [[nodiscard]] std::string idOf(std::size_t number) const {
    return fmt::format("{}-{}", options_.prefix, number);
  }

  sdk::Result<sdk::ServiceHost> checkIn(std::size_t number) {
    sdk::CheckInOptions options;
    options.on_status = [this, serves = false](const sdk::HostStatus& status) mutable {
      const bool served = std::exchange(serves, status.state == sdk::HostState::kServing);
      if (served && !serves) --serving_;
      if (served || !serves || ++serving_ != caches_.size()) return;
      fmt::print("all serving\n");
      std::fflush(stdout);
    };
    return sdk::ServiceHost::checkIn(idOf(number), caches_[number], options);
  }

  sdk::Result<sdk::ServiceHost> listen(std::size_t number) {
    sdk::SocketOptions options;
    options.listening_fd = listenAt("/run/spacekeep/services/" + idOf(number) + ".sock");
    return sdk::ServiceHost::serveSocket(caches_[number], options);
  }

  const Options options_;
  std::vector<std::shared_ptr<soak::Cache>> caches_;
  std::atomic<std::size_t> serving_{0};
  std::vector<sdk::ServiceHost> hosts_;
};

}  // namespace

int main(int count, char** arguments) {
  if (count < 6) return 2;
  Options options;
  options.kind = arguments[1];
  options.prefix = arguments[2];
  options.count = std::strtoul(arguments[3], nullptr, 10);
  options.files_per_second = std::strtod(arguments[4], nullptr);
  options.volumes.assign(arguments + 5, arguments + count);
  Services services(std::move(options));
  if (!services.start()) return 1;
  services.growForEver();
}
