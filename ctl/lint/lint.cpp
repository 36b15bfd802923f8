#include "lint/lint.h"

#include <algorithm>
#include <set>

#include <sys/stat.h>

#include "judgement.h"
#include "lint/subject.h"
#include "look.h"
#include "utilities.h"

namespace {

constexpr const char *archiveExtensions[] = {"tar",  "tar.Z",  "tar.gz", "tgz",      "tar.bz2",
                                             "tbz2", "tbz",    "tar.xz", "txz",      "tar.zst",
                                             "tzst", "tar.lz", "taz",    "tar.lzma", "tlz"};

bool hasArchiveExtension(const std::string &file) {
  const std::size_t point = file.find('.');
  const std::string extension = point == std::string::npos ? "" : file.substr(point + 1);
  return std::find(std::begin(archiveExtensions), std::end(archiveExtensions), extension) !=
         std::end(archiveExtensions);
}

bool isArchive(const std::string &path) {
  const Listing listing = listArchive(path);
  return !listing.members.empty();
}

/// Whether another file of the directory bears the name that this one only adds something to.
bool isNamedAfterAnother(const std::string &file, const std::set<std::string> &files) {
  for (std::size_t point = file.find_first_of(".~", 1); point != std::string::npos;
       point = file.find_first_of(".~", point + 1))
    if (files.count(file.substr(0, point)) != 0)
      return true;
  return false;
}

bool isCompanion(const std::string &folder, const std::string &file, const std::set<std::string> &files) {
  return !hasArchiveExtension(file) && (isNamedAfterAnother(file, files) || !isArchive(folder + file));
}

/// The names of the files of a directory. A pipe or a device is passed over, as the installer does.
std::set<std::string> filesOf(const std::string &folder) {
  std::set<std::string> files;
  listDirectory(folder, [&](const std::string &name) {
    const std::optional<struct stat> status = lookBehind(folder + name);
    if (!status || S_ISREG(status->st_mode))
      files.insert(name);
  });
  return files;
}

PatchSet readSet(const std::string &folder) {
  PatchSet set;
  const std::set<std::string> files = filesOf(folder);
  for (const std::string &file : files) {
    const bool hasName = PatchFileName(file).isValid();
    if (hasName && isCompanion(folder, file, files))
      set.companions.push_back(file);
    else if (hasName || hasArchiveExtension(file))
      set.patches.push_back(examine(folder + file, true));
  }
  if (set.patches.empty() && set.companions.empty())
    throw JudgementError("no patch in " + folder);
  return set;
}

void checkPatch(const Subject &subject, FindingList &findings) {
  for (const LintRule &rule : lintRules()) {
    Finder found(rule.rule, subject.patch.file, findings);
    if (rule.check != nullptr)
      rule.check(subject, found);
  }
}

void checkSet(const PatchSet &set, FindingList &findings) {
  for (const LintRule &rule : lintRules()) {
    Finder found(rule.rule, "", findings);
    if (rule.checkSet != nullptr)
      rule.checkSet(set, found);
  }
}

} // namespace

FindingList lint(const std::string &path) {
  if (!lookBehind(path))
    throw JudgementError("cannot read " + path);
  FindingList findings;
  if (!isDirectory(path)) {
    checkPatch(examine(path, false), findings);
    return findings;
  }
  const PatchSet set = readSet(path.back() == '/' ? path : path + "/");
  for (const Subject &subject : set.patches)
    checkPatch(subject, findings);
  checkSet(set, findings);
  return findings;
}
