// May the patch be applied: running servers, the installed level, and prerequisites.
#include "patchprocessor/patchprocessor.h"

#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "patchhome.h"

namespace {

using Names = std::vector<std::string>;
using ::testing::StartsWith;

const std::string AgentPatch = "kxe_lpp266_vema_fp0001.tar";
const std::string Entry = "PatchProcessor::checkPrereqs() entry";

std::string prereqSection(const std::vector<std::string> &lines) {
  return bareSection("PreReqs", lines);
}

/// The lines of a search for the architecture of a prerequisite.
Names archSearch(const std::string &result) {
  return {"PatchProcessor::getArchFromPrereqs() entry",
          "PatchProcessor::getArchFromPrereqs returning = " + result,
          "PatchProcessor::getArchFromPrereqs() exit"};
}

class PrereqTest : public PatchHome {
public:
  /// A patch of kxe to 06.20.00.01 with these prerequisites; the installed kxe is at 06.20.00.00.
  Processor withPrereqs(const std::vector<std::string> &lines, const Names &ownPrereqs = {"none"}) {
    install("xelpp266.ver", "06200000", "Sample", ownPrereqs);
    return loaded(AgentPatch, patchIni("kxe", "06200001", prereqSection(lines)));
  }
  /// The same with other levels and without prerequisites.
  Processor atLevels(const std::string &installed, const std::string &patch) {
    install("xelpp266.ver", installed);
    return loaded(AgentPatch, patchIni("kxe", patch));
  }
  void expectMet(const Processor &processor) {
    PatchError err;
    EXPECT_TRUE(processor->checkPrereqs(&err));
    EXPECT_EQ(recordOf(err), NoError);
    EXPECT_TRUE(processor->checkPrereqs(nullptr));
  }
  LogLines expectRefused(const Processor &processor, const Record &expected) {
    return expectOwnFailure(expected, [&](PatchError *err) { return processor->checkPrereqs(err); });
  }
};

TEST_F(PrereqTest, PatchWithoutPrerequisitesIsTracedFromEntryToResult) {
  const Processor kxe = atLevels("06200000", "06200001");
  PatchError err;
  EXPECT_TRUE(kxe->checkPrereqs(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), pps({Entry, "PatchProcessor::checkPrereqs() = 1"}));
}

TEST_F(PrereqTest, ProductThatIsNotInstalledIsCode9) {
  const Processor kxe = loaded(AgentPatch, patchIni("kxe"));
  const std::string message =
      "The following product code kxe for the product being updated cannot be located in the .ver files and "
      "therefore, may not be installed at this time.  Verify the product you are attempting to update is "
      "actually installed on this system.";
  EXPECT_EQ(expectRefused(kxe, {9, message}),
            joined({pps({Entry}), {ppError(message)}, pps({"PatchProcessor::checkPrereqs() = 0"})}));
}

/// A patch file, the version file that would satisfy it, and whether that one counts.
struct Installed {
  const char *patch;
  const char *product;
  const char *versionFile;
  bool found;
};

class InstalledTest : public PrereqTest, public ::testing::WithParamInterface<Installed> {};

// KEEP(support-patch-refused)
TEST_P(InstalledTest, IsFoundByProductKindAndFullPlatform) {
  const Installed &given = GetParam();
  install(given.versionFile, "06200000");
  const Processor processor = loaded(given.patch, patchIni(given.product));
  PatchError err;
  EXPECT_EQ(processor->checkPrereqs(&err), given.found);
  EXPECT_EQ(err.code, given.found ? 0 : 9);
}

INSTANTIATE_TEST_SUITE_P(VersionFiles, InstalledTest,
                         ::testing::Values(Installed{"kxe_lpp266_vema_1.tar", "kxe", "xelpp266.ver", true},
                                           Installed{"kxe_lpp266_vema_1.tar", "kxe", "xelpp263.ver", false},
                                           Installed{"kxe_lpp266_vema_1.tar", "kxe", "xeli6243.ver", false},
                                           Installed{"kxe_lpp266_vema_1.tar", "kox", "xelpp266.ver", false},
                                           Installed{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", true},
                                           Installed{"kpt_lpp266_veps_1.tar", "kpt", "ptlpp266.ver", true},
                                           Installed{"kdk_lpp266_vepd_1.tar", "kdk", "dklpp266.ver", true},
                                           Installed{"kzt_lpp266_vecm_1.tar", "kzt", "ztlpp266.ver", true},
                                           Installed{"kxe_lpp266_vecm_1.tar", "kxe", "ztlpp266.ver", false},
                                           Installed{"kxe_lpp266_vems_1.tar", "kxe", "xevms.ver", false},
                                           Installed{"kxe_lpp266_veps_1.tar", "kxe", "xevps.ver", false},
                                           Installed{"kxe_lpp266_vepd_1.tar", "kxe", "xevpd.ver", false},
                                           Installed{"kqa_lpp266_vema_1.tar", "kqa", "qalpp266.ver", false}));

TEST_F(PrereqTest, SameLevelMayBeAppliedAgain) {
  expectMet(atLevels("06200001", "06200001"));
}

TEST_F(PrereqTest, BacklevelPatchIsCode11) {
  const Processor kxe = atLevels("06200002", "06200001");
  const std::string message =
      "Can't install backlevel patch version: 06.20.00.01. Installed version is 06.20.00.02";
  EXPECT_EQ(expectRefused(kxe, {11, message}),
            joined({pps({Entry}), {ppError(message)}, pps({"PatchProcessor::checkPrereqs() = 0"})}));
}

TEST_F(PrereqTest, PatchOfAnOlderReleaseIsBacklevelToo) {
  expectRefused(atLevels("06300000", "06200009"),
                {11, "Can't install backlevel patch version: 06.20.00.09. Installed version is 06.30.00.00"});
}

TEST_F(PrereqTest, PatchOfANewerReleaseIsCode10) {
  const Processor kxe = atLevels("06100005", "06200001");
  const std::string message =
      "Incorrect prerequisite version for kxe. Installed = 06.10.00.05, required = 06.20.00.00.";
  EXPECT_EQ(expectRefused(kxe, {10, message}),
            joined({pps({Entry}), {ppError(message)}, pps({"PatchProcessor::checkPrereqs() = 0"})}));
}

TEST_F(PrereqTest, PatchOfANewerVersionIsCode10) {
  expectRefused(atLevels("06100000", "07100000"),
                {10, "Incorrect prerequisite version for kxe. Installed = 06.10.00.00, required = "
                     "07.10.00.00."});
}

TEST_F(PrereqTest, NewerModificationAndFixLevelOfTheReleasePass) {
  expectMet(atLevels("06200000", "06209999"));
}

TEST_F(PrereqTest, PrerequisitesAreTakenInTheOrderOfTheirCodesAndTraced) {
  install("oxlpp266.ver", "06100000");
  install("hvlpp266.ver", "06200005");
  const Processor kxe =
      withPrereqs({"xe = 09000000", "OX = 06.10.00.00", "khv = 062000"}, {"none", "oxlpp266"});
  EXPECT_TRUE(kxe->checkPrereqs(nullptr));
  EXPECT_EQ(ownLines(), joined({pps({Entry, "Check for prereq for khv"}), pps(archSearch("")),
                                pps({"Comparing installed version 06200005 to required version 06200000.",
                                     "Prereq verified.", "Check for prereq for kox"}),
                                pps(archSearch("lpp266")),
                                pps({"Comparing installed version 06100000 to required version 06100000.",
                                     "Prereq verified.", "Check for prereq for kxe",
                                     "Prereq previously verified.", "PatchProcessor::checkPrereqs() = 1"})}));
}

TEST_F(PrereqTest, LevelIsThatOfTheComponentOfThePatchsPlatform) {
  for (const char *other : {"xeaix526.ver", "xelpp263.ver", "xelpp269.ver", "xeunix.ver"})
    install(other, "07000000");
  expectMet(atLevels("06200000", "06200001"));
}

TEST_F(PrereqTest, OwnProductIsThatOfTheDescriptorNotOfTheFileName) {
  install("xelpp266.ver", "06200000");
  const auto patch = [&](const std::string &prereq) {
    return loaded("kyn_lpp266_vema_fp0001.tar", patchIni("kxe", "06200001", prereqSection({prereq})));
  };
  expectMet(patch("kxe = 09999999"));
  expectRefused(patch("kyn = 061000"), {9, "Missing patch prerequisite: kyn 06.10.00.00"});
}

TEST_F(PrereqTest, MissingPrerequisiteIsCode9AndNamesItsDottedLevel) {
  const Processor kxe = withPrereqs({"kox = 061000", "kyn = 061000"});
  const std::string message = "Missing patch prerequisite: kox 06.10.00.00";
  EXPECT_EQ(expectRefused(kxe, {9, message}),
            joined({pps({Entry, "Check for prereq for kox"}),
                    pps(archSearch("")),
                    {ppError(message), pp("PatchProcessor::checkPrereqs() = 0")}}));
}

TEST_F(PrereqTest, PrerequisiteThatIsTooOldIsCode10) {
  install("oxlpp266.ver", "06100004");
  const Processor kxe = withPrereqs({"kox = 06.10.00.05", "kyn = 061000"});
  const std::string message =
      "Incorrect prerequisite version for kox. Installed = 06.10.00.04, required = 06.10.00.05.";
  EXPECT_EQ(expectRefused(kxe, {10, message}),
            joined({pps({Entry, "Check for prereq for kox"}),
                    pps(archSearch("")),
                    pps({"Comparing installed version 06100004 to required version 06100005."}),
                    {ppError(message), pp("PatchProcessor::checkPrereqs() = 0")}}));
}

TEST_F(PrereqTest, PrerequisiteThatTheComponentDoesNotNameMayHaveAnyArchitecture) {
  install("oxli6243.ver", "06100000");
  expectMet(withPrereqs({"kox = 061000"}, {"none"}));
}

TEST_F(PrereqTest, PrerequisiteThatTheComponentNamesNeedsThatArchitecture) {
  install("oxli6243.ver", "06100000");
  expectRefused(withPrereqs({"kox = 061000"}, {"oxlpp266"}),
                {9, "Missing patch prerequisite: kox 06.10.00.00"});
}

TEST_F(PrereqTest, ArchitectureNoneIsLookedUpAsItIs) {
  install("onlpp266.ver", "06100000");
  expectRefused(withPrereqs({"kon = 061000"}, {"none"}), {9, "Missing patch prerequisite: kon 06.10.00.00"});
}

struct PrereqKind {
  const char *patch;
  const char *product;
  const char *productFile;
  const char *prereq;
  const char *prereqFile;
  bool found;
};

class PrereqKindTest : public PrereqTest, public ::testing::WithParamInterface<PrereqKind> {};

TEST_P(PrereqKindTest, IsThatOfThePatchButForThreeProducts) {
  const PrereqKind &given = GetParam();
  install(given.productFile, "06200000");
  install(given.prereqFile, "06200000");
  const Processor processor =
      loaded(given.patch, patchIni(given.product, "06200001", prereqSection({given.prereq})));
  PatchError err;
  EXPECT_EQ(processor->checkPrereqs(&err), given.found);
  EXPECT_EQ(err.code, given.found ? 0 : 9);
}

INSTANTIATE_TEST_SUITE_P(
    Lookups, PrereqKindTest,
    ::testing::Values(
        PrereqKind{"kxe_lpp266_vema_1.tar", "kxe", "xelpp266.ver", "kzt", "ztlpp266.ver", true},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "kzt", "ztlpp266.ver", true},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "kzt", "ztvms.ver", false},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "khv", "hvlpp266.ver", true},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "khv", "hvvms.ver", false},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "kbn", "bnlpp266.ver", true},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "kox", "oxvms.ver", true},
        PrereqKind{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver", "kox", "oxlpp266.ver", false},
        PrereqKind{"kpt_lpp266_veps_1.tar", "kpt", "ptlpp266.ver", "kox", "oxvps.ver", true},
        PrereqKind{"kxe_lpp266_vema_1.tar", "kxe", "xelpp266.ver", "kqa", "qalpp266.ver", false}));

