#include "client/late_changes.h"

#include <utility>

#include "purgeable/recent_archive.h"

namespace spacekeep {

// The record on the disk may be the very object that is set, changed: its bytes are then older.
void LateChanges::set(const std::string& key, StateObject object) {
  written_.erase(key);
  Change change;
  if (auto* record = std::get_if<Record>(&object)) change.record = std::move(*record);
  if (auto* value = std::get_if<Value>(&object)) change.value = std::move(*value);
  changes_.insert_or_assign(key, std::move(change));
}

void LateChanges::forget(const std::string& key) { changes_.erase(key); }

void LateChanges::wereWritten() {
  for (auto change = changes_.begin(); change != changes_.end();) {
    Change& written = change->second;
    if (hasNoBytes(written) || (written.record && !written.value)) {
      ++change;
      continue;
    }
    if (written.record && written.value) {
      keepWritten(change->first, std::move(written.record), *written.value->data());
    }
    change = changes_.erase(change);
  }
}

LateChanges::Record LateChanges::recordAt(const std::string& key) const {
  const auto found = changes_.find(key);
  return found == changes_.end() ? nullptr : found->second.record;
}

const Value* LateChanges::find(const std::string& key, const Dictionary& state) {
  const auto found = changes_.find(key);
  if (found == changes_.end()) return state.find(key);
  Change& change = found->second;
  archive(change);
  if (hasNoBytes(change)) return state.find(key);
  return change.value ? &*change.value : nullptr;
}

void LateChanges::layOver(Dictionary& state) {
  for (auto& entry : changes_) {
    Change& change = entry.second;
    archive(change);
    if (hasNoBytes(change)) continue;
    if (change.value) {
      state.set(entry.first, *change.value);
    } else {
      state.remove(entry.first);
    }
  }
}

LateChanges::Record LateChanges::writtenRecord(const std::string& key, const Data& archive) const {
  const auto found = written_.find(key);
  if (found == written_.end() || found->second.archive != archive) return nullptr;
  return found->second.record;
}

void LateChanges::keepWritten(const std::string& key, Record record, Data archive) {
  written_.insert_or_assign(key, Written{std::move(record), std::move(archive)});
}

void LateChanges::archive(Change& change) {
  if (change.record && !change.value) change.value = Value(archivedRecentInfo(*change.record));
}

bool LateChanges::hasNoBytes(const Change& change) {
  return change.record && change.value && change.value->data()->bytes.empty();
}

}  // namespace spacekeep
