// Thread safety: confined to one queue at a time; the daemon uses its suite on `defaults_queue` only.
//
// A named store of property-list values that survives restarts.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "support/values/value.h"

namespace spacekeep {

class PreferencesSuite {
 public:
  virtual ~PreferencesSuite() = default;

  /// Writes out what was set since the last call, durably, and picks up what is on disk. Answers
  /// none on success, else what went wrong in words.
  [[nodiscard]] virtual std::optional<std::string> synchronize() = 0;
  /// Picks up what is on disk and writes nothing: a read does not pay for a write that was put off.
  /// Answers as synchronize().
  [[nodiscard]] virtual std::optional<std::string> refresh() = 0;
  /// Null when there is none. Good until the suite is changed, written out or refreshed.
  [[nodiscard]] virtual const Value* find(std::string_view key) const = 0;
  /// A copy of it.
  [[nodiscard]] std::optional<Value> get(std::string_view key) const {
    const Value* value = find(key);
    return value == nullptr ? std::nullopt : std::optional(*value);
  }
  /// Seen by find() at once, on disk after synchronize(). None removes the key.
  virtual void set(std::string_view key, std::optional<Value> value) = 0;
  /// Forgets what was set for `key` and is not on disk yet, so that it never gets there.
  virtual void discard(std::string_view key) = 0;
};

}  // namespace spacekeep
