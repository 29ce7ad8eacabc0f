// A client that knows only the D-Bus interface: what it may send, and what it is told when it errs.
#include <gtest/gtest.h>

#include <unistd.h>

#include <mutex>
#include <string>
#include <vector>

#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

constexpr const char* kInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";
constexpr const char* kUnknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
constexpr const char* kUnknownInterface = "org.freedesktop.DBus.Error.UnknownInterface";
constexpr const char* kUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";

class ForeignClient : public ::testing::Test {
 protected:
  /// Sends `echo` with the arguments in these two strings' stead.
  template <class... Parts>
  std::string errorOfEcho(const char* signature, Parts... parts) {
    sd_bus_message* call = client.newCall("echo");
    EXPECT_GE(sd_bus_message_append(call, signature, parts...), 0) << signature;
    return client.errorOf(call, &text);
  }
  /// Sends `echo` whose info holds one entry "KEY" of the given kind, and hands it back.
  template <class... Parts>
  std::optional<Value> echoed(const char* contents, Parts... parts) {
    sd_bus_message* call = client.newCall("echo");
    EXPECT_GE(sd_bus_message_append(call, "is", 1, "text"), 0);
    EXPECT_GE(sd_bus_message_append(call, "a{sv}", 1, "KEY", contents, parts...), 0) << contents;
    EXPECT_GE(sd_bus_message_append(call, "aa{sv}avas", 0, 0, 0), 0);
    text.clear();
    const std::string error = client.errorOf(call, &text);
    return error.empty() ? seen() : std::nullopt;
  }

  std::optional<Value> seen() {
    const std::scoped_lock lock(mutex_);
    const Value* value = last_.find("KEY");
    return value == nullptr ? std::nullopt : std::optional<Value>(*value);
  }

  static ServedInterface recording(ForeignClient* self) {
    ServedInterface served;
    served.description = &testInterface();
    for (const MethodDescription& described : testInterface().methods) {
      ServedMethod method;
      method.name = described.name;
      method.serve = [self](Arguments arguments, const Responder& responder) {
        if (arguments.size() == 6) {
          const std::scoped_lock lock(self->mutex_);
          self->last_ = std::get<Dictionary>(arguments.at(2));
        }
        responder.reply(std::move(arguments));
      };
      served.methods.push_back(std::move(method));
    }
    ServedMethod aside;
    aside.name = "aside";
    aside.serve = [](const Arguments&, const Responder& responder) {
      responder.reply({std::string()});
    };
    served.methods.push_back(std::move(aside));
    return served;
  }

  spacekeep::test::TemporaryDirectory directory;
  ConcurrentQueue global{{}};
  IpcLoop loop;
  std::string why;
  std::string text;
  rt::Mutex mutex_;
  Dictionary last_;  // protected by mutex_
  SharedDescriptor listening = bindListeningSocket(directory / "s", 0600, why);
  BusServer server{loop, global, recording(this), TestServer::defaultOptions()};
  bool started = (server.serveListening(listening), true);
  BareClient client{directory / "s"};
};

TEST_F(ForeignClient, MaySendNumbersOfEveryType) {
  EXPECT_EQ(echoed("y", 200), Value(200U));
  EXPECT_EQ(echoed("n", -300), Value(-300));
  EXPECT_EQ(echoed("q", 60'000), Value(60'000U));
  EXPECT_EQ(echoed("i", -70'000), Value(-70'000));
  EXPECT_EQ(echoed("u", 4'000'000'000U), Value(4'000'000'000U));
  EXPECT_EQ(echoed("x", std::int64_t{-1} << 40U), Value(-(std::int64_t{1} << 40U)));
  EXPECT_EQ(echoed("t", UINT64_MAX), Value(UINT64_MAX));
  EXPECT_EQ(echoed("d", 0.5), Value(0.5));
}

TEST_F(ForeignClient, MaySendTextsAndBooleansOfEveryType) {
  EXPECT_EQ(echoed("s", "text"), Value("text"));
  EXPECT_EQ(echoed("o", "/a/path"), Value("/a/path"));
  EXPECT_EQ(echoed("g", "a{sv}"), Value("a{sv}"));
  EXPECT_EQ(echoed("b", 1), Value(true));
}

