// The report of a patch: every byte on standard output, the log, and that nothing is changed.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "patchhome.h"

namespace {

using Names = std::vector<std::string>;

const std::string PatchName = "kxe_lpp266_vema_fp0001.tar";
const std::string NoPrePatch = "No commands to be executed before the agent instances are stopped.\n";
const std::string NoPre = "No commands to be executed after stopping the agent instances.\n";
const std::string NoPost = "No commands to be executed before starting the agent instances.\n\n";
const std::string NoInstances = "No instances of running dependent agents to stop or restart.\n\n";
const std::string Files = "\nThe following files will be installed or replaced with new files:\n";

class ReportTest : public PatchHome {
public:
  /// A processor as the package processor has it before a report.
  Processor ready(const std::string &sections, const std::vector<Member> &members) {
    makePatch(PatchName, patchIni("kxe", "06200001", sections), members);
    Processor kxe = processorFor(PatchName);
    EXPECT_TRUE(kxe->initialize(nullptr));
    EXPECT_TRUE(kxe->cleanUp(nullptr));
    logLines();
    return kxe;
  }
  static std::string report(const Processor &processor, bool expected, PatchError *err = nullptr) {
    const Printed printed = printedBy([&] { return processor->testRun(err); });
    EXPECT_EQ(printed.result, expected);
    EXPECT_EQ(printed.err, "");
    return printed.out;
  }
};

TEST_F(ReportTest, PatchWithFilesOnlyIsReportedToTheByte) {
  const Processor kxe = ready("", {{"updated_files/bin/agent", "new"}});
  PatchError err;
  EXPECT_EQ(report(kxe, true, &err),
            NoPrePatch + "\n" + NoInstances + NoPre + Files + "    " + home() + "bin/agent\n\n" + NoPost);
  EXPECT_EQ(recordOf(err), NoError);
}

TEST_F(ReportTest, FullPatchIsReportedToTheByte) {
  install("xelpp266.ver", "06200000", "Sample Agent");
  install("oxlpp266.ver", "06200000", "OS Agent");
  setRunning({{"xe", "11", "host_one"}, {"ox", "12"}});
  const Processor kxe =
      ready("productEXE = agent.bin\n" + bareSection("Dependents", {"ox"}) +
                bareSection("PrePatchCommands", {"2_check.sh now", "1_save.sh"}) +
                bareSection("PreCommands", {"pre 100%s.sh"}) + bareSection("PostCommands", {"b.sh", "a.sh"}),
            {{"updated_files/bin/agent", "new"}, {"updated_files/top", "new"}});
  EXPECT_EQ(report(kxe, true),
            "The following commands will be executed before agent instances are stopped:\n"
            "    1_save.sh\n    2_check.sh now\n"
            "\n"
            "The following agent instances will be stopped during the patch application and restarted "
            "afterwards:\n    OS Agent\n    one instance of Sample Agent\n\n"
            "The following commands will be executed after agent instances are stopped:\n    pre 100%s.sh\n" +
                Files + "    " + home() + "bin/agent\n    " + home() + "top\n\n" +
                "The following commands will be executed before restarting any previously stopped agents:\n"
                "    a.sh\n    b.sh\n\n");
}

TEST_F(ReportTest, ReportIsTracedFromEntryToResult) {
  const Processor kxe = ready("", {{"updated_files/bin/agent", "new"}});
  report(kxe, true);
  EXPECT_EQ(ownLines(),
            joined({pps({"PatchProcessor::testRun() entry", "PatchProcessor::printDependentsList() entry",
                         "PatchProcessor::buildDependentsList() entry", "Dependent product not found: kxe",
                         "PatchProcessor::buildDependentsList = 1", "PatchProcessor::printDependentsList = 1",
                         "PatchProcessor::extract() entry", "tar returned: 0", "stdout: ", "stderr: ",
                         "PatchProcessor::extract() = 1", "PatchProcessor::listFiles() entry"}),
                    {ppInfo("The following files will be installed or replaced with new files:"),
                     ppInfo(home() + "tmp/kxe/updated_files/bin/agent --> " + home() + "bin/agent")},
                    pps({"PatchProcessor::listFiles() exit", "PatchProcessor::listProductEXEFiles() entry",
                         "PatchProcessor::listProductEXEFiles() = 1", "PatchProcessor::testRun() = 1"})}));
}

TEST_F(ReportTest, PatchWithoutFilesEndsAfterThePreCommandsAndFails) {
  const Processor kxe = ready(bareSection("PostCommands", {"never shown"}), {});
  PatchError err;
  EXPECT_EQ(report(kxe, false, &err), NoPrePatch + "\n" + NoInstances + NoPre + "\n");
  EXPECT_EQ(recordOf(err), NoError) << "the reason is in the log only";
  const LogLines lines = ownLines();
  EXPECT_EQ(
      LogLines(lines.end() - 4, lines.end()),
      (LogLines{pp("PatchProcessor::listFiles() entry"), ppInfo("This patch contains no files to update."),
                pp("PatchProcessor::listFiles() exit"), pp("PatchProcessor::testRun() = 0")}));
}

TEST_F(ReportTest, FailedExtractionEndsTheReport) {
  const Processor kxe = ready("", {{"updated_files/bin/agent", "new"}});
  std::filesystem::remove(patchPath(PatchName));
  PatchError err;
  EXPECT_EQ(report(kxe, false, &err), NoPrePatch + "\n" + NoInstances + NoPre);
  EXPECT_EQ(recordOf(err), Record(3, "Bad return code from tar -xf: 2"));
  EXPECT_EQ(report(kxe, false), NoPrePatch + "\n" + NoInstances + NoPre) << "without a record";
  const LogLines lines = ownLines();
  EXPECT_EQ(LogLines(lines.end() - 2, lines.end()),
            pps({"PatchProcessor::extract() = 0", "PatchProcessor::testRun() = 0"}));
}

TEST_F(ReportTest, FilesThatCannotBeListedEndTheReport) {
  const Processor kxe = ready("", {{"updated_files", "a file"}});
  PatchError err;
  EXPECT_EQ(report(kxe, false, &err), NoPrePatch + "\n" + NoInstances + NoPre + "\n");
  EXPECT_EQ(recordOf(err),
            Record(24, "Could not change current working directory to: " + home() + "tmp/kxe/updated_files"));
}

TEST_F(ReportTest, NothingButTheTemporaryDirectoryAndTheLogChanges) {
  install("xelpp266.ver", "06200000");
  setRunning({{"xe", "11"}});
  makeDirectory("vmaorv6/agentdepot");
  write("bin/agent", "old");
  const Processor kxe =
      ready(bareSection("PrePatchCommands", {"1.sh"}) + bareSection("PreCommands", {"1.sh"}) +
                bareSection("PostCommands", {"1.sh"}),
            {command("1.sh", "run"), {"updated_files/bin/agent", "new"}, {"updated_files/more/file", "new"}});
  Names expected = treeOf(home());
  for (const char *added : {"tmp/kxe/", "tmp/kxe/1.sh", "tmp/kxe/patch.ini", "tmp/kxe/updated_files/",
                            "tmp/kxe/updated_files/bin/", "tmp/kxe/updated_files/bin/agent",
                            "tmp/kxe/updated_files/more/", "tmp/kxe/updated_files/more/file"})
    expected.emplace_back(added);
  std::sort(expected.begin(), expected.end());
  report(kxe, true);
  EXPECT_EQ(treeOf(home()), expected);
  EXPECT_EQ(read(home() + "bin/agent"), "old");
  EXPECT_EQ(read(home() + "registry/xelpp266.ver"), "desc = \nVRMF = 06200000\n");
}

} // namespace
