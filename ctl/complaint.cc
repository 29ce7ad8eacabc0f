#include "ctl/complaint.h"

#include <fmt/core.h>

#include <cstdio>

#include "ctl/json_text.h"

namespace spacekeep::ctl {

ExitCode exitCodeOf(sdk::ErrorKind kind) {
  switch (kind) {
    case sdk::ErrorKind::kUnreachable:
      return ExitCode::kUnreachable;
    case sdk::ErrorKind::kNotAllowed:
      return ExitCode::kRefused;
    case sdk::ErrorKind::kDisconnected:
    case sdk::ErrorKind::kTimedOut:
    case sdk::ErrorKind::kNotSupported:
    case sdk::ErrorKind::kInvalidArgument:
    case sdk::ErrorKind::kFailed:
      return ExitCode::kFailed;
  }
  return ExitCode::kFailed;
}

ExitCode complain(const CommonOptions& common, ExitCode code, const std::string& text) {
  if (common.json) fmt::print("{}\n", jsonOf(Value(Dictionary{{"error", text}})));
  remark(text);
  return code;
}

ExitCode complain(const CommonOptions& common, const sdk::Error& error) {
  return complain(common, exitCodeOf(error.kind), error.text);
}

void remark(const std::string& text) { fmt::print(stderr, "spacekeepctl: {}\n", text); }

}  // namespace spacekeep::ctl
