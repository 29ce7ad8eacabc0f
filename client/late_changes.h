// Thread safety: none; confined to the daemon's defaults_queue.
//
// What the daemon itself has changed in the client state and has not brought to the disk yet, by
// key, to be laid over what stands there. A record stays an object until somebody wants its bytes,
// so that a thousand answers in a row need not turn it into bytes and back a thousand times. There
// is a record for each urgency at most, and the one for all of them.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "purgeable/recent_info.h"
#include "support/values/value.h"

namespace spacekeep {

/// What the daemon reads from its own state: nothing, a value, or a record.
using StateObject = std::variant<std::monostate, Value, std::shared_ptr<SpacekeepRecentInfo>>;

class LateChanges {
 public:
  using Record = std::shared_ptr<SpacekeepRecentInfo>;

  /// Nothing takes the key away.
  void set(const std::string& key, StateObject object);
  /// What stands on the disk under the key is newer.
  void forget(const std::string& key);
  /// What was laid over the state is on the disk; what stayed out of it remains.
  void wereWritten();

  [[nodiscard]] bool areAny() const { return !changes_.empty(); }
  /// Null when there is no change of that key, or one that holds no record.
  [[nodiscard]] Record recordAt(const std::string& key) const;
  /// What a client sees under the key, given what `state` holds; null when there is nothing. Good
  /// until either changes.
  [[nodiscard]] const Value* find(const std::string& key, const Dictionary& state);
  /// Leaves out a record that is too large to be turned into bytes.
  void layOver(Dictionary& state);

  /// The record on the disk that `archive` is the bytes of, as far as the daemon still has it.
  [[nodiscard]] Record writtenRecord(const std::string& key, const Data& archive) const;
  void keepWritten(const std::string& key, Record record, Data archive);

 private:
  struct Change {
    Record record;               ///< null for other values
    std::optional<Value> value;  ///< of a record: its bytes, once they were wanted. Else none: gone
  };
  struct Written {
    Record record;
    Data archive;
  };

  static void archive(Change& change);
  static bool hasNoBytes(const Change& change);

  std::map<std::string, Change> changes_;
  std::map<std::string, Written> written_;  // records only
};

}  // namespace spacekeep
