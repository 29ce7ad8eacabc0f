#include "ctl/check_service/ledger.h"

#include <fmt/core.h>

namespace spacekeep::ctl {

std::string Ledger::problemOfAmount(const Dictionary& answer) {
  const Value* amount = answer.find("SPACEKEEP_AMOUNT");
  if (amount == nullptr) return "has no \"SPACEKEEP_AMOUNT\"";
  if (!amount->isNumber()) return "has a \"SPACEKEEP_AMOUNT\" that is not a number";
  if (amount->asDouble().value_or(0) < 0) return "has a \"SPACEKEEP_AMOUNT\" below 0";
  return "";
}

std::string firstOf(const std::vector<std::string>& sentences) {
  if (sentences.empty()) return "";
  if (sentences.size() == 1) return sentences.front();
  return fmt::format("{} ({} more like it)", sentences.front(), sentences.size() - 1);
}

}  // namespace spacekeep::ctl
