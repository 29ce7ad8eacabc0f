// A peer of the daemon, from its first byte: the handshake, then messages and descriptors, then the
// end of the stream. An input that begins with 1 has the handshake done for it, one that begins with
// 2 the headers of its messages as well.
#include <fcntl.h>
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

#include "client/client_adaptor.h"
#include "fuzz/helpers/asking_daemon.h"
#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/wire_bytes.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/sockets.h"
#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"

namespace spacekeep::ipc {
namespace {

using fuzz::require;
using std::string_literals::operator""s;

constexpr int kPatienceMs = 20'000;  // only ever waited for by a finding

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
  void awaitTurn() {
    loop_.runAndWait([] {});
  }
  [[nodiscard]] std::size_t connections() const { return server_.connections(); }

 private:
  /// The peer of every connection here is this process.
  static ServerOptions options(fuzz::AskingDaemon& asking) {
    ServerOptions options;
    options.refuse_own_process = false;
    options.admit = [&asking](PeerConnection& peer, std::string&) { return asking.admits(peer); };
    return options;
  }

  ConcurrentQueue global_{{}};
  IpcLoop loop_;
  std::shared_ptr<fuzz::AskingDaemon> asking_ = std::make_shared<fuzz::AskingDaemon>();
  BusServer server_{loop_, global_, makeClientAdaptor(asking_), options(*asking_)};
  CountingSemaphore ended_{0};
};

std::string hexOfUid() {
  static constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text;
  for (const char digit : std::to_string(::geteuid())) {
    text += kDigits[static_cast<unsigned char>(digit) / 16];
    text += kDigits[static_cast<unsigned char>(digit) % 16];
  }
  return text;
}

/// "%UID%" stands for whoever runs the fuzzer, so that a kept input is as good for everybody.
std::string withUid(std::string_view text) {
  constexpr std::string_view kPlace = "%UID%";
  std::string bytes(text);
  const std::string uid = hexOfUid();
  for (std::size_t at = 0; (at = bytes.find(kPlace, at)) != std::string::npos; at += uid.size()) {
    bytes.replace(at, kPlace.size(), uid);
  }
  return bytes;
}

/// Descriptors as peers may pass them at check-in.
class Endpoints {
 public:
  Endpoints() : open_(makeSocketPair()), left_(makeSocketPair()) {
    require(left_.second != nullptr, "the daemon keeps no descriptor of a peer that has gone");
    left_.second.reset();
    null_ = std::make_shared<Descriptor>(::open("/dev/null", O_RDWR | O_CLOEXEC));
    packets_ = std::make_shared<Descriptor>(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  }
  [[nodiscard]] std::vector<int> some(std::uint8_t choice) const {
    const std::array<int, 4> all{open_.first->fd(), left_.first->fd(), null_->fd(), packets_->fd()};
    std::vector<int> chosen;
    for (std::size_t count = choice % 4; count > 0; --count) {
      chosen.push_back(all.at((choice / 4U + count) % all.size()));
    }
    return chosen;
  }

 private:
  const SocketPair open_;
  SocketPair left_;
  SharedDescriptor null_;
  SharedDescriptor packets_;
};

fuzz::MessageHead headOf(std::uint8_t kind) {
  const auto& methods = spacekeepClientInterface().methods;
  fuzz::MessageHead head;
  head.path = kObjectPath;
  if (kind % 16 < methods.size()) {
    head.member = std::string(methods[kind % 16].name);
    for (const ArgumentDescription& argument : methods[kind % 16].in) {
      head.signature += signatureOf(argument.kind);
    }
  } else if (kind % 16 < 10) {
    head.type = static_cast<fuzz::MessageType>(kind % 16 - 5);
    head.reply_serial = 1;
    head.member = "Signal";
    head.interface = "com.example.Interface";
    head.error_name = "com.example.Error";
  } else if (kind % 16 < 13) {
    head.interface =
        kind % 16 == 10 ? "org.freedesktop.DBus.Introspectable" : "org.freedesktop.DBus.Peer";
    head.member = kind % 16 == 10 ? "Introspect" : kind % 16 == 11 ? "Ping" : "GetMachineId";
  }
  return head;
}

/// False when the socket takes no more.
bool sendRecord(int fd, fuzz::PieceReader& input, const Endpoints& endpoints) {
  const std::uint8_t kind = input.byte();
  fuzz::MessageHead head = headOf(kind);
  const std::vector<int> passed = endpoints.some(input.byte());
  head.descriptors = static_cast<std::uint32_t>(passed.size());
  if ((kind & 0x10) != 0) head.signature = std::string(input.take(input.byte() % 32));
  if ((kind & 0x20) != 0) head.path = std::string(input.take(input.byte() % 32));
  if ((kind & 0x40) != 0) head.flags = input.byte();
  if ((kind & 0x80) != 0) head.descriptors = input.byte();
  head.serial = 1U + input.byte();
  return fuzz::sendAll(fd, fuzz::messageBytes(head, input.piece()), passed);
}

void sendInput(int fd, std::string_view text) {
  const std::string handshake =
      "\0AUTH EXTERNAL "s + hexOfUid() + "\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
  if (text.empty() || (text[0] != 1 && text[0] != 2)) {
    static_cast<void>(fuzz::sendAll(fd, withUid(text)));
    return;
  }
  if (!fuzz::sendAll(fd, handshake)) return;
  fuzz::PieceReader input(text.substr(1));
  if (text[0] == 1) {
    static_cast<void>(fuzz::sendAll(fd, input.rest()));
    return;
  }
  const Endpoints endpoints;
  for (int records = 0; records < 100 && !input.usedUp(); ++records) {
    if (!sendRecord(fd, input, endpoints)) return;
  }
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
  sendInput(pair.first->fd(), input);
  ::shutdown(pair.first->fd(), SHUT_WR);
  readToEnd(pair.first->fd());
  daemon.awaitEnd();
  require(daemon.connections() == 0, "a connection that has ended is not counted");
}

/// What a call has brought goes with the handler that serves it, which may end after the connection.
void requireNoDescriptorKept(std::size_t before) {
  for (int looks = 0; fuzz::openDescriptors() > before; ++looks) {
    require(looks < 1'000'000, "the daemon keeps no descriptor of a peer that has gone");
    Daemon::instance().awaitTurn();
  }
}

}  // namespace
}  // namespace spacekeep::ipc

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  // What libraries open on first use and keep is no leak.
  spacekeep::ipc::examine("\x01");
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size > 64 * 1024) return -1;  // goes into the socket without being read meanwhile
  const std::size_t before = spacekeep::fuzz::openDescriptors();
  spacekeep::ipc::examine(spacekeep::fuzz::textOfInput(data, size));
  spacekeep::ipc::requireNoDescriptorKept(before);
  return 0;
}
