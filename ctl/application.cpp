#include "application.h"

#include <csignal>
#include <cstdio>
#include <new>

#include <CLI/CLI.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "memorylog.h"
#include "signals.h"

std::unique_ptr<CLI::App> makeApplication(Invocation &invocation) {
  auto application = std::make_unique<CLI::App>(
      "Makes, checks and applies patches of the ORV monitoring product, round the installer orvpatch.",
      "orvpatchctl");
  application->set_version_flag("--version", "orvpatchctl " ORVPATCHCTL_VERSION);
  application->require_subcommand(1);
  addNew(*application, invocation);
  addBuild(*application, invocation);
  addLint(*application, invocation);
  addShow(*application, invocation);
  addStatus(*application, invocation);
  addHistory(*application, invocation);
  addVerify(*application, invocation);
  addLog(*application, invocation);
  addCompletion(*application, invocation);
  addCheck(*application, invocation);
  addApply(*application, invocation);
  addUndo(*application, invocation);
  addRecover(*application, invocation);
  return application;
}

namespace {

int parseAndRun(int argc, const char *const *argv) {
  Invocation invocation;
  const std::unique_ptr<CLI::App> application = makeApplication(invocation);
  // What is read with the installer's units must not be told in the log of any home.
  const MemoryLog log;
  try {
    application->parse(argc, argv);
  } catch (const CLI::ParseError &error) {
    return application->exit(error) == 0 ? Good : CannotJudge;
  } catch (const JudgementError &error) {
    fprintf(stderr, "orvpatchctl: %s\n", error.what());
    return CannotJudge;
  } catch (const RefusalError &error) {
    fprintf(stderr, "orvpatchctl: %s\n", error.what());
    return Findings;
  } catch (const Interrupted &interruption) {
    endBySignal(interruption.signal);
  } catch (const std::bad_alloc &) {
    fputs("orvpatchctl: out of memory\n", stderr);
    return CannotJudge;
  } catch (const std::exception &error) { // of the library: a directory that cannot be read, say
    fprintf(stderr, "orvpatchctl: %s\n", error.what());
    return CannotJudge;
  }
  return invocation.status;
}

} // namespace

int runApplication(int argc, const char *const *argv) {
  // With SIGCHLD ignored, which a caller may leave behind, children have no exit status.
  static_cast<void>(signal(SIGCHLD, SIG_DFL));
  const int status = parseAndRun(argc, argv);
  // A document that a full disk has cut off must not pass for a whole one.
  if (fflush(stdout) == 0 && ferror(stdout) == 0)
    return status;
  fputs("orvpatchctl: cannot write to standard output\n", stderr);
  return CannotJudge;
}
