// Thread safety: may be called from any thread; one writer at a time for each path.
//
// Replacing a file as a whole: readers see the old content or the new, never a part.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>

namespace spacekeep {

enum class Durability {
  kVolatile,  ///< after a power cut the file may be old, empty or new
  kDurable,   ///< when the call is back the new content survives a power cut
};

/// Appended to the path while the new content is written. What a killed process left under that
/// name is removed by the next replacement.
inline constexpr const char* kTemporarySuffix = ".new";

/// None on success, else what went wrong in words; the file is then as it was (after a failed last
/// step of kDurable: it is the new one, perhaps not yet durably). `mode` as in open(2), exactly:
/// the umask does not count.
[[nodiscard]] std::optional<std::string> replaceFile(const std::string& path,
                                                     std::span<const std::uint8_t> content,
                                                     Durability durability, mode_t mode = 0644);

/// Makes names created, renamed and removed in `directory` durable.
[[nodiscard]] std::optional<std::string> syncDirectory(const std::string& directory);

/// "." for a path without a slash.
[[nodiscard]] std::string directoryOf(const std::string& path);

}  // namespace spacekeep
