// Thread safety: every member may be called from any thread; the engine orders what must not
// overlap.
//
// The engine as a service of the daemon: each request becomes one call of the engine.
#pragma once

#include <spacekeep/service.h>

#include <memory>

#include "services/cachedir/engine/cache_cleaner.h"

namespace spacekeep::cachedir {

class CacheService final : public sdk::Service {
 public:
  explicit CacheService(std::shared_ptr<CacheCleaner> cleaner) : cleaner_(std::move(cleaner)) {}

  [[nodiscard]] sdk::Answer purgeable(const sdk::Job& job) override;
  [[nodiscard]] sdk::Answer purge(const sdk::Job& job) override;
  [[nodiscard]] sdk::Answer periodic(const sdk::Job& job) override;

 private:
  [[nodiscard]] sdk::Answer free(const char* operation, const sdk::Job& job, FreeRequest request);

  const std::shared_ptr<CacheCleaner> cleaner_;
};

}  // namespace spacekeep::cachedir
