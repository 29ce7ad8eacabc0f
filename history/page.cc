#include "history/page.h"

#include <algorithm>
#include <utility>

#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::history {
namespace {

// A type, a length and what aligning may skip, rounded up.
constexpr std::size_t kValueBytes = 24;
constexpr std::size_t kKeyBytes = 16;

}  // namespace

HistoryRange rangeOf(const Dictionary& request) {
  HistoryRange range{.before = unsignedAt(request, keys::kBefore)};
  if (const std::string* volume = stringAt(request, keys::kVolume)) range.volume = *volume;
  return range;
}

std::size_t limitOf(const Dictionary& request) {
  const std::uint64_t asked = unsignedAt(request, keys::kLimit).value_or(kDefaultPageEntries);
  return static_cast<std::size_t>(std::clamp<std::uint64_t>(asked, 1, kMaxPageEntries));
}

std::size_t wireBytesAtMost(const Value& value) {
  std::size_t total = kValueBytes;
  if (const auto* text = value.string()) total += text->size();
  if (const auto* data = value.data()) total += data->bytes.size();
  if (const auto* array = value.array()) {
    for (const Value& element : *array) total += wireBytesAtMost(element);
  }
  if (const auto* dictionary = value.dictionary()) {
    for (const auto& [key, element] : *dictionary) {
      total += kKeyBytes + key.size() + wireBytesAtMost(element);
    }
  }
  return total;
}

bool Page::take(StoredEntry stored) {
  stored.entry.set(keys::kEntry, stored.number);
  Value entry(std::move(stored.entry));
  const std::size_t entry_bytes = wireBytesAtMost(entry);
  // The first one always fits: entries are small.
  more_ = entries_.size() >= max_entries_ ||
          (!entries_.empty() && used_bytes_ + entry_bytes > max_bytes_);
  if (more_) return false;
  used_bytes_ += entry_bytes;
  last_number_ = stored.number;
  entries_.push_back(std::move(entry));
  return true;
}

Dictionary Page::answer() && {
  Dictionary answer;
  answer.set(keys::kEntries, std::move(entries_));
  if (more_) answer.set(keys::kNext, last_number_);
  return answer;
}

}  // namespace spacekeep::history
