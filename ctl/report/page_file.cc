#include "ctl/report/page_file.h"

#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <memory>

#include "ctl/text_layout.h"
#include "support/files/linux/descriptor.h"

namespace spacekeep::ctl {
namespace {

using Problem = std::optional<std::string>;

Problem problemWith(const std::string& path, const char* what) {
  return harmless(path) + " " + what + ": " + errorText(errno);
}

std::string directoryOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? "." : path.substr(0, slash + 1);
}

/// Through symbolic links; a file that is not there yet is itself.
std::string targetOf(const std::string& path) {
  const std::unique_ptr<char, decltype(&::free)> target(realpath(path.c_str(), nullptr), &::free);
  return target ? target.get() : path;
}

bool writeAll(int descriptor, std::string_view text) {
  while (!text.empty()) {
    const ssize_t written = write(descriptor, text.data(), text.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return false;
    text.remove_prefix(static_cast<std::size_t>(written));
  }
  return true;
}

/// The mode of the file that is replaced, else that of any new file.
mode_t modeFor(const std::string& target) {
  struct stat facts = {};
  if (stat(target.c_str(), &facts) == 0) return facts.st_mode & 0777U;
  const mode_t mask = umask(0);
  umask(mask);
  return 0666U & ~mask;
}

Problem replace(const std::string& target, std::string_view text) {
  std::string fresh = target + ".XXXXXX";
  const mode_t mode = modeFor(target);
  const FileDescriptor file(mkostemp(fresh.data(), O_CLOEXEC));
  if (!file.valid()) return problemWith(target, "cannot be written beside");
  Problem problem;
  if (!writeAll(file.get(), text) || fchmod(file.get(), mode) != 0) {
    problem = problemWith(fresh, "cannot be written");
  } else if (std::rename(fresh.c_str(), target.c_str()) != 0) {
    problem = problemWith(target, "cannot be replaced");
  }
  if (problem) unlink(fresh.c_str());
  return problem;
}

}  // namespace

Problem objectionToFile(const std::string& path) {
  if (path == kStandardOutput) return std::nullopt;
  const std::string name = harmless(path);
  struct stat facts = {};
  if (stat(path.c_str(), &facts) == 0) {
    if (S_ISDIR(facts.st_mode)) return name + " is a directory; name a file in it";
    if (!S_ISREG(facts.st_mode)) return name + " is no plain file; standard output is \"-\"";
  } else if (errno != ENOENT) {
    return problemWith(path, "cannot be looked at");
  }
  const std::string directory = directoryOf(targetOf(path));
  if (path.empty() || path.back() == '/') return "\"" + name + "\" names no file";
  if (access(directory.c_str(), W_OK | X_OK) == 0) return std::nullopt;
  return problemWith(directory, "cannot be written to");
}

Problem writePage(const std::string& path, std::string_view text) {
  if (path != kStandardOutput) return replace(targetOf(path), text);
  if (writeAll(STDOUT_FILENO, text)) return std::nullopt;
  return problemWith("standard output", "cannot be written");
}

}  // namespace spacekeep::ctl
