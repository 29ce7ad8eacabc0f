#include <fmt/core.h>
#include <spacekeep/client.h>
#include <unistd.h>

#include <cstdio>
#include <utility>

#include "ctl/commands.h"
#include "ctl/daemon_link.h"
#include "ctl/json_text.h"
#include "ctl/progress_display.h"
#include "ctl/purge_report.h"
#include "ctl/shown_call.h"
#include "ctl/style.h"
#include "ctl/volume_space.h"

namespace spacekeep::ctl {
namespace {

constexpr int kDefaultUrgency = 3;  // the daemon's, for the estimate

ProgressDisplay::Kind displayKind(const CommonOptions& common) {
  if (common.json) return ProgressDisplay::Kind::kNone;
  return isatty(STDERR_FILENO) == 1 ? ProgressDisplay::Kind::kTerminal
                                    : ProgressDisplay::Kind::kLines;
}

sdk::Reply purgeWithProgress(sdk::Client& client, const sdk::PurgeRequest& request,
                             ProgressDisplay& display) {
  return callShowing(
      [&](sdk::Client::ReplyHandler handler) { client.purgeAsync(request, std::move(handler)); },
      [&display](double elapsed_seconds) { display.show(elapsed_seconds); });
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
  fmt::print("{}", common.json ? jsonOf(report) + "\n" : tableOf(report, styleOf(STDOUT_FILENO)));
  if (report.error) return ExitCode::kRefused;
  return report.reached() ? ExitCode::kDone : ExitCode::kNotReached;
}

}  // namespace

ExitCode runPurge(const CommonOptions& common, const PurgeOptions& options) {
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  sdk::Reply reply;
  {
    ProgressDisplay display(displayKind(common),
                            {.asked_bytes = options.amount,
                             .urgency_limit = options.urgency.value_or(kDefaultUrgency),
                             .timeout_seconds = options.timeout_seconds},
                            options.volume, stderr, styleOf(STDERR_FILENO).columns);
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
  auto client = connectTo(common);
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
