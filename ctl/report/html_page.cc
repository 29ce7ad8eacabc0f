#include "ctl/report/html_page.h"

#include <algorithm>

namespace spacekeep::ctl {

// These characters stand in texts only, so each may be written as its escape. With none of them
// left, nothing can be read as markup.
std::string embeddable(std::string_view json) {
  std::string text;
  text.reserve(json.size() + json.size() / 64);
  for (const char letter : json) {
    switch (letter) {
      case '<':
        text += "\\u003c";
        break;
      case '>':
        text += "\\u003e";
        break;
      case '&':
        text += "\\u0026";
        break;
      default:
        text += letter;
    }
  }
  return text;
}

std::string pageWith(std::string_view json) {
  const std::string_view page = emptyPage();
  const std::size_t at = std::min(page.find(kDataMark), page.size());
  std::string text(page.substr(0, at));
  text += embeddable(json);
  text += page.substr(std::min(at + kDataMark.size(), page.size()));
  return text;
}

}  // namespace spacekeep::ctl
