// Thread safety: plain values; concurrent reads of one value are fine, anything else is not.
//
// Property-list values: what requests, replies, descriptors, rules and stored state are made of.
// There is no null: an absent value is an absent key, std::nullopt or a null pointer.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace spacekeep {

class Value;
using Array = std::vector<Value>;

/// Bytes without meaning to the system.
struct Data {
  std::vector<std::uint8_t> bytes;
  bool operator==(const Data&) const = default;
};

/// A point on the wall clock, in nanoseconds since 1970-01-01 00:00 UTC.
struct Date {
  std::int64_t unix_ns = 0;
  bool operator==(const Date&) const = default;
};

/// String keys to values, iterated in the byte order of the keys.
class Dictionary {
 public:
  struct Entry;
  using const_iterator = const Entry*;

  Dictionary();
  /// A key that is given twice keeps its last value.
  Dictionary(std::initializer_list<Entry> entries);
  Dictionary(const Dictionary&);
  Dictionary(Dictionary&&) noexcept;
  Dictionary& operator=(const Dictionary&);
  Dictionary& operator=(Dictionary&&) noexcept;
  ~Dictionary();

  /// Null when absent. The pointer is good until the dictionary changes.
  [[nodiscard]] const Value* find(std::string_view key) const;
  [[nodiscard]] bool contains(std::string_view key) const { return find(key) != nullptr; }
  /// Adds or replaces. Appending in key order is O(1).
  void set(std::string_view key, Value value);
  /// Answers whether the key was there.
  bool remove(std::string_view key);
  void clear();

  [[nodiscard]] std::size_t size() const;
  [[nodiscard]] bool empty() const { return size() == 0; }
  [[nodiscard]] const_iterator begin() const;
  [[nodiscard]] const_iterator end() const;
  bool operator==(const Dictionary&) const;

 private:
  std::vector<Entry> entries_;  // sorted by key, keys unique
};

class Value {
 public:
  using Storage = std::variant<std::string, bool, std::int64_t, std::uint64_t, double, Data, Date,
                               Array, Dictionary>;

  // Conversions from the kinds themselves are implicit on purpose: dictionaries are written as
  // { {"KEY", 1}, {"OTHER", "text"} }.
  Value(std::string text) : storage_(std::move(text)) {}                 // NOLINT
  Value(std::string_view text) : storage_(std::string(text)) {}          // NOLINT
  Value(const char* text) : storage_(std::string(text)) {}               // NOLINT
  Value(bool truth) : storage_(truth) {}                                 // NOLINT
  Value(int number) : storage_(std::int64_t{number}) {}                  // NOLINT
  Value(long number) : storage_(std::int64_t{number}) {}                 // NOLINT
  Value(long long number) : storage_(std::int64_t{number}) {}            // NOLINT
  Value(unsigned number) : storage_(std::uint64_t{number}) {}            // NOLINT
  Value(unsigned long number) : storage_(std::uint64_t{number}) {}       // NOLINT
  Value(unsigned long long number) : storage_(std::uint64_t{number}) {}  // NOLINT
  Value(double number) : storage_(number) {}                             // NOLINT
  Value(Data data) : storage_(std::move(data)) {}                        // NOLINT
  Value(Date date) : storage_(date) {}                                   // NOLINT
  Value(Array array) : storage_(std::move(array)) {}                     // NOLINT
  Value(Dictionary dictionary) : storage_(std::move(dictionary)) {}      // NOLINT

  [[nodiscard]] const Storage& storage() const { return storage_; }

  // Each answers null when the value is of another kind.
  [[nodiscard]] const std::string* string() const { return std::get_if<std::string>(&storage_); }
  [[nodiscard]] const bool* boolean() const { return std::get_if<bool>(&storage_); }
  [[nodiscard]] const Data* data() const { return std::get_if<Data>(&storage_); }
  [[nodiscard]] const Date* date() const { return std::get_if<Date>(&storage_); }
  [[nodiscard]] const Array* array() const { return std::get_if<Array>(&storage_); }
  [[nodiscard]] const Dictionary* dictionary() const { return std::get_if<Dictionary>(&storage_); }

  /// Signed, unsigned or floating. A boolean is not a number.
  [[nodiscard]] bool isNumber() const;
  /// A number as unsigned 64-bit: fractions are cut off, what is below 0 (or not a number at all in
  /// the floating sense) becomes 0, what is too large becomes the largest. None for other kinds.
  [[nodiscard]] std::optional<std::uint64_t> asUnsigned() const;
  /// The same for signed 64-bit, saturating at both ends.
  [[nodiscard]] std::optional<std::int64_t> asSigned() const;
  [[nodiscard]] std::optional<double> asDouble() const;
  /// A boolean as it is; a number is true unless it is 0; every other kind is false.
  [[nodiscard]] bool truth() const;

  /// Equal kind and equal content; numbers compare by value across the three number kinds.
  bool operator==(const Value& other) const;

 private:
  Storage storage_;
};

struct Dictionary::Entry {
  std::string key;
  Value value;
  bool operator==(const Entry&) const = default;
};

// Readers for request dictionaries: the value under `key` when it is there and of that kind.
[[nodiscard]] std::optional<std::uint64_t> unsignedAt(const Dictionary& info, std::string_view key);
[[nodiscard]] const std::string* stringAt(const Dictionary& info, std::string_view key);
/// False when absent.
[[nodiscard]] bool truthAt(const Dictionary& info, std::string_view key);

/// Deepest nesting of arrays and dictionaries that any decoder here accepts.
inline constexpr int kMaxValueDepth = 32;

}  // namespace spacekeep
