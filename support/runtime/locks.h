// Thread safety: the guards belong to the scope that made them.
//
// std::scoped_lock and std::unique_lock for rt::Mutex. Code outside of support/ takes them from here,
// so that the standard library's own mutexes stay out of its sight.
#pragma once

#include <mutex>  // IWYU pragma: export

#include "support/runtime/runtime.h"
