// Thread safety: none; the record is confined to the daemon's defaults_queue. The functions are
// pure.
//
// What the services last said they could free: per volume and per service. A query counts from it
// whom it need not ask again.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "support/values/value.h"

namespace spacekeep {

/// What one service said.
struct SpacekeepRecentServiceInfo {
  Value amount;  ///< as it came, normally a number of bytes
  Date timestamp = {};
  bool operator==(const SpacekeepRecentServiceInfo&) const = default;
};

struct SpacekeepRecentVolumeInfo {
  std::map<std::string, SpacekeepRecentServiceInfo> services = {};  ///< by service ID
  std::uint64_t freespace = 0;  ///< free bytes on the volume at the last update
  Date timestamp = {};          ///< of the last update
  std::string volumeName = {};  ///< the volume's path
  bool operator==(const SpacekeepRecentVolumeInfo&) const = default;
};

/// What validate() compares a record with.
struct RecentInfoContext {
  Date now;
  /// Free bytes of the volume of that path now.
  std::function<std::uint64_t(const std::string& volume)> freespace;
};

class SpacekeepRecentInfo {
 public:
  using Volumes = std::map<std::string, SpacekeepRecentVolumeInfo>;  ///< by volume path

  // Results of validate() with a meaning; any other says that the record may be used as it is.
  static constexpr std::int32_t kUsable = 0;
  static constexpr std::int32_t kInvalid = 2;  ///< nothing is left in it
  static constexpr std::int32_t kChanged = 3;  ///< something went, what is left must be stored

  SpacekeepRecentInfo() = default;
  explicit SpacekeepRecentInfo(Volumes volumes) : volumes_(std::move(volumes)) {}

  [[nodiscard]] const Volumes& volumes() const { return volumes_; }
  void setVolumes(Volumes volumes) {
    volumes_ = std::move(volumes);
    derived_.clear();
  }
  /// Null when nothing is known of that volume.
  [[nodiscard]] const SpacekeepRecentVolumeInfo* volume(const std::string& path) const;

  /// Takes in what a service said of a volume. The whole entry of the volume gets the free space
  /// and the date, since that is what it was compared with last.
  void update(const std::string& volume, const std::string& service_id,
              SpacekeepRecentServiceInfo answer, std::uint64_t freespace_bytes);

  /// Removes what is too old to be believed: answers older than the limit, and whole volumes that
  /// are older, of the future, or whose free space has moved by more than `threshold_bytes` since.
  std::int32_t validate(double age_limit_seconds, std::uint64_t threshold_bytes,
                        const RecentInfoContext& context);

  /// What each service of the volume said, by service ID; null when nothing is known of it. Shared
  /// and made anew only after a change, since queries ask for it again and again.
  [[nodiscard]] std::shared_ptr<const Dictionary> amounts(const std::string& volume);

  bool operator==(const SpacekeepRecentInfo& other) const { return volumes_ == other.volumes_; }

 private:
  /// What follows from the entry of a volume.
  struct Derived {
    /// No answer is older or younger than these; none when they are not known.
    struct Span {
      Date oldest;
      Date youngest;
    };
    std::optional<Span> span;
    std::shared_ptr<const Dictionary> amounts;
  };

  [[nodiscard]] bool holdsOnlyFresh(const std::string& volume, const Date& now,
                                    double age_limit_seconds) const;
  std::size_t removeOldAnswers(const std::string& path, SpacekeepRecentVolumeInfo& volume,
                               const Date& now, double age_limit_seconds);

  Volumes volumes_;
  std::map<std::string, Derived> derived_;  // by volume path
};

/// The wall clock in whole microseconds, which is what an archive keeps of a date.
[[nodiscard]] Date recentDate(std::int64_t unix_ns);

}  // namespace spacekeep
