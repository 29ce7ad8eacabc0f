// Thread safety: pure functions over plain values.
//
// The history for people and programs.
#pragma once

#include <functional>
#include <string>

#include "ctl/history/entries.h"
#include "ctl/style.h"

namespace spacekeep::ctl {

/// How the table writes what it takes from the machine: user numbers and moments.
struct HistoryWords {
  std::function<std::string(std::uint64_t uid)> user;
  std::function<std::string(const Date& date)> moment;
};
/// User names and local time of this machine.
[[nodiscard]] HistoryWords localWords();

/// Who asked: "backup (alice)", "daemon: low space", "daemon: daily pass".
[[nodiscard]] std::string askerOf(const HistoryEntry& entry, const HistoryWords& words);
/// "nothing more to give", "no answer in time from a, b".
[[nodiscard]] std::string shortfallOf(const HistoryEntry& entry);

/// A line for each entry, with further ones for who gave what and why it fell short. On a terminal
/// fitted to its width.
[[nodiscard]] std::string textOf(const HistoryList& list, const HistoryWords& words,
                                 const Style& style);
/// One entry as an object.
[[nodiscard]] Value jsonMembersOf(const HistoryEntry& entry, const HistoryWords& words);
/// One object; the man page of the tool describes its members.
[[nodiscard]] std::string jsonOf(const HistoryList& list, const HistoryWords& words);

}  // namespace spacekeep::ctl
