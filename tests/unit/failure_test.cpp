// The one failure path: log line, error record, false.
#include "failure.h"

#include <string>

#include <gtest/gtest.h>

#include "scratch.h"

#define LOG_COMPONENT "failure_test"

namespace {

class FailureTest : public ScratchHome {};

TEST_F(FailureTest, TextIsLoggedAndKeptInTheRecord) {
  PatchError err;
  EXPECT_FALSE(FAILURE(&err, PatchError::CannotUpdateVersion, "ERROR_PP_UPDATE_VRMF", "/h/a.ver", "5"));
  EXPECT_EQ(err.code, 28);
  EXPECT_EQ(err.text, "Could not update VRMF for /h/a.ver: 5");
  EXPECT_EQ(logLines(), LogLines{error("failure_test", "Could not update VRMF for /h/a.ver: 5")});
}

TEST_F(FailureTest, LineOfTheCallerStandsInTheLog) {
  FAILURE(nullptr, PatchError::CannotExtract, "PROC_CANT_RUN", "tar -xf");
  const int line = __LINE__ - 1;
  EXPECT_EQ(logLines().size(), 1U);
  EXPECT_EQ(sourceLines(), std::vector<int>{line});
}

TEST_F(FailureTest, NullRecordLeavesTheLogLine) {
  EXPECT_FALSE(FAILURE(nullptr, PatchError::CannotExtract, "PROC_BAD_RC", "tar -xf", 2));
  EXPECT_EQ(logLines(), LogLines{error("failure_test", "Bad return code from tar -xf: 2")});
}

TEST_F(FailureTest, LaterFailureReplacesTheEarlierOne) {
  PatchError err;
  FAILURE(&err, PatchError::CannotExtract, "PROC_CANT_RUN", "tar -xf");
  FAILURE(&err, PatchError::CannotRemoveDirectory, "ERROR_PP_RM_DIR", "/h/tmp/kxe");
  EXPECT_EQ(err.code, 27);
  EXPECT_EQ(err.text, "Unable to remove temporary directory: /h/tmp/kxe");
}

TEST_F(FailureTest, ComponentAndLineAreThoseThatWereGiven) {
  EXPECT_FALSE(reportFailure(620, "dcfpackageprocessor", nullptr, 30, "ERROR_DCFPP_PATH", "/p"));
  EXPECT_EQ(logLines(),
            LogLines{error("dcfpackageprocessor", "Unable to locate path or file specified: /p")});
  EXPECT_EQ(sourceLines(), std::vector<int>{620});
}

TEST_F(FailureTest, PercentSignsOfAnArgumentReachLogAndRecordAsTheyAre) {
  PatchError err;
  FAILURE(&err, PatchError::PathNotFound, "ERROR_DCFPP_PATH", "/p/100%s%n");
  EXPECT_EQ(err.text, "Unable to locate path or file specified: /p/100%s%n");
  EXPECT_EQ(logLines(),
            LogLines{error("failure_test", "Unable to locate path or file specified: /p/100%s%n")});
}

TEST_F(FailureTest, TextOfSeveralLinesIsOneMessage) {
  FAILURE(nullptr, PatchError::NoApplicablePatch, "ERROR_DCFPP_NO_APPLICABLE", "/p");
  EXPECT_EQ(
      logLines(),
      LogLines{error("failure_test", "Unable to locate or install patch files which are applicable to this\n"
                                     "system in the directory specified: /p.")});
}

TEST_F(FailureTest, LongTextIsCutInLogAndRecordAlike) {
  PatchError err;
  FAILURE(&err, PatchError::PathNotFound, "ERROR_DCFPP_PATH", std::string(2000, 'p').c_str());
  EXPECT_EQ(err.text.size(), 1023U);
  EXPECT_EQ(logLines(), LogLines{error("failure_test", err.text)});
}

TEST_F(FailureTest, FillRecordSetsCodeAndTextWithoutLogging) {
  PatchError err;
  fillRecord(&err, 34, "text");
  EXPECT_EQ(err.code, 34);
  EXPECT_EQ(err.text, "text");
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FailureTest, FillRecordLeavesOutANullRecord) {
  fillRecord(nullptr, 34, "text");
  EXPECT_EQ(logLines(), LogLines{});
}

} // namespace
