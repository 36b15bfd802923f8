// The runs of orvpatch.log: who ran what, in which steps, with which programs, and how it ended.
//
// Bytes go in as they come, events come out as soon as the log tells them, so that a finished log is cut into
// runs and a run that is at work is followed by the same means. The lines carry neither a date nor the run
// that wrote them. So what two runs write at the same time cannot be told apart: it counts for the one whose
// header came last, which is then marked as mixed where the log shows it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "logreader.h"

struct LogRun {
  std::size_t number = 0; ///< of its header block, from 1; 0 for lines before the first one
  std::uint64_t offset = 0;
  std::string host;
  std::string user;
  std::optional<long> pid;   ///< none without a header
  std::string action;        ///< "install", "report", "validate", "self-check"; empty when not told
  std::string home;          ///< as given
  std::string path;          ///< of patch, folder or descriptor, as given
  std::optional<int> status; ///< none when it did not end, or when it is mixed with others of another status
  bool hasEnded = false;     ///< its verdict stands in the log
  bool isMixed = false;      ///< the lines of another run stand among its own
  std::size_t errors = 0;
  std::size_t lines = 0; ///< messages
  std::size_t strays = 0;
  int time = -1;    ///< of the first message, second of the day
  long seconds = 0; ///< from the first message to the last
};

enum class StepResult { Passed, Failed, Open };

struct LogStep {
  std::string patch; ///< file name; empty when the log does not tell it
  std::string name;  ///< of the operation: "moveFiles"
  int time = -1;
  long seconds = 0;
  StepResult result = StepResult::Open; ///< open: the log ends in it
  std::size_t files = 0;                ///< moved in it
};

/// A program that the run started.
struct LogChild {
  std::string step; ///< empty outside of all steps
  std::vector<std::string> words;
  int time = -1;
  long seconds = 0;
  std::optional<int> status; ///< where the log tells it
};

/// The run wrote a line of history.
struct LogAttempt {
  std::string patch;
  bool passed = false;
  int from = -1; ///< seconds of the day between which it was written
  int to = -1;
  int days = 0; ///< midnights since the first message of the run
};

/// What happens in a log. The run is as it was told so far.
class RunEvents {
public:
  RunEvents() = default;
  RunEvents(const RunEvents &) = delete;
  RunEvents &operator=(const RunEvents &) = delete;
  virtual ~RunEvents() = default;

  virtual void onRunBegan(const LogRun &) {}
  virtual void onStepBegan(const LogStep &) {}
  virtual void onFileMoved(const std::string & /*path relative to the home*/) {}
  virtual void onChildEnded(const LogChild &) {}
  virtual void onStepEnded(const LogStep &) {}
  virtual void onAttempt(const LogAttempt &) {}
  virtual void onMessage(const LogMessage &) {}
  /// The verdict stands in the log. onRunEnded follows when the next run begins or at the end of the log.
  virtual void onVerdict(const LogRun &) {}
  virtual void onRunEnded(const LogRun &) {}
};

/// Time since the first message, from times of day alone. Midnight passes where the time falls back by more
/// than two hours; less is a clock that was set, and counts as no time.
class RunClock {
public:
  void tick(int time);
  long seconds() const { return seconds_; }
  int days() const { return days_; }
  int time() const { return time_; }

private:
  int time_ = -1;
  long seconds_ = 0;
  int days_ = 0;
};

class RunLog : private LogListener {
public:
  /// Reads from `offset` on, as what follows `runsBefore` header blocks.
  explicit RunLog(RunEvents &events, std::uint64_t offset = 0, std::size_t runsBefore = 0);

  void feed(std::string_view bytes) { reader_.feed(bytes); }
  void settle() { reader_.settle(); }
  void finish();
  const LogRun &run() const { return run_; } ///< the one that is being read

private:
  /// A step that has ended, or not; its result may be told only by what follows.
  struct Current {
    LogStep step;
    long began = 0;
    bool isOver = false;
    bool hadErrors = false;
  };

  void onHeader(const LogHeader &header) override;
  void onMessage(const LogMessage &message) override;
  void onStray() override;

  void beginRun();
  void endRun();
  void readDriver(const std::string &text);
  void readArgument(const std::string &text);
  void readPackages(const std::string &text);
  void readProcessor(const LogMessage &message);
  void readProgram(const LogMessage &message);
  void endProgram();
  void readProgramStatus(const std::string &text);
  void beginStep(const char *name);
  bool readStepEnd(const std::string &text);
  void closeStep(StepResult unlessTold);
  void endPatch(bool passed);
  void closeChild();
  std::string currentPatch() const;

  RunEvents &events_;
  LogReader reader_;
  LogRun run_;
  bool hasRun_ = false;
  RunClock clock_;
  std::size_t verdicts_ = 0;
  std::vector<std::string> arguments_;

  std::string loading_;               ///< the patch that is being checked
  std::vector<std::string> accepted_; ///< those that passed, in the order in which they are applied
  std::size_t applied_ = 0;
  bool isApplying_ = false;
  bool isPatchDone_ = false;
  std::string archive_; ///< what tar was given last

  std::optional<Current> step_;
  std::optional<LogAttempt> attempt_;
  std::optional<LogChild> child_;
  long childBegan_ = 0;
  bool childIsOver_ = false;
};
