// Findings: what a rule has found, where, and what to do about it.
//
// A rule has a name, a severity, what it says, why it matters and the remedy. lint and check each have a
// table of them; --explain and the manual pages are made from these tables.
#pragma once

#include <string>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "output.h"

enum class Severity { Error, Warning };

struct Rule {
  const char *name;
  Severity severity;
  const char *text;   ///< what is wrong, in one sentence
  const char *reason; ///< what the installer does about it
  const char *remedy; ///< what to change
};

/// One finding; the texts are bytes as found and are escaped on their way out.
struct Finding {
  std::string rule;
  Severity severity = Severity::Error;
  std::string patch; ///< file name of the patch; empty when the finding is the home's
  std::string where; ///< member, line or path; may be empty
  std::string text;
  std::string remedy;
};

using FindingList = std::vector<Finding>;

/// Number of findings of a severity.
std::size_t count(const FindingList &findings, Severity severity);

/// {"findings": [...], "errors": N, "warnings": N}
nlohmann::ordered_json toJson(const FindingList &findings);

/// Prints the findings grouped by patch, errors before warnings, and a last line that counts them.
void printFindings(const FindingList &findings, const OutputOptions &options);

/// Prints one rule of a table with its reason and remedy.
void printRule(const Rule &rule);
