// Invariants on what clients get.
#include <algorithm>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/system_invariants.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

/// What must become of a call in the end.
enum class Ending { kAnswer, kAnswerOrNotStored, kNothing };

Ending endingOf(const SystemStory& story, const Call& call) {
  if (call.member == "clientSetState") return Ending::kAnswerOrNotStored;
  const bool is_refused_check_in = call.member == "clientCheckin" &&
                                   !story.declared.contains(call.text) &&
                                   !call.holds("SERVICE_ENTITLEMENT");
  return is_refused_check_in ? Ending::kNothing : Ending::kAnswer;
}

std::string problemWithEnding(const Call& call, Ending ending) {
  const bool refused = call.refused_at != kNowhere;
  const bool dropped = call.dropped_at != kNowhere;
  const std::size_t answers = call.answers_at.size();
  if (answers > 1) return " got " + std::to_string(answers) + " answers";
  switch (ending) {
    case Ending::kNothing:
      if (answers != 0 || refused) return " must get no answer and got one";
      return "";
    case Ending::kAnswer:
      if (refused) return " was refused: " + call.error;
      break;
    case Ending::kAnswerOrNotStored:
      if (answers != 0 && refused) return " was answered and refused";
      break;
  }
  return dropped ? " was let go of without an answer" : "";
}

bool isRefused(const SystemStory& story, const Call& call) {
  if (call.member == "clientPurge") {
    return !call.holds("PURGE_ENTITLEMENT") || !story.isKnownVolume(call.info);
  }
  const char* right = call.member == "clientPurgeableSpace" ? "PURGEABLE_ENTITLEMENT"
                                                            : "ITEMIZED_PURGEABLE_ENTITLEMENT";
  return !call.holds(right) || !story.isKnownVolume(call.info);
}

/// Whether the purge was told that by a service, before the client was.
bool isReplyToPurge(const Life& life, std::size_t operation, const Call& call) {
  const PurgeStory& story = *life.purges;
  return std::any_of(story.replies.begin(), story.replies.end(), [&](const Reply& reply) {
    if (reply.completion_at >= call.answeredAt()) return false;
    if (reply.operation != kNowhere && reply.operation != operation) return false;
    const auto* line = life.as<LogLine>(reply.completion_at);
    return line != nullptr && formats::dictionaryField(*line, 2) == *call.answer;
  });
}

// Whatever a service answers after the outcome, and before the request is let go of, replaces it.
std::string problemWithPurge(const Life& life, const Call& call) {
  const Value* amount = call.info->find("SPACEKEEP_AMOUNT");
  if (amount == nullptr || !amount->isNumber()) {
    const Dictionary refusal = {{"SPACEKEEP_ERROR", "Parameter error, no Amount key in info dict"}};
    return *call.answer == refusal ? "" : " has no amount and got " + textOf(*call.answer);
  }
  for (std::size_t i = 0; i < life.purges->operations.size(); ++i) {
    const Operation& operation = life.purges->operations[i];
    if (operation.request != *call.info || operation.begin_at < call.asked_at) continue;
    if (operation.end_at < call.answeredAt() && operation.outcome == *call.answer) return "";
    if (isReplyToPurge(life, i, call)) return "";
  }
  return " got what no purge of it told: " + textOf(*call.answer);
}

std::string problemWithQuery(const Life& life, const Call& call) {
  const bool is_a_result =
      std::any_of(life.queries.begin(), life.queries.end(), [&](const Query& query) {
        return query.request == *call.info && query.begin_at > call.asked_at &&
               query.end_at < call.answeredAt() && query.result == *call.answer;
      });
  return is_a_result ? "" : " got what no query of it found: " + textOf(*call.answer);
}

std::string problemWithCheckIn(const SystemStory& story, const Call& call) {
  if (story.declared.contains(call.text)) {
    return call.answer ? " is of a declared service and got " + textOf(*call.answer) : "";
  }
  const Dictionary expected = {{"SPACEKEEP_ID", call.text}, {"ANON", true}};
  return call.answer && *call.answer == expected ? "" : " did not get its ID back";
}

std::string problemWithAnswer(const SystemStory& story, const Life& life, const Call& call) {
  if (call.member == "clientCheckin") return problemWithCheckIn(story, call);
  const bool is_purge = call.member == "clientPurge";
  if (!is_purge && !isQueryMember(call.member)) return "";
  if (isRefused(story, call)) {
    return call.answer ? " is to be refused and got " + textOf(*call.answer) : "";
  }
  if (!call.answer) return " got no dictionary";
  return is_purge ? problemWithPurge(life, call) : problemWithQuery(life, call);
}

}  // namespace

void checkCallsEndAsTheyMust(const SystemStory& story, const Life& life, Findings& findings) {
  for (const Call& call : life.calls) {
    const Ending ending = endingOf(story, call);
    std::string problem = problemWithEnding(call, ending);
    const bool is_open = call.endedAt() == kNowhere;
    if (problem.empty() && is_open && !life.cut && ending != Ending::kNothing) {
      problem = " never got an answer";
    }
    const bool is_other_error =
        call.refused_at != kNowhere && ending == Ending::kAnswerOrNotStored && call.error.empty();
    if (is_other_error) problem = " was refused without a reason";
    if (!problem.empty()) findings.push_back(nameOf(call) + problem);
  }
}

void checkAnswersSayWhatHappened(const SystemStory& story, const Life& life, Findings& findings) {
  for (const Call& call : life.calls) {
    if (call.answers_at.empty()) continue;
    const std::string problem = problemWithAnswer(story, life, call);
    if (!problem.empty()) findings.push_back(nameOf(call) + problem);
  }
}

// Each request that is carried out has one operation, each refused one none. Low space makes
// purges of its own, which carry "SPACEKEEP_ASYNC".
void checkRefusedCallsDoNothing(const SystemStory& story, const Life& life, Findings& findings) {
  std::size_t purges = 0;
  std::size_t queries = 0;
  for (const Call& call : life.calls) {
    if (call.member != "clientPurge" && !isQueryMember(call.member)) continue;
    if (isRefused(story, call)) continue;
    if (isQueryMember(call.member)) {
      ++queries;
      continue;
    }
    const Value* amount = call.info->find("SPACEKEEP_AMOUNT");
    if (amount != nullptr && amount->isNumber()) ++purges;
  }
  const auto ran = static_cast<std::size_t>(
      std::count_if(life.purges->operations.begin(), life.purges->operations.end(),
                    [](const Operation& one) { return !isLowSpacePurge(one.request); }));
  if (ran != purges) {
    findings.push_back(std::to_string(ran) + " purges ran for " + std::to_string(purges) +
                       " requests with the right and a volume");
  }
  if (life.queries.size() != queries) {
    findings.push_back(std::to_string(life.queries.size()) + " queries ran for " +
                       std::to_string(queries) + " requests with the right and a volume");
  }
}

void checkNothingIsCancelled(const SystemStory&, const Life& life, Findings& findings) {
  for (const Operation& operation : life.purges->operations) {
    if (!operation.outcome.contains("SPACEKEEP_OPERATION_CANCELLED")) continue;
    if (operation.request.contains("SPACEKEEP_OPERATION_CANCELLED")) continue;
    findings.push_back(life.purges->name(operation) + " was cancelled while it ran");
  }
}

}  // namespace spacekeep::sim
