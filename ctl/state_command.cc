#include <fmt/core.h>
#include <spacekeep/client.h>
#include <unistd.h>

#include <set>
#include <utility>
#include <variant>

#include "ctl/commands.h"
#include "ctl/daemon_link.h"
#include "ctl/json_text.h"
#include "ctl/known_keys.h"
#include "ctl/state_table.h"
#include "ctl/state_value.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

void printJson(Dictionary object) { fmt::print("{}\n", jsonOf(Value(std::move(object)))); }

std::string withoutValueText(const std::string& key) {
  const KnownKey* known = knownKey(key);
  if (known == nullptr || known->default_text.empty()) {
    return fmt::format("{} has no value", harmless(key));
  }
  return fmt::format("{} has no value, so its default {} holds", key, known->default_text);
}

ExitCode notDone(const CommonOptions& common, const std::string& key, const char* what,
                 const sdk::Error& error) {
  return complain(common, exitCodeOf(error.kind),
                  fmt::format("{} was not {}: {}", harmless(key), what, error.text));
}

/// Says what is wrong with a value that the daemon would not work with. True: send it all the same.
bool mayBeSent(const StateOptions& options, const std::optional<std::string>& objection) {
  if (!objection) return true;
  if (options.force) remark("warning: " + *objection);
  return options.force;
}

ExitCode sendSet(const CommonOptions& common, const StateOptions& options, const Value& value) {
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  const sdk::Status status = client->setState(options.key, value);
  if (status.error) return notDone(common, options.key, "set", *status.error);
  if (common.json) {
    printJson({{"key", options.key}, {"value", value}});
  } else {
    fmt::print("{} is now {}, {}\n", harmless(options.key), printValueOf(options.key, value),
               kindText(value));
  }
  return ExitCode::kDone;
}

/// For completions: the keys that mean something stand there without a daemon too, and a busy daemon
/// does not keep the terminal waiting.
ExitCode listNames(const CommonOptions& common) {
  constexpr std::chrono::milliseconds kPatience{3'000};
  auto state = wholeState(common, kPatience);
  std::set<std::string> names;
  for (const auto& known : settableKeys()) names.emplace(known.name);
  if (state) {
    for (const auto& [key, value] : *state) names.insert(harmless(key));
  }
  for (const auto& name : names) fmt::print("{}\n", name);
  if (state) return ExitCode::kDone;
  remark(state.error().text);  // also with --json: the output is names
  return exitCodeOf(state.error().kind);
}

}  // namespace

ExitCode runStateGet(const CommonOptions& common, const StateOptions& options) {
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  const sdk::StateReply reply = client->state(options.key);
  if (reply.error) return complain(common, *reply.error);
  if (!reply.value) return complain(common, ExitCode::kNoValue, withoutValueText(options.key));
  if (common.json) {
    printJson({{"key", options.key}, {"value", *reply.value}});
  } else {
    fmt::print("{}\n", printStateValue(*reply.value));
  }
  return ExitCode::kDone;
}

ExitCode runStateSet(const CommonOptions& common, const StateOptions& options) {
  const auto parsed = parseStateValue(options.value, options.type);
  if (const auto* error = std::get_if<ValueError>(&parsed)) {
    return complain(common, ExitCode::kUsage, error->text);
  }
  const Value& value = std::get<Value>(parsed);
  const auto objection = objectionTo(options.key, value);
  if (!mayBeSent(options, objection)) {
    return complain(common, ExitCode::kUsage,
                    fmt::format("{}. Nothing was sent; --force sends it all the same", *objection));
  }
  return sendSet(common, options, value);
}

ExitCode runStateUnset(const CommonOptions& common, const StateOptions& options) {
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  const sdk::Status status = client->setState(options.key, std::nullopt);
  if (status.error) return notDone(common, options.key, "unset", *status.error);
  if (common.json) {
    printJson({{"key", options.key}});
  } else {
    fmt::print("{}\n", withoutValueText(options.key));
  }
  return ExitCode::kDone;
}

ExitCode runStateList(const CommonOptions& common, const StateOptions& options) {
  if (options.names) return listNames(common);
  auto state = wholeState(common);
  if (!state) return complain(common, state.error());
  if (common.json) {
    printJson({{"state", std::move(*state)}});
  } else {
    fmt::print("{}", stateTableOf(*state, styleOf(STDOUT_FILENO)));
  }
  return ExitCode::kDone;
}

}  // namespace spacekeep::ctl
