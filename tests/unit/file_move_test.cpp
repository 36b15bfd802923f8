// Deleting one file, moving it into place and linking it a second time.
#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "fakehome.h"
#include "file.h"
#include "scratch.h"

namespace {

namespace fs = std::filesystem;

LogLine fileTrace(const std::string &message) {
  return trace("file.cpp", message);
}
LogLine notAFile(const std::string &path) {
  return fileTrace(path + " does not exist or is not a file");
}
LogLine deletingTarget(const std::string &path) {
  return fileTrace("deleting existing target: " + path);
}
LogLine notDeleted(const std::string &path) {
  return fileTrace("Unable to delete file [" + path + "]: Unknown error -1");
}
LogLine notLinked(const std::string &source, const std::string &target, const std::string &reason) {
  return fileTrace("unable to link: " + source + " to " + target + ". " + reason);
}

class FileMoveTest : public ScratchHome {
protected:
  std::string source() const { return home() + "source"; }
  std::string target() const { return home() + "target"; }
  std::string writeSource(unsigned mode = 0644) const { return write("source", "new", mode); }
  std::string writeTarget(unsigned mode = 0644) const { return write("target", "old", mode); }

  LogLines moved(const LogLines &between) {
    return framed(fileTrace("moveFile entry"), between, fileTrace("moveFile exit"));
  }
  LogLines copied(const LogLines &between) {
    return framed(fileTrace("copyFile entry"), between, fileTrace("copyFile exit"));
  }
};

/// A folder on another file system than the home; the test is skipped where there is none.
class OtherFileSystemTest : public FileMoveTest {
protected:
  void SetUp() override {
    FileMoveTest::SetUp();
    std::string pattern = "/dev/shm/orvpatch-unit-XXXXXX";
    struct stat here {};
    struct stat there {};
    if (mkdtemp(pattern.data()) != nullptr)
      folder_ = pattern;
    if (folder_.empty() || stat(home().c_str(), &here) != 0 || stat(folder_.c_str(), &there) != 0 ||
        here.st_dev == there.st_dev)
      GTEST_SKIP() << "needs /dev/shm on a file system of its own";
  }
  void TearDown() override {
    if (!folder_.empty())
      fs::remove_all(folder_);
    FileMoveTest::TearDown();
  }
  std::string farTarget() const { return folder_ + "/target"; }

private:
  std::string folder_;
};

TEST_F(FileMoveTest, DeletedFileIsGoneButItsObjectStillSaysItExists) {
  File file(writeSource());
  EXPECT_TRUE(file.deleteFile());
  EXPECT_FALSE(isThere(source()));
  EXPECT_TRUE(file.exists()); // KEEP(delete-inverted-exists)
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileMoveTest, FileThatCannotBeDeletedIsSaidToBeGone) {
  File file(writeSource());
  fs::remove(source());
  EXPECT_FALSE(file.deleteFile());
  EXPECT_FALSE(file.exists());
  EXPECT_EQ(logLines(), LogLines{notDeleted(source())}); // KEEP(delete-error-text)
}

TEST_F(FileMoveTest, SecondDeletionFailsAndSetsTheFlagRight) {
  File file(writeSource());
  EXPECT_TRUE(file.deleteFile());
  EXPECT_FALSE(file.deleteFile());
  EXPECT_FALSE(file.exists());
  EXPECT_FALSE(file.deleteFile());
  EXPECT_EQ(logLines(), LogLines{notDeleted(source())}) << "the third call does not touch the disk";
}

TEST_F(FileMoveTest, FileThatWasMissingIsNotDeletedLater) {
  File file(source());
  writeSource();
  EXPECT_FALSE(file.deleteFile());
  EXPECT_TRUE(isThere(source()));
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileMoveTest, DirectoryIsNotDeletedAsAFile) {
  File directory(makeDirectory("source"));
  EXPECT_FALSE(directory.deleteFile());
  EXPECT_TRUE(isThere(source()));
  EXPECT_TRUE(directory.exists());
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileMoveTest, DeletedLinkLeavesWhatItLedTo) {
  writeTarget();
  fs::create_symlink(target(), source());
  EXPECT_TRUE(File(source()).deleteFile());
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(read(target()), "old");
}

class MoveToNewNameTest : public FileMoveTest, public ::testing::WithParamInterface<unsigned> {};

TEST_P(MoveToNewNameTest, ModeIs0755WhateverItWas) {
  const UmaskScope strict(077);
  File file(writeSource(GetParam()));
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(modeOf(target()), 0755U);
}

INSTANTIATE_TEST_SUITE_P(OwnModes, MoveToNewNameTest, ::testing::Values(0U, 0600U, 0644U, 0777U, 04711U));

TEST_F(FileMoveTest, MoveToANewNameKeepsTheFileItself) {
  writeSource();
  fs::create_hard_link(source(), home() + "witness");
  File file(source());
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(read(target()), "new");
  EXPECT_TRUE(sameFile(target(), home() + "witness"));
  EXPECT_EQ(logLines(), moved({}));
}

TEST_F(FileMoveTest, MoveToANewNameNeedsNoLeaveToOverwrite) {
  File file(writeSource());
  EXPECT_TRUE(file.moveFile(target(), false));
  EXPECT_EQ(read(target()), "new");
  EXPECT_FALSE(isThere(source()));
}

TEST_F(FileMoveTest, ObjectIsCalledLikeTheTargetButItsFlagsAreThoseOfBefore) {
  File file(writeSource());
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(file.getPath(), target());
  EXPECT_TRUE(file.exists());
  EXPECT_TRUE(file.isFile());
  EXPECT_EQ(file.getSize(), 3);
}

TEST_F(FileMoveTest, MoveOntoAnExistingTargetWithoutLeaveLeavesBoth) {
  File file(writeSource());
  writeTarget();
  EXPECT_FALSE(file.moveFile(target(), false));
  EXPECT_EQ(read(source()), "new");
  EXPECT_EQ(read(target()), "old");
  EXPECT_EQ(file.getPath(), source());
  EXPECT_EQ(logLines(), moved({notLinked(source(), target(), "File exists")}));
}

class MoveOverTest : public FileMoveTest, public ::testing::WithParamInterface<unsigned> {};

TEST_P(MoveOverTest, ModeIsThatOfTheReplacedTarget) {
  const UmaskScope strict(077);
  File file(writeSource(0600));
  writeTarget(GetParam());
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(modeOf(target()), GetParam());
}

INSTANTIATE_TEST_SUITE_P(AllTwelveBits, MoveOverTest,
                         ::testing::Values(0U, 0400U, 0640U, 0777U, 01755U, 02755U, 04755U, 06711U));

TEST_F(FileMoveTest, MoveOverAnExistingTargetReplacesIt) {
  File file(writeSource());
  writeTarget();
  fs::create_hard_link(target(), home() + "other-name-of-old");
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(read(target()), "new");
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(read(home() + "other-name-of-old"), "old");
  EXPECT_EQ(logLines(), moved({deletingTarget(target())}));
}

TEST_F(FileMoveTest, OwnerAndGroupAreThoseOfTheReplacedTarget) {
  REQUIRE_ROOT();
  File file(writeSource());
  writeTarget(04750);
  ASSERT_EQ(chown(target().c_str(), 1234, 2345), 0);
  ASSERT_EQ(chmod(target().c_str(), 04750), 0);
  EXPECT_TRUE(file.moveFile(target(), true));
  struct stat status {};
  ASSERT_EQ(stat(target().c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, 1234U);
  EXPECT_EQ(status.st_gid, 2345U);
  EXPECT_EQ(modeOf(target()), 04750U) << "the change of owner must not cost the set-id bits";
}

TEST_F(FileMoveTest, OwnerOfAFileWithANewNameIsItsOwn) {
  REQUIRE_ROOT();
  File file(writeSource());
  ASSERT_EQ(chown(source().c_str(), 1234, 2345), 0);
  EXPECT_TRUE(file.moveFile(target(), true));
  struct stat status {};
  ASSERT_EQ(stat(target().c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, 1234U);
  EXPECT_EQ(status.st_gid, 2345U);
}

TEST_F(FileMoveTest, MissingSourceCountsAsMovedAndChangesNothing) {
  File file(source());
  writeTarget(0640);
  EXPECT_TRUE(file.moveFile(target(), true)); // KEEP(move-missing-source)
  EXPECT_EQ(read(target()), "old");
  EXPECT_EQ(modeOf(target()), 0640U);
  EXPECT_EQ(file.getPath(), source());
  EXPECT_EQ(logLines(), moved({notAFile(source())}));
}

TEST_F(FileMoveTest, DirectoryCountsAsMovedAndStays) {
  File directory(makeDirectory("source"));
  EXPECT_TRUE(directory.moveFile(target(), true));
  EXPECT_TRUE(isThere(source()));
  EXPECT_FALSE(isThere(target()));
  EXPECT_EQ(logLines(), moved({notAFile(source() + "/")}));
}

TEST_F(FileMoveTest, SourceThatVanishedAfterTheSnapshotFails) {
  File file(writeSource());
  fs::remove(source());
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_EQ(logLines(), moved({notLinked(source(), target(), "No such file or directory")}));
}

TEST_F(FileMoveTest, MoveIntoAMissingDirectoryFails) {
  File file(writeSource());
  EXPECT_FALSE(file.moveFile(home() + "gone/target", true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_EQ(logLines(), moved({notLinked(source(), home() + "gone/target", "No such file or directory")}));
}

TEST_F(FileMoveTest, MoveBelowAFileFails) {
  File file(writeSource());
  const std::string below = writeTarget() + "/below";
  EXPECT_FALSE(file.moveFile(below, true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_EQ(logLines(), moved({notLinked(source(), below, "Not a directory")}));
}

TEST_F(FileMoveTest, MoveOntoADirectoryFailsAndLeavesBoth) {
  File file(writeSource());
  makeDirectory("target");
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_TRUE(fs::is_directory(target()));
  EXPECT_EQ(logLines(), moved({deletingTarget(target()), notLinked(source(), target(), "File exists")}));
}

TEST_F(FileMoveTest, LinkInPlaceOfTheTargetIsReplacedAndItsFileIsLeft) {
  File file(writeSource());
  write("pointed-to", "kept", 0600);
  fs::create_symlink("pointed-to", target());
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_FALSE(fs::is_symlink(target()));
  EXPECT_EQ(read(target()), "new");
  EXPECT_EQ(modeOf(target()), 0600U);
  EXPECT_EQ(read(home() + "pointed-to"), "kept");
}

TEST_F(FileMoveTest, SetIdBitsOfWhatALinkLedToAreNotTakenOver) {
  File file(writeSource());
  write("pointed-to", "kept", 07751);
  fs::create_symlink("pointed-to", target());
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(modeOf(target()), 01751U);
  EXPECT_EQ(modeOf(home() + "pointed-to"), 07751U);
}

TEST_F(FileMoveTest, LinkIsMovedAndWhatItLeadsToGetsTheMode) {
  write("pointed-to", "kept", 0600);
  fs::create_symlink("pointed-to", source());
  File link(source());
  EXPECT_TRUE(link.moveFile(target(), true));
  EXPECT_TRUE(fs::is_symlink(target()));
  EXPECT_FALSE(isThere(source()));
  EXPECT_EQ(modeOf(home() + "pointed-to"), 0755U);
}

TEST_F(FileMoveTest, PipeIsMovedWithoutAWait) {
  ASSERT_EQ(mkfifo(source().c_str(), 0600), 0);
  File pipe(source());
  EXPECT_TRUE(pipe.moveFile(target(), true));
  EXPECT_TRUE(fs::is_fifo(target()));
  EXPECT_EQ(modeOf(target()), 0755U);
}

TEST_F(FileMoveTest, FileThatItsOwnerMayNotReadIsMovedLikeAnyOther) {
  File file(writeSource(0));
  writeTarget(0640);
  const BoundByPermissions bound(home());
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(modeOf(target()), 0640U);
  EXPECT_EQ(logLines(), moved({deletingTarget(target())}));
}

TEST_F(FileMoveTest, DanglingLinkInPlaceOfTheTargetIsNotReplaced) {
  File file(writeSource());
  fs::create_symlink("nowhere", target());
  EXPECT_FALSE(file.moveFile(target(), true));
  EXPECT_TRUE(fs::is_symlink(target()));
  EXPECT_EQ(logLines(), moved({notLinked(source(), target(), "File exists")}));
}

TEST_F(OtherFileSystemTest, MoveFailsAndLeavesTheSource) {
  File file(writeSource());
  EXPECT_FALSE(file.moveFile(farTarget(), true));
  EXPECT_EQ(read(source()), "new");
  EXPECT_FALSE(isThere(farTarget()));
  EXPECT_EQ(logLines(), moved({notLinked(source(), farTarget(), "Invalid cross-device link")}));
}

TEST_F(OtherFileSystemTest, CopyFailsAndLeavesTheSource) {
  File file(writeSource());
  EXPECT_FALSE(file.copyFile(farTarget(), false));
  EXPECT_EQ(read(source()), "new");
  EXPECT_FALSE(isThere(farTarget()));
  EXPECT_EQ(logLines(), copied({notLinked(source(), farTarget(), "Invalid cross-device link")}));
}

class CopyToNewNameTest : public FileMoveTest, public ::testing::WithParamInterface<bool> {};

TEST_P(CopyToNewNameTest, CopyIsASecondNameOfTheSameFile) {
  File file(writeSource(0640));
  EXPECT_TRUE(file.copyFile(target(), GetParam()));
  EXPECT_TRUE(sameFile(source(), target()));
  EXPECT_EQ(modeOf(target()), 0640U);
  EXPECT_EQ(file.getPath(), source());
  EXPECT_TRUE(file.exists());
  EXPECT_EQ(logLines(), copied({fileTrace("Successful copy of: " + source() + " to " + target() + ".")}));
}

INSTANTIATE_TEST_SUITE_P(KeepingAndReplacing, CopyToNewNameTest, ::testing::Bool());

TEST_F(FileMoveTest, CopyOfAMissingFileFailsUnlikeItsMove) {
  File file(source());
  EXPECT_FALSE(file.copyFile(target(), false));
  EXPECT_FALSE(isThere(target()));
  EXPECT_EQ(logLines(), copied({notAFile(source())}));
}

TEST_F(FileMoveTest, CopyOfADirectoryFails) {
  File directory(makeDirectory("source"));
  writeTarget();
  EXPECT_FALSE(directory.copyFile(target(), false));
  EXPECT_EQ(read(target()), "old");
  EXPECT_EQ(logLines(), copied({notAFile(source() + "/")}));
}

TEST_F(FileMoveTest, CopyReplacesAnExistingTargetThatNeedNotBeKept) {
  File file(writeSource(0640));
  writeTarget(0600);
  EXPECT_TRUE(file.copyFile(target(), false));
  EXPECT_TRUE(sameFile(source(), target()));
  EXPECT_EQ(modeOf(target()), 0640U);
  EXPECT_EQ(logLines(), copied({deletingTarget(target()),
                                fileTrace("Successful copy of: " + source() + " to " + target() + ".")}));
}

TEST_F(FileMoveTest, CopyOntoAnExistingTargetThatMustBeKeptFails) {
  File file(writeSource());
  writeTarget();
  EXPECT_FALSE(file.copyFile(target(), true)); // KEEP(copy-flag-sense)
  EXPECT_EQ(read(source()), "new");
  EXPECT_EQ(read(target()), "old");
  EXPECT_EQ(logLines(), copied({notLinked(source(), target(), "File exists")}));
}

TEST_F(FileMoveTest, CopyOntoATargetThatCannotBeDeletedFails) {
  File file(writeSource());
  makeDirectory("target");
  EXPECT_FALSE(file.copyFile(target(), false));
  EXPECT_TRUE(fs::is_directory(target()));
  EXPECT_EQ(logLines(), copied({deletingTarget(target()), notDeleted(target()),
                                notLinked(source(), target(), "File exists")}));
}

TEST_F(FileMoveTest, CopyOfASourceThatVanishedFailsAfterTheTargetWasDeleted) {
  File file(writeSource());
  writeTarget();
  fs::remove(source());
  EXPECT_FALSE(file.copyFile(target(), false));
  EXPECT_FALSE(isThere(target()));
  EXPECT_EQ(logLines(),
            copied({deletingTarget(target()), notLinked(source(), target(), "No such file or directory")}));
}

TEST_F(FileMoveTest, SourceGivenWithASlashIsAMissingOne) {
  writeSource();
  File file(source() + "/");
  EXPECT_TRUE(file.moveFile(target(), true));
  EXPECT_EQ(logLines(), moved({notAFile(source() + "/")}));
  EXPECT_FALSE(file.copyFile(target(), false));
  EXPECT_EQ(logLines(), copied({notAFile(source() + "/")}));
  EXPECT_EQ(read(source()), "new");
  EXPECT_FALSE(isThere(target()));
}

TEST_F(FileMoveTest, RecursiveDeleteTakesDirectoriesOnly) {
  File missing(source());
  EXPECT_FALSE(recursiveDelete(&missing));
  EXPECT_EQ(logLines(),
            (LogLines{fileTrace("loadDir() entry"), fileTrace("Unable to delete directory [" + source() +
                                                              "]: rc = 2, No such file or directory")}));
  File file(writeSource());
  EXPECT_FALSE(recursiveDelete(&file));
  EXPECT_EQ(logLines(),
            (LogLines{fileTrace("loadDir() entry"),
                      fileTrace("Unable to delete directory [" + source() + "]: rc = 20, Not a directory")}));
  EXPECT_EQ(read(source()), "new");
}

} // namespace
