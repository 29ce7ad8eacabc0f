#include "support/preferences/linux/suite_file.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <linux/magic.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/vfs.h>

#include <cstdio>
#include <optional>

#include "support/files/linux/atomic_file.h"
#include "support/files/linux/descriptor.h"
#include "support/logging/log.h"
#include "support/runtime/runtime.h"

namespace spacekeep {
namespace {

using Problem = std::optional<std::string>;

// Each missing directory with mode 0700, made durable in the one above it.
Problem makeDirectories(const std::string& directory) {
  struct stat status {};
  if (stat(directory.c_str(), &status) == 0) {
    return S_ISDIR(status.st_mode) ? std::nullopt : Problem(directory + " is not a directory");
  }
  const std::string above = directoryOf(directory);
  if (above != directory) {
    if (Problem problem = makeDirectories(above)) return problem;
  }
  if (mkdir(directory.c_str(), 0700) != 0 && errno != EEXIST) {
    return directory + " cannot be made: " + errorText(errno);
  }
  return syncDirectory(above);
}

// Where a file system writes changes to new blocks first, it is asked to change what is made in this
// directory in place: a change to the state must not need a free block. Elsewhere nothing to do, and
// where it is refused the state works all the same, as long as there are blocks.
void keepInPlace(const std::string& directory) {
  const FileDescriptor opened(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct statfs where {};
  if (!opened.valid() || fstatfs(opened.get(), &where) != 0 || where.f_type != BTRFS_SUPER_MAGIC) {
    return;
  }
  int flags = 0;
  if (ioctl(opened.get(), FS_IOC_GETFLAGS, &flags) != 0 || (flags & FS_NOCOW_FL) != 0) return;
  flags |= FS_NOCOW_FL;
  static_cast<void>(ioctl(opened.get(), FS_IOC_SETFLAGS, &flags));
}

// There afterwards, regular, with mode 0600: state may tell what a person does with the device.
Problem lockDownFile(const std::string& path) {
  const int flags = O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
  const FileDescriptor file(::open(path.c_str(), flags, 0600));
  struct stat status {};
  if (!file.valid() || fstat(file.get(), &status) != 0) {
    return path + " cannot be opened: " + errorText(errno);
  }
  if (!S_ISREG(status.st_mode)) return path + " is not a regular file";
  if ((status.st_mode & 07777) != 0600 && fchmod(file.get(), 0600) != 0) {
    return path + " cannot be locked down: " + errorText(errno);
  }
  return syncDirectory(directoryOf(path));
}

enum class Soundness { kSound, kDamaged, kUnreachable };

struct Finding {
  Soundness soundness = Soundness::kSound;
  std::string reason;
};

Finding findingOf(sqlite3* database, int code) {
  return {meansDamage(code) ? Soundness::kDamaged : Soundness::kUnreachable,
          sqliteText(database, code)};
}

// The quick check would pass rows that are out of order, and what is then committed beside them is
// not found again.
Finding checkIntegrity(sqlite3* database) {
  const Statement check = prepare(database, "PRAGMA integrity_check(1)");
  const int code = check ? sqlite3_step(check.get()) : sqlite3_extended_errcode(database);
  if (code != SQLITE_ROW) return findingOf(database, code);
  const auto* words = reinterpret_cast<const char*>(sqlite3_column_text(check.get(), 0));
  const std::string verdict = words == nullptr ? "no verdict" : words;
  return verdict == "ok" ? Finding{} : Finding{Soundness::kDamaged, verdict};
}

// An empty file is a fresh one: it has neither tables nor an application of its own.
Finding checkOwner(sqlite3* database, const SuiteFileKind& kind) {
  int code = SQLITE_OK;
  const std::int64_t tables = queryInteger(database, "SELECT count(*) FROM sqlite_schema", code);
  if (code != SQLITE_ROW) return findingOf(database, code);
  const std::int64_t application = queryInteger(database, "PRAGMA application_id", code);
  if (code != SQLITE_ROW) return findingOf(database, code);
  const std::int64_t version = queryInteger(database, "PRAGMA user_version", code);
  if (code != SQLITE_ROW) return findingOf(database, code);
  if (tables == 0 && application == 0) return {};
  if (application != kind.application_id) {
    return {Soundness::kDamaged, "it is the database of another program"};
  }
  if (version > kind.version) {
    return {Soundness::kUnreachable, "it was written by a newer version of this program"};
  }
  return {};
}

// A table of another make passes every check of the database and may lose what is put into it.
Finding checkTable(sqlite3* database, const SuiteFileKind& kind) {
  int code = SQLITE_OK;
  const std::int64_t version = queryInteger(database, "PRAGMA user_version", code);
  if (code != SQLITE_ROW) return findingOf(database, code);
  const Statement find = prepare(database, "SELECT sql FROM sqlite_schema WHERE name = ?1");
  if (!find) return findingOf(database, sqlite3_extended_errcode(database));
  sqlite3_bind_text(find.get(), 1, kind.table, -1, SQLITE_STATIC);
  code = sqlite3_step(find.get());
  if (code != SQLITE_ROW && code != SQLITE_DONE) return findingOf(database, code);
  const bool is_fresh = code == SQLITE_DONE && version != kind.version;
  const auto* words = reinterpret_cast<const char*>(sqlite3_column_text(find.get(), 0));
  const bool is_ours =
      code == SQLITE_ROW && words != nullptr && kind.table_sql == std::string(words);
  if (is_fresh || is_ours) return {};
  return {Soundness::kDamaged, "its table is not as this program makes it"};
}

Finding checkFile(sqlite3* database, const SuiteFileKind& kind) {
  Finding finding = checkOwner(database, kind);
  if (finding.soundness == Soundness::kSound) finding = checkTable(database, kind);
  return finding.soundness == Soundness::kSound ? checkIntegrity(database) : finding;
}

bool exists(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0;
}

// A name that is free: several damaged files may come up within one second.
std::string corruptName(const std::string& directory, const std::string& name) {
  const std::string base =
      directory + "/" + name + ".corrupt-" + std::to_string(rt::wallClockNs() / 1'000'000'000);
  std::string candidate = base;
  for (int number = 2; exists(candidate) || exists(candidate + "-journal"); ++number) {
    candidate = base + "-" + std::to_string(number);
  }
  return candidate;
}

// The rollback journal goes along: it belongs to this content and would be played into the next.
Problem setAside(const std::string& directory, const std::string& name, const std::string& path,
                 const std::string& reason, const char* what) {
  const std::string aside = corruptName(directory, name);
  const std::string journal = path + "-journal";
  if (exists(journal) && std::rename(journal.c_str(), (aside + "-journal").c_str()) != 0) {
    return journal + " cannot be set aside: " + errorText(errno);
  }
  if (std::rename(path.c_str(), aside.c_str()) != 0) {
    return path + " cannot be set aside: " + errorText(errno);
  }
  logProblem("%s %@ cannot be used (%@). It was set aside as %@ and %s starts empty.",
             "openSuiteFile", path, reason, aside, what);
  return syncDirectory(directory);
}

std::variant<Database, Finding> openAndCheck(const std::string& path, const SuiteFileKind& kind) {
  sqlite3* raw = nullptr;
  const int code =
      sqlite3_open_v2(path.c_str(), &raw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr);
  Database database(raw);
  if (code != SQLITE_OK) return findingOf(database.get(), code);
  sqlite3_extended_result_codes(database.get(), 1);
  // Another process may hold the file for a moment; that alone must not cost the suite.
  sqlite3_busy_timeout(database.get(), 2000);
  const Finding finding = checkFile(database.get(), kind);
  if (finding.soundness != Soundness::kSound) return finding;
  return database;
}

}  // namespace

bool isSafeSuiteName(const std::string& name) {
  return !name.empty() && name.size() <= 200 && name[0] != '.' &&
         name.find('/') == std::string::npos && name.find('\0') == std::string::npos;
}

std::variant<Database, SuiteFileError> openSuiteFile(const std::string& directory,
                                                     const std::string& name,
                                                     const SuiteFileKind& kind) {
  if (!isSafeSuiteName(name)) return SuiteFileError{"its name is no safe file name"};
  if (Problem problem = makeDirectories(directory)) return SuiteFileError{*problem};
  keepInPlace(directory);
  const std::string path = directory + "/" + name + ".sqlite";
  for (int attempt = 0; attempt < 2; ++attempt) {
    if (Problem problem = lockDownFile(path)) return SuiteFileError{*problem};
    auto opened = openAndCheck(path, kind);
    if (auto* database = std::get_if<Database>(&opened)) return std::move(*database);
    const auto& finding = std::get<Finding>(opened);
    if (finding.soundness != Soundness::kDamaged) {
      return SuiteFileError{path + ": " + finding.reason};
    }
    if (Problem problem = setAside(directory, name, path, finding.reason, kind.what)) {
      return SuiteFileError{*problem};
    }
  }
  return SuiteFileError{path + " is damaged again right after a fresh start"};
}

}  // namespace spacekeep
