// Thread safety: pure functions.
//
// Text as D-Bus strings can carry it.
#pragma once

#include <string>
#include <string_view>

namespace spacekeep::ipc {

/// `text` with each byte that belongs to no character that sd-bus accepts (valid UTF-8, no NUL, no
/// noncharacter) replaced by U+FFFD, so that one odd string never costs a whole answer.
[[nodiscard]] std::string wireText(std::string_view text);

}  // namespace spacekeep::ipc
