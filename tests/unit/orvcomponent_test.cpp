// Installed components: how they are named, which instances of them run on this host, and for whom.
#include "orvcomponent.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <unistd.h>

#include "fakehome.h"
#include "utilities.h"

namespace {

using Names = std::vector<std::string>;

const std::string CInfoRead = "ORVComponent::intialize entry"; // so spelled
const std::string CInfoDone = "ORVComponent::initialize exit";

class ComponentTest : public FakeHome {
public:
  std::unique_ptr<ORVComponent> component(const std::string &code, const std::string &cinfo,
                                          ORVComponent::Type type = ORVComponent::TYPE_AGENT) const {
    return std::make_unique<ORVComponent>(home(), code, "Agent " + code, "06200000", "lpp266", Names{"none"},
                                          type, cinfo);
  }
  /// The instances that a component of this code finds in the run information.
  Names instances(const std::string &code, const std::string &cinfo) const {
    return component(code, cinfo)->getActiveInstances();
  }
  /// A row of the run information, its host written as given; process 4711 runs it.
  std::string row(const std::string &host, const std::string &code, const std::string &instance) const {
    setProcess("4711");
    return "FIELDSEP=|\n" + host + "|" + code + "|4711|" + instance + "|x\n";
  }
  LogLines ownLines() { return logLinesOf("orvcomponent"); }
};

struct CodeName {
  const char *code;
  const char *name;
};

class ComponentNameTest : public ComponentTest, public ::testing::WithParamInterface<CodeName> {};

TEST_P(ComponentNameTest, IsTheCodeInItsKForm) {
  EXPECT_EQ(component(GetParam().code, "")->getName(), GetParam().name);
}

INSTANTIATE_TEST_SUITE_P(Codes, ComponentNameTest,
                         ::testing::Values(CodeName{"ox", "kox"}, CodeName{"OX", "kox"},
                                           CodeName{"kox", "kox"}, CodeName{"KQA", "kqa"},
                                           CodeName{"ka", "kka"}, CodeName{"x.", "kx."}, CodeName{"x", "x"},
                                           CodeName{"", ""}, CodeName{"ABCD", "abcd"}));

TEST_F(ComponentTest, HoldsWhatItWasMadeFrom) {
  const ORVComponent made(home(), "hv", "Hypervisor Agent", "06100003", "li6243", {"oxli6243", "none"},
                          ORVComponent::TYPE_CLI, "");
  EXPECT_EQ(made.getName(), "khv");
  EXPECT_EQ(made.getDescriptiveName(), "Hypervisor Agent");
  EXPECT_EQ(made.getArch(), "li6243");
  EXPECT_EQ(made.getType(), ORVComponent::TYPE_CLI);
  EXPECT_EQ(made.getVersion()->getDottedVersionString(), "06.10.00.03");
  EXPECT_EQ(made.getPrereqs(), (Names{"oxli6243", "none"}));
  EXPECT_EQ(made.getActiveInstances(), Names{});
}

TEST_F(ComponentTest, VersionIsNotACopy) {
  const auto made = component("ox", "");
  made->getVersion()->set("07010203");
  EXPECT_EQ(made->getVersion()->getVersionString(), "07010203");
}

TEST_F(ComponentTest, CopyIsIndependent) {
  setRunning({{"ox", "4711"}});
  const auto original = component("ox", runInfoText({{"ox", "4711"}}));
  ORVComponent copy(*original);
  EXPECT_TRUE(copy.stopInstance("", nullptr));
  copy.getVersion()->set("07000000");
  EXPECT_EQ(copy.getName(), "kox");
  EXPECT_EQ(copy.getDescriptiveName(), "Agent ox");
  EXPECT_EQ(copy.getArch(), "lpp266");
  EXPECT_EQ(copy.getPrereqs(), Names{"none"});
  EXPECT_EQ(copy.getActiveInstances(), Names{});
  EXPECT_EQ(original->getActiveInstances(), Names{""});
  EXPECT_EQ(original->getVersion()->getVersionString(), "06200000");
}

TEST_F(ComponentTest, DefaultInstanceIsTheEmptyName) {
  EXPECT_EQ(ORVComponent::DEFAULT_INSTANCE, "");
}

TEST_F(ComponentTest, KindsAreNumbersThatOthersCompare) {
  EXPECT_EQ(static_cast<int>(ORVComponent::TYPE_AGENT), 0);
  EXPECT_EQ(static_cast<int>(ORVComponent::TYPE_VEMS), 1);
  EXPECT_EQ(static_cast<int>(ORVComponent::TYPE_VEPS), 2);
  EXPECT_EQ(static_cast<int>(ORVComponent::TYPE_VEPD), 3);
  EXPECT_EQ(static_cast<int>(ORVComponent::TYPE_CLI), 4);
}

TEST_F(ComponentTest, ConstructionOfAnAgentTracesTheCodeAndReadsTheRunInformation) {
  component("OX", "");
  EXPECT_EQ(logLines(), (LogLines{trace("orvcomponent", "ORVComponent::ORVComponent(OX) entry"),
                                  trace("version.cpp", "Version string provided: 06200000."),
                                  trace("orvcomponent", CInfoRead), trace("orvcomponent", "no cinfo data"),
                                  trace("orvcomponent", CInfoDone),
                                  trace("orvcomponent", "ORVComponent::ORVComponent() exit")}));
}

struct Reader {
  const char *code;
  ORVComponent::Type type;
  bool reads;
};

class RunInfoReaderTest : public ComponentTest, public ::testing::WithParamInterface<Reader> {};

TEST_P(RunInfoReaderTest, OnlyAgentsAndTheTwoServersLookAtTheRunInformation) {
  const Reader &reader = GetParam();
  const std::string letters = std::string(reader.code).substr(1);
  setRunning({{letters, "4711"}});
  const auto made = component(reader.code, runInfoText({{letters, "4711"}}), reader.type);
  EXPECT_EQ(made->getActiveInstances(), reader.reads ? Names{""} : Names{});
  const LogLines lines = ownLines();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), trace("orvcomponent", CInfoRead)), reader.reads ? 1 : 0);
}

