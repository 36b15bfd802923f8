#include "orvcomponent.h"

#include <algorithm>

#include "failure.h"
#include "process.h"
#include "utilities.h"

#define LOG_COMPONENT "orvcomponent"

const std::string ORVComponent::DEFAULT_INSTANCE;

namespace {

/// Fields of a line of the run information; further ones are not used.
enum RunInfoField { HostField, CodeField, PidField, InstanceField, UnusedField, FieldCount };

bool beginsWith(const std::string &text, const std::string &prefix) {
  return text.rfind(prefix, 0) == 0;
}

/// The instance name as the control scripts expect it.
std::string instanceName(const std::string &code, std::string instance) {
  const std::size_t underscore = instance.find('_');
  if (code == "xe" && underscore != std::string::npos) {
    instance.erase(0, underscore + 1);
    LOG_TRACE("adjusted instance name to %s", instance.c_str());
  }
  return instance == "None" ? ORVComponent::DEFAULT_INSTANCE : instance;
}

/// The owner of a process as `ps` shows it; empty when unknown.
std::string ownerOf(const std::string &pid) {
  CommandResult ps;
  if (!runCommand({"/bin/sh", "-c", "ps -ef | grep -v grep | grep " + pid}, ps)) {
    LOG_TRACE("unable to determine owner of process id: %s", pid.c_str());
    return "";
  }
  const std::vector<std::string> words = Util::tokenizeString(ps.out, " ");
  std::string owner = words.empty() ? "" : words.front();
  Util::trimString(owner);
  return owner;
}

} // namespace

bool isRunning(const std::string &pid, std::string &owner) {
  CommandResult ps;
  if (!runCommand({"ps", "-p", pid}, ps)) {
    LOG_TRACE("unable to running command");
    return false;
  }
  // KEEP(pid-substring): the id is searched for anywhere in the output, so "12" is found in "123", and an
  // empty id in any output: an instance without a process id counts as running.
  if (ps.out.find(pid) == std::string::npos)
    return false;
  owner = ownerOf(pid);
  return true;
}

ORVComponent::ORVComponent(const std::string &home, const std::string &code,
                           const std::string &descriptiveName, const std::string &versionText,
                           const std::string &arch, std::vector<std::string> prereqs, Type type,
                           const std::string &cinfo)
    : home_(home), name_(Util::normalizeProductCode(code)), descriptiveName_(descriptiveName), arch_(arch),
      type_(type), prereqs_(std::move(prereqs)), cinfo_(cinfo) {
  LOG_TRACE("ORVComponent::ORVComponent(%s) %s", code.c_str(), "entry");
  version_ = std::make_unique<Version>(versionText);
  if (type_ == TYPE_AGENT || name_ == "kqa" || name_ == "kpt")
    ORVComponent::initialize();
  LOG_TRACE("ORVComponent::ORVComponent() %s", "exit");
}

ORVComponent::ORVComponent(const ORVComponent &other)
    : home_(other.home_), name_(other.name_), descriptiveName_(other.descriptiveName_), arch_(other.arch_),
      type_(other.type_), version_(std::make_unique<Version>(*other.version_)),
      activeInstances_(other.activeInstances_), prereqs_(other.prereqs_), owners_(other.owners_),
      pids_(other.pids_), cinfo_(other.cinfo_) {}

void ORVComponent::initialize() {
  LOG_TRACE("ORVComponent::intialize %s", "entry");
  const std::string hostName = Util::toLower(Util::getHostName());
  const std::vector<std::string> lines = Util::tokenizeString(cinfo_, "\n");
  if (lines.empty())
    LOG_TRACE("no cinfo data");
  else
    readRunInfo(lines, hostName);
  LOG_TRACE("ORVComponent::initialize %s", "exit");
}

void ORVComponent::readRunInfo(const std::vector<std::string> &lines, const std::string &hostName) {
  const std::vector<std::string> declaration = Util::tokenizeString(lines.front(), "=");
  if (declaration.size() < 2)
    return; // without a separator no line can be read
  LOG_TRACE("FIELDSEP= %s", declaration[1].c_str());
  for (std::size_t i = 1; i < lines.size(); ++i)
    readRunInfoLine(lines[i], declaration[1], hostName);
}

