#include "description.h"

#include <algorithm>

#include <CLI/CLI.hpp>

namespace {

/// What a value is, by the word that stands for it in the help.
ValueKind kindOf(std::string value) {
  if (value.rfind('[', 0) == 0) // it may be left out
    value.erase(0, 1);
  const auto isOne = [&value](std::initializer_list<const char *> words) {
    return std::any_of(words.begin(), words.end(),
                       [&value](const char *word) { return value.rfind(word, 0) == 0; });
  };
  if (isOne({"HOME", "DIR", "FOLDER"}))
    return ValueKind::Directory;
  if (isOne({"PATCH", "FILE"}))
    return ValueKind::File;
  return value == "WHEN" ? ValueKind::ColorMode : ValueKind::Text;
}

OptionDescription describeOption(const CLI::Option &option) {
  const bool isFlag = option.get_items_expected_max() == 0;
  OptionDescription described;
  const std::vector<std::string> &names = option.get_lnames();
  if (option.get_positional())
    described.name = option.get_name(true);
  else
    described.name = names.empty() ? "-" + option.get_snames().front() : "--" + names.front();
  described.text = option.get_description();
  described.value = isFlag ? "" : option.get_option_text();
  described.kind = kindOf(described.value);
  described.repeats = option.get_items_expected_max() > 1;
  return described;
}

CommandDescription describeCommand(const CLI::App &command, const std::string &name) {
  CommandDescription described{name, command.get_description(), {}, {}};
  for (const CLI::Option *option : command.get_options())
    if (!option->get_group().empty())
      (option->get_positional() ? described.arguments : described.options).push_back(describeOption(*option));
  return described;
}

} // namespace

std::vector<CommandDescription> describe(const CLI::App &application) {
  std::vector<CommandDescription> commands = {describeCommand(application, "")};
  for (const CLI::App *command : application.get_subcommands([](const CLI::App *) { return true; }))
    if (!command->get_group().empty())
      commands.push_back(describeCommand(*command, command->get_name()));
  return commands;
}
