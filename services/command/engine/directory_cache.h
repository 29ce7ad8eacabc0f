// Thread safety: as of Cache.
//
// A cache of plain files, given up by the engine for directories; or of directories that only make
// sense as a whole.
#pragma once

#include "services/command/engine/cache.h"

namespace spacekeep::command {

class CacheOfDirectories final : public Cache {
 public:
  explicit CacheOfDirectories(Rule rule) : Cache(std::move(rule)) {}

  [[nodiscard]] Offer offer(const std::optional<std::string>& volume,
                            const CancelToken& cancel) const override;
  [[nodiscard]] Result free(const Request& request, const CancelToken& cancel,
                            const Visitor& visit) const override;

 private:
  [[nodiscard]] const DirectoryCaches& caches() const {
    return std::get<DirectoryCaches>(rule().cache);
  }
};

}  // namespace spacekeep::command
