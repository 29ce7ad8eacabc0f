// A peer of the daemon, from its first byte: the handshake, then messages, then the end of the
// stream. An input that begins with 1 has the handshake done for it.
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "client/client_protocol.h"
#include "fuzz/helpers/promises.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/sockets.h"
#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"

namespace spacekeep::ipc {
namespace {

using fuzz::require;

constexpr int kPatienceMs = 20'000;  // only ever waited for by a finding

/// The mildest answer of each kind, or what was asked where it fits.
Argument answerOf(ArgumentKind kind, const Arguments& asked) {
  switch (kind) {
    case ArgumentKind::kInt32:
      return std::int32_t{0};
    case ArgumentKind::kString:
      return std::string();
    case ArgumentKind::kDictionary:
      return Dictionary{};
    case ArgumentKind::kOptionalDictionary:
      for (const Argument& argument : asked) {
        if (const auto* info = std::get_if<Dictionary>(&argument)) return OptionalDictionary(*info);
      }
      return OptionalDictionary{};
    case ArgumentKind::kOptionalValue:
      return OptionalValue{};
    case ArgumentKind::kOptionalString:
      return OptionalString("text");
    case ArgumentKind::kDescriptor:
      break;
  }
  return SharedDescriptor{};
}

ServedMethod answering(const MethodDescription& description) {
  ServedMethod method;
  method.name = description.name;
  method.brief = description.name == "clientGetState";
  method.serve = [&description](Arguments asked, Responder responder) {
    require(matches(description.in, asked), "a handler gets what the method describes");
    Arguments answer;
    for (const ArgumentDescription& out : description.out) {
      answer.push_back(answerOf(out.kind, asked));
    }
    responder.reply(std::move(answer));
  };
  return method;
}

ServedInterface interface() {
  ServedInterface served;
  served.description = &spacekeepClientInterface();
  for (const MethodDescription& method : served.description->methods) {
    served.methods.push_back(answering(method));
  }
  return served;
}

class Daemon {
 public:
  static Daemon& instance() {
    static auto* daemon = new Daemon;  // threads run in it until the process ends
    return *daemon;
  }

  /// Answers once the connection has ended on the daemon's side.
  void serve(const SharedDescriptor& end) {
    server_.serveConnected(end, [this] { ended_.signal(); });
  }
  void awaitEnd() { ended_.wait(); }
  [[nodiscard]] std::size_t connections() const { return server_.connections(); }

 private:
  ConcurrentQueue global_{{}};
  IpcLoop loop_;
  BusServer server_{loop_, global_, interface()};
  CountingSemaphore ended_{0};
};

std::string handshake() {
  static constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text = std::string(1, '\0') + "AUTH EXTERNAL ";
  for (const char digit : std::to_string(::geteuid())) {
    text += kDigits[static_cast<unsigned char>(digit) / 16];
    text += kDigits[static_cast<unsigned char>(digit) % 16];
  }
  return text + "\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}

std::string streamOf(std::string_view input) {
  if (input.empty() || input[0] != 1) return std::string(input);
  return handshake() + std::string(input.substr(1));
}

/// The fuzzer's own timer interrupts the wait now and then.
bool isReadable(int fd) {
  pollfd readable{.fd = fd, .events = POLLIN, .revents = 0};
  int ready = 0;
  do {
    ready = ::poll(&readable, 1, kPatienceMs);
  } while (ready < 0 && errno == EINTR);
  return ready > 0;
}

/// Takes what the daemon says until it has closed its end.
void readToEnd(int fd) {
  std::array<char, 4096> buffer{};
  for (;;) {
    require(isReadable(fd), "the daemon lets go of a peer that has ended its stream");
    if (::recv(fd, buffer.data(), buffer.size(), 0) <= 0) return;
  }
}

void examine(std::string_view input) {
  Daemon& daemon = Daemon::instance();
  SocketPair pair = makeSocketPair();
  require(pair.first != nullptr, "the daemon keeps no descriptor of a peer that has gone");
  daemon.serve(pair.second);
  pair.second.reset();
  const std::string stream = streamOf(input);
  static_cast<void>(::send(pair.first->fd(), stream.data(), stream.size(), MSG_NOSIGNAL));
  ::shutdown(pair.first->fd(), SHUT_WR);
  readToEnd(pair.first->fd());
  daemon.awaitEnd();
  require(daemon.connections() == 0, "a connection that has ended is not counted");
}

}  // namespace
}  // namespace spacekeep::ipc

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size > 64 * 1024) return -1;  // goes into the socket in one piece
  spacekeep::ipc::examine(spacekeep::fuzz::textOfInput(data, size));
  return 0;
}
