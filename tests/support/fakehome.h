// A scratch home with a product in it: version files, run information, a `ps` that answers what the test has
// written down, and the sample product's control scripts, which journal their arguments and answer as
// ordered.
#pragma once

#include <functional>
#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

#include "nls.h"
#include "scratch.h"

/// One row of the run information.
struct RunRow {
  std::string code;                ///< two letters
  std::string pid;                 ///< decimal
  std::string instance = "None";   ///< as the file holds it
  std::string owner = currentUser; ///< whom `ps` names

  static const std::string currentUser; ///< stands for the user who runs the test
};

/// An error record as a value that compares and prints.
using Record = std::pair<int, std::string>;
Record recordOf(const PatchError &err);
const Record NoError = {0, ""};

/// What an operation answered and printed. A test looks at it afterwards: an expectation that fails while
/// the output is captured would not be seen.
struct Printed {
  bool result = false;
  std::string out;
  std::string err;
};
Printed printedBy(const std::function<bool()> &operation);

/// The text of a run-information file; the fields are separated by "|" and the rows are of this host.
std::string runInfoText(const std::vector<RunRow> &rows);

/// What a command with these words leaves in the log.
LogLines commandLines(const std::vector<std::string> &words);
/// The parts in one list.
LogLines joined(std::initializer_list<LogLines> parts);
/// Only what this component logged.
LogLines linesOf(const std::string &component, LogLines lines);
/// Trace lines of one component.
LogLines traces(const std::string &component, const std::vector<std::string> &messages);

/// Fixture: the home has bin/QuillAgent and bin/QuillServer; `ps` on PATH knows no process yet.
class FakeHome : public ScratchHome {
public:
  /// Writes registry/`file`: a version file with a description, a level and preReqALL lines.
  std::string install(const std::string &file, const std::string &level = "06100000",
                      const std::string &description = "",
                      const std::vector<std::string> &prereqs = {}) const;

  /// Writes the run information and makes `ps` know all these processes.
  void setRunning(const std::vector<RunRow> &rows) const;
  /// `ps -p` finds the process, and `ps -ef` names its owner.
  void setProcess(const std::string &pid, const std::string &owner = RunRow::currentUser) const;
  /// `ps -p` no longer finds the process.
  void endProcess(const std::string &pid) const;
  /// What `ps -p` with this process id, and `ps -ef`, print below their heading.
  void setPsOfProcess(const std::string &pid, const std::string &text) const;
  void setPsOfAll(const std::string &text) const;

  /// Shell that a control script runs when called like this: "QuillAgent [stop] [ox]".
  void onCall(const std::string &call, const std::string &shell) const;
  /// The calls of the control scripts so far, and what else has written to the journal.
  std::vector<std::string> journal() const;

  /// Runs an operation that must fail, over whatever the record held, and once more without a record, which
  /// must fail with the same output and the same lines of this component in the log. Returns these lines.
  LogLines expectFailure(const std::string &component, const Record &expected,
                         const std::function<bool(PatchError *)> &operation);
  /// What the last operation that was expected to fail has printed.
  const Printed &printedByFailure() const { return printedByFailure_; }

protected:
  void SetUp() override;

private:
  Printed printedByFailure_;
};

/// Names in a directory in the order in which the system lists them.
std::vector<std::string> listedNames(const std::string &directory);
/// Everything below a directory, sorted: relative paths, those of directories with "/" at the end.
std::vector<std::string> treeOf(const std::string &directory);

/// Makes the tests' user another than root, for root: as the real user only, who is what the tool looks at.
class RealUserScope {
public:
  RealUserScope();
  RealUserScope(const RealUserScope &) = delete;
  RealUserScope &operator=(const RealUserScope &) = delete;
  ~RealUserScope();
};

/// Makes permissions bind, for root too: the tree then belongs to the user whom the scope works as.
class BoundByPermissions {
public:
  explicit BoundByPermissions(const std::string &tree);
  BoundByPermissions(const BoundByPermissions &) = delete;
  BoundByPermissions &operator=(const BoundByPermissions &) = delete;
  ~BoundByPermissions();
};
