// Files and directories when the system refuses what they need.
#include "file.h"

#include <cerrno>
#include <filesystem>
#include <string>
#include <utility>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "systemcalls.h"

namespace {

namespace fs = std::filesystem;
using ::testing::Contains;

LogLine fileTrace(const std::string &message) {
  return trace("file.cpp", message);
}
LogLine fileError(const std::string &message) {
  return error("file.cpp", message);
}

const LogLine LoadEntry = fileTrace("loadDir() entry");
const LogLine LoadExit = fileTrace("loadDir() exit");

class SnapshotFailureTest : public SystemCallTest, public ::testing::WithParamInterface<int> {};

TEST_P(SnapshotFailureTest, FailingStatusMeansNothingIsThere) {
  const std::string path = write("file", "text");
  failCall("stat", GetParam()).on(path);
  const File file(path);
  EXPECT_FALSE(file.exists()) << "even though the path is accessible";
  EXPECT_FALSE(file.isFile());
  EXPECT_FALSE(file.isDirectory());
  EXPECT_EQ(file.getSize(), 0);
  EXPECT_EQ(file.getLastModification(), 0);
}

INSTANTIATE_TEST_SUITE_P(Reasons, SnapshotFailureTest, ::testing::Values(ENOENT, ENOTDIR, EACCES, EIO));

class FileFailureTest : public SystemCallTest {
protected:
  std::string source() const { return home() + "source"; }
  std::string target() const { return home() + "target"; }

