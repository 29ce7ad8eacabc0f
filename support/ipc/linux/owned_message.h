// Thread safety: as the message that is owned.
#pragma once

#include <systemd/sd-bus.h>

#include <cstdint>
#include <memory>
#include <string>

namespace spacekeep::ipc {

struct MessageUnref {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using OwnedMessage = std::unique_ptr<sd_bus_message, MessageUnref>;

/// A call as sd-bus wants to see it to make an answer from, when the real one has been let go of or
/// was never read: nothing but its serial matters, and `sender` where there is more than one (null
/// otherwise); its member only to who looks at it. Null when it cannot be made.
[[nodiscard]] OwnedMessage callOfSerial(sd_bus* bus, std::uint64_t serial, const char* sender,
                                        const char* member = "Answered");

/// The answer to `call` that says what is wrong with it. Null when it cannot be made.
[[nodiscard]] OwnedMessage errorAnswer(sd_bus_message* call, const char* error_name,
                                       const std::string& text);
/// About its size.
[[nodiscard]] std::size_t errorAnswerBytes(const std::string& text);

}  // namespace spacekeep::ipc
