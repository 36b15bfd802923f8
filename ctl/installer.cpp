#include "installer.h"

#include <cstdlib>
#include <filesystem>

#include <unistd.h>

#include "judgement.h"

const char *const DefaultSearchPath = "/usr/sbin:/usr/bin:/sbin:/bin";

std::string findInstaller(const InstallerOptions &options) {
  namespace fs = std::filesystem;
  if (!options.file.empty()) {
    if (access(options.file.c_str(), X_OK) != 0)
      throw JudgementError("cannot run the installer " + options.file);
    return fs::absolute(options.file);
  }
  std::error_code error;
  const fs::path self = fs::read_symlink("/proc/self/exe", error);
  const fs::path beside = self.parent_path() / "orvpatch";
  if (!error && access(beside.c_str(), X_OK) == 0)
    return beside;
  const char *const path = getenv("PATH");
  const std::string found = findProgram("orvpatch", path == nullptr ? DefaultSearchPath : path);
  if (found.empty())
    throw JudgementError("no orvpatch beside this program or in PATH: name it with --installer");
  return found;
}

ChildEnvironment installerEnvironment(const InstallerOptions &options) {
  const char *const home = getenv("HOME");
  return {options.searchPath, {"HOME=" + std::string(home == nullptr ? "/" : home), "LANG=C"}};
}

ChildResult runReport(const InstallerOptions &options, const std::string &home, const std::string &patch) {
  return runChild({findInstaller(options), "-h", home, "-t", patch}, installerEnvironment(options));
}
