// Child processes, with real ones: what is captured, what is handed back, what a child inherits.
#include "process.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include "command.h"
#include "scratch.h"

namespace {

using ::testing::internal::CaptureStderr;
using ::testing::internal::CaptureStdout;
using ::testing::internal::GetCapturedStderr;
using ::testing::internal::GetCapturedStdout;

constexpr std::size_t KeptOfAStream = 4096;

LogLine processTrace(const std::string &message) {
  return trace("process.cpp", message);
}
LogLine processError(const std::string &message) {
  return error("process.cpp", message);
}

/// A line of shell that writes so many "x" to standard output.
std::string writeBytes(std::size_t count) {
  return "head -c " + std::to_string(count) + " /dev/zero | tr '\\0' x";
}

class ProcessTest : public ScratchHome {};

TEST_F(ProcessTest, ListingIsCapturedWithStatusZero) {
  write("dir/b", "");
  write("dir/a", "");
  const CapturedRun ls = capture({"ls", home() + "dir"});
  EXPECT_TRUE(ls.started);
  EXPECT_EQ(ls.rc, 0);
  EXPECT_EQ(ls.out, "a\nb\n");
  EXPECT_EQ(ls.err, "");
}

TEST_F(ProcessTest, RunIsTracedWithEveryElementOfTheVector) {
  capture({"test", "a b", "=", ""});
  EXPECT_EQ(logLines(), (LogLines{processTrace("runCommand entry"), processTrace("cmdArray[0]: test"),
                                  processTrace("cmdArray[1]: a b"), processTrace("cmdArray[2]: ="),
                                  processTrace("cmdArray[3]: "), processTrace("runCommand exit")}));
}

TEST_F(ProcessTest, StreamsAreToldApart) {
  const CapturedRun result = captureShell("echo to-out; echo to-err >&2");
  EXPECT_EQ(result.out, "to-out\n");
  EXPECT_EQ(result.err, "to-err\n");
}

TEST_F(ProcessTest, OutputIsAppendedToWhatTheStringsHold) {
  ArgumentVector argv({"/bin/sh", "-c", "echo more; echo worse >&2"});
  std::string out = "before ";
  std::string err = "bad ";
  EXPECT_TRUE(runCommand(argv.get(), nullptr, &out, &err));
  EXPECT_EQ(out, "before more\n");
  EXPECT_EQ(err, "bad worse\n");
}

TEST_F(ProcessTest, WithoutAStringOutputGoesToTheOwnStandardOutput) {
  ArgumentVector argv({"/bin/sh", "-c", "echo 'shown 100%s'; echo kept >&2"});
  std::string err;
  CaptureStdout();
  EXPECT_TRUE(runCommand(argv.get(), nullptr, nullptr, &err));
  EXPECT_EQ(GetCapturedStdout(), "shown 100%s\n");
  EXPECT_EQ(err, "kept\n");
}

TEST_F(ProcessTest, WithoutAStringErrorsGoToTheOwnStandardError) {
  ArgumentVector argv({"/bin/sh", "-c", "echo kept; echo 'shown 100%s' >&2"});
  std::string out;
  CaptureStderr();
  EXPECT_TRUE(runCommand(argv.get(), nullptr, &out, nullptr));
  EXPECT_EQ(GetCapturedStderr(), "shown 100%s\n");
  EXPECT_EQ(out, "kept\n");
}

TEST_F(ProcessTest, BothStreamsAndTheStatusMayBeLeftOut) {
  ArgumentVector argv({"/bin/sh", "-c", "echo out; echo err >&2; exit 9"});
  CaptureStdout();
  CaptureStderr();
  EXPECT_TRUE(runCommand(argv.get(), nullptr, nullptr, nullptr));
  EXPECT_EQ(GetCapturedStdout(), "out\n");
  EXPECT_EQ(GetCapturedStderr(), "err\n");
}

TEST_F(ProcessTest, SilentProgramLeavesTheStringsAlone) {
  ArgumentVector argv({"true"});
  std::string out = "kept";
  std::string err = "too";
  EXPECT_TRUE(runCommand(argv.get(), nullptr, &out, &err));
  EXPECT_EQ(out, "kept");
  EXPECT_EQ(err, "too");
}

TEST_F(ProcessTest, OnlyTheFirst4096BytesAreKept) {
  EXPECT_EQ(captureShell(writeBytes(10000)).out, std::string(KeptOfAStream, 'x'));
  EXPECT_EQ(captureShell(writeBytes(10000) + " >&2").err, std::string(KeptOfAStream, 'x'));
}

TEST_F(ProcessTest, Exactly4096BytesAreKeptWhole) {
  EXPECT_EQ(captureShell(writeBytes(KeptOfAStream)).out, std::string(KeptOfAStream, 'x'));
  EXPECT_EQ(captureShell(writeBytes(KeptOfAStream - 1)).out, std::string(KeptOfAStream - 1, 'x'));
}

TEST_F(ProcessTest, OnlyTheFirst4096BytesArePrinted) {
  ArgumentVector argv({"/bin/sh", "-c", writeBytes(5000)});
  CaptureStdout();
  EXPECT_TRUE(runCommand(argv.get(), nullptr, nullptr, nullptr));
  EXPECT_EQ(GetCapturedStdout(), std::string(KeptOfAStream, 'x'));
}

TEST_F(ProcessTest, OutputEndsAtTheFirstNul) {
  EXPECT_EQ(captureShell("printf 'shown\\0hidden'").out, "shown");
  EXPECT_EQ(captureShell("printf 'shown\\0hidden' >&2").err, "shown");
  EXPECT_EQ(captureShell("printf '\\0hidden'").out, "");
}

TEST_F(ProcessTest, PrintedOutputEndsAtTheFirstNulToo) {
  ArgumentVector argv({"/bin/sh", "-c", "printf 'out\\0hidden'; printf 'err\\0hidden' >&2"});
  CaptureStdout();
  CaptureStderr();
  EXPECT_TRUE(runCommand(argv.get(), nullptr, nullptr, nullptr));
  EXPECT_EQ(GetCapturedStdout(), "out");
  EXPECT_EQ(GetCapturedStderr(), "err");
}

TEST_F(ProcessTest, OutputWrittenInPiecesByOneAndBySeveralProcessesIsWhole) {
  EXPECT_EQ(captureShell("printf one; /bin/echo -n two; printf three; (printf four)").out, "onetwothreefour");
}

class ExitStatusTest : public ScratchHome, public ::testing::WithParamInterface<int> {};

TEST_P(ExitStatusTest, IsHandedBackWhileTheRunSucceeds) {
  const CapturedRun result = captureShell("exit " + std::to_string(GetParam()));
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, GetParam());
}

