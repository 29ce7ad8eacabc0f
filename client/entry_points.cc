// The entry points of clients: check the right, do the work, post the reply.
#include <utility>

#include "client/entitlements.h"
#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

// Until the work behind an entry point exists, its callers get no answer from here; the adaptor
// tells them before it comes to this.
void logNotSupportedYet(const char* operation) { logProblem("%s is not supported yet", operation); }

}  // namespace

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

void Spacekeep::clientPurgeableSpace(Dictionary, DictionaryReply) {
  logNotSupportedYet("clientPurgeableSpace");
}

void Spacekeep::clientItemizedPurgeableSpace(Dictionary, DictionaryReply) {
  logNotSupportedYet("clientItemizedPurgeableSpace");
}

void Spacekeep::clientSetState(ipc::OptionalValue, std::string, EmptyReply) {
  logNotSupportedYet("clientSetState");
}

void Spacekeep::clientGetState(std::string, ValueReply) { logNotSupportedYet("clientGetState"); }

}  // namespace spacekeep
