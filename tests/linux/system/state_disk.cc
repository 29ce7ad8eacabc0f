#include "tests/linux/system/state_disk.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <fstream>

#include "tests/helpers/temporary_directory.h"

namespace spacekeep::system_test {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kSectorBytes = 512;
/// Its content is of no concern.
constexpr const char* kReserve = "reserve";

std::string directoryPart(const std::string& name) {
  const std::size_t slash = name.rfind('/');
  return slash == std::string::npos ? std::string() : name.substr(0, slash);
}

}  // namespace

std::vector<TraceStep> readTrace(const std::string& path) {
  const std::string content = test::contentOf(path);
  std::vector<TraceStep> steps;
  std::size_t place = 0;
  while (place + sizeof(TraceHeader) <= content.size()) {
    TraceStep step;
    std::memcpy(&step.header, content.data() + place, sizeof step.header);
    place += sizeof step.header;
    step.first = content.substr(place, step.header.first_length);
    place += step.header.first_length;
    step.second = content.substr(place, step.header.second_length);
    place += step.header.second_length;
    step.end = place;
    steps.push_back(std::move(step));
  }
  return steps;
}

StateDisk::StateDisk(const std::string& directory, std::string recorded_as)
    : recorded_as_(std::move(recorded_as)) {
  for (const auto& entry : fs::recursive_directory_iterator(directory)) {
    const std::string name = entry.path().lexically_relative(directory);
    if (entry.is_directory()) {
      now_[name] = kDirectory;
      continue;
    }
    now_[name] = static_cast<int>(files_.size());
    files_.push_back({test::contentOf(entry.path()), {}});
  }
  durable_ = now_;
}

std::string StateDisk::within(const std::string& path) const {
  return path.size() <= recorded_as_.size() ? std::string() : path.substr(recorded_as_.size() + 1);
}

StateDisk::File* StateDisk::fileOf(const TraceHeader& header) {
  const auto found = by_inode_.find(header.inode);
  return found == by_inode_.end() ? nullptr : &files_[static_cast<std::size_t>(found->second)];
}

void StateDisk::play(const TraceStep& step) {
  File* file = fileOf(step.header);
  const std::string name = within(step.first);
  switch (step.header.kind) {
    case TraceKind::kOpened:
      if (const auto known = now_.find(name); known != now_.end() && known->second >= 0) {
        by_inode_[step.header.inode] = known->second;
      }
      return;
    case TraceKind::kCreated:
      return created(step.header, name);
    case TraceKind::kWritten:
      if (file != nullptr) file->pending.push_back({false, step.header.offset, step.second});
      return;
    case TraceKind::kResized:
      if (file != nullptr) file->pending.push_back({true, step.header.offset, {}});
      return;
    case TraceKind::kSynced:
      return synced(step);
    case TraceKind::kSyncedAll:
      for (const NameChange& change : pending_names_) apply(change, durable_);
      pending_names_.clear();
      for (File& each : files_) {
        for (const Change& change : std::exchange(each.pending, {})) apply(change, each.durable);
      }
      return;
    case TraceKind::kRenamed: {
      const auto known = now_.find(name);
      if (known != now_.end()) change({name, within(step.second), known->second});
      return;
    }
    case TraceKind::kRemoved:
      return change({name, {}, kNoFile});
  }
}

void StateDisk::created(const TraceHeader& header, const std::string& name) {
  int file = kDirectory;
  if (header.inode != 0) {
    file = static_cast<int>(files_.size());
    files_.emplace_back();
    by_inode_[header.inode] = file;
  }
  change({{}, name, file});
}

void StateDisk::synced(const TraceStep& step) {
  File* file = fileOf(step.header);
  const std::string name = within(step.first);
  const auto known = now_.find(name);
  if (name.empty() || (known != now_.end() && known->second == kDirectory)) return syncNames(name);
  if (file == nullptr) return;
  for (const Change& change : std::exchange(file->pending, {})) apply(change, file->durable);
}

void StateDisk::syncNames(const std::string& directory) {
  std::vector<NameChange> others;
  for (NameChange& change : pending_names_) {
    const std::string& name = change.add.empty() ? change.remove : change.add;
    if (directoryPart(name) == directory) {
      apply(change, durable_);
    } else {
      others.push_back(std::move(change));
    }
  }
  pending_names_ = std::move(others);
}

void StateDisk::change(NameChange change) {
  apply(change, now_);
  pending_names_.push_back(std::move(change));
}

void StateDisk::apply(const NameChange& change, Names& names) {
  if (!change.remove.empty()) names.erase(change.remove);
  if (!change.add.empty()) names[change.add] = change.file;
}

void StateDisk::apply(const Change& change, std::string& content) {
  if (change.resize) return content.resize(change.offset, '\0');
  content.resize(std::max<std::size_t>(content.size(), change.offset + change.bytes.size()), '\0');
  content.replace(change.offset, change.bytes.size(), change.bytes);
}

void StateDisk::applySectors(const Change& change, std::string& content, std::mt19937& random) {
  for (std::uint64_t done = 0; done < change.bytes.size();) {
    const std::uint64_t place = change.offset + done;
    const std::uint64_t length =
        std::min<std::uint64_t>(kSectorBytes - place % kSectorBytes, change.bytes.size() - done);
    if (random() % 2 == 0) apply({false, place, change.bytes.substr(done, length)}, content);
    done += length;
  }
}

std::string StateDisk::contentAfter(const File& file, Unsynced unsynced, std::mt19937& random) {
  std::string content = file.durable;
  if (unsynced == Unsynced::kLost) return content;
  for (const Change& change : file.pending) {
    if (unsynced == Unsynced::kKept) {
      apply(change, content);
    } else if (!change.resize) {
      applySectors(change, content, random);
    } else if (random() % 2 == 0) {
      apply(change, content);
    }
  }
  return content;
}

void StateDisk::layOut(const std::string& directory, Unsynced unsynced,
                       std::mt19937& random) const {
  fs::remove_all(directory);
  fs::create_directories(directory);
  Names names = durable_;
  std::size_t kept = 0;
  if (unsynced == Unsynced::kKept) kept = pending_names_.size();
  if (unsynced == Unsynced::kMixed) kept = random() % (pending_names_.size() + 1);
  for (std::size_t i = 0; i < kept; ++i) apply(pending_names_[i], names);
  for (const auto& [name, file] : names) {
    const fs::path path = fs::path(directory) / name;
    if (path.filename() == kReserve) continue;
    if (file == kDirectory) {
      fs::create_directories(path);
      continue;
    }
    if (!fs::exists(path.parent_path())) continue;  // its directory did not get there
    std::ofstream(path, std::ios::binary)
        << contentAfter(files_[static_cast<std::size_t>(file)], unsynced, random);
  }
}

}  // namespace spacekeep::system_test
