// Thread safety: immutable after construction; may be read from any thread.
//
// Who stands at the other end of an accepted connection, as the kernel vouched for it when the
// connection was accepted (for a caller over a bus: as the bus had it from the kernel). Taken once and never looked up again: a process number may belong to
// somebody else by the time a call arrives.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "support/ipc/arguments.h"

namespace spacekeep::access {

/// Stands where there is no group; no rule can name it.
inline constexpr std::uint32_t kNoGroup = UINT32_MAX;

/// What nobody told of a peer, so that it may or may not be so. Nothing is granted on account of it,
/// and what is denied on account of it is denied.
struct UnclearFacts {
  bool groups = false;
  bool label = false;
  bool unit = false;
};

/// What an identity is made of. An absent member means that the kernel gave no clear answer, and an
/// absent member matches no rule that grants.
struct PeerFacts {
  std::uint32_t uid = 0;
  std::uint32_t gid = 0;  ///< kNoGroup when it is not known which of the groups is the primary one
  std::vector<std::uint32_t> groups = {};  ///< supplementary groups
  std::optional<std::string> label =
      {};                ///< security label (SELinux context, AppArmor profile, ...)
  std::int32_t pid = 0;  ///< for log lines only, never for a decision
  ipc::SharedDescriptor pidfd = nullptr;  ///< of the peer's process, null when the kernel has none
  /// The system service that the process belongs to ("cache.service"). Only set together with
  /// `pidfd`, because a unit looked up by process number alone could be somebody else's.
  std::optional<std::string> unit = {};
  UnclearFacts unclear = {};
  /// What the process calls itself ("backup"), for people to read. It may call itself anything, so
  /// this is never for a decision either.
  std::optional<std::string> program = {};
};

class PeerIdentity {
 public:
  explicit PeerIdentity(PeerFacts facts);
  PeerIdentity(const PeerIdentity&) = delete;
  PeerIdentity& operator=(const PeerIdentity&) = delete;

  [[nodiscard]] std::uint32_t uid() const { return facts_.uid; }
  [[nodiscard]] std::uint32_t gid() const { return facts_.gid; }
  [[nodiscard]] const std::vector<std::uint32_t>& groups() const { return facts_.groups; }
  [[nodiscard]] const std::optional<std::string>& label() const { return facts_.label; }
  [[nodiscard]] std::int32_t pid() const { return facts_.pid; }
  [[nodiscard]] const ipc::SharedDescriptor& pidfd() const { return facts_.pidfd; }
  [[nodiscard]] const std::optional<std::string>& unit() const { return facts_.unit; }
  [[nodiscard]] const std::optional<std::string>& program() const { return facts_.program; }

  [[nodiscard]] const UnclearFacts& unclear() const { return facts_.unclear; }

  /// Primary or supplementary.
  [[nodiscard]] bool isMemberOf(std::uint32_t group) const;
  /// Different for every identity of this process, and never used again: what caches are keyed by.
  [[nodiscard]] std::uint64_t serial() const { return serial_; }
  /// For log lines: "uid 1000 gid 1000 pid 4711 unit cache.service".
  [[nodiscard]] std::string describe() const;

 private:
  const PeerFacts facts_;
  const std::uint64_t serial_;
};

}  // namespace spacekeep::access
