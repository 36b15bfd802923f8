// In place of child processes: every command is recorded and answered at once.
#pragma once

#include <string>
#include <vector>

using Command = std::vector<std::string>;

/// The commands since the last call, in order.
std::vector<Command> takeCommands();

/// Whether `ps -p` knows this process: the real one takes nothing but digits.
bool isKnownProcess(const std::string &pid);
