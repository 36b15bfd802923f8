#include "nls.h"

#include <cstdio>
#include <map>

bool glbInitialized = false;

namespace {

std::map<std::string, std::string> catalogue;

struct Entry {
  const char *key;
  const char *text;
};

// In the order of filling. Scripts read the texts: neither spelling nor blanks may be corrected.
// PP_CAB_EXTRACT, ERROR_PP_COPY_PRODEXE and PP_LIST_PRODEXES are kept for features that this version does not
// have.
const Entry entries[] = {
    {"MAIN_SUCCESSFUL", "Command completed successfully."},
    {"MAIN_NOT_SUCCESSFUL",
     "Command completed with errors. For more information, see the orvpatch.log file under:\n"
     "%s"},
    {"LOG_CANT_WRITE", "Unable to write to log file: %s"},
    {"ERROR_INIFILE_PARSE", "Unable to parse ini file: %s"},
    {"ERROR_INIFILE_PROP", "Properites start before section definition"},
    {"ERROR_INIFILE_CANT_READ", "Unable to read file [%s]: %s"},
    {"ERROR_PATCH_PARSE", "Error parsing patch file"},
    {"ERROR_PATCH_MISSING_SECTION", "Missing required section: %s"},
    {"ERROR_PATCH_MISSING_PROP", "Missing required property: %s"},
    {"PROC_CANT_RUN", "Unable to run %s"},
    {"PROC_BAD_RC", "Bad return code from %s: %d"},
    {"ERROR_ORV_HOME", "Invalid path to ORV home: %s"},
    {"ERROR_START_AGENT", "Unable to start agent for product %s."},
    {"ERROR_START_INST", "Unable to start instance %s of agent for product %s."},
    {"ERROR_STOP_AGENT",
     "Unable to stop agent for product %s.  The agent for product %s may be running under a "
     "different userid and must be manually stopped before applying the patch."},
    {"ERROR_STOP_INST",
     "Unable to stop instance %s of agent for product %s.  The agent for product %s may be "
     "running under a different userid and must be manually stopped before applying the patch."},
    {"ERROR_START_CANT_SU", "Unable to su to user: %s"},
    {"ERROR_START_SERVER", "Unable to start server for product %s."},
    {"ERROR_START_SRV_INST", "Unable to start instance %s of server for product %s."},
    {"ERROR_STOP_SERVER",
     "Unable to stop server for product %s.  The server for product %s may be running under a "
     "different userid and must be manually stopped before applying the patch."},
    {"ERROR_STOP_SRV_INST",
     "Unable to stop instance %s of server for product %s.  The server for product %s may be "
     "running under a different userid and must be manually stopped before applying the patch."},
    {"ERROR_PP_OLD_PATCH", "Can't install backlevel patch version: %s. Installed version is %s"},
    {"ERROR_PP_MISSING_PROD",
     "The following product code %s for the product being updated cannot be located in the .ver "
     "files and therefore, may not be installed at this time.  Verify the product you are "
     "attempting to update is actually installed on this system."},
    {"ERROR_PP_MISSING_PREREQ", "Missing patch prerequisite: %s"},
    {"ERROR_PP_PREREQ_VER", "Incorrect prerequisite version for %s. Installed = %s, required = %s."},
    {"PP_CAB_EXTRACT", "Unable to extract CAB file %s: %d"},
    {"PP_SCRIPT_COUNT", "Processing %d scripts."},
    {"PP_TEST_PREPATCHSCRIPT", "The following commands will be executed before agent instances are stopped:"},
    {"PP_TEST_PRESCRIPT", "The following commands will be executed after agent instances are stopped:"},
    {"PP_TEST_POSTSCRIPT",
     "The following commands will be executed before restarting any previously stopped agents:"},
    {"PP_TEST_NO_PREPATCHSCRIPT", "No commands to be executed before the agent instances are stopped."},
    {"PP_TEST_NO_PRESCRIPT", "No commands to be executed after stopping the agent instances."},
    {"PP_TEST_NO_POSTSCRIPT", "No commands to be executed before starting the agent instances."},
    {"PP_PROCESS_SCRIPT", "Attempting to execute: %s"},
    {"PP_SCRIPT_COMPLETE", "Successfully executed: %s"},
    {"ERROR_PP_SET_CWD", "Could not change current working directory to: %s"},
    {"ERROR_PP_MOVE_FILE",
     "Could not move file %s to %s. Either the product being updated is still running or the file "
     "permissions are restricting access to the file. Verify the product has been stopped and the "
     "file permissions are not restricting access and then re-apply the patch."},
    {"PP_NO_FILES", "This patch contains no files to update."},
    {"PP_MOVE_FILES", "Will attempt to move files from %s to %s"},
    {"PP_LIST_FILES", "The following files will be installed or replaced with new files:"},
    {"PP_MOVE_FILE", "Successfully moved file from %s to %s"},
    {"PP_MAKE_DIR", "Creating new directory: %s"},
    {"ERROR_PP_MAKE_DIR", "Unable to create directory: %s"},
    {"ERROR_PP_RM_DIR", "Unable to remove temporary directory: %s"},
    {"ERROR_PP_UPDATE_VRMF", "Could not update VRMF for %s: %s"},
    {"ERROR_PP_UPDATE_HIST", "Unable to update patch history file, %s: %s"},
    {"ERROR_PP_INITIALIZE", "Can't initialize patch."},
    {"PP_NO_RUNNING_INST", "No instances of running dependent agents to stop or restart."},
    {"PP_LIST_AGENT_INST",
     "The following agent instances will be stopped during the patch application and restarted "
     "afterwards:"},
    {"ERROR_PP_COPY_PRODEXE", "An attempt to copy %s to %s failed."},
    {"PP_LIST_PRODEXES", "The following files will be updated with a new copy of %s"},
    {"DCFPP_PROCESS_DIR", "Processing patch files in directory: %s"},
    {"DCFPP_TEST_NO_PATCH", "There are no patch files applicable to this system."},
    {"DCFPP_PROCESS_PATCH", "Processing patch file: %s"},
    {"ERROR_DCFPP_PATH", "Unable to locate path or file specified: %s"},
    {"ERROR_DCFPP_NO_FILES", "Unable to locate patch files in directory specified: %s"},
    {"ERROR_DCFPP_NO_APPLICABLE", "Unable to locate or install patch files which are applicable to this\n"
                                  "system in the directory specified: %s."},
    {"DCFPP_NOT_APPLICABLE", "File is not an applicable patch and will be ignored: %s"},
    {"ERROR_DCFPP_NOT_APPLICABLE",
     "The patch file %s can not be installed.  Either the current platform architecture or the "
     "installed components do not meet the prerequisites of the patch."},
    {"ERROR_VEMS_RUNNING", "The %s file\n"
                           "includes updates for the Veyra Enterprise Monitoring Server. The server\n"
                           "is currently running and must be stopped before the updates can be\n"
                           "applied. The updates will not be applied at this time. Please stop the\n"
                           "server before attempting to install this patch again."},
    {"ERROR_VEPS_RUNNING", "The %s file\n"
                           "includes updates for the Veyra Enterprise Portal Server. The server is\n"
                           "currently running and must be stopped before the updates can be applied.\n"
                           " The updates will not be applied at this time. Please stop the server\n"
                           "before attempting to install this patch again."},
    {"ERROR_MVEMS_RUNNING", "The %s file\n"
                            "includes updates for the Manage Veyra Enterprise Monitoring Services\n"
                            "console. The console is currently running and must be stopped before the\n"
                            "updates can be applied. The updates will not be applied at this time.\n"
                            "Please stop the console before attempting to install this patch again."},
};

void fillCatalogue() {
  for (const Entry &entry : entries)
    catalogue[entry.key] = entry.text;
}

} // namespace

std::string NLS::getString(const char *key) {
  if (!glbInitialized) {
    glbInitialized = true;
    fillCatalogue();
  }
  const auto found = catalogue.find(key);
  return found == catalogue.end() ? std::string("!") + key + "!" : found->second;
}

std::string NLS::getFormattedString(const char *key, ...) {
  va_list arguments;
  va_start(arguments, key);
  const std::string text = getFormattedStringV(key, arguments);
  va_end(arguments);
  return text;
}

std::string NLS::getFormattedStringV(const char *key, va_list arguments) {
  constexpr std::size_t BufferSize = 1024;
  char buffer[BufferSize] = "";
  const std::string text = getString(key);
  // The template of an unknown key is the marked key itself and holds no conversion.
  vsnprintf(buffer, sizeof buffer, text.c_str(), arguments);
  return buffer;
}
