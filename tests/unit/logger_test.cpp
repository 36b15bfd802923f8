// The log: its destination, its header block and the shape of its lines.
#include "logger.h"

#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "scratch.h"
#include "utilities.h"

#define LOG_COMPONENT "logger_test"

namespace {

namespace fs = std::filesystem;
using ::testing::internal::CaptureStderr;
using ::testing::internal::CaptureStdout;
using ::testing::internal::GetCapturedStderr;
using ::testing::internal::GetCapturedStdout;

// Read before main, so that no test has changed it yet.
const bool toStandardOutputAtStart = glbLogToSTDOUT;

const std::string RowOfEqualSigns(78, '=');

/// The header block as a regular expression: only the build date and time are not known here.
std::string headerPattern() {
  return RowOfEqualSigns + "\n ORV Patch Log File\n   System Name: " + Util::getHostName() +
         "\n   User Name:   " + Util::getUserName() + "\n   Process ID:  " + std::to_string(getpid()) +
         "\n   Build Date:  (1[0-2]|[1-9])/([12][0-9]|3[01]|[1-9])/[0-9]{2} "
         "([01][0-9]|2[0-3]):[0-5][0-9]:[0-5][0-9]\n" +
         RowOfEqualSigns + "\n";
}

/// A line as a regular expression; `message` is taken literally.
std::string linePattern(const std::string &level, int line, const std::string &message) {
  return level + " [0-2][0-9]:[0-5][0-9]:[0-5][0-9] \\(logger_test," + std::to_string(line) +
         "\\): " + message + "\n";
}

bool matches(const std::string &text, const std::string &pattern) {
  return std::regex_match(text, std::regex(pattern));
}

void logThroughArgumentList(logger_level level, const char *format, ...) {
  va_list arguments;
  va_start(arguments, format);
  logMsg(level, LOG_COMPONENT, format, arguments);
  va_end(arguments);
}

std::string clockAt(time_t when) {
  char text[16];
  strftime(text, sizeof text, "%H:%M:%S", localtime(&when));
  return text;
}

/// Starts every test as the program starts: without a log, and without the folder for it.
class LoggerTest : public ScratchHome {
protected:
  void SetUp() override {
    ScratchHome::SetUp();
    fs::remove_all(home() + "patchlogs");
    glbLogFileName.clear();
    glbCurLine = 0;
  }
  void TearDown() override {
    unsetenv("PATCH_DEBUG");
    ScratchHome::TearDown();
  }

  std::string logPath() const { return home() + "patchlogs/orvpatch.log"; }
  std::string log() const { return read(logPath()); }

