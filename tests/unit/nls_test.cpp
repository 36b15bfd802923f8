// The catalogue to the byte, its look-ups, and the error record.
#include "nls.h"

#include <cstring>
#include <map>
#include <set>
#include <string>

#include <gtest/gtest.h>

namespace {

/// One entry: the key, the text as users and their scripts know it, and what its callers pass, in order:
/// 's' a C string, 'd' an int.
struct CatalogueEntry {
  const char *key;
  const char *text;
  const char *arguments;
};

const CatalogueEntry Catalogue[] = {
    {"MAIN_SUCCESSFUL", "Command completed successfully.", ""},
    {"MAIN_NOT_SUCCESSFUL",
     "Command completed with errors. For more information, see the orvpatch.log file under:\n%s", "s"},
    {"LOG_CANT_WRITE", "Unable to write to log file: %s", "s"},
    {"ERROR_INIFILE_PARSE", "Unable to parse ini file: %s", "s"},
    {"ERROR_INIFILE_PROP", "Properites start before section definition", ""},
    {"ERROR_INIFILE_CANT_READ", "Unable to read file [%s]: %s", "ss"},
    {"ERROR_PATCH_PARSE", "Error parsing patch file", ""},
    {"ERROR_PATCH_MISSING_SECTION", "Missing required section: %s", "s"},
    {"ERROR_PATCH_MISSING_PROP", "Missing required property: %s", "s"},
    {"PROC_CANT_RUN", "Unable to run %s", "s"},
    {"PROC_BAD_RC", "Bad return code from %s: %d", "sd"},
    {"ERROR_ORV_HOME", "Invalid path to ORV home: %s", "s"},
    {"ERROR_START_AGENT", "Unable to start agent for product %s.", "s"},
    {"ERROR_START_INST", "Unable to start instance %s of agent for product %s.", "ss"},
    {"ERROR_STOP_AGENT",
     "Unable to stop agent for product %s.  The agent for product %s may be running under a different userid "
     "and must be manually stopped before applying the patch.",
     "ss"},
    {"ERROR_STOP_INST",
     "Unable to stop instance %s of agent for product %s.  The agent for product %s may be running under a "
     "different userid and must be manually stopped before applying the patch.",
     "sss"},
    {"ERROR_START_CANT_SU", "Unable to su to user: %s", "s"},
    {"ERROR_START_SERVER", "Unable to start server for product %s.", "s"},
    {"ERROR_START_SRV_INST", "Unable to start instance %s of server for product %s.", "ss"},
    {"ERROR_STOP_SERVER",
     "Unable to stop server for product %s.  The server for product %s may be running under a different "
     "userid and must be manually stopped before applying the patch.",
     "ss"},
    {"ERROR_STOP_SRV_INST",
     "Unable to stop instance %s of server for product %s.  The server for product %s may be running under a "
     "different userid and must be manually stopped before applying the patch.",
     "sss"},
    {"ERROR_PP_OLD_PATCH", "Can't install backlevel patch version: %s. Installed version is %s", "ss"},
    {"ERROR_PP_MISSING_PROD",
     "The following product code %s for the product being updated cannot be located in the .ver files and "
     "therefore, may not be installed at this time.  Verify the product you are attempting to update is "
     "actually installed on this system.",
     "s"},
    {"ERROR_PP_MISSING_PREREQ", "Missing patch prerequisite: %s", "s"},
    {"ERROR_PP_PREREQ_VER", "Incorrect prerequisite version for %s. Installed = %s, required = %s.", "sss"},
    {"PP_CAB_EXTRACT", "Unable to extract CAB file %s: %d", "sd"},
    {"PP_SCRIPT_COUNT", "Processing %d scripts.", "d"},
    {"PP_TEST_PREPATCHSCRIPT",
     "The following commands will be executed before agent instances are stopped:", ""},
    {"PP_TEST_PRESCRIPT", "The following commands will be executed after agent instances are stopped:", ""},
    {"PP_TEST_POSTSCRIPT",
     "The following commands will be executed before restarting any previously stopped agents:", ""},
    {"PP_TEST_NO_PREPATCHSCRIPT", "No commands to be executed before the agent instances are stopped.", ""},
    {"PP_TEST_NO_PRESCRIPT", "No commands to be executed after stopping the agent instances.", ""},
    {"PP_TEST_NO_POSTSCRIPT", "No commands to be executed before starting the agent instances.", ""},
    {"PP_PROCESS_SCRIPT", "Attempting to execute: %s", "s"},
    {"PP_SCRIPT_COMPLETE", "Successfully executed: %s", "s"},
    {"ERROR_PP_SET_CWD", "Could not change current working directory to: %s", "s"},
    {"ERROR_PP_MOVE_FILE",
     "Could not move file %s to %s. Either the product being updated is still running or the file "
     "permissions are restricting access to the file. Verify the product has been stopped and the file "
     "permissions are not restricting access and then re-apply the patch.",
     "ss"},
    {"PP_NO_FILES", "This patch contains no files to update.", ""},
    {"PP_MOVE_FILES", "Will attempt to move files from %s to %s", "ss"},
    {"PP_LIST_FILES", "The following files will be installed or replaced with new files:", ""},
    {"PP_MOVE_FILE", "Successfully moved file from %s to %s", "ss"},
    {"PP_MAKE_DIR", "Creating new directory: %s", "s"},
    {"ERROR_PP_MAKE_DIR", "Unable to create directory: %s", "s"},
    {"ERROR_PP_RM_DIR", "Unable to remove temporary directory: %s", "s"},
    {"ERROR_PP_UPDATE_VRMF", "Could not update VRMF for %s: %s", "ss"},
    {"ERROR_PP_UPDATE_HIST", "Unable to update patch history file, %s: %s", "ss"},
    {"ERROR_PP_INITIALIZE", "Can't initialize patch.", ""},
    {"PP_NO_RUNNING_INST", "No instances of running dependent agents to stop or restart.", ""},
    {"PP_LIST_AGENT_INST",
     "The following agent instances will be stopped during the patch application and restarted afterwards:",
     ""},
    {"ERROR_PP_COPY_PRODEXE", "An attempt to copy %s to %s failed.", "ss"},
    {"PP_LIST_PRODEXES", "The following files will be updated with a new copy of %s", "s"},
    {"DCFPP_PROCESS_DIR", "Processing patch files in directory: %s", "s"},
    {"DCFPP_TEST_NO_PATCH", "There are no patch files applicable to this system.", ""},
    {"DCFPP_PROCESS_PATCH", "Processing patch file: %s", "s"},
    {"ERROR_DCFPP_PATH", "Unable to locate path or file specified: %s", "s"},
    {"ERROR_DCFPP_NO_FILES", "Unable to locate patch files in directory specified: %s", "s"},
    {"ERROR_DCFPP_NO_APPLICABLE",
     "Unable to locate or install patch files which are applicable to this\nsystem in the directory "
     "specified: %s.",
     "s"},
    {"DCFPP_NOT_APPLICABLE", "File is not an applicable patch and will be ignored: %s", "s"},
    {"ERROR_DCFPP_NOT_APPLICABLE",
     "The patch file %s can not be installed.  Either the current platform architecture or the installed "
     "components do not meet the prerequisites of the patch.",
     "s"},
    {"ERROR_VEMS_RUNNING",
     "The %s file\nincludes updates for the Veyra Enterprise Monitoring Server. The server\nis currently "
     "running and must be stopped before the updates can be\napplied. The updates will not be applied at "
     "this time. Please stop the\nserver before attempting to install this patch again.",
     "s"},
    {"ERROR_VEPS_RUNNING",
     "The %s file\nincludes updates for the Veyra Enterprise Portal Server. The server is\ncurrently running "
     "and must be stopped before the updates can be applied.\n The updates will not be applied at this time. "
     "Please stop the server\nbefore attempting to install this patch again.",
     "s"},
    {"ERROR_MVEMS_RUNNING",
     "The %s file\nincludes updates for the Manage Veyra Enterprise Monitoring Services\nconsole. The "
     "console is currently running and must be stopped before the\nupdates can be applied. The updates will "
     "not be applied at this time.\nPlease stop the console before attempting to install this patch again.",
     "s"},
};

// Read before main, so that no test has changed it yet.
const bool filledAtStart = glbInitialized;

constexpr std::size_t LongestText = 1023;

std::string conversionsOf(const std::string &text) {
  std::string conversions;
  for (std::size_t at = text.find('%'); at != std::string::npos; at = text.find('%', at + 2))
    conversions += text.substr(at + 1, 1);
  return conversions;
}

/// The text with each conversion replaced by what the test passes for it.
std::string filled(std::string text, const std::map<char, std::vector<std::string>> &values) {
  std::map<char, std::size_t> used;
  for (std::size_t at = text.find('%'); at != std::string::npos; at = text.find('%', at)) {
    const char conversion = text[at + 1];
    const std::string &value = values.at(conversion).at(used[conversion]++);
    text.replace(at, 2, value);
    at += value.size();
  }
  return text;
}

std::string formattedWith(const char *arguments, const char *key) {
  const std::string kinds = arguments;
  if (kinds == "s")
    return NLS::getFormattedString(key, "first");
  if (kinds == "ss")
    return NLS::getFormattedString(key, "first", "second");
  if (kinds == "sss")
    return NLS::getFormattedString(key, "first", "second", "third");
  if (kinds == "sd")
    return NLS::getFormattedString(key, "first", -12);
  if (kinds == "d")
    return NLS::getFormattedString(key, -12);
  return NLS::getFormattedString(key);
}

std::string formattedFromList(const char *key, ...) {
  va_list arguments;
  va_start(arguments, key);
  const std::string text = NLS::getFormattedStringV(key, arguments);
  va_end(arguments);
  return text;
}

class CatalogueTest : public ::testing::TestWithParam<CatalogueEntry> {};

TEST_P(CatalogueTest, TextStandsToTheByte) {
  EXPECT_EQ(NLS::getString(GetParam().key), GetParam().text);
}

TEST_P(CatalogueTest, ConversionsAskForWhatTheCallersPass) {
  EXPECT_EQ(conversionsOf(NLS::getString(GetParam().key)), GetParam().arguments);
}

TEST_P(CatalogueTest, EachArgumentStandsAtItsPlace) {
  const std::string expected = filled(GetParam().text, {{'s', {"first", "second", "third"}}, {'d', {"-12"}}});
  EXPECT_EQ(formattedWith(GetParam().arguments, GetParam().key), expected);
}

INSTANTIATE_TEST_SUITE_P(AllEntries, CatalogueTest, ::testing::ValuesIn(Catalogue),
                         [](const auto &entry) { return std::string(entry.param.key); });

TEST(CatalogueTableTest, ListsSixtyTwoKeysOnce) {
  std::set<std::string> keys;
  for (const CatalogueEntry &entry : Catalogue)
    keys.insert(entry.key);
  EXPECT_EQ(keys.size(), 62U);
}

TEST(NlsTest, CatalogueIsNotFilledAtStart) {
  EXPECT_FALSE(filledAtStart);
}

TEST(NlsTest, LookUpFillsTheCatalogueWhenItIsNotFilled) {
  glbInitialized = false;
  EXPECT_EQ(NLS::getString("MAIN_SUCCESSFUL"), "Command completed successfully.");
  EXPECT_TRUE(glbInitialized);
}

TEST(NlsTest, FormattingFillsTheCatalogueWhenItIsNotFilled) {
  glbInitialized = false;
  EXPECT_EQ(NLS::getFormattedString("LOG_CANT_WRITE", "guest"), "Unable to write to log file: guest");
  EXPECT_TRUE(glbInitialized);
}

TEST(NlsTest, UnknownKeyFillsTheCatalogueToo) {
  glbInitialized = false;
  EXPECT_EQ(NLS::getString("NO_SUCH_KEY"), "!NO_SUCH_KEY!");
  EXPECT_TRUE(glbInitialized);
}

TEST(NlsTest, UnknownKeyStaysUnknown) {
  EXPECT_EQ(NLS::getString("NO_SUCH_KEY"), "!NO_SUCH_KEY!");
  EXPECT_EQ(NLS::getString("NO_SUCH_KEY"), "!NO_SUCH_KEY!");
}

TEST(NlsTest, KeysAreMatchedWholeAndCaseSensitively) {
  EXPECT_EQ(NLS::getString(""), "!!");
  EXPECT_EQ(NLS::getString("main_successful"), "!main_successful!");
  EXPECT_EQ(NLS::getString("MAIN_SUCCESSFU"), "!MAIN_SUCCESSFU!");
  EXPECT_EQ(NLS::getString("MAIN_SUCCESSFUL "), "!MAIN_SUCCESSFUL !");
}

TEST(NlsTest, ResultIsACopy) {
  std::string text = NLS::getString("MAIN_SUCCESSFUL");
  text[0] = 'X';
  EXPECT_EQ(NLS::getString("MAIN_SUCCESSFUL"), "Command completed successfully.");
}

TEST(NlsTest, UnknownKeyFormatsAsMarkedKeyWhateverTheArguments) {
  EXPECT_EQ(NLS::getFormattedString("NO_SUCH_KEY", "text", 5), "!NO_SUCH_KEY!");
}

TEST(NlsTest, PathOfTheFailureVerdictStandsOnALineOfItsOwn) {
  EXPECT_EQ(NLS::getFormattedString("MAIN_NOT_SUCCESSFUL", "/opt/x/patchlogs"),
            "Command completed with errors. For more information, see the orvpatch.log file under:\n"
            "/opt/x/patchlogs");
}

TEST(NlsTest, ArgumentIsNotFormattedItself) {
  EXPECT_EQ(NLS::getFormattedString("LOG_CANT_WRITE", "100%s%n%%"), "Unable to write to log file: 100%s%n%%");
}

TEST(NlsTest, ArgumentListIsFormattedLikeArguments) {
  EXPECT_EQ(formattedFromList("PROC_BAD_RC", "tar -xf", 2), "Bad return code from tar -xf: 2");
}

TEST(NlsTest, TextOf2000CharactersIsCutAt1023) {
  const std::string text = NLS::getFormattedString("LOG_CANT_WRITE", std::string(2000, 'x').c_str());
  const std::string start = "Unable to write to log file: ";
  EXPECT_EQ(text, start + std::string(LongestText - start.size(), 'x'));
}

TEST(NlsTest, TextOf1023CharactersStaysWholeAndOneMoreIsCut) {
  const std::size_t startLength = std::strlen("Unable to run ");
  const std::string fitting(LongestText - startLength - 1, 'x');
  EXPECT_EQ(NLS::getFormattedString("PROC_CANT_RUN", (fitting + "y").c_str()),
            "Unable to run " + fitting + "y");
  EXPECT_EQ(NLS::getFormattedString("PROC_CANT_RUN", (fitting + "yz").c_str()),
            "Unable to run " + fitting + "y");
}

TEST(NlsTest, UnknownKeyOf2000CharactersIsCutOnlyWhenFormatted) {
  const std::string key(2000, 'K');
  EXPECT_EQ(NLS::getString(key.c_str()), "!" + key + "!");
  EXPECT_EQ(NLS::getFormattedString(key.c_str()), "!" + std::string(LongestText - 1, 'K'));
}

TEST(PatchErrorTest, StartsWithoutAnError) {
  const PatchError err;
  EXPECT_EQ(err.code, 0);
  EXPECT_EQ(err.text, "");
}

TEST(PatchErrorTest, IsCopiedByValue) {
  PatchError first;
  first.code = 25;
  first.text = "moved";
  PatchError second = first;
  first.text = "changed";
  EXPECT_EQ(second.code, 25);
  EXPECT_EQ(second.text, "moved");
}

struct NamedCode {
  PatchError::Code code;
  int exitStatus;
};

class ErrorCodeTest : public ::testing::TestWithParam<NamedCode> {};

TEST_P(ErrorCodeTest, IsTheExitStatusThatOperatorsKnow) {
  EXPECT_EQ(static_cast<int>(GetParam().code), GetParam().exitStatus);
}

INSTANTIATE_TEST_SUITE_P(
    AllCodes, ErrorCodeTest,
    ::testing::Values(
        NamedCode{PatchError::None, 0}, NamedCode{PatchError::CannotExtract, 3},
        NamedCode{PatchError::PropertyBeforeSection, 4}, NamedCode{PatchError::CannotReadFile, 5},
        NamedCode{PatchError::MissingSection, 6}, NamedCode{PatchError::MissingProperty, 7},
        NamedCode{PatchError::MissingProduct, 9}, NamedCode{PatchError::WrongPrereqVersion, 10},
        NamedCode{PatchError::BacklevelPatch, 11}, NamedCode{PatchError::CannotStartAgent, 12},
        NamedCode{PatchError::CannotStartInstance, 13}, NamedCode{PatchError::CannotStopAgent, 14},
        NamedCode{PatchError::CannotStopInstance, 15}, NamedCode{PatchError::CannotStartServer, 16},
        NamedCode{PatchError::CannotStopServer, 18}, NamedCode{PatchError::ServerInstanceFailed, 19},
        NamedCode{PatchError::CannotSwitchUser, 20}, NamedCode{PatchError::PreScriptFailed, 21},
        NamedCode{PatchError::PrePatchScriptFailed, 22}, NamedCode{PatchError::PostScriptFailed, 23},
        NamedCode{PatchError::CannotChangeDirectory, 24}, NamedCode{PatchError::CannotMoveFile, 25},
        NamedCode{PatchError::CannotMakeDirectory, 26}, NamedCode{PatchError::CannotRemoveDirectory, 27},
        NamedCode{PatchError::CannotUpdateVersion, 28}, NamedCode{PatchError::PathNotFound, 30},
        NamedCode{PatchError::NoFiles, 31}, NamedCode{PatchError::NoApplicablePatch, 32},
        NamedCode{PatchError::NotApplicable, 34}, NamedCode{PatchError::MonitoringServerRunning, 35},
        NamedCode{PatchError::PortalServerRunning, 36}, NamedCode{PatchError::ConsoleRunning, 37}),
    [](const auto &code) { return "Status" + std::to_string(code.param.exitStatus); });

} // namespace
