// The driver: checks the arguments, publishes the home, opens the log, runs one action, prints the verdict.
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

#include "dcfpackageprocessor.h"
#include "logger.h"
#include "patchdescriptor.h"
#include "patchprocessor/patchprocessor.h"
#include "process.h"
#include "utilities.h"

#define LOG_COMPONENT "main"

namespace {

/// Statuses of the driver's own.
enum ExitStatus { UsageError = 1, BadHome = 2 };

struct Arguments {
  std::string home;
  std::string action;
  std::string path;
};

void usage() {
  printf("\nUsage: orvpatch -h <ORV home> [OPTIONS]\n\n"
         "   orvpatch -h <ORV home> -i { <patch_file_directory> | <patch_file> }\n"
         "   orvpatch -h <ORV home> -t { <patch_file_directory> | <patch_file> }\n\n"
         "   where\n\n"
         "   -h  Specifies the ORV installation directory\n"
         "   -i  Specifies the path to the directory or patch file to be installed\n"
         "   -t  Generates a report of the actions to be taken by the patch\n\n\n");
}

bool isAction(const std::string &word) {
  return word == "-vi" || word == "-i" || word == "-t";
}

/// Two pairs of an option and its value, the home and one action, in either order; false for anything else.
bool parseArguments(int argc, char **argv, Arguments &arguments) {
  if (argc != 5)
    return false;
  const std::vector<std::string> words(argv, argv + argc);
  const std::size_t home = words[1] == "-h" ? 1 : 3;
  const std::size_t action = home == 1 ? 3 : 1;
  if (words[home] != "-h" || !isAction(words[action]))
    return false;
  arguments = {words[home + 1], words[action], words[action + 1]};
  return true;
}

/// Appends the "/" that every path below the home relies on and exports the home; ends the process with
/// status 2, before there is a log, when it does not exist.
void initializeQuillHome(std::string &home) {
  if (home.empty() || home.back() != '/')
    home += '/';
  if (access(home.c_str(), F_OK) != 0) {
    fprintf(stderr, "%s\n", NLS::getFormattedString("ERROR_ORV_HOME", home.c_str()).c_str());
    exit(BadHome);
  }
  Util::setEnvironment("QUILLHOME", home);
}

void openLog(int argc, char **argv) {
  logInit();
  LOG_TRACE("main %s", "entry");
  for (int i = 0; i < argc; ++i)
    LOG_TRACE("arg[%d]: %s", i, argv[i]);
}

int installPatch(const std::string &path) {
  LOG_TRACE("installPatch(%s) %s", path.c_str(), "entry");
  PatchError error;
  std::unique_ptr<DCFPackageProcessor> processor(DCFPackageProcessor::createProcessor(path, &error));
  int status = 0;
  if (processor == nullptr || !processor->run(&error)) {
    fprintf(stderr, "\n%s\n\n", error.text.c_str());
    // KEEP(record-is-status): the record's code as it is; a failure without a code ends with status 0.
    status = error.code;
  }
  processor.reset();
  LOG_TRACE("installPatch(%s) = %d", path.c_str(), status);
  return status;
}

int testPatch(const std::string &path) {
  // KEEP(testpatch-entry): the path is not passed to this line, which shows "entry" in the parentheses.
  LOG_TRACE("testPatch(%s)", "entry");
  PatchError error;
  LOG_TRACE("Creating Package Processor object with path [%s]", path.c_str());
  std::unique_ptr<DCFPackageProcessor> processor(DCFPackageProcessor::createProcessor(path, &error));
  int status = 0;
  if (processor != nullptr) {
    if (!processor->testRun(&error)) {
      // KEEP(testpatch-one-newline): without the empty lines that frame the texts of the other actions.
      fprintf(stderr, "%s\n", error.text.c_str());
      status = error.code;
    }
  } else if (error.code != PatchError::None) { // GCOVR_EXCL_BR_LINE: loading fails with a code
    fprintf(stderr, "\n%s\n\n", error.text.c_str());
    status = error.code;
  } else {
    printf("\n%s\n\n", NLS::getString("DCFPP_TEST_NO_PATCH").c_str()); // GCOVR_EXCL_LINE: see above
  }
  processor.reset();
  LOG_TRACE("testPatch(%s) = %d", path.c_str(), status);
  return status;
}

int validatePatchFile(const std::string &path) {
  PatchError error;
  std::unique_ptr<PatchDescriptor> descriptor(PatchDescriptor::parseFile(path, &error));
  const bool valid = descriptor != nullptr;
  descriptor.reset();
  if (!valid) {
    fprintf(stderr, "\n%s\n\n", error.text.c_str());
    return error.code;
  }
  printf("\n%s is valid\n\n", path.c_str());
  return 0;
}

// KEEP(utest-success): findings of the self-check are printed, but the form always ends with success.
void unit_test() {
  patchProcessorSelfCheck();
}

int runAction(const Arguments &arguments) {
  if (arguments.action == "-i")
    return installPatch(arguments.path);
  if (arguments.action == "-t")
    return testPatch(arguments.path);
  return validatePatchFile(arguments.path);
}

/// Logs and prints the verdict; returns the exit status.
int reportVerdict(int status) {
  const std::string logDirectory = Util::getQuillHome() + "patchlogs/";
  const std::string verdict = status == 0
                                  ? NLS::getString("MAIN_SUCCESSFUL")
                                  : NLS::getFormattedString("MAIN_NOT_SUCCESSFUL", logDirectory.c_str());
  // KEEP(verdict-at-info): a failure's verdict is information too; the error itself has been logged as one.
  LOG_INFO("%s", verdict.c_str());
  printf("\n%s\n\n", verdict.c_str());
  LOG_TRACE("main = %d", status);
  return status;
}

/// Corrects state that the caller may have left: with SIGCHLD ignored the children have no exit statuses, and
/// a closed standard descriptor would be given to the next file that is opened. A closed reader, or a limit
/// on the size of files, must not end an installation in its middle.
void repairInheritedState() {
  static_cast<void>(signal(SIGCHLD, SIG_DFL));
  ignoreWriteSignals();
  int fd = 0;
  do
    fd = open("/dev/null", O_RDWR);
  while (fd >= 0 && fd <= STDERR_FILENO); // GCOVR_EXCL_BR_LINE: tests/faults lets the open fail
  if (fd > STDERR_FILENO)                 // GCOVR_EXCL_BR_LINE: the same
    static_cast<void>(close(fd));
}

} // namespace

int main(int argc, char **argv) {
  std::set_new_handler(Util::endWithoutMemory);
  repairInheritedState();
  const bool selfCheck = argc == 4 && std::string(argv[3]) == "-utest";
  Arguments arguments;
  if (!selfCheck && !parseArguments(argc, argv, arguments)) {
    usage();
    return UsageError;
  }
  std::string home = selfCheck ? argv[2] : arguments.home;
  initializeQuillHome(home);
  openLog(argc, argv);
  int status = 0;
  if (selfCheck)
    unit_test();
  else
    status = runAction(arguments);
  return reportVerdict(status);
}
