// completion: what the shells need to complete the command line, made from its own description. A command for
// those who build this program, not shown in the help: the package installs what it prints.
#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "description.h"

namespace {

using Json = nlohmann::ordered_json;
using Commands = std::vector<CommandDescription>;

constexpr const char *Colors = "auto always never";

std::string replaced(std::string text, const std::string &what, const std::string &by) {
  for (std::size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + by.size()))
    text.replace(at, what.size(), by);
  return text;
}

/// In single quotes for a POSIX shell.
std::string quoted(const std::string &text) {
  return "'" + replaced(text, "'", "'\\''") + "'";
}

std::string optionNames(const CommandDescription &command) {
  std::string names;
  for (const OptionDescription &option : command.options)
    names += (names.empty() ? "" : " ") + option.name;
  return names;
}

std::string commandNames(const Commands &commands) {
  std::string names;
  for (const CommandDescription &command : commands)
    names += (names.empty() ? "" : " ") + command.name;
  return names;
}

/// "--a | --b": the options of all commands whose value is of this kind, each once.
std::string bashPattern(const Commands &commands, ValueKind kind) {
  std::vector<std::string> found;
  for (const CommandDescription &command : commands)
    for (const OptionDescription &option : command.options)
      if (!option.value.empty() && option.kind == kind &&
          std::find(found.begin(), found.end(), option.name) == found.end())
        found.push_back(option.name);
  std::string pattern;
  for (const std::string &name : found)
    pattern += (pattern.empty() ? "" : " | ") + name;
  return pattern;
}

void printBashValues(const Commands &commands) {
  const struct {
    ValueKind kind;
    std::string action;
  } values[] = {{ValueKind::Directory, "_orvpatchctl_offer -d \"$word\""},
                {ValueKind::File, "_orvpatchctl_offer -f \"$word\""},
                {ValueKind::ColorMode,
                 std::string("mapfile -t COMPREPLY < <(compgen -W '") + Colors + "' -- \"$word\")"},
                {ValueKind::Text, ":"}};
  printf("  # The value of an option.\n  case $previous in\n");
  for (const auto &value : values) {
    const std::string pattern = bashPattern(commands, value.kind);
    if (!pattern.empty())
      printf("    %s)\n      %s\n      return\n      ;;\n", pattern.c_str(), value.action.c_str());
  }
  printf("  esac\n");
}

std::string bashKinds(const CommandDescription &command) {
  std::string kinds;
  for (const OptionDescription &argument : command.arguments) {
    const char *const kind = argument.kind == ValueKind::Directory ? "d"
                             : argument.kind == ValueKind::File    ? "f"
                                                                   : "-";
    kinds += (kinds.empty() ? "" : " ") + std::string(kind);
  }
  return kinds;
}

bool lastRepeats(const CommandDescription &command) {
  return !command.arguments.empty() && command.arguments.back().repeats;
}

void printBashCommands(const Commands &commands) {
  printf("  case $command in\n");
  for (const CommandDescription &command : commands) {
    printf("    %s)\n      options='%s'\n", command.name.empty() ? "''" : command.name.c_str(),
           optionNames(command).c_str());
    if (!command.arguments.empty())
      printf("      kinds=(%s)\n", bashKinds(command).c_str());
    if (lastRepeats(command))
      printf("      ((count < %zu)) || count=%zu\n", command.arguments.size(), command.arguments.size() - 1);
    printf("      ;;\n");
  }
  printf("  esac\n");
}

void printBash(const Commands &commands) {
  printf("# Completion of orvpatchctl for bash. Made by \"orvpatchctl completion bash\".\n\n"
         "_orvpatchctl_offer() {\n"
         "  compopt -o filenames 2>/dev/null\n"
         "  mapfile -t COMPREPLY < <(compgen \"$1\" -- \"$2\")\n"
         "}\n\n"
         "_orvpatchctl() {\n"
         "  local word=$2 previous=$3 command='' options='' count=0 place\n"
         "  local -a kinds=()\n"
         "  COMPREPLY=()\n");
  printBashValues(commands);
  std::string withValue;
  for (const ValueKind kind : {ValueKind::Directory, ValueKind::File, ValueKind::ColorMode, ValueKind::Text})
    if (const std::string pattern = bashPattern(commands, kind); !pattern.empty())
      withValue += (withValue.empty() ? "" : " | ") + pattern;
  printf("  # The command, and the number of its arguments before the cursor.\n"
         "  for ((place = 1; place < COMP_CWORD; place++)); do\n"
         "    case ${COMP_WORDS[place]} in\n"
         "      %s) ((place++)) ;;\n"
         "      -*) ;;\n"
         "      *) if [[ -z $command ]]; then command=${COMP_WORDS[place]}; else ((count++)); fi ;;\n"
         "    esac\n"
         "  done\n",
         withValue.c_str());
  printBashCommands(commands);
  printf("  if [[ $word == -* ]]; then\n"
         "    mapfile -t COMPREPLY < <(compgen -W \"$options\" -- \"$word\")\n"
         "  elif [[ -z $command ]]; then\n"
         "    mapfile -t COMPREPLY < <(compgen -W '%s' -- \"$word\")\n"
         "  elif [[ ${kinds[count]:--} != - ]]; then\n"
         "    _orvpatchctl_offer \"-${kinds[count]}\" \"$word\"\n"
         "  fi\n"
         "}\n\n"
         "complete -F _orvpatchctl orvpatchctl\n",
         commandNames({commands.begin() + 1, commands.end()}).c_str());
}

