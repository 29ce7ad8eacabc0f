#include "support/ipc/linux/descriptor_message.h"

#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstring>
#include <optional>
#include <set>
#include <string_view>

#include "support/ipc/linux/wire_signature.h"

namespace spacekeep::ipc {

namespace {

constexpr std::size_t kFixedBytes = 16;
constexpr std::uint8_t kMethodCall = 1;

// The codes of the header fields that a call may have ("Message Format" of the D-Bus specification).
enum Field : std::uint8_t {
  kPath = 1,
  kInterface = 2,
  kMember = 3,
  kDestination = 6,
  kSender = 7,
  kSignature = 8,
  kDescriptors = 9,
};

struct Piece {
  std::string bytes;
  std::size_t descriptors = 0;
  bool cut = false;  ///< there are more of them than may be
};

/// Looks without taking: the copies of the descriptors that come with a look are closed at once.
Piece lookAtPiece(int socket, std::size_t size) {
  Piece piece;
  piece.bytes.resize(size);
  iovec part{.iov_base = piece.bytes.data(), .iov_len = size};
  alignas(cmsghdr) std::array<char, CMSG_SPACE(kMaxMessageDescriptors * sizeof(int))> control{};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  const ssize_t seen = ::recvmsg(socket, &message, MSG_PEEK | MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  piece.bytes.resize(seen > 0 ? static_cast<std::size_t>(seen) : 0);
  if (seen < 0) return piece;
  piece.cut = (message.msg_flags & MSG_CTRUNC) != 0;
  for (cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr;
       header = CMSG_NXTHDR(&message, header)) {
    if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (header->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int copy = -1;
      std::memcpy(&copy, CMSG_DATA(header) + i * sizeof(int), sizeof copy);
      ::close(copy);
    }
    piece.descriptors += count;
  }
  return piece;
}

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
    case kDescriptors:
      return 'u';
    case kInterface:
    case kMember:
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

bool readField(HeaderReader& header, std::uint8_t code, std::size_t descriptors) {
  const char type = typeOf(code);
  if (type == '\0' || header.byte() != std::uint8_t{1} ||
      header.byte() != static_cast<std::uint8_t>(type) || header.byte() != std::uint8_t{0}) {
    return false;
  }
  if (type == 'u') return header.number() == descriptors;
  const auto length = type == 'g' ? std::optional<std::size_t>(header.byte())
                                  : std::optional<std::size_t>(header.number());
  const auto text = header.text(length);
  return text && isValidText(code, *text);
}

bool areFieldsSound(std::string_view bytes, bool little_endian, std::size_t descriptors) {
  HeaderReader header(bytes, little_endian);
  std::set<std::uint8_t> seen;
  while (!header.atEnd()) {
    if (!header.align(8)) return false;
    const auto code = header.byte();
    if (!code || !seen.insert(*code).second || !readField(header, *code, descriptors)) return false;
  }
  return seen.contains(kPath) && seen.contains(kMember) && seen.contains(kSignature) &&
         seen.contains(kDescriptors);
}

bool isSoundCall(const Piece& piece) {
  const std::string_view bytes = piece.bytes;
  HeaderReader fixed(bytes.substr(0, kFixedBytes), bytes[0] == 'l');
  static_cast<void>(fixed.byte());
  if (fixed.byte() != kMethodCall || !fixed.byte() || fixed.byte() != std::uint8_t{1}) return false;
  const auto body = fixed.number();
  const auto serial = fixed.number();
  const auto fields = fixed.number();
  if (!body || !serial || *serial == 0 || !fields) return false;
  if (*fields > bytes.size() - kFixedBytes) return false;
  const std::string_view rest = bytes.substr(kFixedBytes + *fields);
  const std::size_t padding = (8 - *fields % 8) % 8;
  if (rest.size() != padding + *body ||
      rest.substr(0, padding).find_first_not_of('\0') != std::string_view::npos) {
    return false;
  }
  return areFieldsSound(bytes.substr(kFixedBytes, *fields), bytes[0] == 'l', piece.descriptors);
}

}  // namespace

std::string descriptorMessageProblem(int socket, std::size_t size) {
  if (size > kMaxDescriptorMessageBytes) return "it sent a descriptor with too large a message";
  const Piece piece = lookAtPiece(socket, size);
  if (piece.cut || piece.descriptors > kMaxMessageDescriptors) {
    return "it sent more than " + std::to_string(kMaxMessageDescriptors) +
           " descriptors with a message";
  }
  if (piece.bytes.size() != size) return "it sent a message with a descriptor in pieces";
  return isSoundCall(piece) ? "" : "it sent a descriptor with a broken message";
}

}  // namespace spacekeep::ipc
