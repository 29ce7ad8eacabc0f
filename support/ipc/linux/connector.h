// Thread safety: every function and member may be called from any thread but the IPC thread.
//
// Makes connections over unix sockets: from a descriptor, to a declared service, to the daemon.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "support/ipc/connection.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

struct ConnectionLimits {
  std::size_t pending_calls = 256;                   ///< per connection; beyond it is ended
  std::size_t message_bytes = 1024 * 1024;           ///< of an answer
  std::size_t queued_bytes = 4 * 1024 * 1024;        ///< estimated, not yet taken by the peer
  std::uint64_t authentication_ns = 30'000'000'000;  ///< services that are started on first use
                                                     ///< answer only once they run
  std::uint64_t peer_death_ns = 100'000'000;  ///< how long after the end of the stream the death of
                                              ///< the peer's process may become known
};

/// A connection, not resumed, over a connected AF_UNIX stream socket on whose other end a D-Bus
/// server stands. Never null: an unusable descriptor gives a connection whose calls fail.
/// Dropping every reference to it (and its proxies) closes it without running its handlers.
[[nodiscard]] std::shared_ptr<Connection> connectionFromDescriptor(IpcLoop& loop,
                                                                   ConcurrentQueue& global,
                                                                   SharedDescriptor descriptor,
                                                                   ConnectionLimits limits = {});

/// The file name of a declared service's socket, empty when `service_id` is no safe file name:
/// 1 to 64 of A-Z a-z 0-9 . _ -, not beginning with a dot.
[[nodiscard]] std::string declaredSocketName(const std::string& service_id);

/// Where the daemon listens.
inline constexpr const char* kDaemonSocketPath = "/run/spacekeep/spacekeep.sock";
/// Where the sockets of declared services stand.
inline constexpr const char* kServicesDirectory = "/run/spacekeep/services";

/// A connection to the unix stream socket at `path`, not resumed; set handlers and interface, then
/// resume. Null when nobody listens or the backlog is full, with the reason in `why`.
[[nodiscard]] std::shared_ptr<Connection> connectToPath(IpcLoop& loop, ConcurrentQueue& global,
                                                        const std::string& path, std::string& why,
                                                        ConnectionLimits limits = {});

class LinuxConnector : public Connector {
 public:
  LinuxConnector(IpcLoop& loop, ConcurrentQueue& global,
                 std::string services_directory = kServicesDirectory, ConnectionLimits limits = {});
  ~LinuxConnector() override;

  std::shared_ptr<Connection> connectionFromEndpoint(SharedDescriptor endpoint) override;
  /// Also null, with a line in the log, when the directory could be written by others than root
  /// and this process's own user, since the connection then might reach anybody.
  std::shared_ptr<Connection> connectionToDeclared(const std::string& service_id,
                                                   const InterfaceDescription& interface) override;

 private:
  struct Declared;
  IpcLoop& loop_;
  ConcurrentQueue& global_;
  const std::string services_directory_;
  const ConnectionLimits limits_;
  std::shared_ptr<Declared> declared_;
};

}  // namespace spacekeep::ipc
