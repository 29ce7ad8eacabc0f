// What the service says and does, with its faults.
#include <fcntl.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <thread>
#include <utility>
#include <vector>

#include "tests/programs/bad_services/raw_service.h"

namespace bad_services {
namespace {

void pauseFor(std::chrono::milliseconds duration) { std::this_thread::sleep_for(duration); }

/// Reached from nowhere on purpose, and touched so that it occupies memory.
void leakMemory() {
  static std::vector<std::vector<char>*> never_freed;
  never_freed.push_back(new std::vector<char>(32768, 'x'));
}

}  // namespace

std::uint64_t RawService::offered(const Request& request) {
  if (wrongVolume(request) && !has(Fault::kOffersOnEveryVolume)) return 0;
  const std::uint64_t all = folder_.occupiedBytes();
  if (has(Fault::kBoastsAtFirst) && queries_ <= 4) return std::uint64_t{1} << 50;
  if (has(Fault::kOffersLessAtHigherUrgency) && request.urgency == 4) return all / 2;
  return all;
}

void RawService::answerQuery(const Request& request) {
  ++queries_;
  if (has(Fault::kDropsWhatComesTogether)) {
    pauseFor(std::chrono::milliseconds(10));
    int waiting = 0;
    if (ioctl(sd_bus_get_fd(server_), FIONREAD, &waiting) == 0 && waiting > 0) return;
  }
  if (has(Fault::kDiesOfOddRequests) && !request.sensible) std::abort();
  if (has(Fault::kFreesOnQuery)) static_cast<void>(folder_.removeOne(true));
  if (has(Fault::kLeaksDescriptors)) static_cast<void>(open("/dev/null", O_RDONLY | O_CLOEXEC));
  if (has(Fault::kLeaksMemory)) leakMemory();
  answerAmount(request, offered(request));
  sd_bus_message_unref(request.call);
}

void RawService::queuePurge(Request request) {
  const bool is_purge = request.member == "servicePurge";
  const bool everywhere = has(Fault::kFreesForEveryVolume);
  if (!is_purge || (wrongVolume(request) && !everywhere)) request.amount = 0;
  const std::uint64_t all = folder_.occupiedBytes();
  const bool modest = request.amount <= all;
  if (has(Fault::kStingy) && modest) request.amount /= 4;
  if (has(Fault::kGreedy) && modest) request.amount *= 3;
  if (has(Fault::kKeepsSome) && !modest) request.amount = all / 4;
  if (has(Fault::kFreesForNothing) && is_purge && !wrongVolume(request)) {
    request.amount = std::max<std::uint64_t>(request.amount, 1);
  }
  purges_.push_back(std::move(request));
}

void RawService::cancelPurges() {
  if (!has(Fault::kIgnoresCancel)) cancelled_ = !purges_.empty();
}

/// One file, or the end of a purge.
void RawService::step() {
  Request& purge = purges_.front();
  const bool ignores_cancel = has(Fault::kIgnoresCancel);
  const bool wanted = purge.freed < purge.amount && !cancelled_;
  const auto freed =
      wanted ? folder_.removeOne(!has(Fault::kTakesFilesInUse)) : std::optional<std::uint64_t>();
  if (freed) {
    purge.freed += *freed;
    pauseFor(std::chrono::milliseconds(ignores_cancel ? 10 : 1));
    return;
  }
  const Request done = std::move(purge);
  purges_.pop_front();
  finish(done);
  if (purges_.empty()) cancelled_ = false;
}

void RawService::finish(const Request& request) {
  const bool is_purge = request.member == "servicePurge";
  const bool silent =
      (has(Fault::kSilentPurge) && is_purge) || (has(Fault::kSilentAfterCancel) && cancelled_);
  if (has(Fault::kSlow) && !std::exchange(was_slow_, true))
    pauseFor(std::chrono::milliseconds(8500));
  if (has(Fault::kFailsPurges) && is_purge) {
    sd_bus_reply_method_errorf(request.call, "com.example.Error.Busy", "not now");
  } else if (!silent) {
    answerAmount(request, has(Fault::kLies) ? request.freed * 2 : request.freed);
  }
  sd_bus_message_unref(request.call);
}

void RawService::answerAmount(const Request& request, std::uint64_t amount) {
  const bool as_text = has(Fault::kAnswersWithText) && request.member == "servicePurge";
  const int times = has(Fault::kAnswersTwice) ? 2 : 1;
  for (int i = 0; i < times; ++i) {
    if (as_text) {
      sd_bus_reply_method_return(request.call, "aa{sv}", 1, 1, "SPACEKEEP_AMOUNT", "s", "plenty");
    } else {
      sd_bus_reply_method_return(request.call, "aa{sv}", 1, 1, "SPACEKEEP_AMOUNT", "t", amount);
    }
  }
}

void RawService::answerNothing(sd_bus_message* call) { sd_bus_reply_method_return(call, ""); }

}  // namespace bad_services
