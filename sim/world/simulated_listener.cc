#include "sim/world/simulated_listener.h"

#include <utility>

#include "support/access/entitlements.h"
#include "support/runtime/locks.h"

namespace spacekeep::sim {
namespace {

ClientAsked askedBy(const SimulatedPeer& peer, std::uint64_t call, std::string_view member,
                    const ipc::Arguments& arguments) {
  ClientAsked asked{.call = call, .member = std::string(member), .client = peer.name()};
  asked.rights.assign(peer.entitlements().begin(), peer.entitlements().end());
  for (const ipc::Argument& argument : arguments) {
    if (const auto* info = std::get_if<Dictionary>(&argument)) asked.info = *info;
    if (const auto* text = std::get_if<std::string>(&argument)) asked.text = *text;
    if (const auto* value = std::get_if<ipc::OptionalValue>(&argument)) asked.value = *value;
  }
  return asked;
}

}  // namespace

class SimulatedListener::Handle final : public ipc::Listener {
 public:
  explicit Handle(SimulatedListener& owner) : owner_(owner) {}

  void setRequiredEntitlement(std::string entitlement) override {
    const std::scoped_lock lock(owner_.mutex_);
    owner_.required_entitlement_ = std::move(entitlement);
  }
  void resume() override {
    const std::scoped_lock lock(owner_.mutex_);
    owner_.resumed_ = true;
  }

 private:
  SimulatedListener& owner_;
};

std::unique_ptr<ipc::Listener> SimulatedListener::makeListener(ipc::ServedInterface interface) {
  const std::scoped_lock lock(mutex_);
  served_ = std::move(interface);
  return std::make_unique<Handle>(*this);
}

bool SimulatedListener::made() const {
  const std::scoped_lock lock(mutex_);
  return served_.has_value();
}

bool SimulatedListener::resumed() const {
  const std::scoped_lock lock(mutex_);
  return resumed_;
}

std::string SimulatedListener::requiredEntitlement() const {
  const std::scoped_lock lock(mutex_);
  return required_entitlement_;
}

bool SimulatedListener::accepts(const SimulatedPeer& peer) const {
  const std::scoped_lock lock(mutex_);
  return resumed_ && (required_entitlement_.empty() || peer.holds(required_entitlement_));
}

std::shared_ptr<ClientCall> SimulatedListener::call(const std::shared_ptr<SimulatedPeer>& peer,
                                                    std::string_view member,
                                                    ipc::Arguments arguments) {
  auto call = std::make_shared<ClientCall>(trace_, std::string(member));
  trace_.add(askedBy(*peer, call->number(), member, arguments));
  const std::string refused = refusal(*peer, member, arguments);
  if (!refused.empty()) {
    call->fail({"org.freedesktop.DBus.Error.Failed", refused});
    return call;
  }
  const ipc::ServedMethod& method = *servedMethod(member);
  Task task = serving(peer, method, std::move(arguments), call);
  if (method.mode == ipc::ServeMode::kInOrder) {
    runInOrder(peer, std::move(task));
  } else {
    runInLane(method, std::move(task));
  }
  return call;
}

const ipc::ServedMethod* SimulatedListener::servedMethod(std::string_view member) const {
  const std::scoped_lock lock(mutex_);
  if (!served_) return nullptr;
  for (const ipc::ServedMethod& method : served_->methods) {
    if (method.name == member) return &method;
  }
  return nullptr;
}

std::string SimulatedListener::refusal(const SimulatedPeer& peer, std::string_view member,
                                       const ipc::Arguments& arguments) const {
  if (!accepts(peer)) return "the listener does not accept " + peer.name();
  if (servedMethod(member) == nullptr) return "no method " + std::string(member);
  const ipc::MethodDescription* described = nullptr;
  {
    const std::scoped_lock lock(mutex_);
    const auto* interface = served_->description->having(member);
    if (interface != nullptr) described = interface->method(member);
  }
  if (described == nullptr) return "no description of " + std::string(member);
  if (!ipc::matches(described->in, arguments)) return "wrong arguments for " + std::string(member);
  return {};
}

Task SimulatedListener::serving(std::shared_ptr<SimulatedPeer> peer,
                                const ipc::ServedMethod& method, ipc::Arguments arguments,
                                const std::shared_ptr<ClientCall>& call) {
  // Goes with the last copy of the responder, and so tells when an answer can no longer come.
  struct LastHolder {
    std::shared_ptr<ClientCall> call;
    ~LastHolder() { call->drop(); }
  };
  auto holder = std::make_shared<LastHolder>(call);
  return [peer = std::move(peer), &method, arguments = std::move(arguments),
          holder = std::move(holder)]() mutable {
    const ipc::ServingScope scope(peer.get());
    auto kept = std::move(holder);
    ipc::Responder responder{
        [kept](ipc::Arguments answer) { kept->call->reply(std::move(answer)); },
        [kept](const ipc::Error& error) { kept->call->fail(error); }};
    kept.reset();
    method.serve(std::move(arguments), std::move(responder));
  };
}

void SimulatedListener::runInOrder(const std::shared_ptr<SimulatedPeer>& peer, Task task) {
  std::shared_ptr<SerialQueue> queue;
  {
    const std::scoped_lock lock(mutex_);
    std::shared_ptr<SerialQueue>& known = in_order_[peer->name()];
    if (known == nullptr) known = SerialQueue::create("client " + peer->name(), global_);
    queue = known;
  }
  queue->async(std::move(task));
}

void SimulatedListener::runInLane(const ipc::ServedMethod& method, Task task) {
  const std::string name(method.lane);
  {
    const std::scoped_lock lock(mutex_);
    Lane& lane = lanes_[name];
    if (lane.running >= method.lane_width) {
      lane.waiting.push_back(std::move(task));
      return;
    }
    ++lane.running;
  }
  startLaneTask(name, std::move(task));
}

void SimulatedListener::startLaneTask(const std::string& lane, Task task) {
  global_.async([this, lane, task = std::move(task)]() mutable {
    task();
    task = nullptr;
    laneTaskEnded(lane);
  });
}

void SimulatedListener::laneTaskEnded(const std::string& lane_name) {
  Task next;
  {
    const std::scoped_lock lock(mutex_);
    Lane& lane = lanes_[lane_name];
    if (lane.waiting.empty()) {
      --lane.running;
      return;
    }
    next = std::move(lane.waiting.front());
    lane.waiting.pop_front();
  }
  startLaneTask(lane_name, std::move(next));
}

void SimulatedListener::abandon() {
  std::map<std::string, Lane> lanes;
  const std::scoped_lock lock(mutex_);
  resumed_ = false;
  for (auto& [name, lane] : lanes_) lanes[name].waiting.swap(lane.waiting);
}

}  // namespace spacekeep::sim
