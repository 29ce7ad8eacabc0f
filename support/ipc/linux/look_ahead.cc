#include "support/ipc/linux/look_ahead.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <utility>

#include "support/ipc/linux/descriptor_message.h"

namespace spacekeep::ipc {

namespace {

using Kind = NextMessage::Kind;

// Over a bus. Headers that anybody has a use for are much shorter.
constexpr std::uint64_t kMaxBusHeaderBytes = 8 * 1024;

NextMessage only(Kind kind) {
  NextMessage next;
  next.kind = kind;
  return next;
}

NextMessage refused(std::string problem) {
  NextMessage next = only(Kind::kRefused);
  next.problem = std::move(problem);
  return next;
}

/// What is there of the next `size` bytes.
std::string peek(int socket, std::size_t size) {
  std::string bytes(size, '\0');
  const ssize_t seen = ::recv(socket, bytes.data(), size, MSG_PEEK | MSG_DONTWAIT);
  bytes.resize(seen > 0 ? static_cast<std::size_t>(seen) : 0);
  return bytes;
}

/// The broker has checked each message, but by its own rules. sd-bus reads on behind what it drops, and
/// so past what was judged: it is shown only what certainly makes sense to it.
NextMessage judgeOfABus(int socket, const WireFixedHeader& fixed, bool brings_descriptors,
                        std::size_t most_bytes) {
  NextMessage next;
  next.bytes = fixed.messageBytes();
  LeftOut message{
      .header = std::nullopt, .bytes = next.bytes, .brings_descriptors = brings_descriptors};
  if (fixed.headerBytes() <= kMaxBusHeaderBytes) {
    const std::string bytes = peek(socket, static_cast<std::size_t>(fixed.headerBytes()));
    if (bytes.size() < fixed.headerBytes()) return only(Kind::kIncomplete);
    message.header = readWireHeader(bytes);
  }
  if (brings_descriptors && message.header && fixed.type == kWireReturn &&
      message.header->sender == kBrokerName) {
    next.kind = Kind::kDescriptors;
  } else if (message.header && !brings_descriptors && message.bytes <= most_bytes) {
    next.kind = Kind::kMessage;
  } else {
    next.kind = Kind::kLeftOut;
    next.left_out = std::move(message);
  }
  return next;
}

NextMessage judgeOfOnePeer(int socket, const WireFixedHeader& fixed, bool brings_descriptors,
                           const LookAheadRules& rules) {
  if (fixed.type > kWireSignal) return refused("it sent something that is no D-Bus message");
  NextMessage next = only(Kind::kMessage);
  next.bytes = fixed.messageBytes();
  if (next.bytes > rules.message_bytes) {
    return refused("it sent a message of " + std::to_string(next.bytes) + " bytes, more than " +
                   std::to_string(rules.message_bytes));
  }
  if (!brings_descriptors || rules.descriptors == DescriptorsFrom::kAnybody) return next;
  if (rules.descriptors == DescriptorsFrom::kNobody) {
    return refused("it sent a descriptor with an answer");
  }
  std::string problem = descriptorMessageProblem(socket, static_cast<std::size_t>(next.bytes));
  if (!problem.empty()) return refused(std::move(problem));
  next.kind = Kind::kDescriptors;
  return next;
}

}  // namespace

NextMessage lookAhead(int socket, const LookAheadRules& rules) {
  std::array<char, kWireFixedBytes> header{};
  iovec part{.iov_base = header.data(), .iov_len = header.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  const ssize_t seen = ::recvmsg(socket, &message, MSG_PEEK | MSG_DONTWAIT);
  if (seen == 0 || (seen < 0 && errno != EAGAIN && errno != EINTR)) return only(Kind::kPeerLeft);
  if (seen < 0) return only(Kind::kNothing);
  if (static_cast<std::size_t>(seen) < header.size()) return only(Kind::kIncomplete);
  const auto fixed = readWireFixedHeader({header.data(), header.size()});
  if (!fixed) return refused("it sent something that is no D-Bus message");
  // Without room for them the kernel says that there are descriptors, and leaves them where they
  // are.
  const bool brings_descriptors = (message.msg_flags & MSG_CTRUNC) != 0;
  return rules.traffic == Traffic::kOfABus
             ? judgeOfABus(socket, *fixed, brings_descriptors, rules.message_bytes)
             : judgeOfOnePeer(socket, *fixed, brings_descriptors, rules);
}

}  // namespace spacekeep::ipc
