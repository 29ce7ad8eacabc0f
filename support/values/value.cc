#include "support/values/value.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

namespace spacekeep {
namespace {

// 2^63 and 2^64: the first doubles outside the two integer ranges.
constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

struct KeyBefore {
  bool operator()(const Dictionary::Entry& entry, std::string_view key) const {
    return std::string_view(entry.key) < key;
  }
};

std::uint64_t unsignedFrom(double number) {
  if (std::isnan(number) || number <= 0) return 0;
  if (number >= kTwoTo64) return std::numeric_limits<std::uint64_t>::max();
  return static_cast<std::uint64_t>(number);
}

std::int64_t signedFrom(double number) {
  if (std::isnan(number)) return 0;
  if (number >= kTwoTo63) return std::numeric_limits<std::int64_t>::max();
  if (number < -kTwoTo63) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(number);
}

// Comparing as doubles would call 2^53 and 2^53 + 1 equal, so the double goes to the integer side.
bool equalNumbers(std::int64_t integer, double number) {
  return number >= -kTwoTo63 && number < kTwoTo63 && std::trunc(number) == number &&
         static_cast<std::int64_t>(number) == integer;
}

bool equalNumbers(std::uint64_t integer, double number) {
  return number >= 0 && number < kTwoTo64 && std::trunc(number) == number &&
         static_cast<std::uint64_t>(number) == integer;
}

bool equalNumbers(std::int64_t left, std::uint64_t right) { return std::cmp_equal(left, right); }

// One answer for each pair of kinds: numbers by value, everything else only with its own kind.
struct EqualContent {
  bool operator()(std::int64_t left, std::uint64_t right) const {
    return equalNumbers(left, right);
  }
  bool operator()(std::uint64_t left, std::int64_t right) const {
    return equalNumbers(right, left);
  }
  bool operator()(std::int64_t left, double right) const { return equalNumbers(left, right); }
  bool operator()(double left, std::int64_t right) const { return equalNumbers(right, left); }
  bool operator()(std::uint64_t left, double right) const { return equalNumbers(left, right); }
  bool operator()(double left, std::uint64_t right) const { return equalNumbers(right, left); }

  template <class Same>
  bool operator()(const Same& left, const Same& right) const {
    return left == right;
  }
  template <class Left, class Right>
  bool operator()(const Left& /*left*/, const Right& /*right*/) const {
    return false;
  }
};

}  // namespace

Dictionary::Dictionary() = default;
Dictionary::Dictionary(const Dictionary&) = default;
Dictionary::Dictionary(Dictionary&&) noexcept = default;
Dictionary& Dictionary::operator=(const Dictionary&) = default;
Dictionary& Dictionary::operator=(Dictionary&&) noexcept = default;
Dictionary::~Dictionary() = default;

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  entries_.reserve(entries.size());
  for (const Entry& entry : entries) set(entry.key, entry.value);
}

const Value* Dictionary::find(std::string_view key) const {
  const auto found = std::lower_bound(entries_.begin(), entries_.end(), key, KeyBefore{});
  return found != entries_.end() && found->key == key ? &found->value : nullptr;
}

void Dictionary::set(std::string_view key, Value value) {
  if (entries_.empty() || std::string_view(entries_.back().key) < key) {
    entries_.push_back({std::string(key), std::move(value)});
    return;
  }
  const auto place = std::lower_bound(entries_.begin(), entries_.end(), key, KeyBefore{});
  if (place->key == key) {
    place->value = std::move(value);
  } else {
    entries_.insert(place, {std::string(key), std::move(value)});
  }
}

bool Dictionary::remove(std::string_view key) {
  const auto found = std::lower_bound(entries_.begin(), entries_.end(), key, KeyBefore{});
  if (found == entries_.end() || found->key != key) return false;
  entries_.erase(found);
  return true;
}

void Dictionary::clear() { entries_.clear(); }
std::size_t Dictionary::size() const { return entries_.size(); }
Dictionary::const_iterator Dictionary::begin() const { return entries_.data(); }
Dictionary::const_iterator Dictionary::end() const { return entries_.data() + entries_.size(); }
bool Dictionary::operator==(const Dictionary&) const = default;

bool Value::isNumber() const {
  return std::holds_alternative<std::int64_t>(storage_) ||
         std::holds_alternative<std::uint64_t>(storage_) ||
         std::holds_alternative<double>(storage_);
}

std::optional<std::uint64_t> Value::asUnsigned() const {
  if (const auto* number = std::get_if<std::uint64_t>(&storage_)) return *number;
  if (const auto* number = std::get_if<std::int64_t>(&storage_)) {
    return *number < 0 ? 0 : static_cast<std::uint64_t>(*number);
  }
  if (const auto* number = std::get_if<double>(&storage_)) return unsignedFrom(*number);
  return std::nullopt;
}

std::optional<std::int64_t> Value::asSigned() const {
  constexpr std::int64_t kLargest = std::numeric_limits<std::int64_t>::max();
  if (const auto* number = std::get_if<std::int64_t>(&storage_)) return *number;
  if (const auto* number = std::get_if<std::uint64_t>(&storage_)) {
    return std::cmp_greater(*number, kLargest) ? kLargest : static_cast<std::int64_t>(*number);
  }
  if (const auto* number = std::get_if<double>(&storage_)) return signedFrom(*number);
  return std::nullopt;
}

std::optional<double> Value::asDouble() const {
  if (const auto* number = std::get_if<double>(&storage_)) return *number;
  if (const auto* number = std::get_if<std::int64_t>(&storage_))
    return static_cast<double>(*number);
  if (const auto* number = std::get_if<std::uint64_t>(&storage_))
    return static_cast<double>(*number);
  return std::nullopt;
}

bool Value::truth() const {
  if (const bool* answer = boolean()) return *answer;
  if (const auto* number = std::get_if<std::int64_t>(&storage_)) return *number != 0;
  if (const auto* number = std::get_if<std::uint64_t>(&storage_)) return *number != 0;
  if (const auto* number = std::get_if<double>(&storage_))
    return std::fpclassify(*number) != FP_ZERO;
  return false;
}

bool Value::operator==(const Value& other) const {
  return std::visit(EqualContent{}, storage_, other.storage_);
}

std::optional<std::uint64_t> unsignedAt(const Dictionary& info, std::string_view key) {
  const Value* value = info.find(key);
  return value == nullptr ? std::nullopt : value->asUnsigned();
}

const std::string* stringAt(const Dictionary& info, std::string_view key) {
  const Value* value = info.find(key);
  return value == nullptr ? nullptr : value->string();
}

bool truthAt(const Dictionary& info, std::string_view key) {
  const Value* value = info.find(key);
  return value != nullptr && value->truth();
}

}  // namespace spacekeep
