#include "ctl/renewed_line.h"

#include <fmt/core.h>

#include "ctl/text_layout.h"

namespace spacekeep::ctl {

RenewedLine::~RenewedLine() {
  if (!shown_) return;
  fmt::print(stream_, "\r\x1b[K");
  std::fflush(stream_);
}

void RenewedLine::show(const std::string& text) {
  if (stream_ == nullptr) return;
  shown_ = true;
  fmt::print(stream_, "\r\x1b[K{}", shortened(text, columns_ - 1));
  std::fflush(stream_);
}

}  // namespace spacekeep::ctl
