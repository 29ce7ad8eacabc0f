// Thread safety: one thread at a time.
//
// A hash table of numbers whose keys are kept elsewhere: 4 bytes a slot, between three eighths and
// three quarters of the slots in use. The caller tells hashes and compares keys.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace spacekeep::cachedir {

inline constexpr std::uint32_t kNoId = 0xffffffff;

class IdTable {
 public:
  /// `hash_of(id)` answers the hash of any number in the table.
  template <class HashOf>
  void insert(std::uint32_t id, const HashOf& hash_of) {
    if ((count_ + 1) * 4 > slots_.size() * 3) grow(hash_of);
    place(id, hash_of(id));
    ++count_;
  }

  /// The number with `hash` for which `matches(id)` holds, else kNoId.
  template <class Matches>
  [[nodiscard]] std::uint32_t find(std::uint64_t hash, const Matches& matches) const {
    if (slots_.empty()) return kNoId;
    for (std::size_t i = hash & mask(); slots_[i] != kNoId; i = (i + 1) & mask()) {
      if (matches(slots_[i])) return slots_[i];
    }
    return kNoId;
  }

  /// `id` is in the table.
  template <class HashOf>
  void erase(std::uint32_t id, const HashOf& hash_of) {
    std::size_t hole = hash_of(id) & mask();
    while (slots_[hole] != id) hole = (hole + 1) & mask();
    // Those behind the hole move up, unless they already stand where they belong or before it.
    for (std::size_t i = (hole + 1) & mask(); slots_[i] != kNoId; i = (i + 1) & mask()) {
      const std::size_t home = hash_of(slots_[i]) & mask();
      if (((i - home) & mask()) < ((i - hole) & mask())) continue;
      slots_[hole] = slots_[i];
      hole = i;
    }
    slots_[hole] = kNoId;
    --count_;
  }

  [[nodiscard]] std::size_t size() const { return count_; }
  [[nodiscard]] std::size_t bytes() const { return slots_.capacity() * sizeof(std::uint32_t); }

 private:
  [[nodiscard]] std::size_t mask() const { return slots_.size() - 1; }

  void place(std::uint32_t id, std::uint64_t hash) {
    std::size_t i = hash & mask();
    while (slots_[i] != kNoId) i = (i + 1) & mask();
    slots_[i] = id;
  }

  template <class HashOf>
  void grow(const HashOf& hash_of) {
    const std::vector<std::uint32_t> before = std::move(slots_);
    slots_.assign(before.empty() ? 16 : before.size() * 2, kNoId);
    for (const std::uint32_t id : before) {
      if (id != kNoId) place(id, hash_of(id));
    }
  }

  std::vector<std::uint32_t> slots_;
  std::size_t count_ = 0;
};

}  // namespace spacekeep::cachedir
