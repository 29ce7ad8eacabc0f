#include "ctl/recent_answers.h"

#include <fmt/core.h>

#include <algorithm>

#include "ctl/text_layout.h"
#include "purgeable/recent_archive.h"

namespace spacekeep::ctl {

std::optional<AnswerDates> answerDates(const std::optional<Value>& recent_stats,
                                       const std::string& volume) {
  if (!recent_stats) return AnswerDates{};
  const Data* archive = recent_stats->data();
  if (archive == nullptr) return std::nullopt;
  const auto record = recentInfoFromArchive(*archive);
  if (!record) return std::nullopt;
  AnswerDates dates;
  const auto* known = record->volume(volume);
  if (known == nullptr) return dates;
  for (const auto& [id, service] : known->services) dates.emplace(id, service.timestamp);
  return dates;
}

std::optional<AnswerOrigin> originOf(const std::string& service_id, const AnswerDates& before,
                                     const AnswerDates& after, Date now) {
  const auto answered = after.find(service_id);
  if (answered == after.end()) return std::nullopt;
  const auto earlier = before.find(service_id);
  const bool from_memory = earlier != before.end() && earlier->second == answered->second;
  const auto age_ns =
      static_cast<double>(now.unix_ns) - static_cast<double>(answered->second.unix_ns);
  return AnswerOrigin{.from_memory = from_memory, .age_seconds = std::max(age_ns, 0.0) / 1e9};
}

std::string textOf(const std::optional<AnswerOrigin>& origin) {
  if (!origin) return "";
  if (!origin->from_memory) return "asked now";
  return fmt::format("from memory, {} ago", printAge(origin->age_seconds));
}

}  // namespace spacekeep::ctl
