// Thread safety: every public member may be called from any thread; startOperation once.
//
// Frees a requested number of bytes on one volume. Urgency by urgency it asks every purging service
// for an equal share of what is still missing and waits, for a bounded time, until they have
// answered. The freed amount is always what the volume shows, never what the services say; their
// sum is kept beside it for comparison.
//
// purge_operation.cc holds the course of one purge, urgency_loop.cc one urgency,
// service_request.cc one service's request, cancellation.cc and progress.cc the rest.
#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "operations/operation.h"
#include "purge/outcome.h"
#include "support/queues/waiting.h"
#include "support/runtime/guarded.h"

namespace spacekeep {

class SpacekeepPurgeOperation : public SpacekeepOperation {
 public:
  using SpacekeepOperation::SpacekeepOperation;

  [[nodiscard]] bool initWithInfo(const Value& info, ServiceSnapshot services) override;

  /// Runs the whole purge on the calling thread. `completion` (which may be empty) gets the answer
  /// of each service as it comes and, last before this returns, the outcome.
  void startOperation(OperationCompletion completion) override;

  /// Asks every service in flight to stop. Returns at once. Services keep their place in flight
  /// until their purge answer or the failure of their connection arrives.
  void cancelOperation() override;

  /// Offers `service` a share of what is missing at `urgency`. Returns at once.
  void queueServiceRequest(std::shared_ptr<SKService> service,
                           std::shared_ptr<PurgeOutcome> outcome, std::int32_t urgency,
                           std::shared_ptr<UrgencyRecord> record, OperationCompletion completion);

  /// Counts one pair of amounts: a ten-percent bucket and a byte total, named by `identifier`.
  void reportPercentageForAmountRequested(std::uint64_t requested_bytes, std::uint64_t purged_bytes,
                                          const std::string& identifier) const;

  /// What holds when the request does not name "SPACEKEEP_FINISH_EARLY". Before the start.
  void setFinishEarlyByDefault(bool finish_early);

  [[nodiscard]] bool cancel() const { return cancel_; }
  void setCancel(bool cancel) { cancel_ = cancel; }
  /// Bytes that the client asked to free.
  [[nodiscard]] std::uint64_t purge_amount_needed() const { return purge_amount_needed_; }
  void setPurge_amount_needed(std::uint64_t bytes) { purge_amount_needed_ = bytes; }
  /// Bytes that the services said they purged.
  [[nodiscard]] std::uint64_t purge_amount_reported() const { return purge_amount_reported_; }
  void setPurge_amount_reported(std::uint64_t bytes) { purge_amount_reported_ = bytes; }
  /// How many services the missing amount is currently divided among.
  [[nodiscard]] std::uint64_t viable_purging_services() const { return viable_purging_services_; }
  void setViable_purging_services(std::uint64_t count) { viable_purging_services_ = count; }
  /// What each service that answered said it purged, at all urgencies together, as it stood at the
  /// end. Once startOperation has returned.
  [[nodiscard]] const std::map<std::string, std::uint64_t>& reportedByService() const {
    return reported_at_end_;
  }
  /// Made afresh for each urgency, null before the first and at the end.
  [[nodiscard]] std::shared_ptr<CountingSemaphore> purge_semaphore() const {
    return purge_semaphore_.get();
  }
  void setPurge_semaphore(std::shared_ptr<CountingSemaphore> semaphore) {
    purge_semaphore_.set(std::move(semaphore));
  }

 private:
  /// What one start carries through its urgencies.
  struct Run {
    std::shared_ptr<PurgeOutcome> outcome;
    OperationCompletion completion;
    std::uint64_t user_timeout_seconds;
    std::uint64_t start_ticks;
  };
  struct ServiceRequest;
  enum class Pass { kGoOn, kStop };

  // The course of one purge.
  [[nodiscard]] std::uint64_t readUserTimeoutSeconds() const;
  [[nodiscard]] bool takeAmountNeeded(const Run& run);
  void finish(const Run& run);
  void cancelIfShort(std::uint64_t freed_bytes);
  void fillOutcome(const Run& run, std::uint64_t freed_bytes, double elapsed_ns);
  void countShortfall(std::uint64_t freed_bytes) const;
  [[nodiscard]] std::uint64_t amountPurged(const PurgeOutcome& outcome) const;
  void addDistribution(double value, const std::string& key) const;

  // One urgency.
  void runUrgencies(const Run& run);
  [[nodiscard]] Pass runUrgency(const Run& run, std::int32_t urgency);
  void askServices(const Run& run, std::int32_t urgency,
                   const std::shared_ptr<UrgencyRecord>& record);
  void waitForServices(const Run& run, std::int32_t urgency,
                       const std::shared_ptr<UrgencyRecord>& record);
  void recordTimeout(UrgencyRecord& record, std::int32_t urgency, std::uint64_t wait_seconds);
  void recordStatistics(const Run& run, std::int32_t urgency,
                        const std::shared_ptr<UrgencyRecord>& record);

  // One service's request.
  void offerShare(const std::shared_ptr<ServiceRequest>& request);
  [[nodiscard]] bool prepareShare(ServiceRequest& request);
  void callService(const std::shared_ptr<ServiceRequest>& request);
  void sendRequest(const std::shared_ptr<ServiceRequest>& request,
                   std::shared_ptr<ipc::RemoteProxy> proxy, ServiceCaller::Done done);
  void bookReply(const ServiceRequest& request, const ipc::OptionalDictionary& reply,
                 const ServiceCaller::Done& done);
  void bookAmount(const ServiceRequest& request, std::uint64_t purged_bytes);
  void leaveFlight(const ServiceRequest& request);
  void bookFailure(const ServiceRequest& request);

  // "SPACEKEEP_FINISH_EARLY".
  [[nodiscard]] bool finishedEarly(const PurgeOutcome& outcome) const;
  void endWaitIfFinishedEarly(const PurgeOutcome& outcome) const;

  std::atomic<bool> cancel_ = false;
  std::atomic<std::uint64_t> purge_amount_needed_ = 0;
  std::atomic<std::uint64_t> purge_amount_reported_ = 0;
  std::atomic<std::uint64_t> viable_purging_services_ = 0;
  rt::Guarded<std::shared_ptr<CountingSemaphore>> purge_semaphore_;
  /// Services that stand in flight although their share was 0 and nothing was sent to them.
  std::atomic<std::uint64_t> unasked_in_flight_ = 0;
  std::atomic<bool> finish_early_ = false;                    // constant once the purge has started
  std::map<std::string, std::uint64_t> reported_by_service_;  // confined to collection_queue()
  std::map<std::string, std::uint64_t> reported_at_end_;      // written by the starting thread
};

}  // namespace spacekeep
