#include "support/events/linux/power_supply.h"

#include <filesystem>
#include <fstream>
#include <system_error>

namespace spacekeep {
namespace {

std::string firstWordOf(const std::filesystem::path& file) {
  std::ifstream stream(file);
  std::string word;
  stream >> word;
  return word;
}

}  // namespace

bool onMainsPower(const std::string& directory) {
  bool has_battery = false;
  std::error_code error;
  for (std::filesystem::directory_iterator supply(directory, error), end; !error && supply != end;
       supply.increment(error)) {
    const std::string type = firstWordOf(supply->path() / "type");
    if (type == "Battery") {
      // Those of mice and headsets have the scope "Device".
      has_battery = has_battery || firstWordOf(supply->path() / "scope") != "Device";
    } else if (firstWordOf(supply->path() / "online") == "1") {
      return true;
    }
  }
  return !has_battery;
}

}  // namespace spacekeep
