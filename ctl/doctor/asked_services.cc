#include "ctl/doctor/asked_services.h"

#include <algorithm>

#include "ctl/daemon_link.h"
#include "ctl/offers.h"
#include "operations/info_keys.h"
#include "support/volumes/linux/linux_volumes.h"

namespace spacekeep::ctl::doctor {
namespace {

/// A query waits ten seconds at the very most, and may stand behind another one.
constexpr std::chrono::milliseconds kPatience{25'000};

/// At the highest urgency the daemon has the most patience.
void askOnce(sdk::Client& client, AskedServices& asked) {
  const Dictionary request{
      {keys::kVolume, asked.volume}, {keys::kUrgency, kUrgencies}, {keys::kExactUrgency, true}};
  const sdk::Reply reply = client.call(sdk::Operation::kItemizedPurgeableSpace, request, kPatience);
  if (reply.error) asked.problem = reply.error->text;
  asked.refused = reply.refused();
  if (!reply.outcome) return;
  for (const auto& [key, value] : *reply.outcome) {
    if (key != keys::kTotalAvailable && key != keys::kVolume) asked.answered.insert(key);
  }
}

}  // namespace

AskedServices askServices(const CommonOptions& common, const std::string& mount_table,
                          const std::set<std::string>& expected) {
  AskedServices asked;
  const auto volumes = LinuxVolumes(mount_table).getLocalVolumes();
  if (volumes.empty()) {
    asked.problem = "there is no local volume to ask the services about";
    return asked;
  }
  asked.volume = volumes.front();
  auto client = connectTo(common);
  if (!client) {
    asked.problem = client.error().text;
    return asked;
  }
  askOnce(*client, asked);
  if (!asked.problem && !asked.refused && !std::ranges::includes(asked.answered, expected)) {
    askOnce(*client, asked);
  }
  return asked;
}

}  // namespace spacekeep::ctl::doctor
