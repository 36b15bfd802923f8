// lint: the findings on patches, or the text of one rule.
#include "lint/lint.h"

#include <algorithm>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"

namespace {

struct LintOptions {
  std::vector<std::string> patches;
  std::string explained;
  bool isStrict = false;
};

nlohmann::ordered_json toJson(const Rule &rule) {
  return {{"rule", rule.name},
          {"severity", rule.severity == Severity::Error ? "error" : "warning"},
          {"text", rule.text},
          {"reason", rule.reason},
          {"remedy", rule.remedy}};
}

/// One rule, or "all" of them.
std::vector<Rule> rulesOf(const std::string &name) {
  std::vector<Rule> rules;
  for (const LintRule &lintRule : lintRules())
    if (name == "all" || name == lintRule.rule.name)
      rules.push_back(lintRule.rule);
  if (rules.empty())
    throw JudgementError("no such rule: " + name);
  return rules;
}

void explain(const std::string &name, const OutputOptions &output) {
  const std::vector<Rule> rules = rulesOf(name);
  nlohmann::ordered_json list = nlohmann::ordered_json::array();
  for (const Rule &rule : rules)
    list.push_back(toJson(rule));
  if (output.json)
    printDocument({{"rules", list}});
  else
    std::for_each(rules.begin(), rules.end(), printRule);
}

int judge(const LintOptions &options, const OutputOptions &output) {
  FindingList findings;
  for (const std::string &path : options.patches) {
    const FindingList more = lint(path);
    findings.insert(findings.end(), more.begin(), more.end());
  }
  if (output.json)
    printDocument(toJson(findings));
  else
    printFindings(findings, output);
  const bool isGood = count(findings, Severity::Error) == 0 && !(options.isStrict && !findings.empty());
  return isGood ? Good : Findings;
}

void run(const LintOptions &options, Invocation &invocation) {
  if (!options.explained.empty())
    explain(options.explained, invocation.output);
  else if (options.patches.empty())
    throw JudgementError("lint: no patch was given");
  else
    invocation.status = judge(options, invocation.output);
}

} // namespace

void addLint(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "lint",
                                       "Tell what is wrong with patches before they are installed");
  const auto options = std::make_shared<LintOptions>();
  command->add_option("patch", options->patches, "Patch files, or directories of them")->option_text("PATCH");
  command->add_option("--explain", options->explained, "Print a rule with its reason and remedy, or all")
      ->option_text("RULE");
  command->add_flag("--strict", options->isStrict, "Status 1 for warnings too");
  command->callback([options, &invocation] { run(*options, invocation); });
}
