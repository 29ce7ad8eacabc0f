// Thread safety: each object belongs to the thread of its test.
//
// What the tests of the bus front share: a message bus of their own with the policy that is shipped,
// callers that know nothing of this system but its D-Bus interface, under several users.
#pragma once

#include <sys/types.h>
#include <systemd/sd-bus.h>

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/linux/bus_options.h"
#include "support/ipc/linux/owned_message.h"
#include "tests/helpers/temporary_directory.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {

inline constexpr const char* kTestBusName = "com.quorvel.Spacekeep";

/// Accounts that every machine has, since dbus-daemon lets in nobody else.
inline constexpr uid_t kDaemonAccount = 1;
inline constexpr uid_t kGamesAccount = 5;

/// dbus-daemon in a directory that everybody may look into. Not running before start().
class PrivateBus {
 public:
  PrivateBus();
  ~PrivateBus() { stop(); }
  PrivateBus(const PrivateBus&) = delete;
  PrivateBus& operator=(const PrivateBus&) = delete;

  /// Returns once it listens. `policy`: what stands in its configuration besides the usual rules of a
  /// system bus; the shipped file when nothing is given.
  void start(const std::string& policy = shippedPolicy());
  void stop();
  [[nodiscard]] pid_t pid() const { return pid_; }
  [[nodiscard]] const std::string& socket() const { return socket_; }
  [[nodiscard]] BusOptions options() const;
  /// Lets calls of the interface of these tests pass, with what the shipped file says.
  static std::string shippedPolicy();

 private:
  spacekeep::test::TemporaryDirectory directory_;
  const std::string socket_;
  pid_t pid_ = -1;
};

struct BusAnswer {
  std::string error;  ///< its name; empty for success
  std::string text;   ///< what the error says
  OwnedMessage message;
};

/// A connection to the bus, of this process.
class BusClient {
 public:
  explicit BusClient(const PrivateBus& bus);
  ~BusClient();
  BusClient(const BusClient&) = delete;
  BusClient& operator=(const BusClient&) = delete;

  [[nodiscard]] sd_bus* bus() { return bus_; }
  /// To the server; no arguments yet.
  [[nodiscard]] OwnedMessage newCall(const char* member,
                                     const char* interface = "com.quorvel.IpcTest",
                                     const char* path = kObjectPath);
  [[nodiscard]] BusAnswer call(OwnedMessage message);
  /// The method "number" with its argument. An error's name, empty for success.
  [[nodiscard]] std::string number(std::int32_t number);
  /// Asks again until the server has its name.
  [[nodiscard]] bool isServed();

 private:
  sd_bus* bus_ = nullptr;
};

/// A server like the one of the other tests, that also stands on the bus.
[[nodiscard]] std::unique_ptr<TestServer> serverOn(
    const PrivateBus& bus, ServerOptions options = TestServer::defaultOptions());

struct ProgramOutput {
  int status = -1;
  std::string text;
};
/// Runs a program to its end under that user (with no group but `gid` and `groups`, "" for none).
[[nodiscard]] ProgramOutput runAs(uid_t uid, gid_t gid, const std::string& groups,
                                  const std::vector<std::string>& command);
/// What dbus-send says about a call without arguments, under that user.
[[nodiscard]] ProgramOutput dbusSendAs(uid_t uid, const PrivateBus& bus, const std::string& method);
/// busctl's call of a method of the test interface, under that user.
[[nodiscard]] ProgramOutput busctlAs(uid_t uid, const PrivateBus& bus,
                                     const std::vector<std::string>& method_and_arguments,
                                     const std::string& groups = "");

/// A connection to the bus that writes its messages itself. Under its own unique name.
class RawBusPeer {
 public:
  explicit RawBusPeer(const PrivateBus& bus);
  [[nodiscard]] bool send(std::string_view bytes) { return peer_.send(bytes); }
  /// Returns once the broker has passed on all that was sent, or has cut this peer off.
  [[nodiscard]] bool brokerHasReadAll();

 private:
  RawPeer peer_;
  std::string received_;
};

/// Writes the fields of a message, little endian.
class RawMessage {
 public:
  RawMessage& text(char code, char type, std::string_view text);
  RawMessage& number(char code, std::uint32_t number);
  /// The fields of a call of the test interface.
  RawMessage& callOf(std::string_view member, std::string_view destination = kTestBusName);
  [[nodiscard]] std::string bytes(char type = 1, std::uint32_t serial = 7,
                                  std::string_view body = "") const;

 private:
  std::string fields_;
};

}  // namespace spacekeep::ipc::test