INSTANTIATE_TEST_SUITE_P(SmallToLargest, ExitStatusTest, ::testing::Values(0, 1, 3, 127, 128, 255));

TEST_F(ProcessTest, ProgramEndedByASignalCountsAsStatusZero) {
  const CapturedRun result = captureShell("echo alive; kill -KILL $$");
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 0); // KEEP(signal-is-zero)
  EXPECT_EQ(result.out, "alive\n");
}

TEST_F(ProcessTest, MissingProgramEndsWithItsErrorNumberAsStatus) {
  const CapturedRun result = capture({"/no/such/program", "argument"});
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 2);
  EXPECT_EQ(result.out, "");
  EXPECT_EQ(result.err, "");
  EXPECT_EQ(logLines(),
            (LogLines{processTrace("runCommand entry"), processTrace("cmdArray[0]: /no/such/program"),
                      processTrace("cmdArray[1]: argument"),
                      processError("error calling execvp = 2: No such file or directory"),
                      processTrace("runCommand exit")}));
}

TEST_F(ProcessTest, ProgramMissingOnTheSearchPathEndsTheSameWay) {
  setenv("PATH", (home() + "nowhere").c_str(), 1);
  EXPECT_EQ(capture({"no-such-program-at-all"}).rc, 2);
}

TEST_F(ProcessTest, FileWithoutExecutePermissionEndsWithStatus13) {
  const std::string script = write("script.sh", "#!/bin/sh\nexit 0\n", 0644);
  const CapturedRun result = capture({script});
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 13);
  EXPECT_EQ(logLines()[2], processError("error calling execvp = 13: Permission denied"));
}

