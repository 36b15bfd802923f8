// Run information: which instances it declares running, and which commands that makes the program run. The
// first byte chooses the product; every "@" after it stands for the name of this host.
#include <algorithm>

#include "fuzz.h"
#include "orvcomponent.h"
#include "standins.h"
#include "utilities.h"

namespace {

const std::string home = "/h/";

struct Expected {
  std::vector<std::string> instances;
  std::vector<Command> commands;
};

std::string withHost(const std::string &text) {
  std::string expanded;
  for (const char c : text)
    expanded += c == '@' ? Util::getHostName() : std::string(1, c);
  return expanded;
}

std::string instanceOf(const std::string &code, std::string field) {
  if (code == "xe" && fuzz::contains(field, "_"))
    field = field.substr(field.find('_') + 1);
  return field == "None" ? "" : field;
}

void readRow(const std::vector<std::string> &fields, const std::string &code, Expected &expected) {
  if (fields.size() < 5 || fields[1] != code ||
      !fuzz::startsWith(fuzz::lower(fields[0]), fuzz::lower(Util::getHostName())))
    return;
  const std::string &pid = fields[2];
  expected.commands.push_back({"ps", "-p", pid});
  if (!isKnownProcess(pid))
    return; // so that nothing but digits ever reaches the shell
  expected.commands.push_back({"/bin/sh", "-c", "ps -ef | grep -v grep | grep " + pid});
  expected.instances.push_back(instanceOf(code, fields[3]));
}

Expected read(const std::string &runInfo, const std::string &code) {
  Expected expected;
  const std::vector<std::string> rows = fuzz::pieces(runInfo, "\n");
  const std::vector<std::string> declaration = rows.empty() ? rows : fuzz::pieces(rows[0], "=");
  if (declaration.size() < 2)
    return expected;
  for (std::size_t i = 1; i < rows.size(); ++i)
    readRow(fuzz::pieces(rows[i], declaration[1]), code, expected);
  return expected;
}

/// Stops and starts an instance; what is asked of the control script is exactly this.
void checkControl(ORVComponent &component, const std::string &code, const std::string &instance) {
  const std::string option = code == "wn" ? "-p" : "-o";
  const auto count = [&component, &instance] {
    const std::vector<std::string> active = component.getActiveInstances();
    return std::count(active.begin(), active.end(), instance);
  };
  const auto before = count();
  PatchError error;
  REQUIRE(component.stopInstance(instance, &error) && error.code == PatchError::None);
  const Command stop = instance.empty() ? Command{home + "bin/QuillAgent", "stop", code}
                                        : Command{home + "bin/QuillAgent", option, instance, "stop", code};
  REQUIRE(takeCommands() == std::vector<Command>{stop});
  REQUIRE(count() == std::max<std::ptrdiff_t>(before - 1, 0));

  REQUIRE(component.startInstance(instance, &error) && error.code == PatchError::None);
  const std::string words = instance.empty() ? "" : option + " " + instance;
  const Command start = {"/bin/sh", "-c", home + "bin/QuillAgent " + words + " start " + code};
  REQUIRE(takeCommands() == std::vector<Command>{start});
  REQUIRE(count() == std::max<std::ptrdiff_t>(before - 1, 1));
}

} // namespace

void check(const std::string &input) {
  if (input.empty())
    return;
  const std::string code =
      std::vector<std::string>{"ox", "xe", "wn"}[static_cast<unsigned char>(input[0]) % 3];
  const std::string runInfo = withHost(input.substr(1));
  const Expected expected = read(runInfo, code);

  static_cast<void>(takeCommands());
  ORVComponent component(home, code, "D", "06100000", "lpp", {}, ORVComponent::TYPE_AGENT, runInfo);
  REQUIRE(component.getActiveInstances() == expected.instances);
  REQUIRE(takeCommands() == expected.commands);
  for (const std::string &instance : expected.instances)
    checkControl(component, code, instance);
  checkControl(component, code, "unknown");

  const ORVComponent other(home, "yn", "D", "06100000", "lpp", {}, ORVComponent::TYPE_CLI, runInfo);
  REQUIRE(other.getActiveInstances().empty() && takeCommands().empty());
}