  static LogLines moved(const LogLines &between) {
    return framed(fileTrace("moveFile entry"), between, fileTrace("moveFile exit"));
  }
  LogLine deletingTarget() const { return fileTrace("deleting existing target: " + target()); }
  LogLine notDeleted(const std::string &path) const {
    return fileTrace("Unable to delete file [" + path + "]: Unknown error -1");
  }
  LogLine notLinked(const std::string &reason) const {
    return fileTrace("unable to link: " + source() + " to " + target() + ". " + reason);
  }
};

TEST_F(FileFailureTest, LinkMovesWhenTheModeOfItsDestinationCannotBeSet) {
  write("destination", "text");
  fs::create_symlink(home() + "destination", source());
  failCall("chmod", EPERM);
  File link(source());
  EXPECT_TRUE(link.moveFile(target(), true));
  EXPECT_TRUE(fs::is_symlink(target()));
  EXPECT_THAT(logLines(), Contains(fileTrace("unable to chmod for file: " + target())));
}

TEST_F(FileFailureTest, OnlyMissingPathsAreNotLogged) {
  const std::string path = write("file", "");
  failCall("stat", ENOENT).on(path).times(1);
  failCall("stat", ENOTDIR).on(path).times(1);
  failCall("stat", EACCES).on(path).times(1);
  const File first(path);
  const File second(path);
  EXPECT_EQ(logLines(), LogLines{});
  const File third(path);
  EXPECT_EQ(logLines(), LogLines{fileError("Unable to determine file/directory for path: " + path +
                                           ". Permission denied")});
}

TEST_F(FileFailureTest, FileThatCannotBeDeletedStaysAndIsSaidToBeGone) {
  File file(write("source", "kept"));
  failCall("unlink", EACCES).on(source());
  EXPECT_FALSE(file.deleteFile());
  EXPECT_TRUE(isThere(source()));
  EXPECT_FALSE(file.exists());                           // KEEP(delete-inverted-exists)
  EXPECT_EQ(logLines(), LogLines{notDeleted(source())}); // KEEP(delete-error-text)
}

TEST_F(FileFailureTest, TargetWhoseModeCannotBeLookedUpIsReplacedWithMode0755) {
  File file(write("source", "new", 0600));
  write("target", "old", 0640);
  failCall("lstat", EIO).on(target()).times(1);
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(read(target()), "new");
  EXPECT_EQ(modeOf(target()), 0755U);
  EXPECT_EQ(logLines(),
            moved({fileTrace("Unable to lookup file permissions: Input/output error"), deletingTarget()}));
}

TEST_F(FileFailureTest, TargetThatCannotBeDeletedMakesTheLinkFail) {
  File file(write("source", "new"));
  write("target", "old");
  failCall("unlink", EACCES).on(target());
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_EQ(read(target()), "old");
  EXPECT_EQ(logLines(), moved({deletingTarget(), notLinked("File exists")}));
}

TEST_F(FileFailureTest, LinkAcrossFileSystemsIsNeverReplacedByACopy) {
  File file(write("source", "new"));
  failCall("link", EXDEV);
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_FALSE(isThere(target()));
  EXPECT_EQ(file.getPath(), source());
  EXPECT_EQ(logLines(), moved({notLinked("Invalid cross-device link")}));
}

TEST_F(FileFailureTest, SourceThatCannotBeUnlinkedLeavesBothNames) {
  File file(write("source", "new", 0600));
  restoreSystemCalls();
  failCall("unlink", EACCES).on(source());
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_TRUE(sameFile(source(), target()));
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(file.getPath(), source());
  EXPECT_EQ(callsOf("fchown") + callsOf("fchmod") + callsOf("chown") + callsOf("chmod"), 0);
  EXPECT_EQ(logLines(), moved({fileTrace("unable to unlink: " + source() + ". Permission denied")}));
}

TEST_F(FileFailureTest, OwnerThatCannotBeSetFailsTheMove) {
  File file(write("source", "new", 0600));
  restoreSystemCalls();
  failCall("fchown", EPERM);
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(read(target()), "new");
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(file.getPath(), target());
  EXPECT_EQ(callsOf("fchmod") + callsOf("chmod"), 0);
  EXPECT_EQ(logLines(), moved({fileTrace("unable to chown for file: " + target())}));
}

TEST_F(FileFailureTest, ModeThatCannotBeSetLeavesTheMoveASuccess) {
  File file(write("source", "new", 0600));
  failCall("fchmod", EPERM);
  EXPECT_TRUE(file.moveFile(target(), true)); // KEEP(chmod-ignored)
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(file.getPath(), target());
  EXPECT_EQ(logLines(), moved({fileTrace("unable to chmod for file: " + target())}));
}

/// Why a source cannot be opened for reading, and how often: once, or for good.
struct OpenFailure {
  int reason;
  int times;
};

class UnopenedSourceTest : public FileFailureTest, public ::testing::WithParamInterface<OpenFailure> {
protected:
  void failOpening() const { failCall("openat", GetParam().reason).on(source()).times(GetParam().times); }
};

TEST_P(UnopenedSourceTest, IsMovedLikeAnyOther) {
  File file(write("source", "new", 0600));
  write("target", "old", 0640);
  if (runsAsRoot()) {
    ASSERT_EQ(chown(target().c_str(), 1234, 2345), 0);
  }
  failOpening();
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(read(target()), "new");
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(file.getPath(), target());
  EXPECT_EQ(modeOf(target()), 0640U);
  struct stat status = {};
  ASSERT_EQ(stat(target().c_str(), &status), 0);
  if (runsAsRoot()) {
    EXPECT_EQ(std::make_pair(status.st_uid, status.st_gid), std::make_pair(uid_t{1234}, gid_t{2345}));
  }
  EXPECT_EQ(logLines(), moved({deletingTarget()}));
}

TEST_P(UnopenedSourceTest, LinkIsStillMovedAsALink) {
  write("pointed-to", "kept", 0600);
  fs::create_symlink("pointed-to", source());
  File link(source());
  failOpening();
  EXPECT_TRUE(link.moveFile(target(), true));
  EXPECT_TRUE(fs::is_symlink(target()));
  EXPECT_EQ(modeOf(home() + "pointed-to"), 0755U);
}

INSTANTIATE_TEST_SUITE_P(Reasons, UnopenedSourceTest,
                         ::testing::Values(OpenFailure{EACCES, 1}, OpenFailure{EMFILE, 1},
                                           OpenFailure{EMFILE, -1}, OpenFailure{ENFILE, -1},
                                           OpenFailure{ENOMEM, -1}));

TEST_F(FileFailureTest, SourceThatCannotBeOpenedAndNotLinkedStays) {
  File file(write("source", "new", 0600));
  failCall("openat", EMFILE);
  failCall("link", EMLINK);
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_EQ(logLines(), moved({notLinked("Too many links")}));
}

TEST_F(FileFailureTest, OwnerOfAnUnopenedSourceThatCannotBeSetFailsTheMoveOnceItIsThere) {
  File file(write("source", "new", 0600));
  restoreSystemCalls();
  failCall("openat", EMFILE);
  failCall("chown", EPERM);
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(read(target()), "new");
  EXPECT_EQ(callsOf("chmod"), 0);
  EXPECT_EQ(logLines(), moved({fileTrace("unable to chown for file: " + target())}));
}

TEST_F(FileFailureTest, AttributesReachTheMovedFileAndNotItsNames) {
  File file(write("source", "new", 0600));
  restoreSystemCalls();
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(callsOf("chown") + callsOf("chmod"), 0);
  EXPECT_EQ(modeOf(target()), 0755U);
}

TEST_F(FileFailureTest, CopyThatCannotBeLinkedFails) {
  File file(write("source", "new"));
  failCall("link", EMLINK);
  EXPECT_FALSE(file.copyFile(target(), false));
  EXPECT_FALSE(isThere(target()));
  EXPECT_EQ(logLines(),
            framed(fileTrace("copyFile entry"), {notLinked("Too many links")}, fileTrace("copyFile exit")));
}

TEST_F(FileFailureTest, CopyOverATargetThatCannotBeDeletedFails) {
  File file(write("source", "new"));
  write("target", "old");
  failCall("unlink", EPERM).on(target());
  EXPECT_FALSE(file.copyFile(target(), false));
  EXPECT_EQ(read(target()), "old");
  EXPECT_EQ(logLines(), framed(fileTrace("copyFile entry"),
                               {deletingTarget(), notDeleted(target()), notLinked("File exists")},
                               fileTrace("copyFile exit")));
}

TEST_F(FileFailureTest, DirectoryThatCannotBeMadeEndsTheChain) {
  failCall("mkdir", EACCES).on(home() + "a/b/");
  File directory(home() + "a/b/c");
  EXPECT_FALSE(directory.mkdir());
  EXPECT_TRUE(isThere(home() + "a"));
  EXPECT_FALSE(isThere(home() + "a/b"));
  EXPECT_FALSE(directory.exists());
  EXPECT_EQ(callsOf("mkdir"), 2);
  EXPECT_EQ(logLines(),
            (LogLines{fileTrace("File::mkdir entry"), fileTrace("creating dir: " + home() + "a/"),
                      fileTrace("creating dir: " + home() + "a/b/"), fileTrace("File::mkdir = 0")}));
}

TEST_F(FileFailureTest, DirectoryWhoseModeCannotBeSetIsMadeAllTheSameAndStaysClosed) {
  const UmaskScope usual(022);
  failCall("fchmod", EPERM);
  File directory(home() + "a/b");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_TRUE(directory.isDirectory());
  EXPECT_EQ(modeOf(home() + "a/b"), 0700U);
}

TEST_F(FileFailureTest, DirectoryThatCannotBeLookedUpStaysClosed) {
  const UmaskScope usual(022);
  failCall("lstat", EIO).on(home() + "a/b");
  File directory(home() + "a/b");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_EQ(callsOf("fchmod"), 1);
  EXPECT_EQ(modeOf(home() + "a"), 0777U);
  EXPECT_EQ(modeOf(home() + "a/b"), 0700U);
}

TEST_F(FileFailureTest, EachDirectoryIsLookedForOnceUnlessDotsStandInTheWay) {
  EXPECT_TRUE(File(home() + "a/b").mkdir());
  EXPECT_EQ(callsOf("access"), 3) << "a/b, a and the home";
  restoreSystemCalls();
  EXPECT_TRUE(File(home() + "c/./d").mkdir());
  EXPECT_EQ(callsOf("access"), 6) << "behind the dot once more";
}

TEST_F(FileFailureTest, DirectoryThatCannotBeOpenedHasEmptyLists) {
  write("dir/file", "");
  makeDirectory("dir/sub");
  File directory(home() + "dir");
  failCall("opendir", EACCES);
  EXPECT_TRUE(directory.listFiles()->empty());
  EXPECT_TRUE(directory.listSubDirectories()->empty());
  EXPECT_EQ(logLines(), LogLines{LoadEntry});
}

TEST_F(FileFailureTest, DirectoryThatCannotBeReadIsReported) {
  write("dir/file", "");
  File directory(home() + "dir");
  failCall("readdir", EIO);
  EXPECT_TRUE(directory.listFiles()->empty());
  EXPECT_EQ(logLines(), framed(LoadEntry, {fileError("Error from readdir: Input/output error")}, LoadExit));
}

TEST_F(FileFailureTest, EntriesReadBeforeTheErrorAreKept) {
  for (const char *name : {"dir/a", "dir/b", "dir/c"})
    write(name, "");
  File directory(home() + "dir");
  failCall("readdir", EIO).after(4); // ".", ".." and at least two files
  EXPECT_GE(directory.listFiles()->size(), 2U);
  EXPECT_EQ(logLines(), framed(LoadEntry, {fileError("Error from readdir: Input/output error")}, LoadExit));
}

TEST_F(FileFailureTest, ErrorOfAnEntryIsNotTakenForOneOfTheDirectory) {
  makeDirectory("dir");
  fs::create_symlink("nowhere", home() + "dir/dangling");
  File directory(home() + "dir");
  EXPECT_EQ(directory.listFiles()->size(), 1U);
  EXPECT_EQ(logLines(), (LogLines{LoadEntry, LoadExit}));
}

TEST_F(FileFailureTest, FileThatCannotBeDeletedKeepsItsTree) {
  const std::string stuck = write("tree/b", "");
  write("tree/a", "");
  write("tree/c", "");
  write("tree/sub/file", "");
  failCall("unlink", EACCES).on(stuck);
  EXPECT_FALSE(File(home() + "tree").rmdir());
  EXPECT_TRUE(isThere(stuck));
  EXPECT_FALSE(isThere(home() + "tree/a"));
  EXPECT_FALSE(isThere(home() + "tree/c"));
  EXPECT_TRUE(isThere(home() + "tree/sub/file"));
  EXPECT_EQ(logLines(),
            (LogLines{fileTrace("File::rmdir entry"), LoadEntry, LoadExit, notDeleted(stuck),
                      fileTrace("Unable to delete file: " + stuck), fileTrace("File::rmdir =0")}));
}

TEST_F(FileFailureTest, DirectoryThatCannotBeRemovedKeepsItsParents) {
  makeDirectory("tree/sub");
  File tree(home() + "tree");
  failCall("rmdir", EBUSY).on(home() + "tree/sub/");
  EXPECT_FALSE(tree.rmdir());
  EXPECT_TRUE(tree.exists());
  EXPECT_EQ(callsOf("rmdir"), 1);
  EXPECT_EQ(logLines(), (LogLines{fileTrace("File::rmdir entry"), LoadEntry, LoadExit, LoadEntry, LoadExit,
                                  fileTrace("Unable to delete directory [" + home() +
                                            "tree/sub/]: rc = 16, Device or resource busy"),
                                  fileTrace("File::rmdir =0")}));
}

} // namespace
