#include "runlog.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <iterator>
#include <utility>

#include "patchfilename.h"
#include "target.h"

namespace {

/// An operation that is a step, and how its last line begins. Behind it stands the result, 1 or 0, where
/// `hasResult`.
struct StepRule {
  const char *name;
  const char *entry;
  const char *exit;
  bool hasResult;
};

const std::array<StepRule, 18> stepRules = {{
    {"initialize", "PatchProcessor::initialize() entry", "PatchProcessor::initialize() retval [", true},
    {"checkForActivePrograms", "PatchProcessor::checkForActivePrograms() entry",
     "PatchProcessor::checkForActivePrograms() = ", true},
    {"checkPrereqs", "PatchProcessor::checkPrereqs() entry", "PatchProcessor::checkPrereqs() = ", true},
    {"cleanUp", "PatchProcessor::cleanUp() entry", "PatchProcessor::cleanUp() = ", true},
    {"extract", "PatchProcessor::extract() entry", "PatchProcessor::extract() = ", true},
    {"runPrePatchScripts", "PatchProcessor::runPrePatchScripts() entry",
     "PatchProcessor::runPrePatchScripts() = ", true},
    {"stopDependents", "PatchProcessor::stopDependents() entry", "PatchProcessor::stopDependents() = ", true},
    {"runPreScripts", "PatchProcessor::runPreScripts() entry", "PatchProcessor::runPreScripts() = ", true},
    {"moveFiles", "PatchProcessor::moveFiles() entry", "PatchProcessor::moveFile() = ", true},
    {"updateProductEXEFiles", "PatchProcessor::updateProductEXEFiles() entry",
     "PatchProcessor::updateProductEXEFiles() = ", true},
    {"runPostScripts", "PatchProcessor::runPostScripts() entry", "PatchProcessor::runPostScripts() ", true},
    {"updatePatchVerFile", "PatchProcessor::updatePatchVerFile() entry",
     "PatchProcessor::updatePatchVerFile() = ", true},
    {"startDependents", "PatchProcessor::startDependents() entry",
     "PatchProcessor::startDependents() = ", true},
    {"startOSAgentIfNeeded", "PatchProcessor::startOSAgentIfNeeded() entry",
     "PatchProcessor::startOSAgentIfNeeded() = ", true},
    {"updatePatchRegistry", "PatchProcessor::updatePatchRegistry() entry",
     "PatchProcessor::updatePatchRegistry() exit", false},
    {"printDependentsList", "PatchProcessor::printDependentsList() entry",
     "PatchProcessor::printDependentsList = ", true},
    {"listFiles", "PatchProcessor::listFiles() entry", "PatchProcessor::listFiles() exit", false},
    {"listProductEXEFiles", "PatchProcessor::listProductEXEFiles() entry",
     "PatchProcessor::listProductEXEFiles() = ", true},
}};

bool beginsWith(const std::string &text, std::string_view start) {
  return text.compare(0, start.size(), start) == 0;
}

/// The number behind `start`; none when the text does not begin so.
std::optional<int> numberBehind(const std::string &text, std::string_view start) {
  if (!beginsWith(text, start))
    return std::nullopt;
  int number = 0;
  const char *const from = text.data() + start.size();
  const auto [end, error] = std::from_chars(from, text.data() + text.size(), number);
  return error == std::errc() && end != from ? std::optional<int>(number) : std::nullopt;
}

std::string nameOf(const std::string &path) {
  return path.substr(path.rfind('/') + 1);
}

/// The order of targets in which the installer applies what it has accepted.
std::size_t rankOf(const std::string &patch) {
  return targetOrder(PatchFileName(patch).getTarget());
}

const char *actionOf(const std::string &option) {
  if (option == "-i")
    return "install";
  if (option == "-t")
    return "report";
  if (option == "-vi")
    return "validate";
  return option == "-utest" ? "self-check" : "";
}

/// "SOURCE to TARGET", where both are a directory, "/./" and the same path: that path. A name may hold " to
/// ".
std::string movedPath(const std::string &text) {
  static constexpr std::string_view between = " to ";
  static constexpr std::string_view root = "/./";
  const std::size_t sourceRoot = text.find(root);
  for (std::size_t at = text.find(between); at != std::string::npos; at = text.find(between, at + 1)) {
    const std::string target = text.substr(at + between.size());
    const std::size_t targetRoot = target.find(root);
    if (sourceRoot < at && targetRoot != std::string::npos &&
        text.compare(sourceRoot, at - sourceRoot, target, targetRoot, std::string::npos) == 0)
      return target.substr(targetRoot + root.size());
  }
  return text;
}

} // namespace

void RunClock::tick(int time) {
  constexpr int Day = 24 * 3600;
  constexpr int SetBack = 2 * 3600;
  if (time < 0)
    return;
  int passed = time_ < 0 ? 0 : time - time_;
  if (passed < -SetBack) {
    passed += Day;
    ++days_;
  } else if (passed >= Day - SetBack) {
    passed -= Day; // set back over midnight
    --days_;
  }
  seconds_ += std::max(passed, 0);
  time_ = time;
}

