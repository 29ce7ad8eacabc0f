#include "services/command/rules/field_reader.h"

#include <algorithm>

#include "services/command/rules/rule.h"
#include "support/values/text.h"

namespace spacekeep::command {

void FieldReader::fail(const std::string& where, const std::string& what,
                       const std::string& advice) {
  failWith(file_ + ": " + (where.empty() ? "" : where + ": ") + what + "; " + advice);
}

void FieldReader::failWith(const std::string& text) {
  if (error_.empty()) error_ = lineOf(text);
}

void FieldReader::onlyKnown(const Dictionary& from, std::span<const std::string_view> known,
                            const std::string& where) {
  for (const auto& entry : from) {
    if (std::ranges::find(known, entry.key) != known.end()) continue;
    std::string list;
    for (const std::string_view key : known) list += (list.empty() ? "" : ", ") + std::string(key);
    fail(where, "unknown key \"" + entry.key + "\"", "the keys are " + list);
  }
}

std::string FieldReader::text(const Dictionary& from, std::string_view key,
                              const std::string& where) {
  const Value* value = from.find(key);
  if (value == nullptr) return "";
  if (value->string() != nullptr && !value->string()->empty()) return *value->string();
  fail(where + std::string(key), "not a string, or empty", "give a text, or leave the key out");
  return "";
}

bool FieldReader::truth(const Dictionary& from, std::string_view key, bool otherwise,
                        const std::string& where) {
  const Value* value = from.find(key);
  if (value == nullptr) return otherwise;
  if (value->boolean() != nullptr) return *value->boolean();
  fail(where + std::string(key), "not a boolean", "give true or false");
  return otherwise;
}

std::uint64_t FieldReader::number(const Dictionary& from, std::string_view key, std::uint64_t least,
                                  std::uint64_t most, std::uint64_t otherwise,
                                  const std::string& where) {
  const Value* value = from.find(key);
  if (value == nullptr) return otherwise;
  const auto read = value->asSigned();
  if (read && *read >= 0 && static_cast<std::uint64_t>(*read) >= least &&
      static_cast<std::uint64_t>(*read) <= most) {
    return static_cast<std::uint64_t>(*read);
  }
  fail(where + std::string(key),
       "not a number from " + std::to_string(least) + " to " + std::to_string(most),
       "give one, or leave the key out for " + std::to_string(otherwise));
  return otherwise;
}

std::vector<std::string> FieldReader::texts(const Dictionary& from, std::string_view key,
                                            std::size_t most, const std::string& where) {
  const Value* value = from.find(key);
  std::vector<std::string> read;
  if (value == nullptr) return read;
  const std::string place = where + std::string(key);
  if (value->array() == nullptr || value->array()->size() > most) {
    fail(place, "not an array of at most " + std::to_string(most) + " strings", "give one");
    return read;
  }
  for (const Value& each : *value->array()) {
    if (each.string() == nullptr || each.string()->empty() ||
        each.string()->size() > kMaxWordBytes || each.string()->find('\0') != std::string::npos) {
      fail(place, "an entry is not a string, is empty or longer than 4096 bytes", "mend it");
      return {};
    }
    read.push_back(*each.string());
  }
  return read;
}

std::string FieldReader::path(const std::string& written, const std::string& where) {
  const auto filled = filledIn(written, folders_);
  if (!filled) {
    fail(where, "\"" + written + "\" is a user's path",
         "serve this file with --user, or write an absolute path");
    return "";
  }
  const std::string framed = *filled + "/";
  if (!filled->starts_with('/') || framed.find("//") != std::string::npos ||
      framed.find("/../") != std::string::npos || framed.find("/./") != std::string::npos) {
    fail(where, "\"" + written + "\" is not an absolute path without \".\" and \"..\"",
         "begin it with a slash, ~/ or $XDG_CACHE_HOME/");
    return "";
  }
  return *filled;
}

Words FieldReader::words(const Dictionary& from, std::string_view key, const std::string& where) {
  Words read = texts(from, key, kMaxWords, where);
  if (read.empty()) {
    fail(where + std::string(key), "missing or empty",
         "give the program and its arguments as an array of strings");
  }
  for (std::string& word : read) {
    const auto filled = filledIn(word, folders_);
    if (filled) word = *filled;
  }
  return read;
}

const Dictionary* FieldReader::dictionary(const Value& value, const std::string& where) {
  if (value.dictionary() == nullptr) fail(where, "not a dictionary", "give a dictionary");
  return value.dictionary();
}

}  // namespace spacekeep::command
