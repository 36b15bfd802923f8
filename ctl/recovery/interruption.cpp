#include "recovery/interruption.h"

#include <filesystem>
#include <map>

#include <sys/stat.h>

#include "judgement.h"
#include "packages.h"
#include "text.h"
#include "transaction/place.h"
#include "transaction/plan.h"
#include "updatedfiles.h"

namespace {

namespace fs = std::filesystem;

/// The newest record without an end. That of an undo stands for the installation that it takes back.
bool findRecord(const Home &home, Interruption &found) {
  if (!stateOf(home.at("patchlogs/transactions")))
    return false;
  const TransactionPlace place(home.path());
  const std::vector<std::string> ids = place.ids();
  for (auto id = ids.rbegin(); id != ids.rend(); ++id) {
    if (!stateOf(place.folderOf(*id) + "/record.json"))
      continue; // killed before it had one: nothing was changed
    Record record = readRecord(place.folderOf(*id));
    if (record.phase == Phase::Closed)
      continue;
    if (record.action == "undo") {
      Record undone = readRecord(place.folderOf(record.undoes));
      if (undone.verdict == "undone")
        continue; // by another undo
      found.messages.push_back("the undo " + record.id + " did not end: orvpatchctl undo finishes it");
      record = std::move(undone);
    }
    found.record = std::move(record);
    found.folder = place.folderOf(found.record.id);
    return true;
  }
  return false;
}

/// The copy of a patch that a transaction has made of it; empty when it has gone.
std::string copyOf(const std::string &folder, const std::string &file) {
  std::error_code error;
  for (const fs::directory_entry &entry : fs::recursive_directory_iterator(folder + "/patches", error))
    if (entry.path().filename() == file)
      return entry.path();
  return "";
}

/// Reads the archive; false, with a message, when it is no patch any more.
bool readArchive(const std::string &path, const std::string &file, Interruption &found) {
  std::string problem = "has no descriptor";
  try {
    InterruptedPatch patch = {readPatch(path), "", "", "", {}, {}, {}};
    if (patch.patch.descriptor != nullptr) {
      found.patches.push_back(std::move(patch));
      return true;
    }
  } catch (const JudgementError &) {
    problem = "cannot be read";
  }
  found.isWhole = false;
  found.messages.push_back(file + ": the patch file " + problem + ": its files and its level are not judged");
  return false;
}

void describe(const Home &home, const Interruption &found, InterruptedPatch &patch) {
  const PatchDescriptor &descriptor = *patch.patch.descriptor;
  patch.versionFile = relativePath(versionFileOf(home, patch.patch).substr(home.path().size()));
  patch.levelAfter = descriptor.getVersion()->getDottedVersionString();
  patch.temporary = {"tmp/" + patch.patch.name.getProduct()};
  if (patch.patch.name.getProduct() != descriptor.getProductCode())
    patch.temporary.push_back("tmp/" + descriptor.getProductCode());
  const auto version = found.log.versions.find(home.at(patch.versionFile));
  if (version != found.log.versions.end())
    patch.levelBefore = Version(version->second.level).getDottedVersionString();
  for (const auto &[path, index] : updatedFiles(patch.patch.members)) {
    const Member &member = patch.patch.members[index];
    if (member.type != Member::Type::Directory)
      patch.files.push_back({path, member.mode & 07777U, false, std::nullopt});
  }
}

void addRecorded(const Record &record, InterruptedPatch &patch) {
  for (const RecordedPatch &recorded : record.patches)
    if (recorded.file == patch.patch.file)
      patch.levelBefore = recorded.levelBefore;
  std::map<std::string, const TouchedFile *> touched;
  for (const TouchedFile &file : record.files)
    touched.emplace(file.path, &file);
  for (InterruptedFile &file : patch.files) {
    const auto known = touched.find(file.path);
    if (known == touched.end())
      continue;
    file.before = known->second->before;
    file.wasThere = file.before.has_value();
  }
}

std::time_t timeOfUtc(const std::string &text) {
  tm parts = {};
  return strptime(text.c_str(), "%Y-%m-%dT%H:%M:%SZ", &parts) == nullptr ? 0 : timegm(&parts);
}

/// Whether the log names the file as one whose old one was removed: the paths there hold "/./".
void addLogged(const Home &home, const LogFacts &log, InterruptedPatch &patch) {
  for (InterruptedFile &file : patch.files)
    file.wasThere = log.replaced.count(home.at("./" + file.path)) != 0;
}

void fromRecord(const Home &home, Interruption &found) {
  found.hasRecord = true;
  found.ran = found.record.before;
  found.since = timeOfUtc(found.record.started);
  for (const NewDirectory &directory : found.record.directories)
    if (directory.path != "tmp")
      found.directories.push_back(directory.path);
  for (const RecordedPatch &recorded : found.record.patches) {
    if (!readArchive(copyOf(found.folder, recorded.file), recorded.file, found))
      continue;
    InterruptedPatch &patch = found.patches.back();
    describe(home, found, patch);
    addRecorded(found.record, patch);
    for (const PatchFacts &facts : found.log.patches)
      if (facts.file == patch.patch.file)
        patch.facts = facts;
  }
}

/// The owner of the instances that the runs have stopped: an ordinary user can stop only instances of the
/// same user. The log of root's runs does not tell it, and any user may own them, unless the home is root's.
std::string ownerOfInstances(const Home &home, const LogFacts &log) {
  struct stat status = {};
  const bool isRoots = stat(home.path().c_str(), &status) == 0 && status.st_uid == 0;
  return log.user != "root" || isRoots ? log.user : "";
}

void fromLog(const Home &home, Interruption &found) {
  for (const StoppedInstance &instance : found.log.stopped)
    if (!isAmong(found.ran, {instance.product, instance.name, "", ""}))
      found.ran.push_back({instance.product, instance.name, "", ownerOfInstances(home, found.log)});
  for (const std::string &directory : found.log.directories) {
    const bool isInside = directory.compare(0, home.path().size(), home.path()) == 0;
    const std::string path = isInside ? relativePath(directory.substr(home.path().size())) : "";
    if (!path.empty() && path != "tmp" && path.rfind("tmp/", 0) != 0)
      found.directories.push_back(path);
  }
  for (const PatchFacts &facts : found.log.patches) {
    if (!readArchive(facts.archive, facts.file, found))
      continue;
    InterruptedPatch &patch = found.patches.back();
    describe(home, found, patch);
    addLogged(home, found.log, patch);
    patch.facts = facts;
  }
}

/// The log's tale in the fields of a record.
void fillRecord(const Home &home, Interruption &found) {
  Record &record = found.record;
  record.home = home.path();
  if (!found.log.isInterrupted)
    return;
  record.action = "apply";
  record.user = found.log.user;
  record.before = found.ran;
  for (const InterruptedPatch &patch : found.patches)
    record.patches.push_back({patch.patch.file, "", patch.patch.descriptor->getProductCode(),
                              patch.patch.name.getTarget(), patch.patch.descriptor->getPatchName(),
                              patch.levelBefore, patch.levelAfter, "", patch.versionFile});
  for (const InterruptedPatch &patch : found.patches)
    for (const InterruptedFile &file : patch.files)
      record.files.push_back({file.path, file.before, stateOf(home.at(file.path)), ""});
  for (const std::string &path : found.directories)
    record.directories.push_back({path});
  for (const LogStep &step : found.log.steps)
    record.steps.push_back(
        {step.name, static_cast<double>(step.seconds), step.result == StepResult::Passed ? "ok" : "failed"});
}

} // namespace

Interruption findInterruption(const Home &home) {
  Interruption found;
  const bool hasRecord = findRecord(home, found);
  found.log = readLogFacts(home);
  if (hasRecord)
    fromRecord(home, found);
  else if (found.log.isInterrupted)
    fromLog(home, found);
  if (!found.hasRecord)
    fillRecord(home, found);
  return found;
}
