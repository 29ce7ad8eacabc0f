#include "ctl/help_layout.h"

#include <string_view>

#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kMargin = 2;
constexpr std::size_t kMeaningColumn = 24;
constexpr std::size_t kNarrowMeaningColumn = 6;
constexpr std::size_t kNarrowColumns = 60;

std::string fullNameOf(const CLI::App* app) {
  const CLI::App* parent = app->get_parent();
  return parent == nullptr ? app->get_name() : fullNameOf(parent) + " " + app->get_name();
}

std::vector<const CLI::Option*> positionalsOf(const CLI::App* app) {
  return app->get_options([](const CLI::Option* option) { return option->get_positional(); });
}

std::vector<const CLI::Option*> flagsOf(const CLI::App* app) {
  return app->get_options([](const CLI::Option* option) { return option->nonpositional(); });
}

std::string nameOf(const CLI::Option* option) {
  const std::string name = option->get_name(false, true);
  const bool takes_value = option->get_items_expected_max() > 0;
  return takes_value ? name + " " + option->get_option_text() : name;
}

/// Each line of its own; one that begins with a space is an example and stays as it is.
std::string paragraphs(std::string_view rest, std::size_t columns) {
  std::string text;
  while (!rest.empty()) {
    const std::string_view line = rest.substr(0, rest.find('\n'));
    text += line.starts_with(' ') ? std::string(line) : wrapped(line, columns, 0);
    text += '\n';
    rest.remove_prefix(std::min(rest.size(), line.size() + 1));
  }
  return text;
}

}  // namespace

std::string HelpLayout::make_help(const CLI::App* app, std::string /*name*/,
                                  CLI::AppFormatMode /*mode*/) const {
  std::string text = paragraphs(app->get_description(), columns_) + "\n" + usageOf(app);
  text += argumentsOf(app) + commandsOf(app) + optionsOf(app);
  const std::string footer = app->get_footer();
  return footer.empty() ? text : text + "\n" + paragraphs(footer, columns_);
}

std::string HelpLayout::usageOf(const CLI::App* app) const {
  std::string usage = "Usage: " + fullNameOf(app) + " [OPTIONS]";
  for (const auto* option : positionalsOf(app)) usage += " " + option->get_name(true, false);
  if (!app->get_subcommands({}).empty()) usage += " COMMAND";
  return wrapped(usage, columns_, 0) + "\n";
}

std::string HelpLayout::argumentsOf(const CLI::App* app) const {
  std::string text;
  for (const auto* option : positionalsOf(app)) {
    text += entry(option->get_name(true, false), option->get_description());
  }
  return text.empty() ? text : "\nArguments:\n" + text;
}

std::string HelpLayout::commandsOf(const CLI::App* app) const {
  std::string text;
  for (const auto* command : app->get_subcommands({})) {
    const std::string about = command->get_description();
    text += entry(command->get_name(), about.substr(0, about.find('\n')));
  }
  return text.empty() ? text : "\nCommands:\n" + text;
}

std::string HelpLayout::optionsOf(const CLI::App* app) const {
  std::string text;
  for (const auto* option : flagsOf(app)) {
    text += entry(nameOf(option), option->get_description());
  }
  for (const CLI::App* above = app->get_parent(); above != nullptr; above = above->get_parent()) {
    for (const auto* option : flagsOf(above)) {
      const bool own = option == above->get_help_ptr() || option == above->get_version_ptr();
      if (!own) text += entry(nameOf(option), option->get_description());
    }
  }
  return "\nOptions:\n" + text;
}

std::string HelpLayout::entry(const std::string& name, const std::string& meaning) const {
  const std::size_t column = columns_ < kNarrowColumns ? kNarrowMeaningColumn : kMeaningColumn;
  const std::string head = std::string(kMargin, ' ') + name;
  const std::string text = wrapped(meaning, columns_, column) + "\n";
  if (displayWidth(head) + kMargin > column) return head + "\n" + text;
  return padded(head, column) + text.substr(column);
}

}  // namespace spacekeep::ctl
