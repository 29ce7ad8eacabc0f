// The one daemon object of the process. The guard is made of the run-time seam rather than of a
// static initialiser: callers that wait for the first one must wait where the seam can see it.
#include <atomic>
#include <utility>

#include "daemon/spacekeep.h"
#include "support/runtime/guarded.h"

namespace spacekeep {
namespace {

struct Shared {
  Platform& platform;
  std::string root_path;
  rt::Guarded<std::shared_ptr<Spacekeep>> daemon{};
};

// Owned. Never freed in production, where the daemon object lives as long as the process.
std::atomic<Shared*> g_shared = nullptr;

}  // namespace

void Spacekeep::setSharedPlatform(Platform& platform, std::string root_path) {
  delete g_shared.exchange(new Shared{.platform = platform, .root_path = std::move(root_path)});
}

std::shared_ptr<Spacekeep> Spacekeep::sharedSpacekeep() {
  Shared* shared = g_shared.load();
  if (shared == nullptr) rt::panic("sharedSpacekeep: no platform has been set");
  std::shared_ptr<Spacekeep> result;
  // Held while the object is made: a concurrent first caller waits and gets the same one.
  shared->daemon.update([&](std::shared_ptr<Spacekeep>& daemon) {
    if (!daemon) daemon = create(shared->platform, shared->root_path);
    result = daemon;
  });
  return result;
}

void Spacekeep::resetSharedSpacekeep() { delete g_shared.exchange(nullptr); }

}  // namespace spacekeep
