// The entry points of clients: check the right, do the work, post the reply.
#include <utility>

#include "client/entitlements.h"
#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"

namespace spacekeep {

void Spacekeep::clientPurge(Dictionary info, DictionaryReply reply) {
  std::optional<Dictionary> answer;
  if (connectionIsEntitled(entitlements::kPurge)) {
    answer = purge(std::move(info), nullptr);
  } else {
    logProblem("%s Connection is not entitled!", "clientPurge");
  }
  // Never on the thread that served the request.
  platform_.global.async([reply = std::move(reply), answer = std::move(answer)] { reply(answer); });
}

void Spacekeep::clientCancelPurge(Dictionary info, EmptyReply reply) {
  cancelPurgeWithToken(info.find(keys::kToken));
  if (reply) reply();
}

// Plain and itemized differ only in the right that they take: both answers name every service.
void Spacekeep::clientPurgeableSpace(Dictionary info, DictionaryReply reply) {
  answerQuery(std::move(info), entitlements::kPurgeable, "clientPurgeableSpace", std::move(reply));
}

void Spacekeep::clientItemizedPurgeableSpace(Dictionary info, DictionaryReply reply) {
  answerQuery(std::move(info), entitlements::kItemizedPurgeable, "clientItemizedPurgeableSpace",
              std::move(reply));
}

void Spacekeep::answerQuery(const Value& info, std::string_view entitlement, const char* operation,
                            DictionaryReply reply) {
  std::optional<Dictionary> answer;
  if (connectionIsEntitled(entitlement)) {
    answer = totalAvailable(info);
  } else {
    logProblem("%s Connection is not entitled!", operation);
  }
  platform_.global.async([reply = std::move(reply), answer = std::move(answer)]() mutable {
    reply(std::move(answer));
  });
}

void Spacekeep::clientSetState(ipc::OptionalValue value, std::string key, EmptyReply reply,
                               StoreFailure failed) {
  defaults_queue_->async([self = shared_from_this(), value = std::move(value), key = std::move(key),
                          reply = std::move(reply), failed = std::move(failed)]() mutable {
    self->_clientSetState(std::move(value), key, reply, failed);
  });
}

void Spacekeep::clientGetState(std::string key, ValueReply reply) {
  defaults_queue_->async([self = shared_from_this(), key = std::move(key),
                          reply = std::move(reply)] { self->_clientGetState(key, reply); });
}

}  // namespace spacekeep
