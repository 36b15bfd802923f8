// status: what is installed in a home, what of it runs, and what the last patch of each product came to.
#include <algorithm>
#include <cctype>
#include <charconv>
#include <cstdio>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "history.h"
#include "home.h"
#include "table.h"
#include "target.h"
#include "text.h"
#include "utilities.h"

namespace {

using Json = nlohmann::ordered_json;

/// Whether the attempt was made on this component: of this kind, and the command line is one component
/// whatever the code of its patches; its own platform, but for a server's support, which has none.
bool concerns(const HistoryRecord &record, const InstalledComponent &component) {
  const ORVComponent::Type kind = targetKind(record.target);
  if (kind != component.type)
    return false;
  const bool isCommandLine = kind == ORVComponent::TYPE_CLI;
  const bool isSupport =
      component.platform == "vms" || component.platform == "vps" || component.platform == "vpd";
  return (isCommandLine || Util::toLower(record.product) == component.code) &&
         (isSupport || record.platform == component.platform);
}

const HistoryRecord *lastPatchOf(const InstalledComponent &component, const History &history) {
  const auto found =
      std::find_if(history.records.rbegin(), history.records.rend(),
                   [&component](const HistoryRecord &record) { return concerns(record, component); });
  return found == history.records.rend() ? nullptr : &*found;
}

/// A number; null for what the run information holds in its place.
Json pidOf(const RunningInstance &instance) {
  long number = 0;
  const char *const end = instance.pid.data() + instance.pid.size();
  const auto [rest, error] = std::from_chars(instance.pid.data(), end, number);
  return error == std::errc() && rest == end ? Json(number) : Json(nullptr);
}

Json instancesOf(const InstalledComponent &component) {
  Json list = Json::array();
  for (const RunningInstance &instance : component.instances)
    list.push_back(
        {{"name", jsonText(instance.name)}, {"pid", pidOf(instance)}, {"user", jsonText(instance.user)}});
  return list;
}

Json documentOf(const HistoryRecord *record) {
  if (record == nullptr)
    return nullptr;
  return {{"name", jsonText(record->name)},
          {"result", record->result},
          {"time", record->time.empty() ? Json(nullptr) : Json(record->time)}};
}

Json documentOf(const Home &home, const std::vector<InstalledComponent> &components,
                const std::vector<std::string> &leftovers, const History &history) {
  Json list = Json::array();
  for (const InstalledComponent &component : components)
    list.push_back({{"code", jsonText(component.code)},
                    {"name", jsonText(component.name)},
                    {"kind", kindName(component.type)},
                    {"level", jsonText(component.level)},
                    {"platform", jsonText(component.platform)},
                    {"instances", instancesOf(component)},
                    {"lastPatch", documentOf(lastPatchOf(component, history))}});
  Json paths = Json::array();
  for (const std::string &path : leftovers)
    paths.push_back(jsonText(path));
  return {{"home", jsonText(home.path())}, {"components", list}, {"leftovers", paths}};
}

std::string lineOf(const HistoryRecord *record) {
  return record == nullptr ? "-" : record->result + " " + terminalText(record->name) + ", " + record->time;
}

void printComponents(const std::vector<InstalledComponent> &components, const History &history) {
  Table table({"CODE", "KIND", "PLATFORM", "LEVEL", "RUNNING", "LAST PATCH", "NAME"});
  for (const InstalledComponent &component : components)
    table.add({terminalText(component.code), kindName(component.type), terminalText(component.platform),
               terminalText(component.level), std::to_string(component.instances.size()),
               lineOf(lastPatchOf(component, history)), terminalText(component.name)});
  if (table.isEmpty())
    printf("Nothing is installed.\n");
  table.print();
}

void printInstances(const std::vector<InstalledComponent> &components) {
  Table table({"RUNNING", "INSTANCE", "PID", "USER"});
  for (const InstalledComponent &component : components)
    for (const RunningInstance &instance : component.instances)
      table.add({terminalText(component.code), instance.name.empty() ? "-" : terminalText(instance.name),
                 terminalText(instance.pid), terminalText(instance.user)});
  if (table.isEmpty())
    return;
  printf("\n");
  table.print();
}

void printLeftovers(const std::vector<std::string> &leftovers, const Palette &palette) {
  if (leftovers.empty())
    return;
  printf("\n%s\n",
         palette.warning("Left over from a run that did not end, or in use by one that has not:").c_str());
  for (const std::string &path : leftovers)
    printf("  %s\n", terminalText(path).c_str());
}

void status(const std::string &path, const Invocation &invocation) {
  const Home home(path);
  const std::vector<InstalledComponent> components = home.components();
  const std::vector<std::string> leftovers = home.leftovers();
  const History history = readHistory(home.path());
  if (invocation.output.json) {
    printDocument(documentOf(home, components, leftovers, history));
    return;
  }
  printf("%s\n\n", terminalText(home.path()).c_str());
  printComponents(components, history);
  printInstances(components);
  printLeftovers(leftovers, Palette(invocation.output));
}

} // namespace

void addStatus(CLI::App &application, Invocation &invocation) {
  CLI::App *const command =
      addCommand(application, invocation, "status",
                 "Print what is installed in a home, what of it runs, and the last patches");
  const std::shared_ptr<std::string> path = addHome(*command);
  command->callback([path, &invocation] { status(*path, invocation); });
}
