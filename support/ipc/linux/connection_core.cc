#include "support/ipc/linux/connection_core.h"

#include <algorithm>
#include <mutex>
#include <utility>

#include "support/ipc/error_names.h"
#include "support/ipc/linux/owned_message.h"
#include "support/ipc/linux/wire_reader.h"
#include "support/ipc/linux/wire_writer.h"
#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

LinkLimits linkLimits(const ConnectionLimits& limits) {
  return {limits.authentication_ns, limits.message_bytes, limits.pending_calls + 1,
          limits.queued_bytes};
}

std::string textOrEmpty(const char* text) { return text == nullptr ? "" : text; }

}  // namespace

ConnectionCore::ConnectionCore(IpcLoop& loop, ConcurrentQueue& global, SharedDescriptor descriptor,
                               const ConnectionLimits& limits)
    : inbox_(loop.inbox()),
      global_(global),
      limits_(limits),
      descriptor_(std::move(descriptor)),
      link_(loop, *this, Authentication::Role::kClient, linkLimits(limits)),
      peer_(loop) {}

void ConnectionCore::setInvalidationHandler(Connection::Handler handler) {
  const std::scoped_lock lock(mutex_);
  if (!ended_) on_invalidation_ = std::move(handler);
}

void ConnectionCore::setInterruptionHandler(Connection::Handler handler) {
  const std::scoped_lock lock(mutex_);
  if (!ended_) on_interruption_ = std::move(handler);
}

void ConnectionCore::setRemoteInterface(const InterfaceDescription& interface) {
  const std::scoped_lock lock(mutex_);
  interface_ = &interface;
}

void ConnectionCore::resume() {
  const std::scoped_lock lock(mutex_);
  if (resumed_) return;
  resumed_ = true;
  // Posted under the lock, so that no call overtakes those that were held.
  inbox_->post([self = shared_from_this(), held = std::move(held_)]() mutable {
    self->start(std::move(held));
  });
  held_.clear();
}

void ConnectionCore::invalidate() {
  inbox_->post([self = shared_from_this()] {
    if (self->finished_) return;
    self->link_.close();
    self->failPending({kErrorDisconnected, "the connection was invalidated"});
    self->finish(End::kInvalidation);
  });
}

bool ConnectionCore::ended() const {
  const std::scoped_lock lock(mutex_);
  return ended_;
}

void ConnectionCore::call(std::string_view member, Arguments arguments,
                          RemoteProxy::ReplyHandler reply, const SharedErrorHandler& on_error) {
  Call call{nullptr, nullptr, std::move(arguments), std::move(reply), on_error};
  Error problem;
  {
    const std::scoped_lock lock(mutex_);
    problem = admit(member, call.arguments, call);
    if (problem.name.empty()) {
      ++unanswered_;
      if (resumed_) {
        post(std::move(call));
      } else {
        held_.push_back(std::move(call));
      }
      return;
    }
  }
  if (problem.name == kErrorLimitsExceeded) {
    logProblem("%s A service's connection is ended: %@", "call", problem.text);
    invalidate();
  }
  fail(std::move(call), std::move(problem));
}

/// Fills in the method. Answers an error with an empty name when the call may be made.
Error ConnectionCore::admit(std::string_view member, const Arguments& arguments, Call& call) {
  if (ended_) return {kErrorDisconnected, "the connection has ended"};
  call.interface = interface_ == nullptr ? nullptr : interface_->having(member);
  if (call.interface == nullptr) {
    return {kErrorUnknownMethod, std::string(member) + " is not known"};
  }
  call.method = call.interface->method(member);
  if (!matches(call.method->in, arguments)) {
    return {kErrorInvalidArgs, std::string(member) + " takes other arguments"};
  }
  if (unanswered_ >= limits_.pending_calls) {
    return {kErrorLimitsExceeded, std::to_string(unanswered_) + " calls are unanswered"};
  }
  return {};
}

void ConnectionCore::post(Call call) {
  inbox_->post([self = shared_from_this(), call = std::move(call)]() mutable {
    self->transmit(std::move(call));
  });
}

/// The whole call goes along, because what its callbacks hold is not to be destroyed on the IPC
/// thread.
void ConnectionCore::fail(Call call, Error error) {
  global_.async([call = std::move(call), error = std::move(error)] {
    if (*call.on_error) (*call.on_error)(error);
  });
}

void ConnectionCore::forgetOne() {
  const std::scoped_lock lock(mutex_);
  if (!ended_) --unanswered_;
}

void ConnectionCore::start(std::deque<Call> held) {
  waiting_ = std::move(held);
  const SharedDescriptor descriptor = std::exchange(descriptor_, nullptr);
  if (finished_) {
    failPending({kErrorDisconnected, "the connection has ended"});
    return;
  }
  const int fd = descriptor == nullptr ? -1 : descriptor->fd();
  peer_.remember(fd);
  link_.start(fd, 0, sendsDescriptors());
}

bool ConnectionCore::sendsDescriptors() {
  const std::scoped_lock lock(mutex_);
  if (interface_ == nullptr) return false;
  return std::ranges::any_of(interface_->methods, passesDescriptor);
}

void ConnectionCore::transmit(Call call) {
  if (!link_.ended() && !link_.ready()) {
    waiting_.push_back(std::move(call));
    return;
  }
  Error problem = send(call);
  if (problem.name.empty()) return;
  forgetOne();
  fail(std::move(call), std::move(problem));
}

