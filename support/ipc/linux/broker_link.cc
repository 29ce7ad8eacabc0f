#include "support/ipc/linux/broker_link.h"

#include <cstring>
#include <string_view>
#include <utility>

#include "support/ipc/error_names.h"

namespace spacekeep::ipc {

namespace {

constexpr const char* kBrokerPath = "/org/freedesktop/DBus";
constexpr std::size_t kQuestionBytes = 256;
/// What a queued message takes besides its bytes, so that many small ones count, too.
constexpr std::size_t kMessageOverhead = 512;
/// Questions to the broker are the daemon's own.
constexpr uid_t kNobody = static_cast<uid_t>(-1);

// What RequestName answers, in the D-Bus specification.
constexpr std::uint32_t kPrimaryOwner = 1;
constexpr std::uint32_t kInQueue = 2;
constexpr std::uint32_t kAlreadyOwner = 4;

bool isText(const char* text, std::string_view wanted) { return text != nullptr && text == wanted; }

}  // namespace

BrokerLink::BrokerLink(IpcLoop& loop, Owner& owner, std::string name, const LinkLimits& limits,
                       std::size_t queued_bytes_per_user)
    : owner_(owner),
      name_(std::move(name)),
      queued_bytes_per_user_(queued_bytes_per_user),
      link_(loop, *this, Authentication::Role::kClient, limits, Traffic::kOfABus) {}

OwnedMessage BrokerLink::question(const char* member) {
  sd_bus_message* made = nullptr;
  if (bus() == nullptr || sd_bus_message_new_method_call(bus(), &made, kBrokerName, kBrokerPath,
                                                         kBrokerName, member) < 0) {
    return nullptr;
  }
  return OwnedMessage(made);
}

void BrokerLink::ask(OwnedMessage question, Answer answer) {
  std::uint64_t serial = 0;
  if (question != nullptr && transmit(question.get(), {kNobody, kQuestionBytes}, &serial)) {
    asked_.emplace(serial, std::move(answer));
  }
}

void BrokerLink::askForCredentials(const std::string& sender, Answer answer) {
  OwnedMessage call = question("GetConnectionCredentials");
  if (call == nullptr || sd_bus_message_append_basic(call.get(), 's', sender.c_str()) < 0) return;
  ask(std::move(call), std::move(answer));
}

void BrokerLink::linkReady() {
  ask(question("Hello"), [this](sd_bus_message* answer) {
    if (sd_bus_message_is_method_error(answer, nullptr) > 0) {
      refused("does not take this process", answer);
    } else {
      askForName();
    }
  });
}

/// Whoever has the name keeps it; without a flag that forbids it, the broker then puts this process
/// into the queue for it.
void BrokerLink::askForName() {
  OwnedMessage call = question("RequestName");
  if (call == nullptr || sd_bus_message_append(call.get(), "su", name_.c_str(), 0U) < 0) {
    return fail("the name " + name_ + " cannot be asked for");
  }
  ask(std::move(call), [this](sd_bus_message* answer) { named(answer); });
}

void BrokerLink::named(sd_bus_message* answer) {
  std::uint32_t result = 0;
  if (sd_bus_message_is_method_error(answer, nullptr) > 0) {
    return refused("does not give the name " + name_, answer);
  }
  if (sd_bus_message_read_basic(answer, 'u', &result) <= 0) result = 0;
  if (result == kPrimaryOwner || result == kAlreadyOwner) {
    owner_.brokerNamed(true);
  } else if (result == kInQueue) {
    owner_.brokerNamed(false);
  } else {
    fail("the bus does not give the name " + name_);
  }
}

void BrokerLink::linkMessage(sd_bus_message* message) {
  std::uint8_t type = 0;
  if (sd_bus_message_get_type(message, &type) < 0) return;
  // Nobody but the broker can have its name as the sender: it writes the sender itself.
  if (isText(sd_bus_message_get_sender(message), kBrokerName)) {  // tidy-allow: the broker wrote it
    fromBroker(message, type);
  } else if (type == SD_BUS_MESSAGE_METHOD_CALL) {
    owner_.brokerCall(message, link_.messageBytes());
  }
}

void BrokerLink::fromBroker(sd_bus_message* message, std::uint8_t type) {
  std::uint64_t serial = 0;
  if (type == SD_BUS_MESSAGE_METHOD_RETURN || type == SD_BUS_MESSAGE_METHOD_ERROR) {
    if (sd_bus_message_get_reply_cookie(message, &serial) < 0) return;
    // Errors also come for answers whose receiver has left; nobody waits for those.
    const auto asked = asked_.extract(serial);
    if (!asked.empty()) asked.mapped()(message);
    return;
  }
  const char* name = nullptr;
  if (sd_bus_message_is_signal(message, kBrokerName, "NameAcquired") > 0 &&
      sd_bus_message_read_basic(message, 's', &name) > 0 && isText(name, name_)) {
    owner_.brokerNamed(true);
  }
}

void BrokerLink::send(sd_bus_message* message, std::size_t bytes, uid_t uid) {
  if (queuedBytes(uid) > queued_bytes_per_user_) return;
  transmit(message, {uid, bytes + kMessageOverhead}, nullptr);
}

bool BrokerLink::transmit(sd_bus_message* message, Queued queued, std::uint64_t* serial) {
  const auto sent = link_.send(message, queued.bytes);
  if (!sent) return false;
  queued_.push_back(queued);
  queued_bytes_[queued.uid] += queued.bytes;
  forgetTaken();
  if (serial != nullptr) *serial = *sent;
  return true;
}

void BrokerLink::forgetTaken() {
  while (queued_.size() > link_.queuedMessages()) {
    const auto of_user = queued_bytes_.find(queued_.front().uid);
    of_user->second -= queued_.front().bytes;
    if (of_user->second == 0) queued_bytes_.erase(of_user);
    queued_.pop_front();
  }
}

std::size_t BrokerLink::queuedBytes(uid_t uid) {
  forgetTaken();
  const auto found = queued_bytes_.find(uid);
  return found == queued_bytes_.end() ? 0 : found->second;
}

/// By the name of the error: its text names this connection, which is another one each time, and so
/// would make each try a new problem.
void BrokerLink::refused(const std::string& what, sd_bus_message* answer) {
  const sd_bus_error* error = sd_bus_message_get_error(answer);
  const std::string name = error == nullptr || error->name == nullptr ? "no reason" : error->name;
  const bool is_denied = name == kErrorAccessDenied;
  fail("the bus " + what + " (" + name + ")" + (is_denied ? "; is its policy installed?" : ""));
}

void BrokerLink::fail(const std::string& why) {
  close();
  owner_.brokerEnded(why);
}

void BrokerLink::linkEnded(LinkEnd, const std::string& why) { owner_.brokerEnded(why); }

}  // namespace spacekeep::ipc
