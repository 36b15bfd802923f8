// What all commands share: their common options and their exit statuses.
#pragma once

#include <memory>
#include <string>

#include "installer.h"
#include "judgement.h"
#include "output.h"

namespace CLI {
class App;
}

/// Exit statuses of every command.
enum ExitStatus {
  Good = 0,
  Findings = 1,        ///< findings, differences, or refused before anything changed
  CannotJudge = 2,     ///< usage, or an archive or a home that cannot be read
  InstallerFailed = 3, ///< the home is as the record says
  DifferencesFound = 4,
  FailedAndUndone = 5
};

/// What the command line says to every command, and the status that the command leaves.
struct Invocation {
  OutputOptions output;
  int status = Good;
};

/// Adds a sub-command with the options that every command has.
CLI::App *addCommand(CLI::App &application, Invocation &invocation, const std::string &name,
                     const std::string &description);

/// Adds the home as the command's first argument; what it says when the command runs.
std::shared_ptr<std::string> addHome(CLI::App &command);

/// Adds --installer and --path.
void addInstallerOptions(CLI::App &command, InstallerOptions &options);
