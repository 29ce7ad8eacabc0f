// Thread safety: for one thread.
//
// The services that descriptor files declare, read as the daemon reads them.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::ctl {

/// One descriptor file that declares a service.
struct DeclaredService {
  std::string path;  ///< of the descriptor
  std::string id;
  bool purges = false;
  bool periodic = false;
  bool do_not_query = false;
  Dictionary descriptor = {};

  /// Whether queries ask it.
  [[nodiscard]] bool isQueried() const { return purges && !do_not_query; }
};

struct UnusedDescriptor {
  std::string path;
  std::string reason;
  bool forbidden = false;  ///< only this user cannot read it
};

struct Declarations {
  std::vector<DeclaredService> services;  ///< in the order of the scan; an ID may stand there twice
  std::vector<UnusedDescriptor> unused;
  std::vector<std::string> unseen_directories;  ///< that this user cannot list
};

/// The directories of descriptors below `root` ("" is the root itself).
[[nodiscard]] std::vector<std::string> descriptorDirectories(const std::string& root);

/// What stands in them. Directories below them are none of the unused.
[[nodiscard]] Declarations readDeclarations(const std::string& root);

/// The socket of a declared service; empty when the ID is no safe file name.
[[nodiscard]] std::string socketOf(const std::string& services_directory, const std::string& id);

/// Of several with one ID the last, which is the one that counts.
[[nodiscard]] std::map<std::string, DeclaredService> servicesById(const Declarations& declarations);

}  // namespace spacekeep::ctl
