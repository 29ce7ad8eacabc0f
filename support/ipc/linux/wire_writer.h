// Thread safety: confined to the IPC thread.
//
// Writes arguments into a D-Bus message. A value becomes a variant: text s, boolean b, signed x,
// unsigned t, floating d, data ay, array av, dictionary a{sv}, and a date the structure (sx) with
// the word "date" and nanoseconds since 1970, since D-Bus has no date of its own.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <string_view>
#include <vector>

#include "support/ipc/arguments.h"
#include "support/values/value.h"

namespace spacekeep::ipc {

inline constexpr const char* kDateTag = "date";

class WireWriter {
 public:
  explicit WireWriter(sd_bus_message* message) : message_(message) {}

  /// False when an argument is of another kind than described, is nested deeper than
  /// kMaxValueDepth, or does not fit into a message. The message is then of no use.
  bool write(const std::vector<ArgumentDescription>& described, const Arguments& arguments);
  /// How large the message has become: its body to the byte, its header at most.
  [[nodiscard]] std::size_t bytes() const { return kMostHeaderBytes + body_bytes_; }
  /// Path, interface, member or error, destination, signature and numbers of any message.
  static constexpr std::size_t kMostHeaderBytes = 512;

 private:
  bool writeArgument(ArgumentKind kind, const Argument& argument);
  bool writeDictionary(const Dictionary& dictionary, int depth);
  bool writeVariant(const Value& value, int depth);
  bool writeContent(const Value& value, int depth);
  bool writeText(std::string_view text);
  bool writeBasic(char type, const void* value);
  bool open(char type, const char* contents);
  bool close();
  void count(std::size_t alignment, std::size_t bytes);

  sd_bus_message* message_;
  std::size_t body_bytes_ = 0;
};

}  // namespace spacekeep::ipc
