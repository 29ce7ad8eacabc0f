// Property-list documents, and the two kinds of files that are made of them: service descriptors and
// entitlement rules.
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "daemon/descriptors.h"
#include "fuzz/helpers/promises.h"
#include "support/access/rule_file.h"
#include "support/values/plist.h"
#include "support/values/text.h"

namespace spacekeep::fuzz {
namespace {

void asDescriptor(const Value& document) {
  const Dictionary* descriptor = document.dictionary();
  if (descriptor == nullptr) return;
  DescribedServices found;
  collectService(*descriptor, found);
  collectService(*descriptor, found);
  require(found.services.size() * 2 == found.service_ids.size(),
          "a descriptor gives one service, and one entry in the order each time");
  for (const auto& [service_id, service] : found.services) {
    require(service->doesPurge() || descriptor->contains("SPACEKEEP_SERVICES"),
            "without roles a service purges");
  }
}

std::optional<std::uint32_t> knownName(const std::string& name) {
  if (name == "root") return 0;
  return std::nullopt;
}

void asRuleFile(const Value& document) {
  const access::NameLookup lookup{.user = knownName, .group = knownName};
  const auto outcome = access::ruleFromDocument("fuzz.plist", document, lookup);
  const auto* parsed = std::get_if<access::ParsedRule>(&outcome);
  if (parsed == nullptr) {
    require(!std::get<access::RuleError>(outcome).reason.empty(), "a refusal says why");
    return;
  }
  const access::Rule& rule = parsed->rule;
  const bool conditions = rule.users || rule.groups || rule.units || rule.labels;
  require(!(rule.matches_anybody && conditions), "anybody goes with no other match");
  require(rule.grants.size() <= access::kMaxRuleEntries, "the entries are bounded");
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace spacekeep;
  const auto parsed = parsePlist(fuzz::inputOf(data, size));
  const auto* document = std::get_if<Value>(&parsed);
  if (document == nullptr) {
    const std::string& reason = std::get<PlistError>(parsed).reason;
    fuzz::require(fuzz::isOneLine(reason), "a refusal is one line");
    return 0;
  }
  fuzz::require(fuzz::isOneLine(textOf(Value(Array{*document}))), "a value is shown as one line");
  fuzz::requireStableRoundTrip(*document);
  fuzz::asDescriptor(*document);
  fuzz::asRuleFile(*document);
  return 0;
}
