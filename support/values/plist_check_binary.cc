#include <algorithm>
#include <bit>
#include <cmath>
#include <vector>

#include "support/values/plist.h"
#include "support/values/plist_check.h"

namespace spacekeep {
namespace {

constexpr std::string_view kMagic = "bplist00";
constexpr std::size_t kTrailerBytes = 32;
// Shared strings and data count each time they are named.
constexpr std::uint64_t kMaxUnfoldedBytes = 4 * std::uint64_t{kMaxPlistBytes};

using Problem = std::optional<std::string>;

std::uint64_t bigEndian(std::span<const std::uint8_t> bytes) {
  std::uint64_t number = 0;
  for (const std::uint8_t byte : bytes) number = number << 8 | byte;
  return number;
}

// One object of the table: what its marker says and the bytes that follow the marker and length.
struct Object {
  unsigned kind = 0;  // the marker's upper four bits
  unsigned low = 0;   // and its lower four
  std::uint64_t count = 0;
  std::span<const std::uint8_t> rest;
};

bool isText(const Object& object) { return object.kind == 0x5 || object.kind == 0x6; }
bool isContainer(const Object& object) { return object.kind == 0xa || object.kind == 0xd; }
// A dictionary names its keys first and then its values.
std::uint64_t references(const Object& object) {
  return object.kind == 0xd ? 2 * object.count : object.count;
}

Problem textProblem(const Object& object) {
  if (object.kind == 0x5) {
    const auto text = object.rest.first(object.count);
    const bool plain = std::all_of(text.begin(), text.end(),
                                   [](std::uint8_t byte) { return byte > 0 && byte < 0x80; });
    return plain ? std::nullopt : Problem("a string holds a byte that is not ASCII");
  }
  bool expects_low_surrogate = false;
  for (std::size_t i = 0; i < object.count; ++i) {
    const std::uint64_t unit = bigEndian(object.rest.subspan(2 * i, 2));
    const bool low_surrogate = unit >= 0xdc00 && unit < 0xe000;
    if (unit == 0 || low_surrogate != expects_low_surrogate) return "a string is not valid UTF-16";
    expects_low_surrogate = unit >= 0xd800 && unit < 0xdc00;
  }
  return expects_low_surrogate ? Problem("a string is not valid UTF-16") : std::nullopt;
}

Problem numberProblem(const Object& object) {
  const std::size_t size = std::size_t{1} << object.low;
  if (object.kind == 0x1) {
    if (object.low > 4) return "an integer has an unknown size";
    if (object.rest.size() < size) return "an integer is cut off";
    if (object.low == 4 && bigEndian(object.rest.first(8)) != 0)
      return "an integer is out of range";
    return std::nullopt;
  }
  if (object.kind == 0x2 && object.low != 2 && object.low != 3) return "a real has an unknown size";
  if (object.kind == 0x3 && object.low != 3) return "a date has an unknown size";
  if (object.rest.size() < size) return "a number or date is cut off";
  if (object.kind == 0x2) return std::nullopt;
  const double seconds = std::bit_cast<double>(bigEndian(object.rest.first(8)));
  return plistDateFits(seconds) ? std::nullopt : Problem("a date is out of range");
}

class Walk {
 public:
  explicit Walk(std::span<const std::uint8_t> document) : document_(document) {}

  Problem run() {
    if (Problem problem = readTrailer()) return problem;
    std::vector<Pending> pending{{root_, 1, false}};
    while (!pending.empty()) {
      const Pending next = pending.back();
      pending.pop_back();
      if (++values_ > kMaxPlistValues) return "it holds too many values";
      Object object;
      if (Problem problem = readObject(next.index, object)) return problem;
      if (next.is_key && !isText(object)) return "a key is not a string";
      if (Problem problem = objectProblem(object)) return problem;
      if (!isContainer(object)) continue;
      if (next.depth > kMaxPlistDepth) return "it is nested too deep";
      // Before pushing: what waits counts too, or one array could fill the memory with references.
      if (values_ + pending.size() + references(object) > kMaxPlistValues)
        return "it holds too many values";
      pushChildren(object, next.depth + 1, pending);
    }
    return std::nullopt;
  }

 private:
  struct Pending {
    std::uint64_t index;
    int depth;  // of this value, were it a container
    bool is_key;
  };