  /// A log whose header has been written and taken away, for tests of single lines.
  void startEmptyLog() {
    logInit();
    fs::resize_file(logPath(), 0);
  }
};

TEST(LoggerStateTest, ProgramStartsWithAFileInMind) {
  EXPECT_FALSE(toStandardOutputAtStart);
}

TEST_F(LoggerTest, FileIsOrvpatchLogInPatchlogsOfTheHome) {
  logInit();
  EXPECT_EQ(glbLogFileName, logPath());
  EXPECT_FALSE(glbLogToSTDOUT);
  EXPECT_TRUE(fs::is_regular_file(logPath()));
}

TEST_F(LoggerTest, PatchlogsIsMadeWithMode0755) {
  const UmaskScope nothingMasked(0);
  logInit();
  EXPECT_EQ(modeOf(home() + "patchlogs"), 0755U);
}

TEST_F(LoggerTest, MaskTakesBitsFromTheModeOfPatchlogs) {
  const UmaskScope ownerOnly(077);
  logInit();
  EXPECT_EQ(modeOf(home() + "patchlogs"), 0700U);
}

TEST_F(LoggerTest, ExistingPatchlogsIsUsedAsItIs) {
  write("patchlogs/patches.hist", "kept\n");
  fs::permissions(home() + "patchlogs", fs::perms(0700));
  logInit();
  EXPECT_EQ(modeOf(home() + "patchlogs"), 0700U);
  EXPECT_EQ(read(home() + "patchlogs/patches.hist"), "kept\n");
  EXPECT_TRUE(isThere(logPath()));
}

TEST_F(LoggerTest, HeaderBlockNamesHostUserProcessAndBuild) {
  logInit();
  EXPECT_TRUE(matches(log(), headerPattern())) << log();
}

TEST_F(LoggerTest, SecondRunAppendsItsHeaderAfterTheLinesOfTheFirst) {
  logInit();
  LOG_INFO("first run");
  const int line = __LINE__ - 1;
  logInit();
  const std::string expected = headerPattern() + linePattern("INFO ", line, "first run") + headerPattern();
  EXPECT_TRUE(matches(log(), expected)) << log();
}

TEST_F(LoggerTest, LevelsAreNumberedFromZero) {
  EXPECT_EQ(LEVEL_ERROR, 0);
  EXPECT_EQ(LEVEL_INFO, 1);
  EXPECT_EQ(LEVEL_TRACE, 2);
}

TEST_F(LoggerTest, EachEntryPointWritesItsFiveCharacterWord) {
  startEmptyLog();
  setLine(11);
  logError(LOG_COMPONENT, "cannot %s %d files", "move", 3);
  setLine(22);
  logInfo(LOG_COMPONENT, "moved %s", "a");
  setLine(33);
  logTrace(LOG_COMPONENT, "exit");
  EXPECT_TRUE(matches(log(), linePattern("ERROR", 11, "cannot move 3 files") +
                                 linePattern("INFO ", 22, "moved a") + linePattern("TRACE", 33, "exit")))
      << log();
}

class LoggerLevelTest : public LoggerTest,
                        public ::testing::WithParamInterface<std::pair<logger_level, const char *>> {};

TEST_P(LoggerLevelTest, ArgumentListIsWrittenUnderTheWordOfTheLevel) {
  startEmptyLog();
  setLine(44);
  logThroughArgumentList(GetParam().first, "%s=%d", "count", 5);
  EXPECT_TRUE(matches(log(), linePattern(GetParam().second, 44, "count=5"))) << log();
}

INSTANTIATE_TEST_SUITE_P(AllLevels, LoggerLevelTest,
                         ::testing::Values(std::pair(LEVEL_ERROR, "ERROR"), std::pair(LEVEL_INFO, "INFO "),
                                           std::pair(LEVEL_TRACE, "TRACE")));

TEST_F(LoggerTest, SetLineIsKeptUntilTheNextOne) {
  startEmptyLog();
  setLine(620);
  EXPECT_EQ(glbCurLine, 620);
  logTrace(LOG_COMPONENT, "one");
  logTrace(LOG_COMPONENT, "two");
  EXPECT_TRUE(matches(log(), linePattern("TRACE", 620, "one") + linePattern("TRACE", 620, "two"))) << log();
}

TEST_F(LoggerTest, MacrosShowTheLineAndTheNameOfTheCaller) {
  startEmptyLog();
  const int first = __LINE__ + 1;
  LOG_ERROR("e %d", 1);
  LOG_INFO("i");
  LOG_TRACE("t");
  LOG_INFO_MESSAGE("PP_SCRIPT_COUNT", 3);
  EXPECT_TRUE(matches(log(), linePattern("ERROR", first, "e 1") + linePattern("INFO ", first + 1, "i") +
                                 linePattern("TRACE", first + 2, "t") +
                                 linePattern("INFO ", first + 3, "Processing 3 scripts\\.")))
      << log();
}

TEST_F(LoggerTest, TimeIsTheLocalOne) {
  setenv("TZ", "FAR-05:30", 1);
  startEmptyLog();
  const time_t before = time(nullptr);
  LOG_TRACE("when");
  const time_t after = time(nullptr);
  EXPECT_THAT(log().substr(6, 8), ::testing::AnyOf(clockAt(before), clockAt(after)));
  unsetenv("TZ");
  tzset();
}

TEST_F(LoggerTest, LongLineStaysWhole) {
  const std::size_t prefix = std::strlen("ERROR 00:00:00 (logger_test,100): ");
  logInit();
  setLine(100);
  for (std::size_t power = 256; power <= 8192; power *= 2)
    for (std::size_t lineLength = power - 2; lineLength <= power + 2; ++lineLength) {
      fs::resize_file(logPath(), 0);
      const std::string message(lineLength - prefix, 'm');
      logError(LOG_COMPONENT, "%s", message.c_str());
      EXPECT_EQ(log().substr(prefix), message + "\n");
    }
}

TEST_F(LoggerTest, PercentSignsOfAnArgumentAreWrittenAsTheyAre) {
  startEmptyLog();
  setLine(1);
  logTrace(LOG_COMPONENT, "%s", "50%s%n");
  EXPECT_TRUE(matches(log(), linePattern("TRACE", 1, "50%s%n"))) << log();
}

TEST_F(LoggerTest, EmptyMessageIsAPrefixAlone) {
  startEmptyLog();
  setLine(1);
  logTrace(LOG_COMPONENT, "%s", "");
  EXPECT_TRUE(matches(log(), linePattern("TRACE", 1, ""))) << log();
}

TEST_F(LoggerTest, FileIsOpenedForEachLineSoThatOthersMayTakeItAway) {
  startEmptyLog();
  setLine(1);
  logTrace(LOG_COMPONENT, "old");
  fs::rename(logPath(), home() + "rotated");
  logTrace(LOG_COMPONENT, "new");
  EXPECT_TRUE(matches(read(home() + "rotated"), linePattern("TRACE", 1, "old")));
  EXPECT_TRUE(matches(log(), linePattern("TRACE", 1, "new")));
}

TEST_F(LoggerTest, WhatOthersAppendBetweenTwoLinesIsKept) {
  startEmptyLog();
  setLine(1);
  logTrace(LOG_COMPONENT, "a");
  std::ofstream(logPath(), std::ios::app) << "from outside\n";
  logTrace(LOG_COMPONENT, "b");
  EXPECT_TRUE(matches(log(), linePattern("TRACE", 1, "a") + "from outside\n" + linePattern("TRACE", 1, "b")));
}

TEST_F(LoggerTest, LinesOfTwoProcessesStayWhole) {
  constexpr int Lines = 200;
  const std::string filling(300, 'x');
  startEmptyLog();
  setLine(1);
  const pid_t other = fork();
  for (int line = 0; line < Lines; ++line)
    logTrace(LOG_COMPONENT, "%s", filling.c_str());
  if (other == 0)
    _exit(0);
  waitpid(other, nullptr, 0);
  std::istringstream written(log());
  const std::regex wholeLine(linePattern("TRACE", 1, filling));
  int wholeLines = 0;
  for (std::string line; std::getline(written, line); ++wholeLines)
    EXPECT_TRUE(std::regex_match(line + "\n", wholeLine)) << line;
  EXPECT_EQ(wholeLines, 2 * Lines);
}

class LoggerToStdoutTest : public LoggerTest, public ::testing::WithParamInterface<const char *> {
protected:
  void SetUp() override {
    LoggerTest::SetUp();
    setenv("PATCH_DEBUG", GetParam(), 1);
  }
};

TEST_P(LoggerToStdoutTest, SwitchSendsHeaderAndLinesToStandardOutput) {
  CaptureStdout();
  logInit();
  setLine(7);
  logError(LOG_COMPONENT, "one");
  logInfo(LOG_COMPONENT, "two");
  logTrace(LOG_COMPONENT, "three");
  const std::string printed = GetCapturedStdout();
  EXPECT_TRUE(matches(printed, headerPattern() + linePattern("ERROR", 7, "one") +
                                   linePattern("INFO ", 7, "two") + linePattern("TRACE", 7, "three")))
      << printed;
}

TEST_P(LoggerToStdoutTest, SwitchLeavesTheHomeUntouched) {
  glbLogFileName = logPath();
  CaptureStdout();
  logInit();
  LOG_TRACE("line");
  GetCapturedStdout();
  EXPECT_TRUE(glbLogToSTDOUT);
  EXPECT_EQ(glbLogFileName, "");
  EXPECT_TRUE(fs::is_empty(home()));
}

INSTANTIATE_TEST_SUITE_P(EmptyAndNotEmpty, LoggerToStdoutTest, ::testing::Values("", "0", "yes"));

/// A home in which no log can be written, for root as for others: patchlogs is a file.
class UnwritableLogTest : public LoggerTest {
protected:
  void SetUp() override {
    LoggerTest::SetUp();
    write("patchlogs", "in the way");
  }

