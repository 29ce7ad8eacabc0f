#include "support/ipc/linux/descriptor_message.h"

#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <string_view>

#include "support/ipc/linux/wire_header.h"

namespace spacekeep::ipc {

namespace {

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

bool isSoundCall(const Piece& piece) {
  const std::string_view bytes = piece.bytes;
  const auto fixed = readWireFixedHeader(bytes);
  if (!fixed || fixed->messageBytes() != bytes.size()) return false;
  const auto header = readWireHeader(bytes.substr(0, fixed->headerBytes()));
  return header && fixed->type == kWireCall && !header->reply_serial && !header->error_name &&
         header->signature && header->descriptors == piece.descriptors;
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