RunLog::RunLog(RunEvents &events, std::uint64_t offset, std::size_t runsBefore)
    : events_(events), reader_(*this, offset) {
  run_.number = runsBefore;
  run_.offset = offset;
}

void RunLog::finish() {
  reader_.finish();
  endRun();
}

void RunLog::onHeader(const LogHeader &header) {
  endRun();
  const std::size_t number = run_.number + 1;
  run_ = LogRun();
  run_.number = number;
  run_.offset = header.offset;
  run_.host = header.host;
  run_.user = header.user;
  run_.pid = header.pid;
  beginRun();
}

void RunLog::onStray() {
  if (!hasRun_)
    beginRun();
  ++run_.strays;
}

void RunLog::beginRun() {
  hasRun_ = true;
  clock_ = RunClock();
  verdicts_ = 0;
  arguments_.clear();
  loading_.clear();
  accepted_.clear();
  applied_ = 0;
  isApplying_ = false;
  isPatchDone_ = false;
  archive_.clear();
  attempt_.reset();
  events_.onRunBegan(run_);
}

void RunLog::endRun() {
  if (!hasRun_)
    return;
  hasRun_ = false;
  closeChild();
  closeStep(verdicts_ == 0 ? StepResult::Open : StepResult::Failed);
  events_.onRunEnded(run_);
}

void RunLog::onMessage(const LogMessage &message) {
  if (!hasRun_)
    beginRun();
  clock_.tick(message.time);
  if (run_.time < 0)
    run_.time = message.time;
  run_.seconds = clock_.seconds();
  ++run_.lines;
  if (message.level == LogLevel::Error) {
    ++run_.errors;
    if (step_)
      step_->hadErrors = true;
  }
  // A run writes nothing behind its verdict.
  if (verdicts_ > 0)
    run_.isMixed = true;
  if (message.component == "main")
    readDriver(message.text);
  else if (message.component == "dcfpackageprocessor")
    readPackages(message.text);
  else if (message.component == "patchprocessor")
    readProcessor(message);
  readProgram(message);
  events_.onMessage(message);
  if (message.component == "main" && verdicts_ > 0 && beginsWith(message.text, "main = "))
    events_.onVerdict(run_);
}

void RunLog::readDriver(const std::string &text) {
  readArgument(text);
  const std::optional<int> status = numberBehind(text, "main = ");
  if (!status)
    return;
  run_.status = verdicts_ == 0 || run_.status == status ? status : std::nullopt;
  run_.hasEnded = true;
  ++verdicts_;
  closeChild();
  closeStep(*status == 0 ? StepResult::Passed : StepResult::Failed);
}

/// "arg[3]: -i": the words of the command line, of which home and action come in either order.
void RunLog::readArgument(const std::string &text) {
  const std::optional<int> place = numberBehind(text, "arg[");
  const std::size_t colon = text.find("]: ");
  if (!place || colon == std::string::npos || *place != static_cast<int>(arguments_.size()) || *place > 4)
    return;
  arguments_.push_back(text.substr(colon + 3));
  if (arguments_.size() == 4 && arguments_[3] == "-utest") {
    run_.action = actionOf(arguments_[3]);
    run_.home = arguments_[2];
  } else if (arguments_.size() == 5) {
    const std::size_t home = arguments_[1] == "-h" ? 1 : 3;
    run_.home = arguments_[home + 1];
    run_.action = actionOf(arguments_[4 - home]);
    run_.path = arguments_[5 - home];
  }
}

/// Which patches are checked, and in which order those that passed are applied.
void RunLog::readPackages(const std::string &text) {
  static const std::string applicable = "] is applicable.";
  if (text.size() > applicable.size() && text.front() == '[' &&
      text.compare(text.size() - applicable.size(), std::string::npos, applicable) == 0) {
    loading_ = nameOf(text.substr(1, text.size() - applicable.size() - 1));
  } else if (beginsWith(text, "Patch pushback succeeded.")) {
    closeStep(StepResult::Passed);
    accepted_.push_back(std::exchange(loading_, ""));
  } else if (text == "DCFPackageProcessor::run() entry" || text == "DCFPackageProcessor::testRun() entry") {
    std::stable_sort(accepted_.begin(), accepted_.end(),
                     [](const std::string &a, const std::string &b) { return rankOf(a) < rankOf(b); });
    isApplying_ = true;
  }
}

std::string RunLog::currentPatch() const {
  if (!isApplying_)
    return loading_;
  return applied_ < accepted_.size() ? accepted_[applied_] : archive_;
}

