// lint: what is wrong with a patch, told before the installer meets it.
//
// Each rule is a row of one table with the function that finds it. Rules on one patch see it as a Subject;
// rules on the files of a directory see them all.
#pragma once

#include <string>
#include <vector>

#include "finding.h"

struct Subject;
struct PatchSet;
class Finder;

struct LintRule {
  Rule rule;
  void (*check)(const Subject &subject, Finder &found); ///< null for a rule on sets
  void (*checkSet)(const PatchSet &set, Finder &found); ///< null for a rule on single patches
};

/// All rules, errors before warnings.
const std::vector<LintRule> &lintRules();

/// The findings on a patch file, or on a directory of them. JudgementError when something cannot be read.
FindingList lint(const std::string &path);
