// Thread safety: as its members; construct and destroy from a thread of the program itself.
//
// The threads that one client or one host of the library owns: the IPC thread and the workers.
#pragma once

#include "support/ipc/linux/ipc_loop.h"
#include "support/queues/concurrent_queue.h"

namespace spacekeep::sdk {

struct Engine {
  Engine();

  // A handler of the program may block in ways that the queue cannot see. The five kinds of
  // handlers that may do so leave workers over for pings and cancel requests.
  ConcurrentQueue queue{{.name = "spacekeep", .parallelism = 8, .idle_worker_ns = 10'000'000'000}};
  ipc::IpcLoop loop;  // after the queue: its thread submits to the queue until it ends
};

}  // namespace spacekeep::sdk
