// From requests to operations: make it, run it on the queue for its kind of work, wait for it.
#include <utility>

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "operations/periodic_operation.h"
#include "purge/purge_operation.h"
#include "purgeable/purgeable_operation.h"
#include "support/logging/log.h"
#include "support/queues/waiting.h"
#include "support/runtime/guarded.h"

namespace spacekeep {

std::optional<Dictionary> Spacekeep::totalAvailable(const Value& info) {
  struct Waiting {
    TaskGroup group;
    std::optional<Dictionary> outcome;  // written by the task, read after it has ended
  };
  const auto waiting = std::make_shared<Waiting>();
  waiting->group.enter();
  purgeable_queue_->async([self = shared_from_this(), waiting, info] {
    const auto operation = makeOperation<SpacekeepPurgeableOperation>(self->platform_, info,
                                                                      self->copyServices(), self);
    if (operation) {
      operation->startOperation(
          [waiting](Dictionary outcome) { waiting->outcome = std::move(outcome); });
    }
    waiting->group.leave();
  });
  waiting->group.wait();
  return std::move(waiting->outcome);
}

std::optional<Dictionary> Spacekeep::purge(const Value& info, OperationCompletion callback) {
  struct Waiting {
    TaskGroup group;
    rt::Guarded<std::optional<Dictionary>> outcome;  // set for as long as services answer
    // Written by the task, read after it has ended: the last outcome by then, and the purge's own.
    std::optional<Dictionary> answer;
    std::optional<Dictionary> own_outcome;
  };
  const auto waiting = std::make_shared<Waiting>();
  const Value* asked_token = info.dictionary() ? info.dictionary()->find(keys::kToken) : nullptr;
  const auto operation = makeOperation<SpacekeepPurgeOperation>(platform_, info, copyServices());
  if (operation) operation->setFinishEarlyByDefault(finish_early_);
  const Value token = asked_token ? *asked_token : platform_.createSpacekeepToken();

  waiting->group.enter();
  purge_queue_->async(
      [this, self = shared_from_this(), waiting, operation, token, callback = std::move(callback)] {
        collection_queue_->sync([&] {
          if (purge_operations_) purge_operations_->set(token, operation);
        });
        if (operation) {
          operation->startOperation(
              [waiting, callback, queue = purge_queue_](const Dictionary& outcome) {
                if (callback) callback(outcome);
                waiting->outcome.set(outcome);
                // Services answer on other threads, and some after the purge's own outcome.
                if (queue->isCurrent()) waiting->own_outcome = outcome;
              });
        }
        collection_queue_->sync([&] {
          if (purge_operations_) purge_operations_->remove(token);
        });
        waiting->answer = waiting->outcome.get();
        waiting->group.leave();
      });
  waiting->group.wait();
  const std::optional<Dictionary>& own = waiting->own_outcome;
  if (operation && own) rememberPurge(*operation, *own);
  return std::move(waiting->answer);
}

void Spacekeep::cancelPurgeWithToken(const Value* token) {
  std::shared_ptr<OperationInterface> operation;
  collection_queue_->sync([&] {
    if (purge_operations_ && token != nullptr) operation = purge_operations_->find(*token);
  });
  if (operation && operation->implementsCancelOperation()) operation->cancelOperation();
}

std::uint64_t Spacekeep::requestsInFlight(const Array& collection) const {
  std::uint64_t count = 0;
  collection_queue_->sync([&] { count = collection.size(); });
  return count;
}

// On the calling thread: the daily pass visits one volume after the other.
void Spacekeep::performPeriodicsWithInfo(const Value& info) {
  const auto operation = makeOperation<SpacekeepPeriodicOperation>(platform_, info, copyServices());
  if (!operation) return;
  const OperationCompletion remember = rememberingDailyPass(operation);
  operation->startOperation([&remember](const Dictionary& outcome) {
    logTrace("%s result: %@", "performPeriodicsWithInfo", outcome);
    remember(outcome);
  });
}

}  // namespace spacekeep
