// Thread safety: one test at a time.
//
// A disk as a power cut leaves it: what the recorder (tests/programs/state_recorder.cc) wrote down
// is played step by step, and at any step the disk can be laid out in a directory without what was
// not durable by then.
#pragma once

#include <cstdint>
#include <map>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "tests/programs/state_trace_format.h"

namespace spacekeep::system_test {

struct TraceStep {
  TraceHeader header;
  std::string first;
  std::string second;
  std::uint64_t end;  ///< offset in the trace behind this record
};

[[nodiscard]] std::vector<TraceStep> readTrace(const std::string& path);

/// What becomes of changes that were not durable when the power went.
enum class Unsynced {
  kLost,   ///< none of them is there
  kKept,   ///< all are
  kMixed,  ///< any of them, by sectors of 512 bytes; of names, the first few
};

class StateDisk {
 public:
  /// Starts with what is below `directory` now, all of it durable. Steps name the files as the
  /// recorded program did: below `recorded_as`.
  StateDisk(const std::string& directory, std::string recorded_as);

  void play(const TraceStep& step);
  /// Writes the files as they are after a cut into `directory`, which is emptied first.
  void layOut(const std::string& directory, Unsynced unsynced, std::mt19937& random) const;

 private:
  struct Change {
    bool resize = false;
    std::uint64_t offset = 0;
    std::string bytes;
  };
  struct File {
    std::string durable;
    std::vector<Change> pending;
  };
  struct NameChange {
    std::string remove;
    std::string add;
    int file = kNoFile;
  };
  using Names = std::map<std::string, int>;
  static constexpr int kNoFile = -1;
  static constexpr int kDirectory = -2;

  [[nodiscard]] std::string within(const std::string& path) const;
  [[nodiscard]] File* fileOf(const TraceHeader& header);
  void created(const TraceHeader& header, const std::string& name);
  void synced(const TraceStep& step);
  void syncNames(const std::string& directory);
  void change(NameChange change);
  static void apply(const NameChange& change, Names& names);
  static void apply(const Change& change, std::string& content);
  [[nodiscard]] static std::string contentAfter(const File& file, Unsynced unsynced,
                                                std::mt19937& random);
  static void applySectors(const Change& change, std::string& content, std::mt19937& random);

  const std::string recorded_as_;
  std::vector<File> files_;
  std::map<std::uint64_t, int> by_inode_;
  Names now_;
  Names durable_;
  std::vector<NameChange> pending_names_;
};

}  // namespace spacekeep::system_test
