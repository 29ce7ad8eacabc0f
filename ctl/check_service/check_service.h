// Thread safety: for one thread.
//
// spacekeepctl check-service: runs a service through what the daemon asks of it, and says in words
// what is wrong.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "ctl/complaint.h"

namespace spacekeep::ctl {

inline constexpr std::uint64_t kDefaultPatienceSeconds = 20;

struct CheckServiceOptions {
  std::string volume;
  std::vector<std::string> command;
  std::string endpoint;          ///< the socket at which the service listens, in place of a command
  std::string data;              ///< where the service keeps its files; may be empty
  std::string in_use;            ///< a file or directory to use during purges; may be empty
  std::uint64_t item_bytes = 0;  ///< the largest item, where items are more than single files
  std::uint64_t patience_seconds = kDefaultPatienceSeconds;
  bool yes = false;
  bool no_purge = false;
};

[[nodiscard]] ExitCode runCheckService(const CommonOptions& common,
                                       const CheckServiceOptions& options);

}  // namespace spacekeep::ctl
