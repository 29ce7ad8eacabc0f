// Thread safety: plain values.
//
// What can go wrong between a program and the daemon. Errors are values; nothing here throws.
#pragma once

#include <cassert>
#include <optional>
#include <string>
#include <utility>
#include <variant>

namespace spacekeep::sdk {

enum class ErrorKind {
  kUnreachable,   ///< nobody listens at the socket, or the path may not be used
  kNotAllowed,    ///< the peer at the other end refuses this process (or is not who it should be)
  kDisconnected,  ///< the connection ended before the answer came
  kTimedOut,      ///< the caller's own deadline passed; the work may go on at the other end
  kNotSupported,  ///< the daemon does not offer this operation
  kInvalidArgument,  ///< the request cannot be sent as it is; nothing was sent
  kFailed,           ///< the other end, or the operating system, reported a failure of another kind
};

struct Error {
  ErrorKind kind = ErrorKind::kFailed;
  std::string text;  ///< for a person: what failed, where, and what to do about it
};

/// A T, or the reason why there is none.
template <class T>
class Result {
 public:
  Result(T value) : content_(std::move(value)) {}      // NOLINT: `return value;` is the point
  Result(Error error) : content_(std::move(error)) {}  // NOLINT

  [[nodiscard]] explicit operator bool() const { return std::holds_alternative<T>(content_); }
  /// Only when there is a value.
  [[nodiscard]] T& operator*() {
    assert(*this);
    return *std::get_if<T>(&content_);
  }
  [[nodiscard]] T* operator->() { return std::get_if<T>(&content_); }
  /// Only when there is none.
  [[nodiscard]] const Error& error() const {
    assert(!*this);
    return *std::get_if<Error>(&content_);
  }

 private:
  std::variant<T, Error> content_;
};

}  // namespace spacekeep::sdk
