#include "sim/world/world.h"

#include <utility>

#include "registry/service_protocol.h"
#include "support/access/entitlements.h"
#include "support/runtime/locks.h"
#include "support/timebase.h"

namespace spacekeep::sim {
namespace {

constexpr const char* kDescriptorDirectory = "/System/Library/Spacekeep/";
constexpr std::uint64_t kPollNs = 1'000'000;

ConcurrentQueue::Options queueOptions(const World::Options& options) {
  ConcurrentQueue::Options queue;
  queue.name = "world";
  queue.parallelism = options.parallelism;
  return queue;
}

}  // namespace

World::World() : World(Options{}) {}

World::World(Options options)
    : trace_(options.trace),
      log_capture_(trace_),
      global_(std::make_unique<ConcurrentQueue>(queueOptions(options))),
      delays_(*global_),
      volumes_(trace_, delays_),
      statistics_(trace_),
      disk_(trace_, options.trace.is_over),
      connector_(*global_),
      listener_(*global_, trace_),
      events_(*global_),
      keep_alive_(trace_),
      caller_(*global_, connector_, spacekeepServiceInterface()),
      platform_(makePlatform(options.keeps_history)) {
  if (const auto base = rt::timebase()) {
    gTimebaseConversion = static_cast<double>(base->numerator) / base->denominator;
  }
  files_.addDirectory(kDescriptorDirectory);
}

World::~World() { shutDown(); }

Platform World::makePlatform(bool keeps_history) {
  Platform platform{
      .global = *global_,
      .volumes = volumes_,
      .access = access_,
      .statistics = statistics_,
      .files = files_,
      .connector = connector_,
      .services = caller_,
      .openPreferencesSuite = [this](const std::string& name) { return openSuite(name); },
      .makeListener =
          [this](ipc::ServedInterface interface) {
            return listener_.makeListener(std::move(interface));
          },
      .after = [this](std::uint64_t delay_ns, Task task) { after(delay_ns, std::move(task)); },
      .createSpacekeepToken =
          [this] {
            const std::scoped_lock lock(mutex_);
            return Value("token-" + std::to_string(++tokens_));
          },
  };
  if (keeps_history) platform.openHistory = [this] { return history_.open(); };
  return platform;
}

std::unique_ptr<PreferencesSuite> World::openSuite(const std::string& name) {
  if (disk_.refusesToOpen()) return nullptr;
  return std::make_unique<InMemoryPreferencesSuite>(disk_, name);
}

std::shared_ptr<SimulatedService> World::addService(const std::string& id,
                                                    ServiceBehaviour behaviour) {
  auto service =
      std::make_shared<SimulatedService>(id, std::move(behaviour), trace_, delays_, volumes_);
  const std::scoped_lock lock(mutex_);
  services_.push_back(service);
  return service;
}

std::shared_ptr<SimulatedService> World::declareService(const std::string& id,
                                                        ServiceBehaviour behaviour,
                                                        Dictionary keys) {
  auto service = addService(id, std::move(behaviour));
  keys.set("SPACEKEEP_ID", id);
  files_.addPlist(kDescriptorDirectory + id + ".plist", std::move(keys));
  connector_.declare(service);
  return service;
}

std::vector<std::shared_ptr<SimulatedService>> World::services() const {
  const std::scoped_lock lock(mutex_);
  return services_;
}

ipc::SharedDescriptor World::endpointOf(const std::shared_ptr<SimulatedService>& service) {
  return connector_.endpointOf(service);
}

std::shared_ptr<SimulatedPeer> World::client(const std::string& name,
                                             std::set<std::string, std::less<>> entitlements) {
  entitlements.emplace(access::kClientEntitlement);
  return std::make_shared<SimulatedPeer>(name, std::move(entitlements));
}

std::shared_ptr<ClientCall> World::call(const std::shared_ptr<SimulatedPeer>& peer,
                                        std::string_view member, ipc::Arguments arguments) {
  return listener_.call(peer, member, std::move(arguments));
}

std::shared_ptr<ClientCall> World::checkIn(const std::shared_ptr<SimulatedService>& service,
                                           const Dictionary& info) {
  const auto peer = client(service->id() + " process", {std::string(access::kServiceEntitlement)});
  return call(peer, "clientCheckin", {service->id(), endpointOf(service), info});
}

void World::after(std::uint64_t delay_ns, Task task) { delays_.after(delay_ns, std::move(task)); }

bool World::eventually(const std::function<bool()>& condition, std::uint64_t limit_ns) {
  const std::uint64_t deadline = rt::deadlineAfterNs(limit_ns);
  while (!condition()) {
    if (rt::ticks() >= deadline) return false;
    rt::sleepNs(kPollNs);
  }
  return true;
}

void World::shutDown() {
  {
    const std::scoped_lock lock(mutex_);
    if (std::exchange(shut_down_, true)) return;
  }
  listener_.abandon();
  for (const auto& service : services()) service->answerPingsFromNowOn();
  delays_.stop();
  // A purge that still runs ends by its own limits; the queue's destructor waits for it.
  for (const auto& service : services()) service->abandon();
  connector_.abandon();
  events_.abandon();
  global_.reset();
}

}  // namespace spacekeep::sim
