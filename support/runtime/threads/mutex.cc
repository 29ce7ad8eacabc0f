#include <pthread.h>

#include <cerrno>
#include <ctime>
#include <new>

#include "support/runtime/runtime.h"
#include "support/runtime/threads/real_clock.h"

namespace spacekeep::rt {
namespace {

// The object that the constructor put into the storage.
template <typename T>
T* native(std::byte* storage) {
  static_assert(sizeof(T) <= 64 && alignof(T) <= alignof(std::max_align_t));
  return std::launder(reinterpret_cast<T*>(storage));
}

// None of these calls can fail on memory that holds a live object, used as runtime.h says.
void mustSucceed(int error, const char* what) {
  if (error != 0) panic(what);
}

}  // namespace

Mutex::Mutex() {
  new (storage_) pthread_mutex_t;
  mustSucceed(pthread_mutex_init(native<pthread_mutex_t>(storage_), nullptr), "mutex init");
}

Mutex::~Mutex() {
  // Not checked: an exception may leave a broken program here, and the reason lies elsewhere.
  pthread_mutex_destroy(native<pthread_mutex_t>(storage_));
}

void Mutex::lock() {
  mustSucceed(pthread_mutex_lock(native<pthread_mutex_t>(storage_)), "mutex lock");
}

void Mutex::unlock() {
  mustSucceed(pthread_mutex_unlock(native<pthread_mutex_t>(storage_)), "mutex unlock");
}

CondVar::CondVar() {
  new (storage_) pthread_cond_t;
  pthread_condattr_t attributes;
  mustSucceed(pthread_condattr_init(&attributes), "condition attributes");
  // Deadlines must not move when somebody sets the wall clock.
  mustSucceed(pthread_condattr_setclock(&attributes, CLOCK_MONOTONIC), "condition clock");
  mustSucceed(pthread_cond_init(native<pthread_cond_t>(storage_), &attributes), "condition init");
  pthread_condattr_destroy(&attributes);
}

CondVar::~CondVar() { pthread_cond_destroy(native<pthread_cond_t>(storage_)); }

void CondVar::wait(Mutex& mutex) {
  mustSucceed(
      pthread_cond_wait(native<pthread_cond_t>(storage_), native<pthread_mutex_t>(mutex.storage_)),
      "condition wait");
}

bool CondVar::waitUntil(Mutex& mutex, std::uint64_t deadline_ticks) {
  if (deadline_ticks == kNever) {
    wait(mutex);
    return true;
  }
  const timespec until = realInstantOf(deadline_ticks);
  const int error = pthread_cond_timedwait(native<pthread_cond_t>(storage_),
                                           native<pthread_mutex_t>(mutex.storage_), &until);
  if (error == ETIMEDOUT) return false;
  mustSucceed(error, "condition wait with deadline");
  return true;
}

void CondVar::notifyOne() {
  mustSucceed(pthread_cond_signal(native<pthread_cond_t>(storage_)), "condition notify");
}

void CondVar::notifyAll() {
  mustSucceed(pthread_cond_broadcast(native<pthread_cond_t>(storage_)), "condition notify all");
}

}  // namespace spacekeep::rt
