// One service's request, from its share to the booking of its reply.
#include <utility>

#include "operations/info_keys.h"
#include "purge/decisions.h"
#include "purge/purge_operation.h"
#include "registry/service_protocol.h"
#include "support/logging/log.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

// Tells apart the two places that complain about an amount.
constexpr int kReplyAmountCheck = 239;

constexpr double kNsPerSecond = 1'000'000'000.0;

std::uint64_t amountOf(const ipc::OptionalDictionary& reply) {
  const Value* amount = reply ? reply->find(keys::kAmount) : nullptr;
  if (amount != nullptr && amount->isNumber()) return amount->asUnsigned().value_or(0);
  logProblem("%s %d num is not a number: %@", "queueServiceRequest", kReplyAmountCheck, amount);
  return 0;
}

}  // namespace

/// Handed from the share computation to the call and from there to the reply; one thread at a time.
struct SpacekeepPurgeOperation::ServiceRequest {
  std::shared_ptr<SKService> service;
  std::shared_ptr<PurgeOutcome> outcome;
  std::int32_t urgency;
  std::shared_ptr<UrgencyRecord> record;
  OperationCompletion completion;
  std::uint64_t donation_bytes = 0;
  Dictionary info{};
  std::uint64_t start_ticks = 0;
};

void SpacekeepPurgeOperation::queueServiceRequest(std::shared_ptr<SKService> service,
                                                  std::shared_ptr<PurgeOutcome> outcome,
                                                  std::int32_t urgency,
                                                  std::shared_ptr<UrgencyRecord> record,
                                                  OperationCompletion completion) {
  auto request =
      std::make_shared<ServiceRequest>(ServiceRequest{.service = std::move(service),
                                                      .outcome = std::move(outcome),
                                                      .urgency = urgency,
                                                      .record = std::move(record),
                                                      .completion = std::move(completion)});
  auto self = std::static_pointer_cast<SpacekeepPurgeOperation>(shared_from_this());
  message_queue()->async(
      [self = std::move(self), request = std::move(request)] { self->offerShare(request); });
}

// On message_queue, so the shares of one urgency are computed one after another.
void SpacekeepPurgeOperation::offerShare(const std::shared_ptr<ServiceRequest>& request) {
  if (prepareShare(*request)) {
    callService(request);
  } else {
    endWaitIfFinishedEarly(*request->outcome);
  }
}

bool SpacekeepPurgeOperation::prepareShare(ServiceRequest& request) {
  logTrace("%s queuing service: %@", "queueServiceRequest", request.service->ID);
  const std::uint64_t purged_bytes = amountPurged(*request.outcome);
  if (viable_purging_services() == 0) return false;
  if (purged_bytes >= purge_amount_needed()) return false;
  if (cancel()) return false;
  collection_queue()->sync([&] { request.info = request.outcome->snapshot(); });
  // Replies change the divisor at any time: it may have become 0 since it was tested.
  const std::uint64_t viable = viable_purging_services();
  const std::uint64_t divisor = viable == 0 ? 1 : viable;
  request.donation_bytes = purge::donation(purge_amount_needed(), purged_bytes, divisor);
  logTrace(
      "%s donation (%lld) = (amount needed[%llu] - amount_purged[%llu]) / "
      "viable_purging_services[%llu])",
      "queueServiceRequest", request.donation_bytes, purge_amount_needed(), purged_bytes, divisor);
  request.info.set(keys::kAmount, request.donation_bytes);
  if (!updateInFlight(request.service->ID, true)) return false;
  if (request.donation_bytes != 0) return true;
  // Less is missing than there are services: the service stays in flight without being called,
  // and the wait of this urgency runs out.
  ++unasked_in_flight_;
  return false;
}

void SpacekeepPurgeOperation::callService(const std::shared_ptr<ServiceRequest>& request) {
  auto self = std::static_pointer_cast<SpacekeepPurgeOperation>(shared_from_this());
  platform().services.CallServiceAsync(
      request->service,
      [self, request](std::shared_ptr<ipc::RemoteProxy> proxy, ServiceCaller::Done done) {
        self->sendRequest(request, std::move(proxy), std::move(done));
      },
      [self, request] { self->bookFailure(*request); });
}

void SpacekeepPurgeOperation::sendRequest(const std::shared_ptr<ServiceRequest>& request,
                                          std::shared_ptr<ipc::RemoteProxy> proxy,
                                          ServiceCaller::Done done) {
  logTrace("%s requesting %lld bytes from %@ at urgency %d", "queueServiceRequest",
           request->donation_bytes, request->service->ID, request->urgency);
  request->start_ticks = rt::ticks();
  auto self = std::static_pointer_cast<SpacekeepPurgeOperation>(shared_from_this());
  SpacekeepServiceProtocol(std::move(proxy))
      .servicePurge(request->urgency, request->info,
                    [self, request, done = std::move(done)](const ipc::OptionalDictionary& reply) {
                      self->bookReply(*request, reply, done);
                    });
}

void SpacekeepPurgeOperation::bookReply(const ServiceRequest& request,
                                        const ipc::OptionalDictionary& reply,
                                        const ServiceCaller::Done& done) {
  const std::string& service_id = request.service->ID;
  const double elapsed_ns = elapsedNs(request.start_ticks, rt::ticks());
  Dictionary answer = reply.value_or(Dictionary());
  answer.set(keys::kElapsedTime, elapsed_ns);
  const std::uint64_t purged_bytes = amountOf(reply);
  bookAmount(request, purged_bytes);
  if (purged_bytes < request.donation_bytes) {
    --viable_purging_services_;  // exhausted at this urgency; nothing keeps it from passing 0
  } else {
    queueServiceRequest(request.service, request.outcome, request.urgency, request.record,
                        request.completion);
  }
  if (request.completion) {
    logTrace("%s %@ calling completion with: %@", "queueServiceRequest", service_id, answer);
    request.completion(answer);
  }
  reportPercentageForAmountRequested(request.donation_bytes, purged_bytes, service_id);
  done();
  leaveFlight(request);
  logTrace("%s %@ took %f seconds, purged: %@", "queueServiceRequest", service_id,
           elapsed_ns / kNsPerSecond, answer);
  addDistribution(elapsed_ns, service_id + "_purgeElapsedNanoseconds");
}

void SpacekeepPurgeOperation::bookAmount(const ServiceRequest& request,
                                         std::uint64_t purged_bytes) {
  purge_amount_reported_ += purged_bytes;
  collection_queue()->sync([&] {
    request.record->setReported(request.service->ID, purged_bytes);
    // The record keeps the last answer of a service alone.
    reported_by_service_[request.service->ID] += purged_bytes;
  });
  logTrace("%s %@ service purged: %llu", "queueServiceRequest", request.service->ID, purged_bytes);
}

// A late reply signals the semaphore of whatever urgency is current, and none after the end.
void SpacekeepPurgeOperation::leaveFlight(const ServiceRequest& request) {
  updateInFlight(request.service->ID, false);
  const bool all_accounted_for = inFlightCount() == 0;
  const auto semaphore = purge_semaphore();
  if (all_accounted_for && semaphore) {
    logTrace("%s All services accounted for, signalling the semaphore.", "queueServiceRequest");
    semaphore->signal();
  }
  endWaitIfFinishedEarly(*request.outcome);
}

void SpacekeepPurgeOperation::bookFailure(const ServiceRequest& request) {
  logTrace("%s connection invalidated", "queueServiceRequest");
  updateInFlight(request.service->ID, false);
  endWaitIfFinishedEarly(*request.outcome);
}

}  // namespace spacekeep
