// From the events of a run to its lives.
#include <algorithm>
#include <utility>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/system_story.h"

namespace spacekeep::sim {
namespace {

using formats::dictionaryField;
using formats::numberField;
using formats::textField;

bool holdsText(const Value& list, std::string_view text) {
  const Array* elements = list.array();
  return elements != nullptr &&
         std::any_of(elements->begin(), elements->end(), [&](const Value& element) {
           return element.string() != nullptr && *element.string() == text;
         });
}

Declared declaredBy(const Dictionary& keys) {
  Declared service;
  const Value* roles = keys.find("SPACEKEEP_SERVICES");
  service.purges = roles == nullptr || holdsText(*roles, "PURGE");
  service.periodic = roles != nullptr && holdsText(*roles, "PERIODIC");
  service.do_not_query = keys.contains("SPACEKEEP_DO_NOT_QUERY");
  const Value* names = keys.find("SPACEKEEP_NOTIFICATIONS");
  if (names == nullptr || names->array() == nullptr) return service;
  for (const Value& name : *names->array()) {
    if (name.string() != nullptr) service.notifications.insert(*name.string());
  }
  return service;
}

std::vector<std::string> textsIn(const Value* list) {
  std::vector<std::string> texts;
  if (list == nullptr || list->array() == nullptr) return texts;
  for (const Value& element : *list->array()) {
    if (element.string() != nullptr) texts.push_back(*element.string());
  }
  return texts;
}

const Value* valueField(const LogLine& line, std::size_t index) {
  return index < line.fields.size() ? std::get_if<Value>(&line.fields[index]) : nullptr;
}

/// Reads one life.
class Reader {
 public:
  Reader(SystemStory& story, Life& life) : story_(story), life_(life) {}

  void read() {
    for (std::size_t at = 0; at < life_.events.size(); ++at) {
      const Event& event = life_.events[at];
      if (const auto* line = std::get_if<LogLine>(&event.body)) {
        readLine(at, event.thread, *line);
      } else if (const auto* asked = std::get_if<ServiceAsked>(&event.body)) {
        life_.asked_at[asked->call] = at;
      } else {
        readCall(at, event);
      }
    }
  }

 private:
  void readCall(std::size_t at, const Event& event) {
    if (const auto* asked = std::get_if<ClientAsked>(&event.body)) {
      call_by_number_[asked->call] = life_.calls.size();
      life_.calls.push_back({.number = asked->call,
                             .member = asked->member,
                             .client = asked->client,
                             .rights = asked->rights,
                             .text = asked->text,
                             .info = asked->info,
                             .value = asked->value,
                             .asked_at = at,
                             .answers_at = {},
                             .answer = {},
                             .result = {},
                             .error = {}});
    } else if (const auto* answered = std::get_if<ClientAnswered>(&event.body)) {
      Call* call = callWith(answered->call);
      if (call == nullptr) return;
      if (call->answers_at.empty()) {
        call->answer = answered->answer;
        call->result = answered->value;
      }
      call->answers_at.push_back(at);
    } else if (const auto* refused = std::get_if<ClientRefused>(&event.body)) {
      Call* call = callWith(refused->call);
      if (call == nullptr) return;
      call->refused_at = at;
      call->error = refused->error;
    } else if (const auto* dropped = std::get_if<ClientDropped>(&event.body)) {
      if (Call* call = callWith(dropped->call)) call->dropped_at = at;
    }
  }

  Call* callWith(std::uint64_t number) {
    const auto found = call_by_number_.find(number);
    if (found != call_by_number_.end()) return &life_.calls[found->second];
    story_.oddities.push_back("an answer to the call #" + std::to_string(number) +
                              ", which nobody made in this life");
    return nullptr;
  }

  void readLine(std::size_t at, unsigned thread, const LogLine& line) {
    if (line.format == formats::kPinging) {
      life_.pings.push_back({.from = at});
    } else if (line.format == formats::kPong) {
      if (!life_.pings.empty() && life_.pings.back().to == kNowhere) life_.pings.back().to = at;
    } else if (line.format == formats::kQueryEntry) {
      query_on_[thread] = life_.queries.size();
      life_.queries.push_back({.thread = thread,
                               .begin_at = at,
                               .request = dictionaryField(line, 1),
                               .first = {},
                               .added = {},
                               .extensions = {},
                               .second = {},
                               .result = {}});
    } else if (line.format == formats::kToCount) {
      readRecord(at, thread, line);
    } else if (line.format == formats::kToQuery) {
      const auto read = read_on_.find(thread);
      if (read != read_on_.end()) {
        recordRead(read->second).to_query = textsIn(valueField(line, 1));
      }
    } else if (const auto found = query_on_.find(thread); found != query_on_.end()) {
      readQuery(at, thread, life_.queries[found->second], line);
    }
  }

  // Queries run one at a time, so a look at the record belongs to the one that runs.
  void readRecord(std::size_t at, unsigned thread, const LogLine& line) {
    if (life_.queries.empty() || life_.queries.back().end_at != kNowhere) {
      story_.oddities.push_back("a look at the recent answers that no query takes");
      return;
    }
    Query& query = life_.queries.back();
    const bool is_first = query.first.at == kNowhere;
    read_on_[thread] = {life_.queries.size() - 1, is_first};
    RecordRead& read = is_first ? query.first : query.second;
    read.at = at;
    read.thread = thread;
    read.to_count = dictionaryField(line, 1);
  }

