// verify: proof that what a patch brings is what the home has.
#include <cstdio>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "home.h"
#include "packages.h"
#include "text.h"
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

void verify(const std::string &homePath, const std::string &path, Invocation &invocation) {
  const Home home(homePath);
  const Verification verification = verifyPatches(home, applicablePatches(home, path));
  if (invocation.output.json)
    printDocument(toJson(verification));
  else
    print(verification, invocation.output);
  invocation.status = verification.differences.empty() ? Good : Findings;
}

} // namespace

void addVerify(CLI::App &application, Invocation &invocation) {
  CLI::App *const command =
      addCommand(application, invocation, "verify", "Compare what a patch brings with what the home has");
  const std::shared_ptr<std::string> home = addHome(*command);
  const auto path = std::make_shared<std::string>();
  command->add_option("patch", *path, "A patch file, or a directory of them")
      ->required()
      ->option_text("PATCH");
  command->callback([home, path, &invocation] { verify(*home, *path, invocation); });
}
