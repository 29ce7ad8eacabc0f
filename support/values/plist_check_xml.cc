#include <algorithm>
#include <charconv>
#include <chrono>

#include "support/values/plist.h"
#include "support/values/plist_check.h"
#include "support/values/text.h"

namespace spacekeep {
namespace {

using Problem = std::optional<std::string>;
constexpr std::string_view kSpace = " \t\r\n";

std::string_view trimmed(std::string_view text) {
  const std::size_t start = text.find_first_not_of(kSpace);
  if (start == std::string_view::npos) return {};
  return text.substr(start, text.find_last_not_of(kSpace) - start + 1);
}

template <class Number, class... Base>
bool readsWhole(std::string_view text, Number& number, Base... base) {
  const char* end = text.data() + text.size();
  const auto read = std::from_chars(text.data(), end, number, base...);
  return !text.empty() && read.ec == std::errc{} && read.ptr == end;
}

// Leading zeros are refused: the parser would take them for octal, the writer hardly meant that.
Problem integerProblem(std::string_view text) {
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  const bool hexadecimal = text.starts_with("0x") || text.starts_with("0X");
  std::uint64_t magnitude = 0;
  const bool readable =
      hexadecimal ? readsWhole(text.substr(2), magnitude, 16)
                  : readsWhole(text, magnitude, 10) && (text.size() == 1 || text[0] != '0');
  if (!readable) return "an integer is not a decimal or hexadecimal number in range";
  const bool in_range = !negative || magnitude <= std::uint64_t{1} << 63;
  return in_range ? std::nullopt : Problem("an integer is out of range");
}

Problem realProblem(std::string_view text) {
  if (text.starts_with('+')) text.remove_prefix(1);
  double number = 0;
  return readsWhole(text, number) ? std::nullopt : Problem("a real is not a number in range");
}

// Exactly YYYY-MM-DDTHH:MM:SSZ, a day of the calendar, in range.
Problem dateProblem(std::string_view text) {
  static constexpr std::string_view kPattern = "dddd-dd-ddTdd:dd:ddZ";
  const auto fits = [](char got, char wanted) {
    return wanted == 'd' ? got >= '0' && got <= '9' : got == wanted;
  };
  if (!std::equal(text.begin(), text.end(), kPattern.begin(), kPattern.end(), fits)) {
    return "a date is not of the form 2001-02-03T04:05:06Z";
  }
  const auto number = [text](std::size_t start, std::size_t length) {
    int value = 0;
    readsWhole(text.substr(start, length), value);
    return value;
  };
  const std::chrono::year_month_day day{std::chrono::year{number(0, 4)},
                                        std::chrono::month{static_cast<unsigned>(number(5, 2))},
                                        std::chrono::day{static_cast<unsigned>(number(8, 2))}};
  if (!day.ok() || number(11, 2) > 23 || number(14, 2) > 59 || number(17, 2) > 59) {
    return "a date is not a point in time";
  }
  const auto seconds =
      std::chrono::sys_seconds{std::chrono::sys_days{day}}.time_since_epoch().count();
  const bool in_range = plistDateFits(static_cast<double>(seconds - kPlistEpochUnixSeconds));
  return in_range ? std::nullopt : Problem("a date is out of range");
}

bool isNumberOrDate(std::string_view name) {
  return name == "integer" || name == "real" || name == "date";
}

Problem scalarProblem(std::string_view name, std::string_view text) {
  if (name == "integer") return integerProblem(text);
  if (name == "real") return realProblem(text);
  return dateProblem(text);
}

class Scan {
 public:
  explicit Scan(std::string_view document) : rest_(document) {}

  Problem run() {
    while (true) {
      const std::size_t start = rest_.find('<');
      if (start == std::string_view::npos) return std::nullopt;
      rest_.remove_prefix(start);
      if (Problem problem = readMarkup()) return problem;
    }
  }

