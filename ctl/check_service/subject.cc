#include "ctl/check_service/subject.h"

#include <fmt/core.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <string_view>
#include <utility>

#include "ctl/check_service/patience.h"
#include "ctl/text_layout.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::ctl {
namespace {

constexpr std::uint64_t kAfterAnEarlyEndNs = 3 * kSecondNs;

std::string seconds(std::uint64_t duration_ns) {
  return fmt::format("{:g} s", static_cast<double>(duration_ns) / 1e9);
}

std::string problemOf(const ServiceLine::Call& call, std::uint64_t patience_ns) {
  if (call.error) {
    return fmt::format("was answered with an error: {} ({})", harmless(call.error->text),
                       harmless(call.error->name));
  }
  if (call.lost) return "was not answered, because the service closed the connection";
  if (call.answers == 0) return "was not answered within " + seconds(patience_ns);
  return "";
}

bool optsOut(const Dictionary& answer) { return answer.contains("SPACEKEEP_OPT_OUT"); }

}  // namespace

Subject::Subject(SubjectOptions options, std::string folder)
    : options_(std::move(options)),
      folder_(std::move(folder)),
      daemon_(engine_, folder_ + "/spacekeep.sock") {}

Subject::~Subject() {
  closeLine();
  process_.reset();  // while there still is a daemon for it
}

std::string Subject::begin() {
  if (options_.command.empty()) {
    return tryToConnect() ? "" : "nobody listens at " + options_.endpoint;
  }
  std::string why = daemon_.open();
  if (!why.empty()) return why;
  listening_ = ipc::bindListeningSocket(folder_ + "/service.sock", 0666, why);
  return listening_ == nullptr ? why : launch();
}

std::string Subject::launch() {
  process_.reset();
  auto started = LaunchedService::start({.command = options_.command,
                                         .daemon_socket = folder_ + "/spacekeep.sock",
                                         .listening_fd = listening_->fd(),
                                         .output_path = outputPath()});
  if (const auto* why = std::get_if<std::string>(&started)) return *why;
  process_ = std::move(std::get<std::unique_ptr<LaunchedService>>(started));
  return "";
}

/// A service that was handed a listening socket accepts at it; one that checks in leaves the
/// connection in the backlog, where it does no harm.
bool Subject::tryToConnect() {
  const std::string path = options_.command.empty() ? options_.endpoint : folder_ + "/service.sock";
  std::string ignored;
  const auto socket = ipc::connectSocket(path, ignored);
  if (socket == nullptr) return false;
  closeLine();
  line_ = std::make_unique<ServiceLine>(engine_.loop, socket);
  return true;
}

void Subject::closeLine() {
  if (line_ == nullptr) return;
  for (auto& surplus : line_->surplusAnswers()) surplus_.push_back(std::move(surplus));
  line_.reset();
}

void Subject::takeUp(CheckIn check_in) {
  closeLine();
  line_ = std::make_unique<ServiceLine>(engine_.loop, check_in.endpoint);
  check_in.endpoint.reset();  // the line has its own; the service must see the end of the stream
  check_in_ = std::move(check_in);
}

std::string Subject::reach(std::uint64_t timeout_ns) {
  if (!check_in_ && !reachable() && !tryToConnect()) return "nobody listens at " + name();
  bool answering = false;
  std::optional<std::uint64_t> ended_at;
  const auto settled = [&] {
    if (auto check_in = daemon_.takeCheckIn()) takeUp(std::move(*check_in));
    answering = reachable() && line_->ready();
    if (answering) return true;
    if (!processEnd()) return false;
    // A program that goes into the background ends first and checks in later.
    if (!ended_at) ended_at = rt::ticks();
    return elapsedNs(*ended_at, rt::ticks()) > kAfterAnEarlyEndNs;
  };
  within(timeout_ns, settled);
  if (answering) {
    if (check_in_) DaemonStandIn::welcome(*check_in_);
    return "";
  }
  if (const auto end = processEnd()) return "its process " + *end + " before it was reached";
  if (options_.command.empty()) return "it did not take a connection within " + seconds(timeout_ns);
  if (check_in_) return fmt::format("within {} it did not check in again", seconds(timeout_ns));
  return fmt::format(
      "within {} it neither checked in nor took a connection at the socket that was handed over to "
      "it. A service that checks in finds the daemon's socket in SPACEKEEP_SOCKET (the library "
      "looks there by itself), or where {{socket}} stands in its command",
      seconds(timeout_ns));
}

