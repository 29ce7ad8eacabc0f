// Thread safety: constants.
//
// The D-Bus error names in use, as the D-Bus specification and its reference implementation have
// them.
#pragma once

namespace spacekeep::ipc {

inline constexpr const char* kErrorAccessDenied = "org.freedesktop.DBus.Error.AccessDenied";
inline constexpr const char* kErrorDisconnected = "org.freedesktop.DBus.Error.Disconnected";
inline constexpr const char* kErrorFailed = "org.freedesktop.DBus.Error.Failed";
inline constexpr const char* kErrorInconsistentMessage =
    "org.freedesktop.DBus.Error.InconsistentMessage";
inline constexpr const char* kErrorInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";
inline constexpr const char* kErrorLimitsExceeded = "org.freedesktop.DBus.Error.LimitsExceeded";
inline constexpr const char* kErrorNotSupported = "org.freedesktop.DBus.Error.NotSupported";
inline constexpr const char* kErrorUnknownInterface = "org.freedesktop.DBus.Error.UnknownInterface";
inline constexpr const char* kErrorUnknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
inline constexpr const char* kErrorUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";

}  // namespace spacekeep::ipc
