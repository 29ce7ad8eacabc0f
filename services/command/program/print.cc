#include <fmt/core.h>

#include <algorithm>
#include <cstdio>
#include <numeric>

#include "ctl/size_text.h"
#include "services/cachedir/program/stop_signals.h"
#include "services/command/engine/cache_set.h"
#include "services/command/program/modes.h"

namespace spacekeep::command {
namespace {

/// A file name may hold anything; a line of output holds one of them.
std::string printable(const std::string& text) {
  std::string shown;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    const bool plain = byte >= 0x20 && byte != 0x7f && c != '\\';
    shown += plain ? std::string(1, c) : fmt::format("\\x{:02x}", byte);
  }
  return shown;
}

void printProblems(const std::vector<std::string>& problems) {
  for (const std::string& problem : problems) fmt::print(stderr, "{}\n", printable(problem));
}

struct Row {
  std::string name;
  Offer offer;
  bool enabled = true;
};

std::string cell(const Offer& offer, std::size_t urgency) {
  const std::string size = ctl::printSize(offer.bytes[urgency]);
  return offer.unknown[urgency] ? (offer.bytes[urgency] > 0 ? size + "+?" : "?") : size;
}

void printRow(const Row& row, std::size_t width) {
  fmt::print("{:<{}}", row.name + (row.enabled ? "" : " (off)"), width);
  for (std::size_t i = 0; i < kUrgencies; ++i) fmt::print("  {:>10}", cell(row.offer, i));
  fmt::print("{}{}\n", row.offer.note.empty() ? "" : "  ", row.offer.note);
}

Row sumOf(const std::vector<Row>& rows) {
  Row sum{"total", {}, true};
  for (const Row& row : rows) {
    if (!row.enabled) continue;
    for (std::size_t i = 0; i < kUrgencies; ++i) {
      sum.offer.bytes[i] += row.offer.bytes[i];
      sum.offer.unknown[i] = sum.offer.unknown[i] || row.offer.unknown[i];
    }
  }
  return sum;
}

}  // namespace

ExitCode freeOnce(std::vector<Rule> rules, const UserFolders* folders, const Options& options) {
  CacheSet set(std::move(rules), folders);
  std::atomic<bool> stopped{false};
  const cachedir::StopSignals signals([&stopped] { stopped = true; });
  const bool dry_run = options.mode == Mode::kDryRun;
  const Result result =
      set.free({.amount = options.amount,
                .urgency = options.urgency,
                .volume = options.volume,
                .dry_run = dry_run},
               CancelToken([&stopped] { return stopped.load(); }),
               [](const std::string& what, std::optional<std::uint64_t> bytes) {
                 fmt::print("{}\t{}\n", bytes ? std::to_string(*bytes) : "?", printable(what));
               });
  std::fflush(stdout);
  printProblems(result.problems);
  fmt::print(stderr, "{} {} bytes ({}){}\n", dry_run ? "would free" : "freed", result.bytes,
             ctl::printSize(result.bytes), stopped ? ", stopped early" : "");
  const bool all = options.amount == std::numeric_limits<std::uint64_t>::max();
  return all || result.bytes >= options.amount ? ExitCode::kDone : ExitCode::kLessThanAsked;
}

ExitCode printTable(std::vector<Rule> rules, const UserFolders* folders, const Options& options) {
  std::vector<Row> rows;
  std::vector<std::string> problems;
  for (Rule& rule : rules) {
    const auto cache = makeCache(std::move(rule), folders);
    Row row{cache->rule().name, cache->offer(options.volume, CancelToken()), cache->rule().enabled};
    for (const auto& problem : row.offer.problems) problems.push_back(row.name + ": " + problem);
    rows.push_back(std::move(row));
  }
  const std::size_t width = std::accumulate(
      rows.begin(), rows.end(), std::size_t{5},
      [](std::size_t most, const Row& row) { return std::max(most, row.name.size() + 6); });
  fmt::print("{:<{}}  {:>10}  {:>10}  {:>10}  {:>10}\n", "rule", width, "urgency 1", "urgency 2",
             "urgency 3", "urgency 4");
  for (const Row& row : rows) printRow(row, width);
  printRow(sumOf(rows), width);
  std::fflush(stdout);
  printProblems(problems);
  return ExitCode::kDone;
}

ExitCode describe(const std::vector<Rule>& rules) {
  for (const Rule& rule : rules) {
    fmt::print("{} ({}): {}\n", rule.name, rule.enabled ? "on" : "off", rule.description);
    for (std::size_t i = 0; i < kUrgencies; ++i) {
      if (!rule.takes[i].empty()) fmt::print("  urgency {} takes {}\n", i + 1, rule.takes[i]);
    }
    if (!rule.loses.empty()) fmt::print("  lost: {}\n", rule.loses);
    if (!rule.source.empty()) fmt::print("  source: {}\n", rule.source);
  }
  return ExitCode::kDone;
}

}  // namespace spacekeep::command
