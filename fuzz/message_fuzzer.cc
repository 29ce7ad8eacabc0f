// The body of a message, from bytes on a socket to arguments: a signature, a zero byte, and the
// contents. Around it goes a header that sd-bus accepts, so that all the work is in the body.
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "client/client_protocol.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/wire_bytes.h"
#include "support/ipc/linux/authenticated_bus.h"
#include "support/ipc/linux/sockets.h"
#include "support/ipc/linux/wire_reader.h"
#include "support/ipc/linux/wire_writer.h"
#include "support/values/text.h"

namespace spacekeep::ipc {
namespace {

using fuzz::require;

std::string messageWith(std::string_view signature, std::string_view body) {
  const fuzz::MessageHead head{
      .path = kObjectPath, .member = "call", .signature = std::string(signature)};
  return fuzz::messageBytes(head, body);
}

class Bus {
 public:
  explicit Bus(int fd) : bus_(makeAuthenticatedBus(fd).bus) {
    require(bus_ != nullptr, "the fuzzer has descriptors left");
  }
  ~Bus() { sd_bus_close_unref(bus_); }
  Bus(const Bus&) = delete;
  Bus& operator=(const Bus&) = delete;

  /// The one message that was sent, null when sd-bus did not take it.
  sd_bus_message* receive() {
    for (int steps = 0; steps < 8; ++steps) {
      sd_bus_message* message = nullptr;
      if (sd_bus_process(bus_, &message) <= 0) return nullptr;
      if (message != nullptr) return message;
    }
    return nullptr;
  }
  [[nodiscard]] sd_bus* get() { return bus_; }

 private:
  sd_bus* bus_;
};

using Description = std::vector<ArgumentDescription>;

/// What was read can be written, and reads as the same again.
void requireRoundTrip(sd_bus* bus, const Description& described, const Arguments& arguments) {
  sd_bus_message* copy = nullptr;
  require(sd_bus_message_new_method_call(bus, &copy, nullptr, kObjectPath, nullptr, "call") >= 0,
          "a message can be made");
  WireWriter writer(copy);
  const bool written = writer.write(described, arguments);
  require(written, "arguments that were read can be written");
  require(sd_bus_message_seal(copy, 1, 0) >= 0, "a written message is whole");
  WireReader reader(copy, EndpointRules{});
  const auto again = reader.read(described);
  require(again.has_value(), "arguments that were written can be read");
  sd_bus_message_unref(copy);
}

void requirePresentable(const Arguments& arguments) {
  for (const Argument& argument : arguments) {
    if (const auto* dictionary = std::get_if<Dictionary>(&argument)) {
      require(fuzz::isOneLine(textOf(*dictionary)), "a dictionary is shown as one line");
    }
    if (const auto* value = std::get_if<OptionalValue>(&argument); value && *value) {
      require(fuzz::isOneLine(textOf(Value(Array{**value}))), "a value is shown as one line");
      fuzz::requireStableRoundTrip(**value);
    }
  }
}

void readAs(sd_bus* bus, sd_bus_message* message, const Description& described) {
  sd_bus_message_rewind(message, 1);
  WireReader reader(message, EndpointRules{});
  const auto arguments = reader.read(described);
  if (!arguments) {
    require(!reader.problem().empty(), "a refusal says why");
    return;
  }
  require(matches(described, *arguments), "the arguments are of the kinds that were asked for");
  requirePresentable(*arguments);
  requireRoundTrip(bus, described, *arguments);
}

std::vector<Description> everyDescription() {
  std::vector<Description> all;
  for (int kind = 0; kind <= static_cast<int>(ArgumentKind::kDescriptor); ++kind) {
    all.push_back({{"argument", static_cast<ArgumentKind>(kind)}});
  }
  for (const MethodDescription& method : spacekeepClientInterface().methods) {
    all.push_back(method.in);
    all.push_back(method.out);
  }
  return all;
}

void examine(std::string_view signature, std::string_view body) {
  static const std::vector<Description> kDescriptions = everyDescription();
  const SocketPair pair = makeSocketPair();
  require(pair.first != nullptr, "the fuzzer has descriptors left");
  Bus bus(pair.first->fd());
  const std::string bytes = messageWith(signature, body);
  const ssize_t sent = ::send(pair.second->fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
  if (sent != static_cast<ssize_t>(bytes.size())) return;
  sd_bus_message* message = bus.receive();
  if (message == nullptr) return;
  for (const Description& described : kDescriptions) readAs(bus.get(), message, described);
  sd_bus_message_unref(message);
}

}  // namespace
}  // namespace spacekeep::ipc

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string input = spacekeep::fuzz::textOfInput(data, size);
  const std::size_t end = input.find('\0');
  if (end == std::string::npos || end > 255) return -1;
  const std::string_view text = input;
  spacekeep::ipc::examine(text.substr(0, end), text.substr(end + 1));
  return 0;
}
