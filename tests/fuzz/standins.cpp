#include "standins.h"

#include "process.h"

namespace {

std::vector<Command> commands;

} // namespace

std::vector<Command> takeCommands() {
  std::vector<Command> taken;
  taken.swap(commands);
  return taken;
}

bool isKnownProcess(const std::string &pid) {
  return !pid.empty() && pid.find_first_not_of("0123456789") == std::string::npos;
}

bool runCommand(const std::vector<std::string> &words, CommandResult &result) {
  commands.push_back(words);
  if (words[0] == "ps" && isKnownProcess(words[2]))
    result.out = "    PID TTY          TIME CMD\n" + words[2] + " ?\n";
  return true;
}
