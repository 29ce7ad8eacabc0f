#include "sim/program/options.h"

#include <algorithm>
#include <charconv>

namespace spacekeep::sim {
namespace {

std::optional<std::uint64_t> numberIn(std::string_view text) {
  std::uint64_t number = 0;
  const char* end = text.data() + text.size();
  const auto [rest, error] = std::from_chars(text.data(), end, number);
  if (error != std::errc() || rest != end) return std::nullopt;
  return number;
}

/// "0,3,7"; none when that is no list of numbers.
std::optional<std::vector<std::size_t>> listIn(std::string_view text) {
  std::vector<std::size_t> list;
  while (!text.empty()) {
    const std::size_t comma = std::min(text.find(','), text.size());
    const auto number = numberIn(text.substr(0, comma));
    if (!number) return std::nullopt;
    list.push_back(static_cast<std::size_t>(*number));
    text.remove_prefix(std::min(comma + 1, text.size()));
  }
  std::sort(list.begin(), list.end());
  list.erase(std::unique(list.begin(), list.end()), list.end());
  return list;
}

bool applyNumber(Options& options, const std::string& name, std::uint64_t number) {
  if (name == "--seeds") {
    options.seeds = number;
  } else if (name == "--first") {
    options.first = number;
  } else if (name == "--jobs") {
    if (number == 0 || number > kMaxJobs) return false;
    options.jobs = static_cast<unsigned>(number);
  } else if (name == "--replay") {
    options.replay = number;
  } else if (name == "--schedule") {
    options.schedule = number;
  } else {
    return false;
  }
  return true;
}

bool apply(Options& options, const std::string& name, const std::string& value) {
  if (name == "--scenario") {
    options.scenario = value == "purge" ? Scenario::kPurge : Scenario::kSystem;
    return value == "purge" || value == "system";
  }
  if (name == "--without") {
    const auto list = listIn(value);
    if (list) options.without = *list;
    return list.has_value();
  }
  const auto number = numberIn(value);
  return number && applyNumber(options, name, *number);
}

}  // namespace

std::variant<Options, OptionError> parseOptions(const std::vector<std::string>& arguments) {
  Options options;
  for (std::size_t i = 0; i < arguments.size(); ++i) {
    if (arguments[i] == "--help" || arguments[i] == "-h") {
      options.help = true;
    } else if (arguments[i] == "--stop") {
      options.stop_at_first = true;
    } else if (i + 1 < arguments.size() && apply(options, arguments[i], arguments[i + 1])) {
      ++i;
    } else {
      return OptionError{"cannot use " + arguments[i] + ": see --help"};
    }
  }
  if (!options.without.empty() && !options.replay) {
    return OptionError{"--without goes with --replay: see --help"};
  }
  if (options.schedule != 0 && !options.replay) {
    return OptionError{"--schedule goes with --replay: see --help"};
  }
  if (options.schedule != 0 && options.scenario == Scenario::kPurge) {
    return OptionError{"--schedule goes with the system scenario: see --help"};
  }
  return options;
}

}  // namespace spacekeep::sim
