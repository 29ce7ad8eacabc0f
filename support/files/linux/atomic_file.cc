#include "support/files/linux/atomic_file.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cstdio>

#include "support/files/linux/descriptor.h"

namespace spacekeep {
namespace {

using Problem = std::optional<std::string>;

Problem problemWith(const std::string& path, const char* what) {
  return path + " " + what + ": " + errorText(errno);
}

bool writeAll(int descriptor, std::span<const std::uint8_t> content) {
  while (!content.empty()) {
    const ssize_t written = write(descriptor, content.data(), content.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return false;
    content = content.subspan(static_cast<std::size_t>(written));
  }
  return true;
}

Problem writeTemporary(const std::string& path, std::span<const std::uint8_t> content,
                       Durability durability, mode_t mode) {
  // Created anew and never through a link that somebody left under the name.
  if (unlink(path.c_str()) != 0 && errno != ENOENT) return problemWith(path, "cannot be removed");
  const FileDescriptor file(
      open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, mode));
  if (!file.valid()) return problemWith(path, "cannot be created");
  if (fchmod(file.get(), mode) != 0) return problemWith(path, "cannot be given its mode");
  if (!writeAll(file.get(), content)) return problemWith(path, "cannot be written");
  if (durability == Durability::kDurable && fsync(file.get()) != 0) {
    return problemWith(path, "cannot be made durable");
  }
  return std::nullopt;
}

}  // namespace

std::string directoryOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::optional<std::string> syncDirectory(const std::string& directory) {
  const FileDescriptor descriptor(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!descriptor.valid()) return problemWith(directory, "cannot be opened");
  if (fsync(descriptor.get()) != 0) return problemWith(directory, "cannot be made durable");
  return std::nullopt;
}

std::optional<std::string> replaceFile(const std::string& path,
                                       std::span<const std::uint8_t> content, Durability durability,
                                       mode_t mode) {
  const std::string temporary = path + kTemporarySuffix;
  Problem problem = writeTemporary(temporary, content, durability, mode);
  if (!problem && std::rename(temporary.c_str(), path.c_str()) != 0) {
    problem = problemWith(path, "cannot be replaced");
  }
  if (problem) {
    unlink(temporary.c_str());
    return problem;
  }
  return durability == Durability::kDurable ? syncDirectory(directoryOf(path)) : std::nullopt;
}

}  // namespace spacekeep
