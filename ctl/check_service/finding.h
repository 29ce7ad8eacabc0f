// Thread safety: plain values and pure functions.
//
// What a check found out, in words for the author of the service.
#pragma once

#include <string>
#include <utility>

namespace spacekeep::ctl {

enum class Outcome {
  kOk,
  kFailed,
  kNotApplicable,  ///< could not be looked at; the text says why, and what would change that
};

struct Finding {
  Outcome outcome = Outcome::kOk;
  std::string text;  ///< may be empty when all is well
};

[[nodiscard]] inline Finding fine(std::string text = {}) { return {Outcome::kOk, std::move(text)}; }
[[nodiscard]] inline Finding failed(std::string text) {
  return {Outcome::kFailed, std::move(text)};
}
[[nodiscard]] inline Finding notApplicable(std::string text) {
  return {Outcome::kNotApplicable, std::move(text)};
}

}  // namespace spacekeep::ctl
