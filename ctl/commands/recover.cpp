// recover: in which states a home is after an installation that did not end, and what can be done about them.
#include <algorithm>
#include <cstdio>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "homelock.h"
#include "processes.h"
#include "recovery/fixing.h"
#include "recovery/states.h"
#include "signals.h"
#include "table.h"
#include "text.h"

using Json = nlohmann::ordered_json;

namespace {

/// Nothing is left to do in them.
bool isSound(const HomeState &state) {
  return state.fixed || state.state == "nothing-applied" || state.state == "applied";
}

/// What a state asks for, also after an attempt to fix it.
const char *remedyOf(const HomeState &state, bool hasRecord, bool isTried) {
  if (state.fixed)
    return "fixed";
  if (isSound(state))
    return "nothing to do";
  const bool isRepetitions =
      state.state == "files-mixed" || state.state == "level-old" || state.state == "history-missing";
  if (isRepetitions)
    return hasRecord ? "undo, or apply again" : "give the same command again";
  return isTried ? "see the messages" : "recover --fix";
}

Json nullIfEmpty(const Json &text) {
  return text.is_string() && text.get<std::string>().empty() ? Json(nullptr) : text;
}

/// The record's fields, of which those that nothing tells are null.
Json documentOf(const Interruption &found, const std::vector<HomeState> &states) {
  Json document = toJson(found.record);
  for (const char *field : {"id", "action", "user", "started"})
    document[field] = nullIfEmpty(document[field]);
  if (!found.hasRecord) {
    document["phase"] = nullptr;
    document["installer"] = nullptr;
    if (found.log.status)
      document["installer"] = {{"status", *found.log.status}, {"stdout", nullptr}, {"stderr", nullptr}};
  }
  for (const std::string &message : found.messages)
    document["messages"].push_back(jsonText(message));
  Json list = Json::array();
  for (const HomeState &state : states)
    list.push_back({{"state", state.state}, {"path", jsonText(state.path)}, {"fixed", state.fixed}});
  document["states"] = list;
  return document;
}

void print(const Interruption &found, const std::vector<HomeState> &states, bool isTried) {
  if (found.hasRecord)
    printf("transaction %s did not end\n", found.record.id.c_str());
  else if (found.log.isInterrupted && found.log.status)
    printf("the last installation ended with status %d\n", *found.log.status);
  else if (found.log.isInterrupted)
    printf("the last installation did not end\n");
  else
    printf("every installation has ended well\n");
  Table table({"STATE", "PATH", "REMEDY"});
  for (const HomeState &state : states)
    table.add({state.state, terminalText(state.path), remedyOf(state, found.hasRecord, isTried)});
  table.print();
  for (const std::string &message : found.messages)
    printf("%s\n", terminalText(message).c_str());
}

void recover(const std::string &path, bool isToFix, Invocation &invocation) {
  const Home home(path);
  const HomeLock lock(home.path());
  demandNoRun(home.path());
  Interruption found = findInterruption(home);
  std::vector<HomeState> states = tellStates(home, found);
  if (isToFix) {
    outlastInterruptions();
    fixStates(home, found, states, found.messages);
  }
  if (invocation.output.json)
    printDocument(documentOf(found, states));
  else
    print(found, states, isToFix);
  const bool isSoundHome = found.isWhole && std::all_of(states.begin(), states.end(), isSound);
  invocation.status = isSoundHome ? Good : Findings;
}

} // namespace

void addRecover(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "recover",
                                       "Tell what an installation that did not end has left, and mend it");
  const std::shared_ptr<std::string> home = addHome(*command);
  const auto fix = std::make_shared<bool>(false);
  command->add_flag("--fix", *fix, "Do what no repetition of the installation does");
  command->callback([home, fix, &invocation] { recover(*home, *fix, invocation); });
}
