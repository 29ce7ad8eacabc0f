#include "support/ipc/linux/wire_signature.h"

#include <cstddef>

namespace spacekeep::ipc {

namespace {

constexpr std::size_t kMaxBytes = 255;
constexpr int kMaxDepth = 32;
constexpr std::string_view kBasicTypes = "ybnqiuxtdsogh";

bool isBasic(char type) { return kBasicTypes.find(type) != std::string_view::npos; }

bool takeType(std::string_view& rest, int arrays, int structures);

/// What stands between the brackets of a structure.
bool takeMembers(std::string_view& rest, int arrays, int structures) {
  std::size_t members = 0;
  for (; !rest.empty() && rest[0] != ')'; ++members) {
    if (!takeType(rest, arrays, structures)) return false;
  }
  if (rest.empty() || members == 0) return false;
  rest.remove_prefix(1);
  return true;
}

/// A key of a basic type, and a value.
bool takeEntry(std::string_view& rest, int arrays, int structures) {
  if (rest.empty() || !isBasic(rest[0])) return false;
  rest.remove_prefix(1);
  if (!takeType(rest, arrays, structures) || rest.empty() || rest[0] != '}') return false;
  rest.remove_prefix(1);
  return true;
}

bool takeType(std::string_view& rest, int arrays, int structures) {
  if (rest.empty() || arrays > kMaxDepth || structures > kMaxDepth) return false;
  const char type = rest[0];
  rest.remove_prefix(1);
  if (isBasic(type) || type == 'v') return true;
  if (type == '(') return takeMembers(rest, arrays, structures + 1);
  if (type != 'a' || rest.empty()) return false;
  if (rest[0] != '{') return takeType(rest, arrays + 1, structures);
  rest.remove_prefix(1);
  return arrays < kMaxDepth && takeEntry(rest, arrays + 1, structures + 1);
}

}  // namespace

bool isWireSignature(std::string_view signature) {
  if (signature.size() > kMaxBytes) return false;
  while (!signature.empty()) {
    if (!takeType(signature, 0, 0)) return false;
  }
  return true;
}

}  // namespace spacekeep::ipc
