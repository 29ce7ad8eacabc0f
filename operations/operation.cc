#include "operations/operation.h"

#include <utility>

#include "operations/info_keys.h"
#include "registry/service_protocol.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

constexpr std::int32_t kMildestUrgency = 1;
constexpr std::int32_t kMostAggressiveUrgency = 4;
constexpr std::int32_t kDefaultUrgencyLimit = 3;

}  // namespace

std::int32_t urgencyLimitOf(const Dictionary& info) {
  const Value* asked = info.find(keys::kUrgency);
  if (asked == nullptr) asked = info.find(keys::kUrgencyLimit);
  const std::optional<std::int64_t> level = asked ? asked->asSigned() : std::nullopt;
  // Out of range is replaced, not clamped: a request for 9 runs at 3, not at 4.
  if (!level || *level < kMildestUrgency || *level > kMostAggressiveUrgency) {
    return kDefaultUrgencyLimit;
  }
  return static_cast<std::int32_t>(*level);
}

bool SpacekeepOperation::initWithInfo(const Value& info, ServiceSnapshot services) {
  const Dictionary* request = info.dictionary();
  if (request == nullptr) {
    logProblem("%s info is not a dictionary!", "initWithInfo");
    return refuse("Parameter error, info is not a dict");
  }
  if (const Value* volume = request->find(keys::kVolume)) setVolume(*volume);
  if (!volume_ || volume_->string() == nullptr) {
    logProblem("%s No Volume key in info: %@", "initWithInfo", *request);
    return refuse("Parameter error, no Volume key in info dict");
  }
  if (!platform_.volumes.validateVolume(*request)) {
    logProblem("%s Unable to validate volume: %@", "initWithInfo", *volume_);
    return refuse("Parameter error, Unable to validate volume in info dict");
  }
  setCollection_queue(
      SerialQueue::create("com.quorvel.spacekeep_operation_collection", platform_.global));
  setMessage_queue(
      SerialQueue::create("com.quorvel.spacekeep_operation_message", platform_.global));
  setInFlight({});
  setResult(*request);
  setServices(std::move(services));
  setInfo(*request);
  setUrgencyLimit(urgencyLimitOf(*request));
  return true;
}

bool SpacekeepOperation::refuse(const char* error_text) {
  setResult({{keys::kError, error_text}});
  return false;
}

bool SpacekeepOperation::updateInFlight(const std::string& service_id, bool add) {
  bool changed = false;
  collection_queue_->sync([&] {
    logTrace("%s %s %@", "updateInFlight", add ? "adding" : "removing", service_id);
    changed = add ? addInFlight(service_id) : removeInFlight(service_id);
  });
  return changed;
}

// A double add is an error; a late or repeated removal is routine, since the answer of a service
// and the failure of its connection may both try to remove it. Hence the different log levels.
bool SpacekeepOperation::addInFlight(const std::string& service_id) {
  if (in_flight_.insert(service_id).second) return true;
  logProblem("%s trying to add \"%@\", which is already inFlight", "updateInFlight", service_id);
  return false;
}

bool SpacekeepOperation::removeInFlight(const std::string& service_id) {
  if (in_flight_.erase(service_id) != 0) return true;
  logTrace("%s trying to remove \"%@\", which is not inFlight", "updateInFlight", service_id);
  return false;
}

std::uint64_t SpacekeepOperation::inFlightCount() const {
  std::uint64_t count = 0;
  collection_queue_->sync([&] { count = in_flight_.size(); });
  return count;
}

std::set<std::string> SpacekeepOperation::copyInFlight() const {
  std::set<std::string> copy;
  collection_queue_->sync([&] { copy = in_flight_; });
  return copy;
}

const std::set<std::string>& SpacekeepOperation::inFlight() const {
  collection_queue_->assertCurrent("inFlight");
  return in_flight_;
}

std::shared_ptr<SKService> SpacekeepOperation::serviceFor(const std::string& service_id) const {
  const auto found = services().find(service_id);
  return found == services().end() ? nullptr : found->second;
}

void SpacekeepOperation::cancelOperation() {
  collection_queue_->async([self = shared_from_this()] {
    for (const std::string& service_id : self->in_flight_) self->askToCancel(service_id);
  });
}

void SpacekeepOperation::askToCancel(const std::string& service_id) {
  platform_.services.CallServiceAsync(
      serviceFor(service_id),
      [](std::shared_ptr<ipc::RemoteProxy> proxy, ServiceCaller::Done done) {
        SpacekeepServiceProtocol(std::move(proxy)).serviceCancelPurge(std::move(done));
      },
      [self = shared_from_this(), service_id] {
        logTrace("%s connection invalidated: %@", "cancelOperation", service_id);
        self->updateInFlight(service_id, false);
      });
}

}  // namespace spacekeep
