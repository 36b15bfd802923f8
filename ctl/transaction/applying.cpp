#include "transaction/applying.h"

#include <algorithm>
#include <chrono>
#include <ctime>

#include <sys/stat.h>
#include <unistd.h>

#include "commands/command.h"
#include "homelock.h"
#include "inputfile.h"
#include "packages.h"
#include "signals.h"
#include "text.h"
#include "transaction/changes.h"
#include "transaction/instances.h"
#include "transaction/page.h"
#include "transaction/place.h"
#include "transaction/plan.h"
#include "transaction/saving.h"
#include "transaction/taking.h"
#include "transaction/undoing.h"
#include "utilities.h"
#include "verification.h"

namespace {

constexpr std::size_t LargestOutput = 64UL * 1024 * 1024;

std::string outputIn(const std::string &file) {
  return InputFile(file).content(LargestOutput);
}

bool bringsCommands(const Patch &patch) {
  const PatchDescriptor &descriptor = *patch.descriptor;
  return !(descriptor.getPrePatchCommands().empty() && descriptor.getPreCommands().empty() &&
           descriptor.getPostCommands().empty());
}

class Transaction {
public:
  Transaction(const Home &home, const ApplyOptions &options, const ApplyDialogue &dialogue,
              const std::vector<std::string> &messages)
      : home_(home), options_(options), dialogue_(dialogue), place_(home.path()), id_(place_.create()),
        folder_(place_.folderOf(id_)) {
    record_.id = id_;
    record_.action = "apply";
    record_.home = home.path();
    record_.user = Util::getUserName();
    record_.started = utcTime(std::time(nullptr));
    record_.dryRun = options.dryRun;
    record_.messages = messages;
  }

  Record run(const std::string &path) {
    const InterruptionCatcher catcher;
    try {
      if (!prepare(path))
        return refused();
    } catch (...) {
      bringBackSetAside(home_.path(), folder_, record_);
      place_.remove(id_);
      throw;
    }
    outlastInterruptions();
    try {
      complete();
    } catch (const std::exception &error) {
      throw JudgementError(std::string(error.what()) + "\nThe transaction " + id_ +
                           " did not end: orvpatchctl undo takes it back");
    }
    tidy();
    return record_;
  }

private:
  /// Runs one step, and notes how long it took and how it ended.
  template <class Work>
  bool step(const char *name, Work work) {
    dialogue_.begins(name);
    const auto start = std::chrono::steady_clock::now();
    const bool good = work();
    const std::chrono::duration<double> seconds = std::chrono::steady_clock::now() - start;
    record_.steps.push_back({name, seconds.count(), good ? "ok" : "failed"});
    return good;
  }

  /// All that comes before the first change; false when it is refused.
  bool prepare(const std::string &path) {
    step("take", [&] {
      taken_ = takePatches(path, folder_ + "/patches");
      return true;
    });
    planReport(home_, taken_, record_);
    writeRecord(folder_, record_);
    if (!step("check", [&] { return check(path); }))
      return false;
    const std::vector<Patch> patches = applicablePatches(home_, taken_);
    planInstallation(home_, patches, record_);
    const bool isAgreed = !options_.dryRun && dialogue_.agree(record_);
    stopIfInterrupted();
    if (!isAgreed)
      return false;
    hasCommands_ = std::any_of(patches.begin(), patches.end(), bringsCommands);
    if (hasCommands_)
      changes_.lookBefore(home_, record_);
    writeRecord(folder_, record_);
    const bool saved = step("save", [this] {
      saveFiles(home_.path(), folder_, record_);
      return true;
    });
    stopIfInterrupted();
    return saved;
  }

  bool check(const std::string &original) {
    CheckOptions options = options_.check;
    options.original = original;
    options.isLockHeld = true;
    record_.findings = checkInstallation(home_, taken_, options).findings;
    return count(record_.findings, Severity::Error) == 0;
  }

  /// All that comes from the first change on.
  void complete() {
    install();
    if (record_.verdict != "applied" && options_.undoOnFailure)
      step("undo", [this] { return undo(); });
    record_.ended = utcTime(std::time(nullptr));
    record_.phase = Phase::Closed;
    writePage(folder_, record_);
    writeRecord(folder_, record_);
  }

