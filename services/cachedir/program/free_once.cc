#include <cstdio>

#include "ctl/size_text.h"
#include "services/cachedir/program/modes.h"
#include "services/cachedir/program/stop_signals.h"

namespace spacekeep::cachedir {
namespace {

/// A file name may hold anything; a line of output holds one file.
std::string printable(const std::string& path) {
  std::string text;
  for (const char c : path) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 0x20 || byte == 0x7f || c == '\\') {
      char escaped[5];
      std::snprintf(escaped, sizeof escaped, "\\x%02x", byte);
      text += escaped;
    } else {
      text += c;
    }
  }
  return text;
}

void printProblems(const std::vector<std::string>& problems) {
  for (const std::string& problem : problems) std::fprintf(stderr, "%s\n", problem.c_str());
}

void printLeft(const Tally& left) {
  for (std::size_t i = 0; i < kLeftWords.size(); ++i) {
    if (left.counts[i] == 0) continue;
    std::fprintf(stderr, "left, %s: %llu\n", std::string(kLeftWords[i]).c_str(),
                 static_cast<unsigned long long>(left.counts[i]));
  }
}

}  // namespace

ExitCode freeOnce(CacheCleaner& cleaner, const Options& options) {
  const StopSignals signals([&cleaner] { cleaner.cancel(); });
  const bool dry_run = options.mode == Mode::kDryRun;
  const FreeResult result =
      cleaner.free({.amount = options.amount,
                    .urgency = options.urgency,
                    .volume = options.volume,
                    .dry_run = dry_run},
                   [](const TakenFile& file) {
                     std::printf("%llu\t%s\n", static_cast<unsigned long long>(file.bytes),
                                 printable(file.path).c_str());
                   });
  std::fflush(stdout);
  printProblems(result.problems);
  printLeft(result.left);
  std::fprintf(stderr, "%s %llu bytes (%s) in %llu files%s\n", dry_run ? "would free" : "freed",
               static_cast<unsigned long long>(result.bytes), ctl::printSize(result.bytes).c_str(),
               static_cast<unsigned long long>(result.files),
               result.cancelled ? ", stopped early" : "");
  return result.bytes >= options.amount ? ExitCode::kDone : ExitCode::kLessThanAsked;
}

ExitCode printEstimate(const CacheCleaner& cleaner, const Options& options) {
  const Estimate estimate = cleaner.estimate(options.volume);
  printProblems(estimate.problems);
  for (std::size_t i = 0; i < estimate.bytes.size(); ++i) {
    std::printf("urgency %zu: %llu bytes (%s) in %llu files\n", i + 1,
                static_cast<unsigned long long>(estimate.bytes[i]),
                ctl::printSize(estimate.bytes[i]).c_str(),
                static_cast<unsigned long long>(estimate.files[i]));
  }
  return ExitCode::kDone;
}

}  // namespace spacekeep::cachedir
