#include <cstdio>
#include <string>
#include <vector>

#include "sim/program/jobs.h"
#include "sim/program/options.h"
#include "sim/program/play.h"

int main(int count, char** arguments) {
  namespace sim = spacekeep::sim;
  const auto parsed = sim::parseOptions(std::vector<std::string>(arguments + 1, arguments + count));
  if (const auto* error = std::get_if<sim::OptionError>(&parsed)) {
    std::fprintf(stderr, "spacekeep-sim: %s\n", error->text.c_str());
    return 2;
  }
  const auto& options = std::get<sim::Options>(parsed);
  if (options.help) {
    std::fputs(sim::kHelp, stdout);
    return 0;
  }
  if (options.replay) return sim::replaySeed(options) ? 0 : 1;
  return sim::playInProcesses(options);
}
