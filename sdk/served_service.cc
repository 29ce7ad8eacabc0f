#include "sdk/served_service.h"

#include <exception>
#include <utility>
#include <variant>
#include <vector>

#include "registry/service_protocol.h"
#include "support/runtime/locks.h"

namespace spacekeep::sdk {
namespace {

Job jobFrom(const ipc::Arguments& in, const Cancellation& cancellation) {
  Job job;
  job.urgency = std::get<std::int32_t>(in.at(0));
  job.info = std::get<Dictionary>(in.at(1));
  if (const auto* volume = stringAt(job.info, "SPACEKEEP_VOLUME")) job.volume = *volume;
  job.amount = unsignedAt(job.info, "SPACEKEEP_AMOUNT").value_or(0);
  job.cancellation = cancellation;
  return job;
}

ipc::Arguments argumentsOf(Answer answer) {
  answer.more.set("SPACEKEEP_AMOUNT", answer.amount);
  return {ipc::OptionalDictionary(std::move(answer.more))};
}

void failAfterException(const ipc::Responder& responder, const char* what) {
  responder.fail({"org.freedesktop.DBus.Error.Failed",
                  std::string("the service's handler ended with an exception: ") + what});
}

}  // namespace

ServedService::ServedService(std::shared_ptr<Service> service, Handlers handlers,
                             ConcurrentQueue& global)
    : service_(std::move(service)), last_call_ticks_(rt::ticks()) {
  for (auto& lane : lanes_) {
    const bool shared = handlers == Handlers::kOneAtATime && &lane != &lanes_[0];
    lane = shared ? lanes_[0] : SerialQueue::create("com.quorvel.spacekeep_service", global);
  }
}

ipc::ServedInterface ServedService::interface() {
  return {&spacekeepServiceInterface(),
          {jobMethod("servicePurgeable", Kind::kPurgeable, &Service::purgeable),
           jobMethod("servicePurge", Kind::kPurge, &Service::purge),
           jobMethod("servicePeriodic", Kind::kPeriodic, &Service::periodic), cancelMethod(),
           pingMethod(), notifyMethod(), callbackMethod()}};
}

ipc::ServedMethod ServedService::jobMethod(const char* name, Kind kind,
                                           Answer (Service::*handler)(const Job& job)) {
  return {.name = name,
          .mode = ipc::ServeMode::kInOrder,
          .lane = {},
          .lane_width = 1,
          .serve = [self = shared_from_this(), kind, handler](ipc::Arguments in,
                                                              ipc::Responder responder) {
            self->enqueue(
                kind, std::move(responder),
                [in = std::move(in), handler](Service& service, const Cancellation& cancellation) {
                  return argumentsOf((service.*handler)(jobFrom(in, cancellation)));
                });
          }};
}

ipc::ServedMethod ServedService::notifyMethod() {
  return {.name = "serviceNotify",
          .mode = ipc::ServeMode::kInOrder,
          .lane = {},
          .lane_width = 1,
          .serve = [self = shared_from_this()](ipc::Arguments in, ipc::Responder responder) {
            self->enqueue(Kind::kNotify, std::move(responder),
                          [in = std::move(in)](Service& service, const Cancellation&) {
                            for (const auto& entry : std::get<Dictionary>(in.at(0))) {
                              service.notify(entry.key, entry.value);
                            }
                            return ipc::Arguments{};
                          });
          }};
}

ipc::ServedMethod ServedService::callbackMethod() {
  return {.name = "serviceCallback",
          .mode = ipc::ServeMode::kInOrder,
          .lane = {},
          .lane_width = 1,
          .serve = [self = shared_from_this()](ipc::Arguments in, ipc::Responder responder) {
            self->enqueue(Kind::kCallback, std::move(responder),
                          [in = std::move(in)](Service& service, const Cancellation&) {
                            return ipc::Arguments{service.callback(std::get<Dictionary>(in.at(0)))};
                          });
          }};
}

ipc::ServedMethod ServedService::cancelMethod() {
  return {
      .name = "serviceCancelPurge",
      .mode = ipc::ServeMode::kInOrder,
      .lane = {},
      .lane_width = 1,
      .serve = [self = shared_from_this()](const ipc::Arguments&, const ipc::Responder& responder) {
        self->noteCall();
        self->cancelPurges();
        self->run(
            [](Service& service, const Cancellation&) {
              service.cancelRequested();
              return ipc::Arguments{};
            },
            Cancellation(), responder);
      }};
}

ipc::ServedMethod ServedService::pingMethod() {
  return {
      .name = "servicePing",
      .mode = ipc::ServeMode::kInOrder,
      .lane = {},
      .lane_width = 1,
      .serve = [self = shared_from_this()](const ipc::Arguments&, const ipc::Responder& responder) {
        self->noteCall();
        self->run(
            [](Service& service, const Cancellation&) {
              service.pinged();
              return ipc::Arguments{};
            },
            Cancellation(), responder);
      }};
}

void ServedService::enqueue(Kind kind, ipc::Responder responder, Work work) {
  const Cancellation cancellation;
  std::uint64_t number = 0;
  {
    const std::scoped_lock lock(mutex_);
    number = next_number_++;
    last_call_ticks_ = rt::ticks();
    pending_.insert({number, Pending{kind, cancellation}});
  }
  lanes_[static_cast<std::size_t>(kind)]->async([self = shared_from_this(), number, cancellation,
                                                 work = std::move(work),
                                                 responder = std::move(responder)]() mutable {
    self->run(work, cancellation, std::move(responder));
    const std::scoped_lock lock(self->mutex_);
    self->pending_.erase(number);
    self->last_call_ticks_ = rt::ticks();
    self->became_idle_.notifyAll();
  });
}

/// By value: when this returns the responder is gone, and with it the way back to the IPC thread.
void ServedService::run(const Work& work, const Cancellation& cancellation,
                        ipc::Responder responder) {  // NOLINT
  try {
    responder.reply(work(*service_, cancellation));
  } catch (const std::exception& exception) {
    failAfterException(responder, exception.what());
  } catch (...) {
    failAfterException(responder, "of an unknown type");
  }
}

void ServedService::cancelPurges() {
  const std::scoped_lock lock(mutex_);
  for (const auto& [number, pending] : pending_) {
    if (pending.kind == Kind::kPurge) pending.cancellation.cancel();
  }
}

void ServedService::cancelAll() {
  const std::scoped_lock lock(mutex_);
  for (const auto& [number, pending] : pending_) pending.cancellation.cancel();
}

void ServedService::waitUntilIdle() {
  const BlockingRegion region;
  const std::scoped_lock lock(mutex_);
  while (!pending_.empty()) became_idle_.wait(mutex_);
}

void ServedService::noteCall() {
  const std::scoped_lock lock(mutex_);
  last_call_ticks_ = rt::ticks();
}

ServedService::Activity ServedService::activity() const {
  const std::scoped_lock lock(mutex_);
  return {pending_.size(), last_call_ticks_};
}

}  // namespace spacekeep::sdk
