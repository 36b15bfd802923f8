// A whole installation: the order of its steps, what it leaves behind, and what a failure at each step
// leaves.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "orvcomponentregistry.h"
#include "patchhome.h"

namespace {

namespace fs = std::filesystem;
using Names = std::vector<std::string>;

const std::string PatchName = "kyn_lpp266_vema_fp0001.tar";
const std::string OsAgentWording =
    "Patch seems to be successfully applied. However, the OS agent could not be restarted";

/// What a script of the patch notes of the state of the home.
const std::string State = R"(cat "$QUILLHOME/bin/agent" >>"$QUILLHOME/journal"
grep VRMF "$QUILLHOME/registry/ynlpp266.ver" >>"$QUILLHOME/journal")";

/// A patch of kyn that brings all a patch can bring, for a home where kyn, its dependent khv and the OS agent
/// run.
class RunTest : public PatchHome {
protected:
  void SetUp() override {
    PatchHome::SetUp();
    install("ynlpp266.ver", "06200000", "Sample");
    install("hvlpp266.ver", "06200000", "Hypervisor");
    install("oxlpp266.ver", "06200000", "OS Agent");
    setRunning({{"yn", "11"}, {"hv", "12", "one"}, {"ox", "13"}});
    makeDirectory("vmaorv6/agentdepot");
    write("bin/agent", "old\n", 0750);
    makePatch(PatchName, descriptorText(), contents());
    processor_ = processorFor(PatchName);
    EXPECT_TRUE(processor_->initialize(nullptr));
    EXPECT_TRUE(processor_->cleanUp(nullptr));
    logLines();
  }

public:
  static std::string descriptorText() {
    return patchIni("kyn", "06200001",
                    bareSection("Dependents", {"ox", "hv"}) + bareSection("PrePatchCommands", {"1.sh"}) +
                        bareSection("PreCommands", {"2.sh"}) + bareSection("PostCommands", {"3.sh"}));
  }
  static std::vector<Member> contents() {
    return {command("1.sh", "pre-patch", State),
            command("2.sh", "pre", State),
            command("3.sh", "post", State),
            {"updated_files/bin/agent", "new\n"},
            {"updated_files/top", "more\n"}};
  }
  std::string tempDir() const { return home() + "tmp/kyn"; }
  std::string resultCode() const { return read(home() + "vmaorv6/agentdepot/rc.txt"); }
  /// Results of the records of the history.
  Names history() const {
    static const std::regex record(R"(kyn \| lpp266 \| vema \| kyn fix pack +\| (PASS|FAIL) \| \S+ +\| .*)");
    Names results;
    std::istringstream text(read(home() + "patchlogs/patches.hist"));
    std::smatch match;
    for (std::string line; std::getline(text, line);)
      if (std::regex_match(line, match, record))
        results.push_back(match[1]);
    return results;
  }
  std::string level() const { return read(home() + "registry/ynlpp266.ver"); }

protected:
  Processor processor_;
};

