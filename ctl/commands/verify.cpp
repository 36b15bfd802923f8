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

/// What stands below one patch file or a directory of them: the last patch of a path or of a version file
/// decides.
Verification verifyPatches(const Home &home, const std::string &path) {
  const std::vector<Patch> patches = applicablePatches(home, path);
  std::vector<Verification> found(patches.size());
  std::set<std::string> covered;
  std::set<std::string> versionFiles;
  for (std::size_t i = patches.size(); i-- > 0;) {
    verifyFiles(home.path(), patches[i], covered, found[i]);
    if (versionFiles.insert(versionFileOf(home, patches[i])).second)
      verifyLevel(home.path(), patches[i], found[i]);
    verifyHistory(home.path(), patches[i], found[i]);
  }
  Verification all;
  for (const Verification &one : found)
    all.append(one);
  return all;
}

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
  const Verification verification = verifyPatches(home, path);
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
