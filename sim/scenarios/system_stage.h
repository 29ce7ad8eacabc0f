// Thread safety: belongs to the schedule of one life.
//
// The cast of one life: sets the world up, starts the daemon in it, plays the actions of the plan,
// waits until everybody has been served, and notes down what is left.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "sim/scenarios/stage_services.h"
#include "sim/scenarios/system_life.h"
#include "sim/world/world.h"
#include "support/queues/waiting.h"

namespace spacekeep::sim {

class SystemStage {
 public:
  SystemStage(SystemRun& run, unsigned number, LifeOfDaemon& life, Lasting& lasting);
  /// Notes down what is left, also when the life was cut off.
  ~SystemStage();
  SystemStage(const SystemStage&) = delete;
  SystemStage& operator=(const SystemStage&) = delete;

  void play();

 private:
  void setUpDisk();
  void setUpVolumes();
  void addBadDescriptor(const BadDescriptor& descriptor);
  void startDaemon();
  void startActions();
  void waitForEverybody();
  void takeDown();
  void noteDown();

  /// It is waited for in the end.
  void keepCall(const std::shared_ptr<ClientCall>& call);
  void perform(const PlannedAction& action);
  void act(const CallAction& action);
  void act(const SpaceAction& action);
  void act(const LowSpaceAction& action);
  void act(const DailyAction& action);
  void act(const ClockAction& action);
  void act(const DiskAction& action);
  void act(const ServiceAction& action);

  SystemRun& run_;
  const unsigned number_;
  LifeOfDaemon& life_;
  Lasting& lasting_;
  World world_;
  StageServices services_;
  rt::Thread daemon_;
  bool noted_down_ = false;
  CountingSemaphore action_done_{0};
  std::size_t actions_ = 0;
  rt::Mutex mutex_;
  // Protected by mutex_.
  std::vector<std::shared_ptr<ClientCall>> calls_;
};

}  // namespace spacekeep::sim
