// Thread safety: InMemoryDisk may be used from any thread; a suite is confined to one queue at a
// time, as every suite is.
//
// Preferences suites whose disk is a map. What was set and not synchronized is lost with the suite.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "sim/world/trace.h"
#include "support/preferences/preferences_suite.h"
#include "support/runtime/runtime.h"
#include "support/values/plist.h"

namespace spacekeep::sim {

/// What is on disk, by suite name and key.
class InMemoryDisk {
 public:
  using Contents = std::map<std::string, Value, std::less<>>;

  InMemoryDisk() = default;
  /// Tells the trace of each write, and takes none once `is_over` (null: never).
  InMemoryDisk(Trace& trace, bool (*is_over)()) : trace_(&trace), is_over_(is_over) {}

  [[nodiscard]] Contents read(const std::string& suite) const;
  void write(const std::string& suite, Contents contents);
  /// What was on it before the world began.
  void restore(const std::string& suite, Contents contents);
  [[nodiscard]] std::uint64_t writes() const;
  /// From now on a write takes that long, and lands in the middle of it.
  void setWriteTimeNs(std::uint64_t duration_ns);
  [[nodiscard]] std::uint64_t writeTimeNs() const;
  /// From now on opening a suite fails, or works again.
  void refuseToOpen(bool refuse);
  /// From now on synchronize() and refresh() fail with this text; empty: works again.
  void failSynchronize(std::string reason);
  /// From now on a value whose property list is larger than this is given up when it is to be
  /// written, as one is that no property list can hold.
  void limitValuesTo(std::size_t bytes);
  [[nodiscard]] std::size_t largestValue() const;
  [[nodiscard]] bool refusesToOpen() const;
  [[nodiscard]] std::optional<std::string> synchronizeFailure() const;
  /// For the trace: a write of the suite came to nothing.
  void refused(const std::string& suite, const std::string& reason);

 private:
  Trace* trace_ = nullptr;
  bool (*is_over_)() = nullptr;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::map<std::string, Contents> suites_;
  std::uint64_t writes_ = 0;
  std::uint64_t write_time_ns_ = 0;
  bool refuse_to_open_ = false;
  std::string failure_;
  std::size_t largest_value_ = kMaxPlistBytes;
};

class InMemoryPreferencesSuite final : public PreferencesSuite {
 public:
  InMemoryPreferencesSuite(InMemoryDisk& disk, std::string name);

  [[nodiscard]] std::optional<std::string> synchronize() override;
  [[nodiscard]] std::optional<std::string> refresh() override;
  [[nodiscard]] const Value* find(std::string_view key) const override;
  void set(std::string_view key, std::optional<Value> value) override;
  void discard(std::string_view key) override;

 private:
  [[nodiscard]] bool giveUpWhatIsTooLarge();

  InMemoryDisk& disk_;
  const std::string name_;
  InMemoryDisk::Contents known_;
  std::map<std::string, std::optional<Value>, std::less<>> unwritten_;
};

}  // namespace spacekeep::sim
