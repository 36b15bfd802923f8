// A patch when the system refuses: no child, no way back, no room for the records.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <cerrno>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "patchhome.h"
#include "systemcalls.h"
#include "utilities.h"

namespace {

using Names = std::vector<std::string>;

const std::string PatchName = "kxe_lpp266_vema_fp0001.tar";

class RefusedTest : public PatchHome {
protected:
  void SetUp() override {
    PatchHome::SetUp();
    restoreSystemCalls();
  }
  void TearDown() override {
    restoreSystemCalls();
    PatchHome::TearDown();
  }

public:
  Processor processor(const std::string &sections = "") {
    return loaded(PatchName, patchIni("kxe", "06200001", sections));
  }
};

TEST_F(RefusedTest, ArchiveIsCode3WhenTarCannotBeRun) {
  const Processor kxe = processor();
  failCall("fork", EAGAIN);
  const std::string before = Util::getCurrentDirectory();
  const Record record = {3, "Unable to run tar -xf"};
  EXPECT_EQ(expectOwnFailure(record, [&](PatchError *err) { return kxe->extract(err); }),
            (LogLines{pp("PatchProcessor::extract() entry"), ppError(record.second),
                      pp("PatchProcessor::extract() = 0")}));
  EXPECT_EQ(expectOwnFailure(record, [&](PatchError *err) { return kxe->extractINI(err); }),
            (LogLines{pp("PatchProcessor::extractINI() entry"), ppError(record.second),
                      pp("PatchProcessor::extractINI() = 0")}));
  EXPECT_EQ(Util::getCurrentDirectory(), before);
}

TEST_F(RefusedTest, HistoryShowsTheDateAndTheWholeClock) {
  setenv("TZ", "UTC", 1);
  tzset();
  answerTime(1173131324);
  processor()->updatePatchRegistry(true);
  unsetenv("TZ");
  tzset();
  EXPECT_THAT(read(home() + "patchlogs/patches.hist"), ::testing::EndsWith(" | 03/05/2007 21:48:44\n"));
}

TEST_F(RefusedTest, WayBackFromAnExtractionIsNotLookedAt) {
  makePatch(PatchName, patchIni("kxe"));
  const Processor kxe = processorFor(PatchName);
  failCall("chdir", EACCES).on(Util::getCurrentDirectory());
  PatchError err;
  EXPECT_TRUE(kxe->extract(&err));
  EXPECT_EQ(recordOf(err), NoError);
}

TEST_F(RefusedTest, CommandsThatCannotBeRunStopTheirList) {
  const Processor kxe = processor(bareSection("PreCommands", {"1.sh", "2.sh"}));
  const std::string path = getenv("PATH");
  const std::string before = Util::getCurrentDirectory();
  failCall("fork", EAGAIN);
  EXPECT_EQ(
      expectOwnFailure({21, "Unable to run 1.sh"}, [&](PatchError *err) { return kxe->runPreScripts(err); }),
      (LogLines{pp("PatchProcessor::runPreScripts() entry"), pp("PatchProcessor::runScripts() entry"),
                pp("old PATH=" + path), pp("Setting PATH=" + home() + "tmp/kxe:" + path),
                ppInfo("Processing 2 scripts."), ppInfo("Attempting to execute: 1.sh"),
                ppError("Unable to run 1.sh"), pp("Restoring PATH=" + path),
                pp("PatchProcessor::runScripts() = 0"), pp("PatchProcessor::runPreScripts() = 0")}));
  EXPECT_EQ(getenv("PATH"), path);
  EXPECT_EQ(Util::getCurrentDirectory(), before);
  expectOwnFailure({-1, "Unable to run 2.sh"},
                   [&](PatchError *err) { return kxe->runScripts({"2.sh"}, err); });
}

TEST_F(RefusedTest, ConsoleIsNotRunningWhenItCannotBeLookedFor) {
  setPsOfAll("quill 11 1 0 08:00 ? java -jar " + home() + "classes/wbt.jar\n");
  const Processor kzt = processorFor("kzt_lpp266_vecm_1.tar");
  failCall("fork", EAGAIN);
  EXPECT_TRUE(kzt->checkForActivePrograms(nullptr));
}

/// The walks of updated_files, which end in the directory from which they were called.
struct Walk {
  const char *name;
  bool (PatchProcessor::*operation)(PatchError *);
};

class WayBackTest : public RefusedTest, public ::testing::WithParamInterface<Walk> {};

TEST_P(WayBackTest, ThatIsRefusedIsCode24) {
  makeDirectory("tmp/kxe/updated_files");
  const Processor kxe = processor();
  const std::string before = Util::getCurrentDirectory();
  expectOwnFailure({24, "Could not change current working directory to: " + before}, [&](PatchError *err) {
    restoreSystemCalls();
    EXPECT_TRUE(Util::setCurrentDirectory(before));
    failCall("chdir", EACCES).on(before);
    return (kxe.get()->*GetParam().operation)(err);
  });
}

INSTANTIATE_TEST_SUITE_P(Walks, WayBackTest,
                         ::testing::Values(Walk{"move", &PatchProcessor::moveFiles},
                                           Walk{"list", &PatchProcessor::listFiles}),
                         [](const auto &test) { return test.param.name; });

TEST_F(RefusedTest, VersionFileThatCannotBeOpenedForWritingIsCode28) {
  const std::string path = install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  const std::string message = "Could not update VRMF for " + path + ": Read-only file system";
  failCall("open", EROFS).on(path).after(1).times(1); // reading it succeeds
  PatchError err;
  EXPECT_FALSE(kxe->updatePatchVerFile(&err));
  EXPECT_EQ(recordOf(err), Record(28, message));
  EXPECT_EQ(ownLines(), (LogLines{pp("PatchProcessor::updatePatchVerFile() entry"), ppError(message)}));
}

// KEEP(version-write-true)
TEST_F(RefusedTest, VersionFileThatCannotBeWrittenToTheEndIsLoggedAndThePatchGoesOn) {
  install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  constexpr int LinesOfTheLogBefore = 5; // entry, and the four of the reader; each is one write
  failCall("write", ENOSPC).after(LinesOfTheLogBefore).times(1);
  PatchError err;
  EXPECT_TRUE(kxe->updatePatchVerFile(&err));
  EXPECT_EQ(recordOf(err), NoError);
  const LogLines lines = ownLines();
  EXPECT_EQ(lines.front(), pp("PatchProcessor::updatePatchVerFile() entry"));
  EXPECT_EQ(lines.back(), pp("PatchProcessor::updatePatchVerFile() = 1"));
  EXPECT_EQ(
      std::count_if(lines.begin(), lines.end(), [](const LogLine &line) { return line.level == "ERROR"; }),
      1);
}

/// What can still fail when the text has been written, and how often it succeeds before.
struct LateFailure {
  const char *call;
  int after;
};

class VersionOnDiskTest : public RefusedTest, public ::testing::WithParamInterface<LateFailure> {};

TEST_P(VersionOnDiskTest, FailureIsLoggedAndThePatchGoesOn) {
  const std::string path = install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  failCall(GetParam().call, EIO).after(GetParam().after).times(1);
  PatchError err;
  EXPECT_TRUE(kxe->updatePatchVerFile(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), (LogLines{pp("PatchProcessor::updatePatchVerFile() entry"),
                                  ppError("Could not update VRMF for " + path + ": Input/output error"),
                                  pp("PatchProcessor::updatePatchVerFile() = 1")}));
  EXPECT_NE(read(path).find("VRMF = 06200001\n"), std::string::npos);
}

/// A file system that does not know of flushing.
class NoFlushTest : public RefusedTest, public ::testing::WithParamInterface<int> {};

TEST_P(NoFlushTest, IsNoFailure) {
  const std::string path = install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  failCall("fsync", GetParam());
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr));
  EXPECT_EQ(read(path), "desc = \nVRMF = 06200001\n\n");
  kxe->updatePatchRegistry(true);
  EXPECT_EQ(callsOf("fsync"), 2);
  for (const LogLine &line : ownLines())
    EXPECT_NE(line.level, "ERROR") << line;
}

