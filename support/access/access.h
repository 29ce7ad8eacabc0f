// Thread safety: every member may be called from any thread.
//
// Who may do what, as the rest of the system asks it.
#pragma once

#include <initializer_list>
#include <string_view>

#include "support/ipc/served.h"

namespace spacekeep {

class Access {
 public:
  virtual ~Access() = default;
  /// True when the peer holds every named entitlement. False for no connection.
  [[nodiscard]] virtual bool connectionIsEntitled(
      ipc::PeerConnection* connection, std::initializer_list<std::string_view> entitlements) = 0;
};

}  // namespace spacekeep
