// Thread safety: one thread.
//
// The processes of the soak, inside the sandbox.
#pragma once

#include <array>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "soak/processes.h"

namespace soak {

inline constexpr const char* kSocket = "/run/spacekeep/spacekeep.sock";
inline constexpr const char* kQuietPeer = "/tmp/quiet-peer.sock";
inline constexpr const char* kFloodedPeer = "/tmp/flooded-peer.sock";
inline constexpr const char* kClientsProgress = "/tmp/clients.progress";
inline constexpr const char* kProbeLog = "/tmp/probe.times";
/// In the order in which the probe numbers them.
inline constexpr std::array<const char*, 3> kProbed = {kSocket, kQuietPeer, kFloodedPeer};

class World {
 public:
  /// The daemon, the bare peers, and the probe that times calls to them.
  void startPeers();
  void startServices();
  void startClients(double seconds);
  /// The hostile client, for a time.
  void startFlood(const std::string& socket, const std::string& kind, double seconds);

  /// Starts again the services that crashed on purpose. Anything else that has ended is a problem.
  void lookAfter();
  /// Waits until the clients have ended by themselves, or tells that they have not.
  void waitForClients();
  /// How many purges and queries of the honest clients have been answered so far.
  [[nodiscard]] static long answersOfClients();
  void addProblem(const std::string& problem) { problems_.push_back(problem); }

  [[nodiscard]] pid_t daemon() const { return daemon_.pid(); }
  [[nodiscard]] int crashes() const { return crashes_; }
  [[nodiscard]] const std::vector<std::string>& problems() const { return problems_; }
  /// How many different services the answers to a query of each volume name. None when one is not
  /// answered.
  [[nodiscard]] static std::optional<std::size_t> servicesInQueries();

 private:
  struct Crashing {
    std::string prefix;
    Process process;
    double restart_at_seconds = 0;
  };

  static void writeRules();
  void startCrashing(Crashing& crashing) const;
  void lookAfterCrashing(Crashing& crashing);
  void mustRun(Process& process, const std::string& name);

  Process daemon_;
  Process quiet_peer_;
  Process flooded_peer_;
  Process probe_;
  Process clients_;
  Process flood_;
  std::vector<Process> services_;
  std::vector<Crashing> crashing_;
  int crashes_ = 0;
  std::vector<std::string> problems_;
};

}  // namespace soak
