// undo: a transaction taken back.
#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "transaction/summary.h"
#include "transaction/undoing.h"

void addUndo(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "undo",
                                       "Take a transaction back: the newest one, or the one that is named");
  const std::shared_ptr<std::string> home = addHome(*command);
  const auto id = std::make_shared<std::string>();
  command->add_option("id", *id, "The transaction's name")->option_text("[ID]");
  command->callback([home, id, &invocation] {
    const Record record = undoTransaction(Home(*home), *id);
    if (invocation.output.json)
      printDocument(toJson(record));
    else
      printRecord(record, invocation.output);
    invocation.status = record.verdict == "undone" ? Good : DifferencesFound;
  });
}