TEST_F(ForeignClient, MaySendTypedContainers) {
  EXPECT_EQ(echoed("ay", 2, 1, 2), Value(Data{{1, 2}}));
  EXPECT_EQ(echoed("as", 2, "a", "b"), Value(Array{"a", "b"}));
  EXPECT_EQ(echoed("at", 1, std::uint64_t{5}), Value(Array{5U}));
  EXPECT_EQ(echoed("aas", 2, 1, "a", 0), Value(Array{Array{"a"}, Array{}}));
  EXPECT_EQ(echoed("a{ss}", 1, "k", "v"), Value(Dictionary{{"k", "v"}}));
  EXPECT_EQ(echoed("aa{st}", 1, 1, "k", std::uint64_t{1}), Value(Array{Dictionary{{"k", 1}}}));
  EXPECT_EQ(echoed("v", "v", "s", "deep"), Value("deep"));
  EXPECT_EQ(echoed("(sx)", "date", std::int64_t{5}), Value(Date{5}));
}

TEST_F(ForeignClient, KeysInAnyOrderAndTwiceEndSortedWithTheLastValue) {
  EXPECT_EQ(echoed("a{ss}", 3, "b", "1", "a", "2", "b", "3"),
            Value(Dictionary{{"a", "2"}, {"b", "3"}}));
}

TEST_F(ForeignClient, IsToldWhatNoValueCanBe) {
  EXPECT_EQ(echoed("(ss)", "a", "b"), std::nullopt);
  EXPECT_EQ(text, "echo: argument 3 (info) holds a structure");
  EXPECT_EQ(echoed("(sx)", "moment", std::int64_t{5}), std::nullopt);
  EXPECT_EQ(text, "echo: argument 3 (info) holds a structure");
  EXPECT_EQ(echoed("a{us}", 1, 1, "a"), std::nullopt);
  EXPECT_EQ(text, "echo: argument 3 (info) holds a dictionary whose keys are not strings");
  EXPECT_EQ(echoed("h", STDIN_FILENO), std::nullopt);
  EXPECT_EQ(text, "echo: argument 3 (info) holds a descriptor inside a value");
}

