// Thread safety: as of Cache.
//
// A cache that its owner's tool cleans. What was freed is what the measured directories lost, and
// not what the tool says.
#pragma once

#include "services/cachedir/engine/roots.h"
#include "services/command/engine/cache.h"

namespace spacekeep::command {

class CacheOfTool final : public Cache {
 public:
  CacheOfTool(Rule rule, const UserFolders* folders)
      : Cache(std::move(rule)), environment_(environmentFor(folders)) {}

  [[nodiscard]] Offer offer(const std::optional<std::string>& volume,
                            const CancelToken& cancel) const override;
  [[nodiscard]] Result free(const Request& request, const CancelToken& cancel,
                            const Visitor& visit) const override;

 private:
  class Cleaning;
  [[nodiscard]] const ToolCache& tool() const { return std::get<ToolCache>(rule().cache); }
  [[nodiscard]] std::string absence() const;
  [[nodiscard]] std::optional<std::uint64_t> wouldFree(const CleanStep& step,
                                                       const std::vector<cachedir::Root>& roots,
                                                       const CancelToken& cancel,
                                                       std::vector<std::string>& problems) const;

  const std::vector<std::string> environment_;
};

}  // namespace spacekeep::command
