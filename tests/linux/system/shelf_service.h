// Thread safety: every member may be called from any thread.
//
// An honest service of many small equal files that can be filled up again.
#pragma once

#include <spacekeep/service.h>

#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>

namespace spacekeep::system_test {

class ShelfService : public sdk::Service {
 public:
  static constexpr std::uint64_t kFileBytes = 4096;

  explicit ShelfService(std::string directory);

  sdk::Answer purgeable(const sdk::Job& job) override;
  sdk::Answer purge(const sdk::Job& job) override;

  /// Until that many files are there.
  void fillUpTo(std::uint64_t files);
  [[nodiscard]] std::uint64_t timesPurged() const { return times_purged_; }

 private:
  [[nodiscard]] std::string pathOf(std::uint64_t number) const;

  const std::string directory_;
  std::atomic<std::uint64_t> times_purged_{0};
  std::mutex mutex_;
  // Protected by mutex_: the files from first_ up to next_ are there.
  std::uint64_t first_ = 0;
  std::uint64_t next_ = 0;
};

}  // namespace spacekeep::system_test
