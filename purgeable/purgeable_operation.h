// Thread safety: every public member may be called from any thread; startOperation once.
//
// Tells how much space the services could free on a volume. Whom it has heard from lately it counts
// from memory; it asks the others, briefly and in parallel, and reads the sum back from memory.
// Whoever answers too late for this request is in memory for the next one.
//
// purgeable_operation.cc holds the course of one query, service_query.cc one service's part,
// query_wait.cc the wait for those in flight, recent_statistics.cc the memory.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "operations/operation.h"
#include "purgeable/recent_info.h"

namespace spacekeep {

class Spacekeep;

class SpacekeepPurgeableOperation : public SpacekeepOperation {
 public:
  /// The memory is in the state store of `daemon`.
  SpacekeepPurgeableOperation(Platform& platform, std::shared_ptr<Spacekeep> daemon)
      : SpacekeepOperation(platform), daemon_(std::move(daemon)) {}

  [[nodiscard]] bool initWithInfo(const Value& info, ServiceSnapshot services) override;

  /// Runs the whole query on the calling thread. `completion` gets the result once, before this
  /// returns.
  void startOperation(OperationCompletion completion) override;

  /// Does nothing: a query ends by its own time limits.
  void cancelOperation() override {}

  /// Adding notes the time and answers false. Without adding it answers whether the service opted
  /// out less than 120 seconds ago, and forgets one that did so earlier.
  bool optOutService(const std::string& service_id, bool add);

  /// Whom to ask and whom to count from memory: "SPACEKEEP_SERVICES_TO_QUERY" (array of IDs) and
  /// "SPACEKEEP_SERVICES_TO_COUNT" (ID to amount). Not from a task on the daemon's defaults_queue.
  [[nodiscard]] Dictionary cachedInfo(const Dictionary& info);
  /// Puts an answer into the memory; `info` holds "SPACEKEEP_VOLUME" and "SPACEKEEP_AMOUNT".
  /// Returns at once.
  void updateServiceStats(const std::string& service_id, Dictionary info);

 private:
  using Self = std::shared_ptr<SpacekeepPurgeableOperation>;
  using Record = std::shared_ptr<SpacekeepRecentInfo>;

  [[nodiscard]] Self self();

  /// What the memory holds, shared with it: there may be thousands of services.
  struct Recent {
    std::shared_ptr<const Dictionary> to_count;  ///< not null
    Array to_query;
  };
  enum class Wanted { kToCount, kToQueryAsWell };
  [[nodiscard]] static Dictionary infoOf(Recent recent);

  // The course of one query.
  [[nodiscard]] Recent recentAnswers(const Dictionary& info, Wanted wanted);
  void askServices(const Dictionary& working_copy, const Array& service_ids);
  [[nodiscard]] Dictionary resultFrom(const Dictionary& amounts) const;

  // One service's part.
  void queryService(const std::shared_ptr<SKService>& service,
                    const std::shared_ptr<const Dictionary>& working_copy);
  void bookAnswer(const std::string& service_id, const Dictionary& working_copy,
                  std::uint64_t start_ticks, const ipc::OptionalDictionary& answer);
  [[nodiscard]] Dictionary entryFor(const std::string& service_id, const Dictionary& working_copy,
                                    const ipc::OptionalDictionary& answer);

  // The wait for those in flight.
  void waitForServices();
  [[nodiscard]] bool nobodyInFlight() const;

  // The memory, on the daemon's defaults_queue.
  [[nodiscard]] Recent readStatistics(const Dictionary& info, Wanted wanted);
  void writeStatistics(const std::string& service_id, const Dictionary& info);
  [[nodiscard]] Record storedRecord() const;
  void storeValidated(std::int32_t code, const Record& record);
  using Freespace = std::function<std::uint64_t(const std::string& volume)>;
  [[nodiscard]] static std::int32_t validate(SpacekeepRecentInfo& record, Freespace freespace);
  [[nodiscard]] std::uint64_t freespaceOf(const std::string& volume) const;
  [[nodiscard]] Array servicesNotIn(const Dictionary& known) const;

  const std::shared_ptr<Spacekeep> daemon_;
  /// Key of the client state under which the memory stands; constant once initWithInfo is back.
  std::string memory_key_;
  /// When each service opted out. It lives no longer than this one request, on purpose. Confined to
  /// collection_queue().
  std::map<std::string, Date> opt_outs_;
};

}  // namespace spacekeep
