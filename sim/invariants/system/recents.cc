// The invariant on the record of recent answers: each look at it is compared with a model.
#include <algorithm>

#include "purgeable/recent_archive.h"
#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/record_model.h"
#include "sim/invariants/system/system_invariants.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

using formats::dictionaryField;
using formats::textField;

constexpr const char* kRecentAnswers = "SPACEKEEP_RECENT_SERVICE_STATS";

/// Follows the record through one life. Everything that touches it happens on one queue, one thing
/// after another.
class RecordFollower {
 public:
  RecordFollower(const SystemStory& story, const Life& life, Findings& findings)
      : life_(life), findings_(findings) {
    is_closed_ = life.number > 0 && life.number - 1 < story.run.plan.crashes.size() &&
                 story.run.plan.crashes[life.number - 1].store_refuses_to_open;
    if (!is_closed_) load();
  }

  void follow() {
    for (std::size_t at = 0; at < life_.events.size() && known_; ++at) {
      if (const auto* space = life_.as<FreeSpaceIs>(at)) free_[space->volume] = space->free;
      const auto* asked = life_.as<ClientAsked>(at);
      // Whatever a client puts there is the client's, from whenever it is stored.
      if (asked != nullptr && asked->member == "clientSetState" && asked->text == kRecentAnswers) {
        return;
      }
      const auto* line = life_.as<LogLine>(at);
      if (line == nullptr) continue;
      // Without the disk there is no record to read nor to delete. It is there again, as it was, as
      // soon as the disk works, which no line tells.
      if (textField(*line, 0) == "persistentState") return;
      if (line->format == formats::kRecordUpdate) followUpdate(at, *line);
      if (line->format == formats::kToCount) followRead(at, *line);
    }
  }

 private:
  void load() {
    const auto state = life_.facts->disk_at_start.find("SPACEKEEP_USER_DEFAULTS");
    const Dictionary* stored =
        state == life_.facts->disk_at_start.end() ? nullptr : state->second.dictionary();
    const Value* archive = stored == nullptr ? nullptr : stored->find(kRecentAnswers);
    if (archive == nullptr) return;
    const auto record =
        archive->data() == nullptr ? std::nullopt : recentInfoFromArchive(*archive->data());
    known_ = record.has_value();
    if (!record) return;
    for (const auto& [path, volume] : record->volumes()) {
      RecordModel::Volume entry{
          .services = {}, .free = volume.freespace, .at_ns = volume.timestamp.unix_ns};
      for (const auto& [service, answer] : volume.services) {
        entry.services[service] = {answer.amount, answer.timestamp.unix_ns};
      }
      record_.put(path, std::move(entry));
    }
  }

  // The clock is read after the line is logged: a jump in between leaves open which time it was.
  [[nodiscard]] bool clockIsClear(std::size_t at) const {
    const std::size_t last = life_.lastOfMoment(at);
    for (std::size_t i = life_.firstOfMoment(at); i <= last; ++i) {
      if (life_.as<ClockJumped>(i) != nullptr) return false;
    }
    return true;
  }

  /// Dates keep whole microseconds.
  [[nodiscard]] std::int64_t nowNs(std::size_t at) const {
    const std::int64_t wall_ns = life_.wallAt(at);
    return wall_ns - wall_ns % 1000;
  }

  /// What the thread saw of the volumes in one go: from `at` on, or before it.
  [[nodiscard]] RecordModel::FreeSpace looksAround(std::size_t at, bool after) const {
    RecordModel::FreeSpace seen = free_;
    const unsigned thread = life_.events[at].thread;
    for (std::size_t i = at; after ? ++i < life_.events.size() : i-- > 0;) {
      if (life_.events[i].thread != thread) continue;
      const auto* look = life_.as<FreeSpaceLooked>(i);
      if (look == nullptr) break;
      seen[look->volume] = look->free;
    }
    return seen;
  }

  [[nodiscard]] bool looksAgain(std::size_t at) const {
    const unsigned thread = life_.events[at].thread;
    for (std::size_t i = at + 1; i < life_.events.size(); ++i) {
      if (life_.events[i].thread == thread) return life_.as<FreeSpaceLooked>(i) != nullptr;
    }
    return false;
  }

  void followUpdate(std::size_t at, const LogLine& line) {
    const std::string service = textField(line, 1);
    const Dictionary entry = dictionaryField(line, 2);
    const std::string expected = record_.empty() ? "(none)" : textOf(record_.text());
    if (textField(line, 3) != expected) {
      findings_.push_back("the record held " + textField(line, 3) + " as " + service +
                          " answered, it ought to have held " + expected);
      known_ = false;
    }
    // The process was killed in between.
    if (!clockIsClear(at) || !looksAgain(at)) known_ = false;
    const std::string* volume = stringAt(entry, "SPACEKEEP_VOLUME");
    const Value* amount = entry.find("SPACEKEEP_AMOUNT");
    if (is_closed_ || !known_ || volume == nullptr || amount == nullptr) return;
    const RecordModel::FreeSpace free = looksAround(at, true);
    const auto space = free.find(*volume);
    record_.answer(*volume, service, *amount, space == free.end() ? 0 : space->second, nowNs(at));
    static_cast<void>(record_.validate(nowNs(at), free));
  }

  void followRead(std::size_t at, const LogLine& line) {
    const auto reader = std::find_if(
        life_.queries.begin(), life_.queries.end(),
        [&](const Query& query) { return query.first.at == at || query.second.at == at; });
    if (reader == life_.queries.end()) return;
    if (!clockIsClear(at)) {
      known_ = false;
      return;
    }
    const bool had_record = !record_.empty();
    const auto verdict = record_.validate(nowNs(at), looksAround(at, false));
    const std::string* volume = stringAt(reader->request, "SPACEKEEP_VOLUME");
    const Dictionary expected = record_.amountsOf(volume == nullptr ? "" : *volume);
    if (dictionaryField(line, 1) != expected) {
      findings_.push_back("a query counts " + textField(line, 1) + ", the record held " +
                          textOf(expected));
      known_ = false;
    } else if (had_record) {
      checkVerdict(at, verdict);
    }
  }

  void checkVerdict(std::size_t at, RecordModel::Verdict verdict) {
    const unsigned thread = life_.events[at].thread;
    bool deletes = false;
    bool stores = false;
    for (std::size_t i = at + 1; i < life_.events.size(); ++i) {
      const auto* line = life_.as<LogLine>(i);
      if (life_.events[i].thread != thread || line == nullptr) continue;
      deletes |= line->format == formats::kRecordInvalid;
      stores |= line->format == formats::kRecordChanged;
      if (line->format == formats::kToQuery || line->format == formats::kAllCached) {
        if (deletes != (verdict == RecordModel::Verdict::kInvalid) ||
            stores != (verdict == RecordModel::Verdict::kChanged)) {
          findings_.push_back("a record that was validated was not dealt with accordingly");
        }
        return;
      }
    }
  }

  const Life& life_;
  Findings& findings_;
  RecordModel record_;
  RecordModel::FreeSpace free_;
  bool is_closed_ = false;  // without a store nothing is kept
  bool known_ = true;
};

}  // namespace

void checkRecordOfAnswers(const SystemStory& story, const Life& life, Findings& findings) {
  RecordFollower(story, life, findings).follow();
}

}  // namespace spacekeep::sim
