// The log when the system refuses what it needs.
#include "logger.h"

#include <cerrno>
#include <ctime>
#include <regex>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "systemcalls.h"

#define LOG_COMPONENT "logger_test"

namespace {

using ::testing::internal::CaptureStderr;
using ::testing::internal::GetCapturedStderr;

class LoggerFailureTest : public SystemCallTest {};

TEST_F(LoggerFailureTest, EachLineIsOneOpenOneWriteAndOneClose) {
  LOG_INFO("%s", std::string(3000, 'x').c_str());
  EXPECT_EQ(callsAmong({"open", "write", "close"}), (std::vector<std::string>{"open", "write", "close"}));
}

TEST_F(LoggerFailureTest, LineIsDroppedWithAComplaintWhenTheFileCannotBeOpened) {
  failCall("open", EMFILE).on(glbLogFileName).times(1);
  CaptureStderr();
  LOG_ERROR("dropped");
  LOG_ERROR("written");
  EXPECT_EQ(GetCapturedStderr(), "Unable to write to log file: " + glbLogFileName + "\n");
  EXPECT_EQ(logLines(), LogLines{error("logger_test", "written")});
}

TEST_F(LoggerFailureTest, HeaderIsDroppedWithAComplaintWhenTheFileCannotBeOpened) {
  const std::string before = read(glbLogFileName);
  failCall("open", EACCES).on(glbLogFileName);
  CaptureStderr();
  logInit();
  EXPECT_EQ(GetCapturedStderr(), "Unable to write to log file: " + glbLogFileName + "\n");
  EXPECT_EQ(read(glbLogFileName), before);
}

TEST_F(LoggerFailureTest, PatchlogsThatCannotBeMadeIsNotReportedItself) {
  failCall("mkdir", EACCES);
  CaptureStderr();
  logInit();
  LOG_TRACE("written all the same, for it is there");
  EXPECT_EQ(GetCapturedStderr(), "");
  EXPECT_EQ(callsOf("mkdir"), 1);
}

TEST_F(LoggerFailureTest, FullDiskCostsTheLineAndNothingElse) {
  failCall("write", ENOSPC).times(1);
  LOG_TRACE("lost");
  LOG_TRACE("kept");
  EXPECT_EQ(logLines(), LogLines{trace("logger_test", "kept")});
}

TEST_F(LoggerFailureTest, LineWrittenInPiecesIsWhole) {
  limitTransfers(7);
  LOG_TRACE("a line that is longer than seven bytes");
  restoreSystemCalls();
  EXPECT_EQ(logLines(), LogLines{trace("logger_test", "a line that is longer than seven bytes")});
}

TEST_F(LoggerFailureTest, InterruptedWriteIsTakenUpAgain) {
  failCall("write", EINTR).times(2);
  LOG_TRACE("persistent");
  EXPECT_EQ(logLines(), LogLines{trace("logger_test", "persistent")});
}

TEST_F(LoggerFailureTest, UnknownTimeIsAnEmptyText) {
  const std::string before = read(glbLogFileName);
  failCall("localtime", EOVERFLOW);
  setLine(5);
  logTrace(LOG_COMPONENT, "timeless");
  EXPECT_EQ(read(glbLogFileName), before + "TRACE  (logger_test,5): timeless\n");
}

TEST_F(LoggerFailureTest, UnknownTimeIsNotThatOfAnEarlierLine) {
  LOG_TRACE("in time");
  for (const time_t second = time(nullptr); time(nullptr) == second;) // lines of one second share its text
    usleep(10000);
  const std::string before = read(glbLogFileName);
  failCall("localtime", EOVERFLOW);
  setLine(5);
  logTrace(LOG_COMPONENT, "timeless");
  EXPECT_EQ(read(glbLogFileName), before + "TRACE  (logger_test,5): timeless\n");
}

/// A moment, and how the lines of the log show it in the zone of the test.
struct Moment {
  time_t now;
  const char *clock;
};

TEST_F(LoggerFailureTest, ClockOfALineIsThatOfItsMomentOfAnyDayAlsoWhenItIsSetBack) {
  setenv("TZ", "UTC", 1);
  logInit();
  for (const Moment &moment :
       {Moment{1000000, "13:46:40"}, Moment{999999, "13:46:39"}, Moment{86400, "00:00:00"},
        Moment{43200, "12:00:00"}, Moment{1173131324, "21:48:44"}, Moment{3, "00:00:03"}}) {
    const std::string before = read(glbLogFileName);
    answerTime(moment.now);
    setLine(5);
    logTrace(LOG_COMPONENT, "told");
    EXPECT_EQ(read(glbLogFileName), before + "TRACE " + moment.clock + " (logger_test,5): told\n");
  }
  unsetenv("TZ");
  tzset();
}

TEST_F(LoggerFailureTest, UserWithoutAnEntryIsAnEmptyNameInTheHeader) {
  failCall("getpwuid", 0);
  logInit();
  EXPECT_THAT(read(glbLogFileName), ::testing::HasSubstr("\n   User Name:   \n   Process ID:  "));
}

TEST_F(LoggerFailureTest, HeaderShowsTheHostWithoutItsDomain) {
  answerNodeName("build7.lab.local");
  logInit();
  EXPECT_THAT(read(glbLogFileName), ::testing::HasSubstr("\n   System Name: build7\n   User Name:   "));
}

} // namespace
