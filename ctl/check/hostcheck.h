// Whether an installation will go through on this host: rules for the home, the files that a patch touches,
// the agents, the tools and the signature. Nothing is changed: probes leave at most the times of directories.
#pragma once

#include <set>
#include <string>
#include <vector>

#include "finding.h"
#include "patch.h"

/// What is checked, and what has been found.
class HostCheck {
public:
  std::string home;               ///< as the installer uses it: ends in "/"
  std::string searchPath;         ///< where the tools are looked for
  std::string keyring;            ///< empty: signatures are not asked for
  std::vector<Patch> patches;     ///< those that apply, in the installer's order
  std::vector<std::string> files; ///< the path of every patch file that was given, applicable or not
  bool isLockHeld = false;        ///< by this process itself

  /// Adds a finding of a rule of the table, with the rule's severity and remedy.
  void add(const std::string &rule, const std::string &patch, const std::string &where,
           const std::string &text);
  /// The same with a severity of its own.
  void addAs(Severity severity, const std::string &rule, const std::string &patch, const std::string &where,
             const std::string &text);
  /// Whether a rule has found something.
  bool has(const std::string &rule) const;
  /// Product codes whose temporary directories the patches use: of file name and descriptor.
  std::set<std::string> temporaryCodes() const;

  const FindingList &findings() const { return findings_; }
  FindingList &findings() { return findings_; }

private:
  FindingList findings_;
};

/// The table of rules, in the order in which they are checked.
const std::vector<Rule> &hostRules();

// Each group adds what it finds.
void checkHome(HostCheck &check);       ///< path, tmp, left-overs, foreign writers, other runs
void checkTargets(HostCheck &check);    ///< the files and directories that the patches touch; room
void checkAgents(HostCheck &check);     ///< run information, owners, users
void checkTools(HostCheck &check);      ///< tar, ps, su, clock
void checkSignatures(HostCheck &check); ///< SHA256SUMS.asc by gpgv, when there is a keyring
