// Thread safety: one thread at a time.
//
// A great many short names in little memory: slots of multiples of 8 bytes, cut from blocks of
// 64 KiB. A slot that is given back is used again by the next name of its size, so a cache whose
// files come and go does not grow.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

namespace spacekeep::cachedir {

class NameStore {
 public:
  using Place = std::uint32_t;  // in steps of 8 bytes
  static constexpr std::size_t kMaxNameBytes = 255;

  NameStore() { free_.fill(kNone); }

  /// `name` has 1 to 255 bytes.
  [[nodiscard]] Place keep(std::string_view name);
  void release(Place place, std::size_t name_bytes);
  /// Good until the name is released.
  [[nodiscard]] std::string_view at(Place place, std::size_t name_bytes) const {
    return {slot(place), name_bytes};
  }
  /// Memory held, used or not.
  [[nodiscard]] std::size_t bytes() const { return blocks_.size() * kBlockBytes; }

 private:
  static constexpr std::size_t kStepBytes = 8;
  static constexpr std::size_t kBlockSteps = 8192;
  static constexpr std::size_t kBlockBytes = kBlockSteps * kStepBytes;
  static constexpr std::size_t kSizes = (kMaxNameBytes + kStepBytes - 1) / kStepBytes;
  static constexpr Place kNone = 0xffffffff;

  [[nodiscard]] static std::size_t stepsOf(std::size_t name_bytes) {
    return (name_bytes + kStepBytes - 1) / kStepBytes;
  }
  [[nodiscard]] char* slot(Place place) const {
    return blocks_[place / kBlockSteps].get() + (place % kBlockSteps) * kStepBytes;
  }
  [[nodiscard]] Place cut(std::size_t steps);

  std::vector<std::unique_ptr<char[]>> blocks_;
  std::size_t used_steps_ = kBlockSteps;  // of the last block
  std::array<Place, kSizes + 1> free_;    // by steps; a free slot holds the place of the next
};

}  // namespace spacekeep::cachedir
