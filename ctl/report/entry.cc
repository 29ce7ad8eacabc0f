#include "ctl/report/entry.h"

#include <fmt/core.h>

#include <array>
#include <utility>

#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::ctl {
namespace {

enum class Kind { kText, kNumber, kSeconds, kTruth, kAmounts, kTexts };

struct Member {
  const char* key;
  const char* name;
  Kind kind;
};

constexpr std::array kMembers{
    Member{keys::kEntry, "number", Kind::kNumber},
    Member{keys::kKind, "kind", Kind::kText},
    Member{keys::kVolume, "volume", Kind::kText},
    Member{keys::kAmount, "asked", Kind::kNumber},
    Member{keys::kUrgencyLimit, "limit", Kind::kNumber},
    Member{keys::kUrgency, "urgency", Kind::kNumber},
    Member{keys::kFreespaceBegin, "begin", Kind::kNumber},
    Member{keys::kFreespaceEnd, "end", Kind::kNumber},
    Member{keys::kAmountFreed, "freed", Kind::kNumber},
    Member{keys::kAmountReported, "reported", Kind::kNumber},
    Member{keys::kReportingServices, "services", Kind::kAmounts},
    Member{keys::kOtherServices, "others", Kind::kNumber},
    Member{keys::kServicesInFlight, "silent", Kind::kTexts},
    Member{keys::kElapsedTime, "seconds", Kind::kSeconds},
    Member{keys::kOperationCancelled, "cancelled", Kind::kTruth},
    Member{keys::kWhyShort, "why", Kind::kText},
};

template <class T>
std::optional<Value> wrapped(const std::optional<T>& content) {
  return content ? std::optional<Value>(*content) : std::nullopt;
}

std::optional<Value> amountsOf(const Value& value) {
  const Dictionary* dictionary = value.dictionary();
  if (dictionary == nullptr) return std::nullopt;
  Dictionary amounts;
  for (const auto& [key, amount] : *dictionary) {
    if (const auto bytes = amount.asSigned()) amounts.set(key, *bytes);
  }
  return Value(std::move(amounts));
}

std::optional<Value> textsOf(const Value& value) {
  const Array* array = value.array();
  if (array == nullptr) return std::nullopt;
  Array texts;
  for (const auto& element : *array) {
    if (element.string() != nullptr) texts.push_back(element);
  }
  return Value(std::move(texts));
}

std::optional<Value> contentOf(const Value& value, Kind kind) {
  switch (kind) {
    case Kind::kText:
      return value.string() == nullptr ? std::nullopt : std::optional(value);
    case Kind::kNumber:
      return wrapped(value.asSigned());
    case Kind::kSeconds:
      return wrapped(value.asDouble());
    case Kind::kTruth:
      return value.boolean() == nullptr ? std::nullopt : std::optional(value);
    case Kind::kAmounts:
      return amountsOf(value);
    case Kind::kTexts:
      return textsOf(value);
  }
  return std::nullopt;
}

}  // namespace

std::optional<std::int64_t> dateOf(const Dictionary& entry) {
  const Value* value = entry.find(keys::kDate);
  const Date* date = value == nullptr ? nullptr : value->date();
  return date == nullptr ? std::nullopt : std::optional(date->unix_ns);
}

std::string clientTextOf(const Dictionary& entry) {
  const Value* value = entry.find(keys::kClient);
  const Dictionary* client = value == nullptr ? nullptr : value->dictionary();
  if (client == nullptr) return "";
  const std::string* program = stringAt(*client, keys::kProgram);
  std::string text = program == nullptr || program->empty() ? "unknown program" : *program;
  const auto uid = unsignedAt(*client, keys::kUid);
  const std::string* unit = stringAt(*client, keys::kUnit);
  if (!uid && unit == nullptr) return text;
  text += " (";
  if (uid) text += fmt::format("user {}", *uid);
  if (unit != nullptr) text += (uid ? ", " : "") + *unit;
  return text + ")";
}

Value pageEntryOf(const Dictionary& entry) {
  Dictionary page_entry;
  for (const auto& member : kMembers) {
    const Value* value = entry.find(member.key);
    if (value == nullptr) continue;
    if (auto content = contentOf(*value, member.kind)) {
      page_entry.set(member.name, std::move(*content));
    }
  }
  if (const auto date_ns = dateOf(entry)) page_entry.set("date", Value(Date{*date_ns}));
  if (std::string client = clientTextOf(entry); !client.empty()) {
    page_entry.set("client", std::move(client));
  }
  return page_entry;
}

}  // namespace spacekeep::ctl
