// From a path to loaded patches: a file, a directory, and everything that ends the loading.
#include "dcfpackageprocessor.h"

#include <algorithm>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "logger.h"
#include "patchhome.h"

namespace {

namespace fs = std::filesystem;
using Names = std::vector<std::string>;
using ::testing::AllOf;
using ::testing::EndsWith;
using ::testing::StartsWith;

LogLine dcf(const std::string &message) {
  return trace("dcfpackageprocessor", message);
}
LogLines dcfs(const std::vector<std::string> &messages) {
  return traces("dcfpackageprocessor", messages);
}
LogLine dcfInfo(const std::string &message) {
  return info("dcfpackageprocessor", message);
}
LogLine dcfError(const std::string &message) {
  return error("dcfpackageprocessor", message);
}

class LoadTest : public PatchHome {
public:
  using Package = std::unique_ptr<DCFPackageProcessor>;

  static Package load(const std::string &path, PatchError *err = nullptr) {
    return Package(DCFPackageProcessor::createProcessor(path, err));
  }
  /// Paths of the loaded patches less the home, in order of application.
  Names loadedPatches(const Package &package) const {
    Names paths;
    for (PatchProcessor *processor : *package->getPatchProcessors())
      paths.push_back(processor->getPatchFilename().substr(home().size()));
    return paths;
  }
  /// A patch that applies to an agent of this code, which is installed.
  std::string makeAgentPatch(const std::string &letters, const std::string &fixPack = "fp0001",
                             const std::string &sections = "") const {
    install(letters + "lpp266.ver", "06200000");
    return makePatch("k" + letters + "_lpp266_vema_" + fixPack + ".tar",
                     patchIni("k" + letters, "06200001", sections));
  }
  static std::string missingPrereq() { return bareSection("PreReqs", {"kzz = 061000"}); }
  std::string patches() const { return home() + "patches"; }

  LogLines expectLoadFails(const std::string &path, const Record &expected) {
    return withoutDestructors(expectFailure("dcfpackageprocessor", expected,
                                            [&](PatchError *err) { return load(path, err) != nullptr; }));
  }
  LogLines packageLines() { return withoutDestructors(logLinesOf("dcfpackageprocessor")); }

