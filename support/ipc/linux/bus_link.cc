#include "support/ipc/linux/bus_link.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>
#include <time.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

#include "support/ipc/linux/authenticated_bus.h"

namespace spacekeep::ipc {

namespace {

constexpr int kMessagesPerTurn = 8;  // then other connections have their turn
constexpr std::size_t kLeftOutPerTurn = 64 * 1024;

/// Of what is sent to a peer that takes nothing any more. A message has a smaller one.
constexpr std::uint64_t kFirstLostSerial = 1ULL << 32U;

constexpr const char* kThePeerHasLeft = "the peer has left";
constexpr const char* kNoDescriptorLeft = "this process has no descriptor left";

std::string cannotBeWritten(int problem) {
  return std::string("messages for it cannot be written: ") + std::strerror(problem);
}

std::size_t bytesAvailable(int fd) {
  int bytes = 0;
  return ::ioctl(fd, FIONREAD, &bytes) == 0 && bytes > 0 ? static_cast<std::size_t>(bytes) : 0;
}

}  // namespace

BusLink::BusLink(IpcLoop& loop, Owner& owner, Authentication::Role role, const LinkLimits& limits,
                 Traffic traffic)
    : loop_(loop), owner_(owner), role_(role), limits_(limits), traffic_(traffic) {}

BusLink::~BusLink() { close(); }

void BusLink::start(int fd, uid_t peer_uid, bool sends_descriptors) {
  sends_descriptors_ = sends_descriptors;
  fd_ = ::fcntl(fd, F_DUPFD_CLOEXEC, 3);
  if (fd_ < 0) return end(LinkEnd::kRefused, kNoDescriptorLeft);
  socket_ = std::make_shared<Descriptor>(fd_);
  // The other side of a passed descriptor may have changed the mode, and the IPC thread never
  // waits.
  ::fcntl(fd_, F_SETFL, ::fcntl(fd_, F_GETFL) | O_NONBLOCK);
  authentication_ = std::make_unique<Authentication>(role_, fd_, peer_uid);
  const std::uint64_t usec = std::max<std::uint64_t>(limits_.authentication_ns / 1000, 1);
  if (!watch() || sd_event_add_time_relative(loop_.event(), &timer_, CLOCK_MONOTONIC, usec, 1000,
                                             &BusLink::onTimeout, this) < 0) {
    return end(LinkEnd::kRefused, "this process cannot watch another connection");
  }
  if (!authentication_->begin()) end(LinkEnd::kPeerLeft, kThePeerHasLeft);
}

// Once it is open, each arrival is told once and read to its end: of a thousand sockets that wait for
// their turn, none is looked at again while the others are served.
bool BusLink::watch() {
  events_ = bus_ == nullptr ? EPOLLIN : EPOLLIN | EPOLLRDHUP | EPOLLET;
  if (sd_event_add_io(loop_.event(), &io_, fd_, events_, &BusLink::onIo, this) < 0) return false;
  waits_behind_others_ = false;
  sd_event_source_set_priority(io_, quietPriority());
  // Who has not said who he is comes after those who have.
  setPriority(bus_ == nullptr && role_ == Authentication::Role::kServer);
  return true;
}

bool BusLink::bringsCalls() const {
  return role_ == Authentication::Role::kServer || traffic_ == Traffic::kOfABus;
}

/// Two hundred services may answer at the same moment, so who only asks now and then comes before
/// them. How much one user can ask is limited by the server.
int BusLink::quietPriority() const {
  return bringsCalls() ? SD_EVENT_PRIORITY_NORMAL - 10 : SD_EVENT_PRIORITY_NORMAL;
}

/// A peer that keeps its connection busy is served when no quiet one has anything to say, so the
/// small call of one waits for a few messages of the others, however many connections are busy.
void BusLink::setPriority(bool waits_behind_others) {
  if (std::exchange(waits_behind_others_, waits_behind_others) == waits_behind_others) return;
  sd_event_source_set_priority(io_, waits_behind_others ? SD_EVENT_PRIORITY_IDLE : quietPriority());
}

int BusLink::onTimeout(sd_event_source*, std::uint64_t, void* self) {
  static_cast<BusLink*>(self)->end(LinkEnd::kRefused, "it did not authenticate in time");
  return 0;
}

int BusLink::onIo(sd_event_source*, int, std::uint32_t events, void* self) {
  auto* link = static_cast<BusLink*>(self);
  if (!link->owner_.linkMayRead()) {
    sd_event_source_set_enabled(link->io_, SD_EVENT_OFF);
    return 0;
  }
  if (link->bus_ == nullptr) {
    link->authenticate();
    return 0;
  }
  if ((events & (EPOLLHUP | EPOLLRDHUP)) != 0) link->peer_hung_up_ = true;
  link->process();
  // What was left of a header does not get longer once the peer is gone.
  if (!link->ended_ && link->header_is_incomplete_ && link->peer_hung_up_) {
    link->end(LinkEnd::kPeerLeft, kThePeerHasLeft);
  }
  return 0;
}

/// What came meanwhile is told at once, since the socket is watched anew.
void BusLink::resumeReading() {
  if (io_ != nullptr) sd_event_source_set_enabled(io_, SD_EVENT_ON);
}

void BusLink::authenticate() {
  std::string why;
  switch (authentication_->advance(why)) {
    case Authentication::Progress::kMore:
      return;
    case Authentication::Progress::kFailed:
      return end(LinkEnd::kRefused, why);
    case Authentication::Progress::kLeft:
      // A server writes down who came and went without a word; a client has to find out whether
      // the server has died.
      return end(role_ == Authentication::Role::kServer ? LinkEnd::kRefused : LinkEnd::kPeerLeft,
                 why);
    case Authentication::Progress::kDone:
      break;
  }
  if (!open()) return end(LinkEnd::kRefused, kNoDescriptorLeft);
  owner_.linkReady();
}

bool BusLink::open() {
  timer_ = sd_event_source_disable_unref(timer_);
  authentication_.reset();
  return takeBus();
}

/// In the place of the one before, if there was one.
bool BusLink::takeBus() {
  io_ = sd_event_source_disable_unref(io_);
  const AuthenticatedBus made = makeAuthenticatedBus(
      fd_, sends_descriptors_ ? BusDescriptors::kTaken : BusDescriptors::kClosed);
  if (made.bus == nullptr) return false;
  socket_.reset();
  sd_bus_close_unref(std::exchange(bus_, made.bus));
  input_ = made.input;
  fd_ = made.output;
  return sd_bus_add_filter(bus_, nullptr, &BusLink::onMessage, this) >= 0 && watch();
}

int BusLink::onMessage(sd_bus_message* message, void* self, sd_bus_error*) {
  auto* link = static_cast<BusLink*>(self);
  // The message that sd-bus makes itself when the stream has ended.
  if (link->ended_ || sd_bus_is_open(link->bus_) <= 0) return 1;
  link->in_message_ = false;
  link->owner_.linkMessage(message);
  return 1;  // so that sd-bus never answers anything by itself
}

void BusLink::process() {
  processing_ = true;
  if (!queued_sizes_.empty()) writeQueued();
  int turns = 0;
  while (turns < kMessagesPerTurn && !ended_ && processOnce()) ++turns;
  processing_ = false;
  if (ended_) return release();
  forgetWritten();
  updateEvents();
  setPriority(turns == kMessagesPerTurn && bringsCalls());
  // What is left gets a turn of its own, and so does the end of the stream, so that the calls before
  // it are served: watching again tells at once what is there.
  if (turns == kMessagesPerTurn || peer_hung_up_) sd_event_source_set_io_events(io_, events_);
}

/// Lets sd-bus write what it can, and read nothing: of what may come meanwhile nothing was judged.
void BusLink::writeQueued() {
  const bool is_silent = ::dup3(loop_.silentSocket(), input_, O_CLOEXEC) >= 0;
  const int progress = is_silent ? sd_bus_process(bus_, nullptr) : 0;
  if (!is_silent || ::dup3(fd_, input_, O_CLOEXEC) < 0) {
    end(LinkEnd::kRefused, "this process cannot duplicate a descriptor");
  } else if (progress < 0) {
    end(LinkEnd::kRefused, cannotBeWritten(-progress));
  } else if (sd_bus_is_open(bus_) <= 0) {
    stopWriting();
  } else {
    forgetWritten();
  }
}

/// When a write has told that the peer takes nothing any more. What it said before is still in the
/// socket; closed on this side as well, its stream has an end behind that, which is told as ever.
void BusLink::stopWriting() {
  only_reads_ = true;
  queued_sizes_.clear();
  queued_bytes_ = 0;
  ::shutdown(fd_, SHUT_RDWR);
}

/// sd-bus reads nothing more after a write that failed, so another bus reads what is left. Of a message
/// that had come in part, the beginning is lost with the first one. Answers whether there is a bus.
bool BusLink::readOn() {
  if (sd_bus_is_open(bus_) > 0) return true;
  if (in_message_ && message_read_ > 0) {
    end(LinkEnd::kPeerLeft, kThePeerHasLeft);
  } else if (!takeBus()) {
    end(LinkEnd::kRefused, kNoDescriptorLeft);
  }
  return !ended_;
}

/// Lets sd-bus read at most one message, and only one whose size is known to be within the limit.
/// Answers whether there may be more to do.
bool BusLink::processOnce() {
  if (!readOn()) return false;
  if (left_out_ > 0) return leaveOut();
  return in_message_ ? readJudged() : readNext();
}

bool BusLink::readNext() {
  const NextMessage next = lookAhead(fd_, rules());
  // A header of which a part has arrived is left in the socket.
  header_is_incomplete_ = next.kind == NextMessage::Kind::kIncomplete;
  message_size_ = static_cast<std::size_t>(next.bytes);
  switch (next.kind) {
    case NextMessage::Kind::kNothing:
    case NextMessage::Kind::kIncomplete:
      return false;
    case NextMessage::Kind::kPeerLeft:
      end(LinkEnd::kPeerLeft, kThePeerHasLeft);
      return false;
    case NextMessage::Kind::kRefused:
      end(LinkEnd::kRefused, next.problem);
      return false;
    case NextMessage::Kind::kLeftOut:
      left_out_ = next.left_out.bytes;
      owner_.linkLeftOut(next.left_out);
      return !ended_ && leaveOut();
    case NextMessage::Kind::kDescriptors:
      return readWithDescriptors();
    case NextMessage::Kind::kMessage:
      in_message_ = true;
      message_read_ = 0;
      return readJudged();
  }
  return false;
}

LookAheadRules BusLink::rules() const {
  DescriptorsFrom from = DescriptorsFrom::kNobody;
  if (role_ == Authentication::Role::kServer) from = DescriptorsFrom::kCalls;
  if (sends_descriptors_) from = DescriptorsFrom::kAnybody;
  return {.traffic = traffic_, .descriptors = from, .message_bytes = limits_.message_bytes};
}

bool BusLink::readJudged() {
  const std::size_t available = bytesAvailable(fd_);
  const bool is_continued = message_read_ > 0;
  const bool could_write = !only_reads_;
  const std::size_t queued = queued_sizes_.size();
  const int progress = sd_bus_process(bus_, nullptr);
  if (ended_) return false;
  if (progress < 0) {
    // It may have been writing just then.
    end(LinkEnd::kRefused, std::string("it cannot be spoken with: ") + std::strerror(-progress));
    return false;
  }
  if (sd_bus_is_open(bus_) <= 0) {
    if (could_write) {
      stopWriting();
    } else {
      end(LinkEnd::kPeerLeft, kThePeerHasLeft);
    }
    return could_write;
  }
  if (in_message_) {
    forgetWritten();
    // It writes first, and reads only when no message was written to its end by that.
    if (queued_sizes_.size() < queued) return true;
    if (messageWasDropped(available)) end(LinkEnd::kRefused, "it sent a broken message");
  }
  if (ended_ || progress == 0) return false;
  // When this message was all there was, the next one wakes the loop by itself, and looking for it
  // now would be a system call for nothing. Of one that came in pieces not all was there this time.
  return is_continued || available != message_size_;
}

/// By a bus for this one message: the connection's own takes no descriptors. Answers whether there
/// may be more to do.
bool BusLink::readWithDescriptors() {
  sd_bus* reader = makeAuthenticatedBus(fd_, BusDescriptors::kTaken).bus;
  if (reader == nullptr || sd_bus_add_filter(reader, nullptr, &BusLink::onMessage, this) < 0) {
    sd_bus_close_unref(reader);
    end(LinkEnd::kRefused, kNoDescriptorLeft);
    return false;
  }
  in_message_ = true;
  constexpr int kMoreThanEnoughSteps = 8;
  for (int steps = 0; in_message_ && !ended_ && steps < kMoreThanEnoughSteps; ++steps) {
    if (sd_bus_process(reader, nullptr) < 0) break;
  }
  sd_bus_close_unref(reader);
  if (in_message_) end(LinkEnd::kRefused, "it sent a broken message");
  return !ended_;
}

/// Reads without room for descriptors, so that the kernel closes them. Answers whether there may be
/// more to do.
bool BusLink::leaveOut() {
  std::array<char, 16 * 1024> unused;  // NOLINT: never read
  for (std::size_t taken = 0; taken < kLeftOutPerTurn && left_out_ > 0;) {
    const auto wanted = static_cast<std::size_t>(std::min<std::uint64_t>(left_out_, unused.size()));
    const ssize_t count = ::recv(fd_, unused.data(), wanted, MSG_DONTWAIT);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0 && errno == EAGAIN) return false;
    if (count <= 0) {
      end(LinkEnd::kPeerLeft, kThePeerHasLeft);
      return false;
    }
    left_out_ -= static_cast<std::uint64_t>(count);
    taken += static_cast<std::size_t>(count);
  }
  return true;
}