/// What a prerequisite list says of the architecture of a prerequisite.
struct ArchSearch {
  const char *prereq;
  Names list;
  const char *arch;
};

class ArchSearchTest : public PrereqTest, public ::testing::WithParamInterface<ArchSearch> {};

TEST_P(ArchSearchTest, FirstEntryThatHoldsTheLettersDecides) {
  const Processor processor = processorFor(AgentPatch);
  logLines();
  EXPECT_EQ(processor->getArchFromPrereqs(GetParam().prereq, GetParam().list), GetParam().arch);
  EXPECT_EQ(ownLines(), pps(archSearch(GetParam().arch)));
}

INSTANTIATE_TEST_SUITE_P(
    Lists, ArchSearchTest,
    ::testing::Values(ArchSearch{"kox", {"oxli6243"}, "li6243"}, ArchSearch{"kox", {}, ""},
                      ArchSearch{"kox", {"none"}, ""}, ArchSearch{"kox", {"qali6243", "oxlpp266"}, "lpp266"},
                      ArchSearch{"kox", {"oxlpp266", "oxli6243"}, "lpp266"},
                      ArchSearch{"kox", {"qaox266", "oxlpp266"}, "ox266"},
                      ArchSearch{"kox", {"OXlpp266"}, ""}, ArchSearch{"kon", {"none", "onlpp266"}, "none"},
                      ArchSearch{"kon", {"nonelpp"}, "nelpp"}, ArchSearch{"kox", {"ox"}, ""},
                      ArchSearch{"kx", {"x", "oxlpp266"}, ""}, ArchSearch{"k", {"oxlpp266"}, "lpp266"},
                      ArchSearch{"", {"oxlpp266"}, "lpp266"}));

