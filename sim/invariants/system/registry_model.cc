#include "sim/invariants/system/registry_model.h"

#include <algorithm>

namespace spacekeep::sim {
namespace {

bool endsAConnection(const Event& event) {
  const auto* line = std::get_if<LogLine>(&event.body);
  return line != nullptr && (line->format == "%s invalidationHandler ENTRY" ||
                             line->format == "%s interruptionHandler ENTRY");
}

bool wants(const Value* names, const std::string& notification) {
  if (names == nullptr || names->array() == nullptr) return false;
  return std::any_of(names->array()->begin(), names->array()->end(), [&](const Value& name) {
    return name.string() != nullptr && *name.string() == notification;
  });
}

}  // namespace

RegistryModel::RegistryModel(const SystemStory& story, const Life& life) : story_(story) {
  for (const Call& call : life.calls) {
    if (call.member != "clientCheckin" || story.declared.contains(call.text)) continue;
    if (call.holds("SERVICE_ENTITLEMENT")) check_ins_.push_back(&call);
  }
  ended_connections_ = static_cast<std::size_t>(
      std::count_if(life.events.begin(), life.events.end(), endsAConnection));
}

bool RegistryModel::isClear(const std::string& service) const {
  return !story_.declared_twice.contains(service);
}

bool RegistryModel::mayPurge(const std::string& service, std::size_t at) const {
  if (!isClear(service)) return true;
  const auto declared = story_.declared.find(service);
  if (declared != story_.declared.end()) return declared->second.purges;
  return std::any_of(check_ins_.begin(), check_ins_.end(), [&](const Call* call) {
    return call->text == service && call->asked_at < at && call->info &&
           truthAt(*call->info, "PURGE");
  });
}

bool RegistryModel::mayBeQueried(const std::string& service, std::size_t at) const {
  if (!isClear(service)) return true;
  const auto declared = story_.declared.find(service);
  const bool is_barred = declared != story_.declared.end() && declared->second.do_not_query;
  return !is_barred && mayPurge(service, at);
}

bool RegistryModel::mayHavePeriodicWork(const std::string& service, std::size_t at) const {
  if (!isClear(service)) return true;
  const auto declared = story_.declared.find(service);
  if (declared != story_.declared.end()) {
    return declared->second.purges && !declared->second.periodic;
  }
  return std::any_of(check_ins_.begin(), check_ins_.end(), [&](const Call* call) {
    return call->text == service && call->asked_at < at && call->info &&
           truthAt(*call->info, "PURGE") && !truthAt(*call->info, "PERIODIC");
  });
}

bool RegistryModel::mayWant(const std::string& service, const std::string& notification,
                            std::size_t at) const {
  if (!isClear(service)) return true;
  const auto declared = story_.declared.find(service);
  if (declared != story_.declared.end()) {
    return declared->second.notifications.contains(notification);
  }
  return std::any_of(check_ins_.begin(), check_ins_.end(), [&](const Call* call) {
    return call->text == service && call->asked_at < at && call->info &&
           wants(call->info->find("SPACEKEEP_NOTIFICATIONS"), notification);
  });
}

// Services that check in can go at any time; they are only sure while no connection has ended, and
// while no other check-in of theirs says anything else.
std::vector<std::string> RegistryModel::surelyPurging(std::size_t at) const {
  std::vector<std::string> services;
  for (const auto& [service, declared] : story_.declared) {
    if (declared.purges && isClear(service)) services.push_back(service);
  }
  if (ended_connections_ != 0) return services;
  std::map<std::string, bool> always;
  for (const Call* call : check_ins_) {
    const bool purges = call->info && truthAt(*call->info, "PURGE");
    const auto known = always.emplace(call->text, true).first;
    known->second = known->second && purges;
  }
  for (const Call* call : check_ins_) {
    const bool is_in = call->answer && call->answeredAt() < at;
    if (is_in && always[call->text]) services.push_back(call->text);
    if (is_in) always[call->text] = false;  // named once
  }
  return services;
}

std::vector<std::string> RegistryModel::surelyQueried(std::size_t at) const {
  std::vector<std::string> services = surelyPurging(at);
  std::erase_if(services, [this](const std::string& service) {
    const auto declared = story_.declared.find(service);
    return declared != story_.declared.end() && declared->second.do_not_query;
  });
  return services;
}

}  // namespace spacekeep::sim
