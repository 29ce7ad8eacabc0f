// Thread safety: confined to the IPC thread.
//
// Reads the arguments of a D-Bus message that anybody may have written. In variants every integer
// type and double become numbers, s o g text, ay data, every other array an array, dictionaries
// with text keys dictionaries, (sx) with the word "date" a date; variants inside variants are
// unwrapped. Other structures, other keys, descriptors inside values and nesting deeper than
// kMaxValueDepth are refused, and so are more than kMaxValuesInMessage values in one message, since
// a value takes many times the room of the byte that it may be on the wire.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "support/ipc/arguments.h"
#include "support/ipc/linux/sockets.h"
#include "support/values/value.h"

namespace spacekeep::ipc {

inline constexpr std::size_t kMaxValuesInMessage = 65'536;

class WireReader {
 public:
  /// A descriptor argument that does not satisfy `rules` is read as one with a problem.
  WireReader(sd_bus_message* message, const EndpointRules& rules)
      : message_(message), rules_(rules) {}

  /// None when the message does not hold what is described; problem() then says which argument
  /// should be what.
  [[nodiscard]] std::optional<Arguments> read(const std::vector<ArgumentDescription>& described);
  [[nodiscard]] const std::string& problem() const { return problem_; }

 private:
  bool checkSignature(const std::vector<ArgumentDescription>& described);
  std::optional<Argument> readArgument(ArgumentKind kind);
  std::optional<Argument> readDescriptor();
  template <class Element, class Read>
  std::optional<Argument> readOptional(const char* contents, Read read);
  std::optional<Value> readValue(int depth, int wrappings = 0);
  std::optional<Value> readNumber(char type);
  std::optional<Value> readArray(const char* contents, int depth);
  std::optional<Value> readDate(const char* contents);
  std::optional<Dictionary> readDictionary(const char* contents, int depth);
  bool readEntry(std::vector<Dictionary::Entry>& entries, const char* contents, int depth);
  std::optional<std::string> readText(char type);
  template <class Wire, class Number>
  std::optional<Value> readAs(char type);
  std::nullopt_t refuse(const char* why);
  std::nullopt_t malformed() { return refuse("is malformed"); }

  sd_bus_message* message_;
  EndpointRules rules_;
  std::string problem_;
  std::size_t values_ = 0;
};

}  // namespace spacekeep::ipc