const std::string ActiveEntry = "PatchProcessor::checkForActivePrograms() entry";

/// The lines of a check that found nothing, or of its end.
LogLines activeEnd(bool result) {
  return pps({std::string("PatchProcessor::checkForActivePrograms() = ") + (result ? "1" : "0"),
              "PatchProcessor::checkForActivePrograms() exit"});
}

class ActiveTest : public PatchHome {
public:
  void expectPasses(const std::string &patch) {
    PatchError err;
    const Processor processor = processorFor(patch);
    logLines();
    const Printed printed = printedBy([&] { return processor->checkForActivePrograms(&err); });
    EXPECT_TRUE(printed.result);
    EXPECT_EQ(printed.out + printed.err, "");
    EXPECT_EQ(recordOf(err), NoError);
    EXPECT_EQ(ownLines(), joined({pps({ActiveEntry}), activeEnd(true)}));
  }
  /// Refusal with an empty text in the record: the message goes to standard error and into the log.
  void expectRefused(const std::string &patch, int code, const std::string &what,
                     const std::string &explanation) {
    const Processor processor = processorFor(patch);
    const std::string path = patchPath(patch);
    const std::string message = "The " + path + " file\n" + explanation;
    const LogLines lines =
        expectOwnFailure({code, ""}, [&](PatchError *err) { return processor->checkForActivePrograms(err); });
    EXPECT_EQ(printedByFailure().err, "\n\n" + message + "\n");
    EXPECT_EQ(printedByFailure().out, "");
    EXPECT_EQ(lines, joined({pps({ActiveEntry, "Found a running instance of the " + what +
                                                   ". Aborting installation of " + path + "."}),
                             {ppError(message)},
                             activeEnd(false)}));
  }
};

