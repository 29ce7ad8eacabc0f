#include "sim/world/in_memory_files.h"

#include <algorithm>

#include "support/runtime/locks.h"
#include "support/values/plist.h"

namespace spacekeep::sim {
namespace {

/// Without doubled slashes and without one at the end.
std::string normalised(std::string_view path) {
  std::string result;
  for (const char c : path) {
    if (c != '/' || result.empty() || result.back() != '/') result.push_back(c);
  }
  if (result.size() > 1 && result.back() == '/') result.pop_back();
  return result;
}

std::string parentOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos || slash == 0) return {};
  return path.substr(0, slash);
}

}  // namespace

void InMemoryFiles::add(const std::string& path, std::vector<std::uint8_t> content) {
  put(path, std::move(content));
}

void InMemoryFiles::addText(const std::string& path, std::string_view content) {
  put(path, std::vector<std::uint8_t>(content.begin(), content.end()));
}

void InMemoryFiles::addPlist(const std::string& path, const Value& content) {
  put(path, binaryPlist(content));
}

void InMemoryFiles::addUnreadable(const std::string& path, std::string reason) {
  put(path, FileError{std::move(reason)});
}

void InMemoryFiles::addDirectory(const std::string& path) { put(path, IsDirectory{}); }

void InMemoryFiles::put(const std::string& path, Node node) {
  const std::string name = normalised(path);
  if (const std::string parent = parentOf(name); !parent.empty()) {
    const std::scoped_lock lock(mutex_);
    std::vector<std::string> missing;
    for (std::string above = parent; !above.empty(); above = parentOf(above)) {
      const bool known = std::any_of(nodes_.begin(), nodes_.end(),
                                     [&](const auto& entry) { return entry.first == above; });
      if (!known) missing.push_back(above);
    }
    for (auto above = missing.rbegin(); above != missing.rend(); ++above) {
      nodes_.emplace_back(*above, IsDirectory{});
    }
  }
  const std::scoped_lock lock(mutex_);
  for (auto& [known, content] : nodes_) {
    if (known != name) continue;
    content = std::move(node);
    return;
  }
  nodes_.emplace_back(name, std::move(node));
}

void InMemoryFiles::remove(const std::string& path) {
  const std::string name = normalised(path);
  const std::scoped_lock lock(mutex_);
  std::erase_if(nodes_, [&](const auto& entry) {
    return entry.first == name || entry.first.starts_with(name + "/");
  });
}

std::vector<std::string> InMemoryFiles::entriesBelow(const std::string& directory) {
  const std::string name = normalised(directory);
  const std::string prefix = name == "/" ? name : name + "/";
  std::vector<std::string> entries;
  const std::scoped_lock lock(mutex_);
  for (const auto& [path, node] : nodes_) {
    if (path.starts_with(prefix)) entries.push_back(path.substr(prefix.size()));
  }
  return entries;
}

std::variant<std::vector<std::uint8_t>, FileError> InMemoryFiles::readWholeFile(
    const std::string& path) {
  const std::string name = normalised(path);
  const std::scoped_lock lock(mutex_);
  for (const auto& [known, node] : nodes_) {
    if (known != name) continue;
    if (const auto* content = std::get_if<std::vector<std::uint8_t>>(&node)) return *content;
    if (const auto* error = std::get_if<FileError>(&node)) return *error;
    return FileError{"not a regular file"};
  }
  return FileError{"no such file"};
}

}  // namespace spacekeep::sim