  void install() {
    record_.phase = Phase::Installing;
    writeRecord(folder_, record_);
    const bool installed = step("install", [this] { return runInstaller(); });
    noteInstalled(home_.path(), record_);
    record_.phase = Phase::Installed;
    writeRecord(folder_, record_);
    const bool verified = step("verify", [this] { return verify(); });
    step("start", [this] {
      startMissing(home_, record_.before, record_.messages);
      return true;
    });
    step("directories", [this] {
      const std::size_t told = record_.messages.size();
      closeDirectories(home_.path(), record_, record_.messages);
      return record_.messages.size() == told;
    });
    record_.after = runningInstances(home_);
    noteMissingInstances();
    if (hasCommands_)
      record_.otherChanges = changes_.others(home_, record_);
    record_.verdict = !installed                                ? "failed"
                      : verified && record_.differences.empty() ? "applied"
                                                                : "incomplete";
  }

  bool runInstaller() {
    const InstallerOptions &options = options_.check.installer;
    umask(022);
    BackgroundChild child({findInstaller(options), "-h", home_.path(), "-i", taken_},
                          installerEnvironment(options), folder_ + "/stdout", folder_ + "/stderr");
    while (!child.hasEnded(200))
      dialogue_.begins("");
    record_.installer = {child.status(), outputIn(folder_ + "/stdout"), outputIn(folder_ + "/stderr")};
    noteResults(home_, record_);
    return child.status() == 0;
  }

  /// Every patch against the home, and mode and owner of each file against what was there before.
  bool verify() {
    Verification verification = verifyPatches(home_, applicablePatches(home_, taken_));
    for (const TouchedFile &file : record_.files)
      if (file.after)
        verifyAttributes(file, *file.after, verification);
    record_.differences = verification.differences;
    return verification.differences.empty();
  }

  void noteMissingInstances() {
    for (const RecordedInstance &before : record_.before)
      if (!isAmong(record_.after, before))
        record_.differences.push_back({nameOf(before), "instance", "it ran before, and does not run now"});
  }

  bool undo() {
    const bool undone = takeBack(home_, folder_, record_, record_.messages);
    if (undone)
      record_.verdict = "undone";
    record_.after = runningInstances(home_);
    return undone;
  }

  /// Nothing was changed: the folder goes, and the caller gets the record.
  Record refused() {
    place_.remove(id_);
    record_.verdict = "refused";
    record_.ended = utcTime(std::time(nullptr));
    record_.phase = Phase::Closed;
    return record_;
  }

  /// The installation has its record: what cannot be cleared away does not change how it ended.
  void tidy() {
    try {
      removePatches(folder_ + "/patches");
      place_.keepNewest(options_.keep);
    } catch (const JudgementError &error) {
      record_.messages.emplace_back(error.what());
    }
  }

  const Home &home_;
  const ApplyOptions &options_;
  const ApplyDialogue &dialogue_;
  TransactionPlace place_;
  std::string id_;
  std::string folder_;
  std::string taken_; ///< the patches where others cannot change them
  bool hasCommands_ = false;
  HomeChanges changes_;
  Record record_;
};

} // namespace

Record applyPatches(const Home &home, const std::string &path, const ApplyOptions &options,
                    const ApplyDialogue &dialogue) {
  const HomeLock lock(home.path());
  std::vector<std::string> messages;
  if (!options.dryRun)
    for (const std::string &id : takeBackInterrupted(home))
      messages.push_back("the interrupted transaction " + id + " was taken back first");
  return Transaction(home, options, dialogue, messages).run(path);
}

int statusOf(const Record &record) {
  if (record.verdict == "applied")
    return Good;
  if (record.verdict == "undone")
    return record.action == "undo" ? Good : FailedAndUndone;
  if (record.verdict == "failed")
    return InstallerFailed;
  if (record.verdict == "incomplete")
    return DifferencesFound;
  return record.dryRun && count(record.findings, Severity::Error) == 0 ? Good : Findings;
}
