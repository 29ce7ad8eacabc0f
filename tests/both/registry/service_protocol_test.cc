// How calls to a service are encoded, and what of its answers is believed.
#include "registry/service_protocol.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace spacekeep::test {
namespace {

/// Keeps each call and answers it with what the test says.
class ScriptedProxy final : public ipc::RemoteProxy {
 public:
  void call(std::string_view member, ipc::Arguments in, ReplyHandler reply) override {
    members.emplace_back(member);
    arguments.push_back(std::move(in));
    reply(answer);
  }

  ipc::Arguments answer;
  std::vector<std::string> members;
  std::vector<ipc::Arguments> arguments;
};

struct Protocol {
  std::shared_ptr<ScriptedProxy> proxy = std::make_shared<ScriptedProxy>();
  SpacekeepServiceProtocol protocol{proxy};
  std::vector<ipc::OptionalDictionary> replies;

  SpacekeepServiceProtocol::DictionaryReply keeping() {
    return [this](ipc::OptionalDictionary reply) { replies.push_back(std::move(reply)); };
  }
};

TEST(ServiceProtocol, ACallbackCarriesItsInfoAndBringsTheAnswerBack) {
  Protocol service;
  service.proxy->answer = {ipc::OptionalDictionary(Dictionary{{"SPACEKEEP_AMOUNT", 7}})};
  service.protocol.serviceCallback({{"KEY", 1}}, service.keeping());
  EXPECT_EQ(service.proxy->members, std::vector<std::string>{"serviceCallback"});
  ASSERT_EQ(service.proxy->arguments.at(0).size(), 1U);
  EXPECT_EQ(std::get<Dictionary>(service.proxy->arguments[0][0]), (Dictionary{{"KEY", 1}}));
  ASSERT_EQ(service.replies.size(), 1U);
  EXPECT_EQ(service.replies[0], (Dictionary{{"SPACEKEEP_AMOUNT", 7}}));
}

TEST(ServiceProtocol, AnAnswerWithoutArgumentsIsNoDictionary) {
  Protocol service;
  service.protocol.servicePurge(2, {}, service.keeping());
  ASSERT_EQ(service.replies.size(), 1U);
  EXPECT_EQ(service.replies[0], std::nullopt);
}

TEST(ServiceProtocol, AnAnswerOfAnotherKindIsNoDictionary) {
  Protocol service;
  service.proxy->answer = {std::string("text")};
  service.protocol.servicePurgeable(1, {}, service.keeping());
  ASSERT_EQ(service.replies.size(), 1U);
  EXPECT_EQ(service.replies[0], std::nullopt);
}

}  // namespace
}  // namespace spacekeep::test
