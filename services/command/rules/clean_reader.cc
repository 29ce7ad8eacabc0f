#include "services/command/rules/clean_reader.h"

#include <cmath>

namespace spacekeep::command {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
constexpr std::uint64_t kCleanSeconds = 60;
// A question to the service is waited for 10 seconds, and several caches may share them.
constexpr std::uint64_t kPreviewSeconds = 4;
constexpr std::size_t kMaxPatterns = 64;

constexpr std::string_view kStepKeys[] = {"COMMAND", "TIMEOUT_SECONDS", "AMOUNT"};
constexpr std::string_view kFilesKeys[] = {"FILES", "KEEP", "OLDER_THAN_DAYS", "AGE"};
constexpr std::string_view kToolKeys[] = {"COMMAND", "TIMEOUT_SECONDS", "AFTER",
                                          "COLUMN",  "PATHS",           "BASE"};

void refusePlaceholders(FieldReader& fields, const Words& words, const std::string& where) {
  for (const std::string& word : words) {
    const std::size_t brace = word.find('{');
    if (brace == std::string::npos) continue;
    const std::size_t end = word.find('}', brace);
    const std::string name = word.substr(brace, end == word.npos ? word.npos : end - brace + 1);
    if (name == "{AMOUNT}" || name == "{KEEP}") continue;
    fields.fail(where, "unknown placeholder \"" + name + "\"",
                "use {AMOUNT}, the bytes to free, or {KEEP}, the bytes that may stay");
  }
}

FilesThatGo filesOf(const Dictionary& from, FieldReader& fields, const std::string& where) {
  FilesThatGo files;
  fields.onlyKnown(from, kFilesKeys, where);
  files.patterns = fields.texts(from, "FILES", kMaxPatterns, where + " ");
  files.keep = fields.texts(from, "KEEP", kMaxPatterns, where + " ");
  if (const Value* days = from.find("OLDER_THAN_DAYS")) {
    const auto number = days->asDouble();
    if (!number || !(*number >= 0) || *number > cachedir::kMaxUnusedDays) {
      fields.fail(where + " OLDER_THAN_DAYS", "not a number of days from 0 to 36500", "give one");
    } else {
      files.older_seconds = std::llround(*number * static_cast<double>(cachedir::kSecondsPerDay));
    }
  }
  const std::string age = fields.text(from, "AGE", where + " ");
  if (age == "JOURNAL_NAME") {
    files.age = FilesThatGo::Age::kJournalName;
  } else if (age == "TRASH_RECORD") {
    files.age = FilesThatGo::Age::kTrashRecord;
  } else if (!age.empty() && age != "MODIFIED") {
    fields.fail(where + " AGE", "unknown age \"" + age + "\"",
                "use MODIFIED, JOURNAL_NAME or TRASH_RECORD");
  }
  return files;
}

AmountInOutput outputOf(const Dictionary& from, FieldReader& fields, const std::string& where) {
  AmountInOutput output;
  output.after = fields.text(from, "AFTER", where + " ");
  output.column = fields.number(from, "COLUMN", 1, 64, 0, where + " ");
  output.base = fields.number(from, "BASE", 1000, 1024, 1024, where + " ");
  const bool paths = fields.truth(from, "PATHS", false, where + " ");
  if (paths && output.column == 0) {
    output.kind = AmountInOutput::Kind::kPaths;
  } else if (output.column > 0 && output.after.empty() && !paths) {
    output.kind = AmountInOutput::Kind::kColumn;
  } else if (output.column == 0 && !output.after.empty()) {
    output.kind = AmountInOutput::Kind::kAfter;
  } else {
    fields.fail(where, "not told where the amount stands in the output",
                "give one of AFTER, COLUMN and PATHS (PATHS may go with AFTER)");
  }
  return output;
}

std::uint64_t limitOf(const Dictionary& from, std::uint64_t otherwise, FieldReader& fields,
                      const std::string& where) {
  return fields.number(from, "TIMEOUT_SECONDS", 1, kMaxToolSeconds, otherwise, where + " ") *
         kNsPerSecond;
}

Preview previewOf(const Value& value, FieldReader& fields, const std::string& where) {
  const Dictionary* from = fields.dictionary(value, where);
  if (from == nullptr) return Unknown{};
  if (!from->contains("COMMAND")) return filesOf(*from, fields, where);
  fields.onlyKnown(*from, kToolKeys, where);
  ToldByTool told;
  told.command = fields.words(*from, "COMMAND", where + " ");
  refusePlaceholders(fields, told.command, where + " COMMAND");
  told.limit_ns = limitOf(*from, kPreviewSeconds, fields, where);
  told.amount = outputOf(*from, fields, where);
  return told;
}

CleanStep stepOf(const Dictionary& from, FieldReader& fields, const std::string& where) {
  CleanStep step;
  fields.onlyKnown(from, kStepKeys, where);
  step.command = fields.words(from, "COMMAND", where + " ");
  refusePlaceholders(fields, step.command, where + " COMMAND");
  step.limit_ns = limitOf(from, kCleanSeconds, fields, where);
  if (const Value* amount = from.find("AMOUNT")) {
    step.preview = previewOf(*amount, fields, where + " AMOUNT");
  }
  return step;
}

}  // namespace

void readClean(const Dictionary& top, FieldReader& fields,
               std::array<std::optional<CleanStep>, kUrgencies>& steps) {
  const Value* value = top.find("CLEAN");
  const Dictionary* by_urgency = value == nullptr ? nullptr : value->dictionary();
  if (by_urgency == nullptr || by_urgency->empty()) {
    fields.fail("CLEAN", "missing, or not a dictionary",
                "give a dictionary with a COMMAND under the keys 1 to 4, the urgencies");
    return;
  }
  for (const auto& entry : *by_urgency) {
    const std::string where = "CLEAN " + entry.key;
    if (entry.key.size() != 1 || entry.key[0] < '1' || entry.key[0] > '4') {
      fields.fail("CLEAN", "unknown urgency \"" + entry.key + "\"", "the urgencies are 1 to 4");
      return;
    }
    const Dictionary* from = fields.dictionary(entry.value, where);
    if (from == nullptr) return;
    steps[static_cast<std::size_t>(entry.key[0] - '1')] = stepOf(*from, fields, where);
  }
}

}  // namespace spacekeep::command
