// Making directories with their parents, listing them and removing whole trees.
#include <cerrno>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include <dirent.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "file.h"
#include "newdirectories.h"
#include "scratch.h"

namespace {

namespace fs = std::filesystem;
using Paths = std::set<std::string>;

LogLine fileTrace(const std::string &message) {
  return trace("file.cpp", message);
}
LogLine creating(const std::string &prefix) {
  return fileTrace("creating dir: " + prefix);
}

const LogLine LoadEntry = fileTrace("loadDir() entry");
const LogLine LoadExit = fileTrace("loadDir() exit");

LogLines mkdirTraces(const LogLines &between, bool result) {
  return framed(fileTrace("File::mkdir entry"), between,
                fileTrace(result ? "File::mkdir = 1" : "File::mkdir = 0"));
}

LogLines rmdirTraces(const LogLines &between, bool result) {
  return framed(fileTrace("File::rmdir entry"), between,
                fileTrace(result ? "File::rmdir =1" : "File::rmdir =0"));
}

LogLine fileLeft(const std::string &path) {
  return fileTrace("Unable to delete file: " + path);
}
LogLine directoryLeft(const std::string &path, const std::string &numberAndText) {
  return fileTrace("Unable to delete directory [" + path + "]: rc = " + numberAndText);
}

Paths pathsOf(const std::vector<File *> *entries) {
  Paths paths;
  for (const File *entry : *entries)
    paths.insert(entry->getPath());
  return paths;
}

/// The names in a directory in the order in which the system returns them, without "." and "..".
std::vector<std::string> systemOrder(const std::string &directory) {
  std::vector<std::string> names;
  DIR *stream = opendir(directory.c_str());
  while (const dirent *entry = readdir(stream))
    if (const std::string name = entry->d_name; name != "." && name != "..")
      names.push_back(name);
  closedir(stream);
  return names;
}

class MkdirTest : public ScratchHome {
protected:
  void SetUp() override {
    ScratchHome::SetUp();
    fs::current_path(home());
  }
};

TEST_F(MkdirTest, RelativePathIsMadeWithAllItsParents) {
  const UmaskScope strict(077);
  File directory("a/b/c");
  EXPECT_TRUE(directory.mkdir());
  for (const char *made : {"a", "a/b", "a/b/c"})
    EXPECT_EQ(modeOf(home() + made), 0777U) << made;
  EXPECT_EQ(logLines(), mkdirTraces({creating("a/"), creating("a/b/"), creating("a/b/c/")}, true));
}

TEST_F(MkdirTest, OnlySlashesDivideAPath) {
  const std::string odd = "a~b c,d;e|f_g\\h.";
  EXPECT_TRUE(File(odd + "/sub").mkdir());
  EXPECT_EQ(logLines(), mkdirTraces({creating(odd + "/"), creating(odd + "/sub/")}, true));
}

TEST_F(MkdirTest, AbsolutePathIsMadeBelowWhatExists) {
  makeDirectory("a");
  fs::permissions(home() + "a", fs::perms(0700));
  File directory(home() + "a/b/c");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_EQ(modeOf(home() + "a"), 0700U) << "what exists keeps its mode";
  EXPECT_EQ(modeOf(home() + "a/b/c"), 0777U);
  EXPECT_EQ(logLines(), mkdirTraces({creating(home() + "a/b/"), creating(home() + "a/b/c/")}, true));
}

TEST_F(MkdirTest, ObjectKnowsThatItIsADirectoryNow) {
  File directory(home() + "new");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_TRUE(directory.exists());
  EXPECT_TRUE(directory.isDirectory());
  EXPECT_FALSE(directory.isFile());
  EXPECT_EQ(directory.getPath(), home() + "new/");
}

TEST_F(MkdirTest, SlashAtTheEndIsNotDoubled) {
  File directory(home() + "new/");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_EQ(directory.getPath(), home() + "new/");
  EXPECT_EQ(logLines(), mkdirTraces({creating(home() + "new/")}, true));
}

TEST_F(MkdirTest, EmptyComponentsVanishFromWhatIsMadeButNotFromThePath) {
  File directory("a//b");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_TRUE(fs::is_directory(home() + "a/b"));
  EXPECT_EQ(directory.getPath(), "a//b/");
  EXPECT_EQ(logLines(), mkdirTraces({creating("a/"), creating("a/b/")}, true));
}

TEST_F(MkdirTest, ExistingDirectoryIsASuccessWithoutAnyChange) {
  File directory(makeDirectory("there"));
  fs::permissions(home() + "there", fs::perms(0700));
  EXPECT_TRUE(directory.mkdir());
  EXPECT_EQ(modeOf(home() + "there"), 0700U);
  EXPECT_EQ(logLines(), mkdirTraces({}, true));
}

TEST_F(MkdirTest, DirectoryMadeByOthersSinceTheSnapshotIsASuccess) {
  File directory(home() + "there");
  makeDirectory("there");
  EXPECT_TRUE(directory.mkdir());
  EXPECT_TRUE(directory.exists());
  EXPECT_TRUE(directory.isDirectory());
}

TEST_F(MkdirTest, ModeIsAddedToWhatTheSystemGave) {
  makeDirectory("parent");
  ASSERT_EQ(chmod((home() + "parent").c_str(), 02755), 0);
  EXPECT_TRUE(File(home() + "parent/child").mkdir());
  EXPECT_EQ(modeOf(home() + "parent/child"), 02777U) << "a child of a set-group-id directory is one too";
}

/// A path of which nothing exists, what is made of it, and what stands there in the end.
struct DottedPath {
  const char *path;
  std::vector<std::string> made;
};

class DottedMkdirTest : public MkdirTest, public ::testing::WithParamInterface<DottedPath> {};

TEST_P(DottedMkdirTest, EachPrefixIsLookedForWhenThoseBeforeItAreMade) {
  makeDirectory("there/old");
  File directory(GetParam().path);
  EXPECT_TRUE(directory.mkdir());
  EXPECT_TRUE(fs::is_directory(GetParam().path));
  LogLines made;
  for (const std::string &prefix : GetParam().made)
    made.push_back(creating(prefix));
  EXPECT_EQ(logLines(), mkdirTraces(made, true));
}

INSTANTIATE_TEST_SUITE_P(Paths, DottedMkdirTest,
                         ::testing::Values(DottedPath{"a/./b", {"a/", "a/./b/"}}, DottedPath{"a/.", {"a/"}},
                                           DottedPath{"a/b/..", {"a/", "a/b/"}}, DottedPath{"./a", {"./a/"}},
                                           DottedPath{"c/../d/e", {"c/", "c/../d/", "c/../d/e/"}},
                                           DottedPath{"c/../there/e", {"c/", "c/../there/e/"}},
                                           DottedPath{"c/../there/old", {"c/"}},
                                           DottedPath{"a/./.b/..c", {"a/", "a/./.b/", "a/./.b/..c/"}},
                                           DottedPath{"c/../there/e/../f",
                                                      {"c/", "c/../there/e/", "c/../there/e/../f/"}}));

TEST_F(MkdirTest, WhatIsMadeForAWorkStaysClosedUntilItEnds) {
  const UmaskScope open(0);
  {
    NewDirectories made;
    EXPECT_TRUE(File("a/b").mkdir(made));
    EXPECT_EQ(modeOf("a"), 0700U);
    EXPECT_EQ(modeOf("a/b"), 0700U);
    EXPECT_EQ(logLines(), mkdirTraces({creating("a/"), creating("a/b/")}, true));
  }
  EXPECT_EQ(modeOf("a"), 0777U);
  EXPECT_EQ(modeOf("a/b"), 0777U);
}

TEST_F(MkdirTest, FileInTheWayEndsItAtOnce) {
  write("file", "kept");
  File directory("file/a/b");
  EXPECT_FALSE(directory.mkdir());
  EXPECT_FALSE(directory.exists());
  EXPECT_FALSE(directory.isDirectory());
  EXPECT_EQ(directory.getPath(), "file/a/b");
  EXPECT_EQ(read(home() + "file"), "kept");
  EXPECT_EQ(logLines(), mkdirTraces({creating("file/")}, false));
}

TEST_F(MkdirTest, FileBehindAWayBackEndsItToo) {
  write("file", "kept");
  EXPECT_FALSE(File("c/../file/a").mkdir());
  EXPECT_TRUE(fs::is_directory("c"));
  EXPECT_EQ(read(home() + "file"), "kept");
}

TEST_F(MkdirTest, ParentsMadeBeforeTheFailureStay) {
  const std::string tooLong(300, 'n');
  File directory("a/" + tooLong + "/c");
  logLines();
  EXPECT_FALSE(directory.mkdir());
  EXPECT_TRUE(fs::is_directory(home() + "a"));
  EXPECT_EQ(logLines(), mkdirTraces({creating("a/"), creating("a/" + tooLong + "/")}, false));
}

TEST_F(MkdirTest, DanglingLinkInTheWayFails) {
  fs::create_symlink("nowhere", home() + "link");
  EXPECT_FALSE(File("link/a").mkdir());
  EXPECT_FALSE(isThere(home() + "nowhere"));
}

TEST_F(MkdirTest, FailureOfAnObjectThatExistedIsStillTrue) {
  File file(write("file", ""));
  EXPECT_TRUE(file.mkdir()); // KEEP(mkdir-known-existence)
  EXPECT_TRUE(file.isFile());
  EXPECT_FALSE(file.isDirectory());
  EXPECT_EQ(file.getPath(), home() + "file");
  EXPECT_EQ(logLines(), mkdirTraces({creating(home() + "file/")}, true));
}

TEST_F(MkdirTest, ParentWithoutWritePermissionFails) {
  REQUIRE_ORDINARY_USER();
  makeDirectory("closed");
  fs::permissions(home() + "closed", fs::perms(0555));
  EXPECT_FALSE(File("closed/a").mkdir());
  EXPECT_EQ(logLines(), mkdirTraces({creating("closed/a/")}, false));
}

class ListingTest : public ScratchHome {
protected:
  File directory() const { return File(home() + "dir"); }
};

TEST_F(ListingTest, OnlyTheDirectoryItselfAndItsParentAreLeftOut) {
  for (const char *name : {".a", "...", "..b", ". "})
    write(std::string("dir/") + name, "");
  makeDirectory("dir/.d");
  File listed = directory();
  EXPECT_THAT(pathsOf(listed.listFiles()),
              ::testing::UnorderedElementsAre(home() + "dir/.a", home() + "dir/...", home() + "dir/..b",
                                              home() + "dir/. "));
  EXPECT_THAT(pathsOf(listed.listSubDirectories()), ::testing::ElementsAre(home() + "dir/.d/"));
}

TEST_F(ListingTest, FilesAndSubDirectoriesAreToldApart) {
  write("dir/file", "");
  write("dir/.hidden", "");
  write("dir/sub/deeper", "");
  makeDirectory("dir/.hidden-sub");
  File listed = directory();
  EXPECT_EQ(pathsOf(listed.listFiles()), (Paths{home() + "dir/file", home() + "dir/.hidden"}));
  EXPECT_EQ(pathsOf(listed.listSubDirectories()), (Paths{home() + "dir/sub/", home() + "dir/.hidden-sub/"}));
}

TEST_F(ListingTest, LinksAreFollowedAndDanglingOnesAreFilesThatDoNotExist) {
  makeDirectory("dir");
  makeDirectory("elsewhere");
  fs::create_symlink("../elsewhere", home() + "dir/to-directory");
  fs::create_symlink("nowhere", home() + "dir/dangling");
  ASSERT_EQ(mkfifo((home() + "dir/pipe").c_str(), 0600), 0);
  File listed = directory();
  EXPECT_EQ(pathsOf(listed.listSubDirectories()), Paths{home() + "dir/to-directory/"});
  EXPECT_EQ(pathsOf(listed.listFiles()), (Paths{home() + "dir/dangling", home() + "dir/pipe"}));
  for (const File *file : *listed.listFiles())
    EXPECT_EQ(file->exists(), file->getName() == "pipe");
}

TEST_F(ListingTest, OrderIsThatOfTheSystem) {
  for (int number = 0; number < 30; ++number)
    write("dir/" + std::to_string(number * 7919 % 1000), "");
  File listed = directory();
  std::vector<std::string> names;
  for (const File *file : *listed.listFiles())
    names.push_back(file->getName());
  EXPECT_EQ(names, systemOrder(home() + "dir"));
}

TEST_F(ListingTest, EmptyDirectoryHasEmptyLists) {
  makeDirectory("dir");
  File listed = directory();
  EXPECT_TRUE(listed.listFiles()->empty());
  EXPECT_TRUE(listed.listSubDirectories()->empty());
}

TEST_F(ListingTest, FirstQuestionLoadsBothListsOnce) {
  write("dir/file", "");
  File listed = directory();
  const auto *const files = listed.listFiles();
  EXPECT_EQ(logLines(), (LogLines{LoadEntry, LoadExit}));
  write("dir/later", "");
  makeDirectory("dir/later-sub");
  EXPECT_EQ(listed.listFiles(), files);
  EXPECT_EQ(files->size(), 1U);
  EXPECT_TRUE(listed.listSubDirectories()->empty());
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(ListingTest, LoadDirMakesTheListsAnew) {
  write("dir/file", "");
  File listed = directory();
  listed.loadDir();
  write("dir/later", "");
  listed.loadDir();
  EXPECT_EQ(listed.listFiles()->size(), 2U);
  EXPECT_EQ(logLines(), (LogLines{LoadEntry, LoadExit, LoadEntry, LoadExit}));
}

TEST_F(ListingTest, WhatIsNoDirectoryHasEmptyListsAndNoExitTrace) {
  File file(write("file", ""));
  EXPECT_TRUE(file.listFiles()->empty());
  EXPECT_TRUE(file.listSubDirectories()->empty());
  EXPECT_EQ(logLines(), LogLines{LoadEntry});
}

TEST_F(ListingTest, MissingPathHasEmptyLists) {
  File gone(home() + "gone");
  EXPECT_TRUE(gone.listSubDirectories()->empty());
  EXPECT_TRUE(gone.listFiles()->empty());
  EXPECT_EQ(logLines(), LogLines{LoadEntry});
}

TEST_F(ListingTest, DirectoryThatCannotBeOpenedHasEmptyListsAndNoMessage) {
  makeDirectory("dir");
  File listed = directory();
  fs::remove(home() + "dir");
  EXPECT_TRUE(listed.listFiles()->empty());
  EXPECT_EQ(logLines(), LogLines{LoadEntry});
}

TEST_F(ListingTest, EarlierErrorNumberIsNotTakenForOneOfTheDirectory) {
  write("dir/file", "");
  File listed = directory();
  errno = EIO;
  listed.loadDir();
  EXPECT_EQ(logLines(), (LogLines{LoadEntry, LoadExit}));
}

TEST_F(ListingTest, RemovedDirectoryIsNotListedWhenAnotherTakesItsPlace) {
  makeDirectory("dir");
  File listed = directory();
  EXPECT_TRUE(listed.rmdir());
  write("dir/file", "");
  logLines();
  listed.loadDir();
  EXPECT_TRUE(listed.listFiles()->empty());
  EXPECT_EQ(logLines(), LogLines{LoadEntry});
}

class RmdirTest : public ScratchHome {
protected:
  void SetUp() override {
    ScratchHome::SetUp();
    makeDirectory("tree");
  }
  std::string tree() const { return home() + "tree/"; }
  /// A link to nowhere is a file that does not exist, and such a file cannot be deleted: not even by root.
  std::string plantUndeletable(const std::string &directory) const {
    fs::create_symlink("nowhere", directory + "stuck");
    return directory + "stuck";
  }
};

TEST_F(RmdirTest, WholeTreeGoesFilesFirst) {
  write("tree/file", "");
  write("tree/sub/file", "");
  write("tree/sub/deeper/file", "");
  File directory(tree());
  EXPECT_TRUE(directory.rmdir());
  EXPECT_FALSE(isThere(home() + "tree"));
  EXPECT_FALSE(directory.exists());
  EXPECT_EQ(logLines(), rmdirTraces({LoadEntry, LoadExit, LoadEntry, LoadExit, LoadEntry, LoadExit}, true));
}

TEST_F(RmdirTest, EmptyDirectoryGoes) {
  File directory(home() + "tree");
  EXPECT_TRUE(directory.rmdir());
  EXPECT_FALSE(isThere(home() + "tree"));
  EXPECT_EQ(logLines(), rmdirTraces({LoadEntry, LoadExit}, true));
}

TEST_F(RmdirTest, FileIsNotADirectory) {
  File file(write("file", "kept"));
  EXPECT_FALSE(file.rmdir());
  EXPECT_EQ(read(home() + "file"), "kept");
  EXPECT_EQ(logLines(),
            (LogLines{fileTrace("File::rmdir entry"), fileTrace(home() + "file is not a directory")}));
}

TEST_F(RmdirTest, MissingPathIsNotADirectory) {
  EXPECT_FALSE(File(home() + "gone").rmdir());
  EXPECT_EQ(logLines(),
            (LogLines{fileTrace("File::rmdir entry"), fileTrace(home() + "gone is not a directory")}));
}

TEST_F(RmdirTest, FileThatStaysKeepsItsDirectoryButNotItsNeighbours) {
  write("tree/a", "");
  write("tree/z", "");
  const std::string stuck = plantUndeletable(tree());
  File directory(tree());
  EXPECT_FALSE(directory.rmdir());
  EXPECT_FALSE(isThere(tree() + "a"));
  EXPECT_FALSE(isThere(tree() + "z"));
  EXPECT_FALSE(isThere(stuck)) << "no link may lead the next archive, but its deletion has failed";
  EXPECT_TRUE(isThere(tree()));
  EXPECT_TRUE(directory.exists());
  EXPECT_EQ(logLines(), rmdirTraces({LoadEntry, LoadExit, fileLeft(stuck)}, false));
}

TEST_F(RmdirTest, FileThatStaysKeepsTheSubDirectoriesBesideIt) {
  write("tree/sub/file", "kept");
  plantUndeletable(tree());
  EXPECT_FALSE(File(tree()).rmdir());
  EXPECT_EQ(read(tree() + "sub/file"), "kept");
}

TEST_F(RmdirTest, SubDirectoryThatStaysKeepsItsParentButNotItsNeighbours) {
  write("tree/a/file", "");
  write("tree/z/file", "");
  makeDirectory("tree/m");
  plantUndeletable(tree() + "m/");
  EXPECT_FALSE(File(tree()).rmdir());
  EXPECT_FALSE(isThere(tree() + "a"));
  EXPECT_FALSE(isThere(tree() + "z"));
  EXPECT_TRUE(isThere(tree() + "m"));
  EXPECT_FALSE(isThere(tree() + "m/stuck"));
}

TEST_F(RmdirTest, LinksGoWhereverTheyStandAndAllElseBehindThemStays) {
  write("outside/file", "kept");
  fs::create_symlink("nowhere", home() + "outside/foreign-link");
  for (const char *directory : {"tree/", "tree/a/", "tree/a/b/", "tree/c/"}) {
    write(directory + std::string("sub/file"), "kept");
    fs::create_symlink(home() + "outside", home() + directory + "to-directory");
    fs::create_symlink("loop", home() + directory + "loop");
    plantUndeletable(home() + directory);
  }
  EXPECT_FALSE(File(tree()).rmdir());
  for (const char *directory : {"tree/", "tree/a/", "tree/a/b/", "tree/c/"}) {
    for (const char *link : {"to-directory", "loop", "stuck"})
      EXPECT_FALSE(isThere(home() + directory + link)) << directory << link;
    EXPECT_EQ(read(home() + directory + "sub/file"), "kept");
  }
  EXPECT_EQ(read(home() + "outside/file"), "kept");
  EXPECT_TRUE(isThere(home() + "outside/foreign-link"));
  EXPECT_TRUE(File(tree()).rmdir()) << "nothing is in the way any more";
}

TEST_F(RmdirTest, LinkInPlaceOfTheTreeGoesAndItsDirectoryStays) {
  write("outside/file", "kept");
  fs::create_symlink("outside", home() + "link");
  File link(home() + "link");
  logLines();
  EXPECT_FALSE(link.rmdir());
  EXPECT_FALSE(isThere(home() + "link"));
  EXPECT_EQ(read(home() + "outside/file"), "kept");
  EXPECT_TRUE(link.exists());
  EXPECT_EQ(logLines(), rmdirTraces({directoryLeft(home() + "link/", "20, Not a directory")}, false));
}

TEST_F(RmdirTest, UnlinkThatFailsIsTracedTwice) {
  const std::string file = write("tree/file", "");
  File directory(tree());
  directory.loadDir();
  fs::remove(file);
  logLines();
  EXPECT_FALSE(directory.rmdir());
  EXPECT_EQ(logLines(),
            rmdirTraces({fileTrace("Unable to delete file [" + file + "]: Unknown error -1"), fileLeft(file)},
                        false));
}

TEST_F(RmdirTest, DirectoryThatStaysIsNamedByItsAbsolutePath) {
  fs::current_path(home());
  File directory("tree");
  directory.loadDir();
  write("tree/since-the-listing", "kept");
  logLines();
  EXPECT_FALSE(directory.rmdir());
  EXPECT_TRUE(directory.exists());
  EXPECT_EQ(logLines(), rmdirTraces({directoryLeft(tree(), "39, Directory not empty")}, false));
}

TEST_F(RmdirTest, LinkToADirectoryInTheTreeIsNeverEntered) {
  write("foreign/file", "kept");
  fs::create_symlink("../foreign", tree() + "link");
  EXPECT_FALSE(File(tree()).rmdir());
  EXPECT_EQ(read(home() + "foreign/file"), "kept");
  EXPECT_EQ(
      logLines(),
      rmdirTraces({LoadEntry, LoadExit, directoryLeft(tree() + "link/", "20, Not a directory")}, false));
}

TEST_F(RmdirTest, LinkToADirectoryIsNotEnteredEither) {
  write("foreign/file", "kept");
  fs::create_symlink("foreign", home() + "link");
  EXPECT_FALSE(File(home() + "link").rmdir());
  EXPECT_EQ(read(home() + "foreign/file"), "kept");
  EXPECT_EQ(logLines(), rmdirTraces({directoryLeft(home() + "link/", "20, Not a directory")}, false));
}

TEST_F(RmdirTest, LinkToAFileGoesAndTheFileStays) {
  write("foreign", "kept");
  fs::create_symlink("../foreign", tree() + "link");
  EXPECT_TRUE(File(tree()).rmdir());
  EXPECT_EQ(read(home() + "foreign"), "kept");
}

TEST_F(RmdirTest, FileInADirectoryWithoutWritePermissionStays) {
  REQUIRE_ORDINARY_USER();
  const std::string file = write("tree/closed/file", "kept");
  fs::permissions(tree() + "closed", fs::perms(0555));
  EXPECT_FALSE(File(tree()).rmdir());
  EXPECT_EQ(read(file), "kept");
  EXPECT_EQ(logLines(),
            rmdirTraces({LoadEntry, LoadExit, LoadEntry, LoadExit,
                         fileTrace("Unable to delete file [" + file + "]: Unknown error -1"), fileLeft(file)},
                        false));
}

TEST_F(RmdirTest, RecursiveDeleteRemovesTheTreeWithoutTracesOfRmdir) {
  write("tree/sub/file", "");
  File directory(tree());
  EXPECT_TRUE(recursiveDelete(&directory));
  EXPECT_FALSE(isThere(home() + "tree"));
  EXPECT_EQ(logLines(), (LogLines{LoadEntry, LoadExit, LoadEntry, LoadExit}));
}

TEST_F(RmdirTest, RecursiveDeleteFailsWhenAnythingStays) {
  plantUndeletable(tree());
  File directory(tree());
  EXPECT_FALSE(recursiveDelete(&directory));
  EXPECT_TRUE(isThere(home() + "tree"));
}

} // namespace
