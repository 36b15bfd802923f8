// The command line as data: what the completions are made from and the manual is checked against.
#pragma once

#include <string>
#include <vector>

namespace CLI {
class App;
}

/// What the shell may offer for a value.
enum class ValueKind { Text, File, Directory, ColorMode };

struct OptionDescription {
  std::string name;  ///< "--json"; of an argument its name
  std::string text;  ///< one sentence
  std::string value; ///< "HOME"; empty for a flag
  ValueKind kind = ValueKind::Text;
  bool repeats = false; ///< the argument may be given several times
};

struct CommandDescription {
  std::string name; ///< empty for the program itself
  std::string text;
  std::vector<OptionDescription> options;
  std::vector<OptionDescription> arguments;
};

/// The program itself first, then its commands in their order, without the hidden ones.
std::vector<CommandDescription> describe(const CLI::App &application);
