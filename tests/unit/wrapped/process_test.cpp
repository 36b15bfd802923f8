// Child processes when the system refuses what they need.
#include "process.h"

#include <algorithm>
#include <cerrno>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include "command.h"
#include "systemcalls.h"

namespace {

using ::testing::internal::CaptureStderr;
using ::testing::internal::CaptureStdout;
using ::testing::internal::GetCapturedStderr;
using ::testing::internal::GetCapturedStdout;

LogLine processTrace(const std::string &message) {
  return trace("process.cpp", message);
}
LogLine processError(const std::string &message) {
  return error("process.cpp", message);
}

const std::string WritesToBoth = "echo to-out; echo to-err >&2; exit 3";

class ProcessFailureTest : public SystemCallTest {
protected:
  /// What a run of a line of shell logs when all that goes wrong is `between`.
  static LogLines runTraces(const std::string &line, const LogLines &between, bool untilItsExit = true) {
    LogLines lines = {processTrace("runCommand entry"), processTrace("cmdArray[0]: /bin/sh"),
                      processTrace("cmdArray[1]: -c"), processTrace("cmdArray[2]: " + line)};
    lines.insert(lines.end(), between.begin(), between.end());
    if (untilItsExit)
      lines.push_back(processTrace("runCommand exit"));
    return lines;
  }

  /// Runs the line that writes to both streams, captured; what its child writes to the own streams instead
  /// is kept here. The plan of failures begins when those have been taken over, which needs dup2 itself.
  template <class Plan>
  CapturedRun runUnder(Plan plan) {
    CaptureStdout();
    CaptureStderr();
    plan();
    CapturedRun result = captureShell(WritesToBoth);
    restoreSystemCalls();
    ownStderr_ = GetCapturedStderr();
    ownStdout_ = GetCapturedStdout();
    return result;
  }

  std::string ownStdout_;
  std::string ownStderr_;
};

TEST_F(ProcessFailureTest, ForkThatFailsIsTheOneFailureOfTheRun) {
  failCall("fork", EAGAIN);
  ArgumentVector argv({"/bin/sh", "-c", "echo x"});
  int rc = 77;
  std::string out = "out";
  std::string err = "err";
  EXPECT_FALSE(runCommand(argv.get(), &rc, &out, &err));
  EXPECT_EQ(rc, 77);
  EXPECT_EQ(out, "out");
  EXPECT_EQ(err, "err");
  EXPECT_EQ(callsOf("wait"), 0);
  EXPECT_EQ(logLines(),
            runTraces("echo x", {processError("Error calling fork - exiting prematurely")}, false));
}

TEST_F(ProcessFailureTest, ForkThatFailsLeavesNoDescriptor) {
  const std::size_t before = openDescriptors();
  failCall("fork", ENOMEM);
  captureShell("true");
  EXPECT_EQ(openDescriptors(), before);
}

TEST_F(ProcessFailureTest, NoDescriptorIsClosedTwice) {
  captureShell(WritesToBoth);
  EXPECT_EQ(callsOf("close of nothing"), 0);
  failCall("fork", EAGAIN).times(1);
  captureShell("true");
  failCall("pipe", EMFILE).times(1);
  captureShell("true");
  EXPECT_EQ(callsOf("close of nothing"), 0);
}

TEST_F(ProcessFailureTest, CreatePipesSaysYesWhenItCannot) {
  failCall("pipe", EMFILE);
  int outPipe[2] = {7, 7};
  int errPipe[2] = {7, 7};
  EXPECT_TRUE(createPipes(outPipe, errPipe)); // KEEP(pipes-always-true)
  for (const int end : {outPipe[0], outPipe[1], errPipe[0], errPipe[1]})
    EXPECT_EQ(end, -1);
  EXPECT_EQ(logLines(), (LogLines{processError("Error creating stdOutPipe: Too many open files"),
                                  processError("Error creating stdErrPipe: Too many open files")}));
}

TEST_F(ProcessFailureTest, WithoutAPipeForItsOutputTheChildWritesToTheOwnStream) {
  const CapturedRun result = runUnder([] { failCall("pipe", ENFILE).times(1); });
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out, "");
  EXPECT_EQ(result.err, "to-err\n");
  EXPECT_EQ(ownStdout_, "to-out\n");
  EXPECT_EQ(logLines(),
            runTraces(WritesToBoth, {processError("Error creating stdOutPipe: Too many open files in system"),
                                     processError("Error duping STDOUT")}));
}

TEST_F(ProcessFailureTest, WithoutAPipeForItsErrorsTheChildWritesToTheOwnStream) {
  const CapturedRun result = runUnder([] { failCall("pipe", ENFILE).after(1); });
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out, "to-out\n");
  EXPECT_EQ(result.err, "");
  EXPECT_EQ(ownStderr_, "to-err\n");
  EXPECT_EQ(logLines(),
            runTraces(WritesToBoth, {processError("Error creating stdErrPipe: Too many open files in system"),
                                     processError("Error duping STDERR")}));
}

TEST_F(ProcessFailureTest, WithoutAnyPipeTheRunGoesOn) {
  const CapturedRun result = runUnder([] { failCall("pipe", EMFILE); });
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out + result.err, "");
  EXPECT_EQ(ownStdout_, "to-out\n");
  EXPECT_EQ(ownStderr_, "to-err\n");
}

TEST_F(ProcessFailureTest, ChildThatCannotTakeItsOutputOverWritesToTheOwnStream) {
  const CapturedRun result = runUnder([] { failCall("dup2", EBUSY).on("1"); });
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out, "");
  EXPECT_EQ(result.err, "to-err\n");
  EXPECT_EQ(ownStdout_, "to-out\n");
  EXPECT_EQ(logLines(), runTraces(WritesToBoth, {processError("Error duping STDOUT")}));
}

