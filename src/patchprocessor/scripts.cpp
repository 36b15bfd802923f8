// The commands of a patch, run at three fixed points from the extracted archive.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <cstdlib>

#include "failure.h"
#include "patchprocessor/workingdirectory.h"
#include "process.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

/// Keeps a directory at the front of PATH during its lifetime.
class PathWith {
public:
  explicit PathWith(const std::string &directory) {
    const char *const path = getenv("PATH");
    oldPath_ = path == nullptr ? "" : path;
    LOG_TRACE("old PATH=%s", oldPath_.c_str());
    const std::string newPath = directory + ":" + oldPath_;
    LOG_TRACE("Setting %s", ("PATH=" + newPath).c_str());
    Util::setEnvironment("PATH", newPath);
  }
  PathWith(const PathWith &) = delete;
  PathWith &operator=(const PathWith &) = delete;
  ~PathWith() {
    LOG_TRACE("Restoring %s", ("PATH=" + oldPath_).c_str());
    Util::setEnvironment("PATH", oldPath_);
  }

private:
  std::string oldPath_;
};

/// Runs one command.
/// KEEP(command-is-program): the whole text is the name of the program, blanks included; no shell interprets
/// it.
bool execute(const std::string &command, PatchError *err) {
  LOG_INFO_MESSAGE("PP_PROCESS_SCRIPT", command.c_str());
  CommandResult script;
  if (!runCommand({command}, script))
    return FAILURE(err, PatchError::ScriptFailed, "PROC_CANT_RUN", command.c_str());
  if (script.rc != 0) {
    FAILURE(err, PatchError::ScriptFailed, "PROC_BAD_RC", command.c_str(), script.rc);
    LOG_ERROR("stdOut: %s", script.out.c_str());
    LOG_ERROR("stdErr: %s", script.err.c_str());
    return false;
  }
  LOG_INFO_MESSAGE("PP_SCRIPT_COMPLETE", command.c_str());
  LOG_TRACE("stdOut: %s", script.out.c_str());
  LOG_TRACE("stdErr: %s", script.err.c_str());
  return true;
}

} // namespace

bool PatchProcessor::runPrePatchScripts(PatchError *err) {
  LOG_TRACE("PatchProcessor::runPrePatchScripts() %s", "entry");
  const bool result = runList(descriptor_->getPrePatchCommands(), PatchError::PrePatchScriptFailed, err);
  LOG_TRACE("PatchProcessor::runPrePatchScripts() = %d", result);
  return result;
}

bool PatchProcessor::runPreScripts(PatchError *err) {
  LOG_TRACE("PatchProcessor::runPreScripts() %s", "entry");
  const bool result = runList(descriptor_->getPreCommands(), PatchError::PreScriptFailed, err);
  LOG_TRACE("PatchProcessor::runPreScripts() = %d", result);
  return result;
}

bool PatchProcessor::runPostScripts(PatchError *err) {
  LOG_TRACE("PatchProcessor::runPostScripts() %s", "entry");
  const bool result = runList(descriptor_->getPostCommands(), PatchError::PostScriptFailed, err);
  LOG_TRACE("PatchProcessor::runPostScripts() %d", result);
  return result;
}

/// KEEP(script-code-replaced): the code of a failed list is that of its place in the sequence, whatever the
/// reason; the text stays.
bool PatchProcessor::runList(const std::vector<std::string> &commands, PatchError::Code code,
                             PatchError *err) {
  const bool result = commands.empty() || runScripts(commands, err);
  if (!result && err != nullptr)
    err->code = code;
  return result;
}

bool PatchProcessor::runScripts(std::vector<std::string> commands, PatchError *err) {
  LOG_TRACE("PatchProcessor::runScripts() %s", "entry");
  bool result = false;
  { // the search path is restored before the result is traced
    const std::string directory = contentDir();
    const PathWith path(directory);
    WorkingDirectory workingDirectory;
    if (workingDirectory.enter(directory, err)) {
      LOG_INFO_MESSAGE("PP_SCRIPT_COUNT", static_cast<int>(commands.size()));
      result = std::all_of(commands.begin(), commands.end(),
                           [err](const std::string &command) { return execute(command, err); });
      result = workingDirectory.leave(err) && result;
    }
  }
  LOG_TRACE("PatchProcessor::runScripts() = %d", result);
  return result;
}
