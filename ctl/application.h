// The program: its commands, its options, and how a run ends.
#pragma once

#include <memory>

namespace CLI {
class App;
}
struct Invocation;

/// The whole command line, with one sub-command a room of commands/. The callbacks store their status in
/// `invocation`, which must outlive the application. Man page and completions are generated from it.
std::unique_ptr<CLI::App> makeApplication(Invocation &invocation);

/// Runs one command; the exit status (see ExitStatus).
int runApplication(int argc, const char *const *argv);
