// Thread safety: a pure function.
//
// Which system service a process belongs to, from the text of its /proc/<pid>/cgroup (cgroups(7)).
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace spacekeep::access {

/// Whether the text tells where the service manager has put the process at all. It does not where
/// there is no unified hierarchy, and not of a process outside of this one's cgroup namespace.
[[nodiscard]] bool tellsUnit(std::string_view cgroup_text);

/// The unit that the service manager itself put the process into: the first component below the
/// slices, when it is a service. What follows it is under the control of that service (a user's
/// own manager names groups as it likes) and is not looked at. None for scopes, kernel threads,
/// and where the text does not tell it.
[[nodiscard]] std::optional<std::string> systemUnitFromCgroup(std::string_view cgroup_text);

}  // namespace spacekeep::access