  std::string complaint() const { return "Unable to write to log file: " + logPath() + "\n"; }
};

TEST_F(UnwritableLogTest, HeaderAndEveryLineAreReportedOnStandardError) {
  CaptureStdout();
  CaptureStderr();
  logInit();
  LOG_ERROR("one");
  LOG_INFO("two");
  LOG_TRACE("three");
  EXPECT_EQ(GetCapturedStderr(), complaint() + complaint() + complaint() + complaint());
  EXPECT_EQ(GetCapturedStdout(), "");
  EXPECT_EQ(read(home() + "patchlogs"), "in the way");
}

TEST_F(UnwritableLogTest, LaterLinesAreWrittenOnceTheFileCanBeOpened) {
  CaptureStderr();
  logInit();
  fs::remove(home() + "patchlogs");
  fs::create_directory(home() + "patchlogs");
  setLine(1);
  logTrace(LOG_COMPONENT, "at last");
  EXPECT_EQ(GetCapturedStderr(), complaint());
  EXPECT_TRUE(matches(log(), linePattern("TRACE", 1, "at last"))) << log();
}

TEST_F(LoggerTest, ReadOnlyPatchlogsIsReportedOnStandardError) {
  REQUIRE_ORDINARY_USER();
  makeDirectory("patchlogs");
  fs::permissions(home() + "patchlogs", fs::perms(0555));
  CaptureStderr();
  logInit();
  LOG_TRACE("line");
  const std::string complaint = "Unable to write to log file: " + logPath() + "\n";
  EXPECT_EQ(GetCapturedStderr(), complaint + complaint);
}

TEST_F(LoggerTest, PipeInPlaceOfTheLogIsReportedAndNotWaitedFor) {
  makeDirectory("patchlogs");
  ASSERT_EQ(mkfifo(logPath().c_str(), 0600), 0);
  CaptureStderr();
  logInit();
  EXPECT_EQ(GetCapturedStderr(), "Unable to write to log file: " + logPath() + "\n");
}

TEST_F(LoggerTest, MissingHomeIsReportedOnStandardError) {
  setenv("QUILLHOME", (home() + "gone/").c_str(), 1);
  CaptureStderr();
  logInit();
  EXPECT_EQ(GetCapturedStderr(), "Unable to write to log file: " + home() + "gone/patchlogs/orvpatch.log\n");
  EXPECT_FALSE(isThere(home() + "gone"));
}

TEST_F(LoggerTest, SinkTakesEachFinishedLineInPlaceOfTheFile) {
  logInit();
  const std::string before = log();
  std::vector<std::string> taken;
  setLogSink([&taken](std::string_view text) { taken.emplace_back(text); });
  setLine(7);
  logError(LOG_COMPONENT, "%s", std::string(5000, 'x').c_str());
  setLine(8);
  logTrace(LOG_COMPONENT, "short");
  EXPECT_TRUE(setLogSink({}));
  EXPECT_EQ(log(), before);
  ASSERT_EQ(taken.size(), 2U);
  EXPECT_TRUE(matches(taken[0], linePattern("ERROR", 7, std::string(5000, 'x'))));
  EXPECT_TRUE(matches(taken[1], linePattern("TRACE", 8, "short")));
}

TEST_F(LoggerTest, WithoutASinkTheFileIsWrittenAgain) {
  logInit();
  EXPECT_FALSE(setLogSink([](std::string_view) {}));
  static_cast<void>(setLogSink({}));
  const std::string before = log();
  setLine(9);
  logInfo(LOG_COMPONENT, "back");
  ASSERT_EQ(log().compare(0, before.size(), before), 0);
  EXPECT_TRUE(matches(log().substr(before.size()), linePattern("INFO ", 9, "back")));
}

} // namespace
