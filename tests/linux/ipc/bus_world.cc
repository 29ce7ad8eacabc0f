#include "tests/linux/ipc/bus_world.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <fstream>
#include <sstream>
#include <utility>

#include "support/ipc/linux/wire_header.h"

namespace spacekeep::ipc::test {

namespace {

/// As a system bus has them: nobody may call anything that is not let through.
constexpr std::string_view kUsualRules =
    R"(<policy context="default"><allow user="*"/><deny own="*"/><deny send_type="method_call"/>
    <allow send_type="signal"/>
    <allow send_requested_reply="true" send_type="method_return"/>
    <allow send_requested_reply="true" send_type="error"/>
    <allow receive_type="method_call"/><allow receive_type="method_return"/>
    <allow receive_type="error"/><allow receive_type="signal"/>
    <allow send_destination="org.freedesktop.DBus"/></policy>)";

std::string contentOf(const std::string& path) {
  std::ifstream stream(path);
  std::ostringstream text;
  text << stream.rdbuf();
  return text.str();
}

/// A command made ready before the fork: in the child of a process with threads nothing may be
/// allocated.
class Command {
 public:
  explicit Command(std::vector<std::string> words) : words_(std::move(words)) {
    for (std::string& word : words_) arguments_.push_back(word.data());
    arguments_.push_back(nullptr);
  }
  [[noreturn]] void become() const {
    ::execvp(arguments_[0], arguments_.data());
    ::_exit(127);
  }

 private:
  std::vector<std::string> words_;
  std::vector<char*> arguments_;
};

}  // namespace

PrivateBus::PrivateBus() : socket_(directory_.path() + "/bus") {
  ::chmod(directory_.path().c_str(), 0755);
}

std::string PrivateBus::shippedPolicy() {
  return std::string("<include>") + SPACEKEEP_SOURCE_DIR +
         "/packaging/dbus/com.quorvel.Spacekeep.conf</include>"
         R"(<policy context="default"><allow send_destination="com.quorvel.Spacekeep"
            send_interface="com.quorvel.IpcTest"/></policy>)";
}

void PrivateBus::start(const std::string& policy) {
  const std::string config =
      directory_.write("bus.conf", "<busconfig><type>system</type><listen>unix:path=" + socket_ +
                                       "</listen><auth>EXTERNAL</auth>" + std::string(kUsualRules) +
                                       policy + "</busconfig>");
  const Command broker({"dbus-daemon", "--nofork", "--nopidfile", "--nosyslog", "--print-address=3",
                        "--config-file=" + config});
  int ready[2] = {-1, -1};
  ASSERT_EQ(::pipe2(ready, O_CLOEXEC), 0);
  pid_ = ::fork();
  if (pid_ == 0) {
    ::dup2(ready[1], 3);
    broker.become();
  }
  ::close(ready[1]);
  // It tells its address once it listens, and closes the pipe when it fails.
  char first = 0;
  EXPECT_EQ(::read(ready[0], &first, 1), 1) << "dbus-daemon did not start";
  ::close(ready[0]);
}

void PrivateBus::stop() {
  if (pid_ <= 0) return;
  ::kill(pid_, SIGKILL);
  ::waitpid(std::exchange(pid_, -1), nullptr, 0);
  ::unlink(socket_.c_str());
}

BusOptions PrivateBus::options() const {
  BusOptions options;
  options.socket = socket_;
  options.name = kTestBusName;
  options.first_pause_ns = 20'000'000;
  options.longest_pause_ns = 100'000'000;
  return options;
}

BusClient::BusClient(const PrivateBus& bus) {
  EXPECT_GE(sd_bus_new(&bus_), 0);
  EXPECT_GE(sd_bus_set_address(bus_, ("unix:path=" + bus.socket()).c_str()), 0);
  EXPECT_GE(sd_bus_set_bus_client(bus_, 1), 0);
  EXPECT_GE(sd_bus_start(bus_), 0);
}

BusClient::~BusClient() { sd_bus_close_unref(bus_); }

OwnedMessage BusClient::newCall(const char* member, const char* interface, const char* path) {
  sd_bus_message* call = nullptr;
  EXPECT_GE(sd_bus_message_new_method_call(bus_, &call, kTestBusName, path, interface, member), 0);
  return OwnedMessage(call);
}

BusAnswer BusClient::call(OwnedMessage message) {
  sd_bus_error error{};
  sd_bus_message* reply = nullptr;
  BusAnswer answer;
  if (sd_bus_call(bus_, message.get(), kLongNs / 1000, &error, &reply) < 0) {
    answer.error = error.name == nullptr ? "(no name)" : error.name;
  }
  answer.text = error.message == nullptr ? "" : error.message;
  answer.message.reset(reply);
  sd_bus_error_free(&error);
  return answer;
}

std::string BusClient::number(std::int32_t number) {
  OwnedMessage call = newCall("number");
  EXPECT_GE(sd_bus_message_append(call.get(), "i", number), 0);
  const BusAnswer answer = this->call(std::move(call));
  if (!answer.error.empty()) return answer.error;
  std::int32_t answered = 0;
  EXPECT_GT(sd_bus_message_read(answer.message.get(), "i", &answered), 0);
  EXPECT_EQ(answered, number);
  return "";
}

