// Thread safety: for one thread.
//
// Asks the daemon which services answer it.
#pragma once

#include <optional>
#include <set>
#include <string>

#include "ctl/complaint.h"

namespace spacekeep::ctl::doctor {

struct AskedServices {
  std::string volume;                    ///< they were asked about
  std::set<std::string> answered;        ///< IDs
  bool refused = false;                  ///< this user may not ask
  std::optional<std::string> problem{};  ///< what went wrong otherwise
};

/// A query about the first local volume, and one more when somebody of `expected` was late.
[[nodiscard]] AskedServices askServices(const CommonOptions& common, const std::string& mount_table,
                                        const std::set<std::string>& expected);

}  // namespace spacekeep::ctl::doctor
