// Thread safety: pure functions over what they are given.
//
// Service descriptor files: property-list documents that declare the services of the system.
#pragma once

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "registry/service.h"
#include "support/files/directory_reader.h"
#include "support/values/value.h"

namespace spacekeep {

struct DescriptorError {
  std::optional<std::string> reason;  ///< none: a document, but no dictionary
};

/// The dictionary of the file at `path`.
[[nodiscard]] std::variant<Dictionary, DescriptorError> readDescriptor(DirectoryReader& files,
                                                                       const std::string& path);

/// What a scan has found so far. A later descriptor of the same ID wins.
struct DescribedServices {
  ServiceMap services;
  std::vector<std::string> service_ids;  ///< in the order of the scan, an ID once per descriptor
};

/// Adds the service that `descriptor` declares. One without "SPACEKEEP_ID", or with one that is no
/// string, is dropped silently.
void collectService(const Dictionary& descriptor, DescribedServices& found);

}  // namespace spacekeep
