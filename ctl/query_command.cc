#include <fmt/core.h>
#include <spacekeep/client.h>
#include <unistd.h>

#include <cstdio>
#include <utility>

#include "ctl/commands.h"
#include "ctl/daemon_link.h"
#include "ctl/known_keys.h"
#include "ctl/query_display.h"
#include "ctl/query_report.h"
#include "ctl/shown_call.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

/// Looking into the memory is a courtesy: when it fails, or takes long, the query goes on without.
std::optional<AnswerDates> rememberedBy(sdk::Client& client, const std::string& volume) {
  constexpr std::chrono::milliseconds kPatience{3'000};
  const sdk::StateReply reply = client.state(kRecentStatsKey, kPatience);
  if (reply.error) return std::nullopt;
  return answerDates(reply.value, volume);
}

sdk::Reply ask(sdk::Client& client, const QueryOptions& options, const std::string& volume,
               QueryDisplay& display) {
  Dictionary request{{"SPACEKEEP_VOLUME", volume}};
  if (options.urgency) request.set("SPACEKEEP_URGENCY", *options.urgency);
  const auto operation =
      options.itemized ? sdk::Operation::kItemizedPurgeableSpace : sdk::Operation::kPurgeableSpace;
  return callShowing(
      [&](sdk::Client::ReplyHandler handler) {
        client.callAsync(operation, request, std::move(handler));
      },
      [&display](double elapsed_seconds) { display.show(elapsed_seconds); });
}

ExitCode refusal(const CommonOptions& common, const QueryOptions& options) {
  return complain(
      common, ExitCode::kRefused,
      fmt::format("the daemon refused: either this user does not hold \"{}\", or {} is "
                  "not the mount point of a local volume (the daemon's log tells "
                  "which)",
                  options.itemized ? "ITEMIZED_PURGEABLE_ENTITLEMENT" : "PURGEABLE_ENTITLEMENT",
                  options.volume));
}

void present(const CommonOptions& common, const QueryOptions& options, const QueryReport& report) {
  const Style style = styleOf(STDOUT_FILENO);
  if (common.json) {
    fmt::print("{}\n", jsonOf(report, options.itemized));
  } else {
    fmt::print("{}", options.itemized ? itemizedTableOf(report, style) : summaryOf(report, style));
  }
}

}  // namespace

ExitCode runQuery(const CommonOptions& common, const QueryOptions& options) {
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  const std::string volume = withoutTrailingSlashes(options.volume);
  MemoryOfDaemon memory{.before = rememberedBy(*client, volume), .after = {}, .now = {}};
  sdk::Reply reply;
  {
    const Style style = styleOf(STDERR_FILENO);
    const bool shown = style.terminal && !common.json;
    QueryDisplay display(shown ? stderr : nullptr, volume, style.columns);
    reply = ask(*client, options, volume, display);
  }
  if (reply.error) return complain(common, *reply.error);
  if (reply.refused()) return refusal(common, options);
  memory.now = Date{rt::wallClockNs()};
  memory.after = rememberedBy(*client, volume);
  present(common, options, queryReport(*reply.outcome, memory, measuredSpaceOf(volume)));
  return ExitCode::kDone;
}

}  // namespace spacekeep::ctl
