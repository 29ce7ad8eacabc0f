// Rule files of the command service: two directories of files that hold anything, of which the later
// one replaces single keys of the earlier. What is taken for a rule runs programs and removes files,
// so each of its promises is looked at again here. Then what such a program may print.
#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "fuzz/helpers/fuzzed_files.h"
#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "services/command/engine/output_amount.h"
#include "services/command/rules/rule_files.h"

namespace spacekeep::command {
namespace {

using fuzz::require;

const std::vector<std::string> kWords{"SPACEKEEP_ID",
                                      "SPACEKEEP_SERVICES",
                                      "ENABLED",
                                      "TAKES",
                                      "NOT_WHILE",
                                      "IDLE_PROCESSES",
                                      "OWNERS_LOCKS",
                                      "DIRECTORIES",
                                      "MEASURE",
                                      "CLEAN",
                                      "PATH",
                                      "UNUSED_DAYS",
                                      "KEEP",
                                      "COMMAND",
                                      "TIMEOUT_SECONDS",
                                      "AMOUNT",
                                      "FILES",
                                      "AFTER",
                                      "COLUMN",
                                      "PATHS",
                                      "PROCESS",
                                      "LOCKED",
                                      "WHOLE_DIRECTORIES",
                                      "OPEN",
                                      "FLOCK",
                                      "1",
                                      "2",
                                      "3",
                                      "4",
                                      "~/x",
                                      "/a/b",
                                      "$XDG_CACHE_HOME/*",
                                      "{AMOUNT}",
                                      "com.example.one"};
const std::array<std::string, 4> kNames{"vendor/a.plist", "admin/a.plist", "vendor/b.plist",
                                        "admin/c.plist"};

const UserFolders& userFolders() {
  static const UserFolders folders{.uid = 1000,
                                   .name = "user",
                                   .home = "/srv/user",
                                   .cache = "/srv/user/.cache",
                                   .data = "/srv/user/.local/share",
                                   .config = "/srv/user/.config",
                                   .state = "/srv/user/.local/state",
                                   .runtime = "",
                                   .problems = {}};
  return folders;
}

void requireStraightPath(const std::string& path) {
  require(path.starts_with('/'), "a path begins at the root");
  const std::string framed = path + "/";
  require(framed.find("/../") == std::string::npos && framed.find("//") == std::string::npos,
          "a path leads nowhere but down");
}

void requireSound(const cachedir::Rules& rules) {
  require(rules.directories.size() <= cachedir::kMaxDirectories, "directories are bounded");
  for (const cachedir::DirectoryRule& each : rules.directories) {
    requireStraightPath(each.path);
    require(each.path != "/" && each.path != "/usr" && each.path != "/etc",
            "a directory of the system is no cache");
    std::int64_t spared = INT64_MAX;
    for (const std::int64_t seconds : each.unused_seconds) {
      require(seconds >= 0 && seconds <= spared, "a higher urgency spares no younger files");
      spared = seconds;
    }
  }
}

void requireSound(const Words& command, std::uint64_t limit_ns) {
  require(!command.empty() && command.size() <= kMaxWords, "a command has words, and not too many");
  for (const std::string& word : command) {
    require(!word.empty() && word.find('\0') == std::string::npos, "a word can be passed on");
  }
  require(limit_ns >= 1'000'000'000 && limit_ns <= kMaxToolSeconds * 1'000'000'000,
          "a command ends some time");
}

void requireSound(const ToolCache& cache) {
  require(!cache.measured.directories.empty(), "what shrinks is measured");
  requireSound(cache.measured);
  for (const auto& step : cache.steps) {
    if (!step) continue;
    requireSound(step->command, step->limit_ns);
    if (const auto* told = std::get_if<ToldByTool>(&step->preview)) {
      requireSound(told->command, told->limit_ns);
    }
  }
}

void requireSound(const Rule& rule) {
  require(!rule.service_id.empty(), "a rule names its service");
  require(rule.not_while.size() <= kMaxConditions, "conditions are bounded");
  for (const Condition& each : rule.not_while) {
    if (each.kind != Condition::Kind::kProcess) requireStraightPath(each.subject);
    require(!each.subject.empty(), "a condition is about something");
  }
  for (const OwnersLock& lock : rule.locks) requireStraightPath(lock.path);
  if (const auto* tool = std::get_if<ToolCache>(&rule.cache)) return requireSound(*tool);
  const auto& caches = std::get<DirectoryCaches>(rule.cache);
  require(!caches.files.directories.empty() || !caches.whole.directories.empty(),
          "a rule gives up something");
  requireSound(caches.files);
  requireSound(caches.whole);
}

void examineFiles(fuzz::PieceReader& input) {
  static fuzz::FuzzedDirectory directory;
  const UserFolders* folders = input.byte() % 2 == 0 ? &userFolders() : nullptr;
  for (std::size_t files = 0; files < 4 && !input.usedUp(); ++files) {
    const std::string& name = kNames.at(input.byte() % kNames.size());
    directory.write(name, fuzz::fileContent(input, kWords));
  }
  const RulesWanted wanted{.files = {},
                           .folders = {directory.path() + "/vendor", directory.path() + "/admin"},
                           .only = {}};
  const auto read = readRules(wanted, folders);
  directory.clear();
  if (const auto* error = std::get_if<cachedir::RuleError>(&read)) {
    return require(fuzz::isOneLine(error->text), "a refusal is one line");
  }
  for (const Rule& rule : std::get<std::vector<Rule>>(read)) requireSound(rule);
}

void examineOutput(fuzz::PieceReader& input) {
  const std::uint8_t choice = input.byte();
  const AmountInOutput how{
      .kind = choice % 2 == 0 ? AmountInOutput::Kind::kAfter : AmountInOutput::Kind::kColumn,
      .after = "freed ",
      .column = choice / 2 % 4 + std::size_t{1},
      .base = choice % 16 < 8 ? std::uint64_t{1000} : std::uint64_t{1024}};
  const std::string output(input.rest());
  const auto once = amountIn(output, how);
  const auto twice = amountIn(output + "\n" + output, how);
  require(!once || !twice || *twice >= *once, "more lines tell of no less");
  for (const std::string& path : pathsIn(output, "Would remove ")) {
    require(path.starts_with('/') && path.find('\n') == std::string::npos, "a path is one line");
  }
}

}  // namespace
}  // namespace spacekeep::command

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string text = spacekeep::fuzz::textOfInput(data, size);
  spacekeep::fuzz::PieceReader input(text);
  // Both often, and of each input only one.
  if (input.byte() % 4 == 3) {
    spacekeep::command::examineOutput(input);
  } else {
    spacekeep::command::examineFiles(input);
  }
  return 0;
}
