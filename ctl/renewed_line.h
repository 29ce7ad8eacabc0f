// Thread safety: for one thread at a time.
//
// One line on a terminal that renews itself, and leaves nothing behind.
#pragma once

#include <cstddef>
#include <cstdio>
#include <string>

namespace spacekeep::ctl {

class RenewedLine {
 public:
  /// A null stream: nothing is ever shown. The line is cut to fit, since it could not renew itself
  /// otherwise.
  RenewedLine(std::FILE* stream, std::size_t columns) : stream_(stream), columns_(columns) {}
  ~RenewedLine();
  RenewedLine(const RenewedLine&) = delete;
  RenewedLine& operator=(const RenewedLine&) = delete;

  void show(const std::string& text);

 private:
  std::FILE* const stream_;
  const std::size_t columns_;
  bool shown_ = false;
};

}  // namespace spacekeep::ctl
