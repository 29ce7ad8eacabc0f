// Thread safety: for one thread at a time.
//
// Shows on a terminal that a query is under way, once it takes longer than one waits without a
// word.
#pragma once

#include <cstddef>
#include <cstdio>
#include <optional>
#include <string>

namespace spacekeep::ctl {

/// None during the first second: most queries are over by then.
[[nodiscard]] std::optional<std::string> queryProgressText(const std::string& volume,
                                                           double elapsed_seconds);

class QueryDisplay {
 public:
  /// Shows nothing without a stream.
  QueryDisplay(std::FILE* stream, std::string volume, std::size_t columns)
      : stream_(stream), volume_(std::move(volume)), columns_(columns) {}
  /// Takes the line away.
  ~QueryDisplay();
  QueryDisplay(const QueryDisplay&) = delete;
  QueryDisplay& operator=(const QueryDisplay&) = delete;

  void show(double elapsed_seconds);

 private:
  std::FILE* const stream_;
  const std::string volume_;
  const std::size_t columns_;
  bool shown_ = false;
};

}  // namespace spacekeep::ctl
