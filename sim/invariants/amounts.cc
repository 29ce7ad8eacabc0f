// Invariants on amounts and statistics.
#include <algorithm>
#include <cmath>
#include <set>

#include "sim/invariants/invariants.h"
#include "support/statistics/statistics.h"

namespace spacekeep::sim {
namespace {

std::uint64_t amountIn(const Operation& operation, const char* key) {
  return unsignedAt(operation.outcome, key).value_or(0);
}

std::string volumeOf(const Operation& operation) {
  const std::string* volume = stringAt(operation.request, "SPACEKEEP_VOLUME");
  return volume == nullptr ? std::string() : *volume;
}

bool contains(const std::vector<std::uint64_t>& values, std::uint64_t value) {
  return std::find(values.begin(), values.end(), value) != values.end();
}

struct Sent {
  std::uint64_t times = 0;
  std::int64_t count = 0;
  std::vector<double> values;
};

std::map<std::string, Sent> statisticsOf(const PurgeStory& story) {
  std::map<std::string, Sent> all;
  for (const Event& event : story.run.events) {
    const auto* one = std::get_if<StatisticSent>(&event.body);
    if (one == nullptr) continue;
    Sent& sent = all[one->key];
    ++sent.times;
    sent.count += one->count;
    if (one->kind == StatisticSent::Kind::kDistribution) sent.values.push_back(one->value);
  }
  return all;
}

void compare(const std::string& key, std::vector<double> sent, std::vector<double> expected,
             Findings& findings) {
  std::sort(sent.begin(), sent.end());
  std::sort(expected.begin(), expected.end());
  const bool same = std::equal(sent.begin(), sent.end(), expected.begin(), expected.end(),
                               [](double a, double b) { return std::abs(a - b) <= 1e-3; });
  if (same) return;
  std::string text = key + " was sent as";
  for (const double value : sent) text += " " + std::to_string(value);
  text += ", expected";
  for (const double value : expected) text += " " + std::to_string(value);
  findings.push_back(text);
}

/// What a service gave to one call of a purge.
struct Given {
  std::size_t operation = 0;
  std::int32_t urgency = 0;
  std::string service;
  std::uint64_t amount = 0;
};

// An amount stands in the record of its urgency before the line that tells of it is written. Where
// the process was killed in between, the answer of the service is all there is to see.
void addGivenUntold(const PurgeStory& story, std::vector<Given>& given) {
  std::set<std::uint64_t> told;
  for (const Reply& reply : story.replies) told.insert(reply.call);
  std::map<std::uint64_t, std::int32_t> urgency_of_call;
  for (const Event& event : story.run.events) {
    if (const auto* asked = std::get_if<ServiceAsked>(&event.body)) {
      urgency_of_call[asked->call] = asked->urgency;
    }
    const auto* answered = std::get_if<ServiceAnswered>(&event.body);
    if (answered == nullptr || told.contains(answered->call)) continue;
    const std::size_t operation = story.operationOfCall(answered->call);
    if (operation == kNowhere) continue;
    given.push_back({operation, urgency_of_call[answered->call], answered->service,
                     answered->amount.value_or(0)});
  }
}

std::vector<Given> allGiven(const PurgeStory& story) {
  std::vector<Given> given;
  for (const Reply& reply : story.replies) {
    given.push_back({reply.operation, reply.urgency, reply.service, reply.amount});
  }
  if (story.run.cut) addGivenUntold(story, given);
  return given;
}

}  // namespace

void checkFreedIsMeasured(const PurgeStory& story, Findings& findings) {
  for (const Operation& operation : story.operations) {
    if (operation.end_at == kNowhere || operation.measured_at == kNowhere) continue;
    const std::size_t from =
        operation.passes.empty() ? operation.begin_at : operation.passes.back().stats_at;
    const std::uint64_t freed = amountIn(operation, "SPACEKEEP_AMOUNT");
    if (!story.hadFreed(operation, freed, from, operation.measured_at)) {
      findings.push_back(story.name(operation) + " claims " + std::to_string(freed) +
                         " freed bytes, which the volume never showed");
    }
    if (!contains(
            story.freeBetween(volumeOf(operation), operation.before_begin_at, operation.begin_at),
            amountIn(operation, "SPACEKEEP_FREESPACE_BEGIN"))) {
      findings.push_back(story.name(operation) + " began with another free space");
    }
    if (!contains(story.freeBetween(volumeOf(operation), operation.measured_at, operation.end_at),
                  amountIn(operation, "SPACEKEEP_FREESPACE_END"))) {
      findings.push_back(story.name(operation) + " ended with another free space");
    }
  }
}

// What was booked when the outcome was made; a reply in the middle of being booked may be in it.
void checkReportedSum(const PurgeStory& story, Findings& findings) {
  std::map<std::uint64_t, std::size_t> answered_at;
  for (std::size_t at = 0; at < story.run.events.size(); ++at) {
    const auto* answered = std::get_if<ServiceAnswered>(&story.run.events[at].body);
    if (answered != nullptr) answered_at[answered->call] = at;
  }
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    if (operation.end_at == kNowhere) continue;
    std::uint64_t surely = 0;
    std::uint64_t possibly = 0;
    for (const Reply& reply : story.replies) {
      if (reply.operation != index) continue;
      if (reply.booked_at < operation.measured_at) surely += reply.amount;
      if (answered_at[reply.call] < operation.end_at) possibly += reply.amount;
    }
    const std::uint64_t told = amountIn(operation, "SPACEKEEP_AMOUNT_REPORTED");
    if (told >= surely && told <= possibly) continue;
    findings.push_back(story.name(operation) + " reports " + std::to_string(told) +
                       " bytes, booked were " + std::to_string(surely) + " to " +
                       std::to_string(possibly));
  }
}

