// The home itself: its path, tmp, what an earlier run left there, who may write where, and who else is at
// work.
#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include <sys/stat.h>
#include <unistd.h>

#include "check/hostcheck.h"
#include "homelock.h"
#include "leftover.h"
#include "look.h"
#include "processes.h"

namespace {

namespace fs = std::filesystem;

std::string withoutSlash(std::string path) {
  while (path.size() > 1 && path.back() == '/')
    path.pop_back();
  return path;
}

std::string canonical(const std::string &path) {
  char *const resolved = realpath(path.c_str(), nullptr);
  const std::string result = resolved == nullptr ? "" : resolved;
  free(resolved);
  return result;
}

bool isPlain(const std::string &path) {
  for (const char c : path)
    if (isalnum(static_cast<unsigned char>(c)) == 0 && strchr("/_-.+", c) == nullptr)
      return false;
  return true;
}

void checkPath(HostCheck &check) {
  const std::string path = withoutSlash(check.home);
  const auto wrong = [&](const std::string &text) { check.add("home-path", "", path, text); };
  if (path.front() != '/')
    wrong("the path is relative");
  else if (canonical(path) != path)
    wrong("the path leads over links, \"..\" or double slashes to " + canonical(path));
  if (!isPlain(path))
    wrong("the path has characters other than letters, digits and / _ - . +");
  if (path.find("grep") != std::string::npos)
    wrong("the path contains the word grep");
}

std::string ownerText(const struct stat &status) {
  return "owner " + loginName(status.st_uid) + ", mode " + std::to_string((status.st_mode >> 6) & 7) +
         std::to_string((status.st_mode >> 3) & 7) + std::to_string(status.st_mode & 7);
}

void checkTmp(HostCheck &check) {
  const std::string path = check.home + "tmp";
  const std::optional<struct stat> status = lookAt(path);
  if (!status)
    return;
  if (S_ISLNK(status->st_mode))
    return check.add("home-tmp", "", "tmp", "it is a symbolic link");
  if (!S_ISDIR(status->st_mode))
    return check.add("home-tmp", "", "tmp", "it is no directory");
  if (status->st_uid != geteuid() || (status->st_mode & 0022) != 0)
    check.add("home-tmp", "", "tmp", ownerText(*status));
}

void checkLeftovers(HostCheck &check) {
  for (const std::string &code : check.temporaryCodes()) {
    const std::optional<struct stat> status =
        code.empty() ? std::nullopt : lookAt(check.home + "tmp/" + code);
    if (!status)
      continue;
    const std::string lacking = S_ISDIR(status->st_mode) ? onlyCopyIn(check.home, "tmp/" + code) : "";
    if (lacking.empty())
      check.add("tmp-leftover", "", "tmp/" + code, "left by an earlier run");
    else
      check.addAs(Severity::Error, "tmp-leftover", "", "tmp/" + code,
                  "it holds " + lacking + ", which the home lacks");
  }
}

void checkPatchPlace(HostCheck &check) {
  const std::string tmp = canonical(check.home + "tmp");
  for (const std::string &file : check.files) {
    const std::string place = canonical(file);
    if (!tmp.empty() && place.compare(0, tmp.size() + 1, tmp + "/") == 0)
      check.add("patch-in-tmp", fs::path(file).filename(), place, "the installer would remove it");
  }
}

/// Whether others than root and the runner may change what stands at the path; one that is missing is left
/// out.
void checkWriters(HostCheck &check, const char *rule, const std::string &relative) {
  const std::optional<struct stat> status = lookBehind(check.home + relative);
  if (!status)
    return;
  const bool foreignOwner = status->st_uid != 0 && status->st_uid != geteuid();
  if (foreignOwner || (status->st_mode & 0022) != 0)
    check.add(rule, "", relative, ownerText(*status));
}

void checkRegistryWriters(HostCheck &check) {
  checkWriters(check, "registry-writable", "registry");
  std::set<std::string> names;
  listDirectory(check.home + "registry", [&names](const std::string &name) {
    if (fs::path(name).extension() == ".ver")
      names.insert(name);
  });
  for (const std::string &name : names)
    checkWriters(check, "registry-writable", "registry/" + name);
}

void checkOtherRuns(HostCheck &check) {
  for (const std::string &run : installerRuns(check.home))
    check.add("other-run", "", "", run);
  if (!check.isLockHeld && !check.has("other-run") && isHomeLocked(check.home))
    check.add("other-run", "", "", "a transaction of orvpatchctl holds the home");
}

} // namespace

void checkHome(HostCheck &check) {
  checkPath(check);
  checkTmp(check);
  checkLeftovers(check);
  checkPatchPlace(check);
  checkRegistryWriters(check);
  checkWriters(check, "runinfo-writable", "config/.ConfigData");
  checkWriters(check, "runinfo-writable", "config/.ConfigData/RunInfo");
  checkOtherRuns(check);
}
