#include "services/command/program/options.h"

#include <spacekeep/client.h>

#include <CLI/CLI.hpp>

#include "services/cachedir/program/size_option.h"

namespace spacekeep::command {
namespace {

constexpr const char* kDescription =
    "Frees caches by rules: by their owners' own tools, by age, or as whole directories.\n"
    "Without a mode it serves at the socket that the service manager hands over.\n"
    "Exit status: 0 done, 1 less could be freed than asked, 2 usage, 3 a rule file is bad,\n"
    "4 cannot serve.";

struct Flags {
  bool check_in = false;
  bool once = false;
  bool dry_run = false;
  bool estimate = false;
  bool describe = false;

  [[nodiscard]] int count() const {
    return int{check_in} + int{once} + int{dry_run} + int{estimate} + int{describe};
  }
  [[nodiscard]] Mode mode() const {
    if (check_in) return Mode::kCheckIn;
    if (once) return Mode::kOnce;
    if (dry_run) return Mode::kDryRun;
    if (estimate) return Mode::kEstimate;
    return describe ? Mode::kDescribe : Mode::kServeSocket;
  }
};

void addRuleOptions(CLI::App& app, Options& options) {
  app.add_option("--rules", options.rules.files, "A rule file, a property list");
  app.add_option("--rules-dir", options.rules.folders,
                 "A directory of rule files (*.plist); a file in a later directory replaces single "
                 "keys of the one of the same name in an earlier one");
  app.add_option("--only", options.rules.only,
                 "Of the directories only the rule of this name (the file's, without .plist)");
  app.add_flag(
      "--user", options.user,
      "The caches of the user who runs this: fills in ~/ and $XDG_CACHE_HOME/ and the like");
  app.add_option(
      "--id", options.id,
      "The service ID; otherwise the rule's, or com.quorvel.spacekeep.caches for several. "
      "With --user the user's number is added");
}

void addModes(CLI::App& app, Flags& flags) {
  app.add_flag("--check-in", flags.check_in, "Serve by checking in with the daemon");
  app.add_flag("--once", flags.once, "Free now, without a daemon, and end");
  app.add_flag("--dry-run", flags.dry_run,
               "As --once, but take nothing and say what would go; without --amount all of it");
  app.add_flag("--estimate", flags.estimate,
               "A table of what each rule could free at each urgency, and end");
  app.add_flag("--describe", flags.describe,
               "What each rule takes at each urgency, what is lost, and who says so, and end");
}

}  // namespace

std::variant<Options, int> readCommandLine(int argc, char** argv) {
  Options options;
  options.socket_path = sdk::kDefaultSocketPath;
  Flags flags;
  std::string amount_text;
  CLI::App app(kDescription, "spacekeep-command");
  app.set_version_flag("--version", "spacekeep-command " SPACEKEEP_VERSION);
  addRuleOptions(app, options);
  addModes(app, flags);
  auto* amount = app.add_option("--amount", amount_text,
                                "With --once or --dry-run: what to free, as 1000000, 500M, 1.5GiB");
  amount->check(cachedir::sizeInto(options.amount));
  app.add_option("--urgency", options.urgency,
                 "With --once or --dry-run: 1, what nobody will miss, to 4, all that is not in use")
      ->check(CLI::Range(1, 4))
      ->capture_default_str();
  app.add_option("--volume", options.volume,
                 "With --once, --dry-run or --estimate: only what lies on this volume (a mount "
                 "point)");
  app.add_option("--socket", options.socket_path, "With --check-in: the daemon's socket")
      ->capture_default_str();
  app.add_option("--allow-user", options.allowed_user,
                 "At a handed-over socket: this user may call, too");
  app.add_option("--stop-when-idle", options.stop_when_idle_seconds,
                 "At a handed-over socket: end after so many seconds without a request")
      ->check(CLI::Range(1, 1'000'000));
  try {
    app.parse(argc, argv);
    if (flags.count() > 1) throw CLI::ExcludesError("one mode", "another");
    if (flags.once && amount->count() == 0) throw CLI::RequiredError("--amount");
    if (options.rules.files.empty() && options.rules.folders.empty()) {
      throw CLI::RequiredError("--rules or --rules-dir");
    }
  } catch (const CLI::ParseError& error) {
    // The parser has a number of its own for each kind of mistake; scripts want one.
    return app.exit(error) == 0 ? static_cast<int>(ExitCode::kDone)
                                : static_cast<int>(ExitCode::kUsage);
  }
  options.mode = flags.mode();
  return options;
}

}  // namespace spacekeep::command