INSTANTIATE_TEST_SUITE_P(Kinds, RunInfoReaderTest,
                         ::testing::Values(Reader{"kox", ORVComponent::TYPE_AGENT, true},
                                           Reader{"kox", ORVComponent::TYPE_VEMS, false},
                                           Reader{"kox", ORVComponent::TYPE_VEPS, false},
                                           Reader{"kox", ORVComponent::TYPE_VEPD, false},
                                           Reader{"kzt", ORVComponent::TYPE_CLI, false},
                                           Reader{"kdk", ORVComponent::TYPE_VEPD, false},
                                           Reader{"kqa", ORVComponent::TYPE_VEMS, true},
                                           Reader{"kqa", ORVComponent::TYPE_VEPS, true},
                                           Reader{"kpt", ORVComponent::TYPE_VEPS, true},
                                           Reader{"kpt", ORVComponent::TYPE_VEPD, true}));

TEST_F(ComponentTest, OtherKindsAreConstructedWithoutALineAboutTheRunInformation) {
  component("dk", "FIELDSEP=|\n", ORVComponent::TYPE_VEPD);
  EXPECT_EQ(ownLines(), traces("orvcomponent", {"ORVComponent::ORVComponent(dk) entry",
                                                "ORVComponent::ORVComponent() exit"}));
}

TEST_F(ComponentTest, ServerWhoseCodeWasGivenInCapitalsLooksAtTheRunInformationToo) {
  const auto made = component("QA", row(Util::getHostName(), "qa", "hub"), ORVComponent::TYPE_VEMS);
  EXPECT_EQ(made->getActiveInstances(), Names{"hub"});
}

TEST_F(ComponentTest, LineEndsAloneAreNoRunInformation) {
  EXPECT_EQ(instances("ox", "\n\n\n"), Names{});
  EXPECT_EQ(ownLines()[2], trace("orvcomponent", "no cinfo data"));
}

TEST_F(ComponentTest, EveryRowIsTracedAsItIsTaken) {
  const std::string host = Util::getHostName();
  setProcess("11", "quill");
  logLines();
  const auto made = component("xe", "FIELDSEP=|\n\n" + host + "|xe|11|host_inst|7|8\n" + host +
                                        "|xe|12|no\n" + host + "|ox|11|None|7\n");
  EXPECT_EQ(made->getActiveInstances(), Names{"inst"});
  EXPECT_EQ(logLines(),
            joined({traces("orvcomponent", {"ORVComponent::ORVComponent(xe) entry"}),
                    {trace("version.cpp", "Version string provided: 06200000.")},
                    traces("orvcomponent", {CInfoRead, "FIELDSEP= |", "adjusted instance name to inst"}),
                    commandLines({"ps", "-p", "11"}),
                    commandLines({"/bin/sh", "-c", "ps -ef | grep -v grep | grep 11"}),
                    traces("orvcomponent", {"Invalid line format: " + host + "|xe|12|no", CInfoDone,
                                            "ORVComponent::ORVComponent() exit"})}));
}

