#include "soak/samples.h"

#include <unistd.h>

#include <filesystem>
#include <sstream>
#include <string>
#include <system_error>

#include "soak/processes.h"

namespace soak {
namespace {

/// The number behind "name:" in a file of such lines.
double fieldOf(const std::string& text, const std::string& name) {
  const std::size_t found = text.find(name + ":");
  return found == std::string::npos ? 0
                                    : std::strtod(text.c_str() + found + name.size() + 1, nullptr);
}

double cpuSeconds(const std::string& stat) {
  // The name in parentheses may hold anything; 11 fields stand between it and the user time.
  std::istringstream rest(stat.substr(stat.rfind(')') + 1));
  std::string skipped;
  for (int i = 0; i < 11; ++i) rest >> skipped;
  double user_ticks = 0;
  double system_ticks = 0;
  rest >> user_ticks >> system_ticks;
  return (user_ticks + system_ticks) / static_cast<double>(::sysconf(_SC_CLK_TCK));
}

double entriesIn(const std::string& directory) {
  double entries = 0;
  std::error_code error;
  for (std::filesystem::directory_iterator it(directory, error), end; !error && it != end;
       it.increment(error)) {
    ++entries;
  }
  return entries;
}

}  // namespace

Sample sampleOf(pid_t pid) {
  const std::string process = "/proc/" + std::to_string(pid);
  const std::string memory = readFile(process + "/smaps_rollup");
  return {.at_seconds = monotonicSeconds(),
          .rss_kib = fieldOf(memory, "Rss"),
          .pss_kib = fieldOf(memory, "Pss"),
          .descriptors = entriesIn(process + "/fd"),
          .threads = fieldOf(readFile(process + "/status"), "Threads"),
          .cpu_seconds = cpuSeconds(readFile(process + "/stat"))};
}

}  // namespace soak
