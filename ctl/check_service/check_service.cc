#include "ctl/check_service/check_service.h"

#include <fmt/core.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <deque>
#include <fstream>
#include <iostream>
#include <optional>
#include <utility>

#include "ctl/check_service/check_progress.h"
#include "ctl/check_service/check_report.h"
#include "ctl/check_service/checks.h"
#include "ctl/check_service/patience.h"
#include "ctl/check_service/private_folder.h"
#include "ctl/text_layout.h"
#include "ctl/volume_space.h"

namespace spacekeep::ctl {
namespace {

constexpr const char* kReached = "reached";
constexpr std::uint64_t kTimeToStartNs = 30 * kSecondNs;
constexpr std::size_t kLastLines = 10;

std::optional<dev_t> deviceOf(const std::string& path) {
  struct stat facts {};
  return stat(path.c_str(), &facts) == 0 ? std::optional(facts.st_dev) : std::nullopt;
}

/// What is wrong with the command line as a whole, empty when nothing.
std::string problemOf(const CheckServiceOptions& options) {
  if (options.command.empty() == options.endpoint.empty()) {
    return "name either the command of the service after --, or its socket with --endpoint";
  }
  const auto volume = deviceOf(options.volume);
  if (!volume || !measuredSpaceOf(options.volume)) {
    return options.volume + " is no volume that could be looked at";
  }
  for (const std::string& path : {options.data, options.in_use}) {
    if (path.empty()) continue;
    const auto device = deviceOf(path);
    if (!device) return path + " does not exist";
    if (device != volume) return path + " is not on the volume " + options.volume;
  }
  return "";
}

bool isYes(const std::string& answer) { return answer == "y" || answer == "yes"; }

/// Whether the service may be made to give up its data.
bool mayPurge(const CheckServiceOptions& options) {
  if (options.yes || options.no_purge) return true;
  if (isatty(STDIN_FILENO) != 1 || isatty(STDERR_FILENO) != 1) return false;
  fmt::print(stderr,
             "This asks the service to give up all the data that it can give up on {}.\n"
             "With --no-purge it is only asked what it could. Go on? [y/N] ",
             options.volume);
  std::fflush(stderr);
  std::string answer;
  std::getline(std::cin, answer);
  return isYes(answer);
}

class CheckRun {
 public:
  CheckRun(const CommonOptions& common, const CheckServiceOptions& options, Subject& subject)
      : common_(common), options_(options), subject_(subject), style_(styleOf(STDOUT_FILENO)) {}

  ExitCode run() {
    report_.volume = options_.volume;
    if (reach()) {
      describe();
      runChecks();
    }
    return conclude();
  }

 private:
  [[nodiscard]] bool progressWanted() const { return !common_.json && isatty(STDERR_FILENO) == 1; }

  void add(std::string name, Finding finding) {
    report_.results.push_back({std::move(name), std::move(finding)});
    if (common_.json) return;
    fmt::print("{}", lineOf(report_.results.back(), style_));
    std::fflush(stdout);
  }

  bool reach() {
    std::string why;
    {
      const CheckProgress progress(progressWanted(), kReached, style_.columns);
      why = subject_.reach(kTimeToStartNs);
    }
    report_.service = subject_.name();
    const bool reached = why.empty();
    const std::string how =
        subject_.checkedIn() ? "it checked in as " + harmless(subject_.name()) : "it listens";
    add(kReached, reached ? fine(how) : failed("The service cannot be asked: " + why + "."));
    return reached;
  }

  /// What the service said of itself.
  void describe() { purges_ = !subject_.checkedIn() || truthAt(subject_.checkIn().info, "PURGE"); }

  [[nodiscard]] std::optional<Finding> reasonToSkip(const Check& check) {
    const bool asks = !check.summing_up;
    if (options_.no_purge && check.purges) return notApplicable("Left out by --no-purge.");
    if (!purges_ && check.purges) {
      return notApplicable(
          "It checked in without \"PURGE\", so the daemon never asks it to free anything.");
    }
    if (!asks) return std::nullopt;
    const std::string why = subject_.reachAgain();
    if (why.empty()) return std::nullopt;
    return notApplicable("The service cannot be reached any more: " + why + ".");
  }

  void runChecks() {
    SpaceMeter space(options_.volume,
                     options_.data.empty() ? std::nullopt : std::optional(options_.data));
    space.learnNoise();
    Bench bench{.subject = subject_,
                .space = space,
                .in_use = options_.in_use,
                .item_bytes = options_.item_bytes,
                .held = {},
                .offered = {},
                .share_limit = {}};
    for (const Check& check : allChecks()) {
      const auto skipped = reasonToSkip(check);
      if (skipped) {
        add(check.name, *skipped);
        continue;
      }
      // Only from the first purge on, because a query may rightly count what nobody uses.
      if (check.purges && !bench.held && !options_.in_use.empty()) {
        bench.held.emplace(options_.in_use);
      }
      add(check.name, [&] {
        const CheckProgress progress(progressWanted(), check.name, style_.columns);
        return check.run(bench);
      }());
    }
  }

  ExitCode conclude() const {
    const bool all_well = report_.count(Outcome::kFailed) == 0;
    if (common_.json) {
      fmt::print("{}\n", jsonOf(report_));
    } else {
      fmt::print("\n{}\n", summaryOf(report_));
      std::fflush(stdout);
      if (!all_well) showOutput();
    }
    return all_well ? ExitCode::kDone : ExitCode::kChecksFailed;
  }

  void showOutput() const {
    std::ifstream stream(subject_.outputPath());
    std::deque<std::string> lines;
    for (std::string line; std::getline(stream, line);) {
      lines.push_back(line);
      if (lines.size() > kLastLines) lines.pop_front();
    }
    if (lines.empty()) return;
    fmt::print(stderr, "\nThe last that the service wrote:\n");
    for (const auto& line : lines) fmt::print(stderr, "  {}\n", harmless(line));
  }

  const CommonOptions& common_;
  const CheckServiceOptions& options_;
  Subject& subject_;
  const Style style_;
  CheckReport report_;
  bool purges_ = true;
};

}  // namespace

ExitCode runCheckService(const CommonOptions& common, const CheckServiceOptions& options) {
  if (const auto problem = problemOf(options); !problem.empty()) {
    return complain(common, ExitCode::kUsage, problem);
  }
  if (!mayPurge(options)) {
    return complain(common, ExitCode::kUsage,
                    "the check asks the service to give up all the data that it can give up; say "
                    "that this is fine with --yes, or leave those checks out with --no-purge");
  }
  const PrivateFolder folder;
  if (folder.path().empty()) {
    return complain(common, ExitCode::kFailed, "cannot make a folder for the check in /tmp");
  }
  Subject subject({.command = options.command,
                   .endpoint = options.endpoint,
                   .patience_ns = options.patience_seconds * kSecondNs},
                  folder.path());
  if (const std::string why = subject.begin(); !why.empty()) {
    return complain(common, ExitCode::kUnreachable, why);
  }
  return CheckRun(common, options, subject).run();
}

}  // namespace spacekeep::ctl