TEST_F(ComponentTest, RowOfFourFieldsIsRejectedAndFiveOrMoreAreTaken) {
  const std::string host = Util::getHostName();
  setProcess("4711");
  EXPECT_EQ(instances("ox", "FIELDSEP=|\n" + host + "|ox|4711|four\n"), Names{});
  EXPECT_EQ(instances("ox", "FIELDSEP=|\n" + host + "|ox|4711|five|1\n"), Names{"five"});
  EXPECT_EQ(instances("ox", "FIELDSEP=|\n" + host + "|ox|4711|seven|1|2|3\n"), Names{"seven"});
}

TEST_F(ComponentTest, EmptyFieldDoesNotCount) {
  const std::string line = Util::getHostName() + "|ox|4711||five";
  EXPECT_EQ(instances("ox", "FIELDSEP=|\n" + line + "\n"), Names{});
  const LogLines lines = ownLines();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), trace("orvcomponent", "Invalid line format: " + line)), 1);
}

TEST_F(ComponentTest, SeparatorIsWhatTheFirstLineSays) {
  const std::string host = Util::getHostName();
  setProcess("4711");
  EXPECT_EQ(instances("ox", "FIELDSEP=;\n" + host + ";ox;4711;a|b;x\n"), Names{"a|b"});
  EXPECT_EQ(instances("ox", "FIELDSEP=|;\n" + host + "|ox;4711|;abc;x\n"), Names{"abc"});
  EXPECT_EQ(instances("ox", "FIELDSEP=|=x\n" + host + "|ox|4711|a=x|y\n"), Names{"a=x"})
      << "it ends at a second equal sign";
  EXPECT_EQ(instances("ox", "anything=,\n" + host + ",ox,4711,abc,x"), Names{"abc"});
}

TEST_F(ComponentTest, FirstLineWithoutASeparatorLeavesNoUsableLine) {
  setProcess("4711");
  EXPECT_EQ(instances("ox", "FIELDSEP\n" + Util::getHostName() + "|ox|4711|abc|x\n"), Names{});
  EXPECT_EQ(instances("ox", "FIELDSEP=\n" + Util::getHostName() + "|ox|4711|abc|x\n"), Names{});
  EXPECT_EQ(instances("ox", "=\n"), Names{});
}

TEST_F(ComponentTest, NoneIsTheDefaultInstance) {
  EXPECT_EQ(instances("ox", row(Util::getHostName(), "ox", "None")), Names{""});
  EXPECT_EQ(instances("ox", row(Util::getHostName(), "ox", "none")), Names{"none"});
}

TEST_F(ComponentTest, OnlyProductXeDropsWhatPrecedesTheUnderscore) {
  const std::string host = Util::getHostName();
  EXPECT_EQ(instances("xe", row(host, "xe", "host_inst")), Names{"inst"});
  EXPECT_EQ(instances("xe", row(host, "xe", "host_inst_2")), Names{"inst_2"});
  EXPECT_EQ(instances("xe", row(host, "xe", "plain")), Names{"plain"});
  EXPECT_EQ(instances("xe", row(host, "xe", "host_None")), Names{""});
  EXPECT_EQ(instances("ox", row(host, "ox", "host_inst")), Names{"host_inst"});
}

TEST_F(ComponentTest, InstanceNameWithoutUnderscoreIsNotTracedAsAdjusted) {
  instances("xe", row(Util::getHostName(), "xe", "plain"));
  EXPECT_EQ(ownLines(),
            traces("orvcomponent", {"ORVComponent::ORVComponent(xe) entry", CInfoRead, "FIELDSEP= |",
                                    CInfoDone, "ORVComponent::ORVComponent() exit"}));
}

// KEEP(host-prefix)
TEST_F(ComponentTest, HostIsComparedAsAPrefixWithoutRegardToCase) {
  const std::string host = Util::getHostName();
  std::string upper = host;
  std::transform(upper.begin(), upper.end(), upper.begin(),
                 [](unsigned char c) { return static_cast<char>(std::toupper(c)); });
  EXPECT_EQ(instances("ox", row(upper + ".example", "ox", "a")), Names{"a"});
  EXPECT_EQ(instances("ox", row(host + "2", "ox", "a")), Names{"a"}) << "a host whose name begins alike";
  EXPECT_EQ(instances("ox", row("x" + host, "ox", "a")), Names{});
  EXPECT_EQ(instances("ox", row(host.substr(0, host.size() - 1), "ox", "a")), Names{});
}

TEST_F(ComponentTest, ProductCodeOfTheRowIsComparedExactly) {
  const std::string host = Util::getHostName();
  EXPECT_EQ(instances("ox", row(host, "OX", "a")), Names{});
  EXPECT_EQ(instances("ox", row(host, "kox", "a")), Names{});
  EXPECT_EQ(instances("ox", row(host, "xe", "a")), Names{});
}

