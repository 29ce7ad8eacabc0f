// Invariants on the course of a run: its end, its answers, who is spoken to.
#include <algorithm>

#include "sim/invariants/invariants.h"
#include "sim/world/simulated_service.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

const char* wordFor(rt::ScheduleEnd end) {
  switch (end) {
    case rt::ScheduleEnd::kFinished:
      return "finished";
    case rt::ScheduleEnd::kDeadlock:
      return "deadlock";
    case rt::ScheduleEnd::kStuck:
      return "stuck";
  }
  return "?";
}

const PlannedPurge* plannedWith(const PurgeView& run, const std::string& token) {
  for (const PlannedPurge& purge : run.scenario->purges) {
    const Value* planned = purge.info.find("SPACEKEEP_TOKEN");
    if (planned != nullptr && textOf(*planned) == token) return &purge;
  }
  return nullptr;
}

bool isKnownVolume(const PurgeView& run, const Dictionary& info) {
  const std::string* volume = stringAt(info, "SPACEKEEP_VOLUME");
  const std::vector<PlannedVolume>& volumes = run.scenario->volumes;
  return volume != nullptr && std::any_of(volumes.begin(), volumes.end(),
                                          [&](const auto& known) { return known.path == *volume; });
}

const Operation* operationFor(const PurgeStory& story, const Dictionary& info) {
  const Value* token = info.find("SPACEKEEP_TOKEN");
  if (token == nullptr) return nullptr;
  const std::string text = textOf(*token);
  const auto found = std::find_if(story.operations.begin(), story.operations.end(),
                                  [&](const Operation& one) { return one.token == text; });
  return found == story.operations.end() ? nullptr : &*found;
}

// Whatever a service answers after the outcome, and before the request is let go of, replaces it.
bool isLateReply(const PurgeStory& story, const Operation& operation, const Dictionary& answer) {
  const auto call = unsignedAt(answer, kCallKey);
  return call && std::any_of(story.replies.begin(), story.replies.end(), [&](const Reply& reply) {
           return reply.call == *call && reply.completion_at != kNowhere &&
                  reply.done_at > operation.end_at;
         });
}

std::string problemWith(const PurgeStory& story, const PlannedPurge& plan,
                        const std::optional<Dictionary>& answer) {
  if (!plan.entitled || !isKnownVolume(story.run, plan.info)) {
    return answer ? "a refused request was answered with " + textOf(*answer) : "";
  }
  if (!answer) return "a purge was answered with nothing";
  const Value* amount = plan.info.find("SPACEKEEP_AMOUNT");
  if (amount == nullptr || !amount->isNumber()) {
    const Dictionary refusal = {{"SPACEKEEP_ERROR", "Parameter error, no Amount key in info dict"}};
    return *answer == refusal ? "" : "an amount that is no number gave " + textOf(*answer);
  }
  const Operation* operation = operationFor(story, plan.info);
  if (operation == nullptr) return "no purge ran for " + textOf(plan.info);
  if (*answer == operation->outcome || isLateReply(story, *operation, *answer)) return "";
  return "the outcome was " + textOf(operation->outcome) + ", the answer " + textOf(*answer);
}

}  // namespace

void checkEnd(const PurgeStory& story, Findings& findings) {
  if (story.run.end != rt::ScheduleEnd::kFinished) {
    findings.push_back(std::string("the schedule ended as ") + wordFor(story.run.end));
  }
  for (const std::string& blocked : story.run.blocked)
    findings.push_back("left blocked: " + blocked);
}

void checkOddities(const PurgeStory& story, Findings& findings) {
  findings.insert(findings.end(), story.oddities.begin(), story.oddities.end());
}

void checkOneAnswerPerClient(const PurgeStory& story, Findings& findings) {
  for (const Event& event : story.run.events) {
    const auto* asked = std::get_if<ClientAsked>(&event.body);
    if (asked == nullptr || !asked->member.ends_with("Purge")) continue;
    const auto answers =
        std::count_if(story.run.events.begin(), story.run.events.end(), [&](const Event& other) {
          const auto* answered = std::get_if<ClientAnswered>(&other.body);
          return answered != nullptr && answered->call == asked->call;
        });
    if (answers == 1) continue;
    findings.push_back(asked->member + " #" + std::to_string(asked->call) + " got " +
                       std::to_string(answers) + " answers");
  }
}

void checkAnswersAreOutcomes(const PurgeStory& story, Findings& findings) {
  std::map<std::uint64_t, const PlannedPurge*> plans;
  for (const Event& event : story.run.events) {
    if (const auto* asked = std::get_if<ClientAsked>(&event.body)) {
      if (asked->member != "clientPurge" || !asked->info) continue;
      const Value* token = asked->info->find("SPACEKEEP_TOKEN");
      if (token != nullptr) plans[asked->call] = plannedWith(story.run, textOf(*token));
    } else if (const auto* answered = std::get_if<ClientAnswered>(&event.body)) {
      const auto plan = plans.find(answered->call);
      if (plan == plans.end() || plan->second == nullptr) continue;
      std::string problem = problemWith(story, *plan->second, answered->answer);
      if (!problem.empty()) findings.push_back(std::move(problem));
    }
  }
}

void checkPurgesDoNotOverlap(const PurgeStory& story, Findings& findings) {
  for (std::size_t i = 0; i + 1 < story.operations.size(); ++i) {
    if (story.operations[i].end_at < story.operations[i + 1].begin_at) continue;
    findings.push_back(story.name(story.operations[i + 1]) + " began before " +
                       story.name(story.operations[i]) + " had ended");
  }
}

void checkOnlyPurgingServicesAreAsked(const PurgeStory& story, Findings& findings) {
  for (const Event& event : story.run.events) {
    const auto* asked = std::get_if<ServiceAsked>(&event.body);
    if (asked == nullptr || asked->member != "servicePurge") continue;
    for (const PlannedService& service : story.run.scenario->services) {
      const bool may_purge = service.purges || service.purges_after_second_check_in.value_or(false);
      if (service.id == asked->service && !may_purge) {
        findings.push_back(service.id + " does not purge and was asked to");
      }
    }
  }
}

void checkCancelsFollowShortfalls(const PurgeStory& story, Findings& findings) {
  std::size_t cancelling = 0;
  for (const Operation& operation : story.operations) {
    if (operation.cancelling_at == kNowhere) continue;
    ++cancelling;
    const std::uint64_t freed = unsignedAt(operation.outcome, "SPACEKEEP_AMOUNT").value_or(0);
    if (freed >= operation.needed) {
      findings.push_back(story.name(operation) + " had what it needed and was cancelled");
    }
  }
  std::map<std::string, std::size_t> cancels;
  for (const Event& event : story.run.events) {
    const auto* asked = std::get_if<ServiceAsked>(&event.body);
    if (asked != nullptr && asked->member == "serviceCancelPurge") ++cancels[asked->service];
  }
  for (const auto& [service, times] : cancels) {
    if (times <= cancelling) continue;
    findings.push_back(service + " was told " + std::to_string(times) + " times to stop, by " +
                       std::to_string(cancelling) + " cancelled purges");
  }
}

}  // namespace spacekeep::sim