void ORVComponent::readRunInfoLine(const std::string &line, const std::string &separator,
                                   const std::string &hostName) {
  const std::vector<std::string> fields = Util::tokenizeString(line, separator.c_str());
  if (fields.size() < FieldCount) {
    LOG_TRACE("Invalid line format: %s", line.c_str());
    return;
  }
  // KEEP(host-prefix): more may follow the local name in the host of the line, such as a domain; so host1
  // also accepts the lines of host12.
  const std::string host = Util::toLower(fields[HostField]);
  if (!beginsWith(host, hostName) || "k" + fields[CodeField] != name_)
    return;
  const std::string instance = instanceName(fields[CodeField], fields[InstanceField]);
  std::string owner;
  if (!isRunning(fields[PidField], owner))
    return;
  activeInstances_.push_back(instance);
  owners_[instance] = owner;
  pids_[instance] = fields[PidField];
}

std::string ORVComponent::lookUp(const std::map<std::string, std::string> &values,
                                 const std::string &instance) {
  const auto found = values.find(instance);
  return found == values.end() ? "" : found->second;
}

std::string ORVComponent::agentCode() const {
  return name_.empty() ? "" : name_.substr(1);
}

const char *ORVComponent::instanceOption() const {
  return name_ == "kwn" ? "-p" : "-o";
}

std::string ORVComponent::startCommandLine(const std::string &instance) const {
  const std::string option = instance.empty() ? "" : std::string(instanceOption()) + " " + instance;
  // KEEP(start-double-blank): without an instance two blanks stand before "start".
  return home_ + "bin/QuillAgent " + option + " start " + agentCode();
}

bool ORVComponent::startInstance(const std::string &instance, PatchError *err) {
  LOG_TRACE("startInstance(%s) %s", instance.c_str(), "entry");
  const bool started = start(instance, err);
  LOG_TRACE("startInstance(%s) %s", instance.c_str(), "exit");
  return started;
}

bool ORVComponent::start(const std::string &instance, PatchError *err) {
  const std::string owner = lookUp(owners_, instance);
  const std::string user = Util::getUserName();
  std::vector<std::string> command = {"/bin/sh", "-c"};
  if (!owner.empty() && owner != user) {
    if (user != "root") {
      if (err != nullptr)
        FAILURE(err, PatchError::CannotSwitchUser, "ERROR_START_CANT_SU", owner.c_str());
      return false;
    }
    command = {"/bin/su", "-", owner, "-c"};
  }
  command.push_back(startCommandLine(instance));
  if (runControl(command)) {
    addActiveInstance(instance);
    return true;
  }
  static const ControlFailure failure = {PatchError::CannotStartInstance, "ERROR_START_INST",
                                         PatchError::CannotStartAgent, "ERROR_START_AGENT"};
  return reportControlFailure(failure, instance, isNamed(instance), err);
}

bool ORVComponent::stopInstance(const std::string &instance, PatchError *err) {
  LOG_TRACE("stopInstance(%s) %s", instance.c_str(), "entry");
  const bool stopped = stop(instance, err);
  LOG_TRACE("stopInstance(%s) %s", instance.c_str(), "exit");
  return stopped;
}

// KEEP(stop-as-current-user): unlike a start, a stop goes neither through a shell nor through su.
bool ORVComponent::stop(const std::string &instance, PatchError *err) {
  std::vector<std::string> command = {home_ + "bin/QuillAgent"};
  if (!instance.empty())
    command.insert(command.end(), {instanceOption(), instance});
  command.insert(command.end(), {"stop", agentCode()});
  bool ran = false;
  if (runControl(command, &ran) || (ran && processHasGone(instance))) {
    removeActiveInstance(instance);
    return true;
  }
  static const ControlFailure failure = {PatchError::CannotStopInstance, "ERROR_STOP_INST",
                                         PatchError::CannotStopAgent, "ERROR_STOP_AGENT"};
  return reportControlFailure(failure, instance, isNamed(instance), err);
}

