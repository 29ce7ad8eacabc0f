// What the adaptor answers when a call cannot be served.
#include "client/client_adaptor.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace spacekeep::test {
namespace {

/// Counts calls and answers none.
class UncalledExport final : public SpacekeepClientProtocol {
 public:
  void clientCheckin(std::string, ipc::SharedDescriptor, Dictionary, CheckinReply) override {
    ++calls;
  }
  void clientPurgeableSpace(Dictionary, DictionaryReply) override { ++calls; }
  void clientItemizedPurgeableSpace(Dictionary, DictionaryReply) override { ++calls; }
  void clientPurge(Dictionary, DictionaryReply) override { ++calls; }
  void clientCancelPurge(Dictionary, EmptyReply) override { ++calls; }
  void clientSetState(ipc::OptionalValue, std::string, EmptyReply, StoreFailure) override {
    ++calls;
  }
  void clientGetState(std::string, ValueReply) override { ++calls; }

  int calls = 0;
};

struct Heard {
  std::vector<std::string> errors;
  int replies = 0;

  ipc::Responder responder() {
    return {
        .reply = [this](const ipc::Arguments&) { ++replies; },
        .fail =
            [this](const ipc::Error& error) { errors.push_back(error.name + ": " + error.text); }};
  }
};

TEST(ClientAdaptor, ArgumentsOfAnotherSignatureAreRefusedByEveryMember) {
  const auto exported = std::make_shared<UncalledExport>();
  const ipc::ServedInterface served = makeClientAdaptor(exported);
  ASSERT_EQ(served.methods.size(), 7U);
  for (const ipc::ServedMethod& method : served.methods) {
    Heard heard;
    method.serve({std::int32_t{7}, ipc::OptionalString()}, heard.responder());
    EXPECT_EQ(heard.errors, std::vector<std::string>{"org.freedesktop.DBus.Error.InvalidArgs: " +
                                                     std::string(method.name) +
                                                     ": arguments do not match the signature"});
    EXPECT_EQ(heard.replies, 0);
  }
  EXPECT_EQ(exported->calls, 0);
}

TEST(ClientAdaptor, WhenTheDaemonObjectIsGoneEveryMemberSaysSo) {
  auto exported = std::make_shared<UncalledExport>();
  const ipc::ServedInterface served = makeClientAdaptor(exported);
  exported.reset();
  for (const ipc::ServedMethod& method : served.methods) {
    Heard heard;
    method.serve({Dictionary()}, heard.responder());
    EXPECT_EQ(heard.errors, std::vector<std::string>{"org.freedesktop.DBus.Error.UnknownObject: "
                                                     "the daemon object is gone"});
  }
}

TEST(ClientAdaptor, OnlyWhatIsOverInMicrosecondsIsServedByTheThreadThatReadsTheMessages) {
  const ipc::ServedInterface served = makeClientAdaptor(std::make_shared<UncalledExport>());
  std::vector<std::string> brief;
  std::vector<std::string> in_turns;
  for (const ipc::ServedMethod& method : served.methods) {
    if (method.brief) brief.emplace_back(method.name);
    if (method.turn_per_user) in_turns.emplace_back(method.name);
  }
  EXPECT_EQ(brief, (std::vector<std::string>{"clientCancelPurge", "clientGetState"}))
      << "a write of the state waits for the disk";
  EXPECT_EQ(in_turns, (std::vector<std::string>{"clientSetState", "clientGetState"}));
}

}  // namespace
}  // namespace spacekeep::test
