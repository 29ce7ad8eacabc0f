// Thread safety: each writer belongs to one thread at a time; answers() and lost() may be called from
// any thread.
//
// A client that counts up a key of its own and knows, after any end of the daemon, which values can
// be stored: the last answered one, or the one that was under way.
#pragma once

#include <spacekeep/client.h>

#include <atomic>
#include <cstdint>
#include <string>

namespace spacekeep::system_test {

class StateWriter {
 public:
  explicit StateWriter(int number) : key_("KEY" + std::to_string(number)), number_(number) {}

  /// Writes on this connection until it ends.
  void writeUntilTheEnd(sdk::Client& client);
  /// Compares what is stored with what may be, and goes on from there. A value that is neither fails
  /// the running test. False when the connection ended before the daemon told.
  bool check(sdk::Client& client);

  [[nodiscard]] std::uint64_t answers() const { return answers_; }
  [[nodiscard]] std::uint64_t lost() const { return lost_; }

 private:
  [[nodiscard]] Value value(std::uint64_t count) const;

  const std::string key_;
  const int number_;
  std::uint64_t sent_ = 0;
  std::uint64_t answered_ = 0;
  std::atomic<std::uint64_t> answers_ = 0;
  std::atomic<std::uint64_t> lost_ = 0;
};

}  // namespace spacekeep::system_test
