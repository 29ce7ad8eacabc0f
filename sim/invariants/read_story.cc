// From events to a story. Each thread's lines read like the code that wrote them: what a line is
// about is told by the lines before it on the same thread.
#include <algorithm>
#include <set>
#include <utility>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/purge_story.h"
#include "sim/world/simulated_service.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

using formats::dictionaryField;
using formats::numberField;
using formats::textField;

/// What one thread is in the middle of, as indices into the story.
struct ThreadState {
  std::size_t operation = kNowhere;
  std::size_t task = kNowhere;
  std::size_t reply = kNowhere;
  std::size_t failure = kNowhere;
  std::size_t last_at = 0;
  std::uint64_t last_look = 0;  ///< at the free space of a volume
  bool elsewhere = false;       ///< at work for something that is no purge
};

struct AskedCall {
  std::string service;
  std::size_t operation = kNowhere;
  std::uint64_t amount = 0;
  std::int32_t urgency = 0;
};

class Reader {
 public:
  explicit Reader(PurgeStory& story) : story_(story) {}

  void read() {
    for (std::size_t at = 0; at < story_.run.events.size(); ++at) {
      const Event& event = story_.run.events[at];
      if (const auto* line = std::get_if<LogLine>(&event.body)) {
        readLine(at, event.thread, *line);
      } else if (const auto* asked = std::get_if<ServiceAsked>(&event.body)) {
        if (asked->member == "servicePurge") readRequest(at, *asked);
      } else if (const auto* look = std::get_if<FreeSpaceLooked>(&event.body)) {
        threads_[event.thread].last_look = look->free;
      } else if (const auto* sent = std::get_if<StatisticSent>(&event.body)) {
        readStatistic(at, event.thread, *sent);
      }
      threads_[event.thread].last_at = at;
    }
    attributeReplies();
    attributeTasks();
    attributeFailures();
    forgetUntoldRefusals();
  }

 private:
  void readLine(std::size_t at, unsigned thread, const LogLine& line) {
    ThreadState& state = threads_[thread];
    if (isOfNoPurge(line)) {
      state.elsewhere = true;
      state.task = state.reply = state.failure = kNowhere;
      return;
    }
    if (beginsPartOfAPurge(line)) state.elsewhere = false;
    if (state.elsewhere) return;
    if (line.format == formats::kBegin) {
      begin(at, thread, line);
    } else if (line.format == formats::kQueuing) {
      state.task = story_.tasks.size();
      story_.tasks.push_back(
          {.at = at, .last_at = at, .thread = thread, .service = textField(line, 1), .share = {}});
    } else if (line.format == formats::kDonation) {
      donation(at, state, line);
    } else if (line.format == formats::kInFlight && textField(line, 0) == "updateInFlight") {
      inFlight(at, state, line);
    } else if (line.format == formats::kAlreadyIn && state.task != kNowhere) {
      story_.tasks[state.task].added = false;
      story_.tasks[state.task].last_at = at;
    } else {
      readReplyLine(at, thread, state, line);
    }
  }

  // Queries and periodic passes keep in-flight sets as well, and their threads may have worked for a
  // purge before.
  [[nodiscard]] static bool isOfNoPurge(const LogLine& line) {
    return line.format == formats::kQueryEntry || line.format == formats::kQueryTook ||
           line.format == formats::kFailedNamed || line.format == formats::kPeriodicCalling ||
           line.format == formats::kPeriodicReplied;
  }

  [[nodiscard]] static bool beginsPartOfAPurge(const LogLine& line) {
    return line.format == formats::kBegin || line.format == formats::kQueuing ||
           line.format == formats::kPurged || line.format == formats::kFailed;
  }

  void begin(std::size_t at, unsigned thread, const LogLine& line) {
    Operation operation;
    operation.thread = thread;
    operation.before_begin_at = threads_[thread].last_at;
    operation.begin_at = at;
    operation.limit = static_cast<std::int32_t>(numberField(line, 1));
    operation.request = dictionaryField(line, 2);
    operation.needed = unsignedAt(operation.request, "SPACEKEEP_AMOUNT").value_or(0);
    const Value* token = operation.request.find("SPACEKEEP_TOKEN");
    if (token != nullptr) operation.token = textOf(*token);
    operation.free_at_begin = threads_[thread].last_look;
    threads_[thread].operation = story_.operations.size();
    story_.operations.push_back(std::move(operation));
  }

