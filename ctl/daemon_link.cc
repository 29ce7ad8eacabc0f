#include "ctl/daemon_link.h"

#include "ctl/known_keys.h"

namespace spacekeep::ctl {

sdk::Result<sdk::Client> connectTo(const CommonOptions& common) {
  return sdk::Client::connect({.socket_path = common.socket_path, .on_disconnect = {}});
}

sdk::Result<Dictionary> wholeState(const CommonOptions& common, sdk::Deadline deadline) {
  auto client = connectTo(common);
  if (!client) return client.error();
  const sdk::StateReply reply = client->state(kWholeStateKey, deadline);
  if (reply.error) return *reply.error;
  const Dictionary* state = reply.value ? reply.value->dictionary() : nullptr;
  return state == nullptr ? Dictionary() : *state;
}

}  // namespace spacekeep::ctl
