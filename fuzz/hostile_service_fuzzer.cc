// The daemon as the client of a service that may say anything: what stands on the socket when the
// daemon comes to call, from the handshake to the end of the stream. Each call ends exactly once,
// and the connection as well.
#include <sys/socket.h>

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/wire_bytes.h"
#include "registry/service_protocol.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/sockets.h"
#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"
#include "support/services/call_service.h"
#include "support/values/text.h"

namespace spacekeep::ipc {
namespace {

using fuzz::require;

/// Small, so that inputs reach past them.
const ConnectionLimits kLimits{
    .pending_calls = 16, .message_bytes = 4096, .queued_bytes = 16 * 1024, .peer_death_ns = 1};

/// What a daemon has to call services with. Its threads run until the process ends.
struct Daemon {
  static Daemon& instance() {
    static auto* daemon = new Daemon;
    return *daemon;
  }

  ConcurrentQueue global{{}};
  IpcLoop loop;
  LinuxConnector connector{loop, global};
  ServiceCaller services{global, connector, spacekeepServiceInterface()};
};

/// What has become of one input's calls and of its connection.
class Course {
 public:
  static constexpr std::size_t kCalls = 7;

  void invoked() { invoked_.signal(); }
  void awaitInvocations() {
    for (std::size_t i = 0; i < kCalls; ++i) invoked_.wait();
  }
  void callEnded(std::size_t call) {
    require(!ended_.at(call).exchange(true), "a call ends once");
    over_.signal();
  }
  void connectionEnded() {
    require(!connection_ended_.exchange(true), "a connection ends once");
    over_.signal();
  }
  void awaitEverything() {
    for (std::size_t i = 0; i <= kCalls; ++i) over_.wait();
  }

 private:
  std::array<std::atomic<bool>, kCalls> ended_{};
  std::atomic<bool> connection_ended_ = false;
  CountingSemaphore invoked_{0};
  CountingSemaphore over_{0};
};

void look(const OptionalDictionary& answer) {
  if (answer) require(fuzz::isOneLine(textOf(*answer)), "an answer is shown as one line");
}

/// One call of each kind that there is.
void makeCall(std::size_t kind, const SpacekeepServiceProtocol& service,
              const std::function<void()>& done) {
  const Dictionary info{{"SPACEKEEP_VOLUME", "/"}, {"SPACEKEEP_AMOUNT", 4096}};
  const auto dictionary = [done](const OptionalDictionary& answer) {
    look(answer);
    done();
  };
  switch (kind) {
    case 0:
      return service.servicePing(done);
    case 1:
      return service.servicePurge(1, info, dictionary);
    case 2:
      return service.servicePurgeable(4, info, dictionary);
    case 3:
      return service.servicePeriodic(2, info, dictionary);
    case 4:
      return service.serviceCancelPurge(done);
    case 5:
      return service.serviceNotify({{"name", true}}, done);
    default:
      return service.serviceCallback(info, dictionary);
  }
}

void callEverything(Daemon& daemon, const std::shared_ptr<Connection>& connection,
                    const std::shared_ptr<Course>& course) {
  auto service = std::make_shared<ServiceReference>();
  service->ID = "com.example.fuzzed";
  service->connection = connection;
  for (std::size_t kind = 0; kind < Course::kCalls; ++kind) {
    daemon.services.CallServiceAsync(
        service,
        [course, kind](std::shared_ptr<RemoteProxy> proxy, const ServiceCaller::Done& done) {
          makeCall(kind, SpacekeepServiceProtocol(std::move(proxy)), [course, kind, done] {
            done();
            course->callEnded(kind);
          });
          course->invoked();
        },
        [course, kind] { course->callEnded(kind); });
  }
}

fuzz::MessageType typeOf(std::uint8_t kind) {
  switch (kind % 8) {
    case 4:
      return fuzz::MessageType::kError;
    case 5:
      return fuzz::MessageType::kCall;
    case 6:
      return fuzz::MessageType::kSignal;
    default:
      return fuzz::MessageType::kReturn;
  }
}

std::string recordedMessage(fuzz::PieceReader& input) {
  const std::uint8_t kind = input.byte();
  if (kind % 8 == 7) return std::string(input.piece());
  fuzz::MessageHead head;
  head.type = typeOf(kind);
  head.serial = 1U + input.byte();
  head.reply_serial = input.byte() % 12;
  head.signature = std::string(input.take(input.byte() % 32));
  head.descriptors = kind / 8 % 2;
  if (head.type == fuzz::MessageType::kError) head.error_name = std::string(input.shortPiece());
  if (head.type == fuzz::MessageType::kCall || head.type == fuzz::MessageType::kSignal) {
    head.path = kObjectPath;
    head.interface = "com.quorvel.SpacekeepServiceProtocol";
    head.member = "servicePing";
  }
  return fuzz::messageBytes(head, input.piece());
}

/// What the first byte of an input says.
struct Manner {
  explicit Manner(std::uint8_t choice)
      : help(choice % 3U),
        calls_are_held(choice / 3U % 2 == 0),
        invalidates(choice / 6U % 2 == 1) {}

