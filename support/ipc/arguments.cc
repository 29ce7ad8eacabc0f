#include "support/ipc/arguments.h"

#include <unistd.h>

#include <algorithm>
#include <cstddef>

namespace spacekeep::ipc {

namespace {

/// The alternative of Argument that holds a kind: ArgumentKind stands in the same order.
std::size_t alternativeOf(ArgumentKind kind) { return static_cast<std::size_t>(kind); }

}  // namespace

// Simulated endpoints are negative numbers, which the kernel knows nothing of.
Descriptor::~Descriptor() {
  if (fd_ >= 0) ::close(fd_);
}

std::string_view signatureOf(ArgumentKind kind) {
  switch (kind) {
    case ArgumentKind::kInt32:
      return "i";
    case ArgumentKind::kString:
      return "s";
    case ArgumentKind::kDictionary:
      return "a{sv}";
    case ArgumentKind::kOptionalDictionary:
      return "aa{sv}";
    case ArgumentKind::kOptionalValue:
      return "av";
    case ArgumentKind::kOptionalString:
      return "as";
    case ArgumentKind::kDescriptor:
      return "h";
  }
  return "";
}

const MethodDescription* InterfaceDescription::method(std::string_view method_name) const {
  const auto found = std::find_if(
      methods.begin(), methods.end(),
      [method_name](const MethodDescription& described) { return described.name == method_name; });
  return found == methods.end() ? nullptr : &*found;
}

const InterfaceDescription* InterfaceDescription::having(std::string_view method_name) const {
  const InterfaceDescription* interface = this;
  while (interface != nullptr && interface->method(method_name) == nullptr) {
    interface = interface->beside;
  }
  return interface;
}

const InterfaceDescription* InterfaceDescription::named(std::string_view interface_name) const {
  const InterfaceDescription* interface = this;
  while (interface != nullptr && interface->name != interface_name) interface = interface->beside;
  return interface;
}

bool passesDescriptor(const MethodDescription& method) {
  return std::ranges::any_of(method.in, [](const ArgumentDescription& argument) {
    return argument.kind == ArgumentKind::kDescriptor;
  });
}

bool matches(const std::vector<ArgumentDescription>& described, const Arguments& arguments) {
  return std::equal(described.begin(), described.end(), arguments.begin(), arguments.end(),
                    [](const ArgumentDescription& wanted, const Argument& given) {
                      return given.index() == alternativeOf(wanted.kind);
                    });
}

}  // namespace spacekeep::ipc
