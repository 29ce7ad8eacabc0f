#include "daemon/descriptors.h"

#include <set>
#include <utility>
#include <variant>

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/files/directory_reader.h"
#include "support/logging/log.h"
#include "support/values/plist.h"

namespace spacekeep {
namespace {

bool holds(const Value& list, std::string_view text) {
  const Array* elements = list.array();
  if (elements == nullptr) return false;
  for (const Value& element : *elements) {
    if (element.string() != nullptr && *element.string() == text) return true;
  }
  return false;
}

/// The strings of `list` as a set: sorted and without doubles.
Array setOf(const Value& list) {
  std::set<std::string> names;
  if (const Array* elements = list.array()) {
    for (const Value& element : *elements) {
      if (element.string() != nullptr) names.insert(*element.string());
    }
  }
  return Array(names.begin(), names.end());
}

void setRoles(SKService& service, const Value* roles) {
  if (roles == nullptr) {
    service.setDoesPurge(true);
    return;
  }
  service.setDoesPeriodic(holds(*roles, keys::kRolePeriodic));
  service.setDoesPurge(holds(*roles, keys::kRolePurge));
}

void logParseFailure(const DescriptorError& error) {
  if (error.reason) {
    logProblem("%s property list parse failed: %@", "scanPlistsAtPath", *error.reason);
  } else {
    const Value* no_error = nullptr;
    logProblem("%s property list parse failed: %@", "scanPlistsAtPath", no_error);
  }
}

/// Without an ID a document is no descriptor. With one that is no string it was meant as one.
void logUnusableId(const std::string& path, const Dictionary& descriptor) {
  const Value* service_id = descriptor.find(keys::kServiceId);
  if (service_id == nullptr || service_id->string() != nullptr) return;
  logProblem("%s the ID in %@ is no string: %@", "scanPlistsAtPath", path, *service_id);
}

}  // namespace

std::variant<Dictionary, DescriptorError> readDescriptor(DirectoryReader& files,
                                                         const std::string& path) {
  const auto file = files.readWholeFile(path);
  if (const auto* error = std::get_if<FileError>(&file)) return DescriptorError{error->reason};
  const auto document = parsePlist(std::get<std::vector<std::uint8_t>>(file));
  if (const auto* error = std::get_if<PlistError>(&document)) return DescriptorError{error->reason};
  const Dictionary* top = std::get<Value>(document).dictionary();
  if (top == nullptr) return DescriptorError{};
  return *top;
}

void Spacekeep::scanPlistsAtPath(const std::string& path,
                                 const std::function<void(const Dictionary&)>& execBlock) const {
  for (const std::string& entry : platform_.files.entriesBelow(path)) {
    const std::string full_path = path + "/" + entry;
    logTrace("%s looking at: %@", "scanPlistsAtPath", full_path);
    const auto descriptor = readDescriptor(platform_.files, full_path);
    if (const auto* error = std::get_if<DescriptorError>(&descriptor)) {
      logParseFailure(*error);
    } else {
      const auto& content = std::get<Dictionary>(descriptor);
      logUnusableId(full_path, content);
      execBlock(content);
    }
  }
}

void collectService(const Dictionary& descriptor, DescribedServices& found) {
  const std::string* service_id = stringAt(descriptor, keys::kServiceId);
  if (service_id == nullptr) return;
  auto service = std::make_shared<SKService>(*service_id);
  setRoles(*service, descriptor.find(keys::kServiceRoles));
  if (descriptor.contains(keys::kDoNotQuery)) {
    logTrace("%s marking %@ as DO_NOT_QUERY", "init", *service_id);
    service->setDoNotQuery(true);
  }
  if (const Value* names = descriptor.find(keys::kNotifications)) {
    const Value desired = setOf(*names);
    service->setDesiredNotifications(desired);
    logTrace("%s %@ desiredNotifications: %@", "init", *service_id, desired);
  }
  found.services.insert_or_assign(*service_id, std::move(service));
  found.service_ids.push_back(*service_id);
}

}  // namespace spacekeep
