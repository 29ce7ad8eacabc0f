// Thread safety: newestEntries() for one thread at a time, the rest may be called from any thread.
//
// What the daemon keeps of its doings, read and understood.
#pragma once

#include <spacekeep/client.h>

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "ctl/history/pages.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

/// The process that asked.
struct HistoryClient {
  std::optional<std::uint64_t> uid;
  std::optional<std::uint64_t> pid;
  std::string program;  ///< empty when not known
  std::string unit;     ///< the same
};

struct HistoryEntry {
  std::uint64_t number = 0;
  std::optional<Date> ended;
  std::string kind;  ///< "purge", "low space", "daily pass"
  std::optional<HistoryClient> client;
  std::string volume;
  std::optional<std::uint64_t> asked_bytes;
  std::optional<std::uint64_t> freed_bytes;
  std::optional<std::uint64_t> reported_bytes;
  std::optional<std::uint64_t> free_begin_bytes;
  std::optional<std::uint64_t> free_end_bytes;
  std::optional<std::uint64_t> urgency;
  std::optional<std::uint64_t> urgency_limit;
  std::optional<double> elapsed_seconds;
  std::vector<std::pair<std::string, std::uint64_t>> services;  ///< bytes, largest first
  std::optional<std::uint64_t> other_services_bytes;
  std::vector<std::string> silent;
  std::string why_short;  ///< empty: it did not fall short
};

/// What is of another kind than it should be is left out.
[[nodiscard]] HistoryEntry historyEntryOf(const Dictionary& entry);

struct HistoryFilter {
  WantedHistory wanted = {};
  std::size_t limit = 20;  ///< most entries
};

struct HistoryList {
  std::vector<HistoryEntry> entries;  ///< newest first
  bool older = false;                 ///< there are more that fit the filter but for the limit
  bool refused = false;               ///< the user has not the right; then there is nothing
};

/// Reads as many pages as the filter takes; of a daemon whose pages do not get older what there is.
[[nodiscard]] sdk::Result<HistoryList> newestEntries(const HistoryFilter& filter,
                                                     const AskHistory& ask);

/// The name of a user (getpwuid(3)), else "uid 1000".
[[nodiscard]] std::string userName(std::uint64_t uid);

}  // namespace spacekeep::ctl
