// Invariants on what the daemon tells: log lines and statistics, and bounds on what it holds.
#include <algorithm>
#include <array>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/system_invariants.h"

namespace spacekeep::sim {
namespace {

constexpr std::int32_t kProblem = 3;
constexpr std::int32_t kTrace = 5;

// Many times what the largest plan needs: what goes round in circles passes it.
constexpr std::uint64_t kMostEvents = 200'000;

struct Format {
  std::string_view format;
  std::int32_t level;
};

constexpr std::array kFormats = {
    // Start-up.
    Format{"%s timebaseInfo:  %u / %u, gTimebaseConversion: %f", kTrace},
    Format{"%s plistDir: %@", kTrace},
    Format{"%s scanning %@", kTrace},
    Format{"%s looking at: %@", kTrace},
    Format{"%s the ID in %@ is no string: %@", kProblem},
    Format{"%s marking %@ as DO_NOT_QUERY", kTrace},
    Format{"%s %@ desiredNotifications: %@", kTrace},
    Format{"%s property list parse failed: %@", kProblem},
    Format{"%s Unable to initialize user defaults!", kProblem},
    Format{"%s resuming listener", kTrace},
    Format{"%s Spacekeep, open for business!", kTrace},
    Format{"%s %@", kProblem},  // a setting or a store that cannot be used
    Format{"%s %@", kTrace},    // the name of a percentage statistic
    // Requests.
    Format{formats::kNotEntitled, kProblem},
    Format{"%s info is not a dictionary!", kProblem},
    Format{"%s No Volume key in info: %@", kProblem},
    Format{"%s Unable to validate volume: %@", kProblem},
    // Services.
    Format{formats::kExistingService, kTrace},
    Format{"%s failed to get the remote proxy: %@", kTrace},
    Format{"%s invalidationHandler ENTRY", kTrace},
    Format{"%s interruptionHandler ENTRY", kTrace},
    Format{formats::kPinging, kTrace},
    Format{formats::kPong, kTrace},
    Format{formats::kNotifying, kTrace},
    Format{"%s %d serviceID: %@", kTrace},
    Format{formats::kFailed, kTrace},
    Format{formats::kFailedNamed, kTrace},
    Format{"%s calling %@ failed: %@", kTrace},
    Format{"%s %@ cannot be reached", kTrace},
    // The in-flight set.
    Format{formats::kInFlight, kTrace},
    Format{formats::kAlreadyIn, kProblem},
    Format{formats::kNotIn, kTrace},
    // Purges.
    Format{"%s user_timeout_seconds: %llu", kTrace},
    Format{"%s %d amount is not a number: %@", kProblem},
    Format{formats::kBegin, kTrace},
    Format{formats::kInQueue, kTrace},
    Format{formats::kUrgency, kTrace},
    Format{formats::kWaiting, kTrace},
    Format{formats::kStatistics, kTrace},
    Format{formats::kCancelling, kProblem},
    Format{formats::kResult, kTrace},
    Format{formats::kQueuing, kTrace},
    Format{formats::kDonation, kTrace},
    Format{"%s requesting %lld bytes from %@ at urgency %d", kTrace},
    Format{"%s %d num is not a number: %@", kProblem},
    Format{formats::kPurged, kTrace},
    Format{formats::kCompletion, kTrace},
    Format{formats::kSignalling, kTrace},
    Format{formats::kTook, kTrace},
    Format{"%s %@ donated %lld of %lld", kTrace},
    // Both of purges, which could not get what they were to, and of periodic passes.
    Format{formats::kTimedOut, kProblem},
    Format{formats::kTimedOut, kTrace},
    // Queries.
    Format{formats::kQueryEntry, kTrace},
    Format{formats::kQueryAsking, kTrace},
    Format{formats::kQueryTook, kTrace},
    Format{"%s %@ has %@, skipping", kTrace},
    Format{formats::kWaitingALittle, kTrace},
    Format{formats::kBeatTheTimeout, kTrace},
    Format{formats::kTick, kTrace},
    Format{formats::kExtension, kTrace},
    Format{formats::kDoneWaiting, kTrace},
    Format{formats::kSecondPass, kTrace},
    Format{formats::kStillInFlight, kTrace},
    Format{formats::kQueryResult, kTrace},
    Format{"%s %d %@ num is not a number: %@", kProblem},
    Format{formats::kToCount, kTrace},
    Format{formats::kToQuery, kTrace},
    Format{formats::kAllCached, kTrace},
    Format{formats::kRecordInvalid, kTrace},
    Format{formats::kRecordChanged, kTrace},
    Format{formats::kRecordUpdate, kTrace},
    // Periodic passes.
    Format{formats::kPeriodicCalling, kTrace},
    Format{"%s calling proxy for %@", kTrace},
    Format{formats::kPeriodicReplied, kTrace},
    Format{formats::kPeriodicResult, kTrace},
    // Low space.
    Format{formats::kNoneLow, kTrace},
    Format{"%s caught VQ_LOWDISK", kProblem},
    Format{"%s caught VQ_VERYLOWDISK", kProblem},
    // The client state.
    Format{"%s ENTRY", kTrace},
    Format{"%s EXIT", kTrace},
    Format{"%s %d", kTrace},
    Format{"%s key is not a string: %@", kProblem},
    Format{"%s persistent_state is not a dictionary: %@", kProblem},
    Format{"%s using default value: %@ for key: %@", kTrace},
    Format{"%s %@ is not on the disk: %@", kProblem},
    Format{"%s recent statistics are not on the disk: %@", kProblem},
    Format{"%s the bytes of %@ are not an archive of this version and count as absent", kProblem},
};

bool isKnown(const LogLine& line) {
  return std::any_of(kFormats.begin(), kFormats.end(), [&](const Format& known) {
    return known.format == line.format && known.level == line.level;
  });
}

std::size_t argumentsIn(std::string_view format) {
  return static_cast<std::size_t>(std::count(format.begin(), format.end(), '%'));
}

bool isNameOfReport(const SystemStory& story, const std::string& name) {
  if (name == "total") return true;
  const auto& services = story.run.plan.services;
  return std::any_of(services.begin(), services.end(),
                     [&](const SystemService& service) { return service.id == name; });
}

/// "%@.purged" and "%@.purged.%d.percent", of tens.
bool isPurgedReport(const SystemStory& story, const std::string& key) {
  constexpr std::string_view kPurged = ".purged";
  const std::size_t dot = key.find(kPurged);
  if (dot == std::string::npos || !isNameOfReport(story, key.substr(0, dot))) return false;
  const std::string rest = key.substr(dot + kPurged.size());
  return rest.empty() || (rest.starts_with(".") && rest.ends_with("0.percent"));
}

bool isReport(const SystemStory& story, const std::string& key) {
  return key == "SK_LOWDISK_EVENT" || key == "SK_VERYLOWDISK_EVENT" ||
         key == "SpacekeepPurgeFailed" || isPurgedReport(story, key);
}

bool isDistribution(const SystemStory& story, const std::string& key) {
  constexpr std::array kOfPurges = {"SpacekeepPurgeAmountRequested",
                                    "SpacekeepPurgeElapsedNanoseconds",
                                    "SpacekeepPurgeAmountPurged", "SpacekeepPurgeDeficit"};
  if (std::find(kOfPurges.begin(), kOfPurges.end(), key) != kOfPurges.end()) return true;
  for (const std::string_view ending :
       {"_purgeElapsedNanoseconds", "_purgeableElapsedNanoseconds"}) {
    const bool is_of_a_service =
        key.ends_with(ending) && isNameOfReport(story, key.substr(0, key.size() - ending.size()));
    if (is_of_a_service) return true;
  }
  return false;
}

std::size_t elementsIn(const LogLine& line) {
  const auto* value = line.fields.size() < 2 ? nullptr : std::get_if<Value>(&line.fields[1]);
  return value == nullptr || value->array() == nullptr ? 0 : value->array()->size();
}

}  // namespace

void checkBounds(const SystemStory& story, const Life& life, Findings& findings) {
  if (life.events.size() > kMostEvents) {
    findings.push_back(std::to_string(life.events.size()) + " events in one life");
  }
  const std::size_t services = story.run.plan.services.size() + story.declared.size();
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* line = life.as<LogLine>(at);
    if (line == nullptr) continue;
    const bool is_in_flight =
        line->format == formats::kTimedOut || line->format == formats::kStillInFlight;
    if (is_in_flight && elementsIn(*line) > services) {
      findings.push_back("more are in flight than there are services: " + textOfLine(*line));
    }
  }
}

void checkLogFormats(const SystemStory&, const Life& life, Findings& findings) {
  for (const Event& event : life.events) {
    const auto* line = std::get_if<LogLine>(&event.body);
    if (line == nullptr) continue;
    if (!isKnown(*line)) {
      findings.push_back("level " + std::to_string(line->level) + ", \"" + line->format + "\"");
    } else if (line->fields.size() != argumentsIn(line->format)) {
      findings.push_back("\"" + line->format + "\" with " + std::to_string(line->fields.size()) +
                         " arguments");
    }
  }
}

void checkStatisticNames(const SystemStory& story, const Life& life, Findings& findings) {
  for (const Event& event : life.events) {
    const auto* sent = std::get_if<StatisticSent>(&event.body);
    if (sent == nullptr || sent->key.empty()) continue;  // a report may go without a name
    const bool known = sent->kind == StatisticSent::Kind::kReport
                           ? isReport(story, sent->key)
                           : isDistribution(story, sent->key);
    if (!known) findings.push_back("nobody knows the statistic " + sent->key);
    if (sent->domain != "com.quorvel.spacekeep") findings.push_back("domain " + sent->domain);
  }
}

}  // namespace spacekeep::sim
