#include "transaction/proof.h"

#include <algorithm>
#include <map>
#include <set>

#include <sys/stat.h>

#include "judgement.h"
#include "patchfilename.h"
#include "transaction/changes.h"
#include "transaction/plan.h"
#include "transaction/record.h"

namespace {

Record readInstallation(const Home &home, const std::string &id) {
  const std::string folder = home.at("patchlogs/transactions/" + id);
  if (id.empty() || id == "." || id == ".." || id.find('/') != std::string::npos || !stateOf(folder))
    throw JudgementError("no transaction " + id);
  Record record = readRecord(folder);
  if (record.action != "apply")
    throw JudgementError(id + " is an undo: name the installation");
  if (record.phase != Phase::Closed)
    throw JudgementError("the transaction " + id +
                         " did not end: orvpatchctl recover tells what it has left");
  if (record.verdict == "undone")
    throw JudgementError("the transaction " + id + " was taken back");
  return record;
}

const char *typeName(unsigned type) {
  if (S_ISREG(type))
    return "a file";
  if (S_ISDIR(type))
    return "a directory";
  return S_ISLNK(type) ? "a symbolic link" : "a special file";
}

class Proof {
public:
  Proof(const Home &home, const Record &record) : home_(home), record_(record) {}

  Verification run() {
    noteTold();
    for (const TouchedFile &file : record_.files)
      compareFile(file);
    for (const NewDirectory &directory : record_.directories)
      compareDirectory(directory.path);
    compareRecords();
    compareInstances();
    return std::move(found_);
  }

private:
  /// What the installation itself had otherwise than its archive: that is still so in an untouched file.
  void noteTold() {
    for (const Difference &difference : record_.differences)
      if (difference.kind == "content" || difference.kind == "type")
        told_.emplace(difference.path, &difference);
  }

  void compareFile(const TouchedFile &file) {
    ++found_.files;
    const std::optional<FileState> now = stateOf(home_.at(file.path));
    if (!now)
      return found_.add(file.path, "missing", "not in the home");
    const unsigned type = file.after ? file.after->type : S_IFREG;
    if (now->type != type)
      return found_.add(file.path, "type",
                        std::string("the installation left ") + typeName(type) + ", the home has " +
                            typeName(now->type));
    compareContent(file, *now);
    verifyAttributes(file, *now, found_);
  }

  void compareContent(const TouchedFile &file, const FileState &now) {
    const auto told = told_.find(file.path);
    if (!file.after)
      found_.add(file.path, "content", "it was missing after the installation, and came from elsewhere");
    else if (!isSameFile(*file.after, now))
      found_.add(file.path, "content", "not the file that was installed: another one, or written to since");
    else if (told != told_.end())
      found_.add(file.path, told->second->kind, told->second->text);
  }

  void compareDirectory(const std::string &path) {
    const std::optional<FileState> now = stateOf(home_.at(path));
    if (path == "tmp")
      return; // the installer's own: the patches bring nothing there
    if (!now)
      found_.add(path, "missing", "not in the home");
    else if (!S_ISDIR(now->type))
      found_.add(path, "type",
                 std::string("the installation left a directory, the home has ") + typeName(now->type));
  }

  /// Of two patches with one version file the later one counts.
  void compareRecords() {
    std::set<std::string> versionFiles;
    std::vector<Verification> each(record_.patches.size());
    for (std::size_t i = record_.patches.size(); i-- > 0;) {
      const RecordedPatch &patch = record_.patches[i];
      if (versionFiles.insert(patch.versionFile).second)
        verifyLevel(home_.path(), patch.versionFile, patch.levelAfter, each[i]);
      verifyHistory(home_.path(),
                    {patch.product, PatchFileName(patch.file).getFullPlatform(), patch.target, patch.name},
                    each[i]);
    }
    for (const Verification &one : each)
      found_.append(one);
  }

  void compareInstances() {
    const std::vector<RecordedInstance> running = runningInstances(home_);
    for (const RecordedInstance &instance : record_.before)
      if (!isAmong(running, instance))
        found_.add(nameOf(instance), "instance", "it ran before the installation, and does not run now");
  }

  const Home &home_;
  const Record &record_;
  Verification found_;
  std::map<std::string, const Difference *> told_;
};

} // namespace

Verification verifyTransaction(const Home &home, const std::string &id) {
  const Record record = readInstallation(home, id);
  return Proof(home, record).run();
}