/// In the brackets of a description, or between the colons of a message, of zsh.
std::string zshText(const std::string &text) {
  std::string escaped = replaced(text, "\\", "\\\\");
  for (const char *special : {"[", "]", ":"})
    escaped = replaced(escaped, special, std::string("\\") + special);
  return escaped;
}

std::string zshAction(const OptionDescription &option) {
  switch (option.kind) {
  case ValueKind::Directory:
    return "_files -/";
  case ValueKind::File:
    return "_files";
  case ValueKind::ColorMode:
    return "(" + std::string(Colors) + ")";
  default:
    return " ";
  }
}

std::vector<std::string> zshSpecs(const CommandDescription &command) {
  std::vector<std::string> specs;
  for (const OptionDescription &option : command.options) {
    const bool isFlag = option.value.empty();
    specs.push_back(option.name + (isFlag ? "" : "=") + "[" + zshText(option.text) + "]" +
                    (isFlag ? "" : ":" + zshText(option.value) + ":" + zshAction(option)));
  }
  for (std::size_t i = 0; i < command.arguments.size(); ++i) {
    const OptionDescription &argument = command.arguments[i];
    specs.push_back((argument.repeats ? "*" : std::to_string(i + 1)) + ":" + zshText(argument.name) + ":" +
                    zshAction(argument));
  }
  return specs;
}

void printZsh(const Commands &commands) {
  printf("#compdef orvpatchctl\n"
         "# Completion of orvpatchctl for zsh. Made by \"orvpatchctl completion zsh\".\n\n"
         "local curcontext=$curcontext state\n"
         "local -a line commands\n"
         "_arguments -C \\\n");
  for (const std::string &spec : zshSpecs(commands.front()))
    printf("  %s \\\n", quoted(spec).c_str());
  printf("  '1:command:->command' \\\n  '*::argument:->argument' && return\n\ncase $state in\n  command)\n"
         "    commands=(\n");
  for (std::size_t i = 1; i < commands.size(); ++i)
    printf("      %s\n", quoted(commands[i].name + ":" + commands[i].text).c_str());
  printf("    )\n    _describe command commands\n    ;;\n  argument)\n    case $words[1] in\n");
  for (std::size_t i = 1; i < commands.size(); ++i) {
    printf("      %s)\n        _arguments", commands[i].name.c_str());
    for (const std::string &spec : zshSpecs(commands[i]))
      printf(" \\\n          %s", quoted(spec).c_str());
    printf("\n        ;;\n");
  }
  printf("    esac\n    ;;\nesac\n");
}

/// In single quotes for fish, which knows a backslash in them.
std::string fishQuoted(const std::string &text) {
  return "'" + replaced(replaced(text, "\\", "\\\\"), "'", "\\'") + "'";
}

std::string fishValue(const OptionDescription &option) {
  switch (option.kind) {
  case ValueKind::Directory:
    return " -x -a '(__fish_complete_directories (commandline -ct) \"\")'";
  case ValueKind::File:
    return " -r -F";
  case ValueKind::ColorMode:
    return std::string(" -x -a '") + Colors + "'";
  default:
    return " -x";
  }
}

void printFishCommand(const CommandDescription &command) {
  const std::string condition =
      command.name.empty() ? "__fish_use_subcommand" : "__fish_seen_subcommand_from " + command.name;
  const std::string start = "complete -c orvpatchctl -n '" + condition + "'";
  for (const OptionDescription &option : command.options)
    printf("%s -l %s%s -d %s\n", start.c_str(), option.name.substr(2).c_str(),
           option.value.empty() ? "" : fishValue(option).c_str(), fishQuoted(option.text).c_str());
  bool takesFiles = false;
  for (const OptionDescription &argument : command.arguments)
    takesFiles = takesFiles || argument.kind == ValueKind::File;
  if (takesFiles)
    printf("%s -F\n", start.c_str());
  else if (!command.arguments.empty())
    printf("%s -f -a '(__fish_complete_directories (commandline -ct) \"\")'\n", start.c_str());
}

void printFish(const Commands &commands) {
  printf("# Completion of orvpatchctl for fish. Made by \"orvpatchctl completion fish\".\n\n"
         "complete -c orvpatchctl -f\n");
  for (std::size_t i = 1; i < commands.size(); ++i)
    printf("complete -c orvpatchctl -n __fish_use_subcommand -a %s -d %s\n", commands[i].name.c_str(),
           fishQuoted(commands[i].text).c_str());
  for (const CommandDescription &command : commands)
    printFishCommand(command);
}

Json documentOf(const std::vector<OptionDescription> &options) {
  Json list = Json::array();
  for (const OptionDescription &option : options)
    list.push_back({{"name", option.name}, {"text", option.text}, {"value", option.value}});
  return list;
}

void printJson(const Commands &commands) {
  Json list = Json::array();
  for (const CommandDescription &command : commands)
    list.push_back({{"name", command.name},
                    {"text", command.text},
                    {"options", documentOf(command.options)},
                    {"arguments", documentOf(command.arguments)}});
  printDocument(list);
}

} // namespace

void addCompletion(CLI::App &application, Invocation &) {
  CLI::App *const command = application.add_subcommand("completion", "Print the completion of a shell");
  command->group("");
  const auto shell = std::make_shared<std::string>();
  command->add_option("shell", *shell, "bash, zsh, fish; json: the command line as data")
      ->required()
      ->check(CLI::IsMember({"bash", "zsh", "fish", "json"}));
  command->callback([shell, &application] {
    const Commands commands = describe(application);
    if (*shell == "json")
      printJson(commands);
    else
      (*shell == "bash" ? printBash : *shell == "zsh" ? printZsh : printFish)(commands);
  });
}
