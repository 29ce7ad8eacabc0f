// Each invariant on the whole daemon finds the fault it is for, in a run that is right but for it.
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <set>
#include <string>

#include "sim/invariants/system/system_invariants.h"
#include "sim/program/one_run.h"

namespace spacekeep::sim {
namespace {

PlannedAction action(std::uint64_t at_ns,
                     std::variant<CallAction, SpaceAction, LowSpaceAction, DailyAction, ClockAction,
                                  DiskAction, ServiceAction>
                         what) {
  return {.life = 0, .at_ns = at_ns, .what = std::move(what)};
}

CallAction calls(const char* member, Dictionary info) {
  return {.client = "app",
          .rights = {"PURGE_ENTITLEMENT", "PURGEABLE_ENTITLEMENT"},
          .member = member,
          .info = std::move(info),
          .key = {},
          .value = {}};
}

CallAction sets(const char* key, Value value) {
  CallAction call = calls("clientSetState", {});
  call.key = key;
  call.value = std::move(value);
  return call;
}

CallAction gets(const char* key) {
  CallAction call = calls("clientGetState", {});
  call.key = key;
  return call;
}

/// A declared service and one that checks in; a query, a purge, settings, low space, a daily pass.
SystemPlan soundPlan() {
  constexpr std::uint64_t kSecond = 1'000'000'000;
  SystemPlan plan;
  plan.volumes = {{"/", 1'000'000'000, 100'000'000}};
  plan.services.push_back(
      {.id = "a-cache",
       .descriptor = Dictionary{{"SPACEKEEP_NOTIFICATIONS", Array{"SPACEKEEP_CACHE_ENABLED"}}},
       .check_in_info = {},
       .behaviour = ownsBytes("/", 300'000'000)});
  plan.services.push_back({.id = "b-cache",
                           .descriptor = {},
                           .check_in_info = {{"PURGE", true}},
                           .behaviour = ownsBytes("/", 5'000)});
  const Dictionary on_root = {{"SPACEKEEP_VOLUME", "/"}};
  plan.actions = {
      action(1 * kSecond, calls("clientPurgeableSpace", on_root)),
      action(2 * kSecond, calls("clientItemizedPurgeableSpace", on_root)),
      action(3 * kSecond, sets("SPACEKEEP_CACHE_ENABLED", false)),
      action(4 * kSecond, gets("SPACEKEEP_CACHE_ENABLED")),
      action(5 * kSecond, calls("clientPurge", {{"SPACEKEEP_VOLUME", "/"},
                                                {"SPACEKEEP_AMOUNT", 20'000},
                                                {"SPACEKEEP_URGENCY", 1}})),
      action(60 * kSecond, LowSpaceAction{.volumes = {"/"}, .event = {{"_Flags", 4}}}),
      action(2000 * kSecond, DailyAction{}),
  };
  return plan;
}

const SystemRun& soundRun() {
  static const SystemRun run = playSystem(soundPlan(), 1);
  return run;
}

template <class Body>
std::size_t eventAt(const SystemRun& run, const std::function<bool(const Body&)>& which) {
  for (std::size_t at = 0; at < run.events.size(); ++at) {
    const auto* body = std::get_if<Body>(&run.events[at].body);
    if (body != nullptr && which(*body)) return at;
  }
  ADD_FAILURE() << "the sound run has no such event";
  return 0;
}

template <class Body>
Body& first(SystemRun& run, const std::function<bool(const Body&)>& which) {
  return std::get<Body>(run.events[eventAt<Body>(run, which)].body);
}

template <class Body>
std::function<bool(const Body&)> ofMember(const char* member) {
  return [member](const Body& body) { return body.member == member; };
}

std::function<bool(const LogLine&)> ofFormat(std::string_view format) {
  return [format](const LogLine& line) { return line.format == format; };
}

void drop(SystemRun& run, std::size_t at) {
  run.events.erase(run.events.begin() + static_cast<std::ptrdiff_t>(at));
}

void repeat(SystemRun& run, std::size_t at) {
  const Event event = run.events.at(at);
  run.events.insert(run.events.begin() + static_cast<std::ptrdiff_t>(at), event);
}

struct SystemFault {
  const char* invariant;
  const char* name;
  std::function<void(SystemRun&)> spoil;
};

const SystemFault kFaults[] = {
    {"the run ends, or stands still on a silent ping", "a deadlock",
     [](SystemRun& run) { run.end = SystemEnd::kDeadlock; }},
    {"the run ends, or stands still on a silent ping", "a silent ping that nobody planned",
     [](SystemRun& run) { run.end = SystemEnd::kSilentPing; }},
    {"every call ends as it must, once", "two answers",
     [](SystemRun& run) {
       repeat(run, eventAt<ClientAnswered>(run, ofMember<ClientAnswered>("clientPurge")));
     }},
    {"every call ends as it must, once", "no answer",
     [](SystemRun& run) {
       drop(run, eventAt<ClientAnswered>(run, ofMember<ClientAnswered>("clientGetState")));
     }},
    {"an answer is the outcome of its own request", "another amount",
     [](SystemRun& run) {
       first<ClientAnswered>(run, ofMember<ClientAnswered>("clientPurge"))
           .answer->set("SPACEKEEP_AMOUNT", 77);
     }},
    {"an answer is the outcome of its own request", "an answer without the right",
     [](SystemRun& run) {
       first<ClientAnswered>(run, ofMember<ClientAnswered>("clientItemizedPurgeableSpace")).answer =
           Dictionary{{"a-cache", 1}};
     }},
    {"a refused request does nothing", "a query that ran without the right",
     [](SystemRun& run) {
       first<ClientAsked>(run, ofMember<ClientAsked>("clientPurgeableSpace")).rights.clear();
     }},
    {"an operation waits for those before it in its own queue only", "a purge that came late",
     [](SystemRun& run) {
       Event& event = run.events[eventAt<ClientAsked>(run, ofMember<ClientAsked>("clientPurge"))];
       event.at_ns -= 1'000;
     }},
    {"state calls and cancels do not wait for operations", "a read that took a second",
     [](SystemRun& run) {
       const std::size_t at = eventAt<ClientAsked>(run, ofMember<ClientAsked>("clientGetState"));
       run.events[at].at_ns -= 1'000'000'000;
     }},
    {"a query waits as long as its urgency allows", "another time than it took",
     [](SystemRun& run) {
       first<LogLine>(run, ofFormat("%s elapsed time: %f result: %@")).fields.at(1) = 0.5;
     }},
    {"a query's result is the sum of what is remembered", "a wrong sum",
     [](SystemRun& run) {
       auto& line = first<LogLine>(run, ofFormat("%s elapsed time: %f result: %@"));
       Dictionary result = *std::get<Value>(line.fields.at(2)).dictionary();
       result.set("SPACEKEEP_TOTAL_AVAILABLE", 1);
       line.fields.at(2) = Value(result);
     }},
    {"a query asks whom the record does not know, and nobody else", "somebody was left out",
     [](SystemRun& run) {
       first<LogLine>(run, ofFormat("%s servicesToQuery: %@")).fields.at(1) =
           Value(Array{"a-cache"});
     }},
    {"a query asks each service once, with its own request", "asked twice",
     [](SystemRun& run) {
       repeat(run, eventAt<ServiceAsked>(run, ofMember<ServiceAsked>("servicePurgeable")));
     }},
    {"every answer to a query is remembered", "an answer that is lost",
     [](SystemRun& run) {
       drop(run,
            eventAt<LogLine>(run, ofFormat("%s ^^^ENTRY, serviceID: %@ : %@, recentInfo: %@")));
     }},
    {"the record holds what was answered lately, and nothing else", "another amount is counted",
     [](SystemRun& run) {
       for (Event& event : run.events) {
         auto* line = std::get_if<LogLine>(&event.body);
         if (line == nullptr || line->format != "%s servicesToCount: %@") continue;
         Dictionary counted = *std::get<Value>(line->fields.at(1)).dictionary();
         if (counted.empty()) continue;
         counted.set("a-cache", 1);
         line->fields.at(1) = Value(counted);
         return;
       }
     }},
    {"a read sees the last write that was answered", "the default after a change",
     [](SystemRun& run) {
       first<ClientAnswered>(run, ofMember<ClientAnswered>("clientGetState")).value = Value(true);
     }},
    {"what is answered as stored is on the disk", "no write before the answer",
     [](SystemRun& run) {
       drop(run, eventAt<DiskWritten>(run, [](const DiskWritten& written) {
              const Value* state = written.contents.find("SPACEKEEP_USER_DEFAULTS");
              return state != nullptr && state->dictionary()->contains("SPACEKEEP_CACHE_ENABLED");
            }));
     }},
    {"a stored setting is told to those who want to know", "nobody was told",
     [](SystemRun& run) {
       drop(run, eventAt<ServiceAsked>(run, ofMember<ServiceAsked>("serviceNotify")));
     }},
    {"nothing but services that purge is asked to purge", "a service that only checks in",
     [](SystemRun& run) {
       first<ClientAsked>(run, ofMember<ClientAsked>("clientCheckin")).info = Dictionary();
     }},
    {"a service is pinged once, as it is registered", "a second ping",
     [](SystemRun& run) {
       repeat(run, eventAt<LogLine>(run, ofFormat("%s calling servicePing")));
     }},
    {"low space purges 250 MiB on each low volume", "a volume that is not low",
     [](SystemRun& run) {
       first<StreamEventSent>(run, [](const StreamEventSent&) { return true; }).low_volumes.clear();
     }},
    {"low-space events are counted by their flag", "counted twice",
     [](SystemRun& run) {
       first<StatisticSent>(run, [](const StatisticSent& sent) {
         return sent.key == "SK_LOWDISK_EVENT";
       }).count = 2;
     }},
    {"a periodic pass asks each service once and ends within 15 s", "a pass too many",
     [](SystemRun& run) { repeat(run, eventAt<LogLine>(run, ofFormat("%s result: %@"))); }},
    {"periodic work is asked for at urgency 3 of those who purge", "urgency 4",
     [](SystemRun& run) {
       first<ServiceAsked>(run, ofMember<ServiceAsked>("servicePeriodic")).urgency = 4;
     }},
    {"keep-alive transactions balance", "one left open",
     [](SystemRun& run) { run.lives.front().keep_alive_open = 1; }},
    {"log lines have their formats and levels", "a level of its own",
     [](SystemRun& run) { first<LogLine>(run, ofFormat("%s ping got pong")).level = 3; }},
    {"statistics have their domain and names", "an unknown name",
     [](SystemRun& run) {
       first<StatisticSent>(run, [](const StatisticSent& sent) {
         return sent.key == "SK_LOWDISK_EVENT";
       }).key = "SK_EVENT";
     }},
    {"the reported amount is the sum of the replies", "a reply too many",
     [](SystemRun& run) {
       first<LogLine>(run, ofFormat("%s %@ service purged: %llu")).fields.at(2) =
           std::uint64_t{999'999};
     }},
};

std::set<std::string> invariantsOf(const std::vector<Violation>& violations) {
  std::set<std::string> names;
  for (const Violation& violation : violations) names.insert(violation.invariant);
  return names;
}

TEST(SystemInvariants, TheSoundRunHasNoViolation) {
  EXPECT_EQ(soundRun().end, SystemEnd::kFinished);
  for (const Violation& violation : judge(soundRun())) {
    ADD_FAILURE() << violation.invariant << ": " << violation.text;
  }
}

TEST(SystemInvariants, EachFindsTheFaultItIsFor) {
  for (const SystemFault& fault : kFaults) {
    SystemRun run = soundRun();
    fault.spoil(run);
    EXPECT_TRUE(invariantsOf(judge(run)).contains(fault.invariant))
        << fault.invariant << " does not see: " << fault.name;
  }
}

TEST(SystemInvariants, AnUndisturbedPlanIsPlayedToTheSameBytesTwice) {
  const SystemRun again = playSystem(soundPlan(), 1);
  EXPECT_EQ(again.trace_hash, soundRun().trace_hash);
  EXPECT_EQ(again.events.size(), soundRun().events.size());
}

TEST(SystemInvariants, HoldInTheFirstSeeds) {
  for (std::uint64_t seed = 1; seed <= 150; ++seed) {
    const Verdict verdict = playOnce(Scenario::kSystem, seed);
    for (const Violation& violation : verdict.violations) {
      ADD_FAILURE() << "seed " << seed << ": " << violation.invariant << ": " << violation.text;
    }
  }
}

// What these seeds show is right, and was once taken for wrong.
struct Misread {
  std::uint64_t seed;
  const char* what;
};

class OnceMisread : public ::testing::TestWithParam<Misread> {};

TEST_P(OnceMisread, IsJudgedRight) {
  const Verdict verdict = playOnce(Scenario::kSystem, GetParam().seed);
  for (const Violation& violation : verdict.violations) {
    ADD_FAILURE() << violation.invariant << ": " << violation.text;
  }
}

INSTANTIATE_TEST_SUITE_P(
    Seeds, OnceMisread,
    ::testing::Values(Misread{3758, "AShareAfterTheSignalAndBeforeTheLineOfTheNewDivisor"},
                      Misread{6251, "KilledBetweenTheRecordOfAnAmountAndItsLine"},
                      Misread{18831, "TwoAnswersWithoutDictionaryInOneMoment"},
                      Misread{38863, "KilledBeforeALateOfferOfAPurgeThatHadEnded"},
                      Misread{56104, "KilledBetweenAnAdditionAndItsRefusal"},
                      Misread{67344, "ARecordThatCouldNotBeDeletedWhileTheDiskFailed"},
                      Misread{116327, "TwoPurgesOfLowSpaceThatCannotBeToldApart"},
                      Misread{148319, "ALateAnswerWithoutDictionaryInPlaceOfTheOutcome"},
                      Misread{169372, "ASilentPingInALifeThatIsNotTheLast"},
                      Misread{695183, "TwoAnswersWithoutDictionaryForEqualSharesInOneMoment"}),
    [](const ::testing::TestParamInfo<Misread>& one) { return std::string(one.param.what); });

TEST(OneRun, LeavingOutElementsLeavesThemOutOfThePlan) {
  const std::size_t elements = elementsOf(Scenario::kSystem, 3);
  ASSERT_GT(elements, 4U);
  std::vector<std::size_t> all(elements);
  for (std::size_t i = 0; i < elements; ++i) all[i] = i;
  const Verdict nothing = playOnce(Scenario::kSystem, 3, all);
  EXPECT_LT(nothing.events, playOnce(Scenario::kSystem, 3).events);
  EXPECT_EQ(complementOf({1, 3}, 5), (std::vector<std::size_t>{0, 2, 4}));
}

}  // namespace
}  // namespace spacekeep::sim