bool ORVComponent::processHasGone(const std::string &instance) const {
  std::string owner;
  if (isRunning(lookUp(pids_, instance), owner))
    return false;
  LOG_TRACE(
      "QuillAgent stop failed, but the Process ID is no longer active. Assuming agent is now not running");
  return true;
}

// KEEP(primary-unnamed): an agent's instance "Primary" is reported as if it were the default one.
bool ORVComponent::isNamed(const std::string &instance) {
  return instance != DEFAULT_INSTANCE && instance != "Primary";
}

bool ORVComponent::runControl(const std::vector<std::string> &command, bool *ran) const {
  CommandResult control;
  const bool couldRun = runCommand(command, control);
  if (ran != nullptr)
    *ran = couldRun;
  if (!couldRun)
    return false;
  LOG_TRACE("return code: %d", control.rc);
  LOG_TRACE("stdout: %s", control.out.c_str());
  LOG_TRACE("stderr: %s", control.err.c_str());
  return control.rc == 0;
}

bool ORVComponent::reportControlFailure(const ControlFailure &failure, const std::string &instance,
                                        bool named, PatchError *err) const {
  // KEEP(null-record-silent): without a record the error is not logged either.
  if (err == nullptr)
    return false;
  const char *const product = descriptiveName_.c_str();
  // The texts name the product once or twice; it is always passed twice.
  if (named)
    return FAILURE(err, failure.instanceCode, failure.instanceKey, instance.c_str(), product, product);
  return FAILURE(err, failure.defaultCode, failure.defaultKey, product, product);
}

void ORVComponent::addActiveInstance(const std::string &instance) {
  if (std::find(activeInstances_.begin(), activeInstances_.end(), instance) == activeInstances_.end())
    activeInstances_.push_back(instance);
}

void ORVComponent::removeActiveInstance(const std::string &instance) {
  const auto found = std::find(activeInstances_.begin(), activeInstances_.end(), instance);
  if (found != activeInstances_.end())
    activeInstances_.erase(found);
}

UNIXMonitoringServer::UNIXMonitoringServer(const std::string &home, const std::string &code,
                                           const std::string &descriptiveName, const std::string &versionText,
                                           const std::string &arch, std::vector<std::string> prereqs,
                                           const std::string &cinfo)
    : ORVComponent(home, code, descriptiveName, versionText, arch, std::move(prereqs), TYPE_VEMS, cinfo) {}

bool UNIXMonitoringServer::startInstance(const std::string &instance, PatchError *err) {
  LOG_TRACE("startInstance(%s) %s", instance.c_str(), "entry");
  // KEEP(server-instance-code): 19 serves for a named instance's start and stop alike; no code 17 is given.
  static const ControlFailure failure = {PatchError::ServerInstanceFailed, "ERROR_START_SRV_INST",
                                         PatchError::CannotStartServer, "ERROR_START_SERVER"};
  const bool started = runControl({home() + "bin/QuillServer", "start", instance});
  if (started)
    addActiveInstance(instance);
  else
    reportControlFailure(failure, instance, !instance.empty(), err);
  LOG_TRACE("startInstance(%s) %s", instance.c_str(), "exit");
  return started;
}

// KEEP(server-stop-unchecked): unlike for an agent, a failing script is a failure whether or not the process
// has gone: only its script decides whether a server is stopped.
bool UNIXMonitoringServer::stopInstance(const std::string &instance, PatchError *err) {
  LOG_TRACE("stopInstance(%s) %s", instance.c_str(), "entry");
  static const ControlFailure failure = {PatchError::ServerInstanceFailed, "ERROR_STOP_SRV_INST",
                                         PatchError::CannotStopServer, "ERROR_STOP_SERVER"};
  const bool stopped = runControl({home() + "bin/QuillServer", "stop", instance});
  if (stopped)
    removeActiveInstance(instance);
  else
    reportControlFailure(failure, instance, !instance.empty(), err);
  LOG_TRACE("stopInstance(%s) %s", instance.c_str(), "exit");
  return stopped;
}
