#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <optional>
#include <variant>

#include "services/cachedir/program/stop_signals.h"
#include "services/command/program/modes.h"
#include "support/logging/linux/standard_error.h"
#include "support/logging/log.h"

namespace {

using namespace spacekeep::command;

/// Each directory that a rule stands for is held open while it is looked at.
void allowManyDescriptors() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 8192);
  ::setrlimit(RLIMIT_NOFILE, &limit);
}

int fail(const std::string& text) {
  std::fprintf(stderr, "%s\n", text.c_str());
  return static_cast<int>(ExitCode::kBadRules);
}

ExitCode play(std::vector<Rule> rules, const UserFolders* folders, const Options& options) {
  switch (options.mode) {
    case Mode::kOnce:
    case Mode::kDryRun:
      return freeOnce(std::move(rules), folders, options);
    case Mode::kEstimate:
      return printTable(std::move(rules), folders, options);
    case Mode::kDescribe:
      return describe(rules);
    case Mode::kCheckIn:
    case Mode::kServeSocket:
      return serve(std::move(rules), folders, options);
  }
  return ExitCode::kUsage;
}

}  // namespace

int main(int argc, char** argv) {
  const auto read = readCommandLine(argc, argv);
  if (const int* code = std::get_if<int>(&read)) return *code;
  const Options& options = std::get<Options>(read);
  static spacekeep::LogHandle log;  // problems, no tracing
  spacekeep::setLogHandle(&log);
  spacekeep::cachedir::StopSignals::block();
  // A single run ends when nobody reads it any more, a service goes on.
  if (options.mode == Mode::kCheckIn || options.mode == Mode::kServeSocket) {
    spacekeep::logToStandardError();
  }
  allowManyDescriptors();

  std::optional<UserFolders> folders;
  if (options.user) {
    auto found = foldersOf(::geteuid());
    if (const auto* error = std::get_if<std::string>(&found)) return fail(*error);
    folders = std::move(std::get<UserFolders>(found));
    for (const auto& problem : folders->problems) std::fprintf(stderr, "%s\n", problem.c_str());
  }
  const UserFolders* user = folders ? &*folders : nullptr;
  auto rules = readRules(options.rules, user);
  if (const auto* error = std::get_if<spacekeep::cachedir::RuleError>(&rules)) {
    return fail(error->text);
  }
  return static_cast<int>(play(std::move(std::get<std::vector<Rule>>(rules)), user, options));
}
