// Programs that this one runs: with an environment of its own making, their output kept whole.
#pragma once

#include <chrono>
#include <string>
#include <vector>

#include <sys/types.h>

struct ChildResult {
  int status =
      0; ///< exit status; 128 and the number of the signal that ended it; 127 when it could not be started
  std::string out;
  std::string err;
  bool isInTime = true; ///< false when it was killed at the limit of its time
};

/// What a child inherits: nothing of the caller's environment but these, and default dispositions of signals.
struct ChildEnvironment {
  std::string path;                   ///< PATH
  std::vector<std::string> variables; ///< further ones, "NAME=value"
  std::string directory = {};         ///< the current one; empty: the caller's
  std::chrono::seconds limit{0};      ///< its time; 0: as long as it takes
};

/// Runs words[0], an absolute path or a name looked up in the environment's PATH, with /dev/null as standard
/// input, and waits for its end. Output goes to files in memory, so that no child waits for a reader.
/// JudgementError when the system gives no process; Interrupted when an interruption is noted meanwhile: the
/// child is killed then.
ChildResult runChild(const std::vector<std::string> &words, const ChildEnvironment &environment);

/// A program in a session of its own, so that a hang-up of the terminal does not end it. What it says goes to
/// files.
class BackgroundChild {
public:
  /// Starts it as runChild does; `outFile` and `errFile` are made anew, mode 0600. JudgementError when that
  /// fails.
  BackgroundChild(const std::vector<std::string> &words, const ChildEnvironment &environment,
                  const std::string &outFile, const std::string &errFile);

  /// Whether it has ended; waits at most so long.
  bool hasEnded(int milliseconds);
  /// Exit status, as in ChildResult, once it has ended.
  int status() const { return status_; }

private:
  pid_t child_ = 0;
  int status_ = 0;
};

/// The file that a name stands for in a search path: the first that can be executed; empty when there is
/// none.
std::string findProgram(const std::string &name, const std::string &path);
