#include "support/events/linux/event_files.h"

#include <unistd.h>

#include <cstdint>
#include <variant>

#include "support/files/linux/atomic_file.h"
#include "support/files/linux/linux_directory_reader.h"
#include "support/logging/log.h"
#include "support/values/plist.h"

namespace spacekeep {
namespace {

bool exists(const std::string& path) { return ::access(path.c_str(), F_OK) == 0; }

/// The document, or what is wrong with it in words.
std::variant<Value, std::string> readDocument(const std::string& path) {
  const auto bytes = LinuxDirectoryReader().readWholeFile(path);
  if (const auto* error = std::get_if<FileError>(&bytes)) return error->reason;
  const auto document = parsePlist(std::get<std::vector<std::uint8_t>>(bytes));
  if (const auto* error = std::get_if<PlistError>(&document)) return error->reason;
  return std::get<Value>(document);
}

}  // namespace

std::optional<std::string> findLaunchFile(const std::vector<std::string>& directories,
                                          const std::string& name) {
  for (const std::string& directory : directories) {
    std::string path = directory + "/" + name + ".plist";
    if (exists(path)) return path;
  }
  return std::nullopt;
}

std::variant<DailySchedule, LaunchFileError> readSchedule(const std::string& path) {
  const auto document = readDocument(path);
  if (const auto* reason = std::get_if<std::string>(&document)) return LaunchFileError{*reason};
  return scheduleFromDocument(std::get<Value>(document));
}

std::optional<DailySchedule> loadSchedule(const std::vector<std::string>& directories,
                                          const std::string& name) {
  const auto path = findLaunchFile(directories, name);
  if (!path) {
    logProblem("%s there is no launch file %s.plist, the activity will not run", "loadSchedule",
               name);
    return std::nullopt;
  }
  const auto schedule = readSchedule(*path);
  if (const auto* found = std::get_if<DailySchedule>(&schedule)) return *found;
  logProblem("%s launch file %s is not used, the activity %s will not run: %s", "loadSchedule",
             *path, name, std::get<LaunchFileError>(schedule).reason);
  return std::nullopt;
}

std::optional<RunRecord> loadRunRecord(const std::string& path) {
  if (!exists(path)) return std::nullopt;
  const auto document = readDocument(path);
  if (const auto* reason = std::get_if<std::string>(&document)) {
    logProblem("%s cannot read %s: %s", "loadRunRecord", path, *reason);
    return std::nullopt;
  }
  auto record = runRecordFromDocument(std::get<Value>(document));
  if (!record) logProblem("%s %s holds no run times", "loadRunRecord", path);
  return record;
}

std::optional<std::string> saveRunRecord(const std::string& path, const RunRecord& record) {
  return replaceFile(path, binaryPlist(documentFromRunRecord(record)), Durability::kDurable, 0600);
}

}  // namespace spacekeep
