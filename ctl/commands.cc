#include "ctl/commands.h"

#include <fmt/core.h>
#include <spacekeep/client.h>
#include <unistd.h>

#include <cstdio>
#include <memory>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/progress_display.h"
#include "ctl/purge_report.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

constexpr int kDefaultUrgency = 3;  // the daemon's, for the estimate

ExitCode exitCodeOf(sdk::ErrorKind kind) {
  switch (kind) {
    case sdk::ErrorKind::kUnreachable:
      return ExitCode::kUnreachable;
    case sdk::ErrorKind::kNotAllowed:
      return ExitCode::kRefused;
    case sdk::ErrorKind::kDisconnected:
    case sdk::ErrorKind::kTimedOut:
    case sdk::ErrorKind::kNotSupported:
    case sdk::ErrorKind::kInvalidArgument:
    case sdk::ErrorKind::kFailed:
      return ExitCode::kFailed;
  }
  return ExitCode::kFailed;
}

ExitCode complain(const CommonOptions& common, ExitCode code, const std::string& text) {
  if (common.json) fmt::print("{}\n", jsonOf(Value(Dictionary{{"error", text}})));
  fmt::print(stderr, "spacekeepctl: {}\n", text);
  return code;
}

ExitCode complain(const CommonOptions& common, const sdk::Error& error) {
  return complain(common, exitCodeOf(error.kind), error.text);
}

/// Clock readings in seconds since the object was made.
class Stopwatch {
 public:
  [[nodiscard]] double seconds() const {
    const auto base = rt::timebase().value_or(rt::Timebase{1, 1});
    return static_cast<double>(rt::ticks() - start_) * base.numerator / base.denominator / 1e9;
  }

 private:
  const std::uint64_t start_ = rt::ticks();
};

ProgressDisplay::Kind displayKind(const CommonOptions& common) {
  if (common.json) return ProgressDisplay::Kind::kNone;
  return isatty(STDERR_FILENO) == 1 ? ProgressDisplay::Kind::kTerminal
                                    : ProgressDisplay::Kind::kLines;
}

sdk::Reply purgeWithProgress(sdk::Client& client, const sdk::PurgeRequest& request,
                             ProgressDisplay& display) {
  constexpr std::uint64_t kRenewNs = 200'000'000;
  struct Slot {
    CountingSemaphore filled{0};
    sdk::Reply reply;
  };
  const auto slot = std::make_shared<Slot>();
  const Stopwatch watch;
  client.purgeAsync(request, [slot](sdk::Reply reply) {
    slot->reply = std::move(reply);
    slot->filled.signal();
  });
  do {
    display.show(watch.seconds());
  } while (slot->filled.waitForNs(kRenewNs) == WaitResult::kTimedOut);
  return std::move(slot->reply);
}

/// Shells complete a directory with a slash; the mount table knows the volume without it.
std::string withoutTrailingSlashes(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

sdk::PurgeRequest requestOf(const PurgeOptions& options) {
  sdk::PurgeRequest request;
  request.volume = withoutTrailingSlashes(options.volume);
  request.amount = options.amount;
  request.urgency = options.urgency;
  request.timeout_seconds = options.timeout_seconds;
  if (options.token) request.token = Value(*options.token);
  if (!options.wait_all) request.finish_early = true;
  return request;
}

ExitCode present(const CommonOptions& common, const PurgeReport& report) {
  fmt::print("{}", common.json ? jsonOf(report) + "\n" : tableOf(report));
  if (report.error) return ExitCode::kRefused;
  return report.reached() ? ExitCode::kDone : ExitCode::kNotReached;
}

}  // namespace

ExitCode runPurge(const CommonOptions& common, const PurgeOptions& options) {
  auto client = sdk::Client::connect({.socket_path = common.socket_path, .on_disconnect = {}});
  if (!client) return complain(common, client.error());
  sdk::Reply reply;
  {
    ProgressDisplay display(displayKind(common),
                            {.asked_bytes = options.amount,
                             .urgency_limit = options.urgency.value_or(kDefaultUrgency),
                             .timeout_seconds = options.timeout_seconds},
                            options.volume, stderr);
    reply = purgeWithProgress(*client, requestOf(options), display);
  }
  if (reply.error) return complain(common, *reply.error);
  if (reply.refused()) {
    return complain(common, ExitCode::kRefused,
                    fmt::format("the daemon refused: either this user does not hold "
                                "\"PURGE_ENTITLEMENT\", or {} is not the mount point of a local "
                                "volume (the daemon's log tells which)",
                                options.volume));
  }
  return present(common, purgeReport(*reply.outcome, options.amount));
}

ExitCode runCancel(const CommonOptions& common, const std::string& token) {
  auto client = sdk::Client::connect({.socket_path = common.socket_path, .on_disconnect = {}});
  if (!client) return complain(common, client.error());
  const sdk::Status status = client->cancel(Value(token));
  if (status.error) return complain(common, *status.error);
  if (common.json) {
    fmt::print("{}\n", jsonOf(Value(Dictionary{{"accepted", true}, {"token", token}})));
  } else {
    fmt::print(
        "The daemon took the cancel request. It answers every such request the same way, and "
        "does not stop a purge that runs or waits: the purge goes on to its end.\n");
  }
  return ExitCode::kDone;
}

}  // namespace spacekeep::ctl
