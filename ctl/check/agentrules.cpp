// The agents that the patches stop and start again: the run information that names them, their owners, the
// runner.
#include <algorithm>
#include <cctype>

#include <pwd.h>
#include <unistd.h>

#include "check/hostcheck.h"
#include "dependents.h"
#include "orvcomponentregistry.h"
#include "processes.h"
#include "utilities.h"

namespace {

const char *const shellCharacters = "`$;&|<>()'\"\\*?[]{}!# \t";

bool isNumber(const std::string &text) {
  return !text.empty() && text.find_first_not_of("0123456789") == std::string::npos;
}

/// One line of the run information, as the installer splits it.
class RunInfoLine {
public:
  RunInfoLine(const std::string &line, const std::string &separator)
      : fields_(Util::tokenizeString(line, separator.c_str())) {}

  bool isComplete() const { return fields_.size() >= 5; }
  const std::string &host() const { return fields_[0]; }
  const std::string &pid() const { return fields_[2]; }
  const std::string &instance() const { return fields_[3]; }

private:
  std::vector<std::string> fields_;
};

void checkLine(HostCheck &check, const std::string &text, const std::string &separator, std::size_t number) {
  const std::string where = "config/.ConfigData/RunInfo line " + std::to_string(number);
  const RunInfoLine line(text, separator);
  if (!line.isComplete())
    return check.add("runinfo-syntax", "", where, "Invalid line format: " + text);
  if (!isNumber(line.pid()))
    check.add("runinfo-syntax", "", where, "the process id is no number: " + line.pid());
  if (line.instance().find_first_of(shellCharacters) != std::string::npos)
    check.add("runinfo-syntax", "", where,
              "a shell would not take the instance name as it is: " + line.instance());
  const std::string here = Util::toLower(Util::getHostName());
  const std::string host = Util::toLower(line.host());
  if (host.rfind(here, 0) == 0 && host.size() > here.size() && host[here.size()] != '.')
    check.add("host-prefix", "", where, line.host() + " is taken for this host, " + here);
}

void checkRunInfo(HostCheck &check) {
  const std::string text = getCInfo_Running(check.home);
  const std::vector<std::string> lines = Util::tokenizeString(text, "\n");
  if (lines.empty())
    return;
  const std::vector<std::string> first = Util::tokenizeString(lines.front(), "=");
  if (first.size() < 2)
    return check.add("runinfo-syntax", "", "config/.ConfigData/RunInfo line 1",
                     "no field separator is declared: " + lines.front());
  for (std::size_t i = 1; i < lines.size(); ++i)
    checkLine(check, lines[i], first[1], i + 1);
}

/// One instance that would be stopped and started again.
void checkInstance(HostCheck &check, const Patch &patch, const DependentInstance &dependent) {
  const RunningInstance &instance = dependent.instance;
  uid_t user = 0;
  // The monitoring server is started as the runner, not as its former owner.
  if (dependent.code == "kqa" || !ownerOf(instance.pid, user))
    return;
  const std::string where = dependent.code + (instance.name.empty() ? "" : " " + instance.name);
  const passwd *const account = getpwuid(user);
  const std::string login = account == nullptr ? "" : account->pw_name;
  if (login.empty())
    return check.add("owner-unknown", patch.file, where,
                     "process " + instance.pid + " belongs to the user number " + std::to_string(user));
  if (user != geteuid() && geteuid() != 0)
    return check.add("wrong-user", patch.file, where, "the instance belongs to " + login);
  if (instance.user != login)
    check.add("owner-truncated", patch.file, where, "ps shows " + instance.user + " in place of " + login);
}

} // namespace

void checkAgents(HostCheck &check) {
  checkRunInfo(check);
  const std::vector<InstalledComponent> components = Home(check.home).components();
  for (const Patch &patch : check.patches)
    for (const DependentInstance &instance : dependentInstances(patch, components))
      checkInstance(check, patch, instance);
}
