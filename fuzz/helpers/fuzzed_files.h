// Thread safety: confined to one thread.
//
// Files whose names are given and whose contents are the input's: its bytes as they stand, or, so
// that not all time goes into how documents are spelt, values that are made of them.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "fuzz/helpers/piece_reader.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {

/// What a file holds: the first byte of the input says how it is made, the next two how many bytes
/// go into it. `words` are what made documents consist of.
[[nodiscard]] std::string fileContent(PieceReader& input, const std::vector<std::string>& words);

/// A directory that is the same for every input, and empty in between.
class FuzzedDirectory {
 public:
  [[nodiscard]] const std::string& path() const { return directory_.path(); }
  void write(const std::string& name, std::string_view content);
  void link(const std::string& name, const std::string& target);
  /// Removes what was written, but not the directories in it.
  void clear();

 private:
  test::TemporaryDirectory directory_;
  std::vector<std::string> written_;
};

}  // namespace spacekeep::fuzz
