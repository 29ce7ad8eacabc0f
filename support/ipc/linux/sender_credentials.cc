#include "support/ipc/linux/sender_credentials.h"

#include <fcntl.h>

#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "support/access/linux/capture_peer_identity.h"

namespace spacekeep::ipc {

namespace {

constexpr std::size_t kMaxGroups = 65536;  // NGROUPS_MAX of the kernel
constexpr std::size_t kMaxLabel = 4096;

struct Credentials {
  std::optional<std::uint32_t> uid;
  std::optional<std::uint32_t> pid;
  std::optional<std::vector<std::uint32_t>> groups;
  std::optional<std::string> label;
  SharedDescriptor process;
};

std::optional<std::uint32_t> readNumber(sd_bus_message* message) {
  std::uint32_t number = 0;
  if (sd_bus_message_read(message, "v", "u", &number) <= 0) return std::nullopt;
  return number;
}

/// The bytes of a variant of that type, an array of `element`. None on failure.
std::optional<std::string_view> readArray(sd_bus_message* message, const char* type, char element) {
  const void* first = nullptr;
  std::size_t size = 0;
  if (sd_bus_message_enter_container(message, 'v', type) <= 0 ||
      sd_bus_message_read_array(message, element, &first, &size) < 0 ||
      sd_bus_message_exit_container(message) < 0) {
    return std::nullopt;
  }
  return size == 0 ? std::string_view() : std::string_view(static_cast<const char*>(first), size);
}

std::optional<std::vector<std::uint32_t>> readGroups(sd_bus_message* message) {
  const auto bytes = readArray(message, "au", 'u');
  if (!bytes || bytes->size() / sizeof(std::uint32_t) > kMaxGroups) return std::nullopt;
  std::vector<std::uint32_t> groups(bytes->size() / sizeof(std::uint32_t));
  if (!groups.empty()) std::memcpy(groups.data(), bytes->data(), bytes->size());
  return groups;
}

/// With the zero byte that ends it, as the D-Bus specification wants it.
std::optional<std::string> readLabel(sd_bus_message* message) {
  const auto bytes = readArray(message, "ay", 'y');
  if (!bytes || bytes->size() > kMaxLabel) return std::nullopt;
  std::string label(*bytes);
  while (!label.empty() && (label.back() == '\0' || label.back() == '\n')) label.pop_back();
  if (label.empty() || label.find('\0') != std::string::npos) return std::nullopt;
  return label;
}

SharedDescriptor readProcess(sd_bus_message* message) {
  int fd = -1;
  if (sd_bus_message_read(message, "v", "h", &fd) <= 0) return nullptr;
  const int own = ::fcntl(fd, F_DUPFD_CLOEXEC, 3);  // the message closes its own
  return own < 0 ? nullptr : std::make_shared<Descriptor>(own);
}

/// Answers whether the message could be read on.
bool readEntry(sd_bus_message* message, Credentials& credentials) {
  const char* text = nullptr;
  if (sd_bus_message_read_basic(message, 's', &text) <= 0) return false;
  const std::string_view key(text);
  if (key == "UnixUserID") return (credentials.uid = readNumber(message)).has_value();
  if (key == "ProcessID") return (credentials.pid = readNumber(message)).has_value();
  if (key == "UnixGroupIDs") return (credentials.groups = readGroups(message)).has_value();
  if (key == "LinuxSecurityLabel") return (credentials.label = readLabel(message)).has_value();
  if (key == "ProcessFD") return (credentials.process = readProcess(message)) != nullptr;
  return sd_bus_message_skip(message, "v") >= 0;
}

std::optional<Credentials> readCredentials(sd_bus_message* message) {
  Credentials credentials;
  if (sd_bus_message_enter_container(message, 'a', "{sv}") <= 0) return std::nullopt;
  int entered = 0;
  while ((entered = sd_bus_message_enter_container(message, 'e', "sv")) > 0) {
    if (!readEntry(message, credentials) || sd_bus_message_exit_container(message) < 0) {
      return std::nullopt;
    }
  }
  return entered < 0 ? std::nullopt : std::optional(std::move(credentials));
}

}  // namespace

std::shared_ptr<const access::PeerIdentity> identityFromCredentials(sd_bus_message* answer) {
  auto known = readCredentials(answer);
  if (!known || !known->uid || *known->uid == UINT32_MAX) return nullptr;
  access::PeerFacts facts;
  facts.uid = *known->uid;
  // The groups come in one list, in which the primary one is not marked.
  facts.gid = access::kNoGroup;
  facts.unclear = {.groups = !known->groups, .label = !known->label, .unit = true};
  facts.groups = std::move(known->groups).value_or(std::vector<std::uint32_t>{});
  facts.label = std::move(known->label);
  facts.pid = static_cast<std::int32_t>(known->pid.value_or(0));
  facts.pidfd = std::move(known->process);
  facts.unclear.unit = !access::addFactsOfProcess(facts);
  return std::make_shared<const access::PeerIdentity>(std::move(facts));
}

}  // namespace spacekeep::ipc
