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

// It is written alone: what the daemon has still to write must not keep it from the disk.
std::optional<std::string> Spacekeep::writeState(ipc::OptionalValue value, const std::string& key) {
  if (!user_defaults_) return "there is no preferences suite";
  Dictionary state = storedState();
  if (value) {
    state.set(key, std::move(*value));
  } else {
    state.remove(key);
  }
  std::optional<std::string> why = writeOut(std::move(state));
  if (!why) late_changes_.forget(key);
  // This write of the daemon's own may have failed before.
  if (late_changes_.areAny()) writeSoon();
  return why;
}

// The answer tells what is on the disk, so a change that did not get there is taken back: nobody
// shall find later what was said not to be stored.
std::optional<std::string> Spacekeep::writeOut(Dictionary state) {
  user_defaults_->set(keys::kUserDefaults, std::move(state));
  std::optional<std::string> why = user_defaults_->synchronize();
  if (why) user_defaults_->discard(keys::kUserDefaults);
  return why;
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
  const Value* stored = persistentState();
  const Dictionary* state = stored == nullptr ? nullptr : stored->dictionary();
  if (state != nullptr) return valueIn(*state, key);
  // What the daemon has changed makes a state by itself.
  if (late_changes_.areAny()) return valueIn({}, key);
  if (stored == nullptr) return builtIn(key);
  logProblem("%s persistent_state is not a dictionary: %@", "_clientGetState", *stored);
  return std::nullopt;
}

std::optional<Value> Spacekeep::valueIn(const Dictionary& state, const std::string& key) {
  if (key == keys::kUserDefaults) {
    Dictionary merged = state;
    late_changes_.layOver(merged);
    for (const auto& [name, value] : default_values_) {
      if (!merged.contains(name)) merged.set(name, value);
    }
    return merged;
  }
  if (const Value* value = late_changes_.find(key, state)) return *value;
  auto value = builtIn(key);
  if (value) {
    logTrace("%s using default value: %@ for key: %@", "_clientGetState", *value, key);
  }
  return value;
}

// What is on the disk now, whoever has put it there.
const Value* Spacekeep::persistentState() {
  if (!user_defaults_) return nullptr;
  if (const auto problem = user_defaults_->refresh()) {
    logProblem("%s %@", "persistentState", *problem);
  }
  return user_defaults_->find(keys::kUserDefaults);
}

// A state that is no dictionary is replaced by one with the first change.
Dictionary Spacekeep::storedState() {
  const Value* stored = persistentState();
  const Dictionary* state = stored == nullptr ? nullptr : stored->dictionary();
  return state == nullptr ? Dictionary() : *state;
}

std::optional<Value> Spacekeep::builtIn(const std::string& key) const {
  const Value* value = default_values_.find(key);
  return value == nullptr ? std::nullopt : std::optional(*value);
}

// Who is told gets the value that holds from now on, also when the stored one was taken away.
void Spacekeep::actOnChange(const std::string& key, const ipc::OptionalValue& value) {
  if (key == keys::kCacheEnabled) notifyRecipients(key, value ? value : builtIn(key));
  if (!isSettingKey(key)) return;
  Dictionary state = storedState();
  late_changes_.layOver(state);
  applySettings(state);
}

}  // namespace spacekeep
