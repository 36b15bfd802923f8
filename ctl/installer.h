// The installer as this program runs it: found beside it, with an environment of its own making.
#pragma once

#include <string>
#include <vector>

#include "child.h"

/// Where the tools are looked for when nothing else is said.
extern const char *const DefaultSearchPath;

/// What every command says that runs the installer.
struct InstallerOptions {
  std::string file;                           ///< --installer; empty: beside this program, else in PATH
  std::string searchPath = DefaultSearchPath; ///< --path
};

/// The installer's file. JudgementError when there is none.
std::string findInstaller(const InstallerOptions &options);

/// PATH, HOME and LANG=C: nothing else of the caller's environment reaches the installer and its children.
ChildEnvironment installerEnvironment(const InstallerOptions &options);

/// Runs `installer -h home -t patch`.
ChildResult runReport(const InstallerOptions &options, const std::string &home, const std::string &patch);