std::string Subject::reachAgain() {
  if (reachable()) return "";
  if (process_ != nullptr && process_->ended()) {
    check_in_.reset();
    closeLine();
    if (std::string why = launch(); !why.empty()) return why;
  }
  return reach(options_.patience_ns);
}

void Subject::goAway() {
  if (check_in_) daemon_.close();
  closeLine();
}

std::string Subject::comeBack() {
  if (check_in_) {
    if (std::string why = daemon_.open(); !why.empty()) return why;
  }
  return reachAgain();
}

bool Subject::endedInPeace() { return !check_in_ && process_ != nullptr && process_->ended() == 0; }

Asked Subject::ask(const char* member, int urgency, const Dictionary& info,
                   std::uint64_t limit_ns) {
  if (ledger_.silent_members.contains(member)) {
    return {.answer = {}, .problem = "was not answered before and is not asked again"};
  }
  ++ledger_.requests;
  Asked asked = answerTo(line_->call(member, {urgency, info}));
  judge(member, urgency, asked, limit_ns);
  return asked;
}

void Subject::judge(const char* member, int urgency, const Asked& asked, std::uint64_t limit_ns) {
  const std::string call = fmt::format("{} at urgency {}", member, urgency);
  if (!asked.answer) {
    if (asked.silent) ledger_.silent_members.insert(member);
    ledger_.unanswered.push_back(fmt::format("{} {}.", call, asked.problem));
    return;
  }
  // A query that is answered with nothing counts as 0; an opt-out needs no amount.
  const bool is_query = std::string_view(member) == "servicePurgeable";
  const bool needs_amount = !is_query || !(asked.without_dictionary || optsOut(*asked.answer));
  if (const auto wrong = Ledger::problemOfAmount(*asked.answer); needs_amount && !wrong.empty()) {
    ledger_.malformed.push_back(fmt::format("The answer to {} {}.", call, wrong));
  }
  if (asked.elapsed_ns > limit_ns) {
    ledger_.late.push_back(fmt::format("{} was answered after {:.1f} s; the daemon waits {}.", call,
                                       static_cast<double>(asked.elapsed_ns) / 1e9,
                                       seconds(limit_ns)));
  }
}

Asked Subject::answerTo(ServiceLine::CallNumber call) {
  const auto state = line_->waitFor(call, options_.patience_ns);
  Asked asked{.answer = {},
              .problem = problemOf(state, options_.patience_ns),
              .silent = !state.settled(),
              .elapsed_ns = elapsedNs(state.sent_ticks, state.answered_ticks)};
  if (!state.answer) return asked;
  asked.answer.emplace();
  if (state.answer->empty()) return asked;
  const auto* dictionary = std::get_if<ipc::OptionalDictionary>(&state.answer->front());
  asked.without_dictionary = dictionary != nullptr && !dictionary->has_value();
  if (dictionary != nullptr && dictionary->has_value()) asked.answer = **dictionary;
  return asked;
}

std::string Subject::name() const {
  if (check_in_) return check_in_->id;
  return options_.command.empty() ? options_.endpoint : options_.command.front();
}

std::optional<pid_t> Subject::pid() const {
  if (check_in_ && check_in_->pid > 0) return check_in_->pid;
  if (process_ != nullptr) return process_->pid();
  return std::nullopt;
}

std::optional<std::string> Subject::processEnd() {
  const pid_t caller = check_in_ ? check_in_->pid : 0;
  if (caller > 0 && (process_ == nullptr || caller != process_->pid())) {
    // A child of what was started, or a service in the background: how it ended is not ours to know.
    return kill(caller, 0) != 0 && errno == ESRCH ? std::optional<std::string>("ended")
                                                  : std::nullopt;
  }
  if (process_ == nullptr) return std::nullopt;
  const auto status = process_->ended();
  return status ? std::optional(textOfEnd(*status)) : std::nullopt;
}

std::vector<std::string> Subject::surplusAnswers() const {
  auto all = surplus_;
  if (line_ != nullptr) {
    for (auto& surplus : line_->surplusAnswers()) all.push_back(std::move(surplus));
  }
  return all;
}

}  // namespace spacekeep::ctl
