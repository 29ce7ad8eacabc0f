// Invariants on the client state: what is read, what is on the disk, what services are told.
#include <algorithm>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/registry_model.h"
#include "sim/invariants/system/system_invariants.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

constexpr const char* kWholeState = "SPACEKEEP_USER_DEFAULTS";
constexpr const char* kCacheEnabled = "SPACEKEEP_CACHE_ENABLED";
// The daemon writes that one itself, see the record of recent answers.
constexpr const char* kRecentAnswers = "SPACEKEEP_RECENT_SERVICE_STATS";

using Seen = std::optional<Value>;

Dictionary stateIn(const InMemoryDisk::Contents& disk) {
  const auto state = disk.find(kWholeState);
  const Dictionary* stored = state == disk.end() ? nullptr : state->second.dictionary();
  return stored == nullptr ? Dictionary() : *stored;
}

/// The changes of the client state in one life, and what it began with.
class StateModel {
 public:
  explicit StateModel(const SystemStory& story, const Life& life) {
    const bool is_closed = life.number > 0 && life.number - 1 < story.run.plan.crashes.size() &&
                           story.run.plan.crashes[life.number - 1].store_refuses_to_open;
    if (!is_closed) initial_ = stateIn(life.facts->disk_at_start);
    for (const Call& call : life.calls) {
      if (call.member == "clientSetState" && call.refused_at == kNowhere) sets_.push_back(&call);
      if (call.member == "clientSetState") keys_.insert(call.text);
    }
    for (const auto& entry : initial_) keys_.insert(entry.key);
    keys_.erase(kRecentAnswers);
  }

  [[nodiscard]] const std::set<std::string>& keys() const { return keys_; }

  /// Whether somebody who looks at some moment from `first` to `last` may see that under the key.
  [[nodiscard]] bool maySee(const std::string& key, const Seen& seen, std::size_t first,
                            std::size_t last) const {
    const Value* initial = initial_.find(key);
    if (!isReplaced(key, 0, first) && seen == (initial ? Seen(*initial) : Seen())) return true;
    return std::any_of(sets_.begin(), sets_.end(), [&](const Call* set) {
      return set->text == key && set->asked_at < last && set->value == seen &&
             !isReplaced(key, set->answeredAt(), first);
    });
  }

 private:
  /// Whether a change that came after that answer has itself been answered.
  [[nodiscard]] bool isReplaced(const std::string& key, std::size_t answered_at,
                                std::size_t before) const {
    if (answered_at == kNowhere) return false;
    return std::any_of(sets_.begin(), sets_.end(), [&](const Call* other) {
      return other->text == key && other->asked_at > answered_at && other->answeredAt() < before;
    });
  }

  Dictionary initial_;
  std::vector<const Call*> sets_;
  std::set<std::string> keys_;
};

std::string textOfSeen(const Seen& seen) { return seen ? textOf(*seen) : "(none)"; }

Seen withDefault(const std::string& key, const Seen& seen) {
  return !seen && key == kCacheEnabled ? Seen(Value(true)) : seen;
}

/// What can be seen of a key: the default hides whether it is stored.
bool mayRead(const StateModel& model, const std::string& key, const Seen& seen, const Call& call) {
  if (model.maySee(key, seen, call.asked_at, call.answeredAt())) {
    return withDefault(key, seen) == seen;
  }
  const bool is_default = key == kCacheEnabled && seen == Seen(Value(true));
  return is_default && model.maySee(key, Seen(), call.asked_at, call.answeredAt());
}

void checkWholeState(const StateModel& model, const Call& call, Findings& findings) {
  const Dictionary* state = call.result ? call.result->dictionary() : nullptr;
  for (const std::string& key : model.keys()) {
    const Value* value = state == nullptr ? nullptr : state->find(key);
    const Seen seen = value == nullptr ? Seen() : Seen(*value);
    const bool is_empty_store = state == nullptr && key == kCacheEnabled;
    const bool may = is_empty_store ? model.maySee(key, Seen(), call.asked_at, call.answeredAt())
                                    : mayRead(model, key, seen, call);
    if (may) continue;
    findings.push_back(nameOf(call) + " found " + textOfSeen(seen) + " under " + key);
  }
}

bool isOnDisk(const DiskWritten& written, const Call& set) {
  const Value* state = written.contents.find(kWholeState);
  if (state == nullptr || state->dictionary() == nullptr) return false;
  const Value* stored = state->dictionary()->find(set.text);
  return set.value ? stored != nullptr && *stored == *set.value : stored == nullptr;
}

}  // namespace

