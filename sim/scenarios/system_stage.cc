#include "sim/scenarios/system_stage.h"

#include <algorithm>
#include <utility>

#include "daemon/spacekeep.h"
#include "daemon/start_up.h"
#include "operations/info_keys.h"
#include "support/runtime/locks.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
// Longer than any delay that a plan draws: afterwards only what never comes is outstanding.
constexpr std::uint64_t kAftermathNs = 60 * kSecond;
constexpr const char* kSuite = "com.quorvel.spacekeep";
constexpr const char* kStream = "com.quorvel.dispatch.vfs";
constexpr const char* kDaily = "com.quorvel.Spacekeep.daily";
constexpr const char* kDescriptors = "/System/Library/Spacekeep/";

World::Options optionsFor(const SystemPlan& plan, const Lasting& lasting) {
  return {.parallelism = plan.parallelism,
          .trace = {lasting.now_ns, lasting.last_call, &rt::clearingAway}};
}

}  // namespace

SystemStage::SystemStage(SystemRun& run, unsigned number, LifeOfDaemon& life, Lasting& lasting)
    : run_(run),
      number_(number),
      life_(life),
      lasting_(lasting),
      world_(optionsFor(run.plan, lasting)),
      services_(world_, run.plan.faults.contains(Fault::kSilentPing),
                [this](const auto& call) { keepCall(call); }) {
  world_.trace().add(LifeBegan{number_, rt::wallClockNs()});
  setUpDisk();
  setUpVolumes();
  for (const SystemService& plan : run_.plan.services) {
    services_.add(plan, lasting_.owns.at(plan.id));
  }
  for (const BadDescriptor& bad : run_.plan.bad_descriptors) addBadDescriptor(bad);
}

SystemStage::~SystemStage() { takeDown(); }

// Called twice when the life is cut off in the middle of it.
void SystemStage::takeDown() {
  if (!std::exchange(noted_down_, true)) noteDown();
  world_.shutDown();
  Spacekeep::resetSharedSpacekeep();
  world_.events().unpark();
  if (daemon_.joinable()) daemon_.join();
  if (rt::clearingAway()) rt::letKeepersGo();
}

void SystemStage::setUpDisk() {
  InMemoryDisk& disk = world_.disk();
  disk.restore(kSuite, lasting_.disk);
  disk.setWriteTimeNs(run_.plan.disk_write_ns);
  if (number_ > 0) disk.refuseToOpen(run_.plan.crashes[number_ - 1].store_refuses_to_open);
}

void SystemStage::setUpVolumes() {
  for (const PlannedVolume& volume : run_.plan.volumes) {
    world_.volumes().add(volume.path, volume.size_bytes, lasting_.free_bytes.at(volume.path));
  }
}

void SystemStage::addBadDescriptor(const BadDescriptor& descriptor) {
  const std::string path = kDescriptors + descriptor.file_name;
  InMemoryFiles& files = world_.files();
  switch (descriptor.kind) {
    case BadDescriptor::Kind::kNoPropertyList:
      return files.addText(path, "not a property list");
    case BadDescriptor::Kind::kNoDictionary:
      return files.addPlist(path, Array{Value(1)});
    case BadDescriptor::Kind::kNoId:
      return files.addPlist(path, Dictionary{{"SPACEKEEP_SERVICES", Array{Value("PURGE")}}});
    case BadDescriptor::Kind::kIdIsNoString:
      return files.addPlist(path, Dictionary{{keys::kServiceId, 7}});
    case BadDescriptor::Kind::kUnreadable:
      return files.addUnreadable(path, "input/output error");
    case BadDescriptor::Kind::kSecondOfId:
      return files.addPlist(path, Dictionary{{keys::kServiceId, descriptor.of_id}});
  }
}

void SystemStage::play() {
  startDaemon();
  startActions();
  waitForEverybody();
  takeDown();
}

