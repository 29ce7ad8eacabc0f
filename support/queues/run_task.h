// Thread safety: may be called from any thread.
//
// How every queue of this folder runs a task.
#pragma once

#include <exception>
#include <functional>
#include <string>

#include "support/runtime/runtime.h"

namespace spacekeep {

/// Runs `task`. Errors are values in this system, so an exception that leaves a task is a broken
/// invariant. What is no std::exception passes: the runtime unwinds left-over threads that way.
inline void runTask(const std::string& queue_name, const std::function<void()>& task) {
  try {
    task();
  } catch (const std::exception& error) {
    rt::panic(("a task of queue " + queue_name + " threw: " + error.what()).c_str());
  }
}

}  // namespace spacekeep
