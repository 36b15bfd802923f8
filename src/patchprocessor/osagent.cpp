// The restart rule of the OS agent: when an instance of it was stopped, the result of the attempt, good or
// bad, is written to a file for it, and its default instance is started.
#include "patchprocessor/patchprocessor.h"

#include <cerrno>
#include <cstring>

#include <fcntl.h>

#include "filedescriptor.h"
#include "logger.h"
#include "orvcomponentregistry.h"

#define LOG_COMPONENT "patchprocessor"

const std::string glbOsAgentPC = "kox";

bool PatchProcessor::startOSAgentIfNeeded(int resultCode, PatchError *err) {
  LOG_TRACE("PatchProcessor::startOSAgentIfNeeded() %s", "entry");
  bool result = true;
  if (!dependents_[glbOsAgentPC].empty()) {
    writeResultFile(resultCode);
    ORVComponent *const agent =
        ORVComponentRegistry::getInstance()->getInstalledComponent(glbOsAgentPC, ORVComponent::TYPE_AGENT);
    if (agent == nullptr) {
      LOG_TRACE("Could not get OSAgent from Registry");
    } else {
      // KEEP(osagent-default-instance): the default instance is started, whichever instances were stopped.
      result = agent->startInstance(ORVComponent::DEFAULT_INSTANCE, err);
    }
  }
  LOG_TRACE("PatchProcessor::startOSAgentIfNeeded() = %d", result);
  return result;
}

/// A missing depot does not prevent the start of the agent.
void PatchProcessor::writeResultFile(int resultCode) const {
  const std::string path = home_ + "vmaorv6/agentdepot/rc.txt";
  const FileDescriptor file(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC);
  int error = errno;
  if (file.isOpen()) {
    LOG_TRACE("Writing out: %s", path.c_str());
    if (file.write(std::to_string(resultCode)))
      return;
    error = errno;
  }
  LOG_TRACE("Unable to write file: %s. %s", path.c_str(), strerror(error));
}
