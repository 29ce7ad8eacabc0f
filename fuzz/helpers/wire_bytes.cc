#include "fuzz/helpers/wire_bytes.h"

#include <dirent.h>
#include <sys/socket.h>

#include <cstring>

namespace spacekeep::fuzz {
namespace {

// The codes of the header fields ("Message Format" of the D-Bus specification).
constexpr char kPath = 1;
constexpr char kInterface = 2;
constexpr char kMember = 3;
constexpr char kErrorName = 4;
constexpr char kReplySerial = 5;
constexpr char kSignature = 8;
constexpr char kDescriptors = 9;

constexpr std::size_t kMostDescriptors = 8;

void pad(std::string& bytes) { bytes.resize((bytes.size() + 7) / 8 * 8, '\0'); }

void appendNumber(std::string& bytes, std::size_t number) {
  for (unsigned shift = 0; shift < 32; shift += 8) {
    bytes += static_cast<char>(number >> shift & 0xff);
  }
}

void appendText(std::string& fields, char code, char type, std::string_view text) {
  if (text.empty()) return;
  pad(fields);
  fields += {code, 1, type, 0};
  if (type == 'g') {
    fields += static_cast<char>(text.size());
  } else {
    appendNumber(fields, text.size());
  }
  fields += text;
  fields += '\0';
}

void appendNumberField(std::string& fields, char code, std::uint32_t number) {
  if (number == 0) return;
  pad(fields);
  fields += {code, 1, 'u', 0};
  appendNumber(fields, number);
}

}  // namespace

std::string messageBytes(const MessageHead& head, std::string_view body) {
  std::string fields;
  appendText(fields, kPath, 'o', head.path);
  appendText(fields, kInterface, 's', head.interface);
  appendText(fields, kMember, 's', head.member);
  appendText(fields, kErrorName, 's', head.error_name);
  appendNumberField(fields, kReplySerial, head.reply_serial);
  appendText(fields, kSignature, 'g', head.signature);
  appendNumberField(fields, kDescriptors, head.descriptors);
  std::string message{'l', static_cast<char>(head.type), static_cast<char>(head.flags), 1};
  appendNumber(message, body.size());
  appendNumber(message, head.serial);
  appendNumber(message, fields.size());
  message += fields;
  pad(message);
  return message + std::string(body);
}

bool sendAll(int fd, std::string_view bytes, const std::vector<int>& descriptors) {
  iovec part{.iov_base = const_cast<char*>(bytes.data()), .iov_len = bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  alignas(cmsghdr) char control[CMSG_SPACE(kMostDescriptors * sizeof(int))] = {};
  if (!descriptors.empty() && descriptors.size() <= kMostDescriptors) {
    const std::size_t size = descriptors.size() * sizeof(int);
    message.msg_control = control;
    message.msg_controllen = CMSG_SPACE(size);
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(size);
    std::memcpy(CMSG_DATA(header), descriptors.data(), size);
  }
  return ::sendmsg(fd, &message, MSG_NOSIGNAL | MSG_DONTWAIT) == static_cast<ssize_t>(bytes.size());
}

std::size_t openDescriptors() {
  DIR* directory = ::opendir("/proc/self/fd");
  if (directory == nullptr) return 0;
  std::size_t count = 0;
  while (::readdir(directory) != nullptr) ++count;
  ::closedir(directory);
  return count;
}

}  // namespace spacekeep::fuzz
