#include "ctl/state_table.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstddef>
#include <map>

#include "ctl/known_keys.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kGap = 2;
constexpr std::size_t kIndent = 2;
constexpr std::size_t kFewestValueCharacters = 16;

using Rows = std::map<std::string, std::string>;  // value text by key

Rows rowsOf(const Dictionary& state) {
  Rows rows;
  for (const auto& [key, value] : state) rows[key] = printValueOf(key, value);
  for (const auto& known : settableKeys()) {
    rows.try_emplace(std::string(known.name), fmt::format("({})", known.default_text));
  }
  return rows;
}

std::size_t widestKey(const Rows& rows) {
  std::size_t widest = 0;
  for (const auto& [key, value] : rows) widest = std::max(widest, displayWidth(harmless(key)));
  return widest;
}

std::string fitted(const std::string& text, std::size_t width, const Style& style) {
  return style.terminal ? shortened(text, width) : text;
}

/// The value beside the key where there is room, else below it.
std::string lineOf(const std::string& key, const std::string& value, std::size_t key_width,
                   const Style& style) {
  const std::string name = fitted(harmless(key), style.columns, style);
  const std::size_t before = std::min(key_width, style.columns) + kGap;
  const bool beside = !style.terminal || before + kFewestValueCharacters <= style.columns;
  if (beside) {
    const std::string shown = fitted(value, style.columns - std::min(before, style.columns), style);
    return padded(name, key_width) + std::string(kGap, ' ') + shown + "\n";
  }
  return name + "\n" + std::string(kIndent, ' ') + fitted(value, style.columns - kIndent, style) +
         "\n";
}

std::string meaningOf(const std::string& key, const Style& style) {
  const KnownKey* known = knownKey(key);
  if (known == nullptr) return "";
  return coloured(wrapped(known->meaning, style.columns, kIndent), Colour::kFaint, style) + "\n";
}

bool anyDefault(const Dictionary& state) {
  return std::ranges::any_of(
      settableKeys(), [&state](const KnownKey& known) { return !state.contains(known.name); });
}

std::string defaultsNote(const Style& style) {
  return "\n" + wrapped("In parentheses: not set, so this default holds.", style.columns, 0) + "\n";
}

}  // namespace

std::string stateTableOf(const Dictionary& state, const Style& style) {
  const Rows rows = rowsOf(state);
  const std::size_t key_width = widestKey(rows);
  std::string text;
  for (const auto& [key, value] : rows) {
    text += lineOf(key, value, key_width, style) + meaningOf(key, style);
  }
  return text + (anyDefault(state) ? defaultsNote(style) : "");
}

}  // namespace spacekeep::ctl
