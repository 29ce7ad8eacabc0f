#include <fmt/core.h>

#include "ctl/check_service/checks.h"

namespace spacekeep::ctl {

Finding checkAnswers(Bench& bench) {
  const Ledger& ledger = bench.subject.ledger();
  if (ledger.unanswered.empty()) return fine(fmt::format("{} requests", ledger.requests));
  return failed(firstOf(ledger.unanswered) +
                " Answer every request once, with what could be done: the daemon cannot tell a "
                "service that takes long from one that has forgotten.");
}

Finding checkInTime(Bench& bench) {
  const Ledger& ledger = bench.subject.ledger();
  if (ledger.late.empty()) return fine();
  return failed(firstOf(ledger.late) +
                " What comes later does not help the client that waits. Count ahead of time, and "
                "stop purging when the time is up.");
}

Finding checkAnswersOnce(Bench& bench) {
  const auto surplus = bench.subject.surplusAnswers();
  if (surplus.empty()) return fine();
  return failed("There was more than one answer: " + firstOf(surplus) +
                ". Answer each request once; a second answer may be taken for that to another.");
}

Finding checkAnswerForm(Bench& bench) {
  const Ledger& ledger = bench.subject.ledger();
  if (ledger.malformed.empty()) return fine();
  return failed(firstOf(ledger.malformed) +
                " Answer with a dictionary that holds \"SPACEKEEP_AMOUNT\", a number of bytes, 0 "
                "when nothing was done: everything else counts as 0 or not at all.");
}

Finding checkHonestAmounts(Bench& bench) {
  const Ledger& ledger = bench.subject.ledger();
  if (ledger.amounts_compared == 0) return notApplicable("No purge was answered.");
  if (ledger.dishonest.empty()) {
    return fine(
        fmt::format("{} purges, within {}", ledger.amounts_compared, "256 KiB and a sixteenth"));
  }
  return failed(firstOf(ledger.dishonest) +
                " Add up the allocated blocks of what really went (a file that is open elsewhere, "
                "or has another name, gives nothing back). If other programs write to this volume, "
                "check on one of its own.");
}

}  // namespace spacekeep::ctl
