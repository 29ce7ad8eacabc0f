#include "services/cachedir/program/options.h"

#include <spacekeep/client.h>

#include <CLI/CLI.hpp>

#include "services/cachedir/program/size_option.h"

namespace spacekeep::cachedir {
namespace {

constexpr const char* kDescription =
    "Frees the files of cache directories, least recently used first.\n"
    "Without a mode it serves at the socket that the service manager hands over.\n"
    "Exit status: 0 done, 1 less could be freed than asked, 2 usage, 3 the rule file is bad,\n"
    "4 cannot serve.";

struct Flags {
  bool check_in = false;
  bool once = false;
  bool dry_run = false;
  bool estimate = false;
};

Mode modeOf(const Flags& flags) {
  if (flags.dry_run) return Mode::kDryRun;
  if (flags.once) return Mode::kOnce;
  if (flags.estimate) return Mode::kEstimate;
  return flags.check_in ? Mode::kCheckIn : Mode::kServeSocket;
}

}  // namespace

std::variant<Options, int> readCommandLine(int argc, char** argv) {
  Options options;
  options.socket_path = sdk::kDefaultSocketPath;
  Flags flags;
  std::string amount_text;
  CLI::App app(kDescription, "spacekeep-cachedir");
  app.set_version_flag("--version", "spacekeep-cachedir " SPACEKEEP_VERSION);
  app.add_option("--rules", options.rules_file, "The rule file, a property list")->required();
  auto* check_in =
      app.add_flag("--check-in", flags.check_in, "Serve by checking in with the daemon");
  auto* once = app.add_flag("--once", flags.once, "Free now, without a daemon, and end");
  auto* dry_run = app.add_flag("--dry-run", flags.dry_run,
                               "As --once, but delete nothing and say what would go");
  auto* estimate =
      app.add_flag("--estimate", flags.estimate, "Say what each urgency could free, and end");
  estimate->excludes(once)->excludes(dry_run)->excludes(check_in);
  check_in->excludes(once)->excludes(dry_run);
  auto* amount = app.add_option("--amount", amount_text,
                                "With --once or --dry-run: what to free, as 1000000, 500M, 1.5GiB");
  amount->check(sizeInto(options.amount));
  app.add_option("--urgency", options.urgency,
                 "With --once or --dry-run: 1, what has long been unused, to 4, all that is not in "
                 "use")
      ->check(CLI::Range(1, 4))
      ->capture_default_str();
  app.add_option("--volume", options.volume,
                 "With --once, --dry-run or --estimate: only directories on this volume (a mount "
                 "point)");
  app.add_option("--socket", options.socket_path, "With --check-in: the daemon's socket")
      ->capture_default_str();
  app.add_option("--stop-when-idle", options.stop_when_idle_seconds,
                 "At a handed-over socket: end after so many seconds without a request")
      ->check(CLI::Range(1, 1'000'000));
  try {
    app.parse(argc, argv);
    if ((flags.once || flags.dry_run) && amount->count() == 0) {
      throw CLI::RequiredError("--amount");
    }
  } catch (const CLI::ParseError& error) {
    // The parser has a number of its own for each kind of mistake; scripts want one.
    return app.exit(error) == 0 ? static_cast<int>(ExitCode::kDone)
                                : static_cast<int>(ExitCode::kUsage);
  }
  options.mode = modeOf(flags);
  return options;
}

}  // namespace spacekeep::cachedir
