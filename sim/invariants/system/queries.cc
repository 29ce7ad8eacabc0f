// Invariants on queries: their waits, whom they ask, what they add up.
#include <algorithm>
#include <cmath>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/registry_model.h"
#include "sim/invariants/system/system_invariants.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

using formats::textField;

constexpr std::uint64_t kTickNs = 10'000'000;
constexpr std::uint64_t kTicks = 15;
constexpr std::uint64_t kTicksAtTheMostUrgent = 85;

std::string nameOf(const Query& query) { return "the query " + textOf(query.request); }

bool contains(const std::vector<std::string>& texts, const std::string& text) {
  return std::find(texts.begin(), texts.end(), text) != texts.end();
}

/// Whether the service has answered the query, or its connection has failed, from `first` to `last`.
bool hasEnded(const Life& life, const std::string& service, std::size_t first, std::size_t last) {
  for (std::size_t at = first; at <= last; ++at) {
    const auto* line = life.as<LogLine>(at);
    if (line == nullptr || textField(*line, 1) != service) continue;
    if (line->format == formats::kQueryTook || line->format == formats::kFailedNamed) return true;
  }
  return false;
}

void checkWaitOf(const Life& life, const Query& query, Findings& findings) {
  const bool is_most_urgent = urgencyLimitIn(query.request) == 4;
  const std::uint64_t most = is_most_urgent ? kTicksAtTheMostUrgent : kTicks;
  if (query.ticks > most || (!query.beat_the_timeout && query.ticks != most)) {
    findings.push_back(nameOf(query) + " waited " + std::to_string(query.ticks) + " ticks of " +
                       std::to_string(most));
  }
  std::uint64_t expected = 5;
  for (const std::uint64_t extension : query.extensions) {
    if (extension == expected-- && is_most_urgent) continue;
    findings.push_back(nameOf(query) + " was extended with " + std::to_string(extension));
  }
  if (!query.beat_the_timeout) return;
  for (const std::string& service : query.added) {
    if (hasEnded(life, service, query.begin_at, query.waited_at)) continue;
    findings.push_back(nameOf(query) + " did not wait for " + service);
  }
}

std::optional<std::int64_t> sumOf(const Dictionary& amounts) {
  std::int64_t sum = 0;
  for (const auto& [service, amount] : amounts) {
    if (__builtin_add_overflow(sum, amount.asSigned().value_or(0), &sum)) return std::nullopt;
  }
  return sum;
}

bool endsConnectionsOfServices(const Event& event) {
  if (const auto* line = std::get_if<LogLine>(&event.body)) {
    return line->format == formats::kFailed || line->format == formats::kFailedNamed;
  }
  if (const auto* changed = std::get_if<WorldChanged>(&event.body)) {
    return changed->what.ends_with(" dies") || changed->what.ends_with(" closes its connections");
  }
  return std::holds_alternative<ServiceCallFailed>(event.body);
}

}  // namespace

void checkQueryWaits(const SystemStory& story, const Life& life, Findings& findings) {
  for (const Query& query : life.queries) {
    if (query.end_at == kNowhere) continue;
    const std::uint64_t took_ns = life.timeAt(query.end_at) - life.timeAt(query.begin_at);
    const bool is_held_up = life.registryWaited(query.begin_at, query.end_at);
    const std::uint64_t least_ns = query.ticks * kTickNs;
    const std::uint64_t writing_ns = life.writingNs(story.run.plan, query.begin_at, query.end_at);
    const bool is_exact = took_ns >= least_ns && took_ns - least_ns <= writing_ns;
    if (!is_held_up && !is_exact) {
      findings.push_back(nameOf(query) + " took " + std::to_string(took_ns) + " ns for " +
                         std::to_string(query.ticks) + " ticks");
    }
    if (std::abs(query.seconds - static_cast<double>(took_ns) / 1e9) > 1e-6) {
      findings.push_back(nameOf(query) + " told " + std::to_string(query.seconds) + " s for " +
                         std::to_string(took_ns) + " ns");
    }
    if (query.waiting_at != kNowhere) checkWaitOf(life, query, findings);
  }
}

