// A processor's life: creation, extraction, the descriptor, and the temporary directory.
#include "patchprocessor/patchprocessor.h"

#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "orvcomponentregistry.h"
#include "patchhome.h"
#include "utilities.h"

namespace {

namespace fs = std::filesystem;
using Names = std::vector<std::string>;
using ::testing::StartsWith;

const std::string PatchName = "kxe_lpp266_vema_fp0001.tar";

class LifecycleTest : public PatchHome {
public:
  std::string tempDir() const { return home() + "tmp/kxe"; }
  Processor processor() const { return processorFor(PatchName); }
  /// A patch with two members besides its descriptor.
  std::string makeSample() const {
    return makePatch(PatchName, patchIni("kxe"), {{"run.sh", ""}, {"updated_files/bin/agent", "new"}});
  }
  /// A `tar` in front of the real one.
  void replaceTar(const std::string &shell) const { write("ps/tar", "#!/bin/sh\n" + shell + "\n", 0755); }
};

TEST_F(LifecycleTest, CreationHoldsThePathsAndChecksNothing) {
  PatchError err{5, "kept"};
  const Processor created(PatchProcessor::createProcessor("no/such.tar", "/no/home/", &err));
  ASSERT_NE(created, nullptr);
  EXPECT_EQ(recordOf(err), Record(5, "kept"));
  EXPECT_EQ(created->getDescriptor(), nullptr);
  EXPECT_EQ(logLines(), pps({"PatchProcessor::createProcessor(no/such.tar, /no/home/) entry",
                             "PatchProcessor::createProcessor(no/such.tar, /no/home/) exit"}));
}

TEST_F(LifecycleTest, PatchFilenameIsThePathAsGiven) {
  const Processor relative(PatchProcessor::createProcessor("./patches/x.tar", home(), nullptr));
  logLines();
  EXPECT_EQ(relative->getPatchFilename(), "./patches/x.tar");
  EXPECT_EQ(logLines(), pps({"PatchProcessor::getPatchFilename() entry",
                             "PatchProcessor::getPatchFilename() retval [./patches/x.tar]"}));
}

TEST_F(LifecycleTest, DestructionIsTracedAroundThatOfTheDescriptor) {
  Processor bare = processor();
  Processor withDescriptor = loaded(PatchName, patchIni("kxe"));
  logLines();
  bare.reset();
  EXPECT_EQ(logLines(),
            pps({"PatchProcessor::~PatchProcessor() entry", "PatchProcessor::~PatchProcessor() exit"}));
  withDescriptor.reset();
  EXPECT_EQ(logLines(), (LogLines{pp("PatchProcessor::~PatchProcessor() entry"),
                                  trace("patchdescriptor.cpp", "PatchDescriptor::~PatchDescriptor entry"),
                                  pp("PatchProcessor::~PatchProcessor() exit")}));
}

TEST_F(LifecycleTest, ExtractionBringsTheWholeArchiveAndIsTraced) {
  const std::string patch = makeSample();
  const Processor kxe = processor();
  const std::string before = Util::getCurrentDirectory();
  PatchError err;
  logLines();
  EXPECT_TRUE(kxe->extract(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(),
            joined({pps({"PatchProcessor::extract() entry"}),
                    traces("file.cpp", {"File::mkdir entry", "creating dir: " + home() + "tmp/",
                                        "creating dir: " + tempDir() + "/", "File::mkdir = 1"}),
                    commandLines({"tar", "-xf", patch}),
                    pps({"tar returned: 0", "stdout: ", "stderr: ", "PatchProcessor::extract() = 1"})}));
  EXPECT_EQ(treeOf(tempDir()), (Names{"patch.ini", "run.sh", "updated_files/", "updated_files/bin/",
                                      "updated_files/bin/agent"}));
  EXPECT_EQ(Util::getCurrentDirectory(), before);
}

TEST_F(LifecycleTest, ExtractionOfTheDescriptorBringsNothingElse) {
  const std::string patch = makeSample();
  makeDirectory("tmp/kxe");
  const Processor kxe = processor();
  logLines();
  EXPECT_TRUE(kxe->extractINI(nullptr));
  EXPECT_EQ(logLines(),
            joined({pps({"PatchProcessor::extractINI() entry"}),
                    traces("file.cpp", {"File::mkdir entry", "File::mkdir = 1"}),
                    commandLines({"tar", "-xf", patch, "patch.ini"}),
                    pps({"tar returned: 0", "stdout: ", "stderr: ", "PatchProcessor::extractINI() = 1"})}));
  EXPECT_EQ(treeOf(tempDir()), Names{"patch.ini"});
}

/// Both forms of extraction fail alike but for the name that their traces bear.
struct Extraction {
  const char *name;
  bool (PatchProcessor::*operation)(PatchError *);
};

class ExtractionFailureTest : public LifecycleTest, public ::testing::WithParamInterface<Extraction> {
public:
  /// What is logged when the extraction fails in this way.
  LogLines failureOf(const Processor &processor, const Record &expected) {
    return expectOwnFailure(expected,
                            [&](PatchError *err) { return (processor.get()->*GetParam().operation)(err); });
  }
  static LogLine entry() { return pp(std::string("PatchProcessor::") + GetParam().name + "() entry"); }
  static LogLine result() { return pp(std::string("PatchProcessor::") + GetParam().name + "() = 0"); }
};

TEST_P(ExtractionFailureTest, TemporaryDirectoryThatCannotBeMadeIsCode3) {
  write("tmp", "in the way");
  const std::string message = "Unable to create directory: " + tempDir();
  EXPECT_EQ(failureOf(processor(), {3, message}), (LogLines{entry(), ppError(message)}));
}

TEST_P(ExtractionFailureTest, TemporaryDirectoryThatCannotBeEnteredIsCode24) {
  write("tmp/kxe", "a file that counts as made");
  const std::string before = Util::getCurrentDirectory();
  const std::string message = "Could not change current working directory to: " + tempDir();
  EXPECT_EQ(failureOf(processor(), {24, message}), (LogLines{entry(), ppError(message)}));
  EXPECT_EQ(Util::getCurrentDirectory(), before);
}

TEST_P(ExtractionFailureTest, StatusOfTarIsCode3EvenWhenTheFilesAreThere) {
  makeSample();
  replaceTar("/bin/tar \"$@\"; echo told; echo why >&2; exit 7");
  const std::string before = Util::getCurrentDirectory();
  const std::string message = "Bad return code from tar -xf: 7";
  EXPECT_EQ(failureOf(processor(), {3, message}),
            (LogLines{entry(), pp("tar returned: 7"), pp("stdout: told\n"), pp("stderr: why\n"),
                      ppError(message), result()}));
  EXPECT_TRUE(fs::exists(tempDir() + "/patch.ini"));
  EXPECT_EQ(Util::getCurrentDirectory(), before);
}

TEST_P(ExtractionFailureTest, MissingOrBrokenArchiveIsTheStatusOfTar) {
  EXPECT_EQ(failureOf(processor(), {3, "Bad return code from tar -xf: 2"})[1], pp("tar returned: 2"));
  write("patches/" + PatchName, "no archive at all");
  EXPECT_EQ(failureOf(processor(), {3, "Bad return code from tar -xf: 2"})[1], pp("tar returned: 2"));
}

TEST_P(ExtractionFailureTest, MissingTarIsTheErrorNumberAsItsStatus) {
  makeSample();
  setenv("PATH", (home() + "nowhere").c_str(), 1);
  failureOf(processor(), {3, "Bad return code from tar -xf: 2"});
}

INSTANTIATE_TEST_SUITE_P(Forms, ExtractionFailureTest,
                         ::testing::Values(Extraction{"extract", &PatchProcessor::extract},
                                           Extraction{"extractINI", &PatchProcessor::extractINI}),
                         [](const auto &test) { return test.param.name; });

TEST_F(LifecycleTest, RelativePathIsMadeAbsoluteBeforeTheDirectoryChanges) {
  makeSample();
  fs::current_path(home() + "patches");
  const Processor relative(PatchProcessor::createProcessor("../patches/" + PatchName, home(), nullptr));
  const std::string before = Util::getCurrentDirectory();
  logLines();
  EXPECT_TRUE(relative->extract(nullptr));
  EXPECT_EQ(linesOf("process.cpp", logLines()),
            commandLines({"tar", "-xf", before + "/../patches/" + PatchName}));
  EXPECT_EQ(Util::getCurrentDirectory(), before);
}

TEST_F(LifecycleTest, TemporaryDirectoryIsNamedByTheProductOfTheFileName) {
  makePatch("KXE_lpp266_vema_fp0001.tar", patchIni("kox"));
  EXPECT_TRUE(processorFor("KXE_lpp266_vema_fp0001.tar")->initialize(nullptr));
  EXPECT_EQ(treeOf(home() + "tmp"), (Names{"KXE/", "KXE/patch.ini"}));
}

TEST_F(LifecycleTest, DescriptorIsReadFromTheTemporaryDirectory) {
  const std::string path = write("tmp/kxe/patch.ini", patchIni("kxe"));
  const Processor kxe = processor();
  logLines();
  EXPECT_TRUE(kxe->parsePatchDescriptor(nullptr));
  const LogLines lines = logLines();
  EXPECT_EQ(linesOf("patchprocessor", lines), pps({"PatchProcessor::parsePatchDescriptor() entry",
                                                   "PatchProcessor::parsePatchDescriptor() = 1"}));
  EXPECT_EQ(linesOf("patchdescriptor.cpp", lines).front(),
            trace("patchdescriptor.cpp", "PatchDescriptor::parseFile(" + path + ") entry"));
  ASSERT_NE(kxe->getDescriptor(), nullptr);
  EXPECT_EQ(kxe->getDescriptor()->getPatchName(), "kxe fix pack");
}

TEST_F(LifecycleTest, DescriptorThatIsReadAgainReplacesTheOneOfBefore) {
  const Processor kxe = loaded(PatchName, patchIni("kxe"));
  write("tmp/kxe/patch.ini", patchIni("kyn"));
  EXPECT_TRUE(kxe->parsePatchDescriptor(nullptr));
  EXPECT_EQ(kxe->getDescriptor()->getProductCode(), "kyn");
  write("tmp/kxe/patch.ini", "");
  EXPECT_FALSE(kxe->parsePatchDescriptor(nullptr));
  EXPECT_EQ(kxe->getDescriptor(), nullptr);
}

// KEEP(two-temp-directories)
TEST_F(LifecycleTest, TemporaryDirectoryIsThatOfTheFileNameAlsoWhenTheDescriptorIsOfAnother) {
  const Processor kxe = loaded(PatchName, patchIni("kyn"));
  write("tmp/kyn/mine", "");
  EXPECT_TRUE(kxe->cleanUp(nullptr));
  EXPECT_FALSE(isThere(home() + "tmp/kxe"));
  EXPECT_TRUE(isThere(home() + "tmp/kyn/mine"));
}

TEST_F(LifecycleTest, TemporaryDirectoryThatEndsInASlashGetsNoSecondOne) {
  const std::string path = write("tmp/patch.ini", patchIni("kxe"));
  const Processor nameless = processorFor("readme.tar"); // no product in the name: home + "tmp/"
  logLines();
  EXPECT_TRUE(nameless->parsePatchDescriptor(nullptr));
  EXPECT_EQ(linesOf("patchdescriptor.cpp", logLines()).front(),
            trace("patchdescriptor.cpp", "PatchDescriptor::parseFile(" + path + ") entry"));
}

TEST_F(LifecycleTest, MissingDescriptorKeepsTheReadersRecord) {
  const Processor kxe = processor();
  const LogLines lines =
      expectOwnFailure({5, "Unable to read file [" + tempDir() + "/patch.ini]: No such file or directory"},
                       [&](PatchError *err) { return kxe->parsePatchDescriptor(err); });
  EXPECT_EQ(lines, pps({"PatchProcessor::parsePatchDescriptor() entry",
                        "PatchProcessor::parsePatchDescriptor() = 0"}));
  EXPECT_EQ(kxe->getDescriptor(), nullptr);
}

TEST_F(LifecycleTest, InitializationExtractsAndParsesTheDescriptorOnly) {
  makeSample();
  const Processor kxe = processor();
  PatchError err;
  logLines();
  EXPECT_TRUE(kxe->initialize(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(),
            pps({"PatchProcessor::initialize() entry", "PatchProcessor::extractINI() entry",
                 "tar returned: 0", "stdout: ", "stderr: ", "PatchProcessor::extractINI() = 1",
                 "PatchProcessor::parsePatchDescriptor() entry", "PatchProcessor::parsePatchDescriptor() = 1",
                 "PatchProcessor::initialize() retval [1]"}));
  EXPECT_EQ(kxe->getDescriptor()->getProductCode(), "kxe");
  EXPECT_EQ(treeOf(tempDir()), Names{"patch.ini"});
}

TEST_F(LifecycleTest, InitializationFailsWithTheExtraction) {
  const Processor kxe = processor();
  const LogLines lines = expectOwnFailure({3, "Bad return code from tar -xf: 2"},
                                          [&](PatchError *err) { return kxe->initialize(err); });
  ASSERT_EQ(lines.size(), 9U);
  EXPECT_EQ(lines[0], pp("PatchProcessor::initialize() entry"));
  EXPECT_EQ(lines[6], pp("PatchProcessor::extractINI() = 0"));
  EXPECT_EQ(lines[7], pp("Unable to extract patch contents for: " + patchPath(PatchName)));
  EXPECT_EQ(lines[8], pp("PatchProcessor::initialize() retval [0]"));
}

TEST_F(LifecycleTest, InitializationFailsWithTheDescriptor) {
  makePatch(PatchName, "[PreReqs]\n");
  const Processor kxe = processor();
  const LogLines lines = expectOwnFailure({6, "Missing required section: ProductInfo"},
                                          [&](PatchError *err) { return kxe->initialize(err); });
  EXPECT_EQ(lines,
            pps({"PatchProcessor::initialize() entry", "PatchProcessor::extractINI() entry",
                 "tar returned: 0", "stdout: ", "stderr: ", "PatchProcessor::extractINI() = 1",
                 "PatchProcessor::parsePatchDescriptor() entry", "PatchProcessor::parsePatchDescriptor() = 0",
                 "Unable to load patch.ini contents for: " + patchPath(PatchName),
                 "PatchProcessor::initialize() retval [0]"}));
}

TEST_F(LifecycleTest, CleanUpRemovesTheTreeOfThisProductOnly) {
  write("tmp/kxe/updated_files/bin/agent", "new");
  write("tmp/kox/patch.ini", "other");
  const Processor kxe = processor();
  PatchError err;
  logLines();
  EXPECT_TRUE(kxe->cleanUp(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), pps({"PatchProcessor::cleanUp() entry", "PatchProcessor::cleanUp() = 1"}));
  EXPECT_EQ(treeOf(home() + "tmp"), (Names{"kox/", "kox/patch.ini"}));
}

TEST_F(LifecycleTest, CleanUpWithoutATemporaryDirectoryIsCode27) {
  const Processor kxe = processor();
  const std::string message = "Unable to remove temporary directory: " + tempDir();
  const LogLines lines = expectOwnFailure({27, message}, [&](PatchError *err) { return kxe->cleanUp(err); });
  EXPECT_EQ(lines, (LogLines{pp("PatchProcessor::cleanUp() entry"), ppError(message),
                             pp("PatchProcessor::cleanUp() = 0")}));
}

TEST_F(LifecycleTest, CleanUpThatMayNotDeleteIsCode27) {
  write("tmp/kxe/locked/file", "");
  const Processor kxe = processor();
  fs::permissions(tempDir() + "/locked", fs::perms::owner_read | fs::perms::owner_exec);
  const BoundByPermissions bound(home());
  expectOwnFailure({27, "Unable to remove temporary directory: " + tempDir()},
                   [&](PatchError *err) { return kxe->cleanUp(err); });
  EXPECT_TRUE(fs::exists(tempDir() + "/locked/file"));
}

TEST_F(LifecycleTest, OsAgentIsKox) {
  EXPECT_EQ(glbOsAgentPC, "kox");
}

TEST_F(LifecycleTest, SelfCheckPrintsItsBannerAndReportsThatTheSamplePatchIsMissing) {
  const Printed printed = printedBy([] {
    patchProcessorSelfCheck();
    return true;
  });
  EXPECT_EQ(printed.out, "----------------------------------------\n"
                         "- Testing patchProcesser API's\n"
                         "----------------------------------------\n");
  EXPECT_THAT(printed.err, StartsWith("Can't initialize patch processor, Error: "));
}

TEST_F(LifecycleTest, SelfCheckThatFindsTheSamplePatchHasNothingToReport) {
  makePatch("kzz_unix_vema_fp0001.tar", patchIni("kzz"));
  std::filesystem::current_path(home() + "patches");
  const Printed printed = printedBy([] {
    patchProcessorSelfCheck();
    return true;
  });
  EXPECT_EQ(printed.err, "");
  EXPECT_EQ(read(home() + "tmp/kzz/patch.ini"), patchIni("kzz"));
}

} // namespace