// Changes that were refused as not stored are never seen.
void checkReadsSeeWrites(const SystemStory& story, const Life& life, Findings& findings) {
  const StateModel model(story, life);
  for (const Call& call : life.calls) {
    if (call.member != "clientGetState" || call.answers_at.empty()) continue;
    if (call.text == kWholeState) {
      checkWholeState(model, call, findings);
    } else if (call.text != kRecentAnswers && !mayRead(model, call.text, call.result, call)) {
      findings.push_back(nameOf(call) + " found " + textOfSeen(call.result) + " under " +
                         call.text);
    }
  }
}

void checkStoredIsOnDisk(const SystemStory&, const Life& life, Findings& findings) {
  for (const Call& call : life.calls) {
    if (call.member != "clientSetState" || call.answers_at.empty()) continue;
    bool is_stored = false;
    for (std::size_t at = call.asked_at; at < call.answeredAt() && !is_stored; ++at) {
      const auto* written = life.as<DiskWritten>(at);
      is_stored = written != nullptr && isOnDisk(*written, call);
    }
    if (is_stored) continue;
    findings.push_back(nameOf(call) + " was answered before " + call.text + " was on the disk");
  }
}

void checkLifeBeginsWithWhatWasStored(const SystemStory& story, const Life& life,
                                      Findings& findings) {
  const Dictionary state = stateIn(life.facts->disk_at_start);
  if (life.number == 0) return;
  // A life that was killed before its first step has left no trace.
  const auto found = std::find_if(story.lives.begin(), story.lives.end(), [&](const Life& other) {
    return other.number + 1 == life.number;
  });
  if (found == story.lives.end()) return;
  const Life& before = *found;
  const StateModel model(story, before);
  // A life without a store begins with nothing and leaves the disk as it is.
  if (before.number > 0 && story.run.plan.crashes[before.number - 1].store_refuses_to_open) {
    if (life.facts->disk_at_start != before.facts->disk_at_start) {
      findings.push_back("a life without a store changed the disk");
    }
    return;
  }
  const std::size_t end = before.events.size();
  for (const std::string& key : model.keys()) {
    const Value* value = state.find(key);
    const Seen seen = value == nullptr ? Seen() : Seen(*value);
    if (model.maySee(key, seen, end, end)) continue;
    findings.push_back("the disk holds " + textOfSeen(seen) + " under " + key +
                       ", which was not what was stored last");
  }
}

void checkNotifications(const SystemStory& story, const Life& life, Findings& findings) {
  const RegistryModel registry(story, life);
  std::vector<const Call*> sets;
  for (const Call& call : life.calls) {
    const bool is_stored = call.member == "clientSetState" && !call.answers_at.empty();
    if (is_stored && call.text == kCacheEnabled) sets.push_back(&call);
  }
  std::size_t told = 0;
  bool any_failed = false;
  std::map<std::string, std::size_t> received;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    if (const auto* line = life.as<LogLine>(at)) {
      if (line->format == formats::kNotifying) ++told;
      any_failed |=
          line->format == formats::kFailed && formats::textField(*line, 0) == "notifyRecipients";
    }
    const auto* asked = life.as<ServiceAsked>(at);
    if (asked == nullptr || asked->member != "serviceNotify") continue;
    ++received[asked->service];
    const bool is_due = std::any_of(sets.begin(), sets.end(), [&](const Call* set) {
      const Dictionary notification{{kCacheEnabled, *withDefault(kCacheEnabled, set->value)}};
      return set->asked_at < at && asked->info == notification;
    });
    if (!is_due || !registry.mayWant(asked->service, kCacheEnabled, at)) {
      findings.push_back(asked->service + " was told " + textOf(asked->info));
    }
  }
  if (told != sets.size()) {
    findings.push_back(std::to_string(told) + " notifications for " + std::to_string(sets.size()) +
                       " stored settings");
  }
  for (const auto& [service, times] : received) {
    if (times > told) findings.push_back(service + " was told more often than there was news");
  }
  for (const auto& [service, declared] : story.declared) {
    if (any_failed || !declared.notifications.contains(kCacheEnabled)) continue;
    if (registry.isClear(service) && received[service] != told) {
      findings.push_back(service + " was told " + std::to_string(received[service]) + " of " +
                         std::to_string(told) + " stored settings");
    }
  }
}

}  // namespace spacekeep::sim
