// Thread safety: each object belongs to the thread of its test unless a member says otherwise.
//
// What the tests of the IPC layer share: an interface with every kind of argument, a server of it
// on a socket in a directory of its own, and three kinds of clients: the system's own connection, a
// bare sd-bus one, and a raw socket.
#pragma once

#include <gtest/gtest.h>
#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/connection.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/sockets.h"
#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::ipc::test {

inline constexpr std::uint64_t kLongNs = 30'000'000'000;  // only ever waited for by a failing test

/// echo: one argument of each kind but the descriptor, answered as they came. takeDescriptor: an
/// endpoint and a text. number: in order, answers its argument. hold, holdDescriptor: keep the
/// responder. block: in a lane of width 2, waits until released. numberBriefly, blockBriefly: the
/// same, brief. forget: drops the responder. whoAmI: the uid. aside: a method of another interface.
[[nodiscard]] const InterfaceDescription& testInterface();

/// True once `condition` holds; gives up after kLongNs.
[[nodiscard]] bool eventually(const std::function<bool()>& condition);

/// How often the loop wakes up in that time.
[[nodiscard]] std::uint64_t wakeUpsInNs(const IpcLoop& loop, std::uint64_t duration_ns);

class TestServer {
 public:
  explicit TestServer(ServerOptions options = defaultOptions());
  ~TestServer();
  static ServerOptions defaultOptions();

  [[nodiscard]] std::string path() const { return path_; }
  [[nodiscard]] std::shared_ptr<Connection> connect(ConnectionLimits limits = {});
  [[nodiscard]] BusServer& server() { return *server_; }
  void stop() { server_.reset(); }

  // Any thread.
  [[nodiscard]] std::size_t held() const;
  [[nodiscard]] Responder takeHeld();
  [[nodiscard]] std::size_t served() const { return served_; }
  [[nodiscard]] std::vector<std::int32_t> numbers() const;
  [[nodiscard]] std::size_t blocked() const { return blocked_; }
  [[nodiscard]] std::size_t mostBlocked() const { return most_blocked_; }
  void releaseBlocked(std::size_t count);
  [[nodiscard]] SharedDescriptor descriptor() const;

  spacekeep::test::TemporaryDirectory directory;
  ConcurrentQueue global{{}};
  IpcLoop loop;

 private:
  [[nodiscard]] ServedInterface interface();
  [[nodiscard]] ServedMethod method(std::string_view name,
                                    std::function<void(Arguments, Responder)> serve);

  std::string path_;
  mutable rt::Mutex mutex_;
  std::vector<Responder> held_;        // protected by mutex_
  std::vector<std::int32_t> numbers_;  // protected by mutex_
  SharedDescriptor descriptor_;        // protected by mutex_
  std::atomic<std::size_t> served_{0};
  std::atomic<std::size_t> blocked_{0};
  std::atomic<std::size_t> most_blocked_{0};
  CountingSemaphore release_{0};
  std::unique_ptr<BusServer> server_;
};

/// The outcome of one call.
struct Outcome {
  std::optional<Arguments> reply;
  std::optional<Error> error;
};

/// A call and what came of it. Any thread.
class PendingCall {
 public:
  PendingCall(const std::shared_ptr<Connection>& connection, std::string_view member,
              Arguments arguments);
  [[nodiscard]] Outcome wait();
  /// How many of reply and error handler have run.
  [[nodiscard]] std::size_t ends() const { return state_->ends; }

 private:
  struct State {
    rt::Mutex mutex;
    Outcome outcome;  // protected by mutex
    std::atomic<std::size_t> ends{0};
    CountingSemaphore ended{0};
  };
  std::shared_ptr<State> state_ = std::make_shared<State>();
};

[[nodiscard]] Outcome callAndWait(const std::shared_ptr<Connection>& connection,
                                  std::string_view member, Arguments arguments);

/// An honest call on a new connection succeeds.
void expectHonestClientIsServed(TestServer& server);

/// A client that knows nothing of this system but its D-Bus interface.
class BareClient {
 public:
  explicit BareClient(const std::string& path);
  ~BareClient();
  BareClient(const BareClient&) = delete;
  BareClient& operator=(const BareClient&) = delete;

  [[nodiscard]] sd_bus* bus() { return bus_; }
  [[nodiscard]] sd_bus_message* newCall(const char* member,
                                        const char* interface = "com.quorvel.IpcTest",
                                        const char* path = kObjectPath);
  /// Takes `call` over. The name of the error that it was answered with, empty for success; what
  /// the error says goes into `text`. A connection that is cut off gives the errno's D-Bus name.
  std::string errorOf(sd_bus_message* call, std::string* text = nullptr);

 private:
  sd_bus* bus_ = nullptr;
};

/// A peer that speaks bytes.
class RawPeer {
 public:
  explicit RawPeer(const std::string& path);
  [[nodiscard]] int fd() const { return socket_->fd(); }
  /// False when the other end is closed.
  bool send(std::string_view bytes);
  void authenticate();
  [[nodiscard]] bool isCutOff();

 private:
  SharedDescriptor socket_;
};

/// The fixed part of a method call's header, little endian.
[[nodiscard]] std::string header(std::uint32_t body_bytes, std::uint32_t field_bytes);

}  // namespace spacekeep::ipc::test
