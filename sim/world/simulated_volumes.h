// Thread safety: every member may be called from any thread.
//
// Volumes that exist in memory only: bytes free out of a size, and the moments at which space that
// was given up really comes back.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "sim/world/delay_line.h"
#include "sim/world/trace.h"
#include "support/runtime/runtime.h"
#include "support/volumes/volumes.h"

namespace spacekeep::sim {

class SimulatedVolumes final : public Volumes {
 public:
  SimulatedVolumes(Trace& trace, DelayLine& delays) : trace_(trace), delays_(delays) {}

  // Setting up and changing the world.
  /// Mounts it, last in mount order.
  void add(const std::string& volume, std::uint64_t size_bytes, std::uint64_t free_bytes);
  void remove(const std::string& volume);
  /// Somebody else takes space. Takes no more than there is; answers what was taken.
  std::uint64_t write(const std::string& volume, std::uint64_t bytes);
  /// Space comes back, at once or later (an open file, a journal commit). Never more than the size.
  void giveBack(const std::string& volume, std::uint64_t bytes, std::uint64_t after_ns = 0);
  void setFree(const std::string& volume, std::uint64_t free_bytes);
  void setLowSpace(std::vector<std::string> volumes);
  [[nodiscard]] std::uint64_t freeBytes(const std::string& volume) const;
  /// Given up, and not back yet.
  [[nodiscard]] std::uint64_t outstandingBytes(const std::string& volume) const;
  /// The last settings given, none when there were none yet. They decide nothing here: which volumes
  /// are short is what setLowSpace() says.
  [[nodiscard]] std::optional<LowSpaceSettings> lowSpaceSettings() const;

  [[nodiscard]] std::vector<std::string> getLocalVolumes() override;
  [[nodiscard]] std::vector<std::string> lowSpaceVolumes() override;
  [[nodiscard]] bool validateVolume(const Dictionary& info) override;
  [[nodiscard]] std::uint64_t volumeFreespace(const Value* volume) override;
  void setLowSpaceSettings(const LowSpaceSettings& settings) override;

 private:
  struct Volume {
    std::uint64_t size = 0;
    std::uint64_t free = 0;
    std::uint64_t outstanding = 0;
  };

  void addFree(const std::string& volume, std::uint64_t bytes);
  void addOutstanding(const std::string& volume, std::uint64_t bytes);
  void set(const std::string& volume, Volume& state, std::uint64_t free_bytes);

  Trace& trace_;
  DelayLine& delays_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::map<std::string, Volume> volumes_;
  std::vector<std::string> mount_order_;
  std::vector<std::string> low_space_;
  std::optional<LowSpaceSettings> low_space_settings_;
};

}  // namespace spacekeep::sim
