// Puts the content of a file into the client state. Usage: bench-set-text SOCKET KEY FILE
#include <fstream>
#include <iterator>
#include <string>

#include "bench/calls.h"

int main(int count, char** arguments) {
  if (count != 4) return 2;
  std::ifstream file(arguments[3]);
  const std::string text{std::istreambuf_iterator<char>(file), {}};
  bench::setState(bench::connectBus(arguments[1]).get(), arguments[2], text.c_str());
}
