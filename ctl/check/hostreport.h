// The whole check: lint, the host, and the installer's own report.
#pragma once

#include <optional>
#include <string>

#include "child.h"
#include "finding.h"
#include "home.h"
#include "installer.h"

struct CheckOptions {
  InstallerOptions installer;
  std::string keyring; ///< empty: signatures are not asked for
  bool withReport = true;
  std::string original;    ///< where the patches were before they were copied; empty: where they are
  bool isLockHeld = false; ///< by this process itself
};

struct CheckResult {
  FindingList findings;
  std::optional<ChildResult> report; ///< none where it was not wanted, or would do harm
};

/// Checks the patches of a path against a home. Changes nothing, but log and tmp where the report runs.
CheckResult checkInstallation(const Home &home, const std::string &path, const CheckOptions &options);
