#include "fuzz/helpers/asking_daemon.h"

#include <fcntl.h>

#include <utility>
#include <vector>

#include "client/entitlements.h"
#include "fuzz/helpers/promises.h"
#include "support/ipc/served.h"
#include "support/values/text.h"

namespace spacekeep::fuzz {
namespace {

using namespace entitlements;

std::vector<access::Rule> rules() {
  access::Rule all;
  all.name = "all.plist";
  all.matches_anybody = true;
  for (const std::string_view granted :
       {kClient, kPurgeable, kItemizedPurgeable, kPurge, kService}) {
    all.grants.emplace_back(granted);
  }
  access::Rule less;
  less.name = "less.plist";
  less.matches_anybody = true;
  less.denies.emplace_back(kPurge);
  return {all, less};
}

void look(const Dictionary& info) {
  require(isOneLine(textOf(Value(info))), "a request is shown as one line");
}

}  // namespace

AskingDaemon::AskingDaemon() : access_(rules()) {}

bool AskingDaemon::admits(ipc::PeerConnection& peer) {
  const bool granted = access_.connectionIsEntitled(&peer, {kClient});
  require(granted, "what the rules grant is granted");
  return granted;
}

bool AskingDaemon::isEntitled(std::string_view entitlement) {
  ipc::PeerConnection* const connection = ipc::currentConnection();
  require(connection != nullptr, "a handler knows whom it serves");
  require(!access_.connectionIsEntitled(connection, {kPurge}), "what a rule denies is denied");
  return access_.connectionIsEntitled(connection, {entitlement});
}

void AskingDaemon::clientCheckin(std::string service_id, ipc::SharedDescriptor endpoint,
                                 Dictionary info, CheckinReply reply) {
  require(endpoint != nullptr, "a service that checks in brings an endpoint");
  require((::fcntl(endpoint->fd(), F_GETFD) >= 0) == endpoint->problem().empty(),
          "an endpoint is an open descriptor, or it has a problem");
  look(info);
  if (!isEntitled(kService)) return;
  Dictionary result{{"SPACEKEEP_ID", std::move(service_id)}, {"ANON", true}};
  reply(std::move(result), std::nullopt);
}

void AskingDaemon::clientPurgeableSpace(Dictionary info, DictionaryReply reply) {
  look(info);
  reply(isEntitled(kPurgeable) ? ipc::OptionalDictionary(std::move(info)) : std::nullopt);
}

void AskingDaemon::clientItemizedPurgeableSpace(Dictionary info, DictionaryReply reply) {
  look(info);
  reply(isEntitled(kItemizedPurgeable) ? ipc::OptionalDictionary(std::move(info)) : std::nullopt);
}

void AskingDaemon::clientPurge(Dictionary info, DictionaryReply reply) {
  look(info);
  require(!isEntitled(kPurge), "nobody may purge");
  reply(std::nullopt);
}

void AskingDaemon::clientCancelPurge(Dictionary info, EmptyReply reply) {
  look(info);
  reply();
}

void AskingDaemon::clientSetState(ipc::OptionalValue value, std::string key, EmptyReply reply,
                                  StoreFailure failed) {
  if (key.empty()) {
    failed("there is no key");
    return;
  }
  if (value) require(isOneLine(textOf(Value(Array{*value}))), "a value is shown as one line");
  reply();
}

void AskingDaemon::clientGetState(std::string key, ValueReply reply) {
  reply(key.empty() ? ipc::OptionalValue() : ipc::OptionalValue(std::move(key)));
}

}  // namespace spacekeep::fuzz
