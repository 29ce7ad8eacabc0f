// Thread safety: plain values.
//
// What the doctor has found.
#pragma once

#include <string>
#include <utility>
#include <vector>

namespace spacekeep::ctl::doctor {

enum class Severity {
  kOk,       ///< looked at, nothing wrong
  kAdvice,   ///< works, but perhaps not as meant
  kProblem,  ///< something does not work
  kUnseen,   ///< this user, or this moment, did not allow a look
};

struct Finding {
  Severity severity = Severity::kOk;
  std::string check;   ///< a short name that stays the same, for programs
  std::string text;    ///< what it is
  std::string advice;  ///< what to do; may be empty
};

struct Group {
  std::string name;
  std::vector<Finding> findings = {};

  void ok(std::string check, std::string text) {
    findings.push_back({Severity::kOk, std::move(check), std::move(text), ""});
  }
  void advice(std::string check, std::string text, std::string what_to_do) {
    findings.push_back(
        {Severity::kAdvice, std::move(check), std::move(text), std::move(what_to_do)});
  }
  void problem(std::string check, std::string text, std::string what_to_do) {
    findings.push_back(
        {Severity::kProblem, std::move(check), std::move(text), std::move(what_to_do)});
  }
  void unseen(std::string check, std::string text) {
    findings.push_back({Severity::kUnseen, std::move(check), std::move(text), ""});
  }
  /// Nothing but good news so far.
  [[nodiscard]] bool isFine() const {
    for (const auto& finding : findings) {
      if (finding.severity != Severity::kOk) return false;
    }
    return true;
  }
};

}  // namespace spacekeep::ctl::doctor
