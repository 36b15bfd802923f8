// The catalogue to the byte, its look-ups, and the error record.
#include "nls.h"

#include <cstring>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

namespace {

/// One entry: the key, the text as users and their scripts know it, and what its callers pass, in order:
/// 's' a C string, 'd' an int.
struct CatalogueEntry {
  std::string key;
  std::string text;
  std::string arguments;
};

std::string conversionsOf(const std::string &text) {
  std::string conversions;
  for (std::size_t at = text.find('%'); at != std::string::npos; at = text.find('%', at + 2))
    conversions += text.substr(at + 1, 1);
  return conversions;
}

/// The catalogue as the tests of whole runs have it, too.
std::vector<CatalogueEntry> readCatalogue() {
  std::ifstream in(SUPPORT_FOLDER "/catalogue.json");
  std::vector<CatalogueEntry> entries;
  const nlohmann::json catalogue = nlohmann::json::parse(in);
  for (const auto &item : catalogue.items()) {
    const std::string text = item.value().get<std::string>();
    entries.push_back({item.key(), text, conversionsOf(text)});
  }
  return entries;
}

// Read before main, so that no test has changed it yet.
const bool filledAtStart = glbInitialized;

constexpr std::size_t LongestText = 1023;

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

std::string formattedWith(const std::string &kinds, const char *key) {
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
  EXPECT_EQ(NLS::getString(GetParam().key.c_str()), GetParam().text);
}

TEST_P(CatalogueTest, EachArgumentStandsAtItsPlace) {
  const std::string expected = filled(GetParam().text, {{'s', {"first", "second", "third"}}, {'d', {"-12"}}});
  EXPECT_EQ(formattedWith(GetParam().arguments, GetParam().key.c_str()), expected);
}

INSTANTIATE_TEST_SUITE_P(AllEntries, CatalogueTest, ::testing::ValuesIn(readCatalogue()),
                         [](const auto &entry) { return entry.param.key; });

TEST(CatalogueTableTest, ListsSixtyTwoKeysOnce) {
  std::set<std::string> keys;
  for (const CatalogueEntry &entry : readCatalogue())
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
