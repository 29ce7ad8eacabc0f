// Thread safety: pure functions over the file system.
//
// How old a file is for its owner's tool, where that is not what the file itself says.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace spacekeep::command {

/// When an archived journal file began, by its name or its modification, whichever is earlier: that
/// is what journald's vacuum goes by. Nanoseconds on the wall clock; none for any other file.
[[nodiscard]] std::optional<std::int64_t> journalTimeNs(std::string_view name,
                                                        std::int64_t modified_ns);

/// When the file at `path` below the trash directory `trash_fd` was thrown away, by the record that
/// stands beside it. Nanoseconds on the wall clock; the earliest time there is for a file without
/// a record (tools remove it at once), none for what is not in the trash or has a bad record.
[[nodiscard]] std::optional<std::int64_t> trashTimeNs(int trash_fd, std::string_view path);

/// The "DeletionDate" of a record: local time, as 2024-01-31T23:59:59.
[[nodiscard]] std::optional<std::int64_t> deletionTimeNs(std::string_view record);

}  // namespace spacekeep::command
