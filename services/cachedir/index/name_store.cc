#include "services/cachedir/index/name_store.h"

#include <cstring>

namespace spacekeep::cachedir {

NameStore::Place NameStore::cut(std::size_t steps) {
  if (used_steps_ + steps > kBlockSteps) {
    blocks_.push_back(std::make_unique<char[]>(kBlockBytes));
    used_steps_ = 0;
  }
  const std::size_t place = (blocks_.size() - 1) * kBlockSteps + used_steps_;
  used_steps_ += steps;
  return static_cast<Place>(place);
}

NameStore::Place NameStore::keep(std::string_view name) {
  const std::size_t steps = stepsOf(name.size());
  Place place = free_[steps];
  if (place == kNone) {
    place = cut(steps);
  } else {
    std::memcpy(&free_[steps], slot(place), sizeof(Place));
  }
  std::memcpy(slot(place), name.data(), name.size());
  return place;
}

void NameStore::release(Place place, std::size_t name_bytes) {
  Place& first = free_[stepsOf(name_bytes)];
  std::memcpy(slot(place), &first, sizeof first);
  first = place;
}

}  // namespace spacekeep::cachedir
