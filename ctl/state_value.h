// Thread safety: pure functions.
//
// Values of the client state as people write them on a command line and read them in a table.
#pragma once

#include <string>
#include <string_view>
#include <variant>

#include "support/values/value.h"

namespace spacekeep::ctl {

enum class ValueType {
  kGuessed,  ///< true and false, numbers, sizes with a unit; everything else is a string
  kString,
  kNumber,
  kBool,
  kSize,
  kJson,  ///< arrays and dictionaries too
};

/// What is wrong with a text, for the person who wrote it.
struct ValueError {
  std::string text;
};

[[nodiscard]] std::variant<Value, ValueError> parseStateValue(std::string_view text,
                                                              ValueType type);

/// One line: data as "<12 bytes>" (it says nothing to a person), everything else as logs show it.
[[nodiscard]] std::string printStateValue(const Value& value);

/// "a boolean", "a number", ...
[[nodiscard]] std::string kindText(const Value& value);

}  // namespace spacekeep::ctl
