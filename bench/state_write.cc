// Setting one key of the client state through the daemon, and one bare SQLite transaction of the same
// bytes that is as durable, in turn; and the ratio of what they took.
// Usage: bench-state-write SOCKET FLOOR_DIRECTORY [ROUNDS]. The directory has to be on the file
// system that holds the daemon's state.
#include <fmt/format.h>
#include <sqlite3.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <string>
#include <vector>

#include "bench/sd_bus_handles.h"

namespace {

constexpr int kWritesPerRound = 20;
constexpr std::size_t kValueBytes = 400;

double nowUs() {
  timespec now = {};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<double>(now.tv_sec) * 1e6 + static_cast<double>(now.tv_nsec) / 1e3;
}

/// The floor: what a program does that has nothing to do but this.
class BareFile {
 public:
  explicit BareFile(const std::string& directory) {
    check(sqlite3_open((directory + "/floor.sqlite").c_str(), &database_));
    check(sqlite3_exec(database_,
                       "PRAGMA journal_mode = PERSIST; PRAGMA synchronous = EXTRA;"
                       "CREATE TABLE IF NOT EXISTS preferences"
                       " (key TEXT PRIMARY KEY NOT NULL, value BLOB NOT NULL) WITHOUT ROWID",
                       nullptr, nullptr, nullptr));
    check(sqlite3_prepare_v2(database_, "INSERT OR REPLACE INTO preferences VALUES ('STATE', ?1)",
                             -1, &store_, nullptr));
  }
  ~BareFile() {
    sqlite3_finalize(store_);
    sqlite3_close(database_);
  }
  BareFile(const BareFile&) = delete;
  BareFile& operator=(const BareFile&) = delete;

  void write(const std::string& text) {
    check(sqlite3_bind_blob(store_, 1, text.data(), static_cast<int>(text.size()), SQLITE_STATIC));
    if (sqlite3_step(store_) != SQLITE_DONE) check(sqlite3_errcode(database_));
    check(sqlite3_reset(store_));
  }

 private:
  void check(int code) {
    if (code == SQLITE_OK) return;
    fmt::print(stderr, "floor: {}\n", sqlite3_errmsg(database_));
    std::exit(1);
  }
  sqlite3* database_ = nullptr;
  sqlite3_stmt* store_ = nullptr;
};

void setState(sd_bus* bus, const std::string& text) {
  sd_bus_message* raw = nullptr;
  bench::check(
      sd_bus_message_new_method_call(bus, &raw, nullptr, "/com/quorvel/Spacekeep",
                                     "com.quorvel.SpacekeepClientProtocol", "clientSetState"),
      "new call");
  const bench::Message call(raw);
  bench::check(sd_bus_message_append(raw, "avs", 1, "s", text.c_str(), "BENCH"), "append");
  sd_bus_message* reply = nullptr;
  sd_bus_error error = {};
  const int result = sd_bus_call(bus, raw, 0, &error, &reply);
  if (result < 0) fmt::print(stderr, "{}\n", error.message == nullptr ? "" : error.message);
  bench::check(result, "clientSetState");
  const bench::Message answer(reply);
}

std::string textOf(int number) {
  std::string text = std::to_string(number);
  text.resize(kValueBytes, 'x');
  return text;
}

double percentile(std::vector<double>& values, double share) {
  std::sort(values.begin(), values.end());
  return values[static_cast<std::size_t>(share * static_cast<double>(values.size() - 1))];
}

}  // namespace

int main(int count, char** arguments) {
  if (count < 3) return 2;
  const int rounds = count > 3 ? std::atoi(arguments[3]) : 30;
  const bench::Bus daemon = bench::connectBus(arguments[1]);
  BareFile floor(arguments[2]);
  std::vector<double> daemon_us;
  std::vector<double> floor_us;
  for (int i = 0; i < rounds * kWritesPerRound; ++i) {
    const std::string text = textOf(i);
    const double start = nowUs();
    setState(daemon.get(), text);
    const double between = nowUs();
    floor.write(text);
    const double end = nowUs();
    if (i < kWritesPerRound) continue;  // warm-up
    daemon_us.push_back(between - start);
    floor_us.push_back(end - between);
  }
  fmt::print(
      "{} writes each; daemon p50 {:.0f} us p99 {:.0f} us; bare SQLite p50 {:.0f} us p99 "
      "{:.0f} us\n",
      daemon_us.size(), percentile(daemon_us, 0.5), percentile(daemon_us, 0.99),
      percentile(floor_us, 0.5), percentile(floor_us, 0.99));
  fmt::print("figure state_write_p50_ratio {:.3f} 1.3\n",
             percentile(daemon_us, 0.5) / percentile(floor_us, 0.5));
}
