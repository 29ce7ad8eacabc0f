// Thread safety: pure functions, apart from sendAll() and openDescriptors(), which ask the kernel; all
// may be called from any thread.
//
// Messages as they stand on a socket, put together byte by byte: a library would not write the broken
// ones.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace spacekeep::fuzz {

/// As in the fixed part of a header.
enum class MessageType : std::uint8_t { kCall = 1, kReturn = 2, kError = 3, kSignal = 4 };

/// What is empty or zero is left out of the header.
struct MessageHead {
  MessageType type = MessageType::kCall;
  std::uint8_t flags = 0;
  std::uint32_t serial = 1;
  std::uint32_t reply_serial = 0;
  std::string path;
  std::string interface;
  std::string member;
  std::string error_name;
  std::string signature;
  std::uint32_t descriptors = 0;
};

[[nodiscard]] std::string messageBytes(const MessageHead& head, std::string_view body);

/// Sends `bytes`, and the descriptors with the first of them. False when not all fit into the socket.
bool sendAll(int fd, std::string_view bytes, const std::vector<int>& descriptors = {});

/// How many descriptors the process has open.
[[nodiscard]] std::size_t openDescriptors();

}  // namespace spacekeep::fuzz
