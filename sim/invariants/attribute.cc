// Each purge has two queues of its own, and a queue's number in the trace is its alone. The first
// share computation of a purge tells which queue it computes them on, the additions which one guards
// its in-flight set, and whoever leaves that set does so on it: however much two purges look alike,
// none of that can be mistaken. Only which call a reply or a failure was for is told by other means,
// and there a mistake would make no difference: the calls in question are equal.
#include "sim/invariants/attribute.h"

#include <algorithm>
#include <map>

namespace spacekeep::sim {
namespace {

class Attribution {
 public:
  explicit Attribution(PurgeStory& story) : story_(story) {}

  void run() {
    for (ShareTask& task : story_.tasks) giveTask(task);
    for (Reply& reply : story_.replies) giveReply(reply);
    for (Failure& failure : story_.failures) giveFailure(failure);
    for (Reply& reply : story_.replies) nameReply(reply);
    for (Reply& reply : story_.replies) giveCallOfReply(reply);
    for (const Failure& failure : story_.failures) giveCallOfFailure(failure);
    for (PurgeCall& call : story_.calls) giveOtherCall(call);
    for (Reply& reply : story_.replies) fillReply(reply);
  }

 private:
  void giveTask(ShareTask& task) {
    if (task.queue != 0 && !computing_.contains(task.queue)) {
      const std::size_t operation = ownerOfNewQueue(task);
      if (operation != kNowhere) computing_[task.queue] = operation;
    }
    const auto owner = computing_.find(task.queue);
    if (owner == computing_.end()) {
      story_.oddities.push_back("a share of " + task.service + " on the queue of no purge");
      return;
    }
    task.operation = owner->second;
    story_.operations[task.operation].services.insert(task.service);
    if (task.adding_at != kNowhere) giveSet(task);
  }

  void giveSet(const ShareTask& task) {
    const unsigned set_queue = set_of_.emplace(task.operation, task.set_queue).first->second;
    const bool is_queue = set_queue != 0 && !computing_.contains(set_queue);
    if (is_queue && set_queue == task.set_queue) return;
    story_.oddities.push_back(task.service + " was added to another in-flight set");
  }

  [[nodiscard]] bool hasQueue(std::size_t operation) const {
    return std::any_of(computing_.begin(), computing_.end(),
                       [&](const auto& known) { return known.second == operation; });
  }

  /// The purge whose first computation this is. A purge with services computes a share before it
  /// ends, unless it ended as soon as it could; so it is the last one that has asked for shares, or
  /// one that ended like that.
  [[nodiscard]] std::size_t ownerOfNewQueue(const ShareTask& task) const {
    bool is_last = true;
    for (std::size_t i = story_.operations.size(); i-- > 0;) {
      const Operation& operation = story_.operations[i];
      const bool has_asked = std::any_of(operation.passes.begin(), operation.passes.end(),
                                         [&](const Pass& pass) { return pass.asked_at < task.at; });
      if (!has_asked) continue;
      const bool fits = !task.share || task.share->needed == operation.needed;
      if ((is_last || story_.mayFinishEarly(operation)) && fits && !hasQueue(i)) return i;
      is_last = false;
    }
    return kNowhere;
  }

  [[nodiscard]] std::size_t ownerOfSet(unsigned set_queue) const {
    if (set_queue == 0) return kNowhere;
    const auto found = std::find_if(set_of_.begin(), set_of_.end(),
                                    [&](const auto& known) { return known.second == set_queue; });
    return found == set_of_.end() ? kNowhere : found->first;
  }

  void giveReply(Reply& reply) {
    reply.operation = ownerOfSet(reply.set_queue);
    if (reply.removing_at == kNowhere || reply.operation != kNowhere) return;
    story_.oddities.push_back("a reply of " + reply.service + ", which was not in flight");
  }

  void giveFailure(Failure& failure) {
    failure.operation = ownerOfSet(failure.set_queue);
    if (failure.removing_at == kNowhere || failure.operation != kNowhere) return;
    story_.oddities.push_back("a failure of " + failure.service + ", which was not in flight");
  }

