// new: a source tree for a patch, which build accepts as it is.
#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>
#include <sys/stat.h>

#include "commands/command.h"
#include "commands/commands.h"
#include "text.h"
#include "utilities.h"
#include "version.h"

namespace {

struct NewOptions {
  std::string directory;
  std::string product;
  std::string level;
  std::string name;
  std::string description;
};

const char *const descriptorFormat = R"(# Descriptor of a patch.
#
# A line that begins with "#" is a comment; there are no comments behind an entry, no quotes and no continued
# lines. Names of sections and keys are exact, capitals included.

[ProductInfo]
productCode = %s
patchName = %s
patchDescriptiveName = %s

# The level that the product has after the patch: version, release, modification, fix, two digits each.
productVer = %s
productRel = %s
productMod = %s
productLvl = %s

# The platform for the name of the archive; the installer goes by that name alone.
productBinArch = lpp266

# Products that must be installed, each with its lowest level:
#   [PreReqs]
#   ax = 06.10.00

# Products whose instances are stopped while files are replaced, besides the patched one; "all" means all agents:
#   [Dependents]
#   ax

# Commands lie beside this file, and run in the order of their bytes: number them. They have no arguments; the
# home is in QUILLHOME. PrePatchCommands run before instances are stopped, PreCommands before files are
# replaced, PostCommands before instances are started.
[PreCommands]
10-prepare.sh
)";

const char *const commandText = R"(#!/bin/sh
# Runs before files are replaced. A status other than 0 ends the patch; let it write little.
set -eu

exit 0
)";

std::string formatted(const char *format, const std::vector<std::string> &values) {
  std::string text = format;
  for (const std::string &value : values) {
    const std::size_t place = text.find("%s");
    text.replace(place, 2, value);
  }
  return text;
}

bool isLine(const std::string &text) {
  return std::none_of(text.begin(), text.end(), [](unsigned char c) { return std::iscntrl(c) != 0; });
}

bool isAlphanumeric(const std::string &text) {
  return std::all_of(text.begin(), text.end(), [](unsigned char c) { return std::isalnum(c) != 0; });
}

/// "06.10.00.02" or "06100002".
Version levelOf(const std::string &text) {
  std::string digits = text;
  digits.erase(std::remove(digits.begin(), digits.end(), '.'), digits.end());
  const bool isLevel =
      digits.size() == 8 &&
      std::all_of(digits.begin(), digits.end(), [](unsigned char c) { return std::isdigit(c) != 0; }) &&
      (text == digits || text == Version(digits).getDottedVersionString());
  if (!isLevel)
    throw JudgementError("no level such as 06.10.00.02: " + text);
  return Version(digits);
}

std::string productOf(const std::string &text) {
  const std::string product = Util::normalizeProductCode(text);
  if (product.size() != 3 || !isAlphanumeric(product))
    throw JudgementError("no product code such as kyn: " + text);
  return product;
}

void writeFile(const std::string &path, const std::string &text, mode_t mode) {
  std::ofstream file(path, std::ios::binary);
  file << text;
  file.close();
  if (!file || chmod(path.c_str(), mode) != 0)
    throw JudgementError("cannot write " + path);
}

void makeDirectory(const std::string &path) {
  if (mkdir(path.c_str(), 0777) != 0)
    throw JudgementError("cannot make " + path + ": " + strerror(errno));
}

std::string descriptorOf(const NewOptions &options) {
  const std::string product = productOf(options.product);
  const Version level = levelOf(options.level);
  const std::string name =
      options.name.empty() ? product + "_fp" + level.getMM() + level.getFF() : options.name;
  const std::string description = options.description.empty()
                                      ? "Fix pack " + level.getDottedVersionString() + " for " + product
                                      : options.description;
  if (!isLine(name) || !isLine(description))
    throw JudgementError("name and description are one line each");
  return formatted(descriptorFormat,
                   {product, name, description, level.getVV(), level.getRR(), level.getMM(), level.getFF()});
}

void make(const NewOptions &options, const OutputOptions &output) {
  const std::string descriptor = descriptorOf(options);
  const std::string folder = options.directory + "/";
  makeDirectory(options.directory);
  makeDirectory(folder + "updated_files");
  writeFile(folder + "patch.ini", descriptor, 0644);
  writeFile(folder + "10-prepare.sh", commandText, 0755);
  if (output.json)
    printDocument({{"directory", jsonText(options.directory)},
                   {"files", {"patch.ini", "10-prepare.sh", "updated_files"}}});
  else
    printf("%s: put the new files into updated_files, laid out like the home, and see patch.ini\n",
           terminalText(options.directory).c_str());
}

} // namespace

void addNew(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "new", "Make a source tree for a patch");
  const auto options = std::make_shared<NewOptions>();
  command->add_option("directory", options->directory, "The tree to make; it must not exist")
      ->required()
      ->option_text("DIR");
  command->add_option("--product", options->product, "Code of the product, such as kyn")
      ->required()
      ->option_text("CODE");
  command->add_option("--level", options->level, "Level after the patch, such as 06.10.00.02")
      ->required()
      ->option_text("LEVEL");
  command->add_option("--name", options->name, "Name for the history, at most 20 characters")
      ->option_text("NAME");
  command->add_option("--description", options->description, "Title for the report")->option_text("TEXT");
  command->callback([options, &invocation] { make(*options, invocation.output); });
}
