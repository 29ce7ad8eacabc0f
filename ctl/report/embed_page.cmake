# Makes one C++ source of the files of the page: cmake -DFOLDER=... -DOUTPUT=... -P embed_page.cmake
# The page forbids everything that is not its own by the hashes of its script and its style, so both
# are computed here, over the very bytes between the tags.
cmake_minimum_required(VERSION 3.25)

set(alphabet "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/")

# base64_of(digits variable): RFC 4648, from hexadecimal digits.
function(base64_of digits variable)
  set(text "")
  string(LENGTH "${digits}" length)
  set(at 0)
  while(at LESS length)
    string(SUBSTRING "${digits}" ${at} 6 group)
    string(LENGTH "${group}" present)
    string(SUBSTRING "${group}0000" 0 6 group)
    math(EXPR letters "(${present} * 4 + 5) / 6")
    foreach(index RANGE 0 3)
      if(index LESS letters)
        math(EXPR letter "(0x${group} >> (18 - 6 * ${index})) & 63")
        string(SUBSTRING "${alphabet}" ${letter} 1 character)
        string(APPEND text "${character}")
      else()
        string(APPEND text "=")
      endif()
    endforeach()
    math(EXPR at "${at} + 6")
  endwhile()
  set(${variable} "${text}" PARENT_SCOPE)
endfunction()

function(hash_of text variable)
  string(SHA256 digits "${text}")
  base64_of("${digits}" base64)
  set(${variable} "${base64}" PARENT_SCOPE)
endfunction()

file(GLOB scripts ${FOLDER}/*.js)
list(SORT scripts)
set(script "'use strict';\n(() => {\n")
foreach(path IN LISTS scripts)
  file(READ ${path} text)
  string(APPEND script "${text}\n")
endforeach()
string(APPEND script "})();\n")
file(READ ${FOLDER}/report.css style)
file(READ ${FOLDER}/report.html page)
hash_of("${script}" script_hash)
hash_of("${style}" style_hash)
string(REPLACE "@SCRIPT_HASH@" "${script_hash}" page "${page}")
string(REPLACE "@STYLE_HASH@" "${style_hash}" page "${page}")
string(REPLACE "@STYLE@" "${style}" page "${page}")
string(REPLACE "@SCRIPT@" "${script}" page "${page}")

string(HEX "${page}" bytes)
string(REGEX REPLACE "(..)" "0x\\1," bytes "${bytes}")
string(REGEX REPLACE "(0x[^x]+x[^x]+x[^x]+x[^x]+x[^x]+x[^x]+x[^x]+x[^x]+x..,)" "\\1\n" bytes "${bytes}")
file(WRITE ${OUTPUT} "// Made by embed_page.cmake from the files of the page.
#include \"ctl/report/html_page.h\"

namespace spacekeep::ctl {
namespace {

constexpr unsigned char kPage[] = {
${bytes}};

}  // namespace

std::string_view emptyPage() {
  return {reinterpret_cast<const char*>(kPage), sizeof kPage};
}

}  // namespace spacekeep::ctl
")