TEST_F(ProcessTest, CommandWithBlanksIsOneProgramName) {
  const CapturedRun result = capture({"/bin/echo hello"});
  EXPECT_EQ(result.rc, 2);
  EXPECT_EQ(result.out, "");
}

TEST_F(ProcessTest, NothingIsExpandedForThereIsNoShell) {
  EXPECT_EQ(capture({"echo", "$HOME", "*", "a;b", "'q'"}).out, "$HOME * a;b 'q'\n");
}

TEST_F(ProcessTest, ProgramIsLookedUpOnTheSearchPath) {
  write("tools/quill-tool", "#!/bin/sh\necho found $1\n", 0755);
  setenv("PATH", (home() + "tools").c_str(), 1);
  EXPECT_EQ(capture({"quill-tool", "here"}).out, "found here\n");
}

TEST_F(ProcessTest, UnflushedOutputOfTheCallerIsNotRepeatedByAChildThatCannotExecute) {
  std::string out;
  ArgumentVector argv({"/no/such/program"});
  CaptureStdout();
  std::printf("before ");
  EXPECT_TRUE(runCommand(argv.get(), nullptr, &out, nullptr));
  EXPECT_EQ(GetCapturedStdout(), "before ");
  EXPECT_EQ(out, "");
}

TEST_F(ProcessTest, PrintedOutputStandsAfterWhatTheCallerPrintedBefore) {
  ArgumentVector argv({"echo", "child"});
  CaptureStdout();
  std::printf("before ");
  EXPECT_TRUE(runCommand(argv.get(), nullptr, nullptr, nullptr));
  std::printf("after");
  EXPECT_EQ(GetCapturedStdout(), "before child\nafter");
}

TEST_F(ProcessTest, EnvironmentAndDirectoryAreInherited) {
  setenv("QUILL_TEST_VALUE", "inherited", 1);
  makeDirectory("work");
  std::filesystem::current_path(home() + "work");
  const CapturedRun result = captureShell("echo $QUILL_TEST_VALUE; echo $QUILLHOME; /bin/pwd");
  unsetenv("QUILL_TEST_VALUE");
  EXPECT_EQ(result.out, "inherited\n" + home() + "\n" + home() + "work\n");
}

/// Another standard input, or none, for the time of a scope.
class StandardInputScope {
public:
  StandardInputScope() : before_(fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 3)) { close(STDIN_FILENO); }
  explicit StandardInputScope(const std::string &path) : StandardInputScope() {
    EXPECT_EQ(open(path.c_str(), O_RDONLY), STDIN_FILENO);
  }
  StandardInputScope(const StandardInputScope &) = delete;
  StandardInputScope &operator=(const StandardInputScope &) = delete;
  ~StandardInputScope() {
    close(STDIN_FILENO);
    if (before_ >= 0) {
      dup2(before_, STDIN_FILENO);
      close(before_);
    }
  }

private:
  int before_;
};

TEST_F(ProcessTest, StandardInputIsInherited) {
  const StandardInputScope input(write("input", "from the caller\n"));
  EXPECT_EQ(capture({"cat"}).out, "from the caller\n");
}

TEST_F(ProcessTest, ClosedStandardInputChangesNothing) {
  const StandardInputScope none;
  const std::size_t before = openDescriptors();
  const CapturedRun result = captureShell("echo out; echo err >&2; exit 5");
  EXPECT_EQ(result.rc, 5);
  EXPECT_EQ(result.out, "out\n");
  EXPECT_EQ(result.err, "err\n");
  EXPECT_EQ(openDescriptors(), before);
}

TEST_F(ProcessTest, OtherDescriptorsAreInherited) {
  const std::string path = write("shared", "");
  const int shared = open(path.c_str(), O_WRONLY);
  const CapturedRun result = captureShell("echo by the child >&" + std::to_string(shared));
  close(shared);
  EXPECT_EQ(result.rc, 0);
  EXPECT_EQ(read(path), "by the child\n");
}

