// The snapshot of a path: what it is, what it is called, and what a copy of it holds.
#include "file.h"

#include <filesystem>
#include <memory>
#include <string>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "scratch.h"

namespace {

namespace fs = std::filesystem;

LogLine undetermined(const std::string &path, const std::string &reason) {
  return error("file.cpp", "Unable to determine file/directory for path: " + path + ". " + reason);
}

void expectNothingThere(const File &file) {
  EXPECT_FALSE(file.exists());
  EXPECT_FALSE(file.isFile());
  EXPECT_FALSE(file.isDirectory());
  EXPECT_EQ(file.getSize(), 0);
  EXPECT_EQ(file.getLastModification(), 0);
}

void expectExistingFile(const File &file) {
  EXPECT_TRUE(file.exists());
  EXPECT_TRUE(file.isFile());
  EXPECT_FALSE(file.isDirectory());
}

void expectExistingDirectory(const File &file) {
  EXPECT_TRUE(file.exists());
  EXPECT_FALSE(file.isFile());
  EXPECT_TRUE(file.isDirectory());
}

void setModificationTime(const std::string &path, time_t seconds) {
  const timespec times[2] = {{seconds, 0}, {seconds, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
}

class FileTest : public ScratchHome {
protected:
  /// Relative paths of the test are below the home.
  void enterHome() const { fs::current_path(home()); }
};

TEST_F(FileTest, RegularFileIsShownWithSizeAndTime) {
  const std::string path = write("file", "12345");
  setModificationTime(path, 1234567890);
  const File file(path);
  expectExistingFile(file);
  EXPECT_EQ(file.getPath(), path);
  EXPECT_EQ(file.getSize(), 5);
  EXPECT_EQ(file.getLastModification(), 1234567890);
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, LargestSizeOf32BitsIsShown) {
  const std::string path = write("huge", "");
  ASSERT_EQ(truncate(path.c_str(), 2147483647), 0);
  EXPECT_EQ(File(path).getSize(), 2147483647);
}

TEST_F(FileTest, PathOfADirectoryGetsItsSlash) {
  const std::string path = makeDirectory("x");
  setModificationTime(path, 1000000000);
  const File file(path);
  expectExistingDirectory(file);
  EXPECT_EQ(file.getPath(), path + "/");
  EXPECT_EQ(file.getLastModification(), 1000000000);
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, SlashesThatAPathOfADirectoryHasAreKept) {
  makeDirectory("x");
  EXPECT_EQ(File(home() + "x/").getPath(), home() + "x/");
  EXPECT_EQ(File(home() + "x//").getPath(), home() + "x//");
  expectExistingDirectory(File(home() + "x//"));
}

TEST_F(FileTest, MissingPathIsNothingAndNotLogged) {
  expectNothingThere(File(home() + "gone"));
  expectNothingThere(File(home() + "gone/"));
  expectNothingThere(File(home() + "gone/below"));
  expectNothingThere(File(""));
  EXPECT_EQ(File(home() + "gone").getPath(), home() + "gone");
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, PathBelowAFileIsNothingAndNotLogged) {
  write("file", "");
  expectNothingThere(File(home() + "file/below"));
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, OtherReasonsOfAFailingStatusAreLogged) {
  const std::string loop = home() + "loop";
  const std::string longName = home() + std::string(300, 'n');
  fs::create_symlink("loop", loop);
  expectNothingThere(File(loop));
  expectNothingThere(File(longName));
  EXPECT_EQ(logLines(), (LogLines{undetermined(loop, "Too many levels of symbolic links"),
                                  undetermined(longName, "File name too long")}));
}

TEST_F(FileTest, FileBehindASlashIsAFileThatIsNotAccessible) {
  write("file", "text");
  const File file(home() + "file/");
  EXPECT_FALSE(file.exists());
  EXPECT_TRUE(file.isFile());
  EXPECT_FALSE(file.isDirectory());
  EXPECT_EQ(file.getSize(), 4);
  EXPECT_EQ(file.getPath(), home() + "file/");
}

TEST_F(FileTest, OnlyOneSlashIsTakenOffForTheStatus) {
  write("file", "text");
  expectNothingThere(File(home() + "file//"));
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, RootDirectoryWithoutItsSlashIsNothing) {
  const File root("/");
  expectNothingThere(root); // KEEP(root-unknown)
  EXPECT_EQ(root.getPath(), "/");
}

TEST_F(FileTest, RootDirectoryThatWasAskedToBeMadeIsADirectoryWithoutAParent) {
  File root("/");
  EXPECT_TRUE(root.mkdir());
  EXPECT_TRUE(root.isDirectory());
  EXPECT_EQ(root.getPath(), "/");
  EXPECT_EQ(root.getName(), "/");
  EXPECT_EQ(root.getParentPath(), "/");
}

TEST_F(FileTest, LinksAreFollowed) {
  write("file", "12345");
  makeDirectory("dir");
  fs::create_symlink("file", home() + "to-file");
  fs::create_symlink("dir", home() + "to-dir");
  expectExistingFile(File(home() + "to-file"));
  EXPECT_EQ(File(home() + "to-file").getSize(), 5);
  expectExistingDirectory(File(home() + "to-dir"));
  EXPECT_EQ(File(home() + "to-dir").getPath(), home() + "to-dir/");
}

TEST_F(FileTest, DanglingLinkIsNothing) {
  fs::create_symlink("nowhere", home() + "dangling");
  expectNothingThere(File(home() + "dangling"));
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, PipeAndDeviceCountAsFiles) {
  ASSERT_EQ(mkfifo((home() + "fifo").c_str(), 0600), 0);
  expectExistingFile(File(home() + "fifo"));
  expectExistingFile(File("/dev/null"));
}

TEST_F(FileTest, SnapshotIsNotRefreshedByItself) {
  const File gone(home() + "later");
  const File there(write("now", "12345"));
  write("later", "");
  fs::remove(home() + "now");
  expectNothingThere(gone);
  expectExistingFile(there);
  EXPECT_EQ(there.getSize(), 5);
}

TEST_F(FileTest, InitializeTakesTheSnapshotAnew) {
  File file(home() + "thing");
  write("thing", "123");
  file.initialize();
  expectExistingFile(file);
  EXPECT_EQ(file.getSize(), 3);
  fs::remove(home() + "thing");
  makeDirectory("thing");
  file.initialize();
  expectExistingDirectory(file);
  EXPECT_EQ(file.getPath(), home() + "thing/");
  fs::remove(home() + "thing");
  file.initialize();
  expectNothingThere(file);
}

TEST_F(FileTest, InitializeForgetsBothListings) {
  File directory(makeDirectory("dir"));
  File again(directory);
  for (File *file : {&directory, &again}) {
    EXPECT_TRUE(file->listFiles()->empty());
    EXPECT_TRUE(file->listSubDirectories()->empty());
  }
  write("dir/new", "");
  makeDirectory("dir/new-sub");
  directory.initialize();
  EXPECT_EQ(directory.listSubDirectories()->size(), 1U);
  EXPECT_EQ(directory.listFiles()->size(), 1U);
  again.initialize();
  EXPECT_EQ(again.listFiles()->size(), 1U); // asked in the other order: either list is read with the other
  EXPECT_EQ(again.listSubDirectories()->size(), 1U);
}

TEST_F(FileTest, EntryOfADirectoryIsNamedBelowIt) {
  write("dir/file", "123");
  makeDirectory("dir/sub");
  const File directory(home() + "dir");
  const File file(directory, "file");
  const File sub(directory, "sub");
  expectExistingFile(file);
  EXPECT_EQ(file.getPath(), home() + "dir/file");
  EXPECT_EQ(file.getSize(), 3);
  expectExistingDirectory(sub);
  EXPECT_EQ(sub.getPath(), home() + "dir/sub/");
}

TEST_F(FileTest, NoSlashIsPutBetweenWhatIsNoDirectoryAndAName) {
  EXPECT_EQ(File(File(home() + "gone"), "name").getPath(), home() + "gonename");
}

TEST_F(FileTest, AbsoluteIsWhatStartsWithASlash) {
  EXPECT_TRUE(File("/gone").isAbsolute());
  EXPECT_FALSE(File("gone/below").isAbsolute());
  EXPECT_FALSE(File("./gone").isAbsolute());
  EXPECT_FALSE(File("").isAbsolute());
}

TEST_F(FileTest, AbsolutePathIsKeptAndARelativeOneIsPutBelowTheCurrentDirectory) {
  enterHome();
  makeDirectory("dir");
  EXPECT_EQ(File(home() + "a/../b").getAbsolutePath(), home() + "a/../b");
  EXPECT_EQ(File("a/b").getAbsolutePath(), home() + "a/b");
  EXPECT_EQ(File("dir").getAbsolutePath(), home() + "dir/");
}

TEST_F(FileTest, AbsolutePathIsNotNormalised) {
  enterHome();
  EXPECT_EQ(File("./a/../b").getAbsolutePath(), home() + "./a/../b");
  EXPECT_EQ(File("a//b").getAbsolutePath(), home() + "a//b");
}

TEST_F(FileTest, AbsolutePathInTheRootDirectoryHasOneSlash) {
  fs::current_path("/");
  EXPECT_EQ(File("no-such-name").getAbsolutePath(), "/no-such-name");
}

TEST_F(FileTest, AbsolutePathIsKeptWhateverDirectoryARelativeOneWouldBePutBelow) {
  EXPECT_EQ(File("/gone/a").getAbsolutePath("/other"), "/gone/a");
  EXPECT_EQ(File("gone/a").getAbsolutePath("/other"), "/other/gone/a");
  EXPECT_EQ(File("gone/a").getAbsolutePath("/other/"), "/other/gone/a");
}

TEST_F(FileTest, AbsolutePathFollowsTheCurrentDirectory) {
  enterHome();
  const File file("a");
  makeDirectory("dir");
  fs::current_path(home() + "dir");
  EXPECT_EQ(file.getAbsolutePath(), home() + "dir/a");
}

/// A path below the home, which holds the directory "dir" with another one "sub" in it and nothing else, and
/// is the current directory.
struct NamedPath {
  const char *caseName;
  const char *path;
  const char *parent;
  const char *name;
};

class FileNameTest : public FileTest, public ::testing::WithParamInterface<NamedPath> {};

TEST_P(FileNameTest, ParentAndNameAreTextOfThePath) {
  enterHome();
  makeDirectory("dir/sub");
  const File file(GetParam().path);
  EXPECT_EQ(file.getParentPath(), GetParam().parent);
  EXPECT_EQ(file.getName(), GetParam().name);
}

INSTANTIATE_TEST_SUITE_P(
    Paths, FileNameTest,
    ::testing::Values(NamedPath{"Plain", "plain", "", "plain"},
                      NamedPath{"Absolute", "/opt-gone/a/x.txt", "/opt-gone/a/", "x.txt"},
                      NamedPath{"InTheRootDirectory", "/x-gone", "/", "x-gone"},
                      NamedPath{"Relative", "a/b/c", "a/b/", "c"},
                      NamedPath{"DirectoryWithoutASlashBeforeItsName", "dir", "dir/", "dir/"},
                      NamedPath{"DirectoryInADirectory", "dir/sub", "dir/", "sub"},
                      NamedPath{"DirectoryGivenWithItsSlash", "dir/sub/", "dir/", "sub"},
                      NamedPath{"DirectoryBehindTwoSlashes", "dir//sub", "dir//", "sub"},
                      NamedPath{"DirectoryInTheRootDirectory", "/tmp", "/", "tmp"},
                      NamedPath{"TwoSlashesAlone", "//", "/", ""},
                      NamedPath{"NoDirectoryButASlashAtItsEnd", "gone/below/", "gone/below/", "gone/below/"},
                      NamedPath{"OneSlashAtTheEndOnly", "gone/", "gone/", "gone/"},
                      NamedPath{"Empty", "", "", ""}),
    [](const auto &path) { return path.param.caseName; });

TEST_F(FileTest, NameAndParentOfADirectoryUnderTheHome) {
  makeDirectory("x");
  const File directory(home() + "x");
  EXPECT_EQ(directory.getName(), "x");
  EXPECT_EQ(directory.getParentPath(), home());
}

TEST_F(FileTest, CopyHoldsPathFlagsSizeAndTime) {
  const std::string path = write("file", "12345");
  setModificationTime(path, 1234567890);
  const File original(path);
  fs::remove(path);
  const File copy(original);
  expectExistingFile(copy);
  EXPECT_EQ(copy.getPath(), path);
  EXPECT_EQ(copy.getSize(), 5);
  EXPECT_EQ(copy.getLastModification(), 1234567890);
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(FileTest, CopyHasItsOwnCopiesOfLoadedListings) {
  write("dir/file", "123");
  makeDirectory("dir/sub");
  auto original = std::make_unique<File>(home() + "dir");
  original->loadDir();
  const File *const entryOfOriginal = original->listFiles()->front();
  File copy(*original);
  original.reset();
  fs::remove_all(home() + "dir");
  logLines();
  ASSERT_EQ(copy.listFiles()->size(), 1U);
  ASSERT_EQ(copy.listSubDirectories()->size(), 1U);
  EXPECT_NE(copy.listFiles()->front(), entryOfOriginal);
  expectExistingFile(*copy.listFiles()->front());
  EXPECT_EQ(copy.listFiles()->front()->getPath(), home() + "dir/file");
  EXPECT_EQ(copy.listSubDirectories()->front()->getPath(), home() + "dir/sub/");
  EXPECT_EQ(logLines(), LogLines{}) << "a listing that was copied is not loaded again";
}

TEST_F(FileTest, CopyLoadsWhatTheOriginalHadNotLoaded) {
  const File original(makeDirectory("dir"));
  File copy(original);
  write("dir/file", "");
  EXPECT_EQ(copy.listFiles()->size(), 1U);
}

} // namespace
