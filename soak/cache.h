// Thread safety: every member may be called from any thread.
//
// The caches of the soak: directories of small files that grow again, owned by services of different
// manners.
#pragma once

#include <spacekeep/service.h>

#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>

namespace soak {

enum class Manners {
  kHonest,
  kSlow,    ///< answers after up to two seconds
  kSilent,  ///< now and then answers nothing for half a minute
};

class Cache : public spacekeep::sdk::Service {
 public:
  static constexpr std::uint64_t kFileBytes = 16'384;

  /// `volume` is the mount point that `directory` is on. With `may_crash` a purge ends the process
  /// now and then, once crashing is allowed.
  Cache(std::string volume, std::string directory, Manners manners, bool may_crash);

  spacekeep::sdk::Answer purgeable(const spacekeep::sdk::Job& job) override;
  spacekeep::sdk::Answer purge(const spacekeep::sdk::Job& job) override;

  /// One more file, when the volume has room for it.
  void grow();
  static void allowCrashes(bool allowed) { crashes_allowed_ = allowed; }

 private:
  void beSlow(const spacekeep::sdk::Job& job) const;
  std::uint64_t removeFiles(std::uint64_t bytes);
  [[nodiscard]] std::string pathOf(std::uint64_t number) const;

  static inline std::atomic<bool> crashes_allowed_{false};

  const std::string volume_;
  const std::string directory_;
  const Manners manners_;
  const bool may_crash_;
  std::mutex mutex_;
  // Protected by mutex_: the files from first_ up to next_ are there.
  std::uint64_t first_ = 0;
  std::uint64_t next_ = 0;
};

}  // namespace soak