INSTANTIATE_TEST_SUITE_P(Reasons, NoFlushTest, ::testing::Values(EINVAL, ENOSYS, EROFS));

TEST_F(RefusedTest, EndBetweenWritingAndCuttingTheVersionFileLeavesALevel) {
  const std::string path = write("registry/xelpp266.ver", "a\r\n\r\nVRMF = 06200000\r\nb\r\n");
  const Processor kxe = processor();
  failCall("ftruncate", EIO).times(1);
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr)); // KEEP(version-write-true)
  EXPECT_EQ(read(path), "a\nVRMF = 06200001\nb\n\n\nb\r\n") << "behind the new text the end of the old one";
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr));
  EXPECT_EQ(read(path), "a\nVRMF = 06200001\nb\nb\n\n");
}

TEST_F(RefusedTest, VersionFileIsNotCutBeforeAllOfItIsWritten) {
  const std::string before = "desc = a long name\nVRMF = 06200000\n";
  const std::string path = write("registry/xelpp266.ver", before);
  const Processor kxe = processor();
  constexpr int LinesOfTheLogBefore = 5; // entry, and the four of the reader; each is one write
  failCall("write", ENOSPC).after(LinesOfTheLogBefore).times(1);
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr));
  EXPECT_EQ(read(path), before);
}

TEST_F(RefusedTest, MovedFilesAreOnDiskBeforeTheLevelIs) {
  write("tmp/kxe/updated_files/bin/agent", "new");
  install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  EXPECT_TRUE(kxe->moveFiles(nullptr));
  restoreSystemCalls();
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr));
  EXPECT_EQ(callsAmong({"syncfs", "ftruncate", "fsync"}), (Names{"syncfs", "ftruncate", "fsync"}));
  EXPECT_EQ(callsOf("open", home()), 1);
}