 private:
  Problem readMarkup() {
    if (rest_.starts_with("<!--")) return skipComment();
    if (rest_.starts_with("<![CDATA[")) return skipPast("]]>", "a CDATA section does not end");
    if (rest_.starts_with("<?")) return skipPast("?>", "a processing instruction does not end");
    if (rest_.starts_with("<!")) return skipDeclaration();
    return readTag();
  }

  Problem skipPast(std::string_view end, const char* problem) {
    const std::size_t found = rest_.find(end);
    if (found == std::string_view::npos) return problem;
    rest_.remove_prefix(found + end.size());
    return std::nullopt;
  }

  Problem skipComment() {
    rest_.remove_prefix(4);
    if (rest_.starts_with('>') || rest_.starts_with("->")) return "a comment is not well formed";
    const std::size_t dashes = rest_.find("--");
    if (dashes == std::string_view::npos || rest_.substr(dashes + 2, 1) != ">") {
      return "a comment does not end or holds two dashes";
    }
    rest_.remove_prefix(dashes + 3);
    return std::nullopt;
  }

  // A document type may stand there; entities of its own, and all else such a thing may hold, not.
  Problem skipDeclaration() {
    const std::size_t end = rest_.find('>');
    if (end == std::string_view::npos) return "a declaration does not end";
    if (rest_.substr(1, end).find_first_of("[<") != std::string_view::npos) {
      return "a declaration holds declarations of its own";
    }
    rest_.remove_prefix(end + 1);
    return std::nullopt;
  }

  Problem readTag() {
    const std::size_t end = rest_.find('>');
    if (end == std::string_view::npos) return "a tag does not end";
    const std::string_view tag = rest_.substr(1, end - 1);
    rest_.remove_prefix(end + 1);
    if (tag.find('<') != std::string_view::npos) return "a tag holds an angle bracket";
    if (std::count(tag.begin(), tag.end(), '"') % 2 != 0 ||
        std::count(tag.begin(), tag.end(), '\'') % 2 != 0) {
      return "a tag holds an odd number of quotes";
    }
    return tag.starts_with('/') ? closeTag(tag.substr(1)) : openTag(tag);
  }

  static bool isContainer(std::string_view name) { return name == "array" || name == "dict"; }

  Problem openTag(std::string_view tag) {
    const std::string_view name = tag.substr(0, tag.find_first_of(" \t\r\n/"));
    if (++values_ > kMaxPlistValues) return "it holds too many values";
    const bool empty = tag.ends_with('/');
    key_waits_ = name == "key" && empty;
    if (isContainer(name)) {
      // An empty one is no deeper than a scalar would be, but counts like every other container.
      if (depth_ + 1 > kMaxPlistDepth) return "it is nested too deep";
      depth_ += empty ? 0 : 1;
      return std::nullopt;
    }
    return isNumberOrDate(name) ? contentProblem(name, empty) : std::nullopt;
  }

  Problem contentProblem(std::string_view name, bool empty) {
    const std::size_t next = std::min(rest_.find('<'), rest_.size());
    // The parser would glue together what comments divide.
    if (!empty && !rest_.substr(next).starts_with("</"))
      return "an integer, a real or a date holds more than text";
    return scalarProblem(name, empty ? std::string_view() : trimmed(rest_.substr(0, next)));
  }

  Problem closeTag(std::string_view tag) {
    const std::string_view name = tag.substr(0, tag.find_first_of(kSpace));
    if (name == "dict" && key_waits_) return "a key has no value";
    key_waits_ = name == "key";
    if (!isContainer(name)) return std::nullopt;
    return --depth_ < 0 ? Problem("a closing tag has no opening one") : std::nullopt;
  }

  std::string_view rest_;
  int depth_ = 0;
  bool key_waits_ = false;  // the last tag ended a key
  std::size_t values_ = 0;
};

}  // namespace

std::optional<std::string> xmlPlistProblem(std::string_view document) {
  if (document.find('\0') != std::string_view::npos) return "it holds a zero byte";
  if (!isUtf8(document)) return "it is not UTF-8 text";
  return Scan(document).run();
}

}  // namespace spacekeep
