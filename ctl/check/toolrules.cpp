// The tools that the installer runs, the clock, and signatures.
#include <algorithm>
#include <ctime>
#include <fstream>
#include <sstream>

#include <sys/stat.h>
#include <unistd.h>

#include "check/hostcheck.h"
#include "checksums.h"
#include "child.h"
#include "look.h"

namespace {

ChildEnvironment environmentOf(const HostCheck &check) {
  return {check.searchPath, {"LANG=C", "LC_ALL=C"}};
}

/// A tool that says who it is: its version text must have the word.
void checkVersion(HostCheck &check, const char *tool, const char *word, const char *expected) {
  if (findProgram(tool, check.searchPath).empty())
    return check.add("tool-missing", "", tool, "not found in " + check.searchPath);
  const ChildResult version = runChild({tool, "--version"}, environmentOf(check));
  if (version.out.find(word) == std::string::npos)
    check.add("tool-missing", "", findProgram(tool, check.searchPath), std::string("it is not ") + expected);
}

void checkPresence(HostCheck &check, const std::string &tool) {
  if (findProgram(tool, check.searchPath).empty())
    check.add("tool-missing", "", tool, "not found");
}

void checkClock(HostCheck &check) {
  const std::time_t now = std::time(nullptr);
  const std::optional<struct stat> log = lookBehind(check.home + "patchlogs/orvpatch.log");
  if (log && log->st_mtime > now)
    check.add("clock-behind", "", "patchlogs/orvpatch.log", "the log was written in the future");
  for (const Patch &patch : check.patches) {
    const auto newest = std::max_element(patch.members.begin(), patch.members.end(),
                                         [](const Member &a, const Member &b) { return a.time < b.time; });
    if (newest != patch.members.end() && newest->time > now)
      check.add("clock-behind", patch.file, newest->name, "the file was made in the future");
  }
}

std::string folderOf(const std::string &file) {
  const std::size_t slash = file.rfind('/');
  return slash == std::string::npos ? "." : slash == 0 ? "/" : file.substr(0, slash);
}

/// Whether the folder's list of checksums bears a good signature; adds why not.
bool isSigned(HostCheck &check, const Patch &patch, const std::string &folder) {
  const std::string list = folder + "/SHA256SUMS";
  const std::string signature = list + ".asc";
  for (const std::string &file : {list, signature}) {
    if (access(file.c_str(), R_OK) == 0)
      continue;
    check.add("signature-missing", patch.file, file, "it is missing or cannot be read");
    return false;
  }
  const ChildResult gpgv =
      runChild({"gpgv", "--keyring", check.keyring, signature, list}, environmentOf(check));
  if (gpgv.status == 0)
    return true;
  check.add("signature-bad", patch.file, signature, gpgv.err.substr(0, gpgv.err.find_last_not_of('\n') + 1));
  return false;
}

} // namespace

void checkTools(HostCheck &check) {
  checkVersion(check, "tar", "GNU tar", "GNU tar");
  checkVersion(check, "ps", "procps", "the ps of procps");
  checkPresence(check, "grep");
  checkPresence(check, "/bin/sh");
  if (geteuid() == 0)
    checkPresence(check, "/bin/su");
  checkClock(check);
}

void checkSignatures(HostCheck &check) {
  if (check.keyring.empty())
    return;
  if (findProgram("gpgv", check.searchPath).empty())
    return check.add("tool-missing", "", "gpgv", "not found in " + check.searchPath);
  for (const Patch &patch : check.patches) {
    const std::string folder = folderOf(patch.path);
    if (!isSigned(check, patch, folder))
      continue;
    const std::string listed = listedChecksum(folder + "/SHA256SUMS", patch.file);
    if (listed.empty())
      check.add("signature-missing", patch.file, folder + "/SHA256SUMS",
                "the signed list does not name the patch");
    else if (listed != sha256OfFile(patch.path))
      check.add("signature-bad", patch.file, patch.path, "the signed checksum is another one");
  }
}
