#include "support/ipc/linux/owned_message.h"

#include <algorithm>
#include <string_view>
#include <utility>

#include "support/ipc/arguments.h"
#include "support/ipc/linux/wire_text.h"

namespace spacekeep::ipc {

namespace {

constexpr std::size_t kMaxErrorText = 2048;

}  // namespace

OwnedMessage callOfSerial(sd_bus* bus, std::uint64_t serial, const char* sender,
                          const char* member) {
  sd_bus_message* call = nullptr;
  if (sd_bus_message_new_method_call(bus, &call, nullptr, kObjectPath, nullptr, member) < 0) {
    return nullptr;
  }
  OwnedMessage owned(call);
  // The answer goes to whom the call names as its sender.
  if (sender != nullptr && sd_bus_message_set_sender(call, sender) < 0) return nullptr;
  return sd_bus_message_seal(call, serial, 0) < 0 ? nullptr : std::move(owned);
}

OwnedMessage errorAnswer(sd_bus_message* call, const char* error_name, const std::string& text) {
  const std::string words = wireText(std::string_view(text).substr(0, kMaxErrorText));
  const sd_bus_error error{error_name, words.c_str(), 0};
  sd_bus_message* made = nullptr;
  if (sd_bus_message_new_method_error(call, &made, &error) < 0) return nullptr;
  return OwnedMessage(made);
}

std::size_t errorAnswerBytes(const std::string& text) {
  return 128 + std::min(text.size(), kMaxErrorText);
}

}  // namespace spacekeep::ipc
