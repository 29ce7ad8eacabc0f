// The client state: one dictionary in the preferences suite, read and written whole. Everything
// here runs on defaults_queue.
#include <utility>

#include "client/state_settings.h"
#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"

namespace spacekeep {

void Spacekeep::_clientSetState(ipc::OptionalValue value, const std::string& key,
                                const EmptyReply& reply, const StoreFailure& failed) {
  defaults_queue_->assertCurrent("_clientSetState");
  const std::optional<std::string> why = writeState(value, key);
  if (why) {
    logProblem("%s %@ is not on the disk: %@", "_clientSetState", key, *why);
    if (failed) return failed(*why);
  }
  actOnChange(key, value);
  if (reply) reply();
}

// The answer tells what is on the disk, so a change that did not get there is taken back: nobody
// shall find later what was said not to be stored.
std::optional<std::string> Spacekeep::writeState(ipc::OptionalValue value, const std::string& key) {
  if (!user_defaults_) return "there is no preferences suite";
  KeptRecord before = kept_record_;
  changeState(std::move(value), key);
  std::optional<std::string> why = user_defaults_->synchronize();
  if (!why) return std::nullopt;
  user_defaults_->discard(keys::kUserDefaults);
  keepRecordToBeWritten(std::move(before));
  return why;
}

void Spacekeep::changeState(ipc::OptionalValue value, const std::string& key) {
  if (key == kept_record_.key) kept_record_ = {};
  if (!user_defaults_) return;
  Dictionary state = mutableState();
  if (value) {
    state.set(key, std::move(*value));
  } else {
    state.remove(key);
  }
  user_defaults_->set(keys::kUserDefaults, std::move(state));
}

void Spacekeep::_clientGetState(const Value& key, const ValueReply& reply) {
  logTrace("%s ENTRY", "_clientGetState");
  defaults_queue_->assertCurrent("_clientGetState");
  if (const std::string* name = key.string()) {
    reply(answerFor(*name));
  } else {
    logProblem("%s key is not a string: %@", "_clientGetState", key);
    reply(std::nullopt);
  }
  logTrace("%s EXIT", "_clientGetState");
}

std::optional<Value> Spacekeep::answerFor(const std::string& key) {
  if (key == kept_record_.key || key == keys::kUserDefaults) archiveKeptRecord();
  const Value* stored = persistentState();
  if (stored == nullptr) {
    const Value* value = default_values_.find(key);
    return value == nullptr ? std::nullopt : std::optional(*value);
  }
  if (const Dictionary* state = stored->dictionary()) return valueIn(*state, key);
  logProblem("%s persistent_state is not a dictionary: %@", "_clientGetState", *stored);
  return std::nullopt;
}

std::optional<Value> Spacekeep::valueIn(const Dictionary& state, const std::string& key) const {
  if (key == keys::kUserDefaults) {
    Dictionary merged = state;
    for (const auto& [name, value] : default_values_) {
      if (!state.contains(name)) merged.set(name, value);
    }
    return merged;
  }
  if (const Value* value = state.find(key)) return *value;
  const Value* value = default_values_.find(key);
  if (value == nullptr) return std::nullopt;
  logTrace("%s using default value: %@ for key: %@", "_clientGetState", *value, key);
  return *value;
}

// What is on the disk, with what was set since and is still to be written.
const Value* Spacekeep::persistentState() {
  if (!user_defaults_) return nullptr;
  if (const auto problem = user_defaults_->refresh()) {
    logProblem("%s %@", "persistentState", *problem);
  }
  return user_defaults_->find(keys::kUserDefaults);
}

// A state that is no dictionary is replaced by one with the first change.
Dictionary Spacekeep::mutableState() {
  const Value* stored = persistentState();
  const Dictionary* state = stored == nullptr ? nullptr : stored->dictionary();
  return state == nullptr ? Dictionary() : *state;
}

void Spacekeep::actOnChange(const std::string& key, const ipc::OptionalValue& value) {
  if (key == keys::kCacheEnabled) notifyRecipients(key, value);
  if (isSettingKey(key)) applySettings(mutableState());
}

}  // namespace spacekeep
