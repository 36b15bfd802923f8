// verify: proof that what a patch brought is what the home has.
#include <cstdio>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "home.h"
#include "packages.h"
#include "text.h"
#include "transaction/proof.h"
#include "verification.h"

namespace {

void print(const Verification &verification, const OutputOptions &options) {
  const Palette palette(options);
  for (const Difference &difference : verification.differences)
    printf("%s%*s%s: %s\n", palette.error(difference.kind).c_str(),
           static_cast<int>(std::max<std::size_t>(10, difference.kind.size() + 1) - difference.kind.size()),
           "", terminalText(difference.path).c_str(), terminalText(difference.text).c_str());
  printf("%zu files compared, %zu differences\n", verification.files, verification.differences.size());
}

struct Arguments {
  std::shared_ptr<std::string> home;
  std::string patch;
  std::string transaction;
};

void verify(const Arguments &arguments, Invocation &invocation) {
  if (arguments.patch.empty() && arguments.transaction.empty())
    throw CLI::RequiredError("PATCH or --transaction");
  const Home home(*arguments.home);
  const Verification verification = arguments.transaction.empty()
                                        ? verifyPatches(home, applicablePatches(home, arguments.patch))
                                        : verifyTransaction(home, arguments.transaction);
  if (invocation.output.json)
    printDocument(toJson(verification));
  else
    print(verification, invocation.output);
  invocation.status = verification.differences.empty() ? Good : Findings;
}

} // namespace

void addVerify(CLI::App &application, Invocation &invocation) {
  CLI::App *const command =
      addCommand(application, invocation, "verify", "Compare what a patch brought with what the home has");
  const auto arguments = std::make_shared<Arguments>();
  arguments->home = addHome(*command);
  CLI::Option *const patch =
      command->add_option("patch", arguments->patch, "A patch file, or a directory of them")
          ->option_text("[PATCH]");
  command
      ->add_option("--transaction", arguments->transaction,
                   "Against the record of this transaction, in place of a patch")
      ->option_text("ID")
      ->excludes(patch);
  command->callback([arguments, &invocation] { verify(*arguments, invocation); });
}
