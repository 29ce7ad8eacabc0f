#include "tests/linux/system/kills_under_load_world.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <stdexcept>
#include <utility>

#include "support/runtime/runtime.h"
#include "tests/linux/system/state_client.h"

namespace spacekeep::system_test {
namespace {

constexpr std::uint64_t kMs = 1'000'000;
constexpr std::uint64_t kPatienceMs = 60'000;
constexpr std::chrono::milliseconds kPatience(kPatienceMs);
constexpr const char* kVolume = "/volumes/tmp";
constexpr int kCheckedIn = 3;
constexpr int kWriters = 2;
/// More than purges under load take while a whole round of checking lasts.
constexpr std::uint64_t kFilesEach = 100;

int listenAt(const std::string& path) {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path.c_str());
  if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      listen(fd, 64) != 0) {
    throw std::runtime_error("cannot listen at " + path);
  }
  return fd;
}

sdk::PurgeRequest purgeOf(std::uint64_t bytes) {
  return {.volume = kVolume,
          .amount = bytes,
          .urgency = 4,
          .timeout_seconds = 2,
          .token = {},
          .finish_early = true};
}

bool isTheEndOfTheDaemon(const sdk::Error& error) {
  return error.kind == sdk::ErrorKind::kDisconnected || error.kind == sdk::ErrorKind::kUnreachable;
}

/// Asks again and again, for a minute.
bool waitUntil(const std::function<bool()>& condition) {
  const std::uint64_t deadline_ms = monotonicMs() + kPatienceMs;
  while (!condition()) {
    if (monotonicMs() >= deadline_ms) return false;
    rt::sleepNs(5 * kMs);
  }
  return true;
}

}  // namespace

LoadedWorld::LoadedWorld() {
  sandbox_.addVolume("tmp", "tmpfs", 32);
  sandbox_.start();
  for (int i = 0; i < kCheckedIn; ++i) addService("checked-in-" + std::to_string(i));
  addService("declared");
  for (int i = 0; i < kWriters; ++i) writers_.emplace_back(i);
}

LoadedWorld::~LoadedWorld() {
  stopping_ = true;
  client_.reset();
  daemon_ = Process();
  for (std::thread& thread : threads_) thread.join();
}

void LoadedWorld::addService(const std::string& id) {
  ids_.push_back(id);
  services_.push_back(std::make_shared<ShelfService>(sandbox_.volume("tmp") + "/" + id));
}

void LoadedWorld::declareService(const std::string& id) {
  sandbox_.write("/System/Library/Spacekeep/" + id + ".plist",
                 "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key><string>" + id +
                     "</string></dict></plist>");
  sdk::SocketOptions options;
  options.listening_fd = listenAt(sandbox_.outside("/run/spacekeep/services/" + id + ".sock"));
  auto host = sdk::ServiceHost::serveSocket(services_.back(), options);
  if (!host) throw std::runtime_error(host.error().text);
  hosts_.push_back(std::move(*host));
}

sdk::ServiceHost LoadedWorld::checkIn(std::size_t index) const {
  sdk::CheckInOptions options;
  options.socket_path = sandbox_.socketPath();
  auto host = sdk::ServiceHost::checkIn(ids_.at(index), services_.at(index), options);
  if (!host) throw std::runtime_error(host.error().text);
  return std::move(*host);
}

void LoadedWorld::startLoad() {
  for (std::size_t i = 0; i < kCheckedIn; ++i) hosts_.push_back(checkIn(i));
  declareService(ids_.back());
  for (StateWriter& writer : writers_) {
    threads_.emplace_back([this, &writer] {
      runLoad([this, &writer](sdk::Client& client) { return writeState(writer, client); });
    });
  }
  threads_.emplace_back(
      [this] { runLoad([this](sdk::Client& client) { return purgeALittle(client); }); });
  threads_.emplace_back([this] { runLoad([this](sdk::Client& client) { return query(client); }); });
  threads_.emplace_back([this] { comeAndGo(); });
}

void LoadedWorld::startDaemon() {
  std::error_code ignored;
  std::filesystem::remove(sandbox_.outside("/tmp/daemon.log"), ignored);
  daemon_ = sandbox_.spawn({"/programs/daemon/spacekeepd"}, "daemon.log");
}

bool LoadedWorld::killDaemon() {
  daemon_.signal(SIGKILL);
  const bool was_killed = daemon_.wait() == 128 + SIGKILL;
  client_.reset();
  return was_killed;
}

void LoadedWorld::renewOneService() {
  const std::size_t index = next_to_renew_++ % kCheckedIn;
  sdk::ServiceHost fresh = checkIn(index);
  std::swap(hosts_.at(index), fresh);
}

std::unique_ptr<sdk::Client> LoadedWorld::connect() const {
  auto client = sdk::Client::connect({.socket_path = sandbox_.socketPath(), .on_disconnect = {}});
  return client ? std::make_unique<sdk::Client>(std::move(*client)) : nullptr;
}

