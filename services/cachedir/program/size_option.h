// Thread safety: none; for reading a command line on one thread.
//
// Sizes as the services take them on their command lines.
#pragma once

#include <CLI/CLI.hpp>
#include <cstdint>
#include <string>
#include <variant>

#include "ctl/size_text.h"

namespace spacekeep::cachedir {

/// Takes what ctl::parseSize reads (1000000, 500M, 1.5GiB) into `amount`, in bytes; anything else is
/// an error of the command line. `amount` must outlive the parsing.
inline CLI::Validator sizeInto(std::uint64_t& amount) {
  return {[&amount](std::string& text) -> std::string {
            const auto size = ctl::parseSize(text);
            if (const auto* error = std::get_if<ctl::SizeError>(&size)) return error->text;
            amount = std::get<std::uint64_t>(size);
            return "";
          },
          "SIZE", "size"};
}

}  // namespace spacekeep::cachedir
