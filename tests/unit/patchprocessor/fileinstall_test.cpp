// updated_files: every file to its place under the home, or its place printed.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "patchhome.h"
#include "utilities.h"

namespace {

namespace fs = std::filesystem;
using Names = std::vector<std::string>;

const std::string MoveEntry = "PatchProcessor::moveFiles() entry";
const std::string MoveDone = "PatchProcessor::moveFile() = 1"; // of moveFiles
const std::string MoveFailed = "PatchProcessor::moveFile() = 0";
const std::string FileEntry = "PatchProcessor::moveFile() entry";
const std::string FileExit = "PatchProcessor::moveFile() exit";
const std::string ListHeading = "The following files will be installed or replaced with new files:";

class FileInstallTest : public PatchHome {
public:
  std::string sourceRoot() const { return home() + "tmp/kxe/updated_files"; }
  Processor processor() { return loaded("kxe_lpp266_vema_fp0001.tar", patchIni("kxe")); }
  /// A new file of the patch; returns its place under the home.
  std::string bring(const std::string &relativePath, const std::string &content = "new") const {
    write("tmp/kxe/updated_files/" + relativePath, content);
    return home() + relativePath;
  }
  LogLine attempt() const {
    return ppInfo("Will attempt to move files from " + sourceRoot() + " to " + home());
  }
  LogLine madeDirectory(const std::string &path) const {
    return ppInfo("Creating new directory: " + home() + "./" + path);
  }
  LogLine moved(const std::string &path) const {
    return ppInfo("Successfully moved file from " + sourceRoot() + "/./" + path + " to " + home() + "./" +
                  path);
  }
  std::string cannotMove(const std::string &path) const {
    return "Could not move file " + sourceRoot() + "/./" + path + " to " + home() + "./" + path +
           ". Either the product being updated is still running or the file permissions are restricting "
           "access to the file. Verify the product has been stopped and the file permissions are not "
           "restricting access and then re-apply the patch.";
  }
  void expectMoves(const Processor &processor) {
    const std::string before = Util::getCurrentDirectory();
    PatchError err;
    EXPECT_TRUE(processor->moveFiles(&err));
    EXPECT_EQ(recordOf(err), NoError);
    EXPECT_EQ(Util::getCurrentDirectory(), before);
  }
  LogLines expectMoveFails(const Processor &processor, const Record &expected) {
    const std::string before = Util::getCurrentDirectory();
    const LogLines lines =
        expectOwnFailure(expected, [&](PatchError *err) { return processor->moveFiles(err); });
    EXPECT_EQ(Util::getCurrentDirectory(), before);
    return lines;
  }
};

TEST_F(FileInstallTest, EveryLayerTracesTheMoveOfOneFile) {
  bring("new/file");
  const Processor kxe = processor();
  expectMoves(kxe);
  const LogLines listed = traces("file.cpp", {"loadDir() entry", "loadDir() exit"});
  EXPECT_EQ(logLines(), joined({pps({MoveEntry}),
                                traces("utilities.cpp", {"Util::pathExists(" + sourceRoot() + ") entry",
                                                         "Util::pathExists(" + sourceRoot() + ") exit"}),
                                {attempt(), pp(FileEntry)},
                                listed,
                                {pp(FileEntry), madeDirectory("new/")},
                                traces("file.cpp", {"File::mkdir entry", "creating dir: " + home() + "./new/",
                                                    "File::mkdir = 1"}),
                                listed,
                                pps({FileEntry}),
                                traces("file.cpp", {"moveFile entry", "moveFile exit"}),
                                {moved("new/file")},
                                pps({FileExit, FileExit, FileExit, MoveDone})}));
  EXPECT_EQ(read(home() + "new/file"), "new");
  EXPECT_EQ(treeOf(sourceRoot()), Names{"new/"});
}

// KEEP(movefiles-exit-name)
TEST_F(FileInstallTest, SubdirectoriesComeBeforeTheFilesOfTheirDirectory) {
  bring("top");
  bring("bin/deep/a");
  bring("bin/b");
  const Processor kxe = processor();
  expectMoves(kxe);
  EXPECT_EQ(ownLines(),
            (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileEntry), pp(FileEntry),
                      madeDirectory("bin/deep/"), pp(FileEntry), moved("bin/deep/a"), pp(FileExit),
                      pp(FileExit), pp(FileEntry), moved("bin/b"), pp(FileExit), pp(FileExit), pp(FileEntry),
                      moved("top"), pp(FileExit), pp(FileExit), pp(MoveDone)}))
      << "bin is there already and gets no line";
}

