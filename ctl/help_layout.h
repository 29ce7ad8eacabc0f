// Thread safety: for one thread at a time.
//
// Help texts that fit the terminal: names in one column, what they mean wrapped in another.
#pragma once

#include <CLI/CLI.hpp>
#include <cstddef>
#include <string>

namespace spacekeep::ctl {

class HelpLayout final : public CLI::FormatterBase {
 public:
  explicit HelpLayout(std::size_t columns) : columns_(columns) {}

  /// The options of the commands above are listed too, since they may stand anywhere.
  std::string make_help(const CLI::App* app, std::string name,
                        CLI::AppFormatMode mode) const override;

 private:
  [[nodiscard]] std::string usageOf(const CLI::App* app) const;
  [[nodiscard]] std::string argumentsOf(const CLI::App* app) const;
  [[nodiscard]] std::string optionsOf(const CLI::App* app) const;
  [[nodiscard]] std::string commandsOf(const CLI::App* app) const;
  [[nodiscard]] std::string entry(const std::string& name, const std::string& meaning) const;

  const std::size_t columns_;
};

}  // namespace spacekeep::ctl
