// Thread safety: every member may be called from any thread; the set orders what must not overlap.
//
// All caches of one owner as a service of the daemon.
#pragma once

#include <spacekeep/service.h>

#include <memory>

#include "services/command/engine/cache_set.h"

namespace spacekeep::command {

class SetService final : public sdk::Service {
 public:
  explicit SetService(std::shared_ptr<CacheSet> set) : set_(std::move(set)) {}

  [[nodiscard]] sdk::Answer purgeable(const sdk::Job& job) override;
  [[nodiscard]] sdk::Answer purge(const sdk::Job& job) override;
  [[nodiscard]] sdk::Answer periodic(const sdk::Job& job) override;

 private:
  [[nodiscard]] sdk::Answer free(const char* operation, const sdk::Job& job, bool periodic);

  const std::shared_ptr<CacheSet> set_;
};

}  // namespace spacekeep::command