  /// The lines that decide whether a file applies.
  LogLines applicability(const std::string &name, bool applies) const {
    return dcfs({"DCFPackageProcessor::isApplicable('" + home() + "','" + name + "')  entry",
                 std::string("DCFPackageProcessor::isApplicable() retval: [") + (applies ? "1" : "0") + "]"});
  }
  /// The lines around the loading of a path, from the factory's entry to its exit.
  LogLines aroundLoading(const std::string &path, const LogLines &between, bool result) const {
    const std::string factory = "DCFPackageProcessor::createProcessor(" + path + ") - ";
    return joined(
        {dcfs({factory + "entry", "DCFPackageProcessor::load() entry", "QUILLHOME=[" + home() + "]"}),
         between,
         dcfs({std::string("DCFPackageProcessor::load() exit retval: [") + (result ? "1" : "0") + "]"}),
         result ? LogLines{} : dcfs({"Unable to load patch(s)"}), dcfs({factory + "exit"})});
  }

private:
  static LogLines withoutDestructors(LogLines lines) {
    lines.erase(
        std::remove_if(lines.begin(), lines.end(),
                       [](const LogLine &line) { return line.message.find('~') != std::string::npos; }),
        lines.end());
    return lines;
  }
};

TEST_F(LoadTest, SingleFileIsLoadedAndTraced) {
  const std::string path = makeAgentPatch("xe");
  PatchError err;
  logLines();
  const Package package = load(path, &err);
  ASSERT_NE(package, nullptr);
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(packageLines(),
            aroundLoading(path,
                          joined({dcfs({"[" + path + "] is a file."}),
                                  applicability("kxe_lpp266_vema_fp0001.tar", true),
                                  dcfs({"[" + path + "] is applicable.", "Calling initialize ",
                                        "Patch initialization succeeded", "Patch pushback succeeded."})}),
                          true));
  EXPECT_EQ(loadedPatches(package), Names{"patches/kxe_lpp266_vema_fp0001.tar"});
  EXPECT_EQ(treeOf(home() + "tmp"), (Names{"kxe/", "kxe/patch.ini"}));
}

TEST_F(LoadTest, RelativePathStaysAsItIsGiven) {
  makeAgentPatch("xe");
  fs::current_path(patches());
  const Package package = load("./kxe_lpp266_vema_fp0001.tar");
  ASSERT_NE(package, nullptr);
  EXPECT_EQ(package->getPatchProcessors()->front()->getPatchFilename(), "./kxe_lpp266_vema_fp0001.tar");
}

TEST_F(LoadTest, DestructorTracesAroundTheDestructionOfItsProcessors) {
  Package package = load(makeAgentPatch("xe"));
  logLines();
  package.reset();
  const LogLines lines = logLines();
  ASSERT_GE(lines.size(), 4U);
  for (const LogLine &line : {lines.front(), lines.back()})
    EXPECT_EQ(line.component, "dcfpackageprocessor");
  EXPECT_THAT(lines.front().message,
              AllOf(StartsWith("DCFPackageProcessor::~DCFPackageProcessor"), EndsWith("entry")));
  EXPECT_THAT(lines.back().message,
              AllOf(StartsWith("DCFPackageProcessor::~DCFPackageProcessor"), EndsWith("exit")));
  EXPECT_EQ(linesOf("patchprocessor", lines),
            pps({"PatchProcessor::~PatchProcessor() entry", "PatchProcessor::~PatchProcessor() exit"}));
}

TEST_F(LoadTest, PathThatDoesNotExistIsCode30) {
  const std::string message = "Unable to locate path or file specified: " + home() + "missing";
  EXPECT_EQ(expectLoadFails(home() + "missing", {30, message}),
            aroundLoading(home() + "missing", {dcfError(message)}, false));
}

/// What stands in the place of a patch when it is looked at again.
class ExchangedPatchTest : public LoadTest, public ::testing::WithParamInterface<bool> {};

TEST_P(ExchangedPatchTest, EndsTheCommandAndIsNotLeftOut) {
  const std::string exchanged = makeAgentPatch("xe");
  makeAgentPatch("yn");
  const LogSink before = setLogSink([&exchanged, becomesDirectory = GetParam()](std::string_view line) {
    if (line.find("Processing patch file: kxe_") == std::string_view::npos)
      return;
    fs::remove(exchanged);
    if (becomesDirectory)
      fs::create_directory(exchanged);
  });
  PatchError err;
  const Package package = load(patches(), &err);
  static_cast<void>(setLogSink(before));
  EXPECT_EQ(package, nullptr) << "the other patch alone must not be installed";
  EXPECT_NE(err.code, PatchError::None);
}

INSTANTIATE_TEST_SUITE_P(BetweenTwoLooks, ExchangedPatchTest, ::testing::Bool());

TEST_F(LoadTest, WhatIsNeitherFileNorDirectoryLoadsNothingAndSucceeds) {
  const std::string pipe = home() + "kxe_lpp266_vema_fp0001.tar";
  ASSERT_EQ(mkfifo(pipe.c_str(), 0644), 0);
  for (const std::string &path : {pipe, std::string("/dev/null")}) {
    PatchError err;
    logLines();
    const Package package = load(path, &err);
    ASSERT_NE(package, nullptr);
    EXPECT_TRUE(package->getPatchProcessors()->empty());
    EXPECT_EQ(recordOf(err), NoError);
    EXPECT_EQ(packageLines(), aroundLoading(path, {}, true));
  }
}

TEST_F(LoadTest, SingleFileThatDoesNotApplyIsCode34) {
  const std::string path = write("readme.txt", "");
  const std::string message =
      "The patch file " + path +
      " can not be installed.  Either the current platform architecture or the installed components do not "
      "meet the prerequisites of the patch.";
  const LogLines lines = expectLoadFails(path, {34, message});
  EXPECT_EQ(lines,
            aroundLoading(path,
                          {dcf("[" + path + "] is a file."),
                           dcf("DCFPackageProcessor::isApplicable('" + home() + "','readme.txt')  entry"),
                           dcf("Specified filename: readme.txt, is not a valid patch filename, therefore the "
                               "file is not an applicable patch."),
                           dcf("DCFPackageProcessor::isApplicable() retval: [0]"), dcfError(message)},
                          false));
}

TEST_F(LoadTest, FileThatCannotBeInitializedKeepsItsOwnRecord) {
  install("xelpp266.ver");
  const std::string path = write("patches/kxe_lpp266_vema_fp0001.tar", "no archive");
  const LogLines lines = expectLoadFails(path, {3, "Bad return code from tar -xf: 2"});
  EXPECT_EQ(lines, aroundLoading(path,
                                 joined({dcfs({"[" + path + "] is a file."}),
                                         applicability("kxe_lpp266_vema_fp0001.tar", true),
                                         dcfs({"[" + path + "] is applicable.", "Calling initialize ",
                                               "Error initializing patch: " + path})}),
                                 false));
}

TEST_F(LoadTest, FileForARunningServerEndsTheLoading) {
  write("config/.ConfigData/kqaenv", "");
  install("qalpp266.ver", "06200000");
  setRunning({{"qa", "11"}});
  const std::string path = makePatch("kqa_lpp266_vems_1.tar", patchIni("kqa"));
  const LogLines lines = expectLoadFails(path, {35, ""});
  EXPECT_EQ(
      lines,
      aroundLoading(path,
                    joined({dcfs({"[" + path + "] is a file."}), applicability("kqa_lpp266_vems_1.tar", true),
                            dcfs({"[" + path + "] is applicable.", "Calling initialize ",
                                  "Patch initialization succeeded",
                                  "Patch installation terminated because of an active server."})}),
                    false));
}

TEST_F(LoadTest, FileThatMissesAPrerequisiteEndsTheLoading) {
  const std::string path = makeAgentPatch("xe", "fp0001", missingPrereq());
  const LogLines lines = expectLoadFails(path, {9, "Missing patch prerequisite: kzz 06.10.00.00"});
  EXPECT_EQ(
      lines,
      aroundLoading(
          path,
          joined({dcfs({"[" + path + "] is a file."}), applicability("kxe_lpp266_vema_fp0001.tar", true),
                  dcfs({"[" + path + "] is applicable.", "Calling initialize ",
                        "Patch initialization succeeded", "Missing prereqs for patch: " + path})}),
          false));
}

TEST_F(LoadTest, ProcessorThatFailsInLoadingIsDestroyedAtOnce) {
  const std::string path = makeAgentPatch("xe", "fp0001", missingPrereq());
  logLines();
  EXPECT_EQ(load(path), nullptr);
  const LogLines lines = logLines();
  const auto destroyed = std::find(lines.begin(), lines.end(), pp("PatchProcessor::~PatchProcessor() exit"));
  const auto loaded =
      std::find(lines.begin(), lines.end(), dcf("DCFPackageProcessor::load() exit retval: [0]"));
  ASSERT_NE(destroyed, lines.end());
  EXPECT_LT(destroyed - lines.begin(), loaded - lines.begin());
}

TEST_F(LoadTest, DirectoryOffersEveryFileInTheOrderOfTheListing) {
  makeAgentPatch("xe");
  makeAgentPatch("yn");
  write("patches/readme.txt", "");
  makeDirectory("patches/kzz_lpp266_vema_fp0001.tar");
  logLines();
  const Package package = load(patches());
  ASSERT_NE(package, nullptr);
  LogLines between = {dcfInfo("Processing patch files in directory: patches")};
  Names listed;
  for (const std::string &name : listedNames(patches())) {
    if (fs::is_directory(patches() + "/" + name))
      continue;
    const std::string path = patches() + "/" + name;
    between.push_back(dcfInfo("Processing patch file: " + name));
    if (name == "readme.txt") {
      between = joined({between,
                        {dcf("DCFPackageProcessor::isApplicable('" + home() + "','readme.txt')  entry"),
                         dcf("Specified filename: readme.txt, is not a valid patch filename, "
                             "therefore the file is not an applicable patch."),
                         dcf("DCFPackageProcessor::isApplicable() retval: [0]"),
                         dcfInfo("File is not an applicable patch and will be ignored: " + path)}});
      continue;
    }
    between = joined({between, applicability(name, true),
                      dcfs({"[" + path + "] is applicable.", "Calling initialize ",
                            "Patch initialization succeeded", "Patch pushback succeeded. success: 1"})});
    listed.push_back("patches/" + name);
  }
  EXPECT_EQ(packageLines(),
            aroundLoading(patches(),
                          joined({between, dcfs({"DCFPackageProcessor::sort() - entry",
                                                 "Total number of eligible patch files to sort: 2",
                                                 "DCFPackageProcessor::sort() - exit"})}),
                          true));
  EXPECT_EQ(loadedPatches(package), listed);
}

TEST_F(LoadTest, OnePatchIsNotSorted) {
  makeAgentPatch("xe");
  logLines();
  const Package package = load(patches() + "/");
  ASSERT_NE(package, nullptr);
  EXPECT_EQ(loadedPatches(package), Names{"patches/kxe_lpp266_vema_fp0001.tar"});
  for (const LogLine &line : logLines())
    EXPECT_EQ(line.message.find("sort()"), std::string::npos) << line;
  EXPECT_TRUE(package->sort());
  const LogLines lines = logLines();
  ASSERT_GE(lines.size(), 2U);
  EXPECT_EQ(LogLines(lines.begin(), lines.begin() + 2),
            dcfs({"DCFPackageProcessor::sort() - entry", "Total number of eligible patch files to sort: 1"}));
  EXPECT_EQ(package->getPatchProcessors()->size(), 1U);
}

TEST_F(LoadTest, DirectoryWithoutFilesIsCode31) {
  makeDirectory("patches/folder");
  write("patches/folder/kxe_lpp266_vema_fp0001.tar", "not looked at");
  const std::string message = "Unable to locate patch files in directory specified: " + patches();
  EXPECT_EQ(expectLoadFails(patches(), {31, message}),
            aroundLoading(patches(),
                          {dcfInfo("Processing patch files in directory: patches"), dcfError(message)},
                          false));
}

std::string noneApplies(const std::string &path) {
  return "Unable to locate or install patch files which are applicable to this\nsystem in the directory "
         "specified: " +
         path + ".";
}

TEST_F(LoadTest, DirectoryWithoutAnApplicablePatchIsCode32) {
  write("patches/readme.txt", "");
  write("patches/kxe_lpp266_vema_fp0001.tar", "not installed");
  const LogLines lines = expectLoadFails(patches(), {32, noneApplies(patches())});
  for (const std::string &name : listedNames(patches()))
    EXPECT_EQ(
        std::count(lines.begin(), lines.end(),
                   dcfInfo("File is not an applicable patch and will be ignored: " + patches() + "/" + name)),
        1);
  ASSERT_GE(lines.size(), 5U);
  EXPECT_EQ(
      LogLines(lines.end() - 5, lines.end() - 3),
      (LogLines{dcf("_patchProcessors empty. No patches to install"), dcfError(noneApplies(patches()))}));
}

// KEEP(no-applicable-overwrites)
TEST_F(LoadTest, DirectoryWhoseFirstApplicablePatchFailsIsCode32) {
  const std::string path = makeAgentPatch("xe", "fp0001", missingPrereq());
  PatchError err;
  logLines();
  EXPECT_EQ(load(patches(), &err), nullptr);
  EXPECT_EQ(recordOf(err), Record(32, noneApplies(patches())));
  const LogLines lines = logLines();
  const auto prereq =
      std::find(lines.begin(), lines.end(), ppError("Missing patch prerequisite: kzz 06.10.00.00"));
  const auto none = std::find(lines.begin(), lines.end(), dcfError(noneApplies(patches())));
  ASSERT_NE(prereq, lines.end());
  ASSERT_NE(none, lines.end());
  EXPECT_LT(prereq - lines.begin(), none - lines.begin());
  EXPECT_EQ(std::count(lines.begin(), lines.end(), dcf("Missing prereqs for patch: " + path)), 1);
}

TEST_F(LoadTest, DirectoryWhoseLaterPatchFailsKeepsThatRecordAndStopsTheScan) {
  for (const char *letters : {"xe", "yn", "hv"})
    makeAgentPatch(letters);
  const Names order = listedNames(patches());
  ASSERT_EQ(order.size(), 3U);
  const std::string second = order[1].substr(1, 2); // its entry in the directory stays where it is
  makeAgentPatch(second, "fp0001", missingPrereq());
  PatchError err;
  logLines();
  EXPECT_EQ(load(patches(), &err), nullptr);
  EXPECT_EQ(recordOf(err), Record(9, "Missing patch prerequisite: kzz 06.10.00.00"));
  const LogLines lines = logLines();
  const auto offered = [&](const std::string &name) {
    return std::count(lines.begin(), lines.end(), dcfInfo("Processing patch file: " + name));
  };
  EXPECT_EQ(offered(order[0]), 1);
  EXPECT_EQ(offered(order[1]), 1);
  EXPECT_EQ(offered(order[2]), 0);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), dcf("DCFPackageProcessor::sort() - entry")), 0);
  EXPECT_EQ(load(patches()), nullptr) << "without a record";
}