TEST_F(RefusedTest, LevelIsWrittenWhenTheMovedFilesCannotBeFlushed) {
  write("tmp/kxe/updated_files/bin/agent", "new");
  const std::string path = install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  failCall("syncfs", EIO);
  EXPECT_TRUE(kxe->moveFiles(nullptr));
  failCall("open", EMFILE).on(home());
  PatchError err;
  EXPECT_TRUE(kxe->updatePatchVerFile(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(read(path), "desc = \nVRMF = 06200001\n\n");
}

TEST_F(RefusedTest, PatchWithoutFilesFlushesNoFileSystem) {
  install("xelpp266.ver", "06200000");
  const Processor kxe = processor();
  EXPECT_TRUE(kxe->moveFiles(nullptr));
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr));
  EXPECT_EQ(callsOf("syncfs"), 0);
}

// Before the close of the version file come those of five lines of the log and that of the reader.
INSTANTIATE_TEST_SUITE_P(Calls, VersionOnDiskTest,
                         ::testing::Values(LateFailure{"ftruncate", 0}, LateFailure{"fsync", 0},
                                           LateFailure{"close", 6}),
                         [](const auto &test) { return test.param.call; });

class HistoryOnDiskTest : public RefusedTest, public ::testing::WithParamInterface<LateFailure> {};

TEST_P(HistoryOnDiskTest, FailureIsLoggedWithItsReason) {
  const Processor kxe = processor();
  ownLines();
  restoreSystemCalls();
  failCall(GetParam().call, EIO).after(GetParam().after).times(1);
  kxe->updatePatchRegistry(true);
  EXPECT_EQ(ownLines(), (LogLines{pp("PatchProcessor::updatePatchRegistry() entry"),
                                  ppError("Unable to update patch history file, " + home() +
                                          "patchlogs/patches.hist: Input/output error"),
                                  pp("PatchProcessor::updatePatchRegistry() exit")}));
}

// Before the write and the close of the history come those of one line of the log.
INSTANTIATE_TEST_SUITE_P(Calls, HistoryOnDiskTest,
                         ::testing::Values(LateFailure{"write", 1}, LateFailure{"fsync", 0},
                                           LateFailure{"close", 1}),
                         [](const auto &test) { return test.param.call; });

TEST_F(RefusedTest, FilesMoveWhenTheDiskCannotBeToldToWriteFirst) {
  write("tmp/kxe/updated_files/bin/agent", "new");
  const Processor kxe = processor();
  failCall("open", EMFILE).on(".");
  PatchError err;
  EXPECT_TRUE(kxe->moveFiles(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(callsOf("open", "."), 1);
  EXPECT_EQ(read(home() + "bin/agent"), "new");
}

TEST_F(RefusedTest, HistoryThatCannotBeOpenedNamesTheReason) {
  const Processor kxe = processor();
  const std::string path = home() + "patchlogs/patches.hist";
  failCall("open", EROFS).on(path);
  kxe->updatePatchRegistry(true);
  EXPECT_EQ(ownLines()[1],
            ppError("Unable to update patch history file, " + path + ": Read-only file system"));
  EXPECT_FALSE(isThere(path));
}

TEST_F(RefusedTest, HistoryOfAUserWithoutANameHasBlanksInItsPlace) {
  const Processor kxe = processor();
  failCall("getpwuid", 0);
  kxe->updatePatchRegistry(true);
  EXPECT_NE(read(home() + "patchlogs/patches.hist").find(" | PASS |                 | "), std::string::npos);
}

TEST_F(RefusedTest, HistoryWithoutALocalTimeHasAnEmptyDate) {
  const Processor kxe = processor();
  failCall("localtime", EOVERFLOW);
  failCall("localtime_r", EOVERFLOW);
  kxe->updatePatchRegistry(false);
  restoreSystemCalls();
  const std::string text = read(home() + "patchlogs/patches.hist");
  ASSERT_GE(text.size(), 3U);
  EXPECT_EQ(text.substr(text.size() - 3), "| \n");
}

TEST_F(RefusedTest, ResultFileThatCannotBeOpenedDoesNotStopTheOsAgent) {
  install("oxlpp266.ver");
  setRunning({{"ox", "11"}});
  const std::string path = home() + "vmaorv6/agentdepot/rc.txt";
  const Processor kxe = processor(bareSection("Dependents", {"ox"}));
  EXPECT_TRUE(kxe->stopDependents(nullptr));
  makeDirectory("vmaorv6/agentdepot");
  logLines();
  failCall("open", EMFILE).on(path);
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(0, nullptr));
  EXPECT_EQ(ownLines()[1], pp("Unable to write file: " + path + ". Too many open files"));
  EXPECT_EQ(journal().back(), "QuillAgent [start] [ox]");
}

} // namespace