/// A peer takes no more than this side would, and ends the connection of whoever sends it: what one
/// client asks must not cost others their service.
std::string ConnectionCore::sizeProblem(const Call& call, std::size_t bytes) const {
  if (bytes <= limits_.message_bytes) return "";
  logProblem("%s %@ is not called, its arguments have %llu bytes and a message %llu at most",
             "send", call.method->name, bytes, limits_.message_bytes);
  return "the arguments have " + std::to_string(bytes) + " bytes, and a message " +
         std::to_string(limits_.message_bytes) + " at most";
}

/// Answers what went wrong, with an empty name when it was sent; `call` else is as it was. Only the
/// end of the connection is called a disconnect, since nothing else makes a caller connect anew.
Error ConnectionCore::send(Call& call) {
  if (link_.ended()) return {kErrorDisconnected, "the connection has ended"};
  sd_bus_message* made = nullptr;
  if (sd_bus_message_new_method_call(link_.bus(), &made, nullptr, kObjectPath,
                                     std::string(call.interface->name).c_str(),
                                     std::string(call.method->name).c_str()) < 0) {
    return {kErrorFailed, "the message cannot be made"};
  }
  const OwnedMessage message(made);
  WireWriter writer(message.get());
  if (!writer.write(call.method->in, call.arguments)) {
    return {kErrorInvalidArgs, "the arguments do not fit into a message"};
  }
  if (std::string problem = sizeProblem(call, writer.bytes()); !problem.empty()) {
    return {kErrorInvalidArgs, std::move(problem)};
  }
  const auto serial = link_.send(message.get(), writer.bytes());
  if (!serial) {
    return {link_.ended() ? kErrorDisconnected : kErrorFailed, "the message cannot be sent"};
  }
  call.arguments.clear();
  pending_.emplace(*serial, std::move(call));
  return {};
}

void ConnectionCore::linkReady() {
  for (Call& call : std::exchange(waiting_, {})) transmit(std::move(call));
}

void ConnectionCore::linkMessage(sd_bus_message* message) {
  std::uint8_t type = 0;
  std::uint64_t serial = 0;
  if (sd_bus_message_get_type(message, &type) < 0) return;
  if (type == SD_BUS_MESSAGE_METHOD_CALL) {
    refuse(message);
    return;
  }
  if (sd_bus_message_get_reply_cookie(message, &serial) < 0) return;
  auto call = pending_.extract(serial);
  if (!call.empty()) answered(message, std::move(call.mapped()));
}

void ConnectionCore::answered(sd_bus_message* message, Call call) {
  forgetOne();
  if (const sd_bus_error* error = sd_bus_message_get_error(message)) {
    fail(std::move(call), {textOrEmpty(error->name), textOrEmpty(error->message)});
    return;
  }
  WireReader reader(message, {});
  auto arguments = reader.read(call.method->out);
  if (!arguments) {
    std::string problem =
        "the answer to " + std::string(call.method->name) + ": " + reader.problem();
    fail(std::move(call), {kErrorInconsistentMessage, std::move(problem)});
    return;
  }
  global_.async([call = std::move(call), arguments = std::move(*arguments)]() mutable {
    if (call.reply) call.reply(std::move(arguments));
  });
}

/// The other end is a server; nothing is served on this one.
void ConnectionCore::refuse(sd_bus_message* request) {
  if (sd_bus_message_get_expect_reply(request) <= 0) return;
  sd_bus_message* answer = nullptr;
  const sd_bus_error error{kErrorUnknownObject, "Nothing is served on this end", 0};
  if (sd_bus_message_new_method_error(request, &answer, &error) < 0) return;
  link_.send(answer, 256);
  sd_bus_message_unref(answer);
}

void ConnectionCore::linkEnded(LinkEnd end, const std::string& why) {
  failPending({kErrorDisconnected, why});
  if (finished_) return;
  if (end == LinkEnd::kRefused) {
    logProblem("%s A connection is ended: %@", "linkEnded", why);
    finish(End::kInvalidation);
    return;
  }
  // The watcher belongs to this object and is gone before it.
  peer_.whenKnown(limits_.peer_death_ns,
                  [this](bool died) { finish(died ? End::kInterruption : End::kInvalidation); });
}

void ConnectionCore::failPending(const Error& error) {
  std::deque<Call> failed = std::exchange(waiting_, {});
  for (auto& [serial, call] : pending_) failed.push_back(std::move(call));
  pending_.clear();
  {
    const std::scoped_lock lock(mutex_);
    ended_ = true;
    for (Call& call : std::exchange(held_, {})) failed.push_back(std::move(call));
    unanswered_ = 0;
  }
  for (Call& call : failed) fail(std::move(call), error);
}

void ConnectionCore::finish(End how) {
  finished_ = true;
  peer_.forget();
  Connection::Handler handler;
  Connection::Handler unused;
  {
    const std::scoped_lock lock(mutex_);
    handler = std::exchange(on_invalidation_, nullptr);
    unused = std::exchange(on_interruption_, nullptr);
  }
  if (how == End::kInterruption) std::swap(handler, unused);
  global_.async([handler = std::move(handler), unused = std::move(unused), how] {
    if (handler && how != End::kSilent) handler();
  });
}

void ConnectionCore::abandon() {
  link_.close();
  descriptor_.reset();
  failPending({kErrorDisconnected, "the connection was dropped"});
  if (!finished_) finish(End::kSilent);
}

}  // namespace spacekeep::ipc
