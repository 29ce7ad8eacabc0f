#include <fmt/core.h>
#include <spacekeep/client.h>
#include <unistd.h>

#include "ctl/commands.h"
#include "ctl/doctor/doctor_report.h"
#include "ctl/doctor/groups.h"

namespace spacekeep::ctl {
namespace doctor {

std::vector<Group> examine(const Place& place, const CommonOptions& common) {
  Contact contact{.common = common};
  const Declarations declarations = readDeclarations(place.root);
  std::vector<Group> groups;
  groups.push_back(daemonGroup(place, contact));
  groups.push_back(rightsGroup(place, contact));
  groups.push_back(descriptorsGroup(place, declarations));
  groups.push_back(servicesGroup(place, declarations, contact));
  groups.push_back(stateGroup(place, contact));
  groups.push_back(settingsGroup(place, contact));
  groups.push_back(dailyGroup(place, contact));
  groups.push_back(volumesGroup(place, contact));
  return groups;
}

}  // namespace doctor

ExitCode runDoctor(const CommonOptions& common, const DoctorOptions& options) {
  const bool usual = common.socket_path == sdk::kDefaultSocketPath;
  const auto place = doctor::placeAt(options.root, usual ? "" : common.socket_path);
  const auto groups = doctor::examine(place, common);
  fmt::print("{}", common.json ? doctor::jsonOf(groups) + "\n"
                               : doctor::textOf(groups, styleOf(STDOUT_FILENO)));
  return doctor::countOf(groups, doctor::Severity::kProblem) == 0 ? ExitCode::kDone
                                                                  : ExitCode::kChecksFailed;
}

}  // namespace spacekeep::ctl
