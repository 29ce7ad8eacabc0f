#include <pthread.h>

#include <cerrno>
#include <csignal>
#include <exception>
#include <memory>
#include <system_error>
#include <utility>

#include "support/runtime/runtime.h"
#include "support/runtime/stack_size.h"

namespace spacekeep::rt {
namespace {

constexpr std::size_t kNameBytes = 15;  // pthread_setname_np(3): 16 with the terminating zero.

static_assert(sizeof(pthread_t) <= sizeof(void*));

pthread_t nativeOf(void* handle) { return reinterpret_cast<pthread_t>(handle); }

struct Start {
  std::string name;
  std::function<void()> body;
};

void runBody(Start& start) {
  try {
    start.body();
  } catch (const std::exception& error) {
    panic(("thread " + start.name + " ended by an exception: " + error.what()).c_str());
  }
}

void* threadMain(void* argument) {
  const std::unique_ptr<Start> start(static_cast<Start*>(argument));
  pthread_setname_np(pthread_self(), start->name.substr(0, kNameBytes).c_str());
  runBody(*start);
  return nullptr;
}

class Attributes {
 public:
  Attributes() {
    pthread_attr_init(&attributes_);
    pthread_attr_setstacksize(&attributes_, kThreadStackBytes);
  }
  ~Attributes() { pthread_attr_destroy(&attributes_); }
  Attributes(const Attributes&) = delete;
  Attributes& operator=(const Attributes&) = delete;
  [[nodiscard]] const pthread_attr_t* get() const { return &attributes_; }

 private:
  pthread_attr_t attributes_;
};

/// Signals go to the threads that ask for them, never to one started here: the new thread takes
/// over the mask of its maker, which is full for that moment.
class AllSignalsBlocked {
 public:
  AllSignalsBlocked() {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before_);
  }
  ~AllSignalsBlocked() { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
  AllSignalsBlocked(const AllSignalsBlocked&) = delete;
  AllSignalsBlocked& operator=(const AllSignalsBlocked&) = delete;

 private:
  sigset_t before_{};
};

}  // namespace

Thread::Thread(std::string name, std::function<void()> body) {
  auto start = std::make_unique<Start>(Start{std::move(name), std::move(body)});
  const Attributes attributes;
  const AllSignalsBlocked blocked;
  pthread_t thread{};
  const int error = pthread_create(&thread, attributes.get(), threadMain, start.get());
  if (error != 0) throw std::system_error(error, std::generic_category(), "pthread_create");
  static_cast<void>(start.release());  // The thread owns it now.
  handle_ = reinterpret_cast<void*>(thread);
}

Thread::Thread(Thread&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}

Thread& Thread::operator=(Thread&& other) noexcept {
  if (joinable()) panic("a thread was assigned over before it was joined or detached");
  handle_ = std::exchange(other.handle_, nullptr);
  return *this;
}

Thread::~Thread() {
  if (joinable()) panic("a thread was destroyed before it was joined or detached");
}

void Thread::join() {
  if (!joinable()) panic("join of no thread");
  if (pthread_join(nativeOf(std::exchange(handle_, nullptr)), nullptr) != 0) panic("thread join");
}

void Thread::detach() {
  if (!joinable()) panic("detach of no thread");
  pthread_detach(nativeOf(std::exchange(handle_, nullptr)));
}

}  // namespace spacekeep::rt
