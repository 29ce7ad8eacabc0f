#include "soak/world.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <regex>
#include <set>
#include <stdexcept>

namespace soak {
namespace {

namespace fs = std::filesystem;

constexpr uid_t kServiceUsers = 3101;  // and the following
constexpr uid_t kCrashingUser = 3201;
constexpr uid_t kClientUser = 3301;
constexpr uid_t kProbeUser = 3401;
constexpr uid_t kHostileUser = 3501;
constexpr int kProcessesOfServices = 4;
constexpr int kServicesEach = 40;
constexpr int kCrashingProcesses = 4;
constexpr int kCrashingServicesEach = 5;
constexpr int kDeclared = 20;
constexpr double kRestartSeconds = 2;
// The purges and queries of ten clients go one by one, and a silent service holds up each for as
// long as it may wait: some ten seconds.
constexpr double kPatienceSeconds = 240;
constexpr const char* kFilesPerSecond = "60";  // of each big process: 16 KiB a file

std::vector<std::string> volumes() { return {"/volumes/a", "/volumes/b"}; }

std::vector<std::string> with(std::vector<std::string> command,
                              const std::vector<std::string>& more) {
  command.insert(command.end(), more.begin(), more.end());
  return command;
}

void waitFor(const std::string& what, const std::function<bool()>& condition) {
  for (int i = 0; i < 600; ++i) {
    if (condition()) return;
    sleepSeconds(0.1);
  }
  throw std::runtime_error("gave up waiting for " + what);
}

void writeText(const std::string& path, const std::string& text) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path) << text;
}

std::string rule(const std::string& users, const std::string& more) {
  return "<plist version=\"1.0\"><dict><key>MATCH_USER</key><array>" + users +
         "</array><key>GRANT</key><array><string>CLIENT_ENTITLEMENT</string>"
         "<string>PURGEABLE_ENTITLEMENT</string>" +
         more + "</array></dict></plist>";
}

std::string user(uid_t uid) { return fmt::format("<integer>{}</integer>", uid); }

void declare(const std::string& id) {
  writeText("/System/Library/Spacekeep/" + id + ".plist",
            "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key><string>" + id +
                "</string></dict></plist>");
}

}  // namespace

void World::writeRules() {
  const std::string rules = "/etc/spacekeep/entitlements.d/";
  std::string services = user(kCrashingUser);
  for (int i = 0; i < kProcessesOfServices; ++i) {
    services += user(kServiceUsers + static_cast<uid_t>(i));
  }
  writeText(rules + "soak-services.plist", rule(services, "<string>SERVICE_ENTITLEMENT</string>"));
  writeText(rules + "soak-clients.plist",
            rule(user(kClientUser), "<string>PURGE_ENTITLEMENT</string>"));
  writeText(rules + "soak-others.plist", rule(user(kProbeUser) + user(kHostileUser), ""));
}

void World::startPeers() {
  writeRules();
  for (const std::string& volume : volumes()) ::chmod(volume.c_str(), 01777);
  fs::create_directories("/volumes/state/spacekeep");
  fs::create_directory_symlink("/volumes/state/spacekeep", "/var/lib/spacekeep");
  for (int i = 0; i < kDeclared; ++i) declare(fmt::format("declared-{}", i));
  daemon_ = Process({"/programs/daemon/spacekeepd"}, "/tmp/daemon.log");
  quiet_peer_ = Process({"/programs/bench/bench-bare-peer", kQuietPeer}, "/tmp/peers.log");
  flooded_peer_ = Process({"/programs/bench/bench-bare-peer", kFloodedPeer}, "/tmp/peers.log");
  // Low space comes again and again; a purge for it must not hold the queue once it has its bytes.
  std::ofstream(kClientsProgress).close();
  ::chmod(kClientsProgress, 0666);
  waitFor("the daemon", [] {
    return Process({"/programs/ctl/spacekeepctl", "state", "set", "SPACEKEEP_FINISH_EARLY", "true"},
                   "/tmp/setup.log")
               .wait(kPatienceSeconds) == 0;
  });
  waitFor("the bare peers", [] { return fs::exists(kQuietPeer) && fs::exists(kFloodedPeer); });
  probe_ =
      Process(with({"/programs/soak/soak-probe", "5", kProbeLog}, {kProbed.begin(), kProbed.end()}),
              "/tmp/probe.log", kProbeUser);
}

