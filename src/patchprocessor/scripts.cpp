// The commands of a patch, run at three fixed points from the extracted archive.
#include "patchprocessor/patchprocessor.h"

#include <cstdlib>

#include "failure.h"
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

/// KEEP(script-code-replaced): the code of a failed list is that of its place in the sequence, whatever the
/// reason; the text stays.
bool withCode(PatchError::Code code, bool result, PatchError *err) {
  if (!result && err != nullptr)
    err->code = code;
  return result;
}

/// Runs one command.
/// KEEP(command-is-program): the whole text is the name of the program, blanks included; no shell interprets
/// it.
bool runScript(const std::string &command, PatchError *err) {
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
  const bool result =
      withCode(PatchError::PrePatchScriptFailed, runIfAny(descriptor_->getPrePatchCommands(), err), err);
  LOG_TRACE("PatchProcessor::runPrePatchScripts() = %d", result);
  return result;
}

bool PatchProcessor::runPreScripts(PatchError *err) {
  LOG_TRACE("PatchProcessor::runPreScripts() %s", "entry");
  const bool result =
      withCode(PatchError::PreScriptFailed, runIfAny(descriptor_->getPreCommands(), err), err);
  LOG_TRACE("PatchProcessor::runPreScripts() = %d", result);
  return result;
}

bool PatchProcessor::runPostScripts(PatchError *err) {
  LOG_TRACE("PatchProcessor::runPostScripts() %s", "entry");
  const bool result =
      withCode(PatchError::PostScriptFailed, runIfAny(descriptor_->getPostCommands(), err), err);
  LOG_TRACE("PatchProcessor::runPostScripts() %d", result);
  return result;
}

bool PatchProcessor::runIfAny(const std::vector<std::string> &commands, PatchError *err) {
  return commands.empty() || runScripts(commands, err);
}

bool PatchProcessor::runScripts(std::vector<std::string> commands, PatchError *err) {
  LOG_TRACE("PatchProcessor::runScripts() %s", "entry");
  const bool result = runCommands(commands, err);
  LOG_TRACE("PatchProcessor::runScripts() = %d", result);
  return result;
}

bool PatchProcessor::runCommands(const std::vector<std::string> &commands, PatchError *err) {
  const std::string previousDirectory = Util::getCurrentDirectory();
  const std::string directory = Util::getTempDir(descriptor_->getProductCode());
  const PathWith path(directory);
  if (!Util::setCurrentDirectory(directory))
    return FAILURE(err, PatchError::CannotChangeDirectory, "ERROR_PP_SET_CWD", directory.c_str());
  LOG_INFO_MESSAGE("PP_SCRIPT_COUNT", static_cast<int>(commands.size()));
  bool result = true;
  for (std::size_t i = 0; result && i < commands.size(); ++i)
    result = runScript(commands[i], err);
  if (!Util::setCurrentDirectory(previousDirectory))
    result = FAILURE(err, PatchError::CannotChangeDirectory, "ERROR_PP_SET_CWD", previousDirectory.c_str());
  return result;
}
