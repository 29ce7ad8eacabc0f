#include "daemon/spacekeep.h"

#include <utility>
#include <vector>

#include "client/client_adaptor.h"
#include "client/entitlements.h"
#include "daemon/descriptors.h"
#include "daemon/names.h"
#include "history/history.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"

namespace spacekeep {

std::shared_ptr<Spacekeep> Spacekeep::create(Platform& platform, std::string root_path) {
  auto daemon = std::make_shared<Spacekeep>(Key{}, platform, std::move(root_path));
  daemon->init();
  return daemon;
}

Spacekeep::Spacekeep(Key, Platform& platform, std::string root_path)
    : platform_(platform), root_path_(std::move(root_path)) {}

// The listener is resumed last: no client can see a half-built object.
void Spacekeep::init() {
  // The root "/" gives a path that begins with a doubled slash. It is kept.
  const std::vector<std::string> directories = {root_path_ + kSystemDescriptors,
                                                kInternalDescriptors};
  logTrace("%s plistDir: %@", "init", directories.front());
  default_values_ = Dictionary{{keys::kCacheEnabled, true}};
  user_defaults_ = platform_.openPreferencesSuite(kSuiteName);
  if (!user_defaults_) logProblem("%s Unable to initialize user defaults!", "init");
  history_ = History::create(platform_);
  createQueues();
  applyStoredSettings();
  scanDescriptors(directories);
  startListener();
}

void Spacekeep::createQueues() {
  ConcurrentQueue& global = platform_.global;
  purge_queue_ = SerialQueue::create("com.quorvel.spacekeep_purge", global);
  purgeable_queue_ = SerialQueue::create("com.quorvel.spacekeep_purgeable", global);
  periodic_queue_ = SerialQueue::create("com.quorvel.spacekeep_periodic", global);
  notify_queue_ = SerialQueue::create("com.quorvel.spacekeep_notify", global);
  daemons_queue_ = SerialQueue::create("com.quorvel.spacekeep_daemons", global);
  // The label does not follow the role: whoever watches the queues knows this one as "cancel".
  collection_queue_ = SerialQueue::create("com.quorvel.spacekeep_cancel", global);
  defaults_queue_ = SerialQueue::create("com.quorvel.spacekeep_defaults", global);
}

void Spacekeep::applyStoredSettings() {
  const auto stored = user_defaults_ ? user_defaults_->get(keys::kUserDefaults) : std::nullopt;
  const Dictionary* state = stored ? stored->dictionary() : nullptr;
  applySettings(state == nullptr ? Dictionary() : *state);
}

// Runs on the creating thread before any queue is in use.
void Spacekeep::scanDescriptors(const std::vector<std::string>& directories) {
  DescribedServices found;
  for (const std::string& directory : directories) {
    logTrace("%s scanning %@", "init", directory);
    scanPlistsAtPath(directory,
                     [&](const Dictionary& descriptor) { collectService(descriptor, found); });
  }
  for (auto& [service_id, service] : found.services) {
    registry_.set(service_id, std::move(service));
  }
  daemons_.insert(found.service_ids.begin(), found.service_ids.end());
}

void Spacekeep::startListener() {
  ipc::ServedInterface served = makeClientAdaptor(weak_from_this());
  serveHistory(served, weak_from_this());
  listener_ = platform_.makeListener(std::move(served));
  listener_->setRequiredEntitlement(std::string(entitlements::kClient));
  logTrace("%s resuming listener", "init");
  listener_->resume();
}

const std::shared_ptr<SerialQueue>& Spacekeep::collection_queue() const {
  return collection_queue_;
}
const std::shared_ptr<SerialQueue>& Spacekeep::defaults_queue() const { return defaults_queue_; }
const std::shared_ptr<SerialQueue>& Spacekeep::purge_queue() const { return purge_queue_; }
const std::shared_ptr<SerialQueue>& Spacekeep::purgeable_queue() const { return purgeable_queue_; }
const std::shared_ptr<SerialQueue>& Spacekeep::periodic_queue() const { return periodic_queue_; }
const std::shared_ptr<SerialQueue>& Spacekeep::notify_queue() const { return notify_queue_; }
const std::shared_ptr<SerialQueue>& Spacekeep::daemons_queue() const { return daemons_queue_; }

PreferencesSuite* Spacekeep::userDefaults() const {
  defaults_queue_->assertCurrent("userDefaults");
  return user_defaults_.get();
}

void Spacekeep::setUserDefaults(std::unique_ptr<PreferencesSuite> suite) {
  defaults_queue_->assertCurrent("setUserDefaults");
  user_defaults_ = std::move(suite);
}

const ServiceMap& Spacekeep::services() const {
  collection_queue_->assertCurrent("services");
  return registry_.services();
}

void Spacekeep::setServices(ServiceMap services) {
  collection_queue_->assertCurrent("setServices");
  registry_.replaceAll(std::move(services));
}

const std::set<std::string>& Spacekeep::daemons() const {
  daemons_queue_->assertCurrent("daemons");
  return daemons_;
}

void Spacekeep::setDaemons(std::set<std::string> service_ids) {
  daemons_queue_->assertCurrent("setDaemons");
  daemons_ = std::move(service_ids);
}

const std::optional<PurgeOperations>& Spacekeep::purgeOperations() const {
  collection_queue_->assertCurrent("purgeOperations");
  return purge_operations_;
}

void Spacekeep::setPurgeOperations(std::optional<PurgeOperations> operations) {
  collection_queue_->assertCurrent("setPurgeOperations");
  purge_operations_ = std::move(operations);
}

}  // namespace spacekeep
