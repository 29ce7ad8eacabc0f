// From events to a story. Each thread's lines read like the code that wrote them: what a line is
// about is told by the lines before it on the same thread.
#include <algorithm>
#include <set>
#include <utility>

#include "sim/invariants/attribute.h"
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

class Reader {
 public:
  explicit Reader(PurgeStory& story) : story_(story) {}

  void read() {
    for (std::size_t at = 0; at < story_.run.events.size(); ++at) {
      const Event& event = story_.run.events[at];
      if (const auto* line = std::get_if<LogLine>(&event.body)) {
        readLine(at, event, *line);
      } else if (const auto* asked = std::get_if<ServiceAsked>(&event.body)) {
        if (asked->member == "servicePurge") readRequest(at, *asked);
      } else if (const auto* answered = std::get_if<ServiceAnswered>(&event.body)) {
        readEnd(at, answered->call, false);
      } else if (const auto* failed = std::get_if<ServiceCallFailed>(&event.body)) {
        readEnd(at, failed->call, true);
      } else if (const auto* look = std::get_if<FreeSpaceLooked>(&event.body)) {
        threads_[event.thread].last_look = look->free;
      } else if (const auto* sent = std::get_if<StatisticSent>(&event.body)) {
        readStatistic(at, event.thread, *sent);
      }
      threads_[event.thread].last_at = at;
    }
    attribute(story_);
    forgetUntoldRefusals();
  }

 private:
  void readLine(std::size_t at, const Event& event, const LogLine& line) {
    const unsigned thread = event.thread;
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
      story_.tasks.push_back({.at = at,
                              .last_at = at,
                              .thread = thread,
                              .service = textField(line, 1),
                              .share = {},
                              .queue = event.queue});
    } else if (line.format == formats::kDonation) {
      donation(at, state, line);
    } else if (line.format == formats::kInFlight && textField(line, 0) == "updateInFlight") {
      inFlight(at, event.queue, state, line);
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

  void readRequest(std::size_t at, const ServiceAsked& asked) {
    PurgeCall call = {.number = asked.call,
                      .service = asked.service,
                      .amount = asked.amount.value_or(0),
                      .urgency = asked.urgency,
                      .asked_at = at,
                      .alike = {}};
    for (std::size_t i = 0; i < story_.operations.size(); ++i) {
      if (isRequestOf(story_.operations[i], asked.info)) call.alike.push_back(i);
    }
    if (call.alike.empty()) {
      story_.oddities.push_back(asked.service + " was asked by no purge that runs");
    }
    story_.calls.push_back(std::move(call));
  }

  void readEnd(std::size_t at, std::uint64_t number, bool failed) {
    for (PurgeCall& call : story_.calls) {
      if (call.number != number) continue;
      call.ended_at = at;
      call.failed = failed;
    }
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

  void inFlight(std::size_t at, unsigned queue, ThreadState& state, const LogLine& line) {
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
      task.set_queue = queue;
      task.last_at = at;
    } else if (state.reply != kNowhere) {
      Reply& reply = story_.replies[state.reply];
      reply.removing_at = at;
      reply.set_queue = queue;
      ++reply.removals;
    } else if (state.failure != kNowhere) {
      Failure& failure = story_.failures[state.failure];
      failure.service = service;
      failure.removing_at = at;
      failure.set_queue = queue;
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

  PurgeStory& story_;
  std::map<unsigned, ThreadState> threads_;
};

}  // namespace

// A run that was broken off has no story, only a great many events.
PurgeStory::PurgeStory(PurgeView view) : run(std::move(view)) {
  if (run.end == rt::ScheduleEnd::kFinished || run.cut) Reader(*this).read();
}

}  // namespace spacekeep::sim
