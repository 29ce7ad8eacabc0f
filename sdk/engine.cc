#include "sdk/engine.h"

#include "support/logging/log.h"

namespace spacekeep::sdk {
namespace {

/// The layers below trace when a process has set up no logging, which is right for the daemon and
/// noise in somebody else's program. What matters to the program reaches it as values.
void keepQuietUnlessTheProgramLogs() {
  static LogHandle silent{0};
  if (getLogHandle() == nullptr) setLogHandle(&silent);
}

}  // namespace

Engine::Engine() { keepQuietUnlessTheProgramLogs(); }

}  // namespace spacekeep::sdk