TEST_F(ForeignClient, IsToldWhenVariantsAreWrappedTooDeep) {
  sd_bus_message* call = client.newCall("echo");
  ASSERT_GE(sd_bus_message_append(call, "isa{sv}aa{sv}", 1, "", 0, 0), 0);
  ASSERT_GE(sd_bus_message_open_container(call, 'a', "v"), 0);
  const int wrappings = kMaxValueDepth + 2;
  for (int i = 0; i < wrappings; ++i) {
    ASSERT_GE(sd_bus_message_open_container(call, 'v', i + 1 < wrappings ? "v" : "s"), 0);
  }
  ASSERT_GE(sd_bus_message_append(call, "s", "inside"), 0);
  for (int i = 0; i <= wrappings; ++i) ASSERT_GE(sd_bus_message_close_container(call), 0);
  ASSERT_GE(sd_bus_message_append(call, "as", 0), 0);
  EXPECT_EQ(client.errorOf(call, &text), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 5 (maybe_value) is nested too deep");
}

TEST_F(ForeignClient, IsToldWhenThereAreTooManyValues) {
  sd_bus_message* call = client.newCall("echo");
  ASSERT_GE(sd_bus_message_append(call, "isa{sv}aa{sv}", 1, "", 0, 0), 0);
  ASSERT_GE(sd_bus_message_open_container(call, 'a', "v"), 0);
  ASSERT_GE(sd_bus_message_open_container(call, 'v', "an"), 0);
  const std::vector<std::int16_t> numbers(70'000);
  ASSERT_GE(sd_bus_message_append_array(call, 'n', numbers.data(), numbers.size() * 2), 0);
  ASSERT_GE(sd_bus_message_close_container(call), 0);
  ASSERT_GE(sd_bus_message_close_container(call), 0);
  ASSERT_GE(sd_bus_message_append(call, "as", 0), 0);
  EXPECT_EQ(client.errorOf(call, &text), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 5 (maybe_value) holds too many values");
}

TEST_F(ForeignClient, IsToldWhichArgumentShouldBeWhat) {
  EXPECT_EQ(errorOfEcho("ssa{sv}aa{sv}avas", "1", "", 0, 0, 0, 0), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 1 (number) should be a 32-bit integer (i), not s");
  EXPECT_EQ(errorOfEcho("iua{sv}aa{sv}avas", 1, 1, 0, 0, 0, 0), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 2 (text) should be a string (s), not u");
  EXPECT_EQ(errorOfEcho("isa{ss}aa{sv}avas", 1, "", 0, 0, 0, 0), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 3 (info) should be a dictionary (a{sv}), not a{ss}");
  EXPECT_EQ(errorOfEcho("isa{sv}a{sv}avas", 1, "", 0, 0, 0, 0), kInvalidArgs);
  EXPECT_EQ(text,
            "echo: argument 4 (maybe_info) should be an array of no or one dictionary (aa{sv}), "
            "not a{sv}");
  EXPECT_EQ(errorOfEcho("isa{sv}aa{sv}sas", 1, "", 0, 0, "", 0), kInvalidArgs);
  EXPECT_EQ(text,
            "echo: argument 5 (maybe_value) should be an array of no or one value (av), not s");
  EXPECT_EQ(errorOfEcho("isa{sv}aa{sv}avs", 1, "", 0, 0, 0, ""), kInvalidArgs);
  EXPECT_EQ(text,
            "echo: argument 6 (maybe_text) should be an array of no or one string (as), not s");
}

TEST_F(ForeignClient, IsToldAboutMissingAndSuperfluousArguments) {
  EXPECT_EQ(errorOfEcho("is", 1, ""), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 3 (info) should be a dictionary (a{sv}), not absent");
  EXPECT_EQ(errorOfEcho("isa{sv}aa{sv}avass", 1, "", 0, 0, 0, 0, ""), kInvalidArgs);
  EXPECT_EQ(text, "echo: there should be 6 arguments, not more");
  EXPECT_EQ(errorOfEcho("isa{sv}aa{sv}avas", 1, "", 0, 2, 0, 0, 0, 0), kInvalidArgs);
  EXPECT_EQ(text, "echo: argument 4 (maybe_info) should have at most one element");
}

TEST_F(ForeignClient, IsToldWhatDoesNotExist) {
  EXPECT_EQ(client.errorOf(client.newCall("nothing")), kUnknownMethod);
  EXPECT_EQ(client.errorOf(client.newCall("echo", "org.example.Other")), kUnknownInterface);
  EXPECT_EQ(client.errorOf(client.newCall("echo", "com.quorvel.IpcTest", "/other")),
            kUnknownObject);
  EXPECT_EQ(client.errorOf(client.newCall("Nothing", "org.freedesktop.DBus.Peer")), kUnknownMethod);
}

TEST_F(ForeignClient, MayLeaveTheInterfaceOut) {
  EXPECT_EQ(client.errorOf(client.newCall("forget", nullptr)), "");
}

TEST_F(ForeignClient, FindsAMethodOnlyInItsInterface) {
  EXPECT_EQ(client.errorOf(client.newCall("aside", "com.quorvel.IpcTestAside")), "");
  EXPECT_EQ(client.errorOf(client.newCall("aside", nullptr)), "");
  EXPECT_EQ(client.errorOf(client.newCall("aside")), kUnknownMethod);
  EXPECT_EQ(client.errorOf(client.newCall("forget", "com.quorvel.IpcTestAside")), kUnknownMethod);
}

TEST_F(ForeignClient, GetsAnswersToTheStandardQuestions) {
  EXPECT_EQ(client.errorOf(client.newCall("Ping", "org.freedesktop.DBus.Peer")), "");
  EXPECT_EQ(client.errorOf(client.newCall("GetMachineId", "org.freedesktop.DBus.Peer")), "");
}

TEST_F(ForeignClient, FindsTheInterfaceByIntrospection) {
  const auto introspect = [this](const char* path) {
    sd_bus_message* reply = nullptr;
    const char* xml = "";
    sd_bus_call_method(client.bus(), nullptr, path, "org.freedesktop.DBus.Introspectable",
                       "Introspect", nullptr, &reply, "");
    if (reply != nullptr) sd_bus_message_read(reply, "s", &xml);
    std::string result = xml;
    sd_bus_message_unref(reply);
    return result;
  };
  EXPECT_EQ(introspect(kObjectPath), introspectionXml(testInterface()));
  EXPECT_EQ(introspect("/"), "<node>\n  <node name=\"com\"/>\n</node>\n");
  EXPECT_EQ(introspect("/com/quorvel"), "<node>\n  <node name=\"Spacekeep\"/>\n</node>\n");
  EXPECT_EQ(introspect("/com/quor"), "");
  EXPECT_EQ(introspect("/com/quorvel/Spacekeep/more"), "");
}

}  // namespace
}  // namespace spacekeep::ipc::test
