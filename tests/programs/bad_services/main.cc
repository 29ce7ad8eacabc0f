// A service with one planted fault, for tests of the checks that service authors run. Usage:
// bad-service FAULT VOLUME FOLDER
#include <cstdio>

#include "tests/programs/bad_services/raw_service.h"

int main(int count, char** arguments) {
  const auto fault = count == 4 ? bad_services::faultNamed(arguments[1]) : std::nullopt;
  if (!fault) return std::fprintf(stderr, "usage: bad-service FAULT VOLUME FOLDER\n"), 2;
  bad_services::RawService(*fault, arguments[2], arguments[3]).run();
}
