#include "support/ipc/linux/socket_watch.h"

#include <sys/inotify.h>
#include <systemd/sd-event.h>

#include <cerrno>
#include <filesystem>
#include <utility>

namespace spacekeep::ipc {

namespace {

constexpr std::uint32_t kAppears = IN_CREATE | IN_MOVED_TO | IN_ATTRIB;
constexpr std::uint32_t kDirectoryGoes = IN_DELETE_SELF | IN_MOVE_SELF;

}  // namespace

/// The deepest directory that is there is watched. Should the next one come into being meanwhile, the
/// watch is too high and does not see more: so it is looked once more from the top.
bool SocketWatch::start(std::function<void()> on_change) {
  stop();
  on_change_ = std::make_shared<const std::function<void()>>(std::move(on_change));
  namespace fs = std::filesystem;
  constexpr int kTries = 16;
  for (int i = 0; i < kTries; ++i) {
    fs::path awaited(path_);
    std::error_code ignored;
    while (awaited.has_relative_path() && !fs::is_directory(awaited.parent_path(), ignored)) {
      awaited = awaited.parent_path();
    }
    if (!watchDirectory(awaited.parent_path().string(), awaited.filename().string())) return false;
    const bool is_last = awaited == fs::path(path_);
    if (source_ != nullptr && (is_last || !fs::exists(awaited, ignored))) return true;
    source_ = sd_event_source_disable_unref(source_);
  }
  return false;
}

/// Without a source, and true, when the directory is gone again.
bool SocketWatch::watchDirectory(const std::string& directory, const std::string& awaited) {
  awaited_ = awaited;
  const int added =
      sd_event_add_inotify(loop_.event(), &source_, directory.c_str(),
                           kAppears | kDirectoryGoes | IN_ONLYDIR, &SocketWatch::onEvent, this);
  return added >= 0 || added == -ENOENT || added == -ENOTDIR;
}

void SocketWatch::stop() {
  source_ = sd_event_source_disable_unref(source_);
  on_change_ = nullptr;
}

int SocketWatch::onEvent(sd_event_source*, const inotify_event* event, void* self) {
  auto* watch = static_cast<SocketWatch*>(self);
  const bool is_awaited = event->len > 0 && watch->awaited_ == event->name;
  const bool cannot_tell =
      (event->mask & (kDirectoryGoes | IN_IGNORED | IN_Q_OVERFLOW | IN_UNMOUNT)) != 0;
  if (is_awaited || cannot_tell) watch->changed();
  return 0;
}

/// Posted, since it may replace the source that is being dispatched.
void SocketWatch::changed() {
  source_ = sd_event_source_disable_unref(source_);
  loop_.post([weak = std::weak_ptr(on_change_)] {
    if (const auto on_change = weak.lock()) (*on_change)();
  });
}

}  // namespace spacekeep::ipc
