// Files and directories when the system refuses what they need.
#include "file.h"

#include <cerrno>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>

#include "systemcalls.h"

namespace {

namespace fs = std::filesystem;

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
  failCall("stat", EIO).on(target()).times(1);
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
  failCall("unlink", EACCES).on(source());
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_TRUE(sameFile(source(), target()));
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(file.getPath(), source());
  EXPECT_EQ(callsOf("chown", target()) + callsOf("chmod", target()), 0);
  EXPECT_EQ(logLines(), moved({fileTrace("unable to unlink: " + source() + ". Permission denied")}));
}

TEST_F(FileFailureTest, OwnerThatCannotBeSetFailsTheMove) {
  File file(write("source", "new", 0600));
  failCall("chown", EPERM).on(target());
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(read(target()), "new");
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(file.getPath(), target());
  EXPECT_EQ(callsOf("chmod", target()), 0);
  EXPECT_EQ(logLines(), moved({fileTrace("unable to chown for file: " + target())}));
}

TEST_F(FileFailureTest, ModeThatCannotBeSetLeavesTheMoveASuccess) {
  File file(write("source", "new", 0600));
  failCall("chmod", EPERM).on(target());
  EXPECT_TRUE(file.moveFile(target(), true)); // KEEP(chmod-ignored)
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(file.getPath(), target());
  EXPECT_EQ(logLines(), moved({fileTrace("unable to chmod for file: " + target())}));
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

TEST_F(FileFailureTest, DirectoryWhoseModeCannotBeSetIsMadeAllTheSame) {
  const UmaskScope usual(022);
  failCall("chmod", EPERM);
  File directory(home() + "a/b");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_TRUE(directory.isDirectory());
  EXPECT_EQ(modeOf(home() + "a/b"), 0755U);
}

TEST_F(FileFailureTest, DirectoryWhoseModeCannotBeLookedUpKeepsTheOneItWasMadeWith) {
  const UmaskScope usual(022);
  failCall("stat", EIO).on(home() + "a/b/");
  File directory(home() + "a/b");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_EQ(callsOf("chmod", home() + "a/b/"), 0);
  EXPECT_EQ(modeOf(home() + "a"), 0777U);
  EXPECT_EQ(modeOf(home() + "a/b"), 0755U);
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