// KEEP(running-empty-text)
TEST_F(ActiveTest, RunningMonitoringServerIsCode35) {
  install("qalpp266.ver");
  setRunning({{"qa", "11"}});
  expectRefused("kqa_lpp266_vems_fp0001.tar", 35, "VEMS server",
                "includes updates for the Veyra Enterprise Monitoring Server. The server\nis currently "
                "running and must be stopped before the updates can be\napplied. The updates will not be "
                "applied at this time. Please stop the\nserver before attempting to install this patch "
                "again.");
}

TEST_F(ActiveTest, RunningPortalServerIsCode36) {
  install("ptlpp266.ver");
  setRunning({{"pt", "11", "portal"}});
  expectRefused("kpt_lpp266_veps_fp0001.tar", 36, "VEPS server",
                "includes updates for the Veyra Enterprise Portal Server. The server is\ncurrently running "
                "and must be stopped before the updates can be applied.\n The updates will not be applied at "
                "this time. Please stop the server\nbefore attempting to install this patch again.");
}

TEST_F(ActiveTest, RunningConsoleIsCode37) {
  setPsOfAll("quill 11 1 0 08:00 ? java -jar " + home() + "classes/wbt.jar\n");
  expectRefused("kzt_lpp266_vecm_fp0001.tar", 37, "Manage Veyra Enterprize Monitoring Services console",
                "includes updates for the Manage Veyra Enterprise Monitoring Services\nconsole. The console "
                "is currently running and must be stopped before the\nupdates can be applied. The updates "
                "will not be applied at this time.\nPlease stop the console before attempting to install "
                "this patch again.");
}

