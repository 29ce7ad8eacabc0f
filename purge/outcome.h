// Thread safety: both objects are confined to the purge operation's collection_queue, but for the
// members that say otherwise. Replies of services write them from several threads at once, so every
// access goes through that queue.
//
// The outcome of a purge under construction, with one record per urgency.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "support/values/value.h"

namespace spacekeep {

/// What happened at one urgency.
class UrgencyRecord {
 public:
  void set(const std::string& key, Value value);
  /// A service that is asked several times keeps its last answer.
  void setReported(const std::string& service_id, std::uint64_t amount_bytes);
  [[nodiscard]] Dictionary snapshot() const;

 private:
  Dictionary fields_;
  std::optional<Dictionary> reporting_services_;
};

class PurgeOutcome {
 public:
  explicit PurgeOutcome(Dictionary request) : fields_(std::move(request)) {}

  void set(const char* key, Value value);
  /// Drops everything and says why the request was refused.
  void replaceWithError(const char* error_text);
  /// The record may still change afterwards: late replies are booked where they belong.
  void attach(std::string key, std::shared_ptr<const UrgencyRecord> record);
  /// The outcome with its records as they stand.
  [[nodiscard]] Dictionary snapshot() const;

  /// Sets what the freed amount is measured from. Before the first request is queued.
  void beginMeasuring(std::uint64_t freespace_begin_bytes);
  /// The part of the outcome from which the freed amount is computed. May be read from any thread
  /// once measuring has begun.
  [[nodiscard]] const Dictionary& measure() const { return measure_; }

 private:
  Dictionary fields_;
  std::vector<std::pair<std::string, std::shared_ptr<const UrgencyRecord>>> records_;
  Dictionary measure_;  // constant once measuring has begun
};

}  // namespace spacekeep
