// Thread safety: for one thread.
//
// Reads single fields of a rule file. The first thing that is wrong stays; whoever reads goes on
// until he asks.
#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "services/command/base/user_folders.h"
#include "services/command/tool/tool.h"
#include "support/values/value.h"

namespace spacekeep::command {

class FieldReader {
 public:
  FieldReader(std::string file, const UserFolders* folders)
      : file_(std::move(file)), folders_(folders) {}

  /// "FILE: WHERE: what; advice", if it is the first.
  void fail(const std::string& where, const std::string& what, const std::string& advice);
  /// A whole line that is already made.
  void failWith(const std::string& text);
  [[nodiscard]] bool good() const { return error_.empty(); }
  [[nodiscard]] const std::string& error() const { return error_; }
  [[nodiscard]] const std::string& file() const { return file_; }

  void onlyKnown(const Dictionary& from, std::span<const std::string_view> known,
                 const std::string& where);
  /// Empty when absent or wrong.
  [[nodiscard]] std::string text(const Dictionary& from, std::string_view key,
                                 const std::string& where);
  [[nodiscard]] bool truth(const Dictionary& from, std::string_view key, bool otherwise,
                           const std::string& where);
  [[nodiscard]] std::uint64_t number(const Dictionary& from, std::string_view key,
                                     std::uint64_t least, std::uint64_t most,
                                     std::uint64_t otherwise, const std::string& where);
  [[nodiscard]] std::vector<std::string> texts(const Dictionary& from, std::string_view key,
                                               std::size_t most, const std::string& where);
  /// An absolute path, "~/" and the like filled in; what it is not is said.
  [[nodiscard]] std::string path(const std::string& written, const std::string& where);
  /// A program and its arguments, each word filled in.
  [[nodiscard]] Words words(const Dictionary& from, std::string_view key, const std::string& where);
  [[nodiscard]] const Dictionary* dictionary(const Value& value, const std::string& where);

 private:
  std::string file_;
  const UserFolders* folders_;
  std::string error_;
};

}  // namespace spacekeep::command
