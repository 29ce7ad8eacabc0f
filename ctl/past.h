// Thread safety: pastOf() for one thread at a time, the rest pure.
//
// What was done last on a volume, in few words.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "ctl/complaint.h"
#include "ctl/explanation.h"
#include "ctl/history/table.h"
#include "ctl/style.h"
#include "ctl/volume_report.h"

namespace spacekeep::ctl {

/// The newest entries of a volume, newest first, by volume.
using Past = std::map<std::string, std::vector<HistoryEntry>>;

/// Three entries of each volume at most. A courtesy: where this user may not look, and where the
/// daemon keeps no history or takes long, there are none.
[[nodiscard]] Past pastOf(const CommonOptions& common, const VolumeReport& volumes);

/// "2 h ago backup (alice) asked for 500.0 MiB and got 312.4 MiB: nothing more to give".
[[nodiscard]] std::string sentenceOf(const HistoryEntry& entry, const Date& now,
                                     const HistoryWords& words);

/// One line for each sentence.
[[nodiscard]] std::string pastLines(const std::vector<std::string>& sentences, const Style& style);

/// What was done, and what to do about it when the last one fell short; empty without entries.
[[nodiscard]] std::vector<Paragraph> pastParagraphs(const std::vector<HistoryEntry>& entries,
                                                    const Date& now, const HistoryWords& words);

}  // namespace spacekeep::ctl
