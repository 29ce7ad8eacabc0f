#include "ctl/command_line.h"

#include <spacekeep/client.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <map>
#include <memory>

#include "ctl/check_service/check_service.h"
#include "ctl/commands.h"
#include "ctl/help_layout.h"
#include "ctl/report/since.h"
#include "ctl/size_text.h"
#include "ctl/style.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

constexpr const char* kVolumeMeaning = "Mount point of a local volume";

/// All that a command line can say.
struct Options {
  CommonOptions common{.socket_path = sdk::kDefaultSocketPath, .json = false};
  PurgeOptions purge;
  std::string amount_text;
  std::string item_text;
  QueryOptions query;
  StateOptions state;
  VolumesOptions volumes;
  OneVolumeOptions one_volume;
  HistoryOptions history;
  DoctorOptions doctor;
  ReportOptions report;
  std::string since_text;
  std::string token;
  CheckServiceOptions check;
};
using SharedOptions = std::shared_ptr<Options>;

/// Checks a size and puts the bytes into `amount`.
CLI::Validator sizeInto(std::uint64_t& amount) {
  return {[&amount](std::string& text) -> std::string {
            const auto size = parseSize(text);
            if (const auto* error = std::get_if<SizeError>(&size)) return error->text;
            amount = std::get<std::uint64_t>(size);
            return amount == 0 ? "there is nothing to free in \"" + text + "\"" : "";
          },
          "SIZE", "size"};
}

CLI::Validator urgencyLevel() {
  return {[](std::string& text) -> std::string {
            if (text.size() == 1 && text[0] >= '1' && text[0] <= '4') return "";
            return "an urgency is 1, 2, 3 or 4, not \"" + text + "\"";
          },
          "LEVEL", "urgency"};
}

void addUrgency(CLI::App& command, std::optional<int>& urgency, const char* meaning) {
  command.add_option("--urgency", urgency, meaning)->option_text("LEVEL")->check(urgencyLevel());
}

using Run = ExitCode (*)(const Options& options);

/// `run` is what the tool does when this command is the one.
CLI::App& addCommand(CLI::App& app, const char* name, const char* about,
                     const SharedOptions& options, Command& chosen, Run run) {
  auto* command = app.add_subcommand(name, about);
  command->callback([&chosen, options, run] { chosen = [options, run] { return run(*options); }; });
  return *command;
}

void addPurge(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& purge = addCommand(
      app, "purge",
      "Ask the services to free space on a volume\n"
      "The mildest urgency comes first. The exit status is 0 only when the amount was reached.",
      options, chosen, [](const Options& o) { return runPurge(o.common, o.purge); });
  PurgeOptions& wanted = options->purge;
  purge.add_option("VOLUME", wanted.volume, kVolumeMeaning)->required();
  purge
      .add_option("AMOUNT", options->amount_text,
                  "What to free: 1000000, 500M, 1.5GiB (steps of 1024), 750MB (steps of 1000)")
      ->required()
      ->check(sizeInto(wanted.amount));
  addUrgency(purge, wanted.urgency,
             "Highest urgency to use: 1, give up what nobody will miss, to 4, give up all that can "
             "be given (default 3)");
  purge
      .add_option(
          "--timeout", wanted.timeout_seconds,
          "Seconds to wait for the services at each urgency, 1 to 300 (default 2 x urgency)")
      ->option_text("SECONDS")
      ->check(CLI::Range(1, 300));
  purge.add_option("--token", wanted.token, "Name of this purge for a cancel request")
      ->option_text("NAME");
  purge.add_flag("--wait-all", wanted.wait_all,
                 "Wait out every urgency even when the amount is reached");
}

