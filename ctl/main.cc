#include <variant>

#include "ctl/command_line.h"

int main(int argc, char** argv) {
  const auto parsed = spacekeep::ctl::parseCommandLine(argc, argv, SPACEKEEP_VERSION);
  if (const int* code = std::get_if<int>(&parsed)) return *code;
  return static_cast<int>(std::get<spacekeep::ctl::Command>(parsed)());
}
