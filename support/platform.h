// Thread safety: a bundle of references that is constant after construction; each thing it refers
// to states its own.
//
// Everything the daemon's own code stands on, handed to it as one constructor argument. Production
// fills it with the Linux implementations of this folder, the simulation with its world.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "support/access/access.h"
#include "support/files/directory_reader.h"
#include "support/history/history_store.h"
#include "support/ipc/served.h"
#include "support/preferences/preferences_suite.h"
#include "support/queues/concurrent_queue.h"
#include "support/services/call_service.h"
#include "support/statistics/statistics.h"
#include "support/volumes/volumes.h"

namespace spacekeep {

struct Platform {
  ConcurrentQueue& global;
  Volumes& volumes;
  Access& access;
  Statistics& statistics;
  DirectoryReader& files;
  ipc::Connector& connector;
  ServiceCaller& services;
  /// The suite of that name, null when it cannot be opened (the reason is logged).
  std::function<std::unique_ptr<PreferencesSuite>(const std::string& name)> openPreferencesSuite;
  /// A listener on the daemon's socket that serves `interface` once it is resumed.
  std::function<std::unique_ptr<ipc::Listener>(ipc::ServedInterface interface)> makeListener;
  /// Runs the task on the global queue once so much time has passed; not at all when the process
  /// ends before.
  std::function<void(std::uint64_t delay_ns, Task task)> after;
  /// A fresh token, unique within the process. It compares by value.
  std::function<Value()> createSpacekeepToken;
  /// Where the daemon keeps what it has done. Empty: nowhere.
  std::function<std::unique_ptr<HistoryStore>()> openHistory = nullptr;
};

}  // namespace spacekeep
