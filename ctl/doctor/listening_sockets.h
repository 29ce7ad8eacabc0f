// Thread safety: constant after construction.
//
// The unix sockets at which somebody listens, as the kernel lists them: to find out about a socket
// without connecting to it, since that would start the service behind it.
#pragma once

#include <set>
#include <string>
#include <string_view>

namespace spacekeep::ctl::doctor {

/// The paths of listening sockets in a table like /proc/net/unix (unix(7)).
[[nodiscard]] std::set<std::string> listeningPathsIn(std::string_view table);

class ListeningSockets {
 public:
  /// Reads the table of this process's network namespace.
  ListeningSockets();

  /// False when the table could not be read.
  [[nodiscard]] bool known() const { return known_; }
  /// Compared by the name and the directory it stands in: whoever listens may know the directory by
  /// another path.
  [[nodiscard]] bool hasServiceSocket(const std::string& path) const;

 private:
  bool known_ = false;
  std::set<std::string> names_;  // the last two components
};

}  // namespace spacekeep::ctl::doctor