void SystemStage::startDaemon() {
  daemon_ = rt::Thread("daemon",
                       [this] { startUp(world_.platform(), world_.events(), world_.keepAlive()); });
  world_.events().waitUntilParked();
}

void SystemStage::startActions() {
  services_.start([this] { action_done_.signal(); });
  actions_ = services_.all().size();
  for (const PlannedAction& action : run_.plan.actions) {
    if (action.life != number_) continue;
    ++actions_;
    world_.after(action.at_ns, [this, &action] { perform(action); });
  }
}

// Without time limits: who is never served makes a deadlock, and that is found.
void SystemStage::waitForEverybody() {
  for (std::size_t i = 0; i < actions_; ++i) action_done_.wait();
  std::vector<std::shared_ptr<ClientCall>> calls;
  {
    const std::scoped_lock lock(mutex_);
    calls = calls_;
  }
  for (const auto& call : calls) (void)call->wait();
  rt::sleepNs(1);  // what was only submitted has begun by then
  world_.keepAlive().waitUntilIdle();
  rt::sleepNs(kAftermathNs);
}

void SystemStage::noteDown() {
  run_.events.reserve(run_.events.size() + 512);
  for (Event& event : world_.trace().take()) run_.events.push_back(std::move(event));
  lasting_.last_call = world_.trace().nextCall();
  for (const auto& [id, service] : services_.all()) {
    life_.services[id] = {service->askedTwiceAtOnce(), service->behaviour().owns};
  }
  for (auto& [volume, free_bytes] : lasting_.free_bytes) {
    free_bytes = world_.volumes().freeBytes(volume);
    life_.free_at_end[volume] = free_bytes;
    free_bytes += world_.volumes().outstandingBytes(volume);
  }
  life_.disk_at_end = world_.disk().read(kSuite);
  life_.keep_alive_open = world_.keepAlive().open();
  life_.keep_alive_went_negative = world_.keepAlive().wentNegative();
}

void SystemStage::perform(const PlannedAction& action) {
  const bool is_of_service = std::holds_alternative<ServiceAction>(action.what);
  std::visit([this](const auto& what) { act(what); }, action.what);
  if (!is_of_service) action_done_.signal();
}

void SystemStage::act(const CallAction& action) {
  ipc::Arguments arguments;
  if (action.member == "clientSetState") {
    arguments = {ipc::OptionalValue(action.value), action.key};
  } else if (action.member == "clientGetState") {
    arguments = {action.key};
  } else {
    arguments = {action.info};
  }
  keepCall(world_.call(world_.client(action.client, action.rights), action.member,
                       std::move(arguments)));
}

void SystemStage::keepCall(const std::shared_ptr<ClientCall>& call) {
  const std::scoped_lock lock(mutex_);
  calls_.push_back(call);
}

void SystemStage::act(const SpaceAction& action) {
  if (action.frees) {
    world_.volumes().giveBack(action.volume, action.bytes);
  } else {
    (void)world_.volumes().write(action.volume, action.bytes);
  }
}

void SystemStage::act(const LowSpaceAction& action) {
  world_.volumes().setLowSpace(action.volumes);
  world_.trace().add(StreamEventSent{action.event, action.volumes});
  (void)world_.events().send(kStream, action.event);
}

void SystemStage::act(const DailyAction& action) {
  world_.trace().add(
      ActivityRan{static_cast<std::int32_t>(action.state), world_.volumes().getLocalVolumes()});
  (void)world_.events().runActivity(kDaily, action.state);
}

void SystemStage::act(const ClockAction& action) {
  world_.trace().add(ClockJumped{action.by_ns});
  rt::jumpWallClockNs(action.by_ns);
}

void SystemStage::act(const DiskAction& action) {
  world_.trace().add(WorldChanged{action.failure.empty() ? "the disk works" : "the disk fails"});
  world_.disk().failSynchronize(action.failure);
}

void SystemStage::act(const ServiceAction& action) {
  services_.act(action, [this] { action_done_.signal(); });
}

}  // namespace spacekeep::sim
