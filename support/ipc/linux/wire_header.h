// Thread safety: plain values and a pure function.
//
// The header of a D-Bus message as it stands on the wire, for messages that are judged before sd-bus
// reads them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace spacekeep::ipc {

/// "Message Format" of the D-Bus specification.
inline constexpr std::size_t kWireFixedBytes = 16;
inline constexpr std::uint8_t kWireCall = 1;
inline constexpr std::uint8_t kWireReturn = 2;
inline constexpr std::uint8_t kWireError = 3;
inline constexpr std::uint8_t kWireSignal = 4;
inline constexpr std::uint8_t kWireNoReplyExpected = 1;

/// The first 16 bytes. The length of the fields is without the padding behind them.
struct WireFixedHeader {
  std::uint8_t type = 0;
  std::uint8_t flags = 0;
  std::uint32_t serial = 0;
  std::uint64_t body_bytes = 0;
  std::uint64_t field_bytes = 0;

  /// Up to the body.
  [[nodiscard]] std::uint64_t headerBytes() const {
    return kWireFixedBytes + (field_bytes + 7) / 8 * 8;
  }
  [[nodiscard]] std::uint64_t messageBytes() const { return headerBytes() + body_bytes; }
};

/// None when it is not the beginning of a D-Bus message. The type may be one that nobody knows.
[[nodiscard]] std::optional<WireFixedHeader> readWireFixedHeader(std::string_view bytes);

struct WireHeader {
  WireFixedHeader fixed;
  std::optional<std::string> path;
  std::optional<std::string> interface;
  std::optional<std::string> member;
  std::optional<std::string> error_name;
  std::optional<std::uint32_t> reply_serial;
  std::optional<std::string> destination;
  std::optional<std::string> sender;
  std::optional<std::string> signature;
  std::optional<std::uint32_t> descriptors;
};

/// `bytes`: the whole header, padding included. None when anything is wrong with it that sd-bus could
/// take amiss (libsystemd 252): an unknown field or one that comes twice, a name that is none, a
/// field that the type of message needs and has not, padding that is not zero.
[[nodiscard]] std::optional<WireHeader> readWireHeader(std::string_view bytes);

}  // namespace spacekeep::ipc
