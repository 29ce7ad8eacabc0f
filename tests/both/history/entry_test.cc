// What an entry of the history tells: for each kind, for each reason of falling short, and with
// everything in the way that a client or a service can put there.
#include "history/entry.h"

#include <gtest/gtest.h>

#include <vector>

#include "history/history_keys.h"
#include "operations/info_keys.h"
#include "purge/decisions.h"

namespace spacekeep::history {
namespace {

using Reported = std::map<std::string, std::uint64_t>;

constexpr Date kEnded{1'700'000'000'000'000'000};

/// A purge of 1000 bytes on /data that got 400 at urgency 2, with everything said about it.
struct Course {
  Dictionary request{{keys::kVolume, "/data"}, {keys::kAmount, 1000}, {"OTHER", "of the client"}};
  Reported reported{{"cache", 300}, {"logs", 150}};
  std::size_t services = 2;
  std::int32_t urgency_limit = 3;
  std::optional<Asker> client = Asker{.uid = 1000, .pid = 77};
  Dictionary outcome{{keys::kVolume, "/data"},
                     {"OTHER", "of the client"},
                     {keys::kFreespaceBegin, 5000},
                     {keys::kFreespaceEnd, 5400},
                     {keys::kAmount, 400},
                     {keys::kAmountReported, 450},
                     {keys::kElapsedTime, 6.5},
                     {purge::urgencyInfoKey(1), answered()},
                     {purge::urgencyInfoKey(2), answered()},
                     {purge::urgencyInfoKey(3), Dictionary{}}};

  static Dictionary answered() { return {{keys::kReportingServices, Dictionary{{"cache", 0}}}}; }
  static Dictionary silent(Array service_ids) {
    return {{keys::kServicesInFlight, std::move(service_ids)}};
  }

