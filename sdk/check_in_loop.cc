#include "sdk/check_in_loop.h"

#include <fmt/core.h>

#include <algorithm>
#include <optional>
#include <utility>

#include "client/client_protocol.h"
#include "sdk/failure.h"
#include "sdk/retry_pause.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::sdk {
namespace {

/// A host that stops while its check-in is on the way goes on answering pings for this long: the
/// daemon pings a new service without a time limit, so leaving just then would block its registry.
constexpr std::uint64_t kGraceNs = 2'000'000'000;
/// Serving for this long counts as success, and the pauses begin small again.
constexpr std::uint64_t kSteadyNs = 10'000'000'000;

ipc::ServerOptions optionsOfOneConnection() {
  ipc::ServerOptions options;
  options.limits.connections = 1;
  return options;
}

}  // namespace

/// Shared with handlers that may run after the session has ended.
struct CheckInLoop::Session {
  struct Answer {
    ipc::OptionalDictionary result;
    std::string error;  ///< empty unless the check-in failed
  };
  // Changed through HostControl::change(), also after the session is over.
  bool daemon_lost = false;
  bool service_lost = false;
  std::optional<Answer> answer;
  // Of the supervising thread.
  std::shared_ptr<ipc::Connection> daemon;
  std::unique_ptr<ipc::BusServer> server;

  [[nodiscard]] bool over() const { return daemon_lost || service_lost; }
  [[nodiscard]] std::string whyOver() const {
    return daemon_lost ? "the connection to the daemon ended"
                       : "the daemon closed the service's connection";
  }
};

CheckInLoop::CheckInLoop(std::string id, CheckInOptions options, Engine& engine,
                         std::shared_ptr<HostControl> control,
                         std::shared_ptr<ServedService> served)
    : id_(std::move(id)),
      options_(std::move(options)),
      engine_(engine),
      control_(std::move(control)),
      served_(std::move(served)) {}

void CheckInLoop::run() {
  while (!control_->stopping()) {
    const std::uint64_t steady_ticks = rt::deadlineAfterNs(kSteadyNs);
    const std::string why = runSession();
    if (control_->stopping()) break;
    failures_ = rt::ticks() >= steady_ticks ? 1 : failures_ + 1;
    pauseAfter(why);
  }
}

std::string CheckInLoop::runSession() {
  control_->report(HostState::kConnecting);
  const auto session = std::make_shared<Session>();
  std::string why;
  session->daemon = ipc::connectToPath(engine_.loop, engine_.queue, options_.socket_path, why);
  if (!session->daemon) {
    return fmt::format("cannot connect to the daemon at {}: {}", options_.socket_path, why);
  }
  startCheckIn(session);
  why = awaitAnswer(*session);
  // Both connections end together: were only one left, the daemon would take the next check-in for
  // a repetition of this one and keep what it has.
  session->daemon->invalidate();
  session->daemon.reset();  // it holds handlers that hold the session
  session->server.reset();
  served_->cancelAll();
  return why;
}

void CheckInLoop::startCheckIn(const std::shared_ptr<Session>& session) {
  const auto lost = [control = control_, session] {
    control->change([&] { session->daemon_lost = true; });
  };
  session->daemon->setInvalidationHandler(lost);
  session->daemon->setInterruptionHandler(lost);
  session->daemon->setRemoteInterface(spacekeepClientInterface());
  session->daemon->resume();

  const ipc::SocketPair pair = ipc::makeSocketPair();
  if (!pair.first || !pair.second) {
    session->answer = Session::Answer{std::nullopt, "this process has no file descriptor left"};
    return;
  }
  // Serving begins before the call goes out, because the daemon pings before it answers.
  session->server = std::make_unique<ipc::BusServer>(
      engine_.loop, engine_.queue, served_->interface(), optionsOfOneConnection());
  session->server->serveConnected(pair.first, [control = control_, session] {
    control->change([&] { session->service_lost = true; });
  });
  const auto proxy =
      session->daemon->remoteProxy([control = control_, session](const ipc::Error& e) {
        const std::string text = failureOf(e, "clientCheckin").text;
        control->change([&] { session->answer = Session::Answer{std::nullopt, text}; });
      });
  proxy->call("clientCheckin", {id_, pair.second, checkInInfo()},
              [control = control_, session](ipc::Arguments out) {
                control->change([&] {
                  session->answer = Session::Answer{
                      std::get<ipc::OptionalDictionary>(out.at(0)),
                      std::get<ipc::OptionalString>(out.at(1)).value_or(std::string())};
                });
              });
}

Dictionary CheckInLoop::checkInInfo() const {
  Array names;
  for (const auto& name : options_.notifications) names.emplace_back(name);
  return {{"PURGE", options_.does_purge},
          {"PERIODIC", options_.does_periodic},
          {"SPACEKEEP_NOTIFICATIONS", std::move(names)}};
}

std::string CheckInLoop::awaitAnswer(Session& session) {
  control_->report(HostState::kCheckingIn);
  const auto settled = [&session] { return session.answer.has_value() || session.over(); };
  const auto patience_ms = std::max<std::int64_t>(0, options_.patience.count());
  const std::uint64_t patience =
      rt::deadlineAfterNs(static_cast<std::uint64_t>(patience_ms) * 1'000'000);
  if (!control_->waitUntil(patience, settled) && !control_->stopping()) {
    control_->report(HostState::kCheckingIn,
                     "the daemon has not answered the check-in yet; it answers late while it waits "
                     "for another service, or while it does not get an answer to its ping");
    control_->waitUntil(rt::kNever, settled);
  }
  // Time for the rest of what is on its way: after a wish to stop, the daemon's ping; after the
  // service's connection was closed, the answer that may say why.
  const auto answered = [&session] { return session.answer.has_value() || session.daemon_lost; };
  if (control_->waitUntil(rt::deadlineAfterNs(kGraceNs), answered, false)) {
    return serveUntilLost(session);
  }
  return "the daemon dropped the check-in without an answer, as it does when this user does not "
         "hold "
         "\"SERVICE_ENTITLEMENT\"";
}

std::string CheckInLoop::serveUntilLost(Session& session) {
  std::optional<Session::Answer> answer;
  control_->look([&] { answer = session.answer; });
  if (!answer) return whyOver(session);
  if (!answer->error.empty()) return "the check-in failed: " + answer->error;
  const bool refused = !answer->result.has_value();
  if (refused) {
    // The declared IDs stay the same for as long as the daemon runs, so only a new one may help.
    control_->report(
        HostState::kRefused,
        fmt::format("the daemon does not take \"{}\" at run time, because a service "
                    "descriptor file declares it; serve at the socket that the service "
                    "manager hands over instead",
                    id_));
    session.server.reset();
    control_->waitUntil(rt::kNever, [&session] { return session.daemon_lost; });
  } else {
    control_->report(HostState::kServing);
    control_->waitUntil(rt::kNever, [&session] { return session.over(); });
  }
  return whyOver(session);
}

std::string CheckInLoop::whyOver(const Session& session) const {
  std::string why;
  control_->look([&] { why = session.whyOver(); });
  return why;
}

void CheckInLoop::pauseAfter(const std::string& why) {
  const std::uint64_t pause_ns = retryPauseNs(failures_, rt::randomNumber());
  control_->report(HostState::kWaiting, fmt::format("{}; trying again in {:.1f} seconds", why,
                                                    static_cast<double>(pause_ns) / 1e9));
  control_->waitUntil(rt::deadlineAfterNs(pause_ns), [] { return false; });
}

}  // namespace spacekeep::sdk
