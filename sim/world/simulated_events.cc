#include "sim/world/simulated_events.h"
#include "support/runtime/locks.h"

#include <utility>

namespace spacekeep::sim {
namespace {

class HandSetActivity final : public Activity {
 public:
  explicit HandSetActivity(ActivityState state) : state_(state) {}
  [[nodiscard]] ActivityState state() const override { return state_; }

 private:
  const ActivityState state_;
};

}  // namespace

void CountingKeepAlive::begin() {
  const std::scoped_lock lock(mutex_);
  ++open_;
  ++begun_;
  changed();
}

void CountingKeepAlive::end() {
  const std::scoped_lock lock(mutex_);
  --open_;
  went_negative_ = went_negative_ || open_ < 0;
  changed();
}

void CountingKeepAlive::changed() {
  if (trace_ != nullptr) trace_->add(KeepAliveIs{open_});
  if (open_ <= 0) idle_.notifyAll();
}

void CountingKeepAlive::waitUntilIdle() {
  const std::scoped_lock lock(mutex_);
  while (open_ > 0) idle_.wait(mutex_);
}

std::int64_t CountingKeepAlive::open() const {
  const std::scoped_lock lock(mutex_);
  return open_;
}

std::uint64_t CountingKeepAlive::begun() const {
  const std::scoped_lock lock(mutex_);
  return begun_;
}

bool CountingKeepAlive::wentNegative() const {
  const std::scoped_lock lock(mutex_);
  return went_negative_;
}

void SimulatedEventSources::registerActivity(const std::string& name, ActivityHandler handler) {
  const std::scoped_lock lock(mutex_);
  activities_[name] = std::move(handler);
}

void SimulatedEventSources::setStreamHandler(const std::string& stream, ConcurrentQueue& queue,
                                             StreamHandler handler) {
  const std::scoped_lock lock(mutex_);
  streams_[stream] = {&queue, std::move(handler)};
}

void SimulatedEventSources::installTerminationHandler(void (*handler)(int)) {
  const std::scoped_lock lock(mutex_);
  termination_handler_ = handler;
}

int SimulatedEventSources::postNotification(const std::string& name) {
  const std::scoped_lock lock(mutex_);
  notifications_.push_back(name);
  return notification_result_;
}

void SimulatedEventSources::park() {
  {
    const std::scoped_lock lock(mutex_);
    parked_ = true;
    has_parked_.notifyAll();
  }
  unparked_.wait();
}

void SimulatedEventSources::waitUntilParked() {
  const std::scoped_lock lock(mutex_);
  while (!parked_) has_parked_.wait(mutex_);
}

bool SimulatedEventSources::runActivity(const std::string& name, ActivityState state) {
  ActivityHandler handler;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = activities_.find(name);
    if (found == activities_.end()) return false;
    handler = found->second;
  }
  global_.async([handler = std::move(handler), state] {
    HandSetActivity activity(state);
    handler(activity);
  });
  return true;
}

bool SimulatedEventSources::send(const std::string& stream, const Dictionary& event) {
  Stream target;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = streams_.find(stream);
    if (found == streams_.end()) return false;
    target = found->second;
  }
  target.queue->async([handler = std::move(target.handler), event] { handler(event); });
  return true;
}

void SimulatedEventSources::unpark() { unparked_.signal(); }

void SimulatedEventSources::setNotificationResult(int result) {
  const std::scoped_lock lock(mutex_);
  notification_result_ = result;
}

std::vector<std::string> SimulatedEventSources::postedNotifications() const {
  const std::scoped_lock lock(mutex_);
  return notifications_;
}

std::vector<std::string> SimulatedEventSources::registeredActivities() const {
  std::vector<std::string> names;
  const std::scoped_lock lock(mutex_);
  for (const auto& [name, handler] : activities_) names.push_back(name);
  return names;
}

bool SimulatedEventSources::parked() const {
  const std::scoped_lock lock(mutex_);
  return parked_;
}

void (*SimulatedEventSources::terminationHandler() const)(int) {
  const std::scoped_lock lock(mutex_);
  return termination_handler_;
}

void SimulatedEventSources::abandon() {
  std::map<std::string, ActivityHandler> activities;
  std::map<std::string, Stream> streams;
  const std::scoped_lock lock(mutex_);
  activities.swap(activities_);
  streams.swap(streams_);
}

}  // namespace spacekeep::sim