  // Purges of the low-space handling name nothing but volume and free space. Two of them that do not
  // differ in that run one after the other.
  void readRequest(std::size_t at, const ServiceAsked& asked) {
    AskedCall call = {asked.service, kNowhere, asked.amount.value_or(0), asked.urgency};
    for (std::size_t i = 0; i < story_.operations.size(); ++i) {
      Operation& operation = story_.operations[i];
      if (!isRequestOf(operation, asked.info)) continue;
      if (call.operation != kNowhere) {
        Operation& earlier = story_.operations[call.operation];
        const bool may_be_its =
            earlier.end_at == kNowhere || story_.timeAt(earlier.end_at) == story_.timeAt(at);
        if (may_be_its) earlier.blurred = operation.blurred = true;
      }
      call.operation = i;
    }
    if (call.operation == kNowhere) {
      story_.oddities.push_back(asked.service + " was asked by no purge that runs");
    }
    story_.operation_of_call[asked.call] = call.operation;
    asked_[asked.call] = call;
  }

  void donation(std::size_t at, const ThreadState& state, const LogLine& line) {
    if (state.task == kNowhere || story_.tasks[state.task].share) {
      story_.oddities.push_back("a donation outside of a share computation: " + textOfLine(line));
      return;
    }
    ShareTask& task = story_.tasks[state.task];
    task.share = Share{at, numberField(line, 1), numberField(line, 2), numberField(line, 3),
                       numberField(line, 4)};
    task.last_at = at;
  }

  [[nodiscard]] bool isNextStepOf(std::size_t index, const std::string& service) const {
    if (index == kNowhere) return false;
    const ShareTask& task = story_.tasks[index];
    return task.service == service && task.share && task.adding_at == kNowhere;
  }

  void inFlight(std::size_t at, ThreadState& state, const LogLine& line) {
    const std::string service = textField(line, 2);
    if (textField(line, 1) == "adding") {
      if (!isNextStepOf(state.task, service)) {
        // Queries and periodic passes add services to sets of their own.
        if (story_.run.scenario != nullptr) {
          story_.oddities.push_back("an addition outside of a share computation: " + service);
        }
        return;
      }
      ShareTask& task = story_.tasks[state.task];
      task.adding_at = at;
      task.added = true;
      task.last_at = at;
    } else if (state.reply != kNowhere) {
      Reply& reply = story_.replies[state.reply];
      reply.removing_at = at;
      ++reply.removals;
    } else if (state.failure != kNowhere) {
      Failure& failure = story_.failures[state.failure];
      failure.service = service;
      failure.removing_at = at;
      state.failure = kNowhere;
    } else {
      story_.oddities.push_back("a removal that nobody asked for: " + service);
    }
  }

  void readReplyLine(std::size_t at, unsigned thread, ThreadState& state, const LogLine& line) {
    if (line.format == formats::kPurged) {
      state.task = kNowhere;
      state.reply = story_.replies.size();
      story_.replies.push_back({.booked_at = at,
                                .thread = thread,
                                .service = textField(line, 1),
                                .amount = numberField(line, 2)});
    } else if (line.format == formats::kFailed && textField(line, 0) == "queueServiceRequest") {
      state.failure = story_.failures.size();
      story_.failures.push_back({.at = at, .service = {}});
    } else if (line.format == formats::kCompletion && state.reply != kNowhere) {
      Reply& reply = story_.replies[state.reply];
      reply.completion_at = at;
      reply.call = unsignedAt(dictionaryField(line, 2), kCallKey).value_or(0);
    } else if (line.format == formats::kDonated && state.reply != kNowhere) {
      story_.replies[state.reply].logged_donation = numberField(line, 3);
    } else if (line.format == formats::kSignalling) {
      if (state.reply == kNowhere) {
        story_.oddities.push_back("a signal outside of the booking of a reply");
      } else {
        ++story_.replies[state.reply].signals;
        story_.replies[state.reply].signalled_at = at;
      }
    } else if (line.format == formats::kTook && state.reply != kNowhere) {
      story_.replies[state.reply].done_at = at;
      state.reply = kNowhere;
    } else if (state.operation != kNowhere) {
      readCourse(at, state, line);
    }
  }

