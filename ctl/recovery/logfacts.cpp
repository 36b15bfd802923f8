#include "recovery/logfacts.h"

#include <algorithm>
#include <iterator>
#include <utility>

#include "logfile.h"
#include "patchfilename.h"
#include "target.h"
#include "utilities.h"

namespace {

/// The text behind `start`; none when it does not begin so.
std::optional<std::string> behind(const std::string &text, const std::string &start) {
  if (text.compare(0, start.size(), start) != 0)
    return std::nullopt;
  return text.substr(start.size());
}

bool endsWith(const std::string &text, const std::string &end) {
  return text.size() >= end.size() && text.compare(text.size() - end.size(), end.size(), end) == 0;
}

std::string nameOf(const std::string &path) {
  return path.substr(path.rfind('/') + 1);
}

class Collector : public RunEvents {
public:
  LogFacts facts() const {
    LogFacts facts = facts_;
    facts.known = known_;
    return facts;
  }

  void onRunBegan(const LogRun &) override { run_ = facts_; }

  void onStepBegan(const LogStep &step) override {
    currentPatch_ = step.patch;
    if (!PatchFileName(step.patch).isValid())
      return;
    PatchFacts &patch = patchOf(step.patch);
    if (step.name == "extract")
      patch.hasMoved = false;
    else if (step.name == "moveFiles")
      patch.hasBegun = true;
    else if (step.name == "updatePatchVerFile")
      beginLevel(patch);
    else if (step.name == "updatePatchRegistry")
      patch.recording = step.time;
  }

  void onFileMoved(const std::string &path) override {
    if (PatchFileName(currentPatch_).isValid())
      patchOf(currentPatch_).moved.insert(path);
  }

  void onStepEnded(const LogStep &step) override {
    steps_.push_back(step);
    if (!PatchFileName(step.patch).isValid())
      return;
    PatchFacts &patch = patchOf(step.patch);
    if (step.name == "moveFiles" && step.result == StepResult::Passed)
      patch.hasMoved = true;
    else if (step.name == "updatePatchRegistry" && step.result != StepResult::Open)
      noteRecorded(patch, step.result == StepResult::Passed);
  }

  void onChildEnded(const LogChild &child) override {
    if (child.words.size() >= 3 && child.words[0] == "tar" && child.words[1] == "-xf" &&
        PatchFileName(nameOf(child.words[2])).isValid())
      patchOf(nameOf(child.words[2])).archive = child.words[2];
    if (child.step == "stopDependents")
      noteStop(child.words);
  }

  void onMessage(const LogMessage &message) override {
    if (message.component == "file.cpp")
      readFileLine(message.text);
    else
      readVersionLine(message.text);
  }

  void onRunEnded(const LogRun &run) override {
    const std::vector<LogStep> steps = std::move(steps_);
    steps_.clear();
    if (run.action != "install" && !run.action.empty())
      return; // a report changes nothing but log and tmp
    if (run.status == 0) {
      facts_ = {};
      return;
    }
    facts_ = std::move(run_);
    facts_.isInterrupted = true;
    facts_.status = run.status;
    facts_.user = run.user;
    facts_.steps = steps;
  }

private:
  PatchFacts &patchOf(const std::string &file) {
    const auto found = std::find_if(run_.patches.begin(), run_.patches.end(),
                                    [&file](const PatchFacts &patch) { return patch.file == file; });
    if (found != run_.patches.end())
      return *found;
    run_.patches.emplace_back();
    run_.patches.back().file = file;
    return run_.patches.back();
  }

  /// What was recorded of the level before is no record of this one.
  void beginLevel(PatchFacts &patch) {
    forget(patch.file);
    patch.hasRecorded = false;
    patch.recording = -1;
  }

  static void noteRecorded(PatchFacts &patch, bool isWritten) {
    patch.recording = -1;
    patch.hasRecorded = patch.hasRecorded || isWritten;
  }

  /// HOME/bin/QuillAgent [-o one] stop yn, HOME/bin/QuillServer stop ''.
  void noteStop(const std::vector<std::string> &words) {
    const std::string program = words.empty() ? "" : nameOf(words[0]);
    if (program == "QuillServer" && words.size() == 3 && words[1] == "stop")
      run_.stopped.push_back({"kqa", words[2]});
    else if (program == "QuillAgent" && words.size() == 3 && words[1] == "stop")
      run_.stopped.push_back({"k" + words[2], ""});
    else if (program == "QuillAgent" && words.size() == 5 && words[3] == "stop")
      run_.stopped.push_back({"k" + words[4], words[2]});
  }

  void readFileLine(const std::string &text) {
    if (const auto target = behind(text, "deleting existing target: "))
      run_.replaced.insert(*target);
    else if (const auto directory = behind(text, "creating dir: "))
      run_.directories.push_back(*directory);
  }

  void readVersionLine(const std::string &text) {
    static const std::string entry = ") entry";
    const auto built = behind(text, "ORVComponentRegistry::buildComponent(");
    if (built && endsWith(*built, entry)) {
      versionFile_ = built->substr(0, built->size() - entry.size());
      version_ = {};
    } else if (text == "ORVComponentRegistry::buildComponent exit") {
      endVersion();
    } else if (const auto level = behind(text, "Version string provided: ")) {
      // "06.10.00. Will pad ff with 00.": the level itself may have points.
      version_.level = level->substr(0, std::min(level->find(". Will pad"), level->size() - 1));
    } else if (const auto prereq = behind(text, "Added preReqALL value = ")) {
      version_.prereqs.push_back(*prereq);
    }
  }

  void endVersion() {
    if (!versionFile_.empty() && !version_.level.empty()) {
      run_.versions.emplace(versionFile_, version_);
      known_[versionFile_] = version_;
    }
    versionFile_.clear();
  }

  /// The level that was read is no longer the one that a patch has written.
  void forget(const std::string &patch) {
    const PatchFileName name(patch);
    const Target *const target = findTarget(name.getTarget());
    const bool isCommandLine = target != nullptr && target->kind == ORVComponent::TYPE_CLI;
    const std::string &product = name.getProduct();
    const std::string code = isCommandLine
                                 ? target->ownCode
                                 : Util::toLower(product.substr(product.size() < 2 ? 0 : product.size() - 2));
    const std::string file = versionFileName(target, code, name.getFullPlatform());
    for (auto version = known_.begin(); version != known_.end();)
      version = nameOf(version->first) == file ? known_.erase(version) : std::next(version);
  }

  LogFacts facts_; ///< of the runs that have ended, in the log's sense
  LogFacts run_;   ///< with those of the run that is read
  std::vector<LogStep> steps_;
  std::string currentPatch_;
  std::map<std::string, OldVersion> known_;
  std::string versionFile_;
  OldVersion version_;
};

} // namespace

LogFacts readLogFacts(const Home &home) {
  const InputFile file(logPath(home.path()));
  Collector collector;
  if (file.exists()) {
    RunLog log(collector);
    feedLog(file, 0, file.size(), log);
    log.finish();
  }
  return collector.facts();
}