void checkQueryResults(const SystemStory&, const Life& life, Findings& findings) {
  for (const Query& query : life.queries) {
    if (query.end_at == kNowhere) continue;
    Dictionary expected = query.second.to_count;
    const auto sum = sumOf(query.second.to_count);
    if (!sum) continue;
    expected.set("SPACEKEEP_TOTAL_AVAILABLE", *sum);
    const Value* volume = query.request.find("SPACEKEEP_VOLUME");
    if (volume != nullptr) expected.set("SPACEKEEP_VOLUME", *volume);
    if (expected == query.result) continue;
    findings.push_back(nameOf(query) + " found " + textOf(query.result) + ", remembered was " +
                       textOf(query.second.to_count));
  }
}

void checkWhomQueriesAsk(const SystemStory& story, const Life& life, Findings& findings) {
  const RegistryModel registry(story, life);
  for (const Query& query : life.queries) {
    if (query.first.at == kNowhere) continue;
    // The process was killed before it told.
    if (life.cut && query.end_at == kNowhere && query.first.to_query.empty()) continue;
    for (const std::string& service : query.first.to_query) {
      if (query.first.to_count.contains(service)) {
        findings.push_back(nameOf(query) + " asks " + service + ", whom it counts");
      }
      if (!registry.mayBeQueried(service, query.begin_at)) {
        findings.push_back(nameOf(query) + " asks " + service + ", who is not to be queried");
      }
    }
    // The snapshot was taken just before.
    const std::size_t before = life.firstOfMoment(query.begin_at);
    for (const std::string& service : registry.surelyQueried(before)) {
      if (query.first.to_count.contains(service)) continue;
      if (contains(query.first.to_query, service)) continue;
      findings.push_back(nameOf(query) + " neither counts nor asks " + service);
    }
    if (query.second.at != kNowhere && query.added != query.first.to_query) {
      findings.push_back(nameOf(query) + " did not ask all that it had to");
    }
  }
}

void checkQueryRequests(const SystemStory&, const Life& life, Findings& findings) {
  std::set<std::pair<std::size_t, std::string>> seen;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* asked = life.as<ServiceAsked>(at);
    if (asked == nullptr || asked->member != "servicePurgeable") continue;
    const auto after = std::find_if(life.queries.begin(), life.queries.end(),
                                    [&](const Query& query) { return query.begin_at > at; });
    if (after == life.queries.begin()) {
      findings.push_back(asked->service + " was queried before there was a query");
      continue;
    }
    const Query& query = *std::prev(after);
    if (!contains(query.added, asked->service)) {
      findings.push_back(asked->service + " was queried and is not in flight");
    }
    if (!seen.insert({query.begin_at, asked->service}).second) {
      findings.push_back(asked->service + " was asked twice by " + nameOf(query));
    }
    if (asked->info != query.request || asked->urgency != urgencyLimitIn(query.request)) {
      findings.push_back(asked->service + " got another request than that of " + nameOf(query));
    }
  }
}

void checkAnswersAreRemembered(const SystemStory&, const Life& life, Findings& findings) {
  struct Counts {
    std::uint64_t sent = 0;
    std::uint64_t told = 0;
    std::uint64_t remembered = 0;
    std::uint64_t timed = 0;
  };
  std::map<std::string, Counts> counts;
  std::set<std::uint64_t> calls;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    if (const auto* line = life.as<LogLine>(at)) {
      if (line->format == formats::kQueryTook) ++counts[textField(*line, 1)].told;
      if (line->format == formats::kRecordUpdate) ++counts[textField(*line, 1)].remembered;
    } else if (const auto* answered = life.as<ServiceAnswered>(at)) {
      const bool is_new =
          answered->member == "servicePurgeable" && calls.insert(answered->call).second;
      if (is_new) ++counts[answered->service].sent;
    } else if (const auto* sent = life.as<StatisticSent>(at)) {
      constexpr std::string_view kElapsed = "_purgeableElapsedNanoseconds";
      if (!sent->key.ends_with(kElapsed)) continue;
      ++counts[sent->key.substr(0, sent->key.size() - kElapsed.size())].timed;
    }
  }
  const bool any_ended =
      std::any_of(life.events.begin(), life.events.end(), endsConnectionsOfServices);
  for (const auto& [service, count] : counts) {
    // An answer over a connection that ends at the same time may be lost with it.
    const bool arrived = count.told == count.sent || any_ended;
    if (arrived && count.told == count.remembered && count.told == count.timed) continue;
    findings.push_back(service + " answered " + std::to_string(count.sent) + " queries, " +
                       std::to_string(count.told) + " answers arrived, " +
                       std::to_string(count.remembered) + " are remembered, " +
                       std::to_string(count.timed) + " were timed");
  }
}

}  // namespace spacekeep::sim