  void readCourse(std::size_t at, ThreadState& state, const LogLine& line) {
    Operation& operation = story_.operations[state.operation];
    if (line.format == formats::kInQueue) {
      Pass pass;
      pass.urgency = static_cast<std::int32_t>(operation.passes.size()) + 1;
      pass.begin_at = at;
      operation.passes.push_back(pass);
    } else if (line.format == formats::kCancelling) {
      operation.cancelling_at = at;
    } else if (line.format == formats::kResult) {
      operation.end_at = at;
      operation.outcome = dictionaryField(line, 1);
      state.operation = kNowhere;
    } else if (!operation.passes.empty()) {
      readPass(at, operation.passes.back(), line);
    }
  }

  static void readPass(std::size_t at, Pass& pass, const LogLine& line) {
    if (line.format == formats::kUrgency) {
      pass.asked_at = at;
    } else if (line.format == formats::kWaiting) {
      pass.waiting_at = at;
      pass.wait_seconds = numberField(line, 1);
    } else if (line.format == formats::kTimedOut) {
      pass.timed_out_at = at;
    } else if (line.format == formats::kStatistics) {
      pass.stats_at = at;
    }
  }

  void readStatistic(std::size_t at, unsigned thread, const StatisticSent& sent) {
    const std::size_t operation = threads_[thread].operation;
    if (operation != kNowhere && sent.key == "SpacekeepPurgeElapsedNanoseconds") {
      story_.operations[operation].measured_at = at;
    }
  }

  // An answer without a dictionary does not say which call it is for, and two of them that arrive in
  // the same moment may be booked in either order. The booking names the share, which tells apart
  // what two purges asked for. Answers of earlier moments that nobody booked were lost with their
  // connection, so the latest moment comes first.
  [[nodiscard]] std::uint64_t callOfUnnamed(const Reply& reply,
                                            const std::set<std::uint64_t>& booked) const {
    std::uint64_t call = 0;
    std::uint64_t answered_ns = 0;
    for (std::size_t at = 0; at < reply.booked_at; ++at) {
      const auto* answered = std::get_if<ServiceAnswered>(&story_.run.events[at].body);
      if (answered == nullptr || answered->service != reply.service) continue;
      const auto asked = asked_.find(answered->call);
      if (asked == asked_.end() || booked.contains(answered->call)) continue;
      if (asked->second.amount != *reply.logged_donation) continue;
      if (call != 0 && story_.timeAt(at) == answered_ns) continue;
      call = answered->call;
      answered_ns = story_.timeAt(at);
    }
    return call;
  }

  // An addition that changes nothing says so in its next line. Where the process was killed between
  // the two, that of a service which is in flight already has not been refused yet.
  void forgetUntoldRefusals() {
    if (!story_.run.cut) return;
    for (ShareTask& task : story_.tasks) {
      if (!task.added || task.adding_at != threads_[task.thread].last_at) continue;
      if (story_.inFlightBefore(task.operation, task.service, task.adding_at) == 0) continue;
      task.added = false;
      task.adding_at = kNowhere;
    }
  }

  void nameUnnamedReplies() {
    std::set<std::uint64_t> booked;
    for (const Reply& reply : story_.replies) booked.insert(reply.call);
    for (Reply& reply : story_.replies) {
      if (reply.call != 0 || !reply.logged_donation) continue;
      reply.call = callOfUnnamed(reply, booked);
      booked.insert(reply.call);
    }
  }

  void attributeReplies() {
    nameUnnamedReplies();
    for (Reply& reply : story_.replies) {
      // The process was killed before the reply was told apart from others.
      if (reply.call == 0 && story_.run.cut) continue;
      const auto asked = asked_.find(reply.call);
      if (asked == asked_.end() || asked->second.service != reply.service) {
        story_.oddities.push_back("a reply of " + reply.service + " to nothing that was asked");
        continue;
      }
      reply.donation = asked->second.amount;
      reply.urgency = asked->second.urgency;
      reply.operation = asked->second.operation;
    }
  }

