// Thread safety: the thread that drives a world calls its members; the load runs on its own threads.
//
// A sandbox in which everything goes on at once - purges, queries, check-ins, state writes - while
// the daemon comes and goes.
#pragma once

#include <spacekeep/client.h>
#include <spacekeep/service.h>

#include <atomic>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "tests/linux/system/sandbox.h"
#include "tests/linux/system/shelf_service.h"
#include "tests/linux/system/state_writer.h"

namespace spacekeep::system_test {

class LoadedWorld {
 public:
  /// What happened, over all the lives of the daemon.
  struct Counts {
    std::atomic<std::uint64_t> purges{0};     ///< answered under load
    std::atomic<std::uint64_t> queries{0};    ///< answered under load
    std::atomic<std::uint64_t> check_ins{0};  ///< of the service that comes and goes
    std::atomic<std::uint64_t> failures{0};   ///< answers under load that are neither good nor late
  };

  /// Worlds are made one after another, on the main thread.
  LoadedWorld();
  ~LoadedWorld();
  LoadedWorld(const LoadedWorld&) = delete;
  LoadedWorld& operator=(const LoadedWorld&) = delete;

  void startLoad();
  void startDaemon();
  /// False when it had ended by itself before the kill.
  bool killDaemon();
  /// The services that have run for longest start over, as a service manager would have them do:
  /// their pauses between tries have grown with each life of the daemon.
  void renewOneService();

  /// On a connection of its own, until the daemon has answered a read of the state. False after a
  /// minute.
  bool waitForFirstAnswer();
  /// Purges until every service has been asked since the start of the daemon and one purge has freed
  /// all that it was to free; each must free something. False after a minute.
  bool waitUntilAllServicesArePurged();
  /// A query whose answer names every service. False after a minute.
  bool waitForWholeQuery();

  [[nodiscard]] const Counts& counts() const { return counts_; }
  [[nodiscard]] std::uint64_t answeredWrites() const;
  [[nodiscard]] std::uint64_t lostWrites() const;
  [[nodiscard]] std::string daemonLog() const { return sandbox_.daemonLog(); }

 private:
  void addService(const std::string& id);
  void declareService(const std::string& id);
  [[nodiscard]] sdk::ServiceHost checkIn(std::size_t index) const;
  [[nodiscard]] std::unique_ptr<sdk::Client> connect() const;
  void runLoad(const std::function<bool(sdk::Client&)>& once);
  bool writeState(StateWriter& writer, sdk::Client& client);
  bool purgeALittle(sdk::Client& client);
  bool query(sdk::Client& client);
  void comeAndGo();
  bool book(const sdk::Reply& reply, std::atomic<std::uint64_t>& answered);
  bool purgeForAll();

  Sandbox sandbox_;
  Process daemon_;
  std::vector<std::string> ids_;
  std::vector<std::shared_ptr<ShelfService>> services_;
  std::vector<sdk::ServiceHost> hosts_;  ///< of services_, the declared one last
  std::size_t next_to_renew_ = 0;
  std::unique_ptr<sdk::Client> client_;  ///< of the driving thread, for the daemon of now
  std::deque<StateWriter> writers_;
  std::vector<std::thread> threads_;
  std::atomic<bool> stopping_{false};
  Counts counts_;
};

}  // namespace spacekeep::system_test
