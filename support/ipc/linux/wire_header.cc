#include "support/ipc/linux/wire_header.h"

#include <systemd/sd-bus.h>

#include <set>

#include "support/ipc/linux/wire_signature.h"

namespace spacekeep::ipc {

namespace {

// The codes of the header fields.
enum Field : std::uint8_t {
  kPath = 1,
  kInterface = 2,
  kMember = 3,
  kErrorName = 4,
  kReplySerial = 5,
  kDestination = 6,
  kSender = 7,
  kSignature = 8,
  kDescriptors = 9,
};

/// Reads a header field by field. Whatever does not fit makes every later answer empty.
class HeaderReader {
 public:
  HeaderReader(std::string_view bytes, bool little_endian)
      : bytes_(bytes), little_endian_(little_endian) {}

  [[nodiscard]] bool atEnd() const { return at_ == bytes_.size(); }
  bool align(std::size_t to) {
    while (at_ % to != 0) {
      if (byte() != std::uint8_t{0}) return false;
    }
    return true;
  }
  std::optional<std::uint8_t> byte() {
    if (at_ >= bytes_.size()) return std::nullopt;
    return static_cast<std::uint8_t>(bytes_[at_++]);
  }
  std::optional<std::uint32_t> number() {
    if (!align(4) || bytes_.size() - at_ < 4) return std::nullopt;
    std::uint32_t number = 0;
    for (std::size_t i = 0; i < 4; ++i) {
      const std::size_t place = little_endian_ ? 3 - i : i;
      number = number << 8U | static_cast<std::uint8_t>(bytes_[at_ + place]);
    }
    at_ += 4;
    return number;
  }
  /// With the zero byte that ends it, which is not part of the answer.
  std::optional<std::string> text(std::optional<std::size_t> length) {
    if (!length || bytes_.size() - at_ <= *length || bytes_[at_ + *length] != '\0') {
      return std::nullopt;
    }
    std::string text(bytes_.substr(at_, *length));
    at_ += *length + 1;
    if (text.find('\0') != std::string::npos) return std::nullopt;
    return text;
  }

 private:
  const std::string_view bytes_;
  const bool little_endian_;
  std::size_t at_ = 0;
};

char typeOf(std::uint8_t code) {
  switch (code) {
    case kPath:
      return 'o';
    case kSignature:
      return 'g';
    case kReplySerial:
    case kDescriptors:
      return 'u';
    case kInterface:
    case kMember:
    case kErrorName:
    case kDestination:
    case kSender:
      return 's';
    default:
      return '\0';
  }
}

bool isLocalName(const std::string& name) {
  return name == "org.freedesktop.DBus.Local" || name == "/org/freedesktop/DBus/Local";
}

bool isValidText(std::uint8_t code, const std::string& text) {
  if (isLocalName(text)) return false;
  switch (code) {
    case kPath:
      return sd_bus_object_path_is_valid(text.c_str()) > 0;
    case kInterface:
    case kErrorName:
      return sd_bus_interface_name_is_valid(text.c_str()) > 0;
    case kMember:
      return sd_bus_member_name_is_valid(text.c_str()) > 0;
    case kDestination:
    case kSender:
      return sd_bus_service_name_is_valid(text.c_str()) > 0;
    case kSignature:
      return isWireSignature(text);
    default:
      return false;
  }
}

std::optional<std::string>& textField(WireHeader& header, std::uint8_t code) {
  switch (code) {
    case kPath:
      return header.path;
    case kInterface:
      return header.interface;
    case kMember:
      return header.member;
    case kErrorName:
      return header.error_name;
    case kDestination:
      return header.destination;
    case kSender:
      return header.sender;
    default:
      return header.signature;
  }
}

bool readField(HeaderReader& reader, std::uint8_t code, WireHeader& header) {
  const char type = typeOf(code);
  if (type == '\0' || reader.byte() != std::uint8_t{1} ||
      reader.byte() != static_cast<std::uint8_t>(type) || reader.byte() != std::uint8_t{0}) {
    return false;
  }
  if (type == 'u') {
    auto& number = code == kReplySerial ? header.reply_serial : header.descriptors;
    number = reader.number();
    // No descriptors may be announced as well as not be mentioned.
    return number && (*number != 0 || code == kDescriptors);
  }
  const auto length = type == 'g' ? std::optional<std::size_t>(reader.byte())
                                  : std::optional<std::size_t>(reader.number());
  auto& text = textField(header, code);
  text = reader.text(length);
  return text && isValidText(code, *text);
}

bool readFields(std::string_view bytes, bool little_endian, WireHeader& header) {
  HeaderReader reader(bytes, little_endian);
  std::set<std::uint8_t> seen;
  while (!reader.atEnd()) {
    if (!reader.align(8)) return false;
    const auto code = reader.byte();
    if (!code || !seen.insert(*code).second || !readField(reader, *code, header)) return false;
  }
  return true;
}

bool hasWhatItsTypeNeeds(const WireHeader& header) {
  switch (header.fixed.type) {
    case kWireCall:
      return header.path && header.member;
    case kWireReturn:
      return header.reply_serial.has_value();
    case kWireError:
      return header.reply_serial && header.error_name;
    case kWireSignal:
      return header.path && header.interface && header.member;
    default:
      return false;
  }
}

}  // namespace

std::optional<WireFixedHeader> readWireFixedHeader(std::string_view bytes) {
  if (bytes.size() < kWireFixedBytes || (bytes[0] != 'l' && bytes[0] != 'B')) return std::nullopt;
  HeaderReader reader(bytes.substr(0, kWireFixedBytes), bytes[0] == 'l');
  static_cast<void>(reader.byte());
  WireFixedHeader header;
  header.type = reader.byte().value_or(0);
  header.flags = reader.byte().value_or(0);
  if (header.type == 0 || reader.byte() != std::uint8_t{1}) return std::nullopt;
  header.body_bytes = reader.number().value_or(0);
  header.serial = reader.number().value_or(0);
  header.field_bytes = reader.number().value_or(0);
  return header;
}

std::optional<WireHeader> readWireHeader(std::string_view bytes) {
  const auto fixed = readWireFixedHeader(bytes);
  if (!fixed || fixed->serial == 0 || fixed->headerBytes() != bytes.size()) return std::nullopt;
  const std::size_t fields_end = kWireFixedBytes + static_cast<std::size_t>(fixed->field_bytes);
  if (bytes.substr(fields_end).find_first_not_of('\0') != std::string_view::npos) {
    return std::nullopt;
  }
  WireHeader header;
  header.fixed = *fixed;
  const std::string_view fields =
      bytes.substr(kWireFixedBytes, static_cast<std::size_t>(fixed->field_bytes));
  if (!readFields(fields, bytes[0] == 'l', header) || !hasWhatItsTypeNeeds(header)) {
    return std::nullopt;
  }
  return header;
}

}  // namespace spacekeep::ipc
