// Thread safety: confined to the IPC thread.
//
// Tells when something appears at a path whose directories may not be there yet, by inotify(7):
// until then nothing wakes up.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "support/ipc/linux/ipc_loop.h"

struct inotify_event;

namespace spacekeep::ipc {

class SocketWatch {
 public:
  SocketWatch(IpcLoop& loop, std::string path) : loop_(loop), path_(std::move(path)) {}
  ~SocketWatch() { stop(); }
  SocketWatch(const SocketWatch&) = delete;
  SocketWatch& operator=(const SocketWatch&) = delete;

  /// Runs `on_change` once, when something on the way to the path has appeared: the path itself, a
  /// directory above it, or that could not be told any more. Not within this call, and not after
  /// stop(); it may start again. What was there before is not told. False when the kernel has no
  /// watch left.
  bool start(std::function<void()> on_change);
  void stop();

 private:
  static int onEvent(sd_event_source*, const inotify_event* event, void* self);
  bool watchDirectory(const std::string& directory, const std::string& awaited);
  void changed();

  IpcLoop& loop_;
  const std::string path_;
  std::string awaited_;  // the name that is to appear in the directory that is watched
  std::shared_ptr<const std::function<void()>> on_change_;
  sd_event_source* source_ = nullptr;
};

}  // namespace spacekeep::ipc