  Problem readTrailer() {
    if (document_.size() < kMagic.size() + kTrailerBytes) return "it is cut off";
    const auto trailer = document_.last(kTrailerBytes);
    offset_size_ = trailer[6];
    reference_size_ = trailer[7];
    objects_ = bigEndian(trailer.subspan(8, 8));
    root_ = bigEndian(trailer.subspan(16, 8));
    table_ = bigEndian(trailer.subspan(24, 8));
    const bool sizes =
        offset_size_ >= 1 && offset_size_ <= 8 && reference_size_ >= 1 && reference_size_ <= 8;
    if (!sizes || objects_ == 0) return "its trailer is damaged";
    if (objects_ > kMaxPlistValues) return "it holds too many values";
    const std::uint64_t end = document_.size() - kTrailerBytes;
    if (table_ < kMagic.size() || table_ > end || objects_ * offset_size_ > end - table_) {
      return "its object table lies outside of it";
    }
    return std::nullopt;
  }

  Problem readObject(std::uint64_t index, Object& object) const {
    if (index >= objects_) return "it refers to an object that is not there";
    const std::uint64_t offset =
        bigEndian(document_.subspan(table_ + index * offset_size_, offset_size_));
    if (offset < kMagic.size() || offset >= table_) return "an object lies outside of it";
    object.rest = document_.subspan(offset, table_ - offset);
    object.kind = object.rest[0] >> 4;
    object.low = object.rest[0] & 15;
    object.count = object.low;
    object.rest = object.rest.subspan(1);
    const bool has_count = object.kind == 0x4 || isText(object) || isContainer(object);
    return has_count && object.low == 15 ? readLongCount(object) : std::nullopt;
  }

  static Problem readLongCount(Object& object) {
    if (object.rest.empty() || object.rest[0] < 0x10 || object.rest[0] > 0x13) {
      return "the length of an object is damaged";
    }
    const std::size_t size = std::size_t{1} << (object.rest[0] & 15);
    if (object.rest.size() < 1 + size) return "the length of an object is cut off";
    object.count = bigEndian(object.rest.subspan(1, size));
    object.rest = object.rest.subspan(1 + size);
    return std::nullopt;
  }

  [[nodiscard]] std::uint64_t bytesPerElement(const Object& object) const {
    if (object.kind == 0x6) return 2;
    if (object.kind == 0xa) return reference_size_;
    if (object.kind == 0xd) return 2 * reference_size_;
    return 1;
  }

  Problem objectProblem(const Object& object) {
    if (object.kind == 0x0) {
      if (object.low == 0) return "it holds a null";
      return object.low == 8 || object.low == 9 ? std::nullopt
                                                : Problem("it holds a value of an unknown kind");
    }
    if (object.kind >= 0x1 && object.kind <= 0x3) return numberProblem(object);
    if (object.kind == 0x8) return "it holds a UID";
    if (object.kind != 0x4 && !isText(object) && !isContainer(object)) {
      return "it holds a value of an unknown kind";
    }
    const std::uint64_t each = bytesPerElement(object);
    if (object.count > object.rest.size() / each) return "a value is cut off";
    unfolded_bytes_ += object.count * each;
    if (unfolded_bytes_ > kMaxUnfoldedBytes) return "it unfolds to too many bytes";
    return isText(object) ? textProblem(object) : std::nullopt;
  }

  void pushChildren(const Object& object, int depth, std::vector<Pending>& pending) const {
    for (std::uint64_t i = 0; i < references(object); ++i) {
      const std::uint64_t index =
          bigEndian(object.rest.subspan(i * reference_size_, reference_size_));
      pending.push_back({index, depth, object.kind == 0xd && i < object.count});
    }
  }

  std::span<const std::uint8_t> document_;
  std::size_t offset_size_ = 0;
  std::size_t reference_size_ = 0;
  std::uint64_t objects_ = 0;
  std::uint64_t root_ = 0;
  std::uint64_t table_ = 0;
  std::size_t values_ = 0;
  std::uint64_t unfolded_bytes_ = 0;
};

}  // namespace

bool isBinaryPlist(std::span<const std::uint8_t> document) {
  return document.size() >= kMagic.size() &&
         std::equal(kMagic.begin(), kMagic.end(), document.begin(),
                    [](char left, std::uint8_t right) {
                      return static_cast<std::uint8_t>(left) == right;
                    });
}

bool plistDateFits(double seconds) {
  const double unix_ns = (seconds + static_cast<double>(kPlistEpochUnixSeconds)) * 1e9;
  return std::abs(unix_ns) < 9.2233720368e18;  // false for NaN
}

std::optional<std::string> binaryPlistProblem(std::span<const std::uint8_t> document) {
  return Walk(document).run();
}

}  // namespace spacekeep