  [[nodiscard]] Dictionary entry() const {
    return purgeEntry({.client = client,
                       .ended = kEnded,
                       .request = request,
                       .outcome = outcome,
                       .urgency_limit = urgency_limit,
                       .services = services,
                       .reported_by_service = reported});
  }
  [[nodiscard]] std::string why() const {
    const Dictionary made = entry();
    const std::string* text = stringAt(made, keys::kWhyShort);
    return text == nullptr ? "" : *text;
  }
};

TEST(PurgeEntry, TellsWhoAskedForWhatAndWhatCameOfIt) {
  Course course;
  course.client = Asker{.uid = 1000, .pid = 77, .program = "backup", .unit = "backup.service"};
  EXPECT_EQ(course.entry(),
            (Dictionary{{keys::kDate, kEnded},
                        {keys::kKind, "purge"},
                        {keys::kClient, Dictionary{{keys::kUid, 1000},
                                                   {keys::kPid, 77},
                                                   {keys::kProgram, "backup"},
                                                   {keys::kUnit, "backup.service"}}},
                        {keys::kVolume, "/data"},
                        {keys::kAmount, 1000},
                        {keys::kUrgencyLimit, 3},
                        {keys::kUrgency, 2},
                        {keys::kFreespaceBegin, 5000},
                        {keys::kFreespaceEnd, 5400},
                        {keys::kAmountFreed, 400},
                        {keys::kAmountReported, 450},
                        {keys::kReportingServices, Dictionary{{"cache", 300}, {"logs", 150}}},
                        {keys::kElapsedTime, 6.5},
                        {keys::kWhyShort, "nothing more to give"}}));
}

TEST(PurgeEntry, OfAProcessOfWhichLittleIsKnownLeavesTheRestOut) {
  EXPECT_EQ(*Course().entry().find(keys::kClient),
            Value(Dictionary{{keys::kUid, 1000}, {keys::kPid, 77}}));
}

TEST(PurgeEntry, WithoutAClientIsTheDaemonsOwnForLowSpace) {
  Course course;
  course.client.reset();
  EXPECT_EQ(*course.entry().find(keys::kKind), Value("low space"));
  EXPECT_FALSE(course.entry().contains(keys::kClient));
}

TEST(PurgeEntry, ThatReachedItsAmountIsNotShort) {
  Course course;
  course.outcome.set(keys::kAmount, 1000);
  EXPECT_EQ(course.why(), "");
  course.outcome.set(keys::kAmount, 999);
  EXPECT_EQ(course.why(), "nothing more to give");
}

TEST(PurgeEntry, FallsShortWithoutServices) {
  Course course;
  course.services = 0;
  course.reported.clear();
  EXPECT_EQ(course.why(), "no services");
}

TEST(PurgeEntry, FallsShortWhenAServiceDidNotAnswerInTime) {
  Course course;
  course.outcome.set(purge::urgencyInfoKey(3), Course::silent({"stuck"}));
  EXPECT_EQ(course.why(), "no answer in time");
  EXPECT_EQ(*course.entry().find(keys::kServicesInFlight), Value(Array{"stuck"}));
  EXPECT_EQ(*course.entry().find(keys::kUrgency), Value(3));
}

TEST(PurgeEntry, ASilenceThatEndedBeforeTheLastUrgencyIsForgiven) {
  Course course;
  course.outcome.set(purge::urgencyInfoKey(1), Course::silent({"late"}));
  EXPECT_EQ(course.why(), "nothing more to give");
  EXPECT_FALSE(course.entry().contains(keys::kServicesInFlight));
}

TEST(PurgeEntry, FallsShortWhenNobodyAnsweredAtAll) {
  Course course;
  course.reported.clear();
  course.outcome.set(purge::urgencyInfoKey(1), Dictionary());
  course.outcome.set(purge::urgencyInfoKey(2), Dictionary());
  EXPECT_EQ(course.why(), "no answer in time");
  EXPECT_FALSE(course.entry().contains(keys::kReportingServices));
  EXPECT_FALSE(course.entry().contains(keys::kUrgency)) << "nobody is known to have been asked";
}

TEST(PurgeEntry, FallsShortWhenItWasCancelled) {
  Course course;
  course.outcome.set(keys::kOperationCancelled, true);
  EXPECT_EQ(course.why(), "cancelled");
  EXPECT_EQ(*course.entry().find(keys::kOperationCancelled), Value(true));
}

TEST(PurgeEntry, OfARefusalTellsItsTextAndNothingThatDidNotHappen) {
  Course course;
  course.request.remove(keys::kAmount);
  course.outcome = Dictionary{{keys::kError, "Parameter error, no Amount key in info dict"}};
  EXPECT_EQ(
      course.entry(),
      (Dictionary{{keys::kDate, kEnded},
                  {keys::kKind, "purge"},
                  {keys::kClient, Dictionary{{keys::kUid, 1000}, {keys::kPid, 77}}},
                  {keys::kVolume, "/data"},
                  {keys::kUrgencyLimit, 3},
                  {keys::kWhyShort, "refused: Parameter error, no Amount key in info dict"}}));
}

TEST(PurgeEntry, BelievesNothingThatTheClientPutIntoItsRequest) {
  Course course;
  for (const auto& [key, value] : std::vector<std::pair<std::string, Value>>{
           {keys::kError, "made up"},
           {keys::kOperationCancelled, true},
           {keys::kWhyShort, "made up"},
           {keys::kReportingServices, Dictionary{{"made up", 1}}},
           {keys::kServicesInFlight, Array{"made up"}},
           {purge::urgencyInfoKey(3), Course::silent({"made up"})}}) {
    course.request.set(key, value);
    course.outcome.set(key, value);  // as a purge echoes what it does not write itself
  }
  EXPECT_EQ(course.why(), "nothing more to give");
  EXPECT_FALSE(course.entry().contains(keys::kOperationCancelled));
  EXPECT_FALSE(course.entry().contains(keys::kServicesInFlight));
  EXPECT_FALSE(course.entry().contains(keys::kError));
  EXPECT_EQ(*course.entry().find(keys::kReportingServices),
            Value(Dictionary{{"cache", 300}, {"logs", 150}}));
  EXPECT_EQ(*course.entry().find(keys::kUrgency), Value(2));
}

TEST(PurgeEntry, LooksAtNoUrgencyBeyondItsLimit) {
  Course course;
  course.urgency_limit = 1;
  EXPECT_EQ(*course.entry().find(keys::kUrgency), Value(1));
}

TEST(PurgeEntry, LeavesOutNumbersThatAreNone) {
  Course course;
  course.request.set(keys::kAmount, "1000");
  course.outcome.set(keys::kFreespaceBegin, "many");
  EXPECT_FALSE(course.entry().contains(keys::kAmount));
  EXPECT_FALSE(course.entry().contains(keys::kFreespaceBegin));
}

TEST(PurgeEntry, NamesTheThirtyTwoThatGaveMostAndAddsUpTheOthers) {
  Course course;
  course.reported.clear();
  for (std::uint64_t i = 1; i <= 40; ++i) course.reported["service" + std::to_string(i)] = i;
  const Dictionary entry = course.entry();
  const Dictionary named = *entry.find(keys::kReportingServices)->dictionary();
  EXPECT_EQ(named.size(), 32U);
  EXPECT_EQ(*named.find("service9"), Value(9));
  EXPECT_FALSE(named.contains("service8"));
  EXPECT_EQ(*entry.find(keys::kOtherServices), Value(1 + 2 + 3 + 4 + 5 + 6 + 7 + 8));
}

TEST(PurgeEntry, NamesThirtyTwoSilentServicesAtMost) {
  Course course;
  Array silent;
  for (int i = 0; i < 33; ++i) silent.push_back("service" + std::to_string(i));
  course.outcome.set(purge::urgencyInfoKey(3), Course::silent(silent));
  silent.pop_back();
  EXPECT_EQ(*course.entry().find(keys::kServicesInFlight), Value(silent));
}

TEST(PurgeEntry, StaysSmallWhateverServicesAreCalled) {
  Course course;
  const std::string longest(kMaxNamedIdBytes, 'a');
  const std::string too_long(kMaxNamedIdBytes + 1, 'b');
  course.reported = {{longest, 1}, {too_long, UINT64_MAX}, {too_long + "c", 5}};
  course.outcome.set(purge::urgencyInfoKey(3), Course::silent({too_long, longest}));
  const Dictionary entry = course.entry();
  EXPECT_EQ(*entry.find(keys::kReportingServices), Value(Dictionary{{longest, 1}}));
  EXPECT_EQ(*entry.find(keys::kOtherServices), Value(UINT64_MAX)) << "no overflow";
  EXPECT_EQ(*entry.find(keys::kServicesInFlight), Value(Array{longest}));
  EXPECT_EQ(course.why(), "no answer in time");
}

TEST(PurgeEntry, ASilentServiceThatCannotBeNamedIsStillSilent) {
  Course course;
  course.outcome.set(purge::urgencyInfoKey(3),
                     Course::silent({std::string(kMaxNamedIdBytes + 1, 'b')}));
  EXPECT_EQ(course.why(), "no answer in time");
  EXPECT_FALSE(course.entry().contains(keys::kServicesInFlight));
}

struct Pass {
  Dictionary request{{keys::kVolume, "/data"}};
  Dictionary outcome{{keys::kAmount, 70}};
  std::size_t services = 2;
  std::set<std::string> in_flight;
  std::uint64_t begin_bytes = 500;
  std::uint64_t end_bytes = 600;

