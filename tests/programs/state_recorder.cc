// Loaded in front of the C library (LD_PRELOAD), it writes down every change that a program makes to
// the files below one directory, and every wish to have them durable, in order. From that a test
// knows what a power cut would have left at any moment.
//
// SPACEKEEP_TRACE_BELOW names the directory, SPACEKEEP_TRACE the file that gets the records.
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>

#include "tests/programs/state_trace_format.h"

namespace {

using spacekeep::system_test::TraceHeader;
using spacekeep::system_test::TraceKind;

template <class Function>
Function* next(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

using WriteCall = ssize_t(int, const void*, size_t);
using PwriteCall = ssize_t(int, const void*, size_t, off_t);
using OpenCall = int(const char*, int, ...);

class Recorder {
 public:
  static Recorder& get() {
    static auto* const recorder = new Recorder;
    return *recorder;
  }

  bool concerns(const std::string& path) const {
    return trace_ >= 0 && path.compare(0, below_.size(), below_) == 0;
  }
  std::string pathOf(int fd) const {
    char link[32];
    char path[PATH_MAX];
    std::snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
    const ssize_t length = readlink(link, path, sizeof path);
    return length < 0 ? std::string() : std::string(path, static_cast<size_t>(length));
  }
  // One record in one call, so that no reader sees half of one.
  void note(TraceKind kind, std::uint64_t inode, std::uint64_t offset, const std::string& first,
            const void* second = nullptr, size_t second_length = 0) {
    const TraceHeader header{kind, static_cast<std::uint32_t>(first.size()), second_length, inode,
                             offset};
    std::string record(reinterpret_cast<const char*>(&header), sizeof header);
    record += first;
    record.append(static_cast<const char*>(second), second_length);
    static auto* const real = next<WriteCall>("write");
    if (real(trace_, record.data(), record.size()) != static_cast<ssize_t>(record.size())) abort();
  }
  void noteOf(int fd, TraceKind kind, std::uint64_t offset, const void* bytes = nullptr,
              size_t length = 0) {
    note(kind, inodeOf(fd), offset, pathOf(fd), bytes, length);
  }
  static std::uint64_t inodeOf(int fd) {
    struct stat status {};
    return fstat(fd, &status) == 0 ? status.st_ino : 0;
  }
  std::mutex& order() { return order_; }

 private:
  Recorder() {
    const char* below = getenv("SPACEKEEP_TRACE_BELOW");
    const char* trace = getenv("SPACEKEEP_TRACE");
    if (below == nullptr || trace == nullptr) return;
    below_ = below;
    trace_ = next<OpenCall>("open")(trace, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  }

  std::string below_;
  int trace_ = -1;
  std::mutex order_;
};

bool isThere(const char* path) {
  struct stat status {};
  return lstat(path, &status) == 0;
}

int openRecorded(const char* name, const char* path, int flags, mode_t mode) {
  auto* const real = next<OpenCall>(name);
  Recorder& recorder = Recorder::get();
  if (!recorder.concerns(path)) return real(path, flags, mode);
  const std::scoped_lock lock(recorder.order());
  const bool was_there = isThere(path);
  const int fd = real(path, flags, mode);
  if (fd < 0) return fd;
  recorder.note(was_there ? TraceKind::kOpened : TraceKind::kCreated, Recorder::inodeOf(fd), 0,
                path);
  if ((flags & O_TRUNC) != 0) recorder.noteOf(fd, TraceKind::kResized, 0);
  return fd;
}

// Runs `call` and, when it went well on a file of concern, notes it.
template <class Call, class Note>
auto recorded(int fd, Call call, Note note) {
  Recorder& recorder = Recorder::get();
  if (!recorder.concerns(recorder.pathOf(fd))) return call();
  const std::scoped_lock lock(recorder.order());
  const auto result = call();
  if (result >= 0) note(recorder, result);
  return result;
}

ssize_t pwriteRecorded(const char* name, int fd, const void* bytes, size_t count, off_t offset) {
  auto* const real = next<PwriteCall>(name);
  return recorded(
      fd, [&] { return real(fd, bytes, count, offset); },
      [&](Recorder& recorder, ssize_t written) {
        recorder.noteOf(fd, TraceKind::kWritten, static_cast<std::uint64_t>(offset), bytes,
                        static_cast<size_t>(written));
      });
}

int syncRecorded(const char* name, int fd, TraceKind kind) {
  auto* const real = next<int(int)>(name);
  return recorded(
      fd, [&] { return real(fd); }, [&](Recorder& recorder, int) { recorder.noteOf(fd, kind, 0); });
}

int resizeRecorded(const char* name, int fd, off_t size) {
  auto* const real = next<int(int, off_t)>(name);
  return recorded(
      fd, [&] { return real(fd, size); },
      [&](Recorder& recorder, int) {
        recorder.noteOf(fd, TraceKind::kResized, static_cast<std::uint64_t>(size));
      });
}

// In the order of their names: what is done to a path, and what is to be noted of it.
template <class Call>
int namesRecorded(Call call, TraceKind kind, const char* first, const char* second) {
  Recorder& recorder = Recorder::get();
  if (!recorder.concerns(first)) return call();
  const std::scoped_lock lock(recorder.order());
  const int result = call();
  if (result == 0) recorder.note(kind, 0, 0, first, second, std::strlen(second));
  return result;
}

mode_t modeFrom(int flags, va_list arguments) {
  return (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(arguments, mode_t) : 0;
}

}  // namespace

extern "C" {

int open(const char* path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = modeFrom(flags, arguments);
  va_end(arguments);
  return openRecorded("open", path, flags, mode);
}

int open64(const char* path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = modeFrom(flags, arguments);
  va_end(arguments);
  return openRecorded("open64", path, flags, mode);
}

ssize_t write(int fd, const void* bytes, size_t count) {
  auto* const real = next<WriteCall>("write");
  return recorded(
      fd, [&] { return real(fd, bytes, count); },
      [&](Recorder& recorder, ssize_t written) {
        // Where it went is where the file stands now, less what was written.
        const off_t end = lseek(fd, 0, SEEK_CUR);
        recorder.noteOf(fd, TraceKind::kWritten, static_cast<std::uint64_t>(end - written), bytes,
                        static_cast<size_t>(written));
      });
}

ssize_t pwrite(int fd, const void* bytes, size_t count, off_t offset) {
  return pwriteRecorded("pwrite", fd, bytes, count, offset);
}
ssize_t pwrite64(int fd, const void* bytes, size_t count, off64_t offset) {
  return pwriteRecorded("pwrite64", fd, bytes, count, offset);
}
int ftruncate(int fd, off_t size) noexcept { return resizeRecorded("ftruncate", fd, size); }
int ftruncate64(int fd, off64_t size) noexcept { return resizeRecorded("ftruncate64", fd, size); }
int fsync(int fd) { return syncRecorded("fsync", fd, TraceKind::kSynced); }
int fdatasync(int fd) { return syncRecorded("fdatasync", fd, TraceKind::kSynced); }
int syncfs(int fd) noexcept { return syncRecorded("syncfs", fd, TraceKind::kSyncedAll); }

int rename(const char* from, const char* to) noexcept {
  auto* const real = next<int(const char*, const char*)>("rename");
  return namesRecorded([&] { return real(from, to); }, TraceKind::kRenamed, from, to);
}
int unlink(const char* path) noexcept {
  auto* const real = next<int(const char*)>("unlink");
  return namesRecorded([&] { return real(path); }, TraceKind::kRemoved, path, "");
}
int mkdir(const char* path, mode_t mode) noexcept {
  auto* const real = next<int(const char*, mode_t)>("mkdir");
  return namesRecorded([&] { return real(path, mode); }, TraceKind::kCreated, path, "");
}

}  // extern "C"