std::size_t BusLink::messageBytes() const { return std::min(message_size_, limits_.message_bytes); }

/// sd-bus leaves out what it cannot parse and reads on, past what was judged. `available` bytes
/// were there before it read, so it has read that many at least.
bool BusLink::messageWasDropped(std::size_t available) {
  message_read_ += available;
  return message_read_ >= message_size_;
}

void BusLink::updateEvents() {
  std::uint32_t wanted = events_ & ~static_cast<std::uint32_t>(EPOLLOUT);
  if (!queued_sizes_.empty()) wanted |= EPOLLOUT;
  if (wanted == events_) return;
  events_ = wanted;
  sd_event_source_set_io_events(io_, events_);
}

std::optional<std::uint64_t> BusLink::send(sd_bus_message* message, std::size_t bytes) {
  if (ended_ || bus_ == nullptr) return std::nullopt;
  if (only_reads_) return kFirstLostSerial + lost_++;
  std::uint64_t serial = 0;
  const int result = sd_bus_send(bus_, message, &serial);
  if (result < 0) {
    const bool gone = result == -ECONNRESET || result == -EPIPE || result == -ENOTCONN;
    if (gone) {
      stopWriting();
      return kFirstLostSerial + lost_++;
    }
    if (sd_bus_is_open(bus_) <= 0 || result == -ENOBUFS || result == -ENOMEM) {
      end(LinkEnd::kRefused, cannotBeWritten(-result));
    }
    return std::nullopt;
  }
  queued_sizes_.push_back(bytes);
  queued_bytes_ += bytes;
  forgetWritten();
  if (queued_sizes_.size() > limits_.queued_messages || queued_bytes_ > limits_.queued_bytes) {
    end(LinkEnd::kRefused, "it left " + std::to_string(queued_sizes_.size()) +
                               " messages of about " + std::to_string(queued_bytes_) +
                               " bytes unread");
    return std::nullopt;
  }
  if (!processing_) updateEvents();
  return serial;
}

void BusLink::forgetWritten() {
  std::uint64_t waiting = 0;
  if (sd_bus_get_n_queued_write(bus_, &waiting) < 0) return;
  while (queued_sizes_.size() > waiting) {
    queued_bytes_ -= queued_sizes_.front();
    queued_sizes_.pop_front();
  }
}

void BusLink::end(LinkEnd how, const std::string& why) {
  if (ended_) return;
  ended_ = true;
  if (!processing_) release();
  owner_.linkEnded(how, why);
}

void BusLink::close() {
  ended_ = true;
  if (!processing_) release();
}

void BusLink::release() {
  io_ = sd_event_source_disable_unref(io_);
  timer_ = sd_event_source_disable_unref(timer_);
  // Who passed the socket may have kept a duplicate, as may this process: the peer shall know.
  if (fd_ >= 0) ::shutdown(fd_, SHUT_RDWR);
  fd_ = input_ = -1;
  if (bus_ != nullptr) bus_ = sd_bus_close_unref(bus_);
  socket_.reset();
}

}  // namespace spacekeep::ipc
