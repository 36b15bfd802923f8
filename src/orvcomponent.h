// An installed component: its identity, its running instances on this host, and how to start and stop one.
//
// The running instances are read from the run information once, at construction; starts and stops of this run
// update the list. The control scripts belong to the product, under bin/ of the home.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "nls.h"
#include "version.h"

class ORVComponent {
public:
  /// Kind of component; the numbers are part of the design.
  enum Type { TYPE_AGENT = 0, TYPE_VEMS = 1, TYPE_VEPS = 2, TYPE_VEPD = 3, TYPE_CLI = 4 };

  /// The default, unnamed instance of a component: the empty name.
  static const std::string DEFAULT_INSTANCE;

  /// home             ends in "/"
  /// code             product code; lower-cased, and "k" put before a two-letter code
  /// descriptiveName  for messages
  /// versionText      see Version::set
  /// arch             may be empty
  /// cinfo            whole text of the run information
  ORVComponent(const std::string &home, const std::string &code, const std::string &descriptiveName,
               const std::string &versionText, const std::string &arch, std::vector<std::string> prereqs,
               Type type, const std::string &cinfo);
  ORVComponent(const ORVComponent &other);
  ORVComponent &operator=(const ORVComponent &) = delete;
  virtual ~ORVComponent() = default;

  /// Runs "bin/QuillAgent [-o|-p instance] start code" through a shell, as the owner of the instance when the
  /// tool runs as root. Codes 12 and 13, and 20 (ERROR_START_CANT_SU) when another user owns the instance and
  /// the tool may not switch. A null record suppresses the error's log line too.
  virtual bool startInstance(const std::string &instance, PatchError *err);
  /// Runs "bin/QuillAgent [-o|-p instance] stop code" directly. A failing script whose process has gone
  /// counts as success. Codes 14 and 15.
  virtual bool stopInstance(const std::string &instance, PatchError *err);
  /// Reads the active instances, their owners and process ids from the run information.
  virtual void initialize();

  std::string getName() const { return name_; }
  std::string getDescriptiveName() const { return descriptiveName_; }
  std::string getArch() const { return arch_; }
  Type getType() const { return type_; }
  Version *getVersion() const { return version_.get(); } ///< owned by the component
  std::vector<std::string> getActiveInstances() const { return activeInstances_; }
  std::vector<std::string> getPrereqs() const { return prereqs_; }
  /// Process id of an active instance from the run information, and its owner from `ps`; empty for an
  /// instance that was not found running.
  std::string getPid(const std::string &instance) const { return lookUp(pids_, instance); }
  std::string getOwner(const std::string &instance) const { return lookUp(owners_, instance); }
  /// Who is to own an instance when it is started again, for a caller that knows it from a record.
  void setOwner(const std::string &instance, const std::string &owner) { owners_[instance] = owner; }

protected:
  /// How a failed start or stop is reported: with the instance's name or without.
  struct ControlFailure {
    PatchError::Code instanceCode;
    const char *instanceKey;
    PatchError::Code defaultCode;
    const char *defaultKey;
  };

  /// Runs a control command and traces its results; true for exit status 0. `ran`, when given, is false if it
  /// could not be run.
  bool runControl(const std::vector<std::string> &command, bool *ran = nullptr) const;
  /// Fills the record and logs, unless the record is null; always false.
  bool reportControlFailure(const ControlFailure &failure, const std::string &instance, bool named,
                            PatchError *err) const;
  void addActiveInstance(const std::string &instance);
  void removeActiveInstance(const std::string &instance);
  const std::string &home() const { return home_; }

private:
  static std::string lookUp(const std::map<std::string, std::string> &values, const std::string &instance);
  static bool isNamed(const std::string &instance);

  void readRunInfo(const std::vector<std::string> &lines, const std::string &hostName);
  void readRunInfoLine(const std::string &line, const std::string &separator, const std::string &hostName);
  std::string agentCode() const;
  const char *instanceOption() const;
  std::string startCommandLine(const std::string &instance) const;
  bool start(const std::string &instance, PatchError *err);
  bool stop(const std::string &instance, PatchError *err);
  bool processHasGone(const std::string &instance) const;

  std::string home_;
  std::string name_;
  std::string descriptiveName_;
  std::string arch_;
  Type type_;
  std::unique_ptr<Version> version_;
  std::vector<std::string> activeInstances_;
  std::vector<std::string> prereqs_;
  std::map<std::string, std::string> owners_;
  std::map<std::string, std::string> pids_;
  std::string cinfo_;
};

/// The monitoring server, kqa: a component that bin/QuillServer starts and stops, always directly and as the
/// current user, with the instance as an argument even when it is empty. Codes 16, 18 and 19.
class UNIXMonitoringServer : public ORVComponent {
public:
  UNIXMonitoringServer(const std::string &home, const std::string &code, const std::string &descriptiveName,
                       const std::string &versionText, const std::string &arch,
                       std::vector<std::string> prereqs, const std::string &cinfo);

  bool startInstance(const std::string &instance, PatchError *err) override;
  bool stopInstance(const std::string &instance, PatchError *err) override;
};

/// Whether `ps` knows the process id; then `owner` receives the first word of its line in `ps -ef`.
bool isRunning(const std::string &pid, std::string &owner);
