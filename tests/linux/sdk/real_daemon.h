// Thread safety: every member may be called from any thread.
//
// The real daemon object behind a real socket. Its volume, its rights and its statistics are
// stand-ins, so that a test may free space without a disk.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "daemon/spacekeep.h"
#include "support/ipc/linux/bus_listener.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/sockets.h"
#include "support/timebase.h"
#include "tests/linux/sdk/fake_daemon.h"

namespace spacekeep::sdk {

/// One volume, "/data", whose free bytes the test moves.
class OneVolume : public Volumes {
 public:
  std::vector<std::string> getLocalVolumes() override { return {"/data"}; }
  std::vector<std::string> lowSpaceVolumes() override { return {}; }
  bool validateVolume(const Dictionary& info) override {
    const auto* volume = stringAt(info, "SPACEKEEP_VOLUME");
    return volume != nullptr && *volume == "/data";
  }
  std::uint64_t volumeFreespace(const Value*) override { return free_bytes; }
  void setLowSpaceSettings(const LowSpaceSettings&) override {}

  std::atomic<std::uint64_t> free_bytes = 1000;
};

class SwitchedAccess : public Access {
 public:
  bool connectionIsEntitled(ipc::PeerConnection* connection,
                            std::initializer_list<std::string_view> entitlements) override {
    if (connection == nullptr) return false;
    for (const auto name : entitlements) {
      if (name == denied.get()) return false;
    }
    return true;
  }

  rt::Guarded<std::string> denied;
};

class NoStatistics : public Statistics {
 public:
  void addDistributionStat(double, std::string_view, std::string_view) override {}
  void addReportStat(std::string_view, std::optional<std::string_view>, std::int64_t) override {}
};

class NoFiles : public DirectoryReader {
 public:
  std::vector<std::string> entriesBelow(const std::string&) override { return {}; }
  std::variant<std::vector<std::uint8_t>, FileError> readWholeFile(const std::string&) override {
    return FileError{"there are no files"};
  }
};

class RealDaemon {
 public:
  explicit RealDaemon(std::string socket_path) : socket_path_(std::move(socket_path)) {
    const auto base = *rt::timebase();
    gTimebaseConversion = static_cast<double>(base.numerator) / base.denominator;
    daemon = Spacekeep::create(platform_);
  }
  ~RealDaemon() {
    daemon->setListener(nullptr);
    const std::weak_ptr<Spacekeep> last = daemon;
    daemon.reset();
    EXPECT_TRUE(eventually([&] { return last.expired(); })) << "somebody still holds the daemon";
    unlink(socket_path_.c_str());
  }
  RealDaemon(const RealDaemon&) = delete;
  RealDaemon& operator=(const RealDaemon&) = delete;

  [[nodiscard]] std::size_t serviceCount() const { return daemon->copyServices()->size(); }

  OneVolume volumes;
  SwitchedAccess access;

 private:
  std::unique_ptr<ipc::Listener> listen(ipc::ServedInterface interface) {
    std::string why;
    auto socket = ipc::bindListeningSocket(socket_path_, 0600, why);
    EXPECT_NE(socket, nullptr) << why;
    ipc::ServerOptions options;
    options.refuse_own_process = false;
    return std::make_unique<ipc::BusListener>(loop_, global_, access, std::move(socket),
                                              std::move(interface), std::move(options));
  }

  const std::string socket_path_;
  ConcurrentQueue global_{{.name = "daemon", .parallelism = 4, .idle_worker_ns = 1'000'000'000}};
  ipc::IpcLoop loop_;
  NoStatistics statistics_;
  NoFiles files_;
  ipc::LinuxConnector connector_{loop_, global_, "/nowhere"};
  ServiceCaller services_{global_, connector_, spacekeepServiceInterface()};
  Platform platform_{
      .global = global_,
      .volumes = volumes,
      .access = access,
      .statistics = statistics_,
      .files = files_,
      .connector = connector_,
      .services = services_,
      .openPreferencesSuite = [](const std::string&) { return nullptr; },
      .makeListener = [this](ipc::ServedInterface i) { return listen(std::move(i)); },
      .after = [](std::uint64_t, const Task&) {},
      .createSpacekeepToken = [] { return Value("token"); }};

 public:
  std::shared_ptr<Spacekeep> daemon;
};

}  // namespace spacekeep::sdk
