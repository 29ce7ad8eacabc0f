#include <fmt/core.h>
#include <unistd.h>

#include "ctl/commands.h"
#include "ctl/daemon_link.h"
#include "ctl/history/pages.h"
#include "ctl/history/table.h"
#include "ctl/volume_space.h"

namespace spacekeep::ctl {

ExitCode runHistory(const CommonOptions& common, const HistoryOptions& options) {
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  const HistoryFilter filter{
      .wanted = {.volume = withoutTrailingSlashes(options.volume), .since_ns = options.since_ns},
      .limit = options.limit};
  auto list = newestEntries(filter, historyOver(*client));
  if (!list) return complain(common, list.error());
  if (list->refused) {
    return complain(common, ExitCode::kRefused,
                    "the daemon refused: this user does not hold "
                    "\"ITEMIZED_PURGEABLE_ENTITLEMENT\", see spacekeep-entitlements(5)");
  }
  const HistoryWords words = localWords();
  fmt::print("{}", common.json ? jsonOf(*list, words) + "\n"
                               : textOf(*list, words, styleOf(STDOUT_FILENO)));
  return ExitCode::kDone;
}

}  // namespace spacekeep::ctl
