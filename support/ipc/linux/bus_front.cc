#include "support/ipc/linux/bus_front.h"

#include <systemd/sd-event.h>
#include <time.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "support/ipc/linux/sockets.h"
#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

constexpr const char* kOperation = "SpacekeepBus";

// Between the moment at which a socket appears and the one at which somebody listens.
constexpr std::uint64_t kRefusedPauseNs = 100'000'000;
constexpr unsigned kRefusalsTried = 6;

// The broker is trusted to read; what one user has unread is limited before this is.
constexpr std::size_t kQueuedMessages = 65'536;
constexpr std::size_t kQueuedBytes = 64 * 1024 * 1024;

LinkLimits linkLimits(const ServerLimits& limits) {
  return {limits.authentication_ns, limits.message_bytes, kQueuedMessages, kQueuedBytes};
}

}  // namespace

BusFront::Session::Session(const std::shared_ptr<ServerContext>& context, BusFront& front)
    : link(context->loop, front, front.options_.name, linkLimits(context->options.limits),
           2 * context->options.limits.queued_bytes),
      callers(context, link) {}

BusFront::BusFront(std::shared_ptr<ServerContext> context, BusOptions options)
    : context_(std::move(context)),
      options_(std::move(options)),
      watch_(context_->loop, options_.socket),
      pause_ns_(options_.first_pause_ns) {}

BusFront::~BusFront() { endPause(); }

/// The watch comes first, so that nothing appears unseen in between.
void BusFront::connect() {
  endPause();
  const bool watches = watch_.start([this] {
    refusals_ = 0;
    connect();
  });
  std::string why;
  const SharedDescriptor socket = connectSocket(options_.socket, why);
  const int error = errno;
  if (socket != nullptr) {
    watch_.stop();
    session_ = std::make_unique<Session>(context_, *this);
    session_->link.start(socket->fd());
  } else if (watches && (error == ENOENT || error == ENOTDIR || error == ECONNREFUSED)) {
    waitForBus(error);
  } else {
    tell(why);
    pause(pause_ns_);
    pause_ns_ = std::min(pause_ns_ * 2, options_.longest_pause_ns);
  }
}

void BusFront::waitForBus(int error) {
  if (error == ECONNREFUSED && refusals_ < kRefusalsTried) {
    pause(kRefusedPauseNs << refusals_++);
  } else if (told_.empty()) {
    told_ = "none";
    logTrace("%s No bus at %@, clients use the socket", kOperation, options_.socket);
  }
}

void BusFront::pause(std::uint64_t duration_ns) {
  const std::uint64_t usec = std::max<std::uint64_t>(duration_ns / 1000, 1);
  endPause();
  if (sd_event_add_time_relative(context_->loop.event(), &timer_, CLOCK_MONOTONIC, usec,
                                 std::max<std::uint64_t>(usec / 10, 1), &BusFront::onPauseEnd,
                                 this) < 0) {
    tell("no timer is left; the bus is not tried again");
  }
}

void BusFront::endPause() { timer_ = sd_event_source_disable_unref(timer_); }

int BusFront::onPauseEnd(sd_event_source*, std::uint64_t, void* self) {
  static_cast<BusFront*>(self)->connect();
  return 0;
}

void BusFront::brokerNamed(bool has_name) {
  if (!has_name) {
    return tell("another program has the name " + options_.name +
                "; it is served once that one gives it up");
  }
  if (named_usec_ > 0) return;  // told by a signal and by an answer
  told_.clear();
  refusals_ = 0;
  named_usec_ = nowUsec();
  logTrace("%s serves as %@ on the bus at %@", kOperation, options_.name, options_.socket);
}

void BusFront::brokerCall(sd_bus_message* call, std::size_t bytes) {
  session_->callers.take(call, bytes);
}

void BusFront::brokerLeftOut(const LeftOut& message) { session_->callers.tellLeftOut(message); }

void BusFront::brokerEnded(const std::string& why) {
  const std::uint64_t named_usec = std::exchange(named_usec_, 0);
  if (named_usec > 0 && nowUsec() - named_usec >= options_.settled_ns / 1000) {
    pause_ns_ = options_.first_pause_ns;
  }
  tell(why);
  retire();
  pause(pause_ns_);
  pause_ns_ = std::min(pause_ns_ * 2, options_.longest_pause_ns);
}

/// It may be on the stack.
void BusFront::retire() {
  if (session_ == nullptr) return;
  session_->callers.clear();
  session_->link.close();
  context_->loop.post([retired = std::shared_ptr<Session>(std::move(session_))] {});
}

/// Once, however often it is tried again.
void BusFront::tell(const std::string& problem) {
  if (std::exchange(told_, problem) == problem) return;
  logProblem("%s not on the bus at %@: %@", kOperation, options_.socket, problem);
}

std::uint64_t BusFront::nowUsec() const {
  std::uint64_t usec = 0;
  sd_event_now(context_->loop.event(), CLOCK_MONOTONIC, &usec);
  return usec;
}

}  // namespace spacekeep::ipc
