// Thread safety: run() is for the host's supervising thread; the rest of the object is private.
//
// Keeps a service checked in: connect, check in, serve until a connection ends, pause, again.
#pragma once

#include <spacekeep/service.h>

#include <cstdint>
#include <memory>
#include <string>

#include "sdk/engine.h"
#include "sdk/host_control.h"
#include "sdk/served_service.h"

namespace spacekeep::sdk {

class CheckInLoop {
 public:
  CheckInLoop(std::string id, CheckInOptions options, Engine& engine,
              std::shared_ptr<HostControl> control, std::shared_ptr<ServedService> served);

  /// Until the control is told to stop.
  void run();

 private:
  struct Session;

  /// One connection to the daemon from its beginning to its end; answers why it ended.
  std::string runSession();
  void startCheckIn(const std::shared_ptr<Session>& session);
  std::string awaitAnswer(Session& session);
  std::string serveUntilLost(Session& session);
  [[nodiscard]] std::string whyOver(const Session& session) const;
  [[nodiscard]] Dictionary checkInInfo() const;
  void pauseAfter(const std::string& why);

  const std::string id_;
  const CheckInOptions options_;
  Engine& engine_;
  const std::shared_ptr<HostControl> control_;
  const std::shared_ptr<ServedService> served_;
  unsigned failures_ = 0;  ///< tries in a row without a time of steady serving
};

}  // namespace spacekeep::sdk