  RecordRead& recordRead(const std::pair<std::size_t, bool>& which) {
    Query& query = life_.queries[which.first];
    return which.second ? query.first : query.second;
  }

  void readQuery(std::size_t at, unsigned thread, Query& query, const LogLine& line) {
    if (line.format == formats::kInFlight && textField(line, 1) == "adding") {
      query.added.push_back(textField(line, 2));
    } else if (line.format == formats::kWaitingALittle) {
      query.waiting_at = at;
    } else if (line.format == formats::kDoneWaiting) {
      query.waited_at = at;
    } else if (line.format == formats::kTick) {
      ++query.ticks;
    } else if (line.format == formats::kExtension) {
      query.extensions.push_back(numberField(line, 1));
    } else if (line.format == formats::kBeatTheTimeout) {
      query.beat_the_timeout = true;
    } else if (line.format == formats::kQueryResult) {
      query.end_at = at;
      if (const auto* seconds = std::get_if<double>(&line.fields[1])) query.seconds = *seconds;
      query.result = dictionaryField(line, 2);
      query_on_.erase(thread);
    }
  }

  SystemStory& story_;
  Life& life_;
  std::map<std::uint64_t, std::size_t> call_by_number_;
  std::map<unsigned, std::size_t> query_on_;                  // by thread
  std::map<unsigned, std::pair<std::size_t, bool>> read_on_;  // by thread: query, first look
};

bool setsFinishEarly(const Event& event) {
  const auto* asked = std::get_if<ClientAsked>(&event.body);
  return asked != nullptr && asked->member == "clientSetState" &&
         asked->text == "SPACEKEEP_FINISH_EARLY";
}

bool isStoredFinishEarly(const LifeOfDaemon& facts) {
  const auto state = facts.disk_at_start.find("SPACEKEEP_USER_DEFAULTS");
  const Dictionary* stored =
      state == facts.disk_at_start.end() ? nullptr : state->second.dictionary();
  return stored != nullptr && stored->contains("SPACEKEEP_FINISH_EARLY");
}

PurgeView viewOf(const SystemStory& story, const Life& life) {
  PurgeView view;
  view.events = life.events;
  view.cut = life.cut;
  for (const SystemService& service : story.run.plan.services) {
    view.service_ids.push_back(service.id);
  }
  view.disk_write_ns = story.run.plan.disk_write_ns;
  view.may_finish_early_by_default =
      isStoredFinishEarly(*life.facts) ||
      std::any_of(life.events.begin(), life.events.end(), setsFinishEarly);
  return view;
}

void splitIntoLives(SystemStory& story) {
  const std::vector<Event>& events = story.run.events;
  std::size_t first = kNowhere;
  for (std::size_t at = 0; at < events.size(); ++at) {
    if (std::holds_alternative<LifeBegan>(events[at].body)) first = at;
    const bool is_last = at + 1 == events.size();
    if (first == kNowhere || !(std::holds_alternative<LifeEnded>(events[at].body) || is_last)) {
      continue;
    }
    Life life;
    life.number = std::get<LifeBegan>(events[first].body).life;
    if (life.number >= story.run.lives.size()) return;
    life.facts = &story.run.lives[life.number];
    life.events = std::span(events).subspan(first, at + 1 - first);
    const bool is_last_life = life.number + 1 == story.run.lives.size();
    life.stands_still = is_last_life && story.run.end == SystemEnd::kSilentPing;
    life.cut = life.facts->killed || life.stands_still;
    story.lives.push_back(std::move(life));
    first = kNowhere;
  }
}

}  // namespace

// A run that was broken off has no story, only a great many events.
SystemStory::SystemStory(const SystemRun& run_given) : run(run_given) {
  for (const PlannedVolume& volume : run.plan.volumes) volumes.insert(volume.path);
  for (const SystemService& service : run.plan.services) {
    if (service.descriptor) declared[service.id] = declaredBy(*service.descriptor);
  }
  // The second file of an ID describes a service that has nothing but its ID.
  for (const BadDescriptor& bad : run.plan.bad_descriptors) {
    if (bad.kind != BadDescriptor::Kind::kSecondOfId) continue;
    if (!declared.emplace(bad.of_id, Declared{.purges = true, .notifications = {}}).second) {
      declared_twice.insert(bad.of_id);
    }
  }
  if (run.end == SystemEnd::kDeadlock || run.end == SystemEnd::kStuck) return;
  splitIntoLives(*this);
  for (Life& life : lives) {
    Reader(*this, life).read();
    // Nobody else may need the registry any more: then the run ends, and one check-in has no answer.
    const bool waits = !life.pings.empty() && life.pings.back().to == kNowhere;
    if (waits && run.plan.faults.contains(Fault::kSilentPing)) life.stands_still = life.cut = true;
    life.purges.emplace(viewOf(*this, life));
  }
}

}  // namespace spacekeep::sim
