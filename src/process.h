// Child processes: one program at a time, without a shell, its output captured.
//
// The child is waited for before its output is read, and only the first 4096 bytes of each stream are kept.
// A program whose output does not fit in a pipe therefore never ends, nor does the tool. The pipes are as
// large as the system gives: 16 MiB for root, mostly 1 MiB for an ordinary user.
#pragma once

#include <string>
#include <vector>

/// Runs argv[0], looked up on the search path, with the null-terminated vector `argv` and waits for its end.
///
/// rc   receives the exit status, 0 to 255; 0 for a child killed by a signal, and the error number for a
///      program that cannot be executed; may be null
/// out  receives the child's standard output, appended; null prints it on this process's own
/// err  the same for standard error
///
/// True when the child was started and waited for, whatever its exit status; false when it was not.
bool runCommand(char **argv, int *rc, std::string *out, std::string *err);

/// Exit status and output of a command.
struct CommandResult {
  int rc = 0;
  std::string out;
  std::string err;
};

/// The same for a command given as its words, with both streams captured.
bool runCommand(const std::vector<std::string> &words, CommandResult &result);

/// Ignores the signals that a write may raise: a closed reader of the log ends no run. Children get SIGPIPE
/// as the caller of this process has it. SIGXFSZ stays ignored for them: a child that reaches the limit on
/// the size of files then ends with its own status, where one that a signal ends would count as a success.
void ignoreWriteSignals();

/// Makes the two pipes, read end first. If a pipe cannot be made, this is logged, its ends are -1, and the
/// result is still true.
bool createPipes(int *outPipe, int *errPipe);
