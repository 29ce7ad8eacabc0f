// Property-list documents, of which descriptors, rules, state and archives are made.
#include <cstddef>
#include <cstdint>
#include <string>
#include <variant>

#include "fuzz/helpers/promises.h"
#include "support/values/plist.h"
#include "support/values/text.h"

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
  return 0;
}