void addQuery(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& query = addCommand(
      app, "query",
      "Ask how much space could be freed on a volume\n"
      "Nothing is freed. The daemon counts answers that are fresh enough from memory and asks the "
      "other services; that takes 10 seconds at most, and longer only behind other queries.",
      options, chosen, [](const Options& o) { return runQuery(o.common, o.query); });
  query.add_option("VOLUME", options->query.volume, kVolumeMeaning)->required();
  query.add_flag("--itemized", options->query.itemized,
                 "What each service could free, and whether it was asked just now");
  addUrgency(query, options->query.urgency,
             "Urgency to ask the services for, 1 to 4 (default 3); answers from memory stay as "
             "they are");
}

const std::map<std::string, ValueType>& valueTypes() {
  static const std::map<std::string, ValueType> types{
      {"string", ValueType::kString}, {"number", ValueType::kNumber}, {"bool", ValueType::kBool},
      {"size", ValueType::kSize},     {"json", ValueType::kJson},
  };
  return types;
}

CLI::Validator valueTypeInto(ValueType& type) {
  return {[&type](std::string& text) -> std::string {
            const auto found = valueTypes().find(text);
            if (found == valueTypes().end()) {
              return "a type is string, number, bool, size or json, not \"" + text + "\"";
            }
            type = found->second;
            return "";
          },
          "TYPE", "type"};
}

void addStateSet(CLI::App& state, const SharedOptions& options, Command& chosen,
                 std::string& type_text) {
  auto& set = addCommand(
      state, "set",
      "Give a key a value\n"
      "true and false become booleans, 12 and 0.5 numbers, 250M a number of bytes, everything else "
      "a string. Before a text that begins with \"-\" write --, as in: set KEY -- -v",
      options, chosen, [](const Options& o) { return runStateSet(o.common, o.state); });
  set.add_option("KEY", options->state.key, "The key")->required();
  set.add_option("VALUE", options->state.value, "The value")->required();
  set.add_option("--type", type_text, "Read VALUE as this: string, number, bool, size or json")
      ->option_text("TYPE")
      ->check(valueTypeInto(options->state.type));
  set.add_flag("--force", options->state.force,
               "Send a value that the daemon would not work with all the same");
}

void addState(CLI::App& app, const SharedOptions& options, Command& chosen,
              std::string& type_text) {
  auto* state = app.add_subcommand("state", "Read and change the settings that the daemon keeps");
  auto& get =
      addCommand(*state, "get",
                 "Print the value of a key\n"
                 "The exit status is 6 when it has none.",
                 options, chosen, [](const Options& o) { return runStateGet(o.common, o.state); });
  get.add_option("KEY", options->state.key, "The key")->required();
  addStateSet(*state, options, chosen, type_text);
  auto& unset = addCommand(
      *state, "unset", "Take the value of a key away, so that its default holds", options, chosen,
      [](const Options& o) { return runStateUnset(o.common, o.state); });
  unset.add_option("KEY", options->state.key, "The key")->required();
  auto& list =
      addCommand(*state, "list", "Show all keys with their values and what they mean", options,
                 chosen, [](const Options& o) { return runStateList(o.common, o.state); });
  list.add_flag("--names", options->state.names, "Only the keys, one per line");
  state->require_subcommand(0, 1);
}

void addVolumes(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& volumes =
      addCommand(app, "volumes",
                 "Show the local volumes and how near they are to being short of space\n"
                 "Works without a daemon too; then the thresholds are the defaults.",
                 options, chosen, [](const Options& o) { return runVolumes(o.common, o.volumes); });
  volumes.add_flag("--names", options->volumes.names, "Only the mount points, one per line");
}

void addStatus(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& status = addCommand(
      app, "status",
      "Show how the volumes are, and who could give how much\n"
      "Nothing is freed. The services are asked at each urgency by itself; what the daemon has in "
      "memory for it counts.",
      options, chosen, [](const Options& o) { return runStatus(o.common, o.one_volume); });
  status.add_option("--volume", options->one_volume.volume, "Only this volume")
      ->option_text("PATH");
}

