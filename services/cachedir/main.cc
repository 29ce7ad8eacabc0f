#include <cstdio>
#include <memory>
#include <variant>

#include "services/cachedir/index/cache_index.h"
#include "services/cachedir/program/modes.h"
#include "services/cachedir/program/stop_signals.h"
#include "support/logging/linux/standard_error.h"
#include "support/logging/log.h"

int main(int argc, char** argv) {
  using namespace spacekeep::cachedir;
  const auto read = readCommandLine(argc, argv);
  if (const int* code = std::get_if<int>(&read)) return *code;
  const Options& options = std::get<Options>(read);

  static spacekeep::LogHandle log;  // problems, no tracing
  spacekeep::setLogHandle(&log);
  StopSignals::block();
  const bool serves = options.mode == Mode::kCheckIn || options.mode == Mode::kServeSocket;
  // A single run ends when nobody reads it any more, a service goes on.
  if (serves) spacekeep::logToStandardError();

  auto rules = readRules(options.rules_file);
  if (const auto* error = std::get_if<RuleError>(&rules)) {
    std::fprintf(stderr, "%s\n", error->text.c_str());
    return static_cast<int>(ExitCode::kBadRules);
  }
  CacheCleaner::Surroundings surroundings;
  if (serves) surroundings.index = std::make_shared<CacheIndex>();  // a single look needs none
  const auto cleaner = std::make_shared<CacheCleaner>(
      std::move(std::get<Rules>(rules)), CacheCleaner::Bounds{}, std::move(surroundings));
  switch (options.mode) {
    case Mode::kOnce:
    case Mode::kDryRun:
      return static_cast<int>(freeOnce(*cleaner, options));
    case Mode::kEstimate:
      return static_cast<int>(printEstimate(*cleaner, options));
    case Mode::kCheckIn:
    case Mode::kServeSocket:
      return static_cast<int>(serve(cleaner, options));
  }
  return static_cast<int>(ExitCode::kUsage);
}
