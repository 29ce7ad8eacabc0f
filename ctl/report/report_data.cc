#include "ctl/report/report_data.h"

#include <utility>

#include "ctl/json_text.h"
#include "ctl/report/entry.h"

namespace spacekeep::ctl {

std::string jsonOf(const ReportData& data) {
  Array entries;
  entries.reserve(data.history.entries.size());
  for (const auto& entry : data.history.entries) {
    if (const Dictionary* dictionary = entry.dictionary()) {
      entries.push_back(pageEntryOf(*dictionary));
    }
  }
  Dictionary object{{"host", data.host},
                    {"made", Value(Date{data.made_ns})},
                    {"volumes", volumesValueOf(data.status)},
                    {"entries", std::move(entries)},
                    {"older_left_out", data.history.older_left_out}};
  if (data.wanted.since_ns) object.set("since", Value(Date{*data.wanted.since_ns}));
  if (!data.wanted.volume.empty()) object.set("volume", data.wanted.volume);
  if (const auto& problem = data.status.survey.problem) object.set("offers_problem", problem->text);
  if (const auto& problem = data.history.problem) object.set("history_problem", problem->text);
  return jsonOf(Value(std::move(object)));
}

}  // namespace spacekeep::ctl
