// Values of every kind, as peers may send them and services may answer them: as a document, as a
// message, as a line of the log, and as JSON.
#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "ctl/json_text.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/value_maker.h"
#include "support/ipc/linux/authenticated_bus.h"
#include "support/ipc/linux/sockets.h"
#include "support/ipc/linux/wire_reader.h"
#include "support/ipc/linux/wire_writer.h"
#include "support/values/text.h"

namespace spacekeep::ipc {
namespace {

using fuzz::isSame;
using fuzz::require;

struct DropMessage {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, DropMessage>;

/// Messages can only be made for a bus; nothing is ever sent over this one.
Message newMessage() {
  static const SocketPair kPair = makeSocketPair();
  static sd_bus* const kBus = makeAuthenticatedBus(kPair.first->fd()).bus;
  sd_bus_message* raw = nullptr;
  const int made =
      sd_bus_message_new_method_call(kBus, &raw, nullptr, kObjectPath, nullptr, "call");
  require(made >= 0, "a message can be made");
  return Message(raw);
}

/// None when the message cannot hold it.
OptionalValue throughMessage(const Value& value) {
  static const std::vector<ArgumentDescription> kDescription{
      {"value", ArgumentKind::kOptionalValue}};
  const Message message = newMessage();
  WireWriter writer(message.get());
  if (!writer.write(kDescription, {OptionalValue(value)})) return std::nullopt;
  require(sd_bus_message_seal(message.get(), 1, 0) >= 0, "a written message is whole");
  WireReader reader(message.get(), EndpointRules{});
  const auto arguments = reader.read(kDescription);
  require(arguments.has_value(), "what was written into a message can be read");
  const auto& read = std::get<OptionalValue>(arguments->front());
  require(read.has_value(), "a value does not get lost on the way");
  return *read;
}

void examine(const Value& value) {
  require(fuzz::isOneLine(textOf(Value(Array{value}))), "a value is shown as one line");
  require(textOf(value).size() <= kMaxTextBytes + 16, "the text of a value is bounded");
  require(ctl::jsonOf(value).find('\n') == std::string::npos, "JSON is one line");
  require(isUtf8(ctl::jsonOf(value)), "JSON is UTF-8");
  fuzz::requireStableRoundTrip(value);
  const OptionalValue arrived = throughMessage(value);
  if (!arrived) return;
  fuzz::requireStableRoundTrip(*arrived);
  const OptionalValue again = throughMessage(*arrived);
  require(again.has_value() && isSame(*again, *arrived), "a value arrives as it left");
}

void requireNumbersWithinRange(const Value& value) {
  require(value.isNumber() == value.asUnsigned().has_value(), "each number has an unsigned form");
  require(value.isNumber() == value.asSigned().has_value(), "each number has a signed form");
  require(value.isNumber() == value.asDouble().has_value(), "each number has a floating form");
}

}  // namespace
}  // namespace spacekeep::ipc

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace spacekeep;
  fuzz::ValueMaker maker(fuzz::inputOf(data, size), {"key", "text", "\xc3\xa9", ""});
  const Value value = maker.value();
  ipc::examine(value);
  ipc::requireNumbersWithinRange(value);
  const Value other = maker.value();
  fuzz::require((value == other) == (other == value), "equality has no direction");
  return 0;
}