  // A donation names the bytes needed, which no two purges of clients share. Else a computation
  // belongs to the running purge, unless a purge that has ended may still have one to come.
  void attributeTasks() {
    for (ShareTask& task : story_.tasks) {
      if (!task.share) continue;
      std::vector<std::size_t> possible;
      for (std::size_t i = 0; i < story_.operations.size(); ++i) {
        if (story_.operations[i].needed == task.share->needed) possible.push_back(i);
      }
      if (possible.size() == 1) give(task, possible.front());
    }
    for (ShareTask& task : story_.tasks) {
      if (task.operation == kNowhere) attributeUnnamed(task);
    }
  }

  void give(ShareTask& task, std::size_t operation) {
    task.operation = operation;
    story_.operations[operation].services.insert(task.service);
  }

  void attributeUnnamed(ShareTask& task) {
    std::vector<std::size_t> possible;
    for (std::size_t i = 0; i < story_.operations.size(); ++i) {
      const Operation& operation = story_.operations[i];
      if (operation.begin_at > task.at) continue;
      if (task.share && task.share->needed != operation.needed) continue;
      if (operation.end_at > task.at || outstandingTasks(i, task) > 0) possible.push_back(i);
    }
    if (possible.empty()) {
      for (std::size_t i = 0; i < story_.operations.size(); ++i) {
        if (story_.operations[i].begin_at < task.at) possible.push_back(i);
      }
    }
    if (possible.size() == 1) return give(task, possible.front());
    for (const std::size_t i : possible) story_.operations[i].blurred = true;
  }

  // Each asked urgency queues one computation for each service, each met share one more. In the
  // very instant of its end a purge may have computations left even for services it has not named
  // yet; time does not move on before they have run.
  [[nodiscard]] std::int64_t outstandingTasks(std::size_t operation, const ShareTask& next) const {
    const Operation& ended = story_.operations[operation];
    const bool same_instant = story_.timeAt(ended.end_at) == story_.timeAt(next.at);
    const bool may_be_asked = same_instant || ended.services.contains(next.service);
    std::int64_t count = 0;
    for (const Pass& pass : ended.passes) {
      if (pass.asked_at != kNowhere && may_be_asked) ++count;
    }
    for (const Reply& reply : story_.replies) {
      if (reply.operation == operation && reply.service == next.service &&
          reply.booked_at < next.at && metItsShare(reply)) {
        ++count;
      }
    }
    for (const ShareTask& task : story_.tasks) {
      if (task.operation == operation && task.service == next.service && task.at < next.at) --count;
    }
    return count;
  }

  [[nodiscard]] bool anyIsBlurred() const {
    return std::any_of(story_.operations.begin(), story_.operations.end(),
                       [](const Operation& operation) { return operation.blurred; });
  }

  void attributeFailures() {
    for (Failure& failure : story_.failures) {
      if (failure.removing_at == kNowhere) continue;
      std::vector<std::size_t> possible;
      for (std::size_t i = 0; i < story_.operations.size(); ++i) {
        if (story_.inFlightBefore(i, failure.service, failure.removing_at) > 0) {
          possible.push_back(i);
        }
      }
      if (possible.empty()) {
        if (anyIsBlurred()) continue;
        story_.oddities.push_back("a failure of " + failure.service + ", which was not in flight");
        continue;
      }
      failure.operation = possible.front();
      if (possible.size() == 1) continue;
      for (const std::size_t i : possible) story_.operations[i].blurred = true;
    }
  }

  PurgeStory& story_;
  std::map<unsigned, ThreadState> threads_;
  std::map<std::uint64_t, AskedCall> asked_;
};

}  // namespace

// A run that was broken off has no story, only a great many events.
PurgeStory::PurgeStory(PurgeView view) : run(std::move(view)) {
  if (run.end == rt::ScheduleEnd::kFinished || run.cut) Reader(*this).read();
}

}  // namespace spacekeep::sim