TEST_F(ProcessTest, ProcessLeftBehindBySilentProgramIsNotWaitedFor) {
  const CapturedRun result = captureShell("sleep 60 & echo $! > " + home() + "pid");
  const pid_t leftBehind = std::stoi(read(home() + "pid"));
  EXPECT_EQ(kill(leftBehind, SIGKILL), 0) << "it ran when runCommand returned";
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 0);
  EXPECT_EQ(result.out + result.err, "");
}

/// Another disposition of a signal for the time of a scope.
class SignalScope {
public:
  SignalScope(int number, void (*disposition)(int)) : number_(number), before_(signal(number, disposition)) {}
  SignalScope(const SignalScope &) = delete;
  SignalScope &operator=(const SignalScope &) = delete;
  ~SignalScope() { signal(number_, before_); }

private:
  int number_;
  void (*before_)(int);
};

bool isIgnored(int number) {
  struct sigaction action = {};
  return sigaction(number, nullptr, &action) == 0 && action.sa_handler == SIG_IGN;
}

TEST_F(ProcessTest, WriteSignalsAreIgnoredAndAChildGetsTheCallersSigpipe) {
  for (const auto callers : {SIG_IGN, SIG_DFL}) { // the default last: it is remembered for other tests
    const SignalScope onPipe(SIGPIPE, callers);
    const SignalScope onSize(SIGXFSZ, SIG_DFL);
    ignoreWriteSignals();
    EXPECT_TRUE(isIgnored(SIGPIPE));
    EXPECT_TRUE(isIgnored(SIGXFSZ));
    EXPECT_EQ(captureShell("kill -PIPE $$; echo survived").out, callers == SIG_IGN ? "survived\n" : "");
    EXPECT_EQ(captureShell("ulimit -c 0; kill -XFSZ $$; echo survived").out, "survived\n");
    EXPECT_TRUE(isIgnored(SIGPIPE));
    EXPECT_TRUE(isIgnored(SIGXFSZ));
  }
}

TEST_F(ProcessTest, ChildOfTheCallerThatEndsFirstIsReapedAndForgotten) {
  const pid_t other = fork();
  if (other == 0)
    _exit(7);
  siginfo_t ended = {};
  ASSERT_EQ(waitid(P_PID, static_cast<id_t>(other), &ended, WEXITED | WNOWAIT), 0);
  const CapturedRun result = captureShell("echo out; exit 3");
  EXPECT_TRUE(result.started);
  EXPECT_EQ(result.rc, 3);
  EXPECT_EQ(result.out, "out\n");
  EXPECT_EQ(waitpid(other, nullptr, WNOHANG), -1) << "no zombie is left";
}

TEST_F(ProcessTest, ChildOfTheCallerThatGoesOnIsNotWaitedFor) {
  const pid_t other = fork();
  if (other == 0) {
    pause();
    _exit(7);
  }
  EXPECT_EQ(captureShell("exit 3").rc, 3);
  EXPECT_EQ(waitpid(other, nullptr, WNOHANG), 0);
  kill(other, SIGKILL);
  EXPECT_EQ(waitpid(other, nullptr, 0), other);
}

/// How often a pipe stands in a listing of descriptors.
int descriptorsOn(const std::string &listing, const std::string &pipe) {
  std::istringstream lines(listing);
  int count = 0;
  for (std::string line; std::getline(lines, line);)
    count += line == pipe ? 1 : 0;
  return count;
}

TEST_F(ProcessTest, ChildHasEachWriteEndTwiceAndNoReadEnd) {
  const CapturedRun result = captureShell("readlink /proc/self/fd/1; readlink /proc/self/fd/2; "
                                          "for d in /proc/self/fd/*; do readlink $d; done");
  std::istringstream listing(result.out);
  std::string outPipe;
  std::string errPipe;
  std::getline(listing, outPipe);
  std::getline(listing, errPipe);
  EXPECT_THAT(outPipe, ::testing::StartsWith("pipe:["));
  EXPECT_THAT(errPipe, ::testing::StartsWith("pipe:["));
  EXPECT_NE(outPipe, errPipe);
  // The line that named the pipe itself, the stream, and the end that it was duplicated from.
  EXPECT_EQ(descriptorsOn(result.out, outPipe), 1 + 2) << result.out;
  EXPECT_EQ(descriptorsOn(result.out, errPipe), 1 + 2) << result.out;
}

