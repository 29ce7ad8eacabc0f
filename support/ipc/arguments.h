// Thread safety: plain values; descriptions are constant after start-up.
//
// What travels in calls, independent of the transport: typed arguments, and the descriptions of
// interfaces from which checking, dispatch and introspection are made.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::ipc {

/// An owned file descriptor, closed with its last holder.
class Descriptor {
 public:
  explicit Descriptor(int fd) : fd_(fd) {}
  /// One that was passed and cannot be used, with the reason.
  explicit Descriptor(std::string problem) : problem_(std::move(problem)) {}
  ~Descriptor();
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  [[nodiscard]] int fd() const { return fd_; }  ///< -1 when there is a problem
  [[nodiscard]] const std::string& problem() const { return problem_; }

 private:
  int fd_ = -1;
  std::string problem_;
};
using SharedDescriptor = std::shared_ptr<Descriptor>;

using OptionalDictionary = std::optional<Dictionary>;
using OptionalValue = std::optional<Value>;
using OptionalString = std::optional<std::string>;

/// In the order of ArgumentKind.
using Argument = std::variant<std::int32_t, std::string, Dictionary, OptionalDictionary,
                              OptionalValue, OptionalString, SharedDescriptor>;
using Arguments = std::vector<Argument>;

/// The kind of an argument and its D-Bus signature. "No dictionary" is an empty array of
/// dictionaries, so that it stays distinct from an empty dictionary.
enum class ArgumentKind {
  kInt32,               ///< i
  kString,              ///< s
  kDictionary,          ///< a{sv}
  kOptionalDictionary,  ///< aa{sv}, zero or one element
  kOptionalValue,       ///< av, zero or one element
  kOptionalString,      ///< as, zero or one element
  kDescriptor,          ///< h
};
[[nodiscard]] std::string_view signatureOf(ArgumentKind kind);

struct ArgumentDescription {
  std::string_view name;
  ArgumentKind kind;
};

struct MethodDescription {
  std::string_view name;
  std::vector<ArgumentDescription> in;
  std::vector<ArgumentDescription> out;
};

struct InterfaceDescription {
  std::string_view name;
  std::vector<MethodDescription> methods;
  /// Another interface of the same object, and so on. Method names are different in all of them.
  const InterfaceDescription* beside = nullptr;

  /// Of this interface alone. Null when there is no such method.
  [[nodiscard]] const MethodDescription* method(std::string_view method_name) const;
  /// The interface, this one or one beside it, that has this method. Null when none has.
  [[nodiscard]] const InterfaceDescription* having(std::string_view method_name) const;
  /// The same by its name.
  [[nodiscard]] const InterfaceDescription* named(std::string_view interface_name) const;
};

/// The introspection document of an object with this interface and those beside it, as D-Bus
/// defines it.
[[nodiscard]] std::string introspectionXml(const InterfaceDescription& interface);

/// The one object path on every connection.
inline constexpr const char* kObjectPath = "/com/quorvel/Spacekeep";

/// Whether one of the arguments in is a descriptor.
[[nodiscard]] bool passesDescriptor(const MethodDescription& method);

/// True when the arguments are of the described kinds, in order.
[[nodiscard]] bool matches(const std::vector<ArgumentDescription>& described,
                           const Arguments& arguments);

}  // namespace spacekeep::ipc
