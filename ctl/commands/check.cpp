// check: whether an installation will go through on this host.
#include <cstdio>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "check/hostreport.h"
#include "commands/command.h"
#include "commands/commands.h"
#include "text.h"

namespace {

struct Arguments {
  std::string home;
  std::string patch;
  CheckOptions options;
  bool withoutReport = false;
};

nlohmann::ordered_json reportOf(const CheckResult &result) {
  if (!result.report)
    return nullptr;
  return {{"status", result.report->status},
          {"stdout", jsonText(result.report->out)},
          {"stderr", jsonText(result.report->err)}};
}

void print(const CheckResult &result, const OutputOptions &options) {
  if (result.report && result.report->status == 0)
    printf("%s\n", result.report->out.c_str());
  printFindings(result.findings, options);
}

void check(Arguments &arguments, Invocation &invocation) {
  arguments.options.withReport = !arguments.withoutReport;
  const Home home(arguments.home);
  const CheckResult result = checkInstallation(home, arguments.patch, arguments.options);
  if (invocation.output.json) {
    nlohmann::ordered_json document = toJson(result.findings);
    document["report"] = reportOf(result);
    printDocument(document);
  } else {
    print(result, invocation.output);
  }
  invocation.status = count(result.findings, Severity::Error) == 0 ? Good : Findings;
}

} // namespace

void addCheck(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "check",
                                       "Tell whether an installation will go through on this host");
  const auto arguments = std::make_shared<Arguments>();
  command->add_option("home", arguments->home, "The product's home")->required()->option_text("HOME");
  command->add_option("patch", arguments->patch, "A patch file, or a directory of them")
      ->required()
      ->option_text("PATCH");
  command->add_flag("--no-report", arguments->withoutReport, "Do not run the installer's own report");
  command->add_option("--keyring", arguments->options.keyring, "Ask for signatures by a key of this keyring")
      ->option_text("FILE");
  addInstallerOptions(*command, arguments->options.installer);
  command->callback([arguments, &invocation] { check(*arguments, invocation); });
}
