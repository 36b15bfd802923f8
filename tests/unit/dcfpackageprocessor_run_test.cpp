// Loaded patches applied or reported one after another, up to the first that fails.
#include "dcfpackageprocessor.h"

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "patchhome.h"

namespace {

namespace fs = std::filesystem;
using Names = std::vector<std::string>;

const std::string Separator = "\n" + std::string(70, '=') + "\n";
const std::string RunEntry = "DCFPackageProcessor::run() entry";
const std::string RunExit = "DCFPackageProcessor::run() exit";
const std::string ReportEntry = "DCFPackageProcessor::testRun() entry";
const std::string ReportExit = "DCFPackageProcessor::testRun() exit";

LogLines dcfs(const std::vector<std::string> &messages) {
  return traces("dcfpackageprocessor", messages);
}

class PackageTest : public PatchHome {
public:
  using Package = std::unique_ptr<DCFPackageProcessor>;

  /// Makes a patch with one script and one file for an agent that is installed, and that does not run.
  void add(const std::string &letters, const std::string &shell = "",
           const std::string &fixPack = "1") const {
    install(letters + "lpp266.ver", "06200000", "Agent " + letters);
    makePatch("k" + letters + "_lpp266_vema_" + fixPack + ".tar",
              patchIni("k" + letters, "06200001", bareSection("PreCommands", {"1.sh"})),
              {command("1.sh", letters + fixPack, shell),
               {"updated_files/" + letters + fixPack, letters + fixPack}});
  }
  /// The package of the path; the log is read up to here.
  Package load(const std::string &path) {
    PatchError err;
    Package package(DCFPackageProcessor::createProcessor(path, &err));
    EXPECT_NE(package, nullptr) << err.text;
    logLines();
    return package;
  }
  Package loadAll() { return load(home() + "patches"); }
  /// A package with nothing in it.
  Package empty() { return load("/dev/null"); }
  LogLines packageLines() { return logLinesOf("dcfpackageprocessor"); }

  /// Two-letter codes of the patches in the order of their application, which is that of the listing.
  Names order() const {
    Names codes;
    for (const std::string &name : listedNames(home() + "patches"))
      codes.push_back(name.substr(1, 2));
    return codes;
  }
  std::string level(const std::string &letters) const {
    return read(home() + "registry/" + letters + "lpp266.ver");
  }
  static std::string newLevel(const std::string &letters) {
    return "desc = Agent " + letters + "\nVRMF = 06200001\n\n";
  }
  static std::string oldLevel(const std::string &letters) {
    return "desc = Agent " + letters + "\nVRMF = 06200000\n";
  }
  /// What is printed for one patch.
  std::string report(const std::string &letters) const {
    return Separator + "Processing patch file: " + home() + "patches/k" + letters + "_lpp266_vema_1.tar\n" +
           "    Fix pack of k" + letters + "\n\n" +
           "No commands to be executed before the agent instances are stopped.\n\n"
           "No instances of running dependent agents to stop or restart.\n\n"
           "The following commands will be executed after agent instances are stopped:\n    1.sh\n"
           "\nThe following files will be installed or replaced with new files:\n    " +
           home() + letters +
           "1\n\n"
           "No commands to be executed before starting the agent instances.\n\n";
  }
};

TEST_F(PackageTest, EmptyListIsAppliedWithSuccess) {
  const Package package = empty();
  PatchError err;
  EXPECT_TRUE(package->run(&err));
  EXPECT_TRUE(package->run(nullptr));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(), dcfs({RunEntry, RunExit, RunEntry, RunExit}));
}