/// On one connection after another for as long as the world stands.
void LoadedWorld::runLoad(const std::function<bool(sdk::Client&)>& once) {
  while (!stopping_) {
    const auto client = connect();
    while (client != nullptr && !stopping_ && once(*client)) {
    }
    rt::sleepNs(2 * kMs);
  }
}

bool LoadedWorld::writeState(StateWriter& writer, sdk::Client& client) {
  if (writer.check(client)) writer.writeUntilTheEnd(client);
  return false;
}

bool LoadedWorld::purgeALittle(sdk::Client& client) {
  for (const auto& service : services_) service->fillUpTo(kFilesEach / 2);
  return book(client.purge(purgeOf(2 * ShelfService::kFileBytes)), counts_.purges);
}

bool LoadedWorld::query(sdk::Client& client) {
  return book(client.itemizedPurgeableSpace({{"SPACEKEEP_VOLUME", kVolume}}), counts_.queries);
}

bool LoadedWorld::book(const sdk::Reply& reply, std::atomic<std::uint64_t>& answered) {
  if (reply.outcome && !reply.outcome->contains("SPACEKEEP_ERROR")) {
    ++answered;
    return true;
  }
  if (reply.error && isTheEndOfTheDaemon(*reply.error)) return false;
  ++counts_.failures;
  ADD_FAILURE() << (reply.error ? reply.error->text : "refused, or an outcome with an error");
  return false;
}

/// A service that checks in and leaves, for as long as the world stands.
void LoadedWorld::comeAndGo() {
  const auto service = std::make_shared<ShelfService>(sandbox_.volume("tmp") + "/comes-and-goes");
  for (std::uint64_t number = 0; !stopping_; ++number) {
    std::atomic<bool> serving{false};
    sdk::CheckInOptions options;
    options.socket_path = sandbox_.socketPath();
    options.on_status = [&serving](const sdk::HostStatus& status) {
      if (status.state == sdk::HostState::kServing) serving = true;
    };
    // A name of its own each time: under one that is still registered it would be told that it serves
    // before it was pinged.
    auto host =
        sdk::ServiceHost::checkIn("comes-and-goes-" + std::to_string(number), service, options);
    // Who leaves before the daemon has its pong holds up the registry for good, as the daemon's ping
    // has no time limit; the library answers for two seconds, which a busy machine may not keep.
    while (!serving && !stopping_) rt::sleepNs(2 * kMs);
    if (serving) ++counts_.check_ins;
    rt::sleepNs(5 * kMs);
  }
}

bool LoadedWorld::waitForFirstAnswer() {
  client_ = connectToStarting(sandbox_);
  return client_ != nullptr;
}

bool LoadedWorld::waitUntilAllServicesArePurged() {
  std::vector<std::uint64_t> before;
  before.reserve(services_.size());
  for (const auto& service : services_) before.push_back(service->timesPurged());
  const auto all_were_asked = [&] {
    for (std::size_t i = 0; i < services_.size(); ++i) {
      if (services_[i]->timesPurged() == before[i]) return false;
    }
    return true;
  };
  bool reached = false;
  return waitUntil([&] {
    reached = purgeForAll() || reached;
    return reached && all_were_asked();
  });
}

/// So much that each service has a share. Answers whether all of it was freed: a purge that asks a
/// service again may find it still booked as being asked, and then ends a little short.
bool LoadedWorld::purgeForAll() {
  for (const auto& service : services_) service->fillUpTo(kFilesEach);
  const std::uint64_t bytes = services_.size() * 4 * ShelfService::kFileBytes;
  const sdk::Reply reply = client_->purge(purgeOf(bytes), kPatience);
  if (!reply.outcome || reply.outcome->contains("SPACEKEEP_ERROR")) {
    ADD_FAILURE() << (reply.error ? reply.error->text : "refused, or an outcome with an error");
    return false;
  }
  const std::uint64_t freed = unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value_or(0);
  EXPECT_GT(freed, 0U);
  return freed >= bytes;
}

bool LoadedWorld::waitForWholeQuery() {
  return waitUntil([this] {
    const sdk::Reply reply =
        client_->itemizedPurgeableSpace({{"SPACEKEEP_VOLUME", kVolume}}, kPatience);
    if (!reply.outcome || !reply.outcome->contains("SPACEKEEP_TOTAL_AVAILABLE")) return false;
    for (const std::string& id : ids_) {
      if (!unsignedAt(*reply.outcome, id)) return false;
    }
    return true;
  });
}

std::uint64_t LoadedWorld::answeredWrites() const {
  std::uint64_t sum = 0;
  for (const StateWriter& writer : writers_) sum += writer.answers();
  return sum;
}

std::uint64_t LoadedWorld::lostWrites() const {
  std::uint64_t sum = 0;
  for (const StateWriter& writer : writers_) sum += writer.lost();
  return sum;
}

}  // namespace spacekeep::system_test
