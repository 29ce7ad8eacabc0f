// The daemon's own part of the client state. Clients are promised that a change is on the disk when
// it is answered; the daemon's record of recent statistics is worth less than the time and the wear
// of a write for each answer, so it is seen at once and written late, many changes in one.
#include <utility>
#include <variant>

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "purgeable/recent_archive.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

/// Marks the entry of the synchronous read in the log.
constexpr int kReadEntryLine = 622;

constexpr const char* kTooLarge = "a record is too large for a property list";

}  // namespace

// Without a suite there is no state to keep anything in.
void Spacekeep::clientSetStateSync(StateObject value, const std::string& key) {
  defaults_queue_->assertCurrent("clientSetStateSync");
  if (!user_defaults_) return;
  const bool is_record = std::holds_alternative<LateChanges::Record>(value);
  const auto* plain = std::get_if<Value>(&value);
  const ipc::OptionalValue stored = plain == nullptr ? std::nullopt : std::optional(*plain);
  late_changes_.set(key, std::move(value));
  if (!is_record) actOnChange(key, stored);
  writeSoon();
}

StateObject Spacekeep::clientGetStateSync(const std::string& key) {
  logTrace("%s ENTRY", "clientGetStateSync");
  defaults_queue_->assertCurrent("clientGetStateSync");
  logTrace("%s %d", "clientGetStateSync", kReadEntryLine);
  StateObject answer;
  if (const auto record = late_changes_.recordAt(key)) {
    // The same read for whoever follows it in the log, without the way through bytes.
    logTrace("%s ENTRY", "_clientGetState");
    answer = record;
    logTrace("%s EXIT", "_clientGetState");
  } else {
    _clientGetState(key, [&](ipc::OptionalValue value) {
      if (value) answer = recordOf(key, std::move(*value));
    });
  }
  logTrace("%s EXIT", "clientGetStateSync");
  return answer;
}

StateObject Spacekeep::recordOf(const std::string& key, Value value) {
  const Data* archive = value.data();
  if (archive == nullptr) return value;
  if (auto known = late_changes_.writtenRecord(key, *archive)) return known;
  auto parsed = recentInfoFromArchive(*archive);
  if (!parsed) {
    logProblem("%s the bytes of %@ are not an archive of this version and count as absent",
               "clientGetStateSync", key);
    return {};
  }
  auto record = std::make_shared<SpacekeepRecentInfo>(std::move(*parsed));
  late_changes_.keepWritten(key, record, *archive);
  return record;
}

void Spacekeep::writeSoon() {
  if (late_write_is_due_ || !user_defaults_) return;
  late_write_is_due_ = true;
  platform_.after(kLateWriteDelayNs, [weak = weak_from_this()] {
    const auto daemon = weak.lock();
    if (!daemon) return;
    daemon->defaults_queue_->async([daemon] { daemon->writeNow(); });
  });
}

// Laid over what stands on the disk by now, which others may have changed since. What does not get
// there stays in memory, seen as before and in nobody's way, until the next change tries again.
void Spacekeep::writeNow() {
  late_write_is_due_ = false;
  if (!user_defaults_ || !late_changes_.areAny()) return;
  Dictionary state = storedState();
  late_changes_.layOver(state);
  auto why = writeOut(std::move(state));
  if (!why) late_changes_.wereWritten();
  if (!why && late_changes_.areAny()) why = kTooLarge;
  if (why) logProblem("%s recent statistics are not on the disk: %@", "writeNow", *why);
}

}  // namespace spacekeep
