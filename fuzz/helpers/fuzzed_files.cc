#include "fuzz/helpers/fuzzed_files.h"

#include <unistd.h>

#include <cstdint>
#include <span>

#include "fuzz/helpers/value_maker.h"
#include "support/values/plist.h"

namespace spacekeep::fuzz {

std::string fileContent(PieceReader& input, const std::vector<std::string>& words) {
  const bool is_made = input.byte() % 2 == 1;
  const std::string_view piece = input.piece();
  if (!is_made) return std::string(piece);
  const auto* first = reinterpret_cast<const std::uint8_t*>(piece.data());
  ValueMaker maker(std::span(first, piece.size()), words);
  const auto document = binaryPlist(Value(maker.dictionary()));
  return std::string(document.begin(), document.end());
}

void FuzzedDirectory::write(const std::string& name, std::string_view content) {
  written_.push_back(directory_.write(name, content));
}

void FuzzedDirectory::link(const std::string& name, const std::string& target) {
  const std::string path = directory_ / name;
  if (::symlink(target.c_str(), path.c_str()) == 0) written_.push_back(path);
}

void FuzzedDirectory::clear() {
  for (const std::string& path : written_) ::unlink(path.c_str());
  written_.clear();
}

}  // namespace spacekeep::fuzz
