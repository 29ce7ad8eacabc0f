// Thread safety: one test at a time.
//
// Runs spacekeep-cachedir, and writes rule files for it.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace spacekeep::cachedir {

inline const std::string kCachedir = SPACEKEEP_BUILD_DIR "/services/spacekeep-cachedir";

struct Ended {
  int status = -1;  // exit status, or 128 + the signal
  std::string out;
  std::string err;
};

/// The program with these arguments; killed when it is still running at the end of its scope.
class Program {
 public:
  /// `listening` becomes the descriptor that a service manager hands over, none when negative.
  explicit Program(const std::vector<std::string>& arguments, int listening = -1,
                   const std::string& program = kCachedir);
  ~Program();
  Program(const Program&) = delete;
  Program& operator=(const Program&) = delete;

  void signal(int number) const;
  /// What it has written to standard error so far.
  [[nodiscard]] std::string errSoFar() const;
  [[nodiscard]] Ended wait();

 private:
  std::string out_;
  std::string err_;
  pid_t pid_ = -1;
};

[[nodiscard]] Ended runProgram(const std::vector<std::string>& arguments);

/// The status, as in Ended, of the program whose standard error is a pipe that nobody reads.
[[nodiscard]] int statusWithoutAReader(const std::string& program,
                                       const std::vector<std::string>& arguments);

/// Writes an XML property list with `content` in its dictionary; answers its path.
[[nodiscard]] std::string ruleFile(const std::string& content);
/// Rules for one directory with the default ages.
[[nodiscard]] std::string ruleFileFor(const std::string& directory);

}  // namespace spacekeep::cachedir
