// Invariants on the order in which requests are carried out, and on who waits for whom.
#include <algorithm>

#include "sim/invariants/system/system_invariants.h"

namespace spacekeep::sim {
namespace {

std::size_t purgeOf(const Life& life, const Call& call) {
  const auto& operations = life.purges->operations;
  for (std::size_t i = 0; i < operations.size(); ++i) {
    if (operations[i].begin_at > call.asked_at && call.info &&
        operations[i].request == *call.info) {
      return i;
    }
  }
  return kNowhere;
}

std::string secondsBetween(const Life& life, std::size_t first, std::size_t last) {
  const auto ns = static_cast<double>(life.timeAt(last) - life.timeAt(first));
  return std::to_string(ns / 1e9) + " s";
}

/// An operation begins in the moment of its request, or in that in which the one before it ends.
/// While a write to the disk keeps a thread busy, another one may have to be found first.
bool beginsInTime(const SystemStory& story, const Life& life, std::size_t asked_at,
                  std::size_t ended_before, std::size_t begin_at) {
  if (life.registryWaited(asked_at, begin_at)) return true;
  const std::size_t free_at =
      ended_before == kNowhere ? asked_at : std::max(asked_at, ended_before);
  return life.timeAt(begin_at) - life.timeAt(free_at) <=
         life.writingNs(story.run.plan, free_at, begin_at);
}

void checkQueryBegins(const SystemStory& story, const Life& life, const Call& call,
                      Findings& findings) {
  for (std::size_t i = 0; i < life.queries.size(); ++i) {
    const Query& query = life.queries[i];
    if (query.begin_at < call.asked_at || !call.info || query.request != *call.info) continue;
    const std::size_t before = i == 0 ? kNowhere : life.queries[i - 1].end_at;
    if (!beginsInTime(story, life, call.asked_at, before, query.begin_at)) {
      findings.push_back(nameOf(call) + " was begun " +
                         secondsBetween(life, call.asked_at, query.begin_at) +
                         " after it was asked for, with no query before it");
    }
    return;
  }
}

}  // namespace

// Whoever asks at a later moment is later in the queue, unless the registry, of which each request
// takes a snapshot first, is waiting for a ping.
void checkPurgesBeginInOrder(const SystemStory& story, const Life& life, Findings& findings) {
  for (const Call& later : life.calls) {
    if (later.member != "clientPurge") continue;
    const std::size_t second = purgeOf(life, later);
    if (second == kNowhere) continue;
    for (const Call& earlier : life.calls) {
      if (earlier.member != "clientPurge" || !earlier.info) continue;
      if (life.timeAt(earlier.asked_at) >= life.timeAt(later.asked_at)) continue;
      const std::size_t first = purgeOf(life, earlier);
      if (first == kNowhere || first < second) continue;
      if (life.registryWaited(earlier.asked_at, life.lastOfMoment(later.asked_at))) continue;
      const std::uint64_t apart_ns = life.timeAt(later.asked_at) - life.timeAt(earlier.asked_at);
      if (apart_ns <= life.writingNs(story.run.plan, earlier.asked_at, later.asked_at)) continue;
      findings.push_back(nameOf(later) + " was begun before " + nameOf(earlier) +
                         ", which had asked first");
    }
  }
}

void checkOperationsWaitForTheirQueueOnly(const SystemStory& story, const Life& life,
                                          Findings& findings) {
  for (const Call& call : life.calls) {
    if (!call.answer) continue;  // refused, or not known to have been carried out
    if (isQueryMember(call.member)) checkQueryBegins(story, life, call, findings);
    if (call.member != "clientPurge") continue;
    const std::size_t index = purgeOf(life, call);
    if (index == kNowhere) continue;
    const auto& operations = life.purges->operations;
    const std::size_t before = index == 0 ? kNowhere : operations[index - 1].end_at;
    if (beginsInTime(story, life, call.asked_at, before, operations[index].begin_at)) continue;
    findings.push_back(nameOf(call) + " was begun " +
                       secondsBetween(life, call.asked_at, operations[index].begin_at) +
                       " after it was asked for, with no purge before it");
  }
}

void checkQueriesDoNotOverlap(const SystemStory&, const Life& life, Findings& findings) {
  for (std::size_t i = 0; i + 1 < life.queries.size(); ++i) {
    if (life.queries[i].end_at < life.queries[i + 1].begin_at) continue;
    findings.push_back("a query began before the one before it had ended");
  }
}

// A setting that services want to know of takes a snapshot of the registry, so pings hold up the
// state with it.
void checkSmallCallsDoNotWait(const SystemStory& story, const Life& life, Findings& findings) {
  for (const Call& call : life.calls) {
    const bool is_small = call.member == "clientSetState" || call.member == "clientGetState" ||
                          call.member == "clientCancelPurge";
    if (!is_small || call.endedAt() == kNowhere) continue;
    const std::uint64_t took_ns = life.timeAt(call.endedAt()) - life.timeAt(call.asked_at);
    const bool is_state = call.member != "clientCancelPurge";
    const std::uint64_t writing_ns =
        is_state ? life.writingNs(story.run.plan, call.asked_at, call.endedAt()) : 0;
    if (took_ns <= writing_ns || life.registryWaited(call.asked_at, call.endedAt())) continue;
    findings.push_back(nameOf(call) + " took " +
                       secondsBetween(life, call.asked_at, call.endedAt()));
  }
}

}  // namespace spacekeep::sim
