#include "support/values/plist.h"

#include <plist/plist.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <memory>

#include "support/values/plist_check.h"
#include "support/values/text.h"

namespace spacekeep {
namespace {

struct FreeNode {
  void operator()(void* node) const { plist_free(node); }
};
struct FreeBytes {
  void operator()(void* bytes) const { std::free(bytes); }
};
using Node = std::unique_ptr<void, FreeNode>;
using OwnedText = std::unique_ptr<char, FreeBytes>;

constexpr std::uint8_t kMarkerUnsigned = 0x14;  // 16 bytes
constexpr std::uint8_t kMarkerDate = 0x33;      // a double
constexpr std::size_t kHeaderBytes = 8;
constexpr std::int64_t kLargestDateNs = 9'223'372'036'000'000'000;

using Bytes = std::vector<std::uint8_t>;

Bytes encodeNode(plist_t node) {
  char* bytes = nullptr;
  std::uint32_t length = 0;
  plist_to_bin(node, &bytes, &length);
  const OwnedText owner(bytes);
  return Bytes(bytes, bytes + (bytes == nullptr ? 0 : length));
}

void appendBigEndian(Bytes& out, std::uint64_t number) {
  for (int shift = 56; shift >= 0; shift -= 8)
    out.push_back(static_cast<std::uint8_t>(number >> shift));
}

// The library's accessors know neither integers above 2^63 nor dates beyond 32 bits of seconds, but
// its nodes and its binary encoding do: one scalar alone is a document, with its bytes at a known
// place.
Node decodeScalar(std::uint8_t marker, std::uint64_t bits) {
  Bytes document{'b', 'p', 'l', 'i', 's', 't', '0', '0', marker};
  if (marker == kMarkerUnsigned) appendBigEndian(document, 0);
  appendBigEndian(document, bits);
  const std::uint64_t table = document.size();
  document.push_back(kHeaderBytes);
  document.insert(document.end(), {0, 0, 0, 0, 0, 0, 1, 1});
  appendBigEndian(document, 1);  // objects
  appendBigEndian(document, 0);  // root
  appendBigEndian(document, table);
  plist_t node = nullptr;
  plist_from_bin(reinterpret_cast<const char*>(document.data()),
                 static_cast<std::uint32_t>(document.size()), &node);
  return Node(node);
}

Value integerOf(plist_t node) {
  std::uint64_t bits = 0;
  plist_get_uint_val(node, &bits);
  if (std::bit_cast<std::int64_t>(bits) >= 0) return Value(std::bit_cast<std::int64_t>(bits));
  const Bytes encoded = encodeNode(node);
  if (encoded.size() > kHeaderBytes && encoded[kHeaderBytes] == kMarkerUnsigned) return Value(bits);
  return Value(std::bit_cast<std::int64_t>(bits));
}

std::optional<Value> dateOf(plist_t node) {
  const Bytes encoded = encodeNode(node);
  if (encoded.size() < kHeaderBytes + 9 || encoded[kHeaderBytes] != kMarkerDate)
    return std::nullopt;
  std::uint64_t bits = 0;
  for (std::size_t i = 1; i <= 8; ++i) bits = bits << 8 | encoded[kHeaderBytes + i];
  const auto seconds = std::bit_cast<double>(bits);
  if (!plistDateFits(seconds)) return std::nullopt;
  // Whole seconds apart from the rest: their product with 10^9 would lose what the double has. Cut
  // off towards the epoch, since in the first second of the range the one below is out of it.
  const double whole = std::trunc(seconds);
  const auto rest_ns = static_cast<std::int64_t>(std::llround((seconds - whole) * 1e9));
  return Value(
      Date{(static_cast<std::int64_t>(whole) + kPlistEpochUnixSeconds) * 1'000'000'000 + rest_ns});
}

std::optional<Value> textOfNode(const char* text, std::uint64_t length) {
  const std::string_view view =
      text == nullptr ? std::string_view() : std::string_view(text, length);
  if (!isUtf8(view)) return std::nullopt;
  return Value(view);
}

std::optional<Value> valueOf(plist_t node, int depth);

std::optional<Value> arrayOf(plist_t node, int depth) {
  Array array;
  plist_array_iter raw = nullptr;
  plist_array_new_iter(node, &raw);
  const std::unique_ptr<void, FreeBytes> iterator(raw);
  while (true) {
    plist_t item = nullptr;
    plist_array_next_item(node, raw, &item);
    if (item == nullptr) return Value(std::move(array));
    std::optional<Value> value = valueOf(item, depth + 1);
    if (!value) return std::nullopt;
    array.push_back(std::move(*value));
  }
}

std::optional<Value> dictionaryOf(plist_t node, int depth) {
  Dictionary dictionary;
  plist_dict_iter raw = nullptr;
  plist_dict_new_iter(node, &raw);
  const std::unique_ptr<void, FreeBytes> iterator(raw);
  while (true) {
    char* raw_key = nullptr;
    plist_t item = nullptr;
    plist_dict_next_item(node, raw, &raw_key, &item);
    const OwnedText key(raw_key);
    if (item == nullptr) return Value(std::move(dictionary));
    std::optional<Value> value = valueOf(item, depth + 1);
    if (!value || key == nullptr || !isUtf8(key.get())) return std::nullopt;
    dictionary.set(key.get(), std::move(*value));
  }
}

// None for what the checks before the parser should have kept out.
std::optional<Value> valueOf(plist_t node, int depth) {
  if (depth > kMaxPlistDepth + 1) return std::nullopt;  // a scalar stands one below its container
  std::uint64_t length = 0;
  switch (plist_get_node_type(node)) {
    case PLIST_BOOLEAN: {
      std::uint8_t truth = 0;
      plist_get_bool_val(node, &truth);
      return Value(truth != 0);
    }
    case PLIST_UINT:
      return integerOf(node);
    case PLIST_REAL: {
      double number = 0;
      plist_get_real_val(node, &number);
      return Value(number);
    }
    case PLIST_STRING: {
      const char* text = plist_get_string_ptr(node, &length);
      return textOfNode(text, length);
    }
    case PLIST_ARRAY:
      return arrayOf(node, depth);
    case PLIST_DICT:
      return dictionaryOf(node, depth);
    case PLIST_DATE:
      return dateOf(node);
    case PLIST_DATA: {
      const char* bytes = plist_get_data_ptr(node, &length);
      return Value(bytes == nullptr ? Data{} : Data{{bytes, bytes + length}});
    }
    case PLIST_KEY:
    case PLIST_UID:
    case PLIST_NONE:
      return std::nullopt;
  }
  return std::nullopt;
}

bool isPlainCharacter(char character) {
  const auto byte = static_cast<unsigned char>(character);
  return byte > 0 && byte < 0x80;
}

// The library takes C strings and drops what is not UTF-8; this way the place of what cannot be
// kept stays visible. Nearly all text is ASCII and goes in runs: others wait while the state is
// written.
std::string storable(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    const std::string_view plain(text.begin(), std::ranges::find_if_not(text, isPlainCharacter));
    out += plain;
    text.remove_prefix(plain.size());
    if (text.empty()) break;
    const std::size_t length = utf8SequenceLength(text);
    const bool keep = length > 0 && text[0] != '\0';
    out += keep ? text.substr(0, length) : "\xef\xbf\xbd";
    text.remove_prefix(std::max<std::size_t>(1, length));
  }
  return out;
}

struct NodeMaker {
  int depth;  // of this value, were it a container
  std::size_t& values_left;

  Node operator()(const std::string& text) const {
    return Node(plist_new_string(storable(text).c_str()));
  }
  Node operator()(bool truth) const { return Node(plist_new_bool(truth ? 1 : 0)); }
  Node operator()(std::int64_t number) const {
    return Node(plist_new_uint(std::bit_cast<std::uint64_t>(number)));
  }
  Node operator()(std::uint64_t number) const {
    if (number > std::uint64_t{INT64_MAX}) return decodeScalar(kMarkerUnsigned, number);
    return Node(plist_new_uint(number));
  }
  Node operator()(double number) const { return Node(plist_new_real(number)); }
  Node operator()(const Data& data) const {
    const char* bytes = data.bytes.empty() ? "" : reinterpret_cast<const char*>(data.bytes.data());
    return Node(plist_new_data(bytes, data.bytes.size()));
  }
  Node operator()(const Date& date) const {
    constexpr std::int64_t kNanoseconds = 1'000'000'000;
    // The very ends of the range are not doubles; one step inside is.
    const std::int64_t unix_ns = std::clamp(date.unix_ns, -kLargestDateNs, kLargestDateNs);
    const std::int64_t whole = unix_ns / kNanoseconds - kPlistEpochUnixSeconds;
    const double rest = static_cast<double>(unix_ns % kNanoseconds) / 1e9;
    return decodeScalar(kMarkerDate,
                        std::bit_cast<std::uint64_t>(static_cast<double>(whole) + rest));
  }
  Node operator()(const Array& array) const {
    Node node(depth > kMaxPlistDepth ? nullptr : plist_new_array());
    for (const Value& value : array) {
      Node item = node ? child(value) : nullptr;
      if (!item) return nullptr;
      plist_array_append_item(node.get(), item.release());
    }
    return node;
  }
  Node operator()(const Dictionary& dictionary) const {
    Node node(depth > kMaxPlistDepth ? nullptr : plist_new_dict());
    for (const auto& [key, value] : dictionary) {
      Node item = node && takeValue() ? child(value) : nullptr;
      if (!item) return nullptr;
      plist_dict_set_item(node.get(), storable(key).c_str(), item.release());
    }
    return node;
  }

  [[nodiscard]] bool takeValue() const { return values_left > 0 && values_left-- > 0; }
  [[nodiscard]] Node child(const Value& value) const {
    return takeValue() ? std::visit(NodeMaker{depth + 1, values_left}, value.storage()) : nullptr;
  }
};

}  // namespace

std::variant<Value, PlistError> parsePlist(std::span<const std::uint8_t> document) {
  if (document.size() > kMaxPlistBytes) return PlistError{"not a property list: it is too large"};
  const bool binary = isBinaryPlist(document);
  std::string_view text(reinterpret_cast<const char*>(document.data()), document.size());
  if (text.starts_with("\xef\xbb\xbf")) text.remove_prefix(3);
  if (const auto problem = binary ? binaryPlistProblem(document) : xmlPlistProblem(text)) {
    return PlistError{"not a property list: " + *problem};
  }
  plist_t raw = nullptr;
  const auto length = static_cast<std::uint32_t>(text.size());
  if (binary) {
    plist_from_bin(text.data(), length, &raw);
  } else if (length > 0) {
    plist_from_xml(text.data(), length, &raw);
  }
  const Node node(raw);
  if (!node) return PlistError{"not a property list: it is not well formed"};
  if (std::optional<Value> value = valueOf(node.get(), 1)) return std::move(*value);
  return PlistError{"not a property list: it holds a value of an unknown kind"};
}

std::vector<std::uint8_t> binaryPlist(const Value& value) {
  std::size_t values_left = kMaxPlistValues - 1;
  const Node node = std::visit(NodeMaker{1, values_left}, value.storage());
  if (!node) return {};
  Bytes bytes = encodeNode(node.get());
  // The library writes equal strings once, so a small document may unfold to more than is read
  // back.
  const bool readable = bytes.size() <= kMaxPlistBytes && !binaryPlistProblem(bytes);
  return readable ? bytes : Bytes{};
}

}  // namespace spacekeep
