#include "ctl/declared_services.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <variant>

#include "daemon/descriptors.h"
#include "daemon/names.h"
#include "support/files/linux/linux_directory_reader.h"
#include "support/ipc/linux/connector.h"
#include "support/logging/log.h"

namespace spacekeep::ctl {
namespace {

bool isDirectory(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

bool isForbidden(const std::string& path, int mode) {
  return ::access(path.c_str(), mode) != 0 && errno == EACCES;
}

/// The daemon's code tells what it does when no log is set up. Here that would be in the way.
void keepQuiet() {
  static LogHandle silent{.level = 0};
  if (getLogHandle() == nullptr) setLogHandle(&silent);
}

DeclaredService declaredBy(const std::string& path, const SKService& service,
                           const Dictionary& descriptor) {
  return {.path = path,
          .id = service.ID,
          .purges = service.doesPurge(),
          .periodic = service.doesPeriodic(),
          .do_not_query = service.doNotQuery(),
          .descriptor = descriptor};
}

void readFile(LinuxDirectoryReader& files, const std::string& path, Declarations& found) {
  const auto read = readDescriptor(files, path);
  if (const auto* error = std::get_if<DescriptorError>(&read)) {
    found.unused.push_back({.path = path,
                            .reason = error->reason.value_or("it holds no dictionary"),
                            .forbidden = isForbidden(path, R_OK)});
    return;
  }
  const auto& descriptor = std::get<Dictionary>(read);
  DescribedServices described;
  collectService(descriptor, described);
  for (const auto& [id, service] : described.services) {
    found.services.push_back(declaredBy(path, *service, descriptor));
  }
  if (described.services.empty()) {
    found.unused.push_back(
        {.path = path, .reason = "it has no SPACEKEEP_ID, or one that is no string"});
  }
}

}  // namespace

std::vector<std::string> descriptorDirectories(const std::string& root) {
  std::vector<std::string> directories;
  for (std::string path : {kSystemDescriptors, kInternalDescriptors}) {
    path.pop_back();  // the last slash
    directories.push_back(root + path);
  }
  return directories;
}

Declarations readDeclarations(const std::string& root) {
  keepQuiet();
  LinuxDirectoryReader files;
  Declarations found;
  for (const auto& directory : descriptorDirectories(root)) {
    if (isForbidden(directory, R_OK | X_OK)) found.unseen_directories.push_back(directory);
    for (const auto& entry : files.entriesBelow(directory)) {
      const std::string path = directory + "/" + entry;
      if (!isDirectory(path)) readFile(files, path, found);
    }
  }
  return found;
}

std::string socketOf(const std::string& services_directory, const std::string& id) {
  const std::string name = ipc::declaredSocketName(id);
  return name.empty() ? name : services_directory + "/" + name;
}

std::map<std::string, DeclaredService> servicesById(const Declarations& declarations) {
  std::map<std::string, DeclaredService> services;
  for (const auto& service : declarations.services) services.insert_or_assign(service.id, service);
  return services;
}

}  // namespace spacekeep::ctl
