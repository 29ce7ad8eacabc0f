#include "sdk/failure.h"

#include <fmt/core.h>

#include <string_view>

namespace spacekeep::sdk {
namespace {

struct KindOfName {
  std::string_view name;
  ErrorKind kind;
};

// The names that the D-Bus specification gives its standard errors.
constexpr KindOfName kKinds[] = {
    {"org.freedesktop.DBus.Error.UnknownMethod", ErrorKind::kNotSupported},
    {"org.freedesktop.DBus.Error.UnknownInterface", ErrorKind::kNotSupported},
    {"org.freedesktop.DBus.Error.UnknownObject", ErrorKind::kNotSupported},
    {"org.freedesktop.DBus.Error.NotSupported", ErrorKind::kNotSupported},
    {"org.freedesktop.DBus.Error.AccessDenied", ErrorKind::kNotAllowed},
    {"org.freedesktop.DBus.Error.AuthFailed", ErrorKind::kNotAllowed},
    {"org.freedesktop.DBus.Error.Disconnected", ErrorKind::kDisconnected},
    {"org.freedesktop.DBus.Error.NoServer", ErrorKind::kDisconnected},
    {"org.freedesktop.DBus.Error.NoReply", ErrorKind::kDisconnected},
    {"org.freedesktop.DBus.Error.InvalidArgs", ErrorKind::kInvalidArgument},
    {"org.freedesktop.DBus.Error.InvalidSignature", ErrorKind::kInvalidArgument},
};

ErrorKind kindOf(std::string_view name) {
  for (const auto& entry : kKinds) {
    if (entry.name == name) return entry.kind;
  }
  return ErrorKind::kFailed;
}

}  // namespace

Error failureOf(const ipc::Error& error, std::string_view operation) {
  const ErrorKind kind = kindOf(error.name);
  if (kind == ErrorKind::kNotSupported) {
    return {kind, fmt::format("the daemon does not offer {} ({})", operation, error.text)};
  }
  return {kind, fmt::format("{} failed: {} ({})", operation, error.text, error.name)};
}

}  // namespace spacekeep::sdk