void addExplain(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& explain = addCommand(
      app, "explain",
      "Say in words why a volume is short of space or not, and what could be done\n"
      "Nothing is freed. Names those who could give something, and those who give nothing with "
      "the reason.",
      options, chosen, [](const Options& o) { return runExplain(o.common, o.one_volume); });
  explain.add_option("VOLUME", options->one_volume.volume,
                     std::string(kVolumeMeaning) + " (default: all of them)");
}

/// Checks a moment and puts it into `since_ns`.
CLI::Validator sinceInto(std::optional<std::int64_t>& since_ns) {
  return {[&since_ns](std::string& text) -> std::string {
            const auto since = parseSince(text, rt::wallClockNs());
            if (const auto* error = std::get_if<SinceError>(&since)) return error->text;
            since_ns = std::get<std::int64_t>(since);
            return "";
          },
          "WHEN", "since"};
}

void addReport(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& report = addCommand(
      app, "report",
      "Write a page with what was freed, by whom, and what could be freed now\n"
      "Nothing is freed. The page is one file for any browser; it loads nothing and can be mailed. "
      "What was freed is shown to those who may ask for it, which is root unless a rule says "
      "otherwise.",
      options, chosen, [](const Options& o) { return runReport(o.common, o.report); });
  report
      .add_option("--html", options->report.file, "File to make or replace; - for standard output")
      ->option_text("FILE")
      ->required();
  report.add_option("--volume", options->report.volume, "Only this volume")->option_text("PATH");
  report
      .add_option("--since", options->since_text,
                  "Leave out what is older: 12h, 7d, 4w, 2026-11-01, \"2026-11-01 14:30\"")
      ->option_text("WHEN")
      ->check(sinceInto(options->report.since_ns));
}

