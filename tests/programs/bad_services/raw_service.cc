#include "tests/programs/bad_services/raw_service.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <systemd/sd-id128.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <string_view>
#include <thread>
#include <utility>

namespace bad_services {
namespace {

constexpr const char* kPath = "/com/quorvel/Spacekeep";
constexpr const char* kDaemonInterface = "com.quorvel.SpacekeepClientProtocol";
constexpr std::uint64_t kNoTimeLimit = UINT64_MAX;

void pauseFor(std::chrono::milliseconds duration) { std::this_thread::sleep_for(duration); }

std::string daemonAddress() {
  const char* socket = std::getenv("SPACEKEEP_SOCKET");
  return std::string("unix:path=") + (socket == nullptr ? "/nowhere" : socket);
}

}  // namespace

RawService::~RawService() { disconnect(); }

void RawService::run() {
  if (has(Fault::kEndsAtOnce)) std::exit(3);
  for (;;) {
    const bool stays_away = was_connected_ && has(Fault::kNeverComesBack);
    if (!stays_away && connect()) serveUntilLost();
    if (was_connected_ && has(Fault::kDiesWithTheDaemon)) std::abort();
    disconnect();
    pauseFor(std::chrono::milliseconds(50));
  }
}

bool RawService::connect() {
  int ends[2] = {-1, -1};
  if (sd_bus_new(&daemon_) < 0 || sd_bus_set_address(daemon_, daemonAddress().c_str()) < 0 ||
      sd_bus_start(daemon_) < 0 ||
      socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) {
    return false;
  }
  const bool connected = startServing(ends[0]) && sendCheckIn(ends[1]);
  close(ends[1]);
  was_connected_ = was_connected_ || connected;
  return connected;
}

bool RawService::startServing(int socket) {
  sd_id128_t id{};
  return sd_id128_randomize(&id) >= 0 && sd_bus_new(&server_) >= 0 &&
         sd_bus_set_fd(server_, socket, socket) >= 0 && sd_bus_set_server(server_, 1, id) >= 0 &&
         sd_bus_start(server_) >= 0 &&
         sd_bus_add_filter(server_, nullptr, &RawService::onMessage, this) >= 0;
}

bool RawService::sendCheckIn(int endpoint) {
  sd_bus_message* call = nullptr;
  const bool sent = sd_bus_message_new_method_call(daemon_, &call, nullptr, kPath, kDaemonInterface,
                                                   "clientCheckin") >= 0 &&
                    sd_bus_message_append(call, "sha{sv}", "com.example.raw", endpoint, 1, "PURGE",
                                          "b", 1) >= 0 &&
                    sd_bus_call_async(daemon_, nullptr, call, nullptr, nullptr, kNoTimeLimit) >= 0;
  sd_bus_message_unref(call);
  return sent;
}

void RawService::disconnect() {
  for (Request& purge : purges_) sd_bus_message_unref(purge.call);
  purges_.clear();
  daemon_ = sd_bus_close_unref(daemon_);
  server_ = sd_bus_close_unref(server_);
}

void RawService::serveUntilLost() {
  for (;;) {
    int progress = 0;
    for (sd_bus* bus : {daemon_, server_}) {
      const int result = sd_bus_process(bus, nullptr);
      if (result < 0 || sd_bus_is_open(bus) <= 0) return;
      progress += result;
    }
    if (!purges_.empty()) {
      step();
    } else if (progress == 0) {
      pollfd sockets[2] = {
          {sd_bus_get_fd(daemon_), static_cast<short>(sd_bus_get_events(daemon_)), 0},
          {sd_bus_get_fd(server_), static_cast<short>(sd_bus_get_events(server_)), 0}};
      poll(sockets, 2, -1);
    }
  }
}

int RawService::onMessage(sd_bus_message* message, void* self, sd_bus_error*) {
  std::uint8_t type = 0;
  if (sd_bus_message_get_type(message, &type) < 0 || type != SD_BUS_MESSAGE_METHOD_CALL) return 0;
  return static_cast<RawService*>(self)->serve(message);
}

int RawService::serve(sd_bus_message* message) {
  const char* name = sd_bus_message_get_member(message);
  const std::string_view member = name == nullptr ? "" : name;
  if (member == "servicePing") {
    if (!has(Fault::kSilentPing)) answerNothing(message);
  } else if (member == "serviceNotify") {
    if (!has(Fault::kSilentNotify)) answerNothing(message);
  } else if (member == "serviceCancelPurge") {
    cancelPurges();
    answerNothing(message);
  } else if (member == "serviceCallback") {
    sd_bus_reply_method_return(message, "aa{sv}", 0);
  } else if (member == "servicePurgeable") {
    answerQuery(read(message));
  } else if (member == "servicePurge" || member == "servicePeriodic") {
    queuePurge(read(message));
  } else {
    return 0;  // sd-bus answers with an error
  }
  return 1;
}

RawService::Request RawService::read(sd_bus_message* message) {
  Request request;
  request.call = sd_bus_message_ref(message);
  request.member = sd_bus_message_get_member(message);
  request.sensible = sd_bus_message_has_signature(message, "ia{sv}") > 0 &&
                     sd_bus_message_read_basic(message, 'i', &request.urgency) > 0;
  if (request.sensible) readInfo(message, request);
  return request;
}

void RawService::readInfo(sd_bus_message* message, Request& request) {
  if (sd_bus_message_enter_container(message, 'a', "{sv}") <= 0) return;
  while (sd_bus_message_enter_container(message, 'e', "sv") > 0) readEntry(message, request);
}

void RawService::readEntry(sd_bus_message* message, Request& request) {
  const char* key = nullptr;
  const char* contents = nullptr;
  char type = 0;
  sd_bus_message_read_basic(message, 's', &key);
  sd_bus_message_peek_type(message, &type, &contents);
  const std::string_view name = key == nullptr ? "" : key;
  const std::string_view of = contents == nullptr ? "" : contents;
  const bool is_number = of == "t" || of == "x";
  if (name == "SPACEKEEP_VOLUME" && of == "s") {
    const char* volume = nullptr;
    sd_bus_message_read(message, "v", "s", &volume);
    request.volume = volume;
  } else if (name == "SPACEKEEP_AMOUNT" && is_number) {
    std::int64_t amount = 0;
    sd_bus_message_read(message, "v", contents, &amount);
    if (amount < 0 && of == "x") request.sensible = false;
    request.amount = request.sensible ? static_cast<std::uint64_t>(amount) : 0;
  } else {
    sd_bus_message_skip(message, "v");
  }
  sd_bus_message_exit_container(message);
}

bool RawService::wrongVolume(const Request& request) const { return request.volume != volume_; }

}  // namespace bad_services