  [[nodiscard]] static bool mayBe(const PurgeCall& call, std::size_t operation) {
    return operation == kNowhere ||
           std::find(call.alike.begin(), call.alike.end(), operation) != call.alike.end();
  }

  // An answer without a dictionary does not say which call it is for. Answers of earlier moments
  // that nobody booked were lost with their connection, so the latest moment comes first.
  void nameReply(Reply& reply) {
    if (reply.call == 0 && reply.logged_donation) {
      const PurgeCall* latest = nullptr;
      for (const PurgeCall& call : story_.calls) {
        const bool fits = call.service == reply.service && call.ended_at < reply.booked_at &&
                          !call.failed && call.amount == *reply.logged_donation &&
                          mayBe(call, reply.operation) && !isBooked(call.number);
        if (!fits) continue;
        const bool is_later =
            latest == nullptr || story_.timeAt(call.ended_at) > story_.timeAt(latest->ended_at);
        if (is_later) latest = &call;
      }
      if (latest != nullptr) reply.call = latest->number;
    }
  }

  [[nodiscard]] bool isBooked(std::uint64_t number) const {
    return std::any_of(story_.replies.begin(), story_.replies.end(),
                       [&](const Reply& reply) { return reply.call == number; });
  }

  PurgeCall* callOf(const Reply& reply) {
    const auto found =
        std::find_if(story_.calls.begin(), story_.calls.end(),
                     [&](const PurgeCall& call) { return call.number == reply.call; });
    return found == story_.calls.end() ? nullptr : &*found;
  }

  void giveCallOfReply(Reply& reply) {
    // The process was killed before the reply was told apart from others.
    if (reply.call == 0 && story_.run.cut) return;
    PurgeCall* call = callOf(reply);
    if (call == nullptr || call->service != reply.service || !mayBe(*call, reply.operation)) {
      story_.oddities.push_back("a reply of " + reply.service + " to nothing that was asked");
      return;
    }
    if (reply.operation != kNowhere) call->operation = reply.operation;
  }

  void giveCallOfFailure(const Failure& failure) {
    if (failure.operation == kNowhere) return;
    for (PurgeCall& call : story_.calls) {
      if (call.service != failure.service || !call.failed || call.ended_at > failure.at) continue;
      if (call.operation != kNowhere || !mayBe(call, failure.operation)) continue;
      call.operation = failure.operation;
      return;
    }
  }

  /// One that nobody has booked: it is of a purge that waits for the service, and for no other call
  /// to it.
  void giveOtherCall(PurgeCall& call) {
    if (call.operation != kNowhere || call.alike.empty()) return;
    const auto waits =
        std::find_if(call.alike.begin(), call.alike.end(), [&](std::size_t operation) {
          return story_.inFlightBefore(operation, call.service, call.asked_at) > 0 &&
                 !hasOpenCall(operation, call);
        });
    call.operation = waits == call.alike.end() ? call.alike.back() : *waits;
  }

  [[nodiscard]] bool hasOpenCall(std::size_t operation, const PurgeCall& next) const {
    return std::any_of(story_.calls.begin(), story_.calls.end(), [&](const PurgeCall& call) {
      return call.operation == operation && call.service == next.service &&
             call.asked_at < next.asked_at && call.ended_at > next.asked_at;
    });
  }

  void fillReply(Reply& reply) {
    const PurgeCall* call = callOf(reply);
    if (call == nullptr) return;
    reply.donation = call->amount;
    reply.urgency = call->urgency;
    if (reply.operation == kNowhere) reply.operation = call->operation;
  }

  PurgeStory& story_;
  std::map<unsigned, std::size_t> computing_;  ///< purges by the queue of their shares
  std::map<std::size_t, unsigned> set_of_;     ///< the queues of in-flight sets by purge
};

}  // namespace

void attribute(PurgeStory& story) { Attribution(story).run(); }

}  // namespace spacekeep::sim
