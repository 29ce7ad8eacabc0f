#include "ctl/report/history_call.h"

#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::ctl {

AskHistory historyOver(sdk::Client& client, sdk::Deadline deadline) {
  return [&client, deadline](const Dictionary& request) {
    sdk::HistoryRequest wanted;
    wanted.before = unsignedAt(request, keys::kBefore);
    wanted.limit = unsignedAt(request, keys::kLimit);
    if (const std::string* volume = stringAt(request, keys::kVolume)) wanted.volume = *volume;
    return client.history(wanted, deadline);
  };
}

}  // namespace spacekeep::ctl
