#include "support/ipc/linux/bus_caller.h"

#include <algorithm>
#include <utility>

#include "support/ipc/error_names.h"

namespace spacekeep::ipc {

std::string useTheSocketInstead(const std::string& socket) {
  std::string text =
      "Descriptors are not taken over the bus; connect to the daemon's socket instead";
  if (!socket.empty()) text += ", " + socket;
  return text;
}

BusCaller::BusCaller(std::shared_ptr<ServerContext> context, std::shared_ptr<AcceptedPeer> peer,
                     std::string name, BrokerLink& link, HeldBudget& budget)
    : CallServer(std::move(context), std::move(peer)),
      name_(std::move(name)),
      link_(&link),
      budget_(&budget) {}

void BusCaller::end() {
  link_ = nullptr;
  if (budget_ != nullptr) budget_->giveBack(identity().uid(), held_.bytes());
  budget_ = nullptr;
  held_ = {};
}

void BusCaller::take(sd_bus_message* call, std::size_t bytes) {
  if (link_ == nullptr) return;
  if (held_.empty() && !mustWait()) {
    serve(call, bytes);
  } else if (held_.size() >= context().options.limits.unanswered_calls ||
             !budget_->take(identity().uid(), bytes)) {
    refuse(call, kErrorLimitsExceeded,
           std::to_string(held_.size()) + " calls of this connection wait; wait for answers");
  } else {
    held_.add(call, bytes);
  }
}

bool BusCaller::mustWait() {
  const uid_t uid = identity().uid();
  if (context().pace.mayGoOn(uid)) return false;
  if (std::exchange(waiting_, true)) return true;
  context().pace.wait(uid, [weak = weak_from_this()] {
    const auto self = std::static_pointer_cast<BusCaller>(weak.lock());
    if (self == nullptr) return;
    self->waiting_ = false;
    self->serveHeld();
  });
  return true;
}

void BusCaller::serveHeld() {
  while (link_ != nullptr && !held_.empty() && !mustWait()) {
    const HeldCalls::Call next = held_.takeFirst();
    budget_->giveBack(identity().uid(), next.bytes);
    serve(next.message.get(), next.bytes);
  }
}

void BusCaller::serve(sd_bus_message* call, std::size_t bytes) {
  context().pace.spendOnMessage(identity().uid(), bytes);
  if (refusal().empty()) {
    dispatch(call, bytes);
  } else {
    refuse(call, kErrorAccessDenied, "The caller is refused: " + refusal());
  }
}

/// On the socket a refused peer loses its connection; here there is none to lose, so that each call
/// is told.
const std::string& BusCaller::refusal() {
  if (refusal_) return *refusal_;
  refusal_ = admissionRefusal();
  if (!refusal_->empty()) context().refusals.write(identity().describe(), *refusal_);
  return *refusal_;
}

void BusCaller::send(sd_bus_message* message, std::size_t bytes) {
  if (link_ != nullptr) link_->send(message, bytes, identity().uid());
}

/// The broker takes what everybody is answered over the same socket.
std::string BusCaller::answerProblem(std::size_t bytes) const {
  const std::size_t queued = link_ == nullptr ? 0 : link_->queuedBytes(identity().uid());
  if (queued == 0 || queued + bytes <= context().options.limits.queued_bytes) return "";
  return "Answers of " + std::to_string(queued) +
         " bytes to this user have not been taken by the bus yet; wait for them";
}

std::string BusCaller::methodProblem(const MethodDescription& method) const {
  return passesDescriptor(method) ? useTheSocketInstead(context().endpoint_rules.own_address) : "";
}

}  // namespace spacekeep::ipc
