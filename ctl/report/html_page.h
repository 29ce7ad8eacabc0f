// Thread safety: pure functions.
//
// The page: a fixed text with the data in its middle.
#pragma once

#include <string>
#include <string_view>

namespace spacekeep::ctl {

/// Where the data goes into the page, once.
inline constexpr std::string_view kDataMark = "@DATA@";

/// The page without data. Made from the files of ctl/report/page when the tool is built.
[[nodiscard]] std::string_view emptyPage();

/// `json` so that it can stand in an element of a page: no text in it can end the element or begin
/// another, and it says the same.
[[nodiscard]] std::string embeddable(std::string_view json);

/// The whole page.
[[nodiscard]] std::string pageWith(std::string_view json);

}  // namespace spacekeep::ctl
