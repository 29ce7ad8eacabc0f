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

}  // namespace

void Spacekeep::clientSetStateSync(StateObject value, const std::string& key) {
  defaults_queue_->assertCurrent("clientSetStateSync");
  if (auto* record = std::get_if<std::shared_ptr<SpacekeepRecentInfo>>(&value)) {
    keepRecord(std::move(*record), key);
  } else {
    auto* plain = std::get_if<Value>(&value);
    const ipc::OptionalValue stored = plain == nullptr ? std::nullopt : std::optional(*plain);
    changeState(stored, key);
    if (user_defaults_) actOnChange(key, stored);
  }
  writeSoon();
}

StateObject Spacekeep::clientGetStateSync(const std::string& key) {
  logTrace("%s ENTRY", "clientGetStateSync");
  defaults_queue_->assertCurrent("clientGetStateSync");
  logTrace("%s %d", "clientGetStateSync", kReadEntryLine);
  StateObject answer;
  if (key == kept_record_.key && kept_record_.isNewerThanState()) {
    // The same read for whoever follows it in the log, without the way through bytes.
    logTrace("%s ENTRY", "_clientGetState");
    answer = kept_record_.record;
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
  if (key == kept_record_.key && kept_record_.isArchivedAs(value)) return kept_record_.record;
  auto record = recentInfoFromArchive(*archive);
  if (!record) {
    logProblem("%s the bytes of %@ are not an archive of this version and count as absent",
               "clientGetStateSync", key);
    return {};
  }
  keepRecord(std::make_shared<SpacekeepRecentInfo>(std::move(*record)), key);
  kept_record_.archive = *archive;
  return kept_record_.record;
}

// One record is kept. Another key's gives way to it and goes on as bytes.
void Spacekeep::keepRecord(std::shared_ptr<SpacekeepRecentInfo> record, const std::string& key) {
  if (key != kept_record_.key) archiveKeptRecord();
  kept_record_ = {.key = key, .record = std::move(record)};
}

// Somebody wants the bytes. They are not written out by that.
void Spacekeep::archiveKeptRecord() {
  if (!user_defaults_ || !kept_record_.isNewerThanState()) return;
  KeptRecord archived = kept_record_;
  archived.archive = archivedRecentInfo(*archived.record);
  changeState(Value(*archived.archive), archived.key);
  kept_record_ = std::move(archived);
}

// Its bytes may have been among what did not get to the disk.
void Spacekeep::keepRecordToBeWritten(KeptRecord record) {
  kept_record_ = std::move(record);
  if (!kept_record_.record) return;
  kept_record_.archive.reset();
  writeSoon();
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

void Spacekeep::writeNow() {
  late_write_is_due_ = false;
  archiveKeptRecord();
  if (const auto why = user_defaults_->synchronize()) {
    logProblem("%s recent statistics are not on the disk: %@", "writeNow", *why);
  }
}

}  // namespace spacekeep