bool BusClient::isServed() {
  return eventually([this] { return number(1).empty(); });
}

std::unique_ptr<TestServer> serverOn(const PrivateBus& bus, ServerOptions options) {
  auto server = std::make_unique<TestServer>(std::move(options));
  server->server().serveOnBus(bus.options());
  return server;
}

ProgramOutput runAs(uid_t uid, gid_t gid, const std::string& groups,
                    const std::vector<std::string>& command) {
  std::vector<std::string> whole = {"setpriv", "--reuid=" + std::to_string(uid),
                                    "--regid=" + std::to_string(gid),
                                    groups.empty() ? "--clear-groups" : "--groups=" + groups};
  whole.insert(whole.end(), command.begin(), command.end());
  const spacekeep::test::TemporaryDirectory directory;
  const std::string path = directory / "output";
  const Command ready(std::move(whole));
  const pid_t pid = ::fork();
  if (pid == 0) {
    const int out = ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
    ::dup2(out, 1);
    ::dup2(out, 2);
    ready.become();
  }
  int status = 0;
  ::waitpid(pid, &status, 0);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : 128, contentOf(path)};
}

ProgramOutput dbusSendAs(uid_t uid, const PrivateBus& bus, const std::string& method) {
  return runAs(
      uid, 60, "",
      {"dbus-send", "--bus=unix:path=" + bus.socket(), "--print-reply",
       std::string("--dest=") + kTestBusName, kObjectPath, "com.quorvel.IpcTest." + method});
}

ProgramOutput busctlAs(uid_t uid, const PrivateBus& bus,
                       const std::vector<std::string>& method_and_arguments,
                       const std::string& groups) {
  std::vector<std::string> command = {"busctl",    "--address=unix:path=" + bus.socket(),
                                      "call",      kTestBusName,
                                      kObjectPath, "com.quorvel.IpcTest"};
  command.insert(command.end(), method_and_arguments.begin(), method_and_arguments.end());
  return runAs(uid, 60, groups, command);
}

namespace {

RawMessage toBroker(std::string_view interface, std::string_view member) {
  return RawMessage()
      .text(1, 'o', "/org/freedesktop/DBus")
      .text(2, 's', interface)
      .text(3, 's', member)
      .text(6, 's', "org.freedesktop.DBus");
}

/// Takes whole messages off; answers whether one of them answers the call of that serial.
bool holdsAnswerTo(std::uint32_t serial, std::string& received) {
  while (const auto fixed = readWireFixedHeader(received)) {
    if (received.size() < fixed->messageBytes()) return false;
    const auto header = readWireHeader(received.substr(0, fixed->headerBytes()));
    received.erase(0, fixed->messageBytes());
    if (header && header->reply_serial == serial) return true;
  }
  return false;
}

std::string numberBytes(std::size_t number) {
  std::string bytes;
  for (unsigned shift = 0; shift < 32; shift += 8) {
    bytes += static_cast<char>(number >> shift & 0xFFU);
  }
  return bytes;
}

}  // namespace

RawBusPeer::RawBusPeer(const PrivateBus& bus) : peer_(bus.socket()) {
  peer_.authenticate();
  EXPECT_TRUE(send(toBroker("org.freedesktop.DBus", "Hello").bytes(1, 1)));
}

/// The broker reads a connection in order, so its answer comes after it has passed on the rest.
bool RawBusPeer::brokerHasReadAll() {
  constexpr std::uint32_t kSerial = 99;
  if (!send(toBroker("org.freedesktop.DBus.Peer", "Ping").bytes(1, kSerial))) return true;
  return eventually([this] {
    char bytes[4096];
    const ssize_t seen = ::recv(peer_.fd(), bytes, sizeof bytes, MSG_DONTWAIT);
    if (seen > 0) received_.append(bytes, static_cast<std::size_t>(seen));
    const bool cut_off = seen == 0 || (seen < 0 && errno != EAGAIN);
    return cut_off || holdsAnswerTo(kSerial, received_);
  });
}

RawMessage& RawMessage::text(char code, char type, std::string_view text) {
  fields_.resize((fields_.size() + 7) / 8 * 8, '\0');
  fields_ += {code, 1, type, 0};
  fields_ +=
      type == 'g' ? std::string(1, static_cast<char>(text.size())) : numberBytes(text.size());
  fields_ += text;
  fields_ += '\0';
  return *this;
}

RawMessage& RawMessage::number(char code, std::uint32_t number) {
  fields_.resize((fields_.size() + 7) / 8 * 8, '\0');
  fields_ += {code, 1, 'u', 0};
  fields_ += numberBytes(number);
  return *this;
}

RawMessage& RawMessage::callOf(std::string_view member, std::string_view destination) {
  return text(1, 'o', kObjectPath)
      .text(2, 's', "com.quorvel.IpcTest")
      .text(3, 's', member)
      .text(6, 's', destination);
}

std::string RawMessage::bytes(char type, std::uint32_t serial, std::string_view body) const {
  std::string message{'l', type, 0, 1};
  message += numberBytes(body.size()) + numberBytes(serial) + numberBytes(fields_.size()) + fields_;
  message.resize((message.size() + 7) / 8 * 8, '\0');
  return message + std::string(body);
}

}  // namespace spacekeep::ipc::test