void World::startServices() {
  for (int i = 0; i < kProcessesOfServices; ++i) {
    services_.emplace_back(
        with({"/programs/soak/soak-services", "checked-in", fmt::format("batch{}", i),
              std::to_string(kServicesEach), kFilesPerSecond},
             volumes()),
        fmt::format("/tmp/services-{}.log", i), kServiceUsers + static_cast<uid_t>(i));
  }
  services_.emplace_back(with({"/programs/soak/soak-services", "declared", "declared",
                               std::to_string(kDeclared), kFilesPerSecond},
                              volumes()),
                         "/tmp/services-declared.log");
  for (int i = 0; i < kCrashingProcesses; ++i) {
    crashing_.push_back({fmt::format("crashing{}", i), {}, 0});
    startCrashing(crashing_.back());
  }
  waitFor("the services to check in", [] {
    for (int i = 0; i < kProcessesOfServices; ++i) {
      const std::string log = readFile(fmt::format("/tmp/services-{}.log", i));
      if (log.find("all serving") == std::string::npos) return false;
    }
    return true;
  });
}

void World::startCrashing(Crashing& crashing) const {
  crashing.process = Process(with({"/programs/soak/soak-services", "crashing", crashing.prefix,
                                   std::to_string(kCrashingServicesEach), "10"},
                                  volumes()),
                             "/tmp/services-crashing.log", kCrashingUser);
}

void World::startClients(double seconds) {
  clients_ = Process(with({"/programs/soak/soak-clients", "client", "50", "2",
                           std::to_string(static_cast<long>(seconds)), kClientsProgress},
                          volumes()),
                     "/tmp/clients.log", kClientUser);
}

void World::startFlood(const std::string& socket, const std::string& kind, double seconds) {
  flood_ = Process(
      {"/programs/soak/soak-hostile", socket, std::to_string(static_cast<long>(seconds)), kind},
      "/tmp/hostile.log", kHostileUser);
}

void World::lookAfter() {
  mustRun(daemon_, "the daemon");
  mustRun(quiet_peer_, "a bare peer");
  mustRun(flooded_peer_, "a bare peer");
  mustRun(probe_, "the probe");
  for (Process& process : services_) mustRun(process, "a process of services");
  for (Crashing& crashing : crashing_) lookAfterCrashing(crashing);
}

void World::lookAfterCrashing(Crashing& crashing) {
  if (!crashing.process.ended()) return;
  if (crashing.restart_at_seconds == 0) {
    ++crashes_;
    crashing.restart_at_seconds = monotonicSeconds() + kRestartSeconds;
  } else if (monotonicSeconds() >= crashing.restart_at_seconds) {
    crashing.restart_at_seconds = 0;
    startCrashing(crashing);
  }
}

void World::mustRun(Process& process, const std::string& name) {
  if (const auto status = process.ended()) {
    problems_.push_back(fmt::format("{} ended with status {}", name, *status));
    process = Process();
  }
}

void World::waitForClients() {
  const auto status = clients_.wait(kPatienceSeconds);
  if (!status) {
    addProblem(fmt::format("the clients still waited for answers after {} s", kPatienceSeconds));
  } else if (*status != 0) {
    addProblem(fmt::format("the clients ended with status {}", *status));
  }
}

long World::answersOfClients() {
  return std::strtol(readFile(kClientsProgress).c_str(), nullptr, 10);
}

std::optional<std::size_t> World::servicesInQueries() {
  std::set<std::string> services;
  const std::regex id("\"((?:batch|crashing|declared)[0-9]*-[0-9]+)\"");
  for (const std::string& volume : volumes()) {
    std::remove("/tmp/query.log");
    Process query({"/programs/ctl/spacekeepctl", "query", volume, "--itemized", "--json"},
                  "/tmp/query.log");
    if (query.wait(kPatienceSeconds) != 0) return std::nullopt;
    const std::string answer = readFile("/tmp/query.log");
    for (std::sregex_iterator found(answer.begin(), answer.end(), id), end; found != end; ++found) {
      services.insert((*found)[1]);
    }
  }
  return services.size();
}

}  // namespace soak
