#include "tests/linux/ipc/ipc_world.h"

#include <poll.h>
#include <sys/socket.h>

#include <atomic>
#include <mutex>
#include <utility>

#include "support/access/peer_identity.h"

namespace spacekeep::ipc::test {

const InterfaceDescription& testInterface() {
  using enum ArgumentKind;
  static const std::vector<ArgumentDescription> all = {{"number", kInt32},
                                                       {"text", kString},
                                                       {"info", kDictionary},
                                                       {"maybe_info", kOptionalDictionary},
                                                       {"maybe_value", kOptionalValue},
                                                       {"maybe_text", kOptionalString}};
  static const InterfaceDescription aside = {"com.quorvel.IpcTestAside",
                                             {{"aside", {}, {{"text", kString}}}}};
  static const InterfaceDescription interface = {
      "com.quorvel.IpcTest",
      {{"echo", all, all},
       {"takeDescriptor", {{"endpoint", kDescriptor}, {"text", kString}}, {{"text", kString}}},
       {"holdDescriptor", {{"endpoint", kDescriptor}}, {}},
       {"number", {{"number", kInt32}}, {{"number", kInt32}}},
       {"hold", {}, {{"text", kString}}},
       {"block", {}, {}},
       {"numberBriefly", {{"number", kInt32}}, {{"number", kInt32}}},
       {"blockBriefly", {}, {}},
       {"forget", {}, {}},
       {"whoAmI", {}, {{"uid", kOptionalValue}}}},
      &aside};
  return interface;
}

bool eventually(const std::function<bool()>& condition) {
  const std::uint64_t deadline = rt::deadlineAfterNs(kLongNs);
  while (!condition()) {
    if (rt::ticks() > deadline) return false;
    rt::sleepNs(1'000'000);
  }
  return true;
}

std::uint64_t wakeUpsInNs(const IpcLoop& loop, std::uint64_t duration_ns) {
  const std::uint64_t before = loop.wakeups();
  rt::sleepNs(duration_ns);  // the time that is measured
  return loop.wakeups() - before;
}

ServerOptions TestServer::defaultOptions() {
  ServerOptions options;
  options.refuse_own_process = false;
  return options;
}

TestServer::TestServer(ServerOptions options)
    : path_(directory.path() + "/daemon.sock"),
      server_(std::make_unique<BusServer>(loop, global, interface(), std::move(options))) {
  std::string why;
  server_->serveListening(bindListeningSocket(path_, 0600, why));
  EXPECT_EQ(why, "");
}

TestServer::~TestServer() {
  releaseBlocked(10'000);
  {
    const std::scoped_lock lock(mutex_);
    held_.clear();
  }
  stop();
}

std::shared_ptr<Connection> TestServer::connect(ConnectionLimits limits) {
  std::string why;
  auto connection = connectToPath(loop, global, path_, why, limits);
  EXPECT_NE(connection, nullptr) << why;
  connection->setRemoteInterface(testInterface());
  connection->resume();
  return connection;
}

std::size_t TestServer::held() const {
  const std::scoped_lock lock(mutex_);
  return held_.size();
}

Responder TestServer::takeHeld() {
  const std::scoped_lock lock(mutex_);
  Responder first = std::move(held_.front());
  held_.erase(held_.begin());
  return first;
}

std::vector<std::int32_t> TestServer::numbers() const {
  const std::scoped_lock lock(mutex_);
  return numbers_;
}

SharedDescriptor TestServer::descriptor() const {
  const std::scoped_lock lock(mutex_);
  return descriptor_;
}

void TestServer::releaseBlocked(std::size_t count) {
  for (std::size_t i = 0; i < count; ++i) release_.signal();
}

ServedMethod TestServer::method(std::string_view name,
                                std::function<void(Arguments, Responder)> serve) {
  ServedMethod served;
  served.name = name;
  served.serve = [this, serve = std::move(serve)](Arguments arguments, Responder responder) {
    ++served_;
    serve(std::move(arguments), std::move(responder));
  };
  return served;
}

namespace {

/// The same method under another name, served by the thread that reads the messages.
ServedMethod briefly(ServedMethod method, std::string_view name) {
  method.name = name;
  method.brief = true;
  return method;
}

}  // namespace

ServedInterface TestServer::interface() {
  ServedInterface served;
  served.description = &testInterface();
  served.methods.push_back(method("echo", [](Arguments arguments, const Responder& responder) {
    responder.reply(std::move(arguments));
  }));
  served.methods.push_back(
      method("takeDescriptor", [this](Arguments arguments, const Responder& responder) {
        {
          const std::scoped_lock lock(mutex_);
          descriptor_ = std::get<SharedDescriptor>(arguments.at(0));
        }
        responder.reply({arguments.at(1)});
      }));
  auto number = method("number", [this](Arguments arguments, const Responder& responder) {
    {
      const std::scoped_lock lock(mutex_);
      numbers_.push_back(std::get<std::int32_t>(arguments.at(0)));
    }
    responder.reply(std::move(arguments));
  });
  served.methods.push_back(number);
  served.methods.push_back(briefly(number, "numberBriefly"));
  for (const std::string_view name : {"hold", "holdDescriptor"}) {
    served.methods.push_back(method(name, [this](const Arguments&, Responder responder) {
      const std::scoped_lock lock(mutex_);
      held_.push_back(std::move(responder));
    }));
  }
  auto block = method("block", [this](const Arguments&, const Responder& responder) {
    const std::size_t now = ++blocked_;
    std::size_t most = most_blocked_;
    while (now > most && !most_blocked_.compare_exchange_weak(most, now)) {
    }
    release_.wait();
    --blocked_;
    responder.reply({});
  });
  block.mode = ServeMode::kLane;
  block.lane = "blocking";
  block.lane_width = 2;
  served.methods.push_back(block);
  served.methods.push_back(briefly(block, "blockBriefly"));
  served.methods.push_back(method("forget", [](const Arguments&, const Responder&) {}));
  served.methods.push_back(method("whoAmI", [](const Arguments&, const Responder& responder) {
    responder.reply({OptionalValue(Value(currentConnection()->identity().uid()))});
  }));
  served.methods.push_back(method("aside", [](const Arguments&, const Responder& responder) {
    responder.reply({std::string("from beside")});
  }));
  return served;
}

PendingCall::PendingCall(const std::shared_ptr<Connection>& connection, std::string_view member,
                         Arguments arguments) {
  const auto proxy = connection->remoteProxy([state = state_](const Error& error) {
    {
      const std::scoped_lock lock(state->mutex);
      state->outcome.error = error;
    }
    ++state->ends;
    state->ended.signal();
  });
  proxy->call(member, std::move(arguments), [state = state_](Arguments reply) {
    {
      const std::scoped_lock lock(state->mutex);
      state->outcome.reply = std::move(reply);
    }
    ++state->ends;
    state->ended.signal();
  });
}

Outcome PendingCall::wait() {
  if (state_->ended.waitForNs(kLongNs) == WaitResult::kTimedOut) {
    ADD_FAILURE() << "neither a reply nor an error came";
  }
  const std::scoped_lock lock(state_->mutex);
  return state_->outcome;
}

Outcome callAndWait(const std::shared_ptr<Connection>& connection, std::string_view member,
                    Arguments arguments) {
  return PendingCall(connection, member, std::move(arguments)).wait();
}

void expectHonestClientIsServed(TestServer& server) {
  const Outcome outcome = callAndWait(server.connect(), "number", {std::int32_t{7}});
  ASSERT_TRUE(outcome.reply) << (outcome.error ? outcome.error->text : "");
  EXPECT_EQ(std::get<std::int32_t>(outcome.reply->at(0)), 7);
}

BareClient::BareClient(const std::string& path) {
  const std::string address = "unix:path=" + path;
  EXPECT_GE(sd_bus_new(&bus_), 0);
  EXPECT_GE(sd_bus_set_address(bus_, address.c_str()), 0);
  EXPECT_GE(sd_bus_set_bus_client(bus_, 0), 0);
  EXPECT_GE(sd_bus_start(bus_), 0);
}

BareClient::~BareClient() { sd_bus_close_unref(bus_); }

sd_bus_message* BareClient::newCall(const char* member, const char* interface, const char* path) {
  sd_bus_message* call = nullptr;
  EXPECT_GE(sd_bus_message_new_method_call(bus_, &call, nullptr, path, interface, member), 0);
  return call;
}

std::string BareClient::errorOf(sd_bus_message* call, std::string* text) {
  sd_bus_error error{};
  sd_bus_message* reply = nullptr;
  const int result = sd_bus_call(bus_, call, kLongNs / 1000, &error, &reply);
  std::string name;
  if (result < 0) name = error.name == nullptr ? "(no name)" : error.name;
  if (text != nullptr) *text = error.message == nullptr ? "" : error.message;
  sd_bus_error_free(&error);
  sd_bus_message_unref(reply);
  sd_bus_message_unref(call);
  return name;
}

RawPeer::RawPeer(const std::string& path) {
  std::string why;
  socket_ = connectSocket(path, why);
  EXPECT_NE(socket_, nullptr) << why;
}

bool RawPeer::send(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t sent = ::send(fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (sent < 0 && errno == EAGAIN) {
      pollfd writable{fd(), POLLOUT, 0};
      ::poll(&writable, 1, 1000);
      continue;
    }
    if (sent <= 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(sent));
  }
  return true;
}

void RawPeer::authenticate() {
  using namespace std::string_view_literals;
  EXPECT_TRUE(send("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv));
  std::string answer;
  EXPECT_TRUE(eventually([&] {
    char bytes[256];
    const ssize_t seen = ::recv(fd(), bytes, sizeof bytes, MSG_DONTWAIT);
    if (seen > 0) answer.append(bytes, static_cast<std::size_t>(seen));
    return answer.find("AGREE_UNIX_FD\r\n") != std::string::npos;
  })) << answer;
}

bool RawPeer::isCutOff() {
  return eventually([&] {
    char bytes[4096];
    const ssize_t seen = ::recv(fd(), bytes, sizeof bytes, MSG_DONTWAIT);
    return seen == 0 || (seen < 0 && errno != EAGAIN);
  });
}

std::string header(std::uint32_t body_bytes, std::uint32_t field_bytes) {
  std::string bytes = {'l', 1, 0, 1};
  for (const std::uint32_t number : {body_bytes, std::uint32_t{1}, field_bytes}) {
    for (unsigned shift = 0; shift < 32; shift += 8) {
      bytes += static_cast<char>(number >> shift & 0xFFU);
    }
  }
  return bytes;
}

}  // namespace spacekeep::ipc::test
