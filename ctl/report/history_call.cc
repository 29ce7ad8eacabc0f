#include "ctl/report/history_call.h"

namespace spacekeep::ctl {

AskHistory historyOver(sdk::Client& client, sdk::Deadline deadline) {
  return [&client, deadline](const Dictionary& request) {
    sdk::HistoryRequest wanted;
    wanted.before = unsignedAt(request, "SPACEKEEP_BEFORE");
    wanted.limit = unsignedAt(request, "SPACEKEEP_LIMIT");
    if (const std::string* volume = stringAt(request, "SPACEKEEP_VOLUME")) wanted.volume = *volume;
    return client.history(wanted, deadline);
  };
}

}  // namespace spacekeep::ctl