void RunLog::readProcessor(const LogMessage &message) {
  static constexpr std::string_view moved = "Successfully moved file from ";
  const std::string &text = message.text;
  for (const StepRule &rule : stepRules)
    if (text == rule.entry) {
      beginStep(rule.name);
      return;
    }
  if (readStepEnd(text))
    return;
  if (beginsWith(text, moved)) {
    if (step_)
      ++step_->step.files;
    events_.onFileMoved(movedPath(text.substr(moved.size())));
  } else if (const std::optional<int> ran = numberBehind(text, "PatchProcessor::run() = ")) {
    endPatch(*ran == 1);
  } else if (const std::optional<int> reported = numberBehind(text, "PatchProcessor::testRun() = ")) {
    endPatch(*reported == 1);
  }
}

void RunLog::beginStep(const char *name) {
  // A step without a word about its result has passed when the one after it follows. The OS agent's turn
  // comes after the one that failed too.
  closeChild();
  const bool followsAll = name == std::string("startOSAgentIfNeeded");
  closeStep(followsAll ? StepResult::Failed : StepResult::Passed);
  step_ = Current();
  step_->step.patch = currentPatch();
  step_->step.name = name;
  step_->step.time = clock_.time();
  step_->began = clock_.seconds();
  if (step_->step.name == "updatePatchRegistry")
    attempt_ = LogAttempt{step_->step.patch, false, clock_.time(), clock_.time(), clock_.days()};
  events_.onStepBegan(step_->step);
}

/// Whether the text is the last line of the step at work.
bool RunLog::readStepEnd(const std::string &text) {
  if (!step_ || step_->isOver)
    return false;
  const auto rule = std::find_if(stepRules.begin(), stepRules.end(), [this](const StepRule &candidate) {
    return step_->step.name == candidate.name;
  });
  const std::optional<int> result = numberBehind(text, rule->exit);
  if (rule->hasResult ? !result : text != rule->exit)
    return false;
  closeChild();
  step_->step.seconds = clock_.seconds() - step_->began;
  step_->isOver = true;
  if (attempt_)
    attempt_->to = clock_.time();
  const bool isUnknown = !rule->hasResult && !step_->hadErrors;
  if (isUnknown && step_->step.name == "listFiles")
    return true; // what follows tells
  closeStep(rule->hasResult ? (*result == 1 ? StepResult::Passed : StepResult::Failed)
                            : (step_->hadErrors ? StepResult::Failed : StepResult::Passed));
  return true;
}

void RunLog::closeStep(StepResult unlessTold) {
  if (!step_)
    return;
  LogStep step = std::move(step_->step);
  if (!step_->isOver)
    step.seconds = clock_.seconds() - step_->began;
  step_.reset();
  step.result = unlessTold;
  const bool isLastOfPatch = step.name == "cleanUp" && isPatchDone_;
  events_.onStepEnded(step);
  if (!isLastOfPatch)
    return;
  ++applied_;
  isPatchDone_ = false;
}

void RunLog::endPatch(bool passed) {
  closeStep(passed ? StepResult::Passed : StepResult::Failed);
  isPatchDone_ = true;
  if (!attempt_)
    return;
  attempt_->passed = passed;
  events_.onAttempt(*attempt_);
  attempt_.reset();
}

void RunLog::readProgram(const LogMessage &message) {
  const std::string &text = message.text;
  if (message.component != "process.cpp") {
    readProgramStatus(text);
    return;
  }
  if (text == "runCommand entry") {
    closeChild();
    child_ = LogChild{step_ ? step_->step.name : "", {}, clock_.time(), 0, {}};
    childBegan_ = clock_.seconds();
    childIsOver_ = false;
  } else if (child_ && !childIsOver_ && beginsWith(text, "cmdArray[")) {
    const std::size_t colon = text.find("]: ");
    if (colon != std::string::npos)
      child_->words.push_back(text.substr(colon + 3));
  } else if (child_ && text == "runCommand exit") {
    endProgram();
  }
}

/// The archive that tar has unpacked tells the patch where the start of the log is lost.
void RunLog::endProgram() {
  child_->seconds = clock_.seconds() - childBegan_;
  childIsOver_ = true;
  if (child_->words.size() == 3 && child_->words[0] == "tar")
    archive_ = nameOf(child_->words[2]);
  if (step_ && step_->step.patch.empty())
    step_->step.patch = currentPatch();
}

/// The line behind a program's end tells its status, when it is one of these.
void RunLog::readProgramStatus(const std::string &text) {
  if (!child_ || !childIsOver_)
    return;
  const std::string name = child_->words.empty() ? "" : child_->words.front();
  for (const std::string &start :
       {std::string("tar returned: "), std::string("return code: "), "Bad return code from " + name + ": "})
    if (const std::optional<int> status = numberBehind(text, start))
      child_->status = status;
  if (text == "Successfully executed: " + name)
    child_->status = 0;
  closeChild();
}

void RunLog::closeChild() {
  if (!child_)
    return;
  LogChild child = *std::exchange(child_, std::nullopt);
  if (!childIsOver_)
    child.seconds = clock_.seconds() - childBegan_;
  events_.onChildEnded(child);
}