TEST_F(ProcessTest, ManyRunsLeaveNoDescriptorOpen) {
  const std::size_t before = openDescriptors();
  for (int run = 0; run < 5; ++run)
    capture({run % 2 == 0 ? "true" : "/no/such/program"});
  EXPECT_EQ(openDescriptors(), before);
}

TEST_F(ProcessTest, CommandGivenAsWordsIsRunTheSameWay) {
  CommandResult result;
  EXPECT_TRUE(runCommand({"/bin/sh", "-c", "echo $1; echo $2 >&2; exit 4", "sh", "a b", "c"}, result));
  EXPECT_EQ(result.rc, 4);
  EXPECT_EQ(result.out, "a b\n");
  EXPECT_EQ(result.err, "c\n");
  EXPECT_EQ(logLines(), (LogLines{processTrace("runCommand entry"), processTrace("cmdArray[0]: /bin/sh"),
                                  processTrace("cmdArray[1]: -c"),
                                  processTrace("cmdArray[2]: echo $1; echo $2 >&2; exit 4"),
                                  processTrace("cmdArray[3]: sh"), processTrace("cmdArray[4]: a b"),
                                  processTrace("cmdArray[5]: c"), processTrace("runCommand exit")}));
}

/// The pipe size that the system gives this user, up to the size that the tool asks for.
int largestPipeGiven() {
  constexpr int Wanted = 16 * 1024 * 1024;
  int ends[2] = {-1, -1};
  EXPECT_EQ(pipe(ends), 0);
  int limit = 0;
  std::ifstream("/proc/sys/fs/pipe-max-size") >> limit; // binds ordinary users
  const int given = std::max(fcntl(ends[0], F_SETPIPE_SZ, Wanted), std::min(limit, Wanted));
  close(ends[0]);
  close(ends[1]);
  return given;
}

TEST_F(ProcessTest, PipesHoldAsMuchAsTheSystemGives) {
  int outPipe[2] = {-1, -1};
  int errPipe[2] = {-1, -1};
  const int given = largestPipeGiven();
  createPipes(outPipe, errPipe);
  EXPECT_EQ(fcntl(outPipe[0], F_GETPIPE_SZ), given);
  EXPECT_EQ(fcntl(errPipe[0], F_GETPIPE_SZ), given);
  for (const int end : {outPipe[0], outPipe[1], errPipe[0], errPipe[1]})
    close(end);
}

TEST_F(ProcessTest, ProgramThatSaysMoreThanAnUsualPipeHoldsEnds) {
  const CapturedRun result = captureShell(writeBytes(500000) + "; " + writeBytes(500000) + " >&2; exit 6");
  EXPECT_EQ(result.rc, 6);
  EXPECT_EQ(result.out, std::string(KeptOfAStream, 'x'));
  EXPECT_EQ(result.err, std::string(KeptOfAStream, 'x'));
}

TEST_F(ProcessTest, CreatePipesMakesTwoPipesReadEndFirst) {
  int outPipe[2] = {-1, -1};
  int errPipe[2] = {-1, -1};
  EXPECT_TRUE(createPipes(outPipe, errPipe));
  EXPECT_EQ(::write(outPipe[1], "o", 1), 1);
  EXPECT_EQ(::write(errPipe[1], "e", 1), 1);
  char fromOut = 0;
  char fromErr = 0;
  EXPECT_EQ(::read(outPipe[0], &fromOut, 1), 1);
  EXPECT_EQ(::read(errPipe[0], &fromErr, 1), 1);
  EXPECT_EQ(fromOut, 'o');
  EXPECT_EQ(fromErr, 'e');
  for (const int end : {outPipe[0], outPipe[1], errPipe[0], errPipe[1]})
    EXPECT_EQ(close(end), 0);
  EXPECT_EQ(logLines(), LogLines{});
}

} // namespace