void addHistory(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& history = addCommand(
      app, "history",
      "Show what the daemon has done\n"
      "Who asked for space, how much was asked for and freed, who gave it, and why it fell short. "
      "Newest first.",
      options, chosen, [](const Options& o) { return runHistory(o.common, o.history); });
  HistoryOptions& wanted = options->history;
  history.add_option("--volume", wanted.volume, "Only this volume")->option_text("PATH");
  history
      .add_option("--since", options->since_text,
                  "Leave out what is older: 12h, 7d, 4w, 2026-11-01, \"2026-11-01 14:30\"")
      ->option_text("WHEN")
      ->check(sinceInto(wanted.since_ns));
  history.add_option("--limit", wanted.limit, "Most entries, 1 to 10000 (default 20)")
      ->option_text("NUMBER")
      ->check(CLI::Range(1, 10'000));
}

void addDoctor(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& doctor = addCommand(
      app, "doctor",
      "Find what is wrong with the daemon's surroundings, and say what to do\n"
      "Changes nothing, and works without a daemon. Root sees more than others. The exit status "
      "is 7 when there is a problem; advice alone does not change it.",
      options, chosen, [](const Options& o) { return runDoctor(o.common, o.doctor); });
  doctor
      .add_option("--root", options->doctor.root, "Look at the system whose root directory this is")
      ->option_text("DIR")
      ->check(CLI::ExistingDirectory);
}

void addCancel(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& cancel =
      addCommand(app, "cancel", "Send a cancel request; the daemon takes it and stops nothing",
                 options, chosen, [](const Options& o) { return runCancel(o.common, o.token); });
  cancel.add_option("TOKEN", options->token, "The purge's token")->required();
}

void addCheckService(CLI::App& app, const SharedOptions& options, Command& chosen) {
  auto& check = addCommand(
      app, "check-service",
      "Run a service through what the daemon asks of it\n"
      "Says in words what is wrong. Needs no daemon: this tool stands in for it, starts COMMAND "
      "and asks it to give up all the data that it can give up on the volume. The exit status is 7 "
      "when a check failed. Write -- before COMMAND.",
      options, chosen, [](const Options& o) { return runCheckService(o.common, o.check); });
  CheckServiceOptions& wanted = options->check;
  check.add_option("COMMAND", wanted.command,
                   "The service and its arguments; {socket} stands for the daemon's socket, which "
                   "is also in SPACEKEEP_SOCKET");
  check
      .add_option("--volume", wanted.volume,
                  "Mount point of the volume that holds the service's data")
      ->option_text("PATH")
      ->required();
  check.add_option("--endpoint", wanted.endpoint, "Socket of a service that listens already")
      ->option_text("SOCKET");
  check
      .add_option("--data", wanted.data, "Where the service keeps its data, to tell what vanished")
      ->option_text("PATH");
  check
      .add_option("--in-use", wanted.in_use,
                  "File to hold open, locked and mapped during purges, or directory of such")
      ->option_text("PATH");
  check
      .add_option("--item", options->item_text,
                  "Size of the largest item, where more than a single file goes at a time")
      ->option_text("SIZE")
      ->check(sizeInto(wanted.item_bytes));
  check
      .add_option("--patience", wanted.patience_seconds,
                  "Seconds after which an answer counts as missing, 1 to 600 (default 20)")
      ->option_text("SECONDS")
      ->check(CLI::Range(1, 600));
  check.add_flag("--yes", wanted.yes, "Give up the data without asking first");
  check.add_flag("--no-purge", wanted.no_purge, "Only the checks that give up no data");
}

void addCommonOptions(CLI::App& app, CommonOptions& common, const std::string& version) {
  app.set_version_flag("--version", "spacekeepctl " + version, "Show the version");
  app.add_flag("--json", common.json, "Write the result as one JSON object");
  app.add_option("--socket", common.socket_path,
                 std::string("The daemon's socket (default ") + sdk::kDefaultSocketPath + ")")
      ->option_text("PATH");
  app.set_help_flag("-h,--help", "Show this, also after a command");
  app.formatter(std::make_shared<HelpLayout>(styleOf(STDOUT_FILENO).columns));
  app.footer(
      "Exit status: 0 done, 1 the purge did not reach its amount, 2 wrong usage, 3 daemon not "
      "reachable, 4 refused, 5 failed, 6 the key has no value, 7 a check failed. See "
      "spacekeepctl(1).");
  app.fallthrough();
}

/// CLI11 has a number of its own for each kind of mistake; scripts want one.
int usageCode(const CLI::App& app, const CLI::ParseError& error) {
  return app.exit(error) == 0 ? 0 : static_cast<int>(ExitCode::kUsage);
}

int commandMissing(const CLI::App& app) {
  const bool in_state = app.got_subcommand("state");
  std::fprintf(stderr, "A command is required: %s\nRun with --help for more information.\n",
               in_state ? "state get, state set, state unset or state list"
                        : "status, explain, history, report, doctor, purge, query, state, volumes, "
                          "cancel or check-service");
  return static_cast<int>(ExitCode::kUsage);
}

}  // namespace

std::variant<Command, int> parseCommandLine(int argc, const char* const* argv,
                                            const std::string& version) {
  CLI::App app("Asks the Spacekeep daemon for space, and how it is doing.", "spacekeepctl");
  const auto options = std::make_shared<Options>();
  Command chosen;
  std::string type_text;
  addCommonOptions(app, options->common, version);
  addStatus(app, options, chosen);
  addExplain(app, options, chosen);
  addHistory(app, options, chosen);
  addReport(app, options, chosen);
  addDoctor(app, options, chosen);
  addPurge(app, options, chosen);
  addQuery(app, options, chosen);
  addState(app, options, chosen, type_text);
  addVolumes(app, options, chosen);
  addCancel(app, options, chosen);
  addCheckService(app, options, chosen);
  app.require_subcommand(0, 1);  // "none" is told below, so that an unknown word is named
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return usageCode(app, error);
  }
  if (!chosen) return commandMissing(app);
  return chosen;
}

}  // namespace spacekeep::ctl
