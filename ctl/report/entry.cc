#include "ctl/report/entry.h"

#include <fmt/core.h>

#include <array>
#include <utility>

namespace spacekeep::ctl {
namespace {

enum class Kind { kText, kNumber, kSeconds, kTruth, kAmounts, kTexts };

struct Member {
  const char* key;
  const char* name;
  Kind kind;
};

constexpr std::array kMembers{
    Member{"SPACEKEEP_ENTRY", "number", Kind::kNumber},
    Member{"SPACEKEEP_KIND", "kind", Kind::kText},
    Member{"SPACEKEEP_VOLUME", "volume", Kind::kText},
    Member{"SPACEKEEP_AMOUNT", "asked", Kind::kNumber},
    Member{"SPACEKEEP_URGENCY_LIMIT", "limit", Kind::kNumber},
    Member{"SPACEKEEP_URGENCY", "urgency", Kind::kNumber},
    Member{"SPACEKEEP_FREESPACE_BEGIN", "begin", Kind::kNumber},
    Member{"SPACEKEEP_FREESPACE_END", "end", Kind::kNumber},
    Member{"SPACEKEEP_AMOUNT_FREED", "freed", Kind::kNumber},
    Member{"SPACEKEEP_AMOUNT_REPORTED", "reported", Kind::kNumber},
    Member{"SPACEKEEP_REPORTING_SERVICES", "services", Kind::kAmounts},
    Member{"SPACEKEEP_OTHER_SERVICES", "others", Kind::kNumber},
    Member{"SPACEKEEP_SERVICES_INFLIGHT", "silent", Kind::kTexts},
    Member{"SPACEKEEP_ELAPSED_TIME", "seconds", Kind::kSeconds},
    Member{"SPACEKEEP_OPERATION_CANCELLED", "cancelled", Kind::kTruth},
    Member{"SPACEKEEP_WHY_SHORT", "why", Kind::kText},
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
  const Value* value = entry.find("SPACEKEEP_DATE");
  const Date* date = value == nullptr ? nullptr : value->date();
  return date == nullptr ? std::nullopt : std::optional(date->unix_ns);
}

std::string clientTextOf(const Dictionary& entry) {
  const Value* value = entry.find("SPACEKEEP_CLIENT");
  const Dictionary* client = value == nullptr ? nullptr : value->dictionary();
  if (client == nullptr) return "";
  const std::string* program = stringAt(*client, "SPACEKEEP_PROGRAM");
  std::string text = program == nullptr || program->empty() ? "unknown program" : *program;
  const auto uid = unsignedAt(*client, "SPACEKEEP_UID");
  const std::string* unit = stringAt(*client, "SPACEKEEP_UNIT");
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
