// Helpers on texts and paths, and the look-ups of home, host, user and installed servers.
#include "utilities.h"

#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/utsname.h>
#include <unistd.h>

#include "logger.h"
#include "scratch.h"

namespace {

namespace fs = std::filesystem;
using Words = std::vector<std::string>;

LogLine utilTrace(const std::string &message) {
  return trace("utilities.cpp", message);
}

LogLines foundTraces(const std::string &path) {
  return {utilTrace("Util::pathExists(" + path + ") entry"),
          utilTrace("Util::pathExists(" + path + ") exit")};
}

LogLines notFoundTraces(const std::string &path) {
  return {utilTrace("Util::pathExists(" + path + ") entry"), utilTrace("Path does not exist: " + path),
          utilTrace("Util::pathExists(" + path + ") exit")};
}

struct Trimmed {
  const char *name;
  std::string text;
  std::string result;
};

class TrimStringTest : public ::testing::TestWithParam<Trimmed> {};

TEST_P(TrimStringTest, RemovesTheFourBlanksAtBothEnds) {
  std::string text = GetParam().text;
  Util::trimString(text);
  EXPECT_EQ(text, GetParam().result);
}

INSTANTIATE_TEST_SUITE_P(
    Texts, TrimStringTest,
    ::testing::Values(Trimmed{"AllFourKinds", " \t x y \r\n", "x y"}, Trimmed{"OnlyTabs", "\t\t", ""},
                      Trimmed{"OnlyEveryKind", "\r\n\t \r\n\t ", ""}, Trimmed{"Empty", "", ""},
                      Trimmed{"Nothing", "x", "x"}, Trimmed{"LeadingOnly", "\n\nx", "x"},
                      Trimmed{"TrailingOnly", "x\r\r", "x"}, Trimmed{"InnerKept", "a \r\n\t b", "a \r\n\t b"},
                      Trimmed{"FormFeedKept", "\fx\f", "\fx\f"},
                      Trimmed{"VerticalTabKept", " \vx\v ", "\vx\v"},
                      Trimmed{"NulKept", std::string(" \0 ", 3), std::string("\0", 1)},
                      Trimmed{"BytesAboveAsciiKept", "\xa0x\x85", "\xa0x\x85"}),
    [](const auto &text) { return text.param.name; });

struct Split {
  const char *name;
  std::string text;
  const char *delimiters;
  Words tokens;
};

class TokenizeStringTest : public ::testing::TestWithParam<Split> {};

TEST_P(TokenizeStringTest, YieldsTheNonEmptyPiecesInOrder) {
  EXPECT_EQ(Util::tokenizeString(GetParam().text, GetParam().delimiters), GetParam().tokens);
}

INSTANTIATE_TEST_SUITE_P(Texts, TokenizeStringTest,
                         ::testing::Values(Split{"Four", "1,2,3,4", ",", {"1", "2", "3", "4"}},
                                           Split{"RunsAndEnds", ",,a,,b,", ",", {"a", "b"}},
                                           Split{"Empty", "", ",", {}},
                                           Split{"OnlyDelimiters", ",;,", ";,", {}},
                                           Split{"NoDelimiter", "a b", ",", {"a b"}},
                                           Split{"SeveralDelimiters", "a, b;c", " ,;", {"a", "b", "c"}},
                                           Split{"BlanksAreNotTrimmed", " a , b ", ",", {" a ", " b "}},
                                           Split{"NoDelimiters", "a,b", "", {"a,b"}},
                                           Split{"LinesOfBothKinds", "one\r\ntwo\n", "\n\r", {"one", "two"}}),
                         [](const auto &text) { return text.param.name; });

TEST(TokenizeStringTest, WorksOnAPrivateCopy) {
  const std::string text = "a,b,c";
  Util::tokenizeString(text, ",");
  EXPECT_EQ(text, "a,b,c");
}

struct DottedPath {
  const char *name;
  const char *path;
  const char *result;
};

class RemoveDotFromPathTest : public ::testing::TestWithParam<DottedPath> {};

TEST_P(RemoveDotFromPathTest, TakesOutTheFirstDotComponentOnly) {
  EXPECT_EQ(Util::removeDotFromPath(GetParam().path), GetParam().result);
}

INSTANTIATE_TEST_SUITE_P(Paths, RemoveDotFromPathTest,
                         ::testing::Values(DottedPath{"Inside", "a/./b", "a/b"},
                                           DottedPath{"OnlyTheFirst", "a/./b/./c", "a/b/./c"},
                                           DottedPath{"OneOfTwoInARow", "a/././b", "a/./b"},
                                           DottedPath{"AtTheStart", "/./a", "/a"},
                                           DottedPath{"AtTheEnd", "a/./", "a/"},
                                           DottedPath{"Alone", "/./", "/"}, DottedPath{"Empty", "", ""},
                                           DottedPath{"None", "/opt/x/y.txt", "/opt/x/y.txt"},
                                           DottedPath{"LeadingDotKept", "./a", "./a"},
                                           DottedPath{"TrailingDotKept", "a/.", "a/."},
                                           DottedPath{"ParentKept", "a/../b", "a/../b"}),
                         [](const auto &path) { return path.param.name; });

struct ProductCode {
  const char *name;
  const char *given;
  const char *kept;
};

class ProductCodeTest : public ::testing::TestWithParam<ProductCode> {};

TEST_P(ProductCodeTest, IsLowerCasedAndTwoLettersGetTheirK) {
  EXPECT_EQ(Util::normalizeProductCode(GetParam().given), GetParam().kept);
}

INSTANTIATE_TEST_SUITE_P(Codes, ProductCodeTest,
                         ::testing::Values(ProductCode{"TwoLetters", "ox", "kox"},
                                           ProductCode{"TwoCapitals", "QA", "kqa"},
                                           ProductCode{"ThreeLetters", "kpt", "kpt"},
                                           ProductCode{"ThreeCapitals", "KOX", "kox"}),
                         [](const auto &code) { return code.param.name; });

TEST(LowerCaseTest, LettersOfAsciiAreLoweredAndNothingElse) {
  EXPECT_EQ(Util::toLower("KOX-li6243_VEMA @[`{"), "kox-li6243_vema @[`{");
  EXPECT_EQ(Util::toLower("\xc4\xd6"), "\xc4\xd6");
  EXPECT_EQ(Util::toLower(""), "");
}

class UtilitiesTest : public ScratchHome {};

TEST_F(UtilitiesTest, HomeIsTheEnvironmentVariableVerbatim) {
  setenv("QUILLHOME", "/opt/x/", 1);
  EXPECT_EQ(Util::getQuillHome() + "registry/", "/opt/x/registry/");
  setenv("QUILLHOME", "not a path, no slash", 1);
  EXPECT_EQ(Util::getQuillHome(), "not a path, no slash");
}

TEST_F(UtilitiesTest, UnsetHomeIsEmpty) {
  unsetenv("QUILLHOME");
  EXPECT_EQ(Util::getQuillHome(), "");
}

TEST_F(UtilitiesTest, EnvironmentIsSetAndSetAgain) {
  const std::string name = "QUILL_TEST_VALUE";
  Util::setEnvironment(name, "first");
  EXPECT_STREQ(getenv(name.c_str()), "first");
  Util::setEnvironment(name, "second=with equal sign");
  EXPECT_STREQ(getenv(name.c_str()), "second=with equal sign");
  Util::setEnvironment(name, "");
  EXPECT_STREQ(getenv(name.c_str()), "");
  unsetenv(name.c_str());
}

TEST_F(UtilitiesTest, TextsOfTheEnvironmentStayWhereTheyAreWhenOthersFollow) {
  // Short ones: such a string keeps its text in itself.
  Util::setEnvironment("QUILL_A", "x");
  const char *const first = getenv("QUILL_A");
  for (int i = 0; i < 200; ++i)
    Util::setEnvironment("QUILL_B", std::to_string(i));
  EXPECT_EQ(getenv("QUILL_A"), first);
  EXPECT_STREQ(first, "x");
  EXPECT_STREQ(getenv("QUILL_B"), "199");
  Util::setEnvironment("QUILL_A", "y");
  EXPECT_STREQ(first, "x") << "who has asked before keeps the answer";
  EXPECT_STREQ(getenv("QUILL_A"), "y");
  unsetenv("QUILL_A");
  unsetenv("QUILL_B");
}

TEST_F(UtilitiesTest, HostNameIsTheNodeNameUpToItsFirstDot) {
  utsname host{};
  ASSERT_EQ(uname(&host), 0);
  const std::string node = host.nodename;
  EXPECT_EQ(Util::getHostName(), node.substr(0, node.find('.')));
}

TEST_F(UtilitiesTest, UserNameIsTheLoginNameOfTheRealUser) {
  const passwd *entry = getpwuid(getuid());
  EXPECT_EQ(Util::getUserName(), entry == nullptr ? "" : entry->pw_name);
}

TEST_F(UtilitiesTest, UserNameIsNotTakenFromTheEnvironment) {
  const std::string name = Util::getUserName();
  for (const char *variable : {"LOGNAME", "USER"}) {
    const char *const value = getenv(variable);
    const std::string before = value == nullptr ? "" : value;
    setenv(variable, "of-the-environment", 1);
    EXPECT_EQ(Util::getUserName(), name);
    logInit();
    EXPECT_NE(read(glbLogFileName).rfind("\n   User Name:   " + name + "\n"), std::string::npos);
    EXPECT_EQ(read(glbLogFileName).find("of-the-environment"), std::string::npos);
    if (value == nullptr)
      unsetenv(variable);
    else
      setenv(variable, before.c_str(), 1);
  }
}

TEST_F(UtilitiesTest, UserNameOfRootIsRoot) {
  REQUIRE_ROOT();
  EXPECT_EQ(Util::getUserName(), "root");
}

TEST_F(UtilitiesTest, LookUpsOfHomeHostAndUserLogNothing) {
  Util::getQuillHome();
  Util::getHostName();
  Util::getUserName();
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(UtilitiesTest, TempDirIsBelowTheHomeAndNotMade) {
  setenv("QUILLHOME", "/opt/x/", 1);
  EXPECT_EQ(Util::getTempDir("kox"), "/opt/x/tmp/kox");
  setenv("QUILLHOME", home().c_str(), 1);
  EXPECT_EQ(Util::getTempDir(""), home() + "tmp/");
  EXPECT_FALSE(isThere(home() + "tmp"));
}

TEST_F(UtilitiesTest, ExistingPathIsTracedInTwoLines) {
  const std::string path = write("there", "");
  EXPECT_TRUE(Util::pathExists(path));
  EXPECT_EQ(logLines(), foundTraces(path));
}

TEST_F(UtilitiesTest, DirectoryExistsWithAndWithoutItsSlash) {
  makeDirectory("dir");
  EXPECT_TRUE(Util::pathExists(home() + "dir"));
  EXPECT_TRUE(Util::pathExists(home() + "dir/"));
}

TEST_F(UtilitiesTest, MissingPathIsNamedBetweenTheTwoLines) {
  const std::string path = home() + "100%s gone";
  EXPECT_FALSE(Util::pathExists(path));
  EXPECT_EQ(logLines(), notFoundTraces(path));
}

TEST_F(UtilitiesTest, UnreadableFileExistsAndADanglingLinkDoesNot) {
  fs::create_symlink("nowhere", home() + "dangling");
  EXPECT_TRUE(Util::pathExists(write("unreadable", "", 0)));
  EXPECT_FALSE(Util::pathExists(home() + "dangling"));
  EXPECT_FALSE(Util::pathExists(""));
}

TEST_F(UtilitiesTest, CurrentDirectoryHasNoTrailingSlash) {
  makeDirectory("work");
  EXPECT_TRUE(Util::setCurrentDirectory(home() + "work/"));
  EXPECT_EQ(Util::getCurrentDirectory(), home() + "work");
}

TEST_F(UtilitiesTest, LongCurrentDirectoryIsToldWhole) {
  std::string path = home();
  for (int level = 0; level < 10; ++level)
    path += std::string(200, 'd') + "/";
  fs::create_directories(path);
  ASSERT_TRUE(Util::setCurrentDirectory(path));
  EXPECT_EQ(Util::getCurrentDirectory() + "/", path);
}

TEST_F(UtilitiesTest, CurrentDirectoryThatWasRemovedIsEmpty) {
  fs::current_path(makeDirectory("gone"));
  fs::remove(home() + "gone");
  EXPECT_EQ(Util::getCurrentDirectory(), "");
}

TEST_F(UtilitiesTest, MissingDirectoryCannotBecomeTheCurrentOne) {
  fs::current_path(home());
  EXPECT_FALSE(Util::setCurrentDirectory(home() + "gone"));
  EXPECT_FALSE(Util::setCurrentDirectory(write("file", "")));
  EXPECT_FALSE(Util::setCurrentDirectory(""));
  EXPECT_EQ(Util::getCurrentDirectory() + "/", home());
}

struct ServerQuestion {
  const char *name;
  bool (*isInstalled)();
  const char *probe;
};

class InstalledServerTest : public ScratchHome, public ::testing::WithParamInterface<ServerQuestion> {};

TEST_P(InstalledServerTest, IsAnsweredByItsProbeFile) {
  const std::string probe = write(GetParam().probe, "");
  EXPECT_TRUE(GetParam().isInstalled());
  EXPECT_EQ(logLines(), foundTraces(probe));
}

TEST_P(InstalledServerTest, IsNotInstalledWithoutTheProbeFile) {
  EXPECT_FALSE(GetParam().isInstalled());
  EXPECT_EQ(logLines(), notFoundTraces(home() + GetParam().probe));
}

INSTANTIATE_TEST_SUITE_P(
    AllThree, InstalledServerTest,
    ::testing::Values(ServerQuestion{"MonitoringServer", [] { return Util::isVEMSInstalled(); },
                                     "config/.ConfigData/kqaenv"},
                      ServerQuestion{"PortalServer", [] { return Util::isVEPSInstalled("li6263"); },
                                     "registry/ptli6263.ver"},
                      ServerQuestion{"DesktopClient", [] { return Util::isVEPDInstalled("li6263"); },
                                     "registry/dkli6263.ver"},
                      ServerQuestion{"PortalServerWithoutArch", [] { return Util::isVEPSInstalled(""); },
                                     "registry/pt.ver"}),
    [](const auto &question) { return question.param.name; });

/// What runs on the host is what `ps` prints, and the shell finds `ps` and `grep` by the search path.
class ManagementConsoleTest : public ScratchHome {
protected:
  void replaceProgram(const std::string &name, const std::string &script) {
    write("tools/" + name, "#!/bin/sh\n" + script + "\n", 0755);
    const std::string path = getenv("PATH");
    setenv("PATH", (home() + "tools:" + path).c_str(), 1);
  }
  void listProcesses(const std::string &lines) { replaceProgram("ps", "printf '" + lines + "'"); }
  std::string console() const { return home() + "classes/wbt.jar"; }
};

TEST_F(ManagementConsoleTest, RunsWhenOneProcessNamesItsArchive) {
  listProcesses("root 1 0 init\\nquill 7 1 java -cp " + console() + " main\\n");
  EXPECT_TRUE(Util::isManageGUIRunning());
}

TEST_F(ManagementConsoleTest, RunsWhenTenProcessesNameItsArchive) {
  std::string lines;
  for (int process = 0; process < 10; ++process)
    lines += "java " + console() + "\\n";
  listProcesses(lines);
  EXPECT_TRUE(Util::isManageGUIRunning());
}

TEST_F(ManagementConsoleTest, DoesNotRunWhenNoProcessNamesItsArchive) {
  listProcesses("root 1 0 init\\njava /elsewhere/classes/wbt.jar\\n");
  EXPECT_FALSE(Util::isManageGUIRunning());
}

TEST_F(ManagementConsoleTest, SearchesForTheArchiveDoNotCount) {
  listProcesses("root 9 1 grep -c " + console() + "\\n");
  EXPECT_FALSE(Util::isManageGUIRunning());
}

TEST_F(ManagementConsoleTest, AsksTheShellForTheFullListOfProcesses) {
  replaceProgram("ps", "echo \"$*\" > " + home() + "journal");
  Util::isManageGUIRunning();
  EXPECT_EQ(read(home() + "journal"), "-ef\n");
}

TEST_F(ManagementConsoleTest, CommandIsTracedByTheRunOfIt) {
  listProcesses("java " + console() + "\\n");
  Util::isManageGUIRunning();
  EXPECT_EQ(logLines(),
            (LogLines{trace("process.cpp", "runCommand entry"), trace("process.cpp", "cmdArray[0]: /bin/sh"),
                      trace("process.cpp", "cmdArray[1]: -c"),
                      trace("process.cpp", "cmdArray[2]: ps -ef | grep -v grep | grep -c " + console()),
                      trace("process.cpp", "runCommand exit")}));
}

TEST_F(ManagementConsoleTest, ErrorsOfTheCommandAreNotShown) {
  replaceProgram("ps", "echo 'ps: complaint' >&2");
  ::testing::internal::CaptureStderr();
  EXPECT_FALSE(Util::isManageGUIRunning());
  EXPECT_EQ(::testing::internal::GetCapturedStderr(), "");
}

struct CountOutput {
  const char *name;
  const char *script; ///< in place of grep
  bool running;
};

class ConsoleCountTest : public ManagementConsoleTest, public ::testing::WithParamInterface<CountOutput> {};

TEST_P(ConsoleCountTest, OnlyOneTokenThatIsNotZeroMeansRunning) {
  listProcesses("");
  replaceProgram("grep", GetParam().script);
  EXPECT_EQ(Util::isManageGUIRunning(), GetParam().running);
}

INSTANTIATE_TEST_SUITE_P(Outputs, ConsoleCountTest,
                         ::testing::Values(CountOutput{"One", "echo 1", true},
                                           CountOutput{"Negative", "echo -1", true},
                                           CountOutput{"OneWithCarriageReturn", "printf '1\\r\\n'", true},
                                           CountOutput{"DigitsThenText", "echo '3 found'", true},
                                           CountOutput{"ZeroWithStatusZero", "echo 0", false},
                                           CountOutput{"TextIsZero", "echo many", false},
                                           CountOutput{"NoToken", "printf '\\n\\r\\n'", false},
                                           CountOutput{"Nothing", "true", false},
                                           CountOutput{"TwoTokens", "echo 1; echo 1", false},
                                           CountOutput{"OneWithStatusOne", "echo 1; exit 1", false},
                                           CountOutput{"OneWithStatusTwo", "echo 1; exit 2", false}),
                         [](const auto &output) { return output.param.name; });

} // namespace
