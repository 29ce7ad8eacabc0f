// Thread safety: every member may be called from any thread.
//
// One value that several threads read and replace.
#pragma once

#include <mutex>
#include <utility>

#include "support/runtime/runtime.h"

namespace spacekeep::rt {

template <class T>
class Guarded {
 public:
  Guarded() = default;
  explicit Guarded(T value) : value_(std::move(value)) {}

  [[nodiscard]] T get() const {
    const std::scoped_lock lock(mutex_);
    return value_;
  }
  void set(T value) {
    const std::scoped_lock lock(mutex_);
    std::swap(value_, value);  // the old value is destroyed after the lock is gone
  }
  /// Runs `change` on the value while the lock is held.
  template <class Change>
  void update(Change&& change) {
    const std::scoped_lock lock(mutex_);
    std::forward<Change>(change)(value_);
  }

 private:
  mutable Mutex mutex_;
  T value_{};  // protected by mutex_
};

}  // namespace spacekeep::rt
