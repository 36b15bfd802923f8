#include "commands/command.h"

#include <CLI/CLI.hpp>

CLI::App *addCommand(CLI::App &application, Invocation &invocation, const std::string &name,
                     const std::string &description) {
  CLI::App *const command = application.add_subcommand(name, description);
  command->add_flag("--json", invocation.output.json, "One JSON document on standard output");
  command
      ->add_option("--color", invocation.output.color,
                   "Colours: auto (on a terminal, unless NO_COLOR is set), always or never")
      ->transform(CLI::CheckedTransformer(std::map<std::string, ColorMode>{
          {"auto", ColorMode::Auto}, {"always", ColorMode::Always}, {"never", ColorMode::Never}}))
      ->option_text("WHEN");
  return command;
}

std::shared_ptr<std::string> addHome(CLI::App &command) {
  auto path = std::make_shared<std::string>();
  command.add_option("home", *path, "Directory in which the product is installed")
      ->required()
      ->option_text("HOME");
  return path;
}

void addInstallerOptions(CLI::App &command, InstallerOptions &options) {
  command
      .add_option("--installer", options.file,
                  "The installer to run, in place of the one beside this program")
      ->option_text("FILE");
  command.add_option("--path", options.searchPath, "Where the installer's tools are looked for")
      ->option_text("LIST");
}
