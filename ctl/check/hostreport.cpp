#include "check/hostreport.h"

#include <algorithm>
#include <filesystem>
#include <iterator>
#include <utility>

#include "check/hostcheck.h"
#include "dcfpackageprocessor.h"
#include "file.h"
#include "lint/lint.h"
#include "signals.h"
#include "utilities.h"

namespace {

bool hasRule(const FindingList &findings, const std::string &rule) {
  return std::any_of(findings.begin(), findings.end(),
                     [&rule](const Finding &finding) { return finding.rule == rule; });
}

/// The report would remove another run's directory or the patch itself, would never end, or would remove what
/// may be the only copy of a file.
bool wouldHarm(const FindingList &findings) {
  for (const char *rule : {"other-run", "patch-in-tmp", "tar-too-loud", "tmp-leftover"})
    if (hasRule(findings, rule))
      return true;
  return false;
}

/// Patches that the installer would not take on this home are left to its report.
HostCheck subjectOf(const Home &home, const std::string &path, const CheckOptions &options) {
  HostCheck check;
  check.home = home.path();
  check.searchPath = options.installer.searchPath;
  check.keyring = options.keyring;
  check.isLockHeld = options.isLockHeld;
  check.files = patchFiles(options.original.empty() ? path : options.original);
  for (const std::string &file : patchFiles(path)) {
    if (!DCFPackageProcessor::isApplicable(home.path(), File(file)))
      continue;
    Patch patch = readPatch(file);
    if (patch.descriptor != nullptr)
      check.patches.push_back(std::move(patch));
  }
  return check;
}

std::string trimmed(std::string text) {
  Util::trimString(text);
  return text;
}

/// The tar of a report that was killed goes on until its directory has gone, and may fill it meanwhile.
void removeWhole(const std::string &directory) {
  constexpr int Most = 100;
  std::error_code error = std::make_error_code(std::errc::directory_not_empty);
  for (int tries = 0; tries < Most && error == std::errc::directory_not_empty; ++tries)
    std::filesystem::remove_all(directory, error);
}

/// A report that does not end well leaves what it has extracted. None of it was there before: a left-over
/// keeps the report from being run.
void removeExtracted(const HostCheck &check) {
  for (const std::string &code : check.temporaryCodes())
    if (!code.empty() && code != "." && code != ".." && code.find('/') == std::string::npos)
      removeWhole(check.home + "tmp/" + code);
}

ChildResult report(const HostCheck &check, const InstallerOptions &installer, const std::string &path) {
  try {
    const ChildResult result = runReport(installer, check.home, path);
    removeExtracted(check);
    return result;
  } catch (...) {
    removeExtracted(check);
    throw;
  }
}

} // namespace

CheckResult checkInstallation(const Home &home, const std::string &path, const CheckOptions &options) {
  const InterruptionCatcher catcher;
  CheckResult result;
  result.findings = lint(path);
  HostCheck check = subjectOf(home, path, options);
  checkHome(check);
  checkTargets(check);
  checkAgents(check);
  checkTools(check);
  checkSignatures(check);
  if (options.withReport && !wouldHarm(check.findings()) && !wouldHarm(result.findings)) {
    result.report = report(check, options.installer, path);
    if (result.report->status != 0)
      check.add("installer-refuses", "", "status " + std::to_string(result.report->status),
                trimmed(result.report->err));
  }
  stopIfInterrupted();
  std::move(check.findings().begin(), check.findings().end(), std::back_inserter(result.findings));
  return result;
}
