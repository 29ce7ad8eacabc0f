#include <spacekeep/client.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <string>
#include <variant>

#include "ctl/commands.h"
#include "ctl/size_text.h"

namespace {

using spacekeep::ctl::CommonOptions;
using spacekeep::ctl::ExitCode;
using spacekeep::ctl::PurgeOptions;

/// Checks a size and puts the bytes into `amount`.
CLI::Validator sizeInto(std::uint64_t& amount) {
  return {[&amount](std::string& text) -> std::string {
            const auto size = spacekeep::ctl::parseSize(text);
            if (const auto* error = std::get_if<spacekeep::ctl::SizeError>(&size)) {
              return error->text;
            }
            amount = std::get<std::uint64_t>(size);
            return amount == 0 ? "there is nothing to free in \"" + text + "\"" : "";
          },
          "SIZE", "size"};
}

void addPurge(CLI::App& app, PurgeOptions& options, std::string& amount_text) {
  auto* purge = app.add_subcommand("purge", "Ask the services to free space on a volume");
  purge->add_option("VOLUME", options.volume, "Mount point of a local volume")->required();
  purge
      ->add_option("AMOUNT", amount_text,
                   "What to free: 1000000, 500M, 1.5GiB (steps of 1024), 750MB (steps of 1000)")
      ->required()
      ->check(sizeInto(options.amount));
  purge
      ->add_option("--urgency", options.urgency,
                   "Highest urgency to use: 1, give up what nobody will miss, to 4, give up all "
                   "that can be given (default 3)")
      ->check(CLI::Range(1, 4));
  purge
      ->add_option("--timeout", options.timeout_seconds,
                   "Seconds to wait for the services at each urgency (default 2 x urgency)")
      ->check(CLI::Range(1, 300));
  purge->add_option("--token", options.token, "Name of this purge for a cancel request");
  purge->add_flag("--wait-all", options.wait_all,
                  "Wait out every urgency even when the amount is reached");
}

/// CLI11 has a number of its own for each kind of mistake; scripts want one.
int usageCode(const CLI::App& app, const CLI::ParseError& error) {
  return app.exit(error) == 0 ? 0 : static_cast<int>(ExitCode::kUsage);
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app(
      "Asks the Spacekeep daemon for space.\n"
      "Exit status: 0 reached, 1 not reached, 2 usage, 3 daemon not reachable, 4 refused, "
      "5 failed.",
      "spacekeepctl");
  CommonOptions common{.socket_path = spacekeep::sdk::kDefaultSocketPath, .json = false};
  PurgeOptions purge;
  std::string amount_text;
  std::string token;
  app.set_version_flag("--version", "spacekeepctl " SPACEKEEP_VERSION);
  app.add_flag("--json", common.json, "Write the result as one JSON object");
  app.add_option("--socket", common.socket_path, "The daemon's socket")->capture_default_str();
  app.require_subcommand(0, 1);  // "none" is told below, so that an unknown word is named
  app.fallthrough();
  addPurge(app, purge, amount_text);
  app.add_subcommand("cancel", "Send a cancel request; the daemon takes it and stops nothing")
      ->add_option("TOKEN", token, "The purge's token")
      ->required();
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return usageCode(app, error);
  }
  if (app.get_subcommands().empty()) {
    std::fputs("A command is required: purge or cancel\nRun with --help for more information.\n",
               stderr);
    return static_cast<int>(ExitCode::kUsage);
  }
  const ExitCode code = app.got_subcommand("purge") ? spacekeep::ctl::runPurge(common, purge)
                                                    : spacekeep::ctl::runCancel(common, token);
  return static_cast<int>(code);
}
