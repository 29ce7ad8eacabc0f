#include "sim/program/options.h"

#include <charconv>

namespace spacekeep::sim {
namespace {

std::optional<std::uint64_t> numberIn(const std::string& text) {
  std::uint64_t number = 0;
  const char* end = text.data() + text.size();
  const auto [rest, error] = std::from_chars(text.data(), end, number);
  if (error != std::errc() || rest != end) return std::nullopt;
  return number;
}

bool apply(Options& options, const std::string& name, std::uint64_t number) {
  if (name == "--seeds") {
    options.seeds = number;
  } else if (name == "--first") {
    options.first = number;
  } else if (name == "--jobs") {
    if (number == 0 || number > kMaxJobs) return false;
    options.jobs = static_cast<unsigned>(number);
  } else if (name == "--replay") {
    options.replay = number;
  } else {
    return false;
  }
  return true;
}

}  // namespace

std::variant<Options, OptionError> parseOptions(const std::vector<std::string>& arguments) {
  Options options;
  for (std::size_t i = 0; i < arguments.size(); ++i) {
    if (arguments[i] == "--help" || arguments[i] == "-h") {
      options.help = true;
      continue;
    }
    const auto number =
        i + 1 < arguments.size() ? numberIn(arguments[i + 1]) : std::optional<std::uint64_t>();
    if (!number || !apply(options, arguments[i], *number)) {
      return OptionError{"cannot use " + arguments[i] + ": see --help"};
    }
    ++i;
  }
  return options;
}

}  // namespace spacekeep::sim
