#include <gtest/gtest.h>

#include <unistd.h>

#include <limits>

#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

Arguments arguments(Dictionary info, OptionalDictionary maybe_info = std::nullopt,
                    OptionalValue maybe_value = std::nullopt,
                    OptionalString maybe_text = std::nullopt) {
  return {std::int32_t{-5},      std::string("text \xC3\xA4"), std::move(info),
          std::move(maybe_info), std::move(maybe_value),       std::move(maybe_text)};
}

class RoundTrip : public ::testing::Test {
 protected:
  Arguments echo(Arguments sent) {
    Outcome outcome = callAndWait(server.connect(), "echo", std::move(sent));
    EXPECT_TRUE(outcome.reply) << (outcome.error ? outcome.error->text : "");
    return outcome.reply.value_or(Arguments{});
  }
  std::string errorOf(Arguments sent) {
    const Outcome outcome = callAndWait(server.connect(), "echo", std::move(sent));
    return outcome.error ? outcome.error->name + ": " + outcome.error->text : "";
  }
  TestServer server;
};

TEST_F(RoundTrip, EveryKindOfArgumentComesBackAsItWasSent) {
  const Arguments sent = arguments({{"A", 1}}, Dictionary{{"B", "two"}}, Value(3.5), "four");
  EXPECT_EQ(echo(sent), sent);
}

TEST_F(RoundTrip, EveryKindOfValueComesBackAsItWasSent) {
  const Dictionary info = {
      {"array", Array{1, "two", Array{}, Dictionary{}}},
      {"data", Data{{0, 1, 255}}},
      {"data_empty", Data{}},
      {"date", Date{1'700'000'000'123'456'789}},
      {"date_before_1970", Date{-1}},
      {"dictionary", Dictionary{{"inner", Dictionary{{"deeper", true}}}}},
      {"false", false},
      {"floating", 0.1},
      {"infinite", std::numeric_limits<double>::infinity()},
      {"signed_least", std::numeric_limits<std::int64_t>::min()},
      {"text", "text"},
      {"text_empty", ""},
      {"true", true},
      {"unsigned_most", std::numeric_limits<std::uint64_t>::max()},
  };
  const Arguments sent = arguments(info);
  const Arguments received = echo(sent);
  EXPECT_EQ(received, sent);
  // Equality of numbers goes by value, so the kinds are looked at as well.
  const auto& back = std::get<Dictionary>(received.at(2));
  for (const auto& entry : info) {
    EXPECT_EQ(back.find(entry.key)->storage().index(), entry.value.storage().index()) << entry.key;
  }
}

TEST_F(RoundTrip, NoDictionaryStaysDistinctFromAnEmptyOne) {
  EXPECT_FALSE(std::get<OptionalDictionary>(echo(arguments({})).at(3)).has_value());
  const auto empty = std::get<OptionalDictionary>(echo(arguments({}, Dictionary{})).at(3));
  ASSERT_TRUE(empty.has_value());
  EXPECT_TRUE(empty->empty());
}

TEST_F(RoundTrip, NoTextAndNoValueStayDistinctFromEmptyOnes) {
  const Arguments none = echo(arguments({}));
  EXPECT_FALSE(std::get<OptionalValue>(none.at(4)).has_value());
  EXPECT_FALSE(std::get<OptionalString>(none.at(5)).has_value());
  const Arguments empty = echo(arguments({}, std::nullopt, Value(""), ""));
  EXPECT_EQ(std::get<OptionalValue>(empty.at(4)), Value(""));
  EXPECT_EQ(std::get<OptionalString>(empty.at(5)), "");
}

Value nested(int levels) {
  Value value = 1;
  for (int level = 0; level < levels; ++level) {
    value = level % 2 == 0 ? Value(Array{value}) : Value(Dictionary{{"in", value}});
  }
  return value;
}

TEST_F(RoundTrip, NestingUpToTheLimitPasses) {
  const Arguments sent = arguments({{"deep", nested(kMaxValueDepth - 1)}});
  EXPECT_EQ(echo(sent), sent);
  const Arguments value = arguments({}, std::nullopt, nested(kMaxValueDepth));
  EXPECT_EQ(echo(value), value);
}

TEST_F(RoundTrip, DataInTheDeepestArrayPasses) {
  Value value(Data{{1, 2, 3}});
  for (int level = 0; level < kMaxValueDepth; ++level) value = Array{value};
  const Arguments sent = arguments({}, std::nullopt, value);
  EXPECT_EQ(echo(sent), sent);
}

