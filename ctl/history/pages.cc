#include "ctl/history/pages.h"

#include <algorithm>

#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::ctl {
namespace {

/// Answers whether older entries are wanted.
bool takePage(const Dictionary& page, const TakeEntry& take) {
  const Value* entries = page.find(keys::kEntries);
  if (entries == nullptr || entries->array() == nullptr) return true;
  return std::ranges::all_of(*entries->array(), [&take](const Value& entry) {
    return entry.dictionary() == nullptr || take(*entry.dictionary());
  });
}

}  // namespace

AskHistory historyOver(sdk::Client& client, sdk::Deadline deadline) {
  return [&client, deadline](const Dictionary& request) {
    sdk::HistoryRequest wanted;
    wanted.before = unsignedAt(request, keys::kBefore);
    wanted.limit = unsignedAt(request, keys::kLimit);
    if (const std::string* volume = stringAt(request, keys::kVolume)) wanted.volume = *volume;
    return client.history(wanted, deadline);
  };
}

sdk::Result<PagesEnd> forEachEntry(const std::string& volume, std::uint64_t page_entries,
                                   const AskHistory& ask, const TakeEntry& take) {
  Dictionary request{{keys::kLimit, std::min(page_entries, kMostOfOnePage)}};
  if (!volume.empty()) request.set(keys::kVolume, volume);
  while (true) {
    const sdk::Reply reply = ask(request);
    if (reply.error) return *reply.error;
    if (!reply.outcome) return PagesEnd::kRefused;
    if (!takePage(*reply.outcome, take)) return PagesEnd::kEnough;
    const auto next = unsignedAt(*reply.outcome, keys::kNext);
    if (!next) return PagesEnd::kOldest;
    const auto before = unsignedAt(request, keys::kBefore);
    if (before && *next >= *before) return PagesEnd::kNotOlder;
    request.set(keys::kBefore, *next);
  }
}

}  // namespace spacekeep::ctl
