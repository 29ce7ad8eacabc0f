#include "registry/service.h"

namespace spacekeep {

bool SKService::desires(std::string_view notification_name) const {
  const std::optional<Value> names = desiredNotifications();
  const Array* list = names ? names->array() : nullptr;
  if (list == nullptr) return false;
  for (const Value& name : *list) {
    if (name.string() != nullptr && *name.string() == notification_name) return true;
  }
  return false;
}

}  // namespace spacekeep