TEST_F(FileInstallTest, FilesOfADirectoryMoveInTheOrderOfTheListing) {
  for (const char *name : {"c", "a", "d", "b"})
    bring(name);
  LogLines expected;
  for (const std::string &name : listedNames(sourceRoot()))
    expected.push_back(moved(name));
  expectMoves(processor());
  LogLines lines = ownLines();
  lines.erase(std::remove_if(lines.begin(), lines.end(),
                             [&](const LogLine &line) { return line.level != "INFO" || line == attempt(); }),
              lines.end());
  EXPECT_EQ(lines, expected);
}

TEST_F(FileInstallTest, FileThatIsThereIsReplacedAndHandsOverItsMode) {
  const std::string target = write("bin/agent", "old", 0640);
  bring("bin/agent");
  expectMoves(processor());
  EXPECT_EQ(read(target), "new");
  EXPECT_EQ(modeOf(target), 0640U);
}

TEST_F(FileInstallTest, NewFileAndNewDirectoryGetTheirFixedModes) {
  const UmaskScope umask(077);
  bring("new/agent");
  expectMoves(processor());
  EXPECT_EQ(modeOf(home() + "new/agent"), 0755U);
  EXPECT_EQ(modeOf(home() + "new"), 0777U);
}

TEST_F(FileInstallTest, PatchWithoutFilesInstallsAndSaysSo) {
  const Processor kxe = processor();
  expectMoves(kxe);
  EXPECT_EQ(ownLines(), (LogLines{pp(MoveEntry), ppInfo("This patch contains no files to update.")}));
}

TEST_F(FileInstallTest, EmptyTreeMovesNothingAndSucceeds) {
  makeDirectory("tmp/kxe/updated_files");
  const Processor kxe = processor();
  expectMoves(kxe);
  EXPECT_EQ(ownLines(), (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileExit), pp(MoveDone)}));
}

TEST_F(FileInstallTest, EmptyDirectoriesAreMade) {
  makeDirectory("tmp/kxe/updated_files/a/b");
  expectMoves(processor());
  EXPECT_TRUE(fs::is_directory(home() + "a/b"));
}

// KEEP(two-temp-directories)
TEST_F(FileInstallTest, SourceIsThatOfTheDescriptorsProduct) {
  bring("bin/agent");
  expectMoves(loaded("KXE_lpp266_vema_fp0001.tar", patchIni("KXE")));
  EXPECT_EQ(read(home() + "bin/agent"), "new");
}

TEST_F(FileInstallTest, TreeThatCannotBeEnteredIsCode24) {
  write("tmp/kxe/updated_files", "a file");
  const std::string message = "Could not change current working directory to: " + sourceRoot();
  EXPECT_EQ(expectMoveFails(processor(), {24, message}), (LogLines{pp(MoveEntry), ppError(message)}));
}

TEST_F(FileInstallTest, FileThatCannotBeMovedIsCode25AndStopsTheWalk) {
  bring("first/moved");
  bring("stuck");
  makeDirectory("stuck"); // a directory in the place of the file
  const Processor kxe = processor();
  PatchError err{99, "earlier"};
  EXPECT_FALSE(kxe->moveFiles(&err));
  EXPECT_EQ(recordOf(err), Record(25, cannotMove("stuck")));
  EXPECT_EQ(ownLines(),
            (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileEntry), madeDirectory("first/"),
                      pp(FileEntry), moved("first/moved"), pp(FileExit), pp(FileExit), pp(FileEntry),
                      ppError(cannotMove("stuck")), pp(FileExit), pp(FileExit), pp(MoveFailed)}));
  EXPECT_EQ(read(home() + "first/moved"), "new") << "what was moved stays moved";
  EXPECT_EQ(read(sourceRoot() + "/stuck"), "new");
}

TEST_F(FileInstallTest, FailureInASubdirectoryStopsEverythingAfterIt) {
  bring("top");
  bring("sub/stuck");
  makeDirectory("sub/stuck");
  const Processor kxe = processor();
  EXPECT_EQ(
      expectMoveFails(kxe, {25, cannotMove("sub/stuck")}),
      (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileEntry), pp(FileEntry),
                ppError(cannotMove("sub/stuck")), pp(FileExit), pp(FileExit), pp(FileExit), pp(MoveFailed)}));
  EXPECT_FALSE(isThere(home() + "top"));
}