void checkServiceStatistics(const PurgeStory& story, Findings& findings) {
  const auto sent = statisticsOf(story);
  std::map<std::string, Sent> expected;
  for (const Reply& reply : story.replies) {
    ++expected[reply.service].times;
    expected[reply.service].count += static_cast<std::int64_t>(reply.amount);
  }
  for (const std::string& service : story.run.service_ids) {
    const Sent& balance = expected[service];
    const auto total = sent.find(service + ".purged");
    const Sent told = total == sent.end() ? Sent() : total->second;
    if (told.times != balance.times || told.count != balance.count) {
      findings.push_back(service + ".purged counts " + std::to_string(told.count) + " bytes in " +
                         std::to_string(told.times) + " reports, booked were " +
                         std::to_string(balance.count) + " in " + std::to_string(balance.times));
    }
    const auto elapsed = sent.find(service + "_purgeElapsedNanoseconds");
    const std::uint64_t times = elapsed == sent.end() ? 0 : elapsed->second.times;
    if (times != balance.times) {
      findings.push_back(service + "_purgeElapsedNanoseconds was sent " + std::to_string(times) +
                         " times for " + std::to_string(balance.times) + " replies");
    }
  }
}

void checkPurgeStatistics(const PurgeStory& story, Findings& findings) {
  std::map<std::string, std::vector<double>> expected;
  std::int64_t total = 0;
  std::uint64_t failed = 0;
  for (const Operation& operation : story.operations) {
    const auto needed = static_cast<double>(operation.needed);
    const auto freed = static_cast<double>(amountIn(operation, "SPACEKEEP_AMOUNT"));
    auto& requested = expected["SpacekeepPurgeAmountRequested"];
    requested.insert(requested.end(), operation.passes.size(), needed);
    expected["SpacekeepPurgeAmountPurged"].push_back(freed);
    if (operation.end_at != kNowhere) {
      expected["SpacekeepPurgeElapsedNanoseconds"].push_back(
          static_cast<double>(story.timeAt(operation.end_at) - story.timeAt(operation.begin_at)));
    }
    total += static_cast<std::int64_t>(freed);
    if (freed >= needed) continue;
    ++failed;
    expected["SpacekeepPurgeDeficit"].push_back(needed - freed);
  }
  auto sent = statisticsOf(story);
  for (const char* key : {"SpacekeepPurgeAmountRequested", "SpacekeepPurgeAmountPurged",
                          "SpacekeepPurgeElapsedNanoseconds", "SpacekeepPurgeDeficit"}) {
    compare(key, sent[key].values, expected[key], findings);
  }
  if (sent["total.purged"].count != total) {
    findings.push_back("total.purged counts " + std::to_string(sent["total.purged"].count) +
                       " bytes, freed were " + std::to_string(total));
  }
  if (sent["SpacekeepPurgeFailed"].times != failed) {
    findings.push_back("SpacekeepPurgeFailed was sent " +
                       std::to_string(sent["SpacekeepPurgeFailed"].times) + " times for " +
                       std::to_string(failed) + " purges that fell short");
  }
}

void checkReportingServices(const PurgeStory& story, Findings& findings) {
  const std::vector<Given> given = allGiven(story);
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    if (operation.end_at == kNowhere) continue;
    for (const Pass& pass : operation.passes) {
      const std::string key =
          "SPACEKEEP_URGENCY_" + std::to_string(pass.urgency) + "_OPERATION_INFO";
      const Value* record = operation.outcome.find(key);
      if (record == nullptr || record->dictionary() == nullptr) {
        findings.push_back(story.name(operation) + " has no " + key);
        continue;
      }
      const Value* reporting = record->dictionary()->find("SPACEKEEP_REPORTING_SERVICES");
      if (reporting == nullptr || reporting->dictionary() == nullptr) continue;
      for (const auto& [service, amount] : *reporting->dictionary()) {
        const bool known = std::any_of(given.begin(), given.end(), [&](const Given& one) {
          return one.operation == index && one.service == service && one.urgency == pass.urgency &&
                 Value(one.amount) == amount;
        });
        if (!known) findings.push_back(key + " names an amount that " + service + " never gave");
      }
    }
  }
}

}  // namespace spacekeep::sim
