// Thread safety: every member may be called from any thread; replies may run on any thread.
//
// The interface by which clients look up what the daemon has done. It stands beside the client
// interface, on the same object of the same connection.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "support/ipc/served.h"

namespace spacekeep {

/// "com.quorvel.SpacekeepHistoryProtocol".
[[nodiscard]] const ipc::InterfaceDescription& spacekeepHistoryInterface();

/// The client interface with the one for the history beside it: all that a client finds.
[[nodiscard]] const ipc::InterfaceDescription& spacekeepClientInterfaces();

class SpacekeepHistoryProtocol {
 public:
  /// No dictionary means that the request was refused.
  using HistoryReply = std::function<void(ipc::OptionalDictionary)>;
  /// Gets, in words, why the history cannot be read.
  using HistoryFailure = std::function<void(std::string why)>;

  virtual ~SpacekeepHistoryProtocol() = default;

  /// A page of entries, newest first; history/page.h says what is asked and answered. Exactly one of
  /// the two runs.
  virtual void clientHistory(Dictionary info, HistoryReply reply, HistoryFailure failed) = 0;
};

/// Serves `exported` too, where `served` serves the client interface. Does not keep it alive.
void serveHistory(ipc::ServedInterface& served, std::weak_ptr<SpacekeepHistoryProtocol> exported);

}  // namespace spacekeep