TEST_F(RunTest, StepsHaveTheirOrder) {
  onCall("QuillAgent [start] [ox]", "cat \"$home/vmaorv6/agentdepot/rc.txt\" >>\"$home/journal\"; echo >>"
                                    "\"$home/journal\"");
  onCall("QuillAgent [start] [yn]", State);
  onCall("QuillAgent [stop] [yn]", State);
  PatchError err;
  EXPECT_TRUE(processor_->run(&err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(journal(), (Names{"pre-patch",
                              "old",
                              "VRMF = 06200000",
                              "QuillAgent [-o] [one] [stop] [hv]",
                              "QuillAgent [stop] [ox]",
                              "QuillAgent [stop] [yn]",
                              "old",
                              "VRMF = 06200000",
                              "pre",
                              "old",
                              "VRMF = 06200000",
                              "post",
                              "new",
                              "VRMF = 06200000",
                              "QuillAgent [-o] [one] [start] [hv]",
                              "QuillAgent [start] [yn]",
                              "new",
                              "VRMF = 06200001",
                              "QuillAgent [start] [ox]",
                              "0"}));
}

TEST_F(RunTest, HomeIsLeftAsThePatchWantsIt) {
  EXPECT_TRUE(processor_->run(nullptr));
  EXPECT_EQ(read(home() + "bin/agent"), "new\n");
  EXPECT_EQ(modeOf(home() + "bin/agent"), 0750U);
  EXPECT_EQ(read(home() + "top"), "more\n");
  EXPECT_EQ(modeOf(home() + "top"), 0755U);
  EXPECT_EQ(level(), "desc = Sample\nVRMF = 06200001\n\n");
  EXPECT_EQ(resultCode(), "0");
  EXPECT_EQ(history(), Names{"PASS"});
  EXPECT_EQ(treeOf(tempDir()),
            (Names{"1.sh", "2.sh", "3.sh", "patch.ini", "updated_files/", "updated_files/bin/"}))
      << "a run does not remove its temporary directory";
}

/// What the processor logs while it runs one command.
LogLines scriptLines(const std::string &tempDir, const std::string &path, const std::string &script) {
  return {pp("PatchProcessor::runScripts() entry"),
          pp("old PATH=" + path),
          pp("Setting PATH=" + tempDir + ":" + path),
          ppInfo("Processing 1 scripts."),
          ppInfo("Attempting to execute: " + script),
          ppInfo("Successfully executed: " + script),
          pp("stdOut: "),
          pp("stdErr: "),
          pp("Restoring PATH=" + path),
          pp("PatchProcessor::runScripts() = 1")};
}

LogLines stopLines(const std::string &instance, const std::string &code) {
  return pps({"Attempting to stop instance [" + instance + "]",
              "Adding instance [" + instance + "] to the list of stopped agents",
              "Stopped 1 instance(s) of " + code});
}

TEST_F(RunTest, SuccessIsTracedFromEntryToResult) {
  const std::string path = getenv("PATH");
  const std::string root = tempDir() + "/updated_files";
  const LogLine entry = pp("PatchProcessor::moveFile() entry");
  const LogLine exit = pp("PatchProcessor::moveFile() exit");
  const auto moved = [&](const std::string &file) {
    return ppInfo("Successfully moved file from " + root + "/./" + file + " to " + home() + "./" + file);
  };
  EXPECT_TRUE(processor_->run(nullptr));
  EXPECT_EQ(
      ownLines(),
      joined(
          {pps({"PatchProcessor::run() entry", "PatchProcessor::extract() entry", "tar returned: 0",
                "stdout: ", "stderr: ", "PatchProcessor::extract() = 1",
                "PatchProcessor::runPrePatchScripts() entry"}),
           scriptLines(tempDir(), path, "1.sh"),
           pps({"PatchProcessor::runPrePatchScripts() = 1", "PatchProcessor::stopDependents() entry"}),
           stopLines("one", "khv"),
           stopLines("", "kox"),
           stopLines("", "kyn"),
           pps({"PatchProcessor::stopDependents() = 1", "PatchProcessor::runPreScripts() entry"}),
           scriptLines(tempDir(), path, "2.sh"),
           pps({"PatchProcessor::runPreScripts() = 1", "PatchProcessor::moveFiles() entry"}),
           {ppInfo("Will attempt to move files from " + root + " to " + home()), entry, entry, entry,
            moved("bin/agent"), exit, exit, entry, moved("top"), exit, exit},
           pps({"PatchProcessor::moveFile() = 1", "PatchProcessor::updateProductEXEFiles() entry",
                "PatchProcessor::updateProductEXEFiles() = 1", "PatchProcessor::runPostScripts() entry"}),
           scriptLines(tempDir(), path, "3.sh"),
           pps({"PatchProcessor::runPostScripts() 1", "PatchProcessor::updatePatchVerFile() entry",
                "PatchProcessor::updatePatchVerFile() = 1", "PatchProcessor::startDependents() entry",
                "Attempting to start instance [one]", "Attempting to start instance []",
                "PatchProcessor::startDependents() = 1", "PatchProcessor::startOSAgentIfNeeded() entry",
                "Writing out: " + home() + "vmaorv6/agentdepot/rc.txt",
                "PatchProcessor::startOSAgentIfNeeded() = 1", "PatchProcessor::updatePatchRegistry() entry",
                "PatchProcessor::updatePatchRegistry() exit", "PatchProcessor::run() = 1"})}));
}

TEST_F(RunTest, EveryLayerTracesASmallPatch) {
  makePatch("kaa_lpp266_vema_1.tar", patchIni("kaa"));
  install("aalpp266.ver", "06100000");
  const Processor kaa = processorFor("kaa_lpp266_vema_1.tar");
  EXPECT_TRUE(kaa->initialize(nullptr));
  getComponent("kaa"); // the registry is read before
  logLines();
  EXPECT_TRUE(kaa->run(nullptr));
  const std::string root = home() + "tmp/kaa/updated_files";
  const std::string versionFile = home() + "registry/aalpp266.ver";
  EXPECT_EQ(
      withoutPointers(logLines()),
      joined(
          {pps({"PatchProcessor::run() entry", "PatchProcessor::extract() entry"}),
           traces("file.cpp", {"File::mkdir entry", "File::mkdir = 1"}),
           commandLines({"tar", "-xf", patchPath("kaa_lpp266_vema_1.tar")}),
           pps({"tar returned: 0", "stdout: ", "stderr: ", "PatchProcessor::extract() = 1",
                "PatchProcessor::runPrePatchScripts() entry", "PatchProcessor::runPrePatchScripts() = 1",
                "PatchProcessor::stopDependents() entry"}),
           traces("orvcomponentregistry", {"ORVComponentRegistry::getInstalledComponent entry",
                                           "ORVComponentRegistry::getInstalledComponent exit"}),
           pps({"No running instances of kaa found", "PatchProcessor::stopDependents() = 1",
                "PatchProcessor::runPreScripts() entry", "PatchProcessor::runPreScripts() = 1",
                "PatchProcessor::moveFiles() entry"}),
           traces("utilities.cpp", {"Util::pathExists(" + root + ") entry", "Path does not exist: " + root,
                                    "Util::pathExists(" + root + ") exit"}),
           {ppInfo("This patch contains no files to update.")},
           pps({"PatchProcessor::updateProductEXEFiles() entry",
                "PatchProcessor::updateProductEXEFiles() = 1", "PatchProcessor::runPostScripts() entry",
                "PatchProcessor::runPostScripts() 1", "PatchProcessor::updatePatchVerFile() entry"}),
           traces("utilities.cpp", {"Util::readFileByLines(" + versionFile + ") entry",
                                    "Util::readFile(" + versionFile + ") entry",
                                    "Util::readFile(" + versionFile + ")=0(buffer) exit",
                                    "Util::readFileByLines(" + versionFile + ") exit"}),
           pps({"PatchProcessor::updatePatchVerFile() = 1", "PatchProcessor::startDependents() entry",
                "PatchProcessor::startDependents() = 1", "PatchProcessor::startOSAgentIfNeeded() entry",
                "PatchProcessor::startOSAgentIfNeeded() = 1", "PatchProcessor::updatePatchRegistry() entry",
                "PatchProcessor::updatePatchRegistry() exit", "PatchProcessor::run() = 1"})}));
}

const Names Steps = {"extract",         "runPrePatchScripts",    "stopDependents",     "runPreScripts",
                     "moveFiles",       "updateProductEXEFiles", "runPostScripts",     "updatePatchVerFile",
                     "startDependents", "startOSAgentIfNeeded",  "updatePatchRegistry"};

/// The steps of the list whose entry these lines hold, in order.
Names stepsAmong(const LogLines &lines) {
  Names entered;
  for (const LogLine &line : lines)
    for (const std::string &step : Steps)
      if (line == pp("PatchProcessor::" + step + "() entry"))
        entered.push_back(step);
  return entered;
}

/// How a step is made to fail, and what follows from it.
struct Failure {
  const char *name;
  std::function<void(const RunTest &)> cause;
  std::size_t steps; ///< that were entered of the nine
  int code;
  const char *handedToOsAgent; ///< content of its result file; empty when it was not stopped
  Names lastCalls;             ///< the end of the journal
};

/// Remakes the patch with one script that fails.
std::function<void(const RunTest &)> failingScript(const std::string &name) {
  return [name](const RunTest &test) {
    std::vector<Member> members = RunTest::contents();
    for (Member &member : members)
      if (member.path == name)
        member.content += "exit 3\n";
    test.makePatch(PatchName, RunTest::descriptorText(), members);
  };
}

/// The control script fails when it is called like this.
std::function<void(const RunTest &)> failingCall(const std::string &call) {
  return [call](const RunTest &test) { test.onCall(call, "exit 1"); };
}

const std::string StartOsAgent = "QuillAgent [start] [ox]";

class FailedStepTest : public RunTest, public ::testing::WithParamInterface<Failure> {
public:
  void expectLastCalls() const {
    const Names all = journal();
    const Names &expected = GetParam().lastCalls;
    ASSERT_GE(all.size(), expected.size());
    EXPECT_EQ(Names(all.end() - static_cast<std::ptrdiff_t>(expected.size()), all.end()), expected);
  }
};

TEST_P(FailedStepTest, SkipsTheLaterStepsButNotTheOsAgentAndTheHistory) {
  const Failure &failure = GetParam();
  getComponent("kyn"); // the registry is read while all is well
  failure.cause(*this);
  logLines();
  PatchError err;
  EXPECT_FALSE(processor_->run(&err));
  EXPECT_EQ(err.code, failure.code) << err.text;
  Names entered(Steps.begin(), Steps.begin() + static_cast<std::ptrdiff_t>(failure.steps));
  entered.insert(entered.end(), Steps.end() - 2, Steps.end());
  const LogLines lines = ownLines();
  EXPECT_EQ(stepsAmong(lines), entered);
  EXPECT_EQ(lines.back(), pp("PatchProcessor::run() = 0"));
  EXPECT_EQ(history(), Names{"FAIL"});
  EXPECT_EQ(resultCode(), failure.handedToOsAgent);
  expectLastCalls();
}

TEST_P(FailedStepTest, WithoutARecordEndsTheSameWayButHandsOverZero) {
  const Failure &failure = GetParam();
  getComponent("kyn");
  failure.cause(*this);
  EXPECT_FALSE(processor_->run(nullptr));
  EXPECT_EQ(history(), Names{"FAIL"});
  EXPECT_EQ(resultCode(), *failure.handedToOsAgent == '\0' ? "" : "0");
  expectLastCalls();
}

INSTANTIATE_TEST_SUITE_P(
    Steps, FailedStepTest,
    ::testing::Values(
        Failure{
            "Extraction", [](const RunTest &test) { fs::remove(test.patchPath(PatchName)); }, 1, 3, "", {}},
        Failure{"PrePatchScript", failingScript("1.sh"), 2, 22, "", {"pre-patch", "old", "VRMF = 06200000"}},
        Failure{"FirstStop",
                failingCall("QuillAgent [-o] [one] [stop] [hv]"),
                3,
                15,
                "",
                {"QuillAgent [-o] [one] [stop] [hv]"}},
        Failure{"LastStop",
                failingCall("QuillAgent [stop] [yn]"),
                3,
                14,
                "14",
                {"QuillAgent [stop] [yn]", StartOsAgent}},
        Failure{
            "PreScript", failingScript("2.sh"), 4, 21, "21", {"pre", "old", "VRMF = 06200000", StartOsAgent}},
        Failure{"Move",
                [](const RunTest &test) { test.makeDirectory("top"); },
                5,
                25,
                "25",
                {"pre", "old", "VRMF = 06200000", StartOsAgent}},
        Failure{"PostScript",
                failingScript("3.sh"),
                7,
                23,
                "23",
                {"post", "new", "VRMF = 06200000", StartOsAgent}},
        Failure{"VersionFile",
                [](const RunTest &test) { // the post script is the last to see the file
                  std::vector<Member> members = RunTest::contents();
                  members[2].content += "rm \"$QUILLHOME/registry/ynlpp266.ver\"\n";
                  test.makePatch(PatchName, RunTest::descriptorText(), members);
                },
                8,
                28,
                "28",
                {"post", "new", "VRMF = 06200000", StartOsAgent}},
        Failure{"Start",
                failingCall("QuillAgent [-o] [one] [start] [hv]"),
                9,
                13,
                "13",
                {"QuillAgent [-o] [one] [start] [hv]", StartOsAgent}}),
    [](const auto &test) { return test.param.name; });

TEST_F(RunTest, OsAgentThatCannotBeRestartedFailsTheRun) {
  onCall(StartOsAgent, "exit 1");
  PatchError err;
  EXPECT_FALSE(processor_->run(&err));
  EXPECT_EQ(recordOf(err), Record(12, "Unable to start agent for product OS Agent."));
  EXPECT_EQ(resultCode(), "0");
  EXPECT_EQ(history(), Names{"FAIL"});
  EXPECT_EQ(level(), "desc = Sample\nVRMF = 06200001\n\n");
  const LogLines lines = ownLines();
  EXPECT_EQ(LogLines(lines.end() - 5, lines.end()),
            pps({"PatchProcessor::startOSAgentIfNeeded() = 0", OsAgentWording,
                 "PatchProcessor::updatePatchRegistry() entry", "PatchProcessor::updatePatchRegistry() exit",
                 "PatchProcessor::run() = 0"}));
}

// KEEP(osagent-wording)
TEST_F(RunTest, SameWordsAfterAPatchThatFailedAndTheLastFailureHasTheRecord) {
  onCall(StartOsAgent, "exit 1");
  makeDirectory("top");
  PatchError err;
  EXPECT_FALSE(processor_->run(&err));
  EXPECT_EQ(recordOf(err), Record(12, "Unable to start agent for product OS Agent."));
  EXPECT_EQ(resultCode(), "25");
  const LogLines lines = ownLines();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), pp(OsAgentWording)), 1);
}

TEST_F(RunTest, OsAgentGetsTheCodeThatTheRecordHeldBefore) {
  PatchError err{27, "of a clean-up"};
  EXPECT_TRUE(processor_->run(&err));
  EXPECT_EQ(recordOf(err), Record(27, "of a clean-up"));
  EXPECT_EQ(resultCode(), "27");
  EXPECT_EQ(history(), Names{"PASS"});
}

TEST_F(RunTest, ProductExecutableChangesNothing) {
  write("vmaorv6/agent_copy.bin", "old copy");
  makePatch("kaa_lpp266_vema_1.tar", patchIni("kaa", "06200001", "productEXE = agent.bin\n"),
            {{"updated_files/vmaorv6/agent.bin", "new"}});
  install("aalpp266.ver", "06100000");
  const Processor kaa = processorFor("kaa_lpp266_vema_1.tar");
  EXPECT_TRUE(kaa->initialize(nullptr));
  EXPECT_TRUE(kaa->run(nullptr));
  EXPECT_EQ(read(home() + "vmaorv6/agent_copy.bin"), "old copy");
  EXPECT_EQ(read(home() + "vmaorv6/agent.bin"), "new");
}

} // namespace
