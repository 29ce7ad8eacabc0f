#include "support/ipc/linux/bus_callers.h"

#include <algorithm>
#include <utility>

#include "support/ipc/error_names.h"
#include "support/ipc/linux/sender_credentials.h"

namespace spacekeep::ipc {

namespace {

// The broker answers at once, so that few are ever unknown.
constexpr std::size_t kMaxUnknown = 256;
constexpr std::size_t kMaxUnknownBytes = 16 * 1024 * 1024;

/// Answers to callers of whom nothing is known go on nobody's account.
constexpr uid_t kUnknownUser = static_cast<uid_t>(-1);

constexpr const char* kWaitForAnswers = "Too many calls wait; wait for answers";

}  // namespace

BusCallers::BusCallers(std::shared_ptr<ServerContext> context, BrokerLink& link)
    : context_(std::move(context)), link_(link), budget_(context_->options.limits.queued_bytes) {}

void BusCallers::take(sd_bus_message* call, std::size_t bytes) {
  const char* sender = sd_bus_message_get_sender(call);  // tidy-allow: the broker wrote it
  if (sender == nullptr || sender[0] != ':') return;     // no broker passes such a call on
  const auto known = callers_.find(std::string_view(sender));
  if (known == callers_.end()) return lookUp(sender, call, bytes);
  const std::shared_ptr<BusCaller> caller = known->second;
  caller->last_use = ++uses_;
  caller->take(call, bytes);
}

void BusCallers::lookUp(const std::string& name, sd_bus_message* call, std::size_t bytes) {
  const auto asked = unknown_.find(name);
  const bool is_new = asked == unknown_.end();
  const ServerLimits& limits = context_->options.limits;
  if ((is_new && unknown_.size() >= kMaxUnknown) || unknown_bytes_ + bytes > kMaxUnknownBytes ||
      (!is_new && (asked->second.size() >= limits.unanswered_calls ||
                   asked->second.bytes() + bytes > limits.queued_bytes))) {
    return refuse(call, kErrorLimitsExceeded, kWaitForAnswers);
  }
  unknown_[name].add(call, bytes);
  unknown_bytes_ += bytes;
  if (!is_new) return;
  // The link belongs to the same owner, and asks nobody back once that one is gone.
  link_.askForCredentials(name, [this, name](sd_bus_message* answer) { found(name, answer); });
}

void BusCallers::found(const std::string& name, sd_bus_message* answer) {
  auto entry = unknown_.extract(name);
  if (entry.empty()) return;
  HeldCalls calls = std::move(entry.mapped());
  unknown_bytes_ -= calls.bytes();
  const bool failed = sd_bus_message_is_method_error(answer, nullptr) > 0;
  auto identity = failed ? nullptr : identityFromCredentials(answer);
  if (identity == nullptr) {
    return refuseAll(std::move(calls), kErrorAccessDenied,
                     "The bus does not tell who the caller is");
  }
  const uid_t uid = identity->uid();
  if (!makeRoom(uid)) {
    return refuseAll(std::move(calls), kErrorLimitsExceeded,
                     "Too many callers of the bus are served");
  }
  context_->pace.spendOnConnection(uid);
  const auto caller = std::make_shared<BusCaller>(
      context_, std::make_shared<AcceptedPeer>(std::move(identity)), name, link_, budget_);
  caller->last_use = ++uses_;
  callers_.emplace(name, caller);
  while (!calls.empty()) {
    const HeldCalls::Call call = calls.takeFirst();
    caller->take(call.message.get(), call.bytes);
  }
}

/// Names of connections that are gone stay until their room is needed: that costs less than to be
/// told of each that leaves the bus.
bool BusCallers::makeRoom(uid_t uid) {
  const ServerLimits& limits = context_->options.limits;
  const auto of_user = [uid](const BusCaller& caller) { return caller.identity().uid() == uid; };
  const auto count = std::ranges::count_if(
      callers_, [&of_user](const auto& entry) { return of_user(*entry.second); });
  if (static_cast<std::size_t>(count) >= limits.connections_per_uid) return forgetIdle(of_user);
  return callers_.size() < limits.connections || forgetIdle([](const BusCaller&) { return true; });
}

/// The one that was quiet for longest. Answers whether there was one.
bool BusCallers::forgetIdle(const std::function<bool(const BusCaller&)>& may_be_forgotten) {
  auto oldest = callers_.end();
  for (auto entry = callers_.begin(); entry != callers_.end(); ++entry) {
    const BusCaller& caller = *entry->second;
    if (!caller.isIdle() || !may_be_forgotten(caller)) continue;
    if (oldest == callers_.end() || caller.last_use < oldest->second->last_use) oldest = entry;
  }
  if (oldest == callers_.end()) return false;
  oldest->second->end();
  callers_.erase(oldest);
  return true;
}

void BusCallers::tellLeftOut(const LeftOut& message) {
  const auto& header = message.header;
  if (!header || header->fixed.type != kWireCall || !header->sender || !header->member ||
      (header->fixed.flags & kWireNoReplyExpected) != 0 || link_.bus() == nullptr) {
    return;
  }
  const OwnedMessage call = callOfSerial(link_.bus(), header->fixed.serial, header->sender->c_str(),
                                         header->member->c_str());
  if (call == nullptr) return;
  if (message.brings_descriptors) {
    refuse(call.get(), kErrorNotSupported,
           useTheSocketInstead(context_->endpoint_rules.own_address));
  } else {
    refuse(call.get(), kErrorLimitsExceeded,
           "The message has " + std::to_string(message.bytes) + " bytes, more than " +
               std::to_string(context_->options.limits.message_bytes));
  }
}

void BusCallers::refuse(sd_bus_message* call, const char* error_name, const std::string& text) {
  const char* member = sd_bus_message_get_member(call);
  context_->refused_calls.write("a caller of the bus", text, member == nullptr ? "" : member);
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  const OwnedMessage answer = errorAnswer(call, error_name, text);
  if (answer != nullptr) link_.send(answer.get(), errorAnswerBytes(text), kUnknownUser);
}

void BusCallers::refuseAll(HeldCalls calls, const char* error_name, const std::string& text) {
  while (!calls.empty()) refuse(calls.takeFirst().message.get(), error_name, text);
}

void BusCallers::clear() {
  for (const auto& [name, caller] : callers_) caller->end();
  callers_.clear();
  unknown_.clear();
  unknown_bytes_ = 0;
}

}  // namespace spacekeep::ipc