TEST_F(FileInstallTest, TargetThatMayNotBeWrittenIsCode25) {
  write("bin/agent", "old");
  bring("bin/agent");
  const Processor kxe = processor();
  fs::permissions(home() + "bin", fs::perms::owner_read | fs::perms::owner_exec);
  const BoundByPermissions bound(home());
  expectMoveFails(kxe, {25, cannotMove("bin/agent")});
  EXPECT_EQ(read(home() + "bin/agent"), "old");
}

TEST_F(FileInstallTest, DirectoryThatCannotBeMadeIsCode26) {
  bring("lib/new/file");
  write("lib", "a file in the place of the directory");
  const Processor kxe = processor();
  const std::string message = "Unable to create directory: " + home() + "./lib/";
  PatchError err{99, "earlier"};
  EXPECT_FALSE(kxe->moveFiles(&err));
  EXPECT_EQ(recordOf(err), Record(26, message));
  EXPECT_EQ(ownLines(),
            (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileEntry), madeDirectory("lib/"),
                      ppError(message), pp(FileExit), pp(FileExit), pp(MoveFailed)}));
}

// KEEP(mkdir-null-record)
TEST_F(FileInstallTest, WithoutARecordTheWalkGoesOnAfterADirectoryThatCannotBeMade) {
  makeDirectory("tmp/kxe/updated_files/lib");
  bring("top");
  write("lib", "a file in the place of the directory");
  const Processor kxe = processor();
  EXPECT_TRUE(kxe->moveFiles(nullptr));
  EXPECT_EQ(ownLines(),
            (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileEntry), madeDirectory("lib/"),
                      ppError("Unable to create directory: " + home() + "./lib/"), pp(FileExit),
                      pp(FileEntry), moved("top"), pp(FileExit), pp(FileExit), pp(MoveDone)}));
  EXPECT_EQ(read(home() + "top"), "new");
}

TEST_F(FileInstallTest, OneFileMayBeMovedByItself) {
  bring("file");
  const Processor kxe = processor();
  fs::current_path(sourceRoot());
  File entry("./file");
  PatchError err;
  EXPECT_TRUE(kxe->moveFile(&entry, &err));
  EXPECT_EQ(ownLines(), (LogLines{pp(FileEntry), moved("file"), pp(FileExit)}));
  EXPECT_EQ(entry.getPath(), home() + "./file");
}

class FileListTest : public FileInstallTest {
public:
  LogLine mapped(const std::string &path) const {
    return ppInfo(sourceRoot() + "/" + path + " --> " + home() + path);
  }
  /// What is printed for these files, in this order.
  std::string listing(const Names &paths) const {
    std::string text = "\n" + ListHeading + "\n";
    for (const std::string &path : paths)
      text += "    " + home() + path + "\n";
    return text + "\n";
  }
  const LogLine entry_ = pp("PatchProcessor::listFiles() entry");
  const LogLine exit_ = pp("PatchProcessor::listFiles() exit");
};

TEST_F(FileListTest, FilesArePrintedWithTheirTargetsAndNothingMoves) {
  bring("top");
  bring("new/deep/a");
  bring("new/b");
  const Processor kxe = processor();
  const Names before = treeOf(home());
  const std::string directory = Util::getCurrentDirectory();
  PatchError err;
  const Printed printed = printedBy([&] { return kxe->listFiles(&err); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, listing({"new/deep/a", "new/b", "top"}));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), (LogLines{entry_, ppInfo(ListHeading), mapped("new/deep/a"), mapped("new/b"),
                                  mapped("top"), exit_}));
  EXPECT_EQ(treeOf(home()), before);
  EXPECT_EQ(Util::getCurrentDirectory(), directory);
}

// KEEP(list-no-files-false)
TEST_F(FileListTest, PatchWithoutFilesFailsWithAnEmptyLineOnly) {
  const Processor kxe = processor();
  PatchError err;
  const Printed printed = printedBy([&] { return kxe->listFiles(&err); });
  EXPECT_FALSE(printed.result);
  EXPECT_EQ(printed.out, "\n");
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), (LogLines{entry_, ppInfo("This patch contains no files to update."), exit_}));
}

