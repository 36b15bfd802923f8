// Programs that orvpatchctl runs, and checksums.
#include "child.h"

#include <chrono>
#include <csignal>
#include <cstdlib>

#include <gtest/gtest.h>
#include <unistd.h>

#include "checksums.h"
#include "judgement.h"
#include "scratch.h"
#include "signals.h"

namespace {

const ChildEnvironment environment = {"/usr/bin:/bin", {"LC_ALL=C", "KEPT=yes"}};

TEST(CtlChild, OutputAndStatusAreKeptApart) {
  const ChildResult result = runChild({"sh", "-c", "echo out; echo err >&2; exit 7"}, environment);
  EXPECT_EQ(result.status, 7);
  EXPECT_EQ(result.out, "out\n");
  EXPECT_EQ(result.err, "err\n");
}

TEST(CtlChild, OutputLargerThanAPipeIsKeptWhole) {
  const ChildResult result = runChild({"sh", "-c", "head -c 3000000 /dev/zero | tr '\\0' x"}, environment);
  EXPECT_EQ(result.out, std::string(3000000, 'x'));
}

TEST(CtlChild, EnvironmentIsTheOneThatIsGiven) {
  setenv("CALLERS", "no", 1);
  const ChildResult result = runChild({"sh", "-c", "echo $KEPT $CALLERS $PATH"}, environment);
  EXPECT_EQ(result.out, "yes /usr/bin:/bin\n");
}

TEST(CtlChild, StandardInputIsEmpty) {
  EXPECT_EQ(runChild({"wc", "-c"}, environment).out, "0\n");
}

TEST(CtlChild, IgnoredSignalsAreNotInherited) {
  const auto before = signal(SIGTERM, SIG_IGN);
  const ChildResult result = runChild({"sh", "-c", "kill -TERM $$; echo survived"}, environment);
  signal(SIGTERM, before);
  EXPECT_EQ(result.status, 128 + SIGTERM);
  EXPECT_EQ(result.out, "");
}

TEST(CtlChild, ProgramThatIsNotFoundHasStatus127) {
  EXPECT_EQ(runChild({"no-such-program"}, environment).status, 127);
  EXPECT_EQ(findProgram("no-such-program", environment.path), "");
  EXPECT_EQ(findProgram("sh", "/nowhere:/bin"), "/bin/sh");
}

/// In a process of its own: what is noted stays noted.
TEST(CtlChildDeathTest, AnInterruptionThatCameBeforeTheWaitEndsIt) {
  const auto interrupted = [] {
    static_cast<void>(signal(SIGTERM, SIG_DFL));
    const InterruptionCatcher catcher;
    static_cast<void>(raise(SIGTERM));
    try {
      runChild({"sleep", "30"}, environment);
    } catch (const Interrupted &interruption) {
      _exit(interruption.signal);
    }
    _exit(0);
  };
  const auto start = std::chrono::steady_clock::now();
  EXPECT_EXIT(interrupted(), testing::ExitedWithCode(SIGTERM), "");
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(25));
}

class CtlChecksums : public ScratchHome {};

TEST_F(CtlChecksums, OfAFile) {
  const std::string file = write("plain", "abc");
  EXPECT_EQ(sha256OfFile(file), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_EQ(sha256OfFile(write("odd\nname", "abc")), sha256OfFile(file));
  EXPECT_THROW(sha256OfFile(home() + "gone"), JudgementError);
}

TEST_F(CtlChecksums, AreFoundInAListByTheWholeName) {
  const std::string digest(64, 'a');
  const std::string other(64, 'b');
  const std::string list =
      write("SHA256SUMS", other + "  longer_name\n" + std::string(64, 'A') + " *name\n" + "junk  name2\n");
  EXPECT_EQ(listedChecksum(list, "name"), digest);
  EXPECT_EQ(listedChecksum(list, "longer_name"), other);
  EXPECT_EQ(listedChecksum(list, "name2"), "");
  EXPECT_EQ(listedChecksum(home() + "gone", "name"), "");
}

} // namespace
