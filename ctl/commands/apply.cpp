// apply: an installation as a transaction.
#include <cstdio>
#include <cstdlib>
#include <iostream>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>
#include <unistd.h>

#include "commands/command.h"
#include "commands/commands.h"
#include "signals.h"
#include "text.h"
#include "transaction/applying.h"
#include "transaction/progress.h"
#include "transaction/summary.h"

namespace {

struct Arguments {
  std::shared_ptr<std::string> home;
  std::string patch;
  bool yes = false;
  ApplyOptions options;
};

/// Asks on a terminal alone; elsewhere --yes must have answered.
bool agrees(const Arguments &arguments, const Record &record) {
  if (arguments.yes)
    return true;
  if (isatty(STDIN_FILENO) != 1) {
    fputs("orvpatchctl: not confirmed: give --yes\n", stderr);
    return false;
  }
  printPlan(record, stderr);
  fputs("Apply? [y/N] ", stderr);
  std::string answer;
  if (waitForInput(STDIN_FILENO))
    std::getline(std::cin, answer);
  return answer == "y" || answer == "yes";
}

/// Nothing of the caller's environment reaches what is run from here on.
void renewEnvironment(const InstallerOptions &options) {
  const char *const home = getenv("HOME");
  const std::string kept = home == nullptr ? "/" : home;
  clearenv();
  setenv("PATH", options.searchPath.c_str(), 1);
  setenv("HOME", kept.c_str(), 1);
  setenv("LANG", "C", 1);
}

void apply(const Arguments &arguments, Invocation &invocation) {
  ApplyOptions options = arguments.options;
  options.check.installer.file = findInstaller(options.check.installer);
  renewEnvironment(options.check.installer);
  const Home home(*arguments.home);
  Progress progress(home.path(), stderr, isatty(STDERR_FILENO) == 1);
  const bool isQuiet = invocation.output.json;
  const ApplyDialogue dialogue = {[&arguments, &progress](const Record &record) {
                                    progress.end(); // the question has a line of its own
                                    progress.expect(record.files.size());
                                    return agrees(arguments, record);
                                  },
                                  [isQuiet, &progress](const std::string &step) {
                                    if (isQuiet)
                                      return;
                                    if (step.empty())
                                      progress.poll();
                                    else
                                      progress.begin(step);
                                  }};
  const Record record = applyPatches(home, arguments.patch, options, dialogue);
  progress.end();
  if (invocation.output.json)
    printDocument(toJson(record));
  else
    printRecord(record, invocation.output);
  invocation.status = statusOf(record);
}

} // namespace

void addApply(CLI::App &application, Invocation &invocation) {
  CLI::App *const command =
      addCommand(application, invocation, "apply", "Install patches so that they can be undone");
  const auto arguments = std::make_shared<Arguments>();
  arguments->home = addHome(*command);
  command->add_option("patch", arguments->patch, "A patch file, or a directory of them")
      ->required()
      ->option_text("PATCH");
  command->add_flag("--yes", arguments->yes, "Do not ask");
  command->add_flag("--dry-run", arguments->options.dryRun, "Stop before the question");
  command->add_flag("--undo-on-failure", arguments->options.undoOnFailure,
                    "Take everything back when it does not end well");
  command->add_option("--keep", arguments->options.keep, "How many transactions are kept (default 5)")
      ->option_text("N")
      ->check(CLI::PositiveNumber);
  command
      ->add_option("--keyring", arguments->options.check.keyring,
                   "Ask for signatures by a key of this keyring")
      ->option_text("FILE");
  addInstallerOptions(*command, arguments->options.check.installer);
  command->callback([arguments, &invocation] { apply(*arguments, invocation); });
}