  unsigned help;        ///< done for the input: nothing, the handshake, or the headers too
  bool calls_are_held;  ///< made before the connection is resumed
  bool invalidates;     ///< the daemon ends the connection itself
};

constexpr std::string_view kHandshake =
    "DATA\r\nOK 0123456789abcdef0123456789abcdef\r\nAGREE_UNIX_FD\r\n";

/// One message after another; those whose kind says so bring a descriptor.
bool sendRecords(int fd, fuzz::PieceReader input) {
  while (!input.usedUp()) {
    const bool brings_one = (fuzz::PieceReader(input).byte() & 8) != 0;
    const std::string message = recordedMessage(input);
    if (!fuzz::sendAll(fd, message, std::vector<int>(brings_one ? 1 : 0, fd))) return false;
  }
  return true;
}

/// False when not all of it fits into the socket.
bool sendInput(int fd, std::string_view text) {
  fuzz::PieceReader input(text);
  const unsigned help = Manner(input.byte()).help;
  if (help > 0 && !fuzz::sendAll(fd, kHandshake)) return false;
  return help == 2 ? sendRecords(fd, input) : fuzz::sendAll(fd, input.rest());
}

void examine(std::string_view input) {
  Daemon& daemon = Daemon::instance();
  const SocketPair pair = makeSocketPair();
  require(pair.first != nullptr, "the daemon keeps no descriptor of a service that has gone");
  if (!sendInput(pair.second->fd(), input)) return;
  ::shutdown(pair.second->fd(), SHUT_WR);
  const auto course = std::make_shared<Course>();
  const auto connection = connectionFromDescriptor(daemon.loop, daemon.global, pair.first, kLimits);
  connection->setInvalidationHandler([course] { course->connectionEnded(); });
  connection->setInterruptionHandler([] { require(false, "the peer's process lives"); });
  connection->setRemoteInterface(spacekeepServiceInterface());
  const Manner manner(fuzz::PieceReader(input).byte());
  if (!manner.calls_are_held) connection->resume();
  callEverything(daemon, connection, course);
  course->awaitInvocations();
  if (manner.calls_are_held) connection->resume();
  if (manner.invalidates) connection->invalidate();
  course->awaitEverything();
}

/// What has ended is let go of on other threads, soon.
void requireNoDescriptorKept(std::size_t before) {
  for (int looks = 0; fuzz::openDescriptors() > before; ++looks) {
    require(looks < 1'000'000, "the daemon keeps no descriptor of a service that has gone");
    Daemon::instance().loop.runAndWait([] {});
  }
}

}  // namespace
}  // namespace spacekeep::ipc

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  // What libraries open on first use and keep is no leak.
  spacekeep::ipc::examine("");
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size > 32 * 1024) return -1;  // goes into the socket in one piece
  const std::size_t before = spacekeep::fuzz::openDescriptors();
  spacekeep::ipc::examine(spacekeep::fuzz::textOfInput(data, size));
  spacekeep::ipc::requireNoDescriptorKept(before);
  return 0;
}
