#include "ctl/shown_call.h"

#include <memory>
#include <utility>

#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

constexpr std::uint64_t kRenewNs = 200'000'000;

}  // namespace

double secondsSince(std::uint64_t start_ticks) {
  const auto base = rt::timebase().value_or(rt::Timebase{1, 1});
  return static_cast<double>(rt::ticks() - start_ticks) * base.numerator / base.denominator / 1e9;
}

sdk::Reply callShowing(const std::function<void(sdk::Client::ReplyHandler)>& start,
                       const std::function<void(double elapsed_seconds)>& show) {
  struct Slot {
    CountingSemaphore filled{0};
    sdk::Reply reply;
  };
  const auto slot = std::make_shared<Slot>();
  const std::uint64_t start_ticks = rt::ticks();
  start([slot](sdk::Reply reply) {
    slot->reply = std::move(reply);
    slot->filled.signal();
  });
  do {
    show(secondsSince(start_ticks));
  } while (slot->filled.waitForNs(kRenewNs) == WaitResult::kTimedOut);
  return std::move(slot->reply);
}

}  // namespace spacekeep::ctl