TEST_F(ActiveTest, PathIsNamedAsItWasGiven) {
  install("qalpp266.ver");
  setRunning({{"qa", "11"}});
  std::filesystem::current_path(makeDirectory("patches"));
  const Processor relative(PatchProcessor::createProcessor("./kqa_lpp266_vems_1.tar", home(), nullptr));
  const Printed printed = printedBy([&] { return relative->checkForActivePrograms(nullptr); });
  EXPECT_FALSE(printed.result);
  EXPECT_THAT(printed.err, StartsWith("\n\nThe ./kqa_lpp266_vems_1.tar file\nincludes updates"));
}

TEST_F(ActiveTest, ServerThatIsInstalledButStoppedPasses) {
  install("qalpp266.ver");
  install("ptlpp266.ver");
  expectPasses("kqa_lpp266_vems_fp0001.tar");
  expectPasses("kpt_lpp266_veps_fp0001.tar");
}

TEST_F(ActiveTest, ServerThatIsNotInstalledPasses) {
  setRunning({{"qa", "11"}, {"pt", "12"}});
  expectPasses("kqa_lpp266_vems_fp0001.tar");
  expectPasses("kpt_lpp266_veps_fp0001.tar");
}

TEST_F(ActiveTest, ConsoleOfAnotherHomePasses) {
  setPsOfAll("quill 11 1 0 08:00 ? java -jar /elsewhere/classes/wbt.jar\n");
  expectPasses("kzt_lpp266_vecm_fp0001.tar");
}

TEST_F(ActiveTest, ProductOfTheFileNameDecidesNotThatOfTheDescriptor) {
  install("qalpp266.ver");
  setRunning({{"qa", "11"}});
  const auto passes = [&](const std::string &fileName, const std::string &product) {
    const Processor processor = loaded(fileName, patchIni(product));
    return printedBy([&] { return processor->checkForActivePrograms(nullptr); }).result;
  };
  EXPECT_FALSE(passes("kqa_lpp266_vems_fp0001.tar", "kxe"));
  EXPECT_TRUE(passes("kxe_lpp266_vems_fp0001.tar", "kqa"));
}

TEST_F(ActiveTest, OtherProductsPassWhateverRuns) {
  for (const char *file : {"qalpp266.ver", "ptlpp266.ver", "xelpp266.ver"})
    install(file);
  setRunning({{"qa", "11"}, {"pt", "12"}, {"xe", "13"}});
  setPsOfAll("quill 11 1 0 08:00 ? java -jar " + home() + "classes/wbt.jar\n");
  expectPasses("kxe_lpp266_vems_fp0001.tar");
  expectPasses("kxe_lpp266_vecm_fp0001.tar");
  expectPasses("KQA_lpp266_vems_fp0001.tar");
}

} // namespace
