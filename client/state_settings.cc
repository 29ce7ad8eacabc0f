#include "client/state_settings.h"

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"
#include "support/values/text.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep {

bool isSettingKey(const std::string& key) {
  return key == keys::kFinishEarly || key == kLowSpaceBytesKey || key == kLowSpacePercentKey ||
         key == kLowSpaceInodesPercentKey;
}

bool finishEarlyFrom(const Dictionary& state, const RefuseSetting& refuse) {
  const Value* value = state.find(keys::kFinishEarly);
  if (value == nullptr) return false;
  if (const bool* finish_early = value->boolean()) return *finish_early;
  refuse(std::string(keys::kFinishEarly) + " = " + textOf(*value) +
         " is no boolean; set it to true or false. Until then false holds.");
  return false;
}

void Spacekeep::applySettings(const Dictionary& state) {
  const auto refuse = [](const std::string& problem) {
    logProblem("%s %@", "applySettings", problem);
  };
  finish_early_ = finishEarlyFrom(state, refuse);
  platform_.volumes.setLowSpaceSettings(lowSpaceSettingsFrom(state, refuse));
}

}  // namespace spacekeep
