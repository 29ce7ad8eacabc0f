// Requests of any content to the whole daemon, and services that answer anything: in a simulated
// world, where waits cost nothing and the input decides the schedule as well. Each call ends, with
// one answer at most, and nobody can say anything that takes up a second line of the log.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "daemon/spacekeep.h"
#include "fuzz/helpers/answering_connector.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/value_maker.h"
#include "operations/info_keys.h"
#include "registry/service_protocol.h"
#include "sim/world/world.h"
#include "support/runtime/simulation.h"
#include "support/services/call_service.h"
#include "support/values/text.h"

namespace spacekeep::fuzz {
namespace {

const std::vector<std::string> kWords{keys::kVolume,
                                      keys::kAmount,
                                      keys::kUrgency,
                                      keys::kUrgencyLimit,
                                      keys::kPurgeTimeout,
                                      keys::kToken,
                                      keys::kFinishEarly,
                                      keys::kFreespaceBegin,
                                      keys::kAmountReported,
                                      keys::kElapsedTime,
                                      keys::kOperationCancelled,
                                      keys::kReportingServices,
                                      keys::kTotalAvailable,
                                      keys::kOptOut,
                                      keys::kServicesToQuery,
                                      keys::kServicesToCount,
                                      keys::kUserDefaults,
                                      keys::kCacheEnabled,
                                      keys::kRecentServiceStats,
                                      keys::kNotifications,
                                      keys::kRolePurge,
                                      keys::kRolePeriodic,
                                      "SPACEKEEP_LOW_SPACE_BYTES",
                                      "/",
                                      "/data",
                                      "one",
                                      "guest"};
constexpr std::uint64_t kLongestNs = 4ULL * 3600 * 1'000'000'000;
constexpr std::size_t kMostRequests = 6;

/// The daemon in its world, with the services of the input.
class Scene {
 public:
  explicit Scene(ValueMaker& input) : input_(input), services_(world_, input) {
    world_.volumes().add("/", 1'000'000'000, 5'000'000);
    world_.volumes().add("/data", 1'000'000, 0);
    for (const char* service_id : {"one", "two", "three"}) {
      Dictionary descriptor = input_.dictionary();
      descriptor.set(keys::kServiceId, service_id);
      if (input_.byte() < 192) descriptor.set(keys::kServiceRoles, Array{"PURGE", "PERIODIC"});
      world_.files().addPlist(std::string("/System/Library/Spacekeep/") + service_id, descriptor);
    }
    daemon_ = Spacekeep::create(platform_);
  }
  ~Scene() {
    world_.shutDown();
    services_.forget();
  }
  Scene(const Scene&) = delete;
  Scene& operator=(const Scene&) = delete;

  void play() {
    for (std::size_t i = 0; i < kMostRequests && !input_.usedUp(); ++i) {
      makeRequest();
      if (input_.byte() < 128) awaitAll();
    }
    awaitAll();
    lookAtTheLog();
  }

 private:
  [[nodiscard]] Platform platform() {
    Platform& base = world_.platform();
    return {.global = base.global,
            .volumes = base.volumes,
            .access = base.access,
            .statistics = base.statistics,
            .files = base.files,
            .connector = services_,
            .services = caller_,
            .openPreferencesSuite = base.openPreferencesSuite,
            .makeListener = base.makeListener,
            .after = base.after,
            .createSpacekeepToken = base.createSpacekeepToken};
  }

  [[nodiscard]] Dictionary info() {
    Dictionary info = input_.dictionary();
    const std::uint8_t choice = input_.byte();
    if (choice % 4 != 0) info.set(keys::kVolume, choice % 8 == 1 ? "/data" : "/");
    if (choice >= 64) info.set(keys::kAmount, input_.byte() * std::uint64_t{100'000});
    return info;
  }

  [[nodiscard]] ipc::OptionalValue value() {
    if (input_.byte() < 32) return std::nullopt;
    return input_.value();
  }

  void makeRequest() {
    switch (input_.byte() % 8) {
      case 0:
        return call("clientPurge", {info()});
      case 1:
        return call("clientPurgeableSpace", {info()});
      case 2:
        return call("clientItemizedPurgeableSpace", {info()});
      case 3:
        return call("clientCancelPurge", {info()});
      case 4: {
        ipc::OptionalValue state = value();
        return call("clientSetState", {std::move(state), input_.text()});
      }
      case 5:
        return call("clientGetState", {input_.text()});
      case 6: {
        std::string service_id = input_.text();
        return call("clientCheckin", {std::move(service_id), ipc::SharedDescriptor(), info()});
      }
      default:
        world_.volumes().setLowSpace({"/"});
        daemon_->performPeriodicsWithInfo(info());
        daemon_->handleVFSStreamEvent(input_.dictionary());
        return;
    }
  }

  void call(const char* member, ipc::Arguments arguments) {
    calls_.push_back(world_.call(client_, member, std::move(arguments)));
  }

  void awaitAll() {
    for (const auto& call : calls_) {
      require(call->waitForNs(kLongestNs), "each call ends");
      require(call->answers() <= 1, "a call has one answer at most");
      if (const auto answer = call->dictionary()) {
        require(isOneLine(textOf(*answer)), "an answer is shown as one line");
      }
    }
    calls_.clear();
  }

  void lookAtTheLog() {
    for (const std::int32_t level : {kLogProblem, kLogTrace}) {
      for (const std::string& line : world_.trace().linesOfLevel(level)) {
        require(isOneLine(line), "a log line is one line of UTF-8");
      }
    }
  }

  ValueMaker& input_;
  sim::World world_;
  AnsweringConnector services_;
  ServiceCaller caller_{world_.global(), services_, spacekeepServiceInterface()};
  Platform platform_ = platform();
  std::shared_ptr<Spacekeep> daemon_;
  const std::shared_ptr<sim::SimulatedPeer> client_ =
      world_.client("fuzzed", {"PURGEABLE_ENTITLEMENT", "ITEMIZED_PURGEABLE_ENTITLEMENT",
                               "PURGE_ENTITLEMENT", "SERVICE_ENTITLEMENT"});
  std::vector<std::shared_ptr<sim::ClientCall>> calls_;
};

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace spacekeep;
  fuzz::ValueMaker input(fuzz::inputOf(data, size), fuzz::kWords);
  rt::ScheduleOptions options;
  options.seed = input.byte() + 1U;
  options.strategy = input.byte() < 64 ? rt::Strategy::kPct : rt::Strategy::kRandom;
  const rt::ScheduleReport report =
      rt::runSchedule(options, [&input] { fuzz::Scene(input).play(); });
  fuzz::require(report.end == rt::ScheduleEnd::kFinished, "everything comes to an end");
  return 0;
}
