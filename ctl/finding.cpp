#include "finding.h"

#include <algorithm>
#include <cstdio>
#include <set>

#include <nlohmann/json.hpp>

#include "text.h"

namespace {

const char *wordOf(Severity severity) {
  return severity == Severity::Error ? "error" : "warning";
}

void printFinding(const Finding &finding, const Palette &palette) {
  const std::string word = wordOf(finding.severity);
  const std::string painted =
      finding.severity == Severity::Error ? palette.error(word) : palette.warning(word);
  const std::string where = finding.where.empty() ? "" : terminalText(finding.where) + ": ";
  printf("  %s%*s%s\n%*s%s%s\n", painted.c_str(), static_cast<int>(9 - word.size()), "", finding.rule.c_str(),
         11, "", where.c_str(), terminalText(finding.text).c_str());
  if (!finding.remedy.empty())
    printf("%*s%s\n", 11, "", terminalText(finding.remedy).c_str());
}

/// Those of one patch with one severity, in the order in which they were found.
void printGroup(const FindingList &findings, const std::string &patch, Severity severity,
                const Palette &palette) {
  for (const Finding &finding : findings)
    if (finding.patch == patch && finding.severity == severity)
      printFinding(finding, palette);
}

} // namespace

std::size_t count(const FindingList &findings, Severity severity) {
  return static_cast<std::size_t>(
      std::count_if(findings.begin(), findings.end(),
                    [severity](const Finding &finding) { return finding.severity == severity; }));
}

nlohmann::ordered_json toJson(const FindingList &findings) {
  nlohmann::ordered_json list = nlohmann::ordered_json::array();
  for (const Finding &finding : findings)
    list.push_back({{"rule", finding.rule},
                    {"severity", wordOf(finding.severity)},
                    {"patch", jsonText(finding.patch)},
                    {"where", jsonText(finding.where)},
                    {"text", jsonText(finding.text)},
                    {"remedy", jsonText(finding.remedy)}});
  return {{"findings", list},
          {"errors", count(findings, Severity::Error)},
          {"warnings", count(findings, Severity::Warning)}};
}

void printFindings(const FindingList &findings, const OutputOptions &options) {
  const Palette palette(options);
  std::set<std::string> printed;
  for (const Finding &first : findings) {
    if (!printed.insert(first.patch).second)
      continue;
    if (!first.patch.empty())
      printf("%s\n", terminalText(first.patch).c_str());
    printGroup(findings, first.patch, Severity::Error, palette);
    printGroup(findings, first.patch, Severity::Warning, palette);
    printf("\n");
  }
  printf("%zu errors, %zu warnings\n", count(findings, Severity::Error), count(findings, Severity::Warning));
}

void printRule(const Rule &rule) {
  printf("%s (%s)\n  %s\n  Why: %s\n  Remedy: %s\n", rule.name, wordOf(rule.severity), rule.text, rule.reason,
         rule.remedy);
}
