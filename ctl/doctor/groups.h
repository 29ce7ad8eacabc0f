// Thread safety: for one thread.
//
// The things that the doctor looks at. Nothing is changed by that.
#pragma once

#include <string>
#include <vector>

#include "ctl/declared_services.h"
#include "ctl/doctor/contact.h"
#include "ctl/doctor/finding.h"
#include "ctl/doctor/place.h"
#include "support/access/entitlement_rules.h"
#include "support/volumes/space_source.h"

namespace spacekeep::ctl::doctor {

/// The socket, and whether the daemon answers there within three seconds; fills `contact`.
[[nodiscard]] Group daemonGroup(const Place& place, Contact& contact);
/// The rule files, and what this user may do by them.
[[nodiscard]] Group rightsGroup(const Place& place, const Contact& contact);
/// The files that declare services.
[[nodiscard]] Group descriptorsGroup(const Place& place, const Declarations& declarations);
/// The services that are declared: their sockets, and whether they answer the daemon.
[[nodiscard]] Group servicesGroup(const Place& place, const Declarations& declarations,
                                  const Contact& contact);
[[nodiscard]] Group stateGroup(const Place& place, const Contact& contact);
/// The log level, and the settings that the daemon keeps.
[[nodiscard]] Group settingsGroup(const Place& place, const Contact& contact);
[[nodiscard]] Group dailyGroup(const Place& place, const Contact& contact);
[[nodiscard]] Group volumesGroup(const Place& place, const Contact& contact);
/// The same for given volumes.
[[nodiscard]] Group volumesGroupOf(const std::vector<VolumeSample>& samples);

/// All of them, in the order in which they stand here.
[[nodiscard]] std::vector<Group> examine(const Place& place, const CommonOptions& common);

}  // namespace spacekeep::ctl::doctor