TEST_F(ComponentTest, ProcessThatDoesNotRunLeavesNoInstance) {
  setProcess("12");
  EXPECT_EQ(instances("ox", runInfoText({{"ox", "11", "a"}, {"ox", "12", "b"}, {"ox", "13", "c"}})),
            Names{"b"});
}

TEST_F(ComponentTest, InstancesKeepTheOrderOfTheRowsAndMayRepeat) {
  const std::vector<RunRow> rows = {{"ox", "11", "b"}, {"ox", "12", "a"}, {"ox", "13"}, {"ox", "14", "b"}};
  setRunning(rows);
  EXPECT_EQ(instances("ox", runInfoText(rows)), (Names{"b", "a", "", "b"}));
}

TEST_F(ComponentTest, InitializeIsAnOperationOfItsOwn) {
  const auto made = component("ox", "");
  logLines();
  made->initialize();
  EXPECT_EQ(logLines(), traces("orvcomponent", {CInfoRead, "no cinfo data", CInfoDone}));
}

class IsRunningTest : public ComponentTest {
protected:
  std::string owner_ = "unset";
};

TEST_F(IsRunningTest, AsksPsDirectlyAndThenForTheOwner) {
  setProcess("4711", "quill");
  EXPECT_TRUE(isRunning("4711", owner_));
  EXPECT_EQ(owner_, "quill");
  EXPECT_EQ(logLines(), joined({commandLines({"ps", "-p", "4711"}),
                                commandLines({"/bin/sh", "-c", "ps -ef | grep -v grep | grep 4711"})}));
}

TEST_F(IsRunningTest, ProcessThatPsDoesNotKnowDoesNotRun) {
  EXPECT_FALSE(isRunning("4711", owner_));
  EXPECT_EQ(logLines(), commandLines({"ps", "-p", "4711"})) << "its owner is not asked for";
}

// KEEP(pid-substring)
TEST_F(IsRunningTest, AnyTextThatHoldsTheNumberCounts) {
  setPsOfProcess("12", "  123 ?   00:00:00 other\n");
  EXPECT_TRUE(isRunning("12", owner_));
}

TEST_F(IsRunningTest, ExitStatusOfPsIsNotLookedAt) {
  write("ps/ps", "#!/bin/sh\necho 4711 owner; exit 1\n", 0755);
  EXPECT_TRUE(isRunning("4711", owner_));
  write("ps/ps", "#!/bin/sh\nexit 0\n", 0755);
  EXPECT_FALSE(isRunning("4711", owner_));
}

TEST_F(IsRunningTest, PsThatIsMissingOnThePathMeansNotRunning) {
  setenv("PATH", (home() + "nowhere").c_str(), 1);
  EXPECT_FALSE(isRunning("4711", owner_));
}

TEST_F(IsRunningTest, OwnerIsTheFirstWordOfTheFirstLineThatHoldsTheNumber) {
  setPsOfProcess("47", "  47 ?   00:00:00 agent\n");
  setPsOfAll("other 11 1\n   first  147 1\nsecond 47 1\n");
  EXPECT_TRUE(isRunning("47", owner_));
  EXPECT_EQ(owner_, "first");
}

TEST_F(IsRunningTest, OwnerIsTrimmed) {
  setPsOfProcess("47", "  47 ?   00:00:00 agent\n");
  setPsOfAll("\tquill\t 47 1\n");
  EXPECT_TRUE(isRunning("47", owner_));
  EXPECT_EQ(owner_, "quill");
}

TEST_F(IsRunningTest, OnlyBlanksEndTheOwner) {
  setPsOfProcess("47", "  47 ?   00:00:00 agent\n");
  setPsOfAll("EX+o~r,v_q-u.i|l=l$\tx 47 1\n");
  EXPECT_TRUE(isRunning("47", owner_));
  EXPECT_EQ(owner_, "EX+o~r,v_q-u.i|l=l$\tx");
}

TEST_F(IsRunningTest, ProcessWithoutAnOwnerRunsAllTheSame) {
  owner_.clear();
  setPsOfProcess("47", "  47 ?   00:00:00 agent\n");
  EXPECT_TRUE(isRunning("47", owner_));
  EXPECT_EQ(owner_, "");
}

TEST_F(IsRunningTest, RealPsFindsThisVeryProcess) {
  std::filesystem::remove(home() + "ps/ps");
  EXPECT_TRUE(isRunning(std::to_string(getpid()), owner_));
}

} // namespace