  [[nodiscard]] Dictionary entry() const {
    return dailyPassEntry({.ended = kEnded,
                           .request = request,
                           .outcome = outcome,
                           .services = services,
                           .in_flight = in_flight,
                           .freespace_begin_bytes = begin_bytes,
                           .freespace_end_bytes = end_bytes,
                           .elapsed_seconds = 1.5});
  }
};

TEST(DailyPassEntry, TellsWhatTheVolumeGained) {
  EXPECT_EQ(Pass().entry(), (Dictionary{{keys::kDate, kEnded},
                                        {keys::kKind, "daily pass"},
                                        {keys::kVolume, "/data"},
                                        {keys::kFreespaceBegin, 500},
                                        {keys::kFreespaceEnd, 600},
                                        {keys::kAmountFreed, 100},
                                        {keys::kAmountReported, 70},
                                        {keys::kElapsedTime, 1.5}}));
}

TEST(DailyPassEntry, OfAVolumeThatOthersFilledMeanwhileGainedNothing) {
  Pass pass;
  pass.end_bytes = 400;
  EXPECT_EQ(*pass.entry().find(keys::kAmountFreed), Value(0));
}

TEST(DailyPassEntry, NamesWhoDidNotAnswer) {
  Pass pass;
  pass.in_flight = {"logs", "stuck"};
  EXPECT_EQ(*pass.entry().find(keys::kServicesInFlight), Value(Array{"logs", "stuck"}));
  EXPECT_EQ(*pass.entry().find(keys::kWhyShort), Value("no answer in time"));
}

TEST(DailyPassEntry, WithNobodyToAskSaysSo) {
  Pass pass;
  pass.services = 0;
  EXPECT_EQ(*pass.entry().find(keys::kWhyShort), Value("no services"));
}

}  // namespace
}  // namespace spacekeep::history