TEST_F(PackageTest, PatchesAreAppliedInOrderEachBetweenTwoCleanUps) {
  add("xe");
  add("yn");
  const Package package = loadAll();
  EXPECT_EQ(treeOf(home() + "tmp"), (Names{"kxe/", "kxe/patch.ini", "kyn/", "kyn/patch.ini"}));
  PatchError err;
  EXPECT_TRUE(package->run(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(treeOf(home() + "tmp"), Names{});
  EXPECT_EQ(journal(), (Names{order()[0] + "1", order()[1] + "1"}));
  for (const char *letters : {"xe", "yn"}) {
    EXPECT_EQ(read(home() + letters + "1"), std::string(letters) + "1");
    EXPECT_EQ(level(letters), newLevel(letters));
  }
  const LogLines lines = logLines();
  EXPECT_EQ(linesOf("dcfpackageprocessor", lines), dcfs({RunEntry, RunExit}));
  Names steps;
  for (const LogLine &line : linesOf("patchprocessor", lines))
    for (const char *step : {"cleanUp() = 1", "run() entry", "run() = 1"})
      if (line.message == std::string("PatchProcessor::") + step)
        steps.emplace_back(step);
  EXPECT_EQ(steps, (Names{"cleanUp() = 1", "run() entry", "run() = 1", "cleanUp() = 1", "cleanUp() = 1",
                          "run() entry", "run() = 1", "cleanUp() = 1"}));
}

TEST_F(PackageTest, FailedPatchEndsTheRunAndIsNotCleanedUp) {
  for (const char *letters : {"xe", "yn", "hv"})
    add(letters);
  const Names codes = order();
  add(codes[1], "exit 3"); // its entry in the directory stays where it is
  const Package package = loadAll();
  PatchError err;
  EXPECT_FALSE(package->run(&err));
  EXPECT_EQ(recordOf(err), Record(21, "Bad return code from 1.sh: 3"));
  EXPECT_EQ(packageLines(), dcfs({RunEntry, "Unable to apply patch: Fix pack of k" + codes[1], RunExit}));
  EXPECT_EQ(journal(), (Names{codes[0] + "1", codes[1] + "1"}));
  EXPECT_EQ(level(codes[0]), newLevel(codes[0]));
  EXPECT_EQ(level(codes[1]), oldLevel(codes[1]));
  EXPECT_EQ(level(codes[2]), oldLevel(codes[2]));
  EXPECT_TRUE(isThere(home() + "tmp/k" + codes[1] + "/1.sh"));
  EXPECT_EQ(treeOf(home() + "tmp/k" + codes[2]), Names{"patch.ini"});
}

TEST_F(PackageTest, FailedPatchWithoutARecordEndsTheRunTheSameWay) {
  add("xe", "exit 3");
  const Package package = loadAll();
  EXPECT_FALSE(package->run(nullptr));
  EXPECT_EQ(packageLines(), dcfs({RunEntry, "Unable to apply patch: Fix pack of kxe", RunExit}));
}

// KEEP(cleanup-unchecked)
TEST_F(PackageTest, CleanUpThatFailsStopsNothingAndLeavesItsRecord) {
  add("xe", "", "1");
  add("xe", "", "2"); // both share one temporary directory, which the first removes
  const Package package = loadAll();
  PatchError err;
  EXPECT_TRUE(package->run(&err));
  EXPECT_EQ(recordOf(err), Record(27, "Unable to remove temporary directory: " + home() + "tmp/kxe"));
  EXPECT_TRUE(isThere(home() + "xe1"));
  EXPECT_TRUE(isThere(home() + "xe2"));
}

TEST_F(PackageTest, EmptyListIsReportedAsNotApplicable) {
  const Package package = empty();
  PatchError err;
  const Printed printed = printedBy([&] { return package->testRun(&err); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, "\nThere are no patch files applicable to this system.\n\n");
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(),
            joined({dcfs({ReportEntry}),
                    {info("dcfpackageprocessor", "There are no patch files applicable to this system.")},
                    dcfs({ReportExit})}));
}

TEST_F(PackageTest, OnePatchIsReportedToTheByte) {
  add("xe");
  const Package package = load(home() + "patches/kxe_lpp266_vema_1.tar");
  PatchError err;
  const Printed printed = printedBy([&] { return package->testRun(&err); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, report("xe"));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(packageLines(), dcfs({ReportEntry, ReportExit}));
}

TEST_F(PackageTest, TwoPatchesAreReportedToTheByteAndChangeNothing) {
  add("xe");
  add("yn");
  const Names before = treeOf(home() + "registry");
  const Package package = loadAll();
  const Printed printed = printedBy([&] { return package->testRun(nullptr); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, report(order()[0]) + report(order()[1]));
  EXPECT_EQ(treeOf(home() + "tmp"), Names{}) << "cleaned up after each";
  EXPECT_EQ(journal(), Names{});
  EXPECT_FALSE(isThere(home() + "xe1"));
  EXPECT_FALSE(isThere(home() + "patchlogs/patches.hist"));
  EXPECT_EQ(level("xe"), oldLevel("xe"));
  EXPECT_EQ(treeOf(home() + "registry"), before);
}

TEST_F(PackageTest, FailedReportEndsTheReportsAndIsNotCleanedUp) {
  add("xe");
  add("yn");
  const std::string first = order()[0];
  fs::remove_all(home() + "staging/k" + first + "_lpp266_vema_1.tar");
  makePatch("k" + first + "_lpp266_vema_1.tar", patchIni("k" + first)); // without files
  const Package package = loadAll();
  PatchError err;
  const Printed printed = printedBy([&] { return package->testRun(&err); });
  EXPECT_FALSE(printed.result);
  EXPECT_EQ(printed.out, Separator + "Processing patch file: " + home() + "patches/k" + first +
                             "_lpp266_vema_1.tar\n    Fix pack of k" + first +
                             "\n\n"
                             "No commands to be executed before the agent instances are stopped.\n\n"
                             "No instances of running dependent agents to stop or restart.\n\n"
                             "No commands to be executed after stopping the agent instances.\n\n");
  EXPECT_EQ(recordOf(err), NoError) << "a patch without files leaves no code";
  EXPECT_EQ(packageLines(), dcfs({ReportEntry, "Unable to apply patch: Fix pack of k" + first, ReportExit}));
  EXPECT_TRUE(isThere(home() + "tmp/k" + first + "/patch.ini"));
}

TEST_F(PackageTest, FailedExtractionInAReportIsInTheRecord) {
  add("xe");
  const Package package = loadAll();
  fs::remove(home() + "patches/kxe_lpp266_vema_1.tar");
  PatchError err;
  const Printed printed = printedBy([&] { return package->testRun(&err); });
  EXPECT_FALSE(printed.result);
  EXPECT_EQ(recordOf(err), Record(3, "Bad return code from tar -xf: 2"));
  EXPECT_EQ(packageLines(), dcfs({ReportEntry, "Unable to apply patch: Fix pack of kxe", ReportExit}));
}

TEST_F(PackageTest, PercentSignsOfADescriptionAreJustText) {
  install("xelpp266.ver", "06200000");
  std::string ini = patchIni("kxe");
  ini.replace(ini.find("Fix pack of kxe"), 15, "100%s%n");
  makePatch("kxe_lpp266_vema_1.tar", ini, {{"updated_files/file", ""}});
  const Package package = loadAll();
  const Printed printed = printedBy([&] { return package->testRun(nullptr); });
  EXPECT_TRUE(printed.result);
  EXPECT_NE(printed.out.find("\n    100%s%n\n\n"), std::string::npos);
}

} // namespace
