// Child processes: one program at a time, without a shell, its output captured.
//
// The child is waited for before its output is read, and only the first 4096 bytes of each stream are kept.
// A program whose output does not fit in a pipe (64 KiB on Linux) therefore never ends, nor does the tool.
#pragma once

#include <string>
#include <vector>

/// Runs argv[0], looked up on the search path, with the null-terminated vector `argv` and waits for its end.
///
/// rc   receives the exit status, 0 to 255; 0 for a child killed by a signal, and the error number for a
///      program that cannot be executed; may be null
/// out  what the child wrote to standard output is appended; null prints it on this process's own
/// err  the same for standard error
///
/// True when the child was started and waited for, whatever its exit status; false when it was not.
bool runCommand(char **argv, int *rc, std::string *out, std::string *err);

/// What a command left behind.
struct CommandResult {
  int rc = 0;
  std::string out;
  std::string err;
};

/// The same for a command given as its words, with both streams captured.
bool runCommand(const std::vector<std::string> &words, CommandResult &result);

/// Sets the disposition of the signals that a write may raise: SIG_IGN for the tool, so that a log that
/// nobody takes ends no run; children get SIG_DFL.
void setWriteSignals(void (*disposition)(int));

/// Makes the two pipes, read end first. A pipe that cannot be made is logged and its ends are -1; the result
/// is true all the same.
bool createPipes(int *outPipe, int *errPipe);