class SortTest : public LoadTest {
protected:
  void SetUp() override {
    LoadTest::SetUp();
    write("config/.ConfigData/kqaenv", "");
  }

public:
  /// A patch for a component that is installed for it.
  void add(const std::string &letters, const std::string &target, const std::string &fixPack = "1") const {
    install(letters + "lpp266.ver", "06200000");
    makePatch("k" + letters + "_lpp266_" + target + "_" + fixPack + ".tar", patchIni("k" + letters));
  }
};

TEST_F(SortTest, TargetsHaveTheirOrder) {
  add("xe", "vema");
  add("dk", "vepd");
  add("qa", "vems");
  add("zt", "vecm");
  add("pt", "veps");
  PatchError err;
  const Package package = load(patches(), &err);
  ASSERT_NE(package, nullptr) << err.text;
  EXPECT_EQ(loadedPatches(package), (Names{"patches/kzt_lpp266_vecm_1.tar", "patches/kqa_lpp266_vems_1.tar",
                                           "patches/kpt_lpp266_veps_1.tar", "patches/kdk_lpp266_vepd_1.tar",
                                           "patches/kxe_lpp266_vema_1.tar"}));
}

TEST_F(SortTest, OrderWithinATargetIsThatOfTheListing) {
  Names listed;
  for (const char *letters : {"xe", "aa", "zz", "mm"})
    add(letters, "vema");
  add("qa", "vems");
  for (const std::string &name : listedNames(patches()))
    if (name.find("vema") != std::string::npos)
      listed.push_back("patches/" + name);
  listed.insert(listed.begin(), "patches/kqa_lpp266_vems_1.tar");
  const Package package = load(patches());
  ASSERT_NE(package, nullptr);
  EXPECT_EQ(loadedPatches(package), listed);
  EXPECT_TRUE(package->sort());
  EXPECT_EQ(loadedPatches(package), listed) << "sorting again changes nothing";
}

} // namespace