TEST_F(RoundTrip, NestingBeyondTheLimitFailsTheCallAndNothingElse) {
  const std::string too_deep =
      "org.freedesktop.DBus.Error.InvalidArgs: the arguments do not fit into a message";
  EXPECT_EQ(errorOf(arguments({{"deep", nested(kMaxValueDepth)}})), too_deep);
  EXPECT_EQ(errorOf(arguments({}, std::nullopt, nested(kMaxValueDepth + 1))), too_deep);
  expectHonestClientIsServed(server);
}

TEST_F(RoundTrip, TextThatIsNoUtf8IsRepairedAndNotRefused) {
  const Arguments received = echo(arguments({{"key\xFF", "a\xC3(\xED\xA0\x80"}}));
  EXPECT_EQ(
      std::get<Dictionary>(received.at(2)),
      (Dictionary{{"key\xEF\xBF\xBD", "a\xEF\xBF\xBD(\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD"}}));
}

TEST_F(RoundTrip, AMessageNearTheSizeLimitPasses) {
  const Arguments sent = arguments({{"large", std::string(1000 * 1000, 'x')}});
  EXPECT_EQ(echo(sent), sent);
}

/// Numbers that come in two bytes each and go out in sixteen.
Dictionary growing() { return {{"numbers", Array(std::vector<Value>(60'000, Value(7)))}}; }

TEST_F(RoundTrip, ACallBeyondTheSizeLimitFailsAndNothingElse) {
  spacekeep::test::LogCapture log;
  const auto connection = server.connect();
  PendingCall before(connection, "hold", {});
  ASSERT_TRUE(eventually([this] { return server.held() == 1; }));
  const Outcome outcome =
      callAndWait(connection, "echo",
                  arguments({{"large", std::string(600'000, 'x')}, {"numbers", growing()}}));
  ASSERT_TRUE(outcome.error);
  EXPECT_EQ(outcome.error->name, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_NE(outcome.error->text.find("and a message 1048576 at most"), std::string::npos)
      << outcome.error->text;
  EXPECT_EQ(log.count(kLogProblem, "send echo is not called, its arguments have "), 1U);
  EXPECT_EQ(server.served(), 1U);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
  server.takeHeld().reply({std::string()});
  EXPECT_TRUE(before.wait().reply);
}

TEST_F(RoundTrip, AnAnswerBeyondTheSizeLimitIsAnErrorAndNothingElse) {
  spacekeep::test::LogCapture log;
  const auto connection = server.connect();
  PendingCall held(connection, "hold", {});
  ASSERT_TRUE(eventually([this] { return server.held() == 1; }));
  server.takeHeld().reply({std::string(1024 * 1024, 'x')});
  const Outcome outcome = held.wait();
  ASSERT_TRUE(outcome.error);
  EXPECT_EQ(outcome.error->name, "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(log.count(kLogProblem, "refused: The answer has "), 1U);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
}

TEST_F(RoundTrip, AnAnswerThatAPeerTakesNotEndsTheConnection) {
  ConnectionLimits limits;
  limits.message_bytes = 4096;
  const auto connection = server.connect(limits);
  PendingCall held(connection, "hold", {});
  ASSERT_TRUE(eventually([this] { return server.held() == 1; }));
  server.takeHeld().reply({std::string(8192, 'x')});
  const Outcome outcome = held.wait();
  ASSERT_TRUE(outcome.error);
  EXPECT_NE(outcome.error->text.find("more than 4096"), std::string::npos) << outcome.error->text;
}

TEST_F(RoundTrip, ArgumentsOfAnotherKindFailBeforeAnythingIsSent) {
  const Outcome outcome = callAndWait(server.connect(), "number", {std::string("no number")});
  ASSERT_TRUE(outcome.error);
  EXPECT_EQ(outcome.error->name, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_EQ(server.served(), 0U);
}

TEST_F(RoundTrip, AMemberThatIsNotDescribedFails) {
  const Outcome outcome = callAndWait(server.connect(), "noSuchThing", {});
  ASSERT_TRUE(outcome.error);
  EXPECT_EQ(outcome.error->name, "org.freedesktop.DBus.Error.UnknownMethod");
}

TEST_F(RoundTrip, AHandlerSeesWhoCalls) {
  const Outcome outcome = callAndWait(server.connect(), "whoAmI", {});
  ASSERT_TRUE(outcome.reply);
  EXPECT_EQ(std::get<OptionalValue>(outcome.reply->at(0)), Value(::geteuid()));
}

}  // namespace
}  // namespace spacekeep::ipc::test
