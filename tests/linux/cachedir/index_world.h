// Thread safety: one test at a time.
//
// The same rules asked twice: of the index, and of a fresh walk, which is right by definition.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "services/cachedir/engine/cache_cleaner.h"
#include "services/cachedir/index/cache_index.h"

namespace spacekeep::cachedir {

/// An index without a thread of its own: events are taken when somebody asks, and only then.
[[nodiscard]] CacheIndex::Settings withoutThread();

class IndexWorld {
 public:
  explicit IndexWorld(const Rules& rules, const CacheIndex::Settings& settings = withoutThread());

  /// What the index answers. Fails the test when it differs from a walk.
  Estimate compared(const std::optional<std::string>& volume = {});
  /// The same, and fails the test unless the answer came from the index alone, without indexing
  /// anything from nothing.
  Estimate known(const std::optional<std::string>& volume = {});
  /// Bytes at urgency 4, by known().
  std::uint64_t bytes() { return known().bytes[3]; }

  CacheIndex& index() { return *index_; }
  CacheCleaner& cleaner() { return cleaner_; }
  void passTime(double days) { offset_ns_ += static_cast<std::int64_t>(days * 86400e9); }
  /// All problems told so far.
  [[nodiscard]] const std::vector<std::string>& problems() const { return problems_; }

 private:
  [[nodiscard]] CacheCleaner::Surroundings surroundings(std::shared_ptr<CacheIndex> index);

  std::int64_t offset_ns_ = 0;
  std::int64_t now_ns_ = 0;  // stands still during a comparison
  std::shared_ptr<CacheIndex> index_;
  CacheCleaner cleaner_;
  CacheCleaner walker_;
  std::vector<std::string> problems_;
};

}  // namespace spacekeep::cachedir