TEST_F(ProcessFailureTest, ChildThatCannotTakeItsErrorsOverWritesToTheOwnStream) {
  const CapturedRun result = runUnder([] { failCall("dup2", EBUSY).on("2"); });
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out, "to-out\n");
  EXPECT_EQ(result.err, "");
  EXPECT_EQ(ownStderr_, "to-err\n");
  EXPECT_EQ(logLines(), runTraces(WritesToBoth, {processError("Error duping STDERR")}));
}

TEST_F(ProcessFailureTest, ErrorNumberOfTheExecutionIsTheStatus) {
  failCall("execvp", E2BIG);
  const CapturedRun result = captureShell("true");
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, E2BIG);
  EXPECT_EQ(logLines(),
            runTraces("true", {processError("error calling execvp = 7: Argument list too long")}));
}

TEST_F(ProcessFailureTest, ChildThatCannotDoAnythingSaysSoThreeTimes) {
  const CapturedRun result = runUnder([] {
    failCall("dup2", EBUSY);
    failCall("execvp", E2BIG);
  });
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, E2BIG);
  EXPECT_EQ(result.out + result.err, "");
  EXPECT_EQ(ownStdout_ + ownStderr_, "");
  EXPECT_EQ(logLines(),
            runTraces(WritesToBoth, {processError("Error duping STDOUT"), processError("Error duping STDERR"),
                                     processError("error calling execvp = 7: Argument list too long")}));
}

TEST_F(ProcessFailureTest, InterruptedWaitIsTakenUpAgain) {
  failCall("wait", EINTR).times(2);
  const CapturedRun result = captureShell("echo x; exit 4");
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 4);
  EXPECT_EQ(result.out, "x\n");
  EXPECT_EQ(callsOf("wait"), 3);
}

TEST_F(ProcessFailureTest, ChildThatCannotBeWaitedForFailsTheRun) {
  failCall("wait", ECHILD).times(1);
  const CapturedRun result = captureShell("true");
  EXPECT_FALSE(result.started);
  EXPECT_EQ(result.rc, -1);
  const pid_t child = wait(nullptr);
  EXPECT_GT(child, 0) << "the child is still to be reaped";
  const std::string text = "Error waiting for process " + std::to_string(child) + ": No child processes";
  EXPECT_EQ(logLines(), runTraces("true", {processError(text)}, false));
}

TEST_F(ProcessFailureTest, RefusedSizesLeaveThePipeAtTheFirstThatIsGiven) {
  failCall("fcntl", EPERM).on(std::to_string(F_SETPIPE_SZ)).times(4); // 16, 8, 4 and 2 MiB
  int outPipe[2] = {-1, -1};
  int errPipe[2] = {-1, -1};
  createPipes(outPipe, errPipe);
  EXPECT_EQ(fcntl(outPipe[1], F_GETPIPE_SZ), 1024 * 1024);
  for (const int end : {outPipe[0], outPipe[1], errPipe[0], errPipe[1]})
    close(end);
}

TEST_F(ProcessFailureTest, PipeThatCannotBeEnlargedStaysAsItWas) {
  int usual[2] = {-1, -1};
  ASSERT_EQ(pipe(usual), 0);
  failCall("fcntl", EPERM).on(std::to_string(F_SETPIPE_SZ));
  int outPipe[2] = {-1, -1};
  int errPipe[2] = {-1, -1};
  createPipes(outPipe, errPipe);
  EXPECT_EQ(fcntl(outPipe[1], F_GETPIPE_SZ), fcntl(usual[1], F_GETPIPE_SZ));
  for (const int end : {usual[0], usual[1], outPipe[0], outPipe[1], errPipe[0], errPipe[1]})
    close(end);
  const CapturedRun result = captureShell(WritesToBoth);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out + result.err, "to-out\nto-err\n");
  EXPECT_EQ(logLines(), runTraces(WritesToBoth, {}));
}

TEST_F(ProcessFailureTest, EndOfTheChildIsWaitedForBeforeAnythingIsRead) {
  captureShell(WritesToBoth);
  EXPECT_EQ(callsAmong({"wait", "read"}), // KEEP(wait-before-read)
            (std::vector<std::string>{"wait", "read", "read"}));
}

TEST_F(ProcessFailureTest, WriteEndsAreClosedBeforeTheEndOfTheChildIsWaitedFor) {
  captureShell(WritesToBoth);
  std::vector<std::string> calls = callsAmong({"open", "close", "wait"});
  calls.erase(std::find(calls.begin(), calls.end(), "wait"), calls.end());
  const auto opened = std::count(calls.begin(), calls.end(), "open"); // and closed again: lines of the log
  EXPECT_EQ(std::count(calls.begin(), calls.end(), "close"), opened + 2);
}

TEST_F(ProcessFailureTest, OutputThatCannotBeReadIsLeftOut) {
  failCall("read", EIO);
  const CapturedRun result = captureShell(WritesToBoth);
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out + result.err, "");
  EXPECT_EQ(logLines(), runTraces(WritesToBoth, {}));
}

TEST_F(ProcessFailureTest, InterruptedReadIsTakenUpAgain) {
  failCall("read", EINTR).times(2);
  const CapturedRun result = captureShell(WritesToBoth);
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.out, "to-out\n");
  EXPECT_EQ(result.err, "to-err\n");
  EXPECT_EQ(callsOf("read"), 4);
}

} // namespace
