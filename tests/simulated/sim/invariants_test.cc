// Each invariant finds the fault it is for, in a run that is right but for that fault.
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <set>

#include "sim/invariants/invariants.h"
#include "sim/invariants/log_formats.h"
#include "tests/simulated/sim/broken_runs.h"

namespace spacekeep::sim {
namespace {

using formats::textField;

struct Fault {
  const char* invariant;
  const char* name;
  std::function<void(PurgeRun&)> spoil;
};

std::function<bool(const LogLine&)> names(const std::string& service, std::size_t field = 1) {
  return [service, field](const LogLine& one) { return textField(one, field) == service; };
}

std::function<bool(const ServiceAsked&)> purgeCallOf(const std::string& service) {
  return [service](const ServiceAsked& asked) {
    return asked.service == service && asked.member == "servicePurge";
  };
}

std::size_t purgeCallAt(const PurgeRun& run, const std::string& service) {
  return eventAt<ServiceAsked>(run, purgeCallOf(service));
}

std::size_t clientAnswerAt(const PurgeRun& run) {
  return eventAt<ClientAnswered>(
      run, [](const ClientAnswered& answered) { return answered.member == "clientPurge"; });
}

std::size_t statisticAt(const PurgeRun& run, const std::string& key) {
  return eventAt<StatisticSent>(run, [&](const StatisticSent& sent) { return sent.key == key; });
}

std::size_t removalAt(const PurgeRun& run, const std::string& service) {
  return lineAt(run, formats::kInFlight, 0, [&](const LogLine& one) {
    return textField(one, 1) == "removing" && textField(one, 2) == service;
  });
}

/// A further computation of a share, on the purge's own queue and on a thread of its own.
void offerAfter(PurgeRun& run, std::size_t at) {
  const std::size_t offer = lineAt(run, formats::kQueuing);
  Event again = run.events[offer];
  again.thread = 900;
  again.at_ns = run.events[at].at_ns;
  run.events.insert(run.events.begin() + static_cast<std::ptrdiff_t>(at) + 1, std::move(again));
}

LogLine signalLine() {
  return {5, std::string(formats::kSignalling), {LogField(std::string("queueServiceRequest"))}};
}

LogLine refusalLine(const std::string& service) {
  return {3,
          std::string(formats::kAlreadyIn),
          {LogField(std::string("updateInFlight")), LogField(service)}};
}

void setShare(PurgeRun& run, std::size_t at, std::uint64_t donation, std::uint64_t divisor) {
  LogLine& share = line(run, at);
  share.fields.at(1) = donation;
  share.fields.at(4) = divisor;
}

// The course of a run.

const Fault kCourse[] = {
    {"the run ends and leaves nothing blocked", "deadlock",
     [](PurgeRun& run) { run.report.end = rt::ScheduleEnd::kDeadlock; }},
    {"the run ends and leaves nothing blocked", "somebody left behind",
     [](PurgeRun& run) { run.report.blocked = {"somebody: waits"}; }},
    {"every line stands where it belongs", "a share that nobody computes",
     [](PurgeRun& run) {
       const std::size_t at = lineAt(run, formats::kDonation);
       repeat(run, at);
       run.events[at + 1].thread = 900;
     }},
    {"every line stands where it belongs", "a signal that no reply gives",
     [](PurgeRun& run) { insertAfter(run, lineAt(run, formats::kTook), signalLine()); }},
    {"every line stands where it belongs", "a share on no queue",
     [](PurgeRun& run) { run.events[lineAt(run, formats::kQueuing, 1)].queue = 0; }},
    {"every line stands where it belongs", "a share on a queue that is no purge's",
     [](PurgeRun& run) { run.events[lineAt(run, formats::kQueuing, 1)].queue = 900; }},
    {"every line stands where it belongs", "an addition to another in-flight set",
     [](PurgeRun& run) { run.events[lineAt(run, formats::kInFlight, 1)].queue = 900; }},
    {"every line stands where it belongs", "a reply that leaves another in-flight set",
     [](PurgeRun& run) { run.events[removalAt(run, "poor")].queue = 900; }},
    {"every line stands where it belongs", "a failure that leaves another in-flight set",
     [](PurgeRun& run) { run.events[removalAt(run, "broken")].queue = 900; }},
    {"each client gets exactly one answer", "two answers",
     [](PurgeRun& run) { repeat(run, clientAnswerAt(run)); }},
    {"each client gets exactly one answer", "no answer",
     [](PurgeRun& run) { drop(run, clientAnswerAt(run)); }},
    {"the answer is what the purge reported last", "another answer",
     [](PurgeRun& run) {
       auto& answered = std::get<ClientAnswered>(run.events[clientAnswerAt(run)].body);
       answered.answer->set("SPACEKEEP_AMOUNT", 77);
     }},
    {"the answer is what the purge reported last", "an answer to a refused request",
     [](PurgeRun& run) { run.scenario.purges.front().entitled = false; }},
    {"purges never overlap", "a second purge begins",
     [](PurgeRun& run) {
       const std::size_t at = lineAt(run, formats::kBegin);
       repeat(run, at);
       run.events[at + 1].thread = 900;
     }},
    {"only purging services are asked", "the keeper is asked",
     [](PurgeRun& run) {
       ServiceAsked asked{"keeper", "servicePurge", 900, 1, 5, "the purge"};
       insertAfter(run, purgeCallAt(run, "poor"), asked);
     }},
    {"only a purge that fell short cancels", "told twice to stop",
     [](PurgeRun& run) {
       repeat(run, eventAt<ServiceAsked>(run, [](const ServiceAsked& asked) {
                return asked.member == "serviceCancelPurge";
              }));
     }},
    {"only a purge that fell short cancels", "it had what it needed",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_AMOUNT", 10'000); }},
};

// Waits.

const Fault kWaits[] = {
    {"every urgency up to the limit runs", "another limit",
     [](PurgeRun& run) { line(run, lineAt(run, formats::kBegin)).fields.at(1) = std::int64_t{3}; }},
    {"every urgency up to the limit runs", "one urgency only",
     [](PurgeRun& run) { drop(run, lineAt(run, formats::kInQueue, 1)); }},
    {"waits are exact", "a nanosecond more",
     [](PurgeRun& run) { delayFrom(run, lineAt(run, formats::kTimedOut), 1); }},
    {"waits are exact", "time between the waits",
     [](PurgeRun& run) { delayFrom(run, lineAt(run, formats::kInQueue, 1), 1'000'000); }},
    {"waits are exact", "another wait announced",
     [](PurgeRun& run) {
       line(run, lineAt(run, formats::kWaiting)).fields.at(1) = std::uint64_t{3};
     }},
    {"only a reply ends a wait early", "no signal and no timeout",
     [](PurgeRun& run) { drop(run, lineAt(run, formats::kTimedOut)); }},
    {"only a reply ends a wait early", "a signal with a service in flight",
     [](PurgeRun& run) {
       insertAfter(run,
                   lineAt(run, formats::kInFlight, 0,
                          [](const LogLine& one) { return textField(one, 1) == "removing"; }),
                   signalLine());
     }},
    {"the last reply of a purge that waits signals it", "a signal after the end of the purge",
     [](PurgeRun& run) {
       const std::size_t end = lineAt(run, formats::kResult);
       const Event result = run.events[end];
       drop(run, end);
       const std::size_t removal = lineAt(run, formats::kInFlight, 0, [](const LogLine& one) {
         return textField(one, 1) == "removing";
       });
       insertAfter(run, removal, signalLine());
       run.events.insert(run.events.begin() + static_cast<std::ptrdiff_t>(removal), result);
     }},
};

// Shares.

const Fault kShares[] = {
    {"a share is an equal part of what is missing", "one byte more",
     [](PurgeRun& run) { setShare(run, lineAt(run, formats::kDonation), 2'501, 4); }},
    {"a share is an equal part of what is missing", "from a stale amount",
     [](PurgeRun& run) {
       line(run, lineAt(run, formats::kDonation)).fields.at(3) = std::uint64_t{400};
       setShare(run, lineAt(run, formats::kDonation), 2'400, 4);
     }},
    {"shares are computed one after another on their queue", "by the purge's own thread",
     [](PurgeRun& run) {
       run.events[lineAt(run, formats::kQueuing)].thread =
           run.events[lineAt(run, formats::kBegin)].thread;
     }},
    {"shares are computed one after another on their queue", "inside of a reply",
     [](PurgeRun& run) {
       const std::size_t reply = lineAt(run, formats::kPurged);
       insertAfter(run, reply, line(run, lineAt(run, formats::kQueuing)));
     }},
    {"shares are computed one after another on their queue", "two at a time",
     [](PurgeRun& run) {
       const std::size_t second = lineAt(run, formats::kQueuing, 1);
       const Event moved = run.events[second];
       drop(run, second);
       const std::size_t first = lineAt(run, formats::kQueuing);
       insertAfter(run, first, moved.body);
       run.events[first + 1].thread = 900;
       const std::size_t share = lineAt(run, formats::kDonation, 1);
       run.events[share].thread = 900;
     }},
    {"every service is offered its first share before any its second", "a second one between",
     [](PurgeRun& run) {
       const std::size_t last_of_first = lineAt(run, formats::kInFlight, 0, names("broken", 2));
       offerAfter(run, last_of_first);
     }},
    {"every service is offered its first share before any its second", "out of order",
     [](PurgeRun& run) {
       const std::size_t first = lineAt(run, formats::kQueuing);
       const std::size_t second = lineAt(run, formats::kQueuing, 1);
       for (std::size_t at : {first, second}) {
         const bool is_broken = textField(line(run, at), 1) == "broken";
         line(run, at).fields.at(1) = std::string(is_broken ? "generous" : "broken");
       }
     }},
    {"shares never add up to more than is missing", "the whole for each",
     [](PurgeRun& run) {
       for (std::size_t nth = 0; nth < 4; ++nth) {
         setShare(run, lineAt(run, formats::kDonation, nth), 10'000, 1);
       }
     }},
    {"nobody is asked for 0 bytes", "0 bytes",
     [](PurgeRun& run) {
       std::get<ServiceAsked>(run.events[purgeCallAt(run, "poor")].body).amount = 0;
     }},
    {"the divisor is the number of services that can still give", "one service less",
     [](PurgeRun& run) { setShare(run, lineAt(run, formats::kDonation), 3'333, 3); }},
};

// The in-flight set.

const Fault kInFlight[] = {
    {"no service is asked twice at once", "asked again",
     [](PurgeRun& run) {
       const std::size_t at = purgeCallAt(run, "poor");
       repeat(run, at);
       std::get<ServiceAsked>(run.events[at + 1].body).call = 900;
     }},
    {"no service is asked twice at once", "the service says so",
     [](PurgeRun& run) { run.asked_twice["poor"] = 1; }},
    {"the in-flight set follows requests and their ends", "a refusal without a reason",
     [](PurgeRun& run) {
       const std::size_t added = lineAt(run, formats::kInFlight);
       insertAfter(run, added, refusalLine("broken"));
     }},
    {"the in-flight set follows requests and their ends", "added while in flight",
     [](PurgeRun& run) { drop(run, lineAt(run, formats::kAlreadyIn)); }},
    {"every request ends once", "a reply that does not remove",
     [](PurgeRun& run) { drop(run, removalAt(run, "poor")); }},
    {"every request ends once", "a failure that does not remove",
     [](PurgeRun& run) { drop(run, removalAt(run, "broken")); }},
    {"a met share is followed by another offer", "one offer too many",
     [](PurgeRun& run) { offerAfter(run, lineAt(run, formats::kResult)); }},
};

// Amounts and statistics.

const Fault kAmounts[] = {
    {"the freed amount is what the volume gained", "the reported sum",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_AMOUNT", 4'321); }},
    {"the freed amount is what the volume gained", "another beginning",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_FREESPACE_BEGIN", 499); }},
    {"the freed amount is what the volume gained", "another end",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_FREESPACE_END", 500); }},
    {"the reported amount is the sum of the replies", "more",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_AMOUNT_REPORTED", 1'000'000); }},
    {"the reported amount is the sum of the replies", "less",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_AMOUNT_REPORTED", 1); }},
    {"statistics of services balance with replies", "a report is missing",
     [](PurgeRun& run) { drop(run, statisticAt(run, "poor.purged")); }},
    {"statistics of services balance with replies", "a time is missing",
     [](PurgeRun& run) { drop(run, statisticAt(run, "poor_purgeElapsedNanoseconds")); }},
    {"statistics of purges balance with outcomes", "a deficit is missing",
     [](PurgeRun& run) { drop(run, statisticAt(run, "SpacekeepPurgeDeficit")); }},
    {"statistics of purges balance with outcomes", "requested once only",
     [](PurgeRun& run) { drop(run, statisticAt(run, "SpacekeepPurgeAmountRequested")); }},
    {"statistics of purges balance with outcomes", "failed twice",
     [](PurgeRun& run) { repeat(run, statisticAt(run, "SpacekeepPurgeFailed")); }},
    {"statistics of purges balance with outcomes", "another total",
     [](PurgeRun& run) {
       std::get<StatisticSent>(run.events[statisticAt(run, "total.purged")].body).count = 5;
     }},
    {"urgency records name what services reported", "an amount that nobody gave",
     [](PurgeRun& run) {
       setInOutcome(run, "SPACEKEEP_URGENCY_1_OPERATION_INFO",
                    Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"poor", 11}}}});
     }},
    {"urgency records name what services reported", "no record",
     [](PurgeRun& run) { setInOutcome(run, "SPACEKEEP_URGENCY_2_OPERATION_INFO", "gone"); }},
};

std::vector<Fault> allFaults() {
  std::vector<Fault> faults;
  for (const auto& part : {std::span<const Fault>(kCourse), std::span<const Fault>(kWaits),
                           std::span<const Fault>(kShares), std::span<const Fault>(kInFlight),
                           std::span<const Fault>(kAmounts)}) {
    faults.insert(faults.end(), part.begin(), part.end());
  }
  return faults;
}

std::string textOfViolations(const std::vector<Violation>& violations) {
  std::string text;
  for (const Violation& violation : violations) {
    text += violation.invariant + ": " + violation.text + "\n";
  }
  return text;
}

TEST(Invariants, ASoundRunHoldsThemAll) {
  const auto violations = judge(soundRun());
  EXPECT_TRUE(violations.empty()) << textOfViolations(violations);
}

TEST(Invariants, TheSoundRunHoldsEveryKindOfEnd) {
  const PurgeRun run = soundRun();
  const PurgeStory story(run);
  ASSERT_EQ(story.operations.size(), 1U);
  EXPECT_EQ(story.operations.front().passes.size(), 2U);
  EXPECT_EQ(story.failures.size(), 2U);
  EXPECT_GE(story.replies.size(), 3U);
  EXPECT_TRUE(std::any_of(story.replies.begin(), story.replies.end(), metItsShare));
  EXPECT_NE(story.operations.front().cancelling_at, kNowhere);
}

TEST(Invariants, EachFindsTheFaultItIsFor) {
  for (const Fault& fault : allFaults()) {
    PurgeRun run = soundRun();
    fault.spoil(run);
    const auto violations = judge(run);
    EXPECT_TRUE(
        std::any_of(violations.begin(), violations.end(),
                    [&](const Violation& found) { return found.invariant == fault.invariant; }))
        << fault.invariant << ", " << fault.name << ", found:\n"
        << textOfViolations(violations);
  }
}

TEST(Invariants, EachHasAFaultInThisFile) {
  std::set<std::string> covered;
  for (const Fault& fault : allFaults()) covered.insert(fault.invariant);
  for (const Invariant& invariant : purgeInvariants()) {
    EXPECT_TRUE(covered.contains(invariant.name)) << invariant.name;
  }
}

TEST(Invariants, ARunThatDidNotEndIsJudgedForThatAlone) {
  PurgeRun run = soundRun();
  run.report.end = rt::ScheduleEnd::kStuck;
  run.events.clear();
  const auto violations = judge(run);
  ASSERT_EQ(violations.size(), 1U);
  EXPECT_EQ(violations.front().text, "the schedule ended as stuck");
}

}  // namespace
}  // namespace spacekeep::sim
