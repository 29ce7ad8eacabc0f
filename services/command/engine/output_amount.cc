#include "services/command/engine/output_amount.h"

#include <cctype>
#include <charconv>
#include <cmath>
#include <functional>
#include <limits>
#include <vector>

namespace spacekeep::command {
namespace {

constexpr double kMost = 1e18;

bool isSpace(char c) { return c == ' ' || c == '\t'; }

void skipSpace(std::string_view& text) {
  while (!text.empty() && isSpace(text.front())) text.remove_prefix(1);
}

/// Letters at the beginning, without what follows.
std::string_view wordOf(std::string_view text) {
  std::size_t end = 0;
  while (end < text.size() && std::isalpha(static_cast<unsigned char>(text[end])) != 0) ++end;
  return text.substr(0, end);
}

/// How many bytes the unit stands for; none for a word that is no unit.
std::optional<double> unitOf(std::string_view word, std::uint64_t base, bool apart) {
  if (word.empty() || word == "B" || word == "byte" || word == "bytes") return 1;
  constexpr std::string_view kLetters = "kmgtp";
  const auto power = kLetters.find(static_cast<char>(std::tolower(word.front())));
  const std::string_view rest = word.substr(1);
  if (power == std::string_view::npos ||
      (rest != "" && rest != "B" && rest != "iB" && rest != "i")) {
    // "12 files": a word apart belongs to the sentence, not to the number.
    return apart ? std::optional<double>(1) : std::nullopt;
  }
  const double step = !rest.empty() && rest.front() == 'i' ? 1024 : static_cast<double>(base);
  return std::pow(step, static_cast<double>(power + 1));
}

void forEachLine(const std::string& output, const std::function<void(std::string_view)>& visit) {
  for (std::size_t begin = 0; begin < output.size();) {
    const std::size_t end = std::min(output.find('\n', begin), output.size());
    std::string_view line(output.data() + begin, end - begin);
    if (line.ends_with('\r')) line.remove_suffix(1);
    visit(line);
    begin = end + 1;
  }
}

std::vector<std::string_view> columnsOf(std::string_view line) {
  std::vector<std::string_view> columns;
  for (skipSpace(line); !line.empty(); skipSpace(line)) {
    std::size_t end = 0;
    while (end < line.size() && !isSpace(line[end])) ++end;
    columns.push_back(line.substr(0, end));
    line.remove_prefix(end);
  }
  return columns;
}

std::uint64_t sumOf(std::uint64_t a, std::uint64_t b) {
  return a > std::numeric_limits<std::uint64_t>::max() - b
             ? std::numeric_limits<std::uint64_t>::max()
             : a + b;
}

}  // namespace

std::optional<std::uint64_t> sizeAtBeginning(std::string_view text, std::uint64_t base) {
  skipSpace(text);
  if (text.empty() || std::isdigit(static_cast<unsigned char>(text.front())) == 0) {
    return std::nullopt;
  }
  double number = 0;
  const auto [end, error] =
      std::from_chars(text.data(), text.data() + text.size(), number, std::chars_format::fixed);
  if (error != std::errc()) return std::nullopt;
  text.remove_prefix(static_cast<std::size_t>(end - text.data()));
  const bool apart = !text.empty() && isSpace(text.front());
  skipSpace(text);
  const auto unit = unitOf(wordOf(text), base, apart);
  if (!unit || !(number * *unit < kMost)) return std::nullopt;
  return static_cast<std::uint64_t>(number * *unit);
}

std::optional<std::uint64_t> amountIn(const std::string& output, const AmountInOutput& how) {
  std::uint64_t sum = 0;
  bool good = true;
  std::size_t number = 0;
  forEachLine(output, [&](std::string_view line) {
    ++number;
    if (how.kind == AmountInOutput::Kind::kAfter) {
      const std::size_t at = line.find(how.after);
      if (at == std::string_view::npos) return;
      const auto size = sizeAtBeginning(line.substr(at + how.after.size()), how.base);
      good = good && size;
      sum = sumOf(sum, size.value_or(0));
      return;
    }
    const auto columns = columnsOf(line);
    if (columns.empty()) return;
    const auto size = how.column <= columns.size()
                          ? sizeAtBeginning(columns[how.column - 1], how.base)
                          : std::nullopt;
    good = good && (size || number == 1);
    sum = sumOf(sum, size.value_or(0));
  });
  return good ? std::optional(sum) : std::nullopt;
}

std::set<std::string> pathsIn(const std::string& output, const std::string& after) {
  std::set<std::string> paths;
  forEachLine(output, [&](std::string_view line) {
    if (!line.starts_with(after)) return;
    line.remove_prefix(after.size());
    skipSpace(line);
    while (line.size() > 1 && line.ends_with('/')) line.remove_suffix(1);
    if (line.starts_with('/') && paths.size() < kMaxListedPaths) paths.emplace(line);
  });
  return paths;
}

}  // namespace spacekeep::command
