// Thread safety: as of Cache.
//
// A cache of plain files, given up by the engine for directories; or of directories that only make
// sense as a whole.
#pragma once

#include "services/command/engine/cache.h"
#include "services/command/engine/in_use.h"

namespace spacekeep::command {

class CacheOfDirectories final : public Cache {
 public:
  /// While it frees it asks so often whether the rule's conditions still allow it.
  explicit CacheOfDirectories(Rule rule, std::uint64_t ask_every_ns = ConditionWatch::kEveryNs)
      : Cache(std::move(rule)), ask_every_ns_(ask_every_ns) {}

  [[nodiscard]] Offer offer(const std::optional<std::string>& volume,
                            const CancelToken& cancel) const override;
  [[nodiscard]] Result free(const Request& request, const CancelToken& cancel,
                            const Visitor& visit) const override;

 private:
  [[nodiscard]] const DirectoryCaches& caches() const {
    return std::get<DirectoryCaches>(rule().cache);
  }

  const std::uint64_t ask_every_ns_;
};

}  // namespace spacekeep::command