TEST_F(FileListTest, EmptyTreeListsNothingAndSucceeds) {
  makeDirectory("tmp/kxe/updated_files/empty");
  const Processor kxe = processor();
  const Printed printed = printedBy([&] { return kxe->listFiles(nullptr); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, listing({}));
  EXPECT_EQ(ownLines(), (LogLines{entry_, ppInfo(ListHeading), exit_}));
}

TEST_F(FileListTest, TreeThatCannotBeEnteredIsCode24) {
  write("tmp/kxe/updated_files", "a file");
  const Processor kxe = processor();
  const std::string message = "Could not change current working directory to: " + sourceRoot();
  const LogLines lines =
      expectOwnFailure({24, message}, [&](PatchError *err) { return kxe->listFiles(err); });
  EXPECT_EQ(printedByFailure().out, "\n");
  EXPECT_EQ(lines, (LogLines{entry_, ppError(message), exit_}));
}

TEST_F(FileListTest, OneFileMayBeListedByItself) {
  bring("bin/agent");
  const Processor kxe = processor();
  fs::current_path(sourceRoot());
  File entry("./bin/agent");
  const Printed printed = printedBy([&] { return kxe->listFile(&entry, nullptr); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, "    " + home() + "bin/agent\n");
  EXPECT_EQ(ownLines(), LogLines{mapped("bin/agent")});
}

TEST_F(FileListTest, DirectoryThatIsGoneListsNothing) {
  makeDirectory("tmp/kxe/updated_files/dir");
  const Processor kxe = processor();
  fs::current_path(sourceRoot());
  fs::create_symlink("dir", "link");
  File directory("./dir");
  File link("./link");
  fs::remove("dir");
  for (File *entry : {&directory, &link}) {
    const Printed printed = printedBy([&] { return kxe->listFile(entry, nullptr); });
    EXPECT_TRUE(printed.result);
    EXPECT_EQ(printed.out, "");
  }
}

TEST_F(FileListTest, LinkToAnotherFileSystemIsEntered) {
  const std::string elsewhere = "/proc/sys/kernel/random/";
  const Processor kxe = processor();
  fs::create_symlink(elsewhere, home() + "link");
  File link(home() + "link");
  std::string listed;
  for (const std::string &name : listedNames(elsewhere))
    listed += "    " + home() + home() + "link/" + name + "\n";
  ASSERT_NE(listed, "");
  EXPECT_EQ(printedBy([&] { return kxe->listFile(&link, nullptr); }).out, listed);
}

/// The directory from which the call is made cannot be entered again, though it could be left.
class NoWayBackTest : public FileListTest {
public:
  std::string leave() const {
    const std::string inner = makeDirectory("closed/inner");
    fs::current_path(inner);
    fs::permissions(home() + "closed", fs::perms::none);
    return inner;
  }
};

TEST_F(NoWayBackTest, MovingIsCode24AfterTheFilesHaveMoved) {
  bring("top");
  const Processor kxe = processor();
  const BoundByPermissions bound(home());
  const std::string inner = leave();
  const std::string message = "Could not change current working directory to: " + inner;
  PatchError err;
  EXPECT_FALSE(kxe->moveFiles(&err));
  EXPECT_EQ(recordOf(err), Record(24, message));
  EXPECT_EQ(ownLines(), (LogLines{pp(MoveEntry), attempt(), pp(FileEntry), pp(FileEntry), moved("top"),
                                  pp(FileExit), pp(FileExit), ppError(message), pp(MoveFailed)}));
  EXPECT_EQ(read(home() + "top"), "new");
}

TEST_F(NoWayBackTest, ListingIsCode24AfterTheFilesWereListed) {
  bring("top");
  const Processor kxe = processor();
  const BoundByPermissions bound(home());
  const std::string message = "Could not change current working directory to: " + leave();
  PatchError err;
  const Printed printed = printedBy([&] { return kxe->listFiles(&err); });
  EXPECT_FALSE(printed.result);
  EXPECT_EQ(printed.out, listing({"top"}));
  EXPECT_EQ(recordOf(err), Record(24, message));
  EXPECT_EQ(ownLines(), (LogLines{entry_, ppInfo(ListHeading), mapped("top"), ppError(message), exit_}));
}

} // namespace
