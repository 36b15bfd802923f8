// The instances that a patch stops and starts again: which they are, in which order, and what the report
// says.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "orvcomponentregistry.h"
#include "patchhome.h"

namespace {

using Names = std::vector<std::string>;

const std::string AgentPatch = "kxe_lpp266_vema_fp0001.tar";
const std::string NoneRuns = "No instances of running dependent agents to stop or restart.\n\n";
const std::string Heading = "The following agent instances will be stopped during the patch application and "
                            "restarted afterwards:\n";
const std::string NoTarget = "This patch is not target for a vema or vecm, no dependents will be stopped";
const std::string BuildEntry = "PatchProcessor::buildDependentsList() entry";
const std::string BuildDone = "PatchProcessor::buildDependentsList = 1";
const std::string StopEntry = "PatchProcessor::stopDependents() entry";
const std::string StopDone = "PatchProcessor::stopDependents() = 1";
const std::string StopFailed = "PatchProcessor::stopDependents() = 0";
const std::string StartEntry = "PatchProcessor::startDependents() entry";
const std::string StartDone = "PatchProcessor::startDependents() = 1";
const std::string StartFailed = "PatchProcessor::startDependents() = 0";

class DependentsTest : public PatchHome {
public:
  /// Agents of these two-letter codes, described by their product codes.
  void installAgents(const Names &letters) const {
    for (const std::string &code : letters)
      install(code + "lpp266.ver", "06200000", "k" + code);
  }
  Processor withDependents(const Names &dependents, const std::string &patch = AgentPatch,
                           const std::string &product = "kxe") {
    return loaded(patch, patchIni(product, "06200001", bareSection("Dependents", dependents)));
  }
  LogLines buildLines(const Processor &processor) {
    logLines();
    EXPECT_TRUE(processor->buildDependentsList(nullptr));
    return ownLines();
  }
  LogLines stopLines(const Processor &processor) {
    logLines();
    PatchError err;
    EXPECT_TRUE(processor->stopDependents(&err));
    EXPECT_EQ(recordOf(err), NoError);
    return ownLines();
  }
  LogLines startLines(const Processor &processor) {
    logLines();
    PatchError err;
    EXPECT_TRUE(processor->startDependents(&err));
    EXPECT_EQ(recordOf(err), NoError);
    return ownLines();
  }
  static std::string printed(const Processor &processor) {
    const Printed list = printedBy([&] { return processor->printDependentsList(nullptr); });
    EXPECT_TRUE(list.result);
    return list.out;
  }
  /// What the control scripts were called for since the last question.
  Names calls() {
    const Names all = journal();
    const Names fresh(all.begin() + static_cast<std::ptrdiff_t>(seen_), all.end());
    seen_ = all.size();
    return fresh;
  }
  /// The lines of one component in the order in which the registry lists the version files.
  LogLines inRegistryOrder(const std::map<std::string, Names> &linesOfFiles) const {
    LogLines lines;
    for (const std::string &file : listedNames(home() + "registry"))
      for (const std::string &message : linesOfFiles.at(file))
        lines.push_back(pp(message));
    return lines;
  }

private:
  std::size_t seen_ = 0;
};

struct Aim {
  const char *patch;
  const char *product;
  bool hasDependents;
};

class AimTest : public DependentsTest, public ::testing::WithParamInterface<Aim> {};

TEST_P(AimTest, AgentAndFourthKindPatchesAndThoseOfTheTwoServersHaveDependents) {
  const Processor processor = withDependents({"kyn"}, GetParam().patch, GetParam().product);
  const LogLines notFound = pps({"Dependent product not found: kyn",
                                 std::string("Dependent product not found: ") + GetParam().product});
  EXPECT_EQ(buildLines(processor), GetParam().hasDependents
                                       ? joined({pps({BuildEntry}), notFound, pps({BuildDone})})
                                       : pps({BuildEntry, NoTarget}));
  EXPECT_EQ(stopLines(processor), GetParam().hasDependents
                                      ? joined({pps({StopEntry}), notFound, pps({StopDone})})
                                      : pps({StopEntry, NoTarget}));
}

INSTANTIATE_TEST_SUITE_P(
    Targets, AimTest,
    ::testing::Values(Aim{"kxe_lpp266_vemx_1.tar", "kxe", false}, Aim{"kxe_lpp266_vema_1.tar", "kxe", true},
                      Aim{"kzt_lpp266_vecm_1.tar", "kzt", true}, Aim{"kxe_lpp266_vecm_1.tar", "kxe", true},
                      Aim{"kox_lpp266_vems_1.tar", "kox", false}, Aim{"kxe_lpp266_veps_1.tar", "kxe", false},
                      Aim{"kdk_lpp266_vepd_1.tar", "kdk", false}, Aim{"kqa_lpp266_vems_1.tar", "kqa", true},
                      Aim{"kpt_lpp266_veps_1.tar", "kpt", true}, Aim{"kqa_lpp266_vepd_1.tar", "kpt", true},
                      Aim{"kqa_lpp266_vems_1.tar", "kox", false}, Aim{"kox_lpp266_vems_1.tar", "kqa", true}));

TEST_F(DependentsTest, PatchWithoutDependentsStopsNothingThatRuns) {
  installAgents({"ox"});
  setRunning({{"ox", "11"}});
  const Processor support = withDependents({"kox"}, "kox_lpp266_vems_fp0001.tar", "kox");
  stopLines(support);
  EXPECT_EQ(printed(support), NoneRuns);
  EXPECT_EQ(startLines(support), pps({StartEntry, StartDone}));
  EXPECT_EQ(calls(), Names{});
}

TEST_F(DependentsTest, ReportCollectsListedProductsInOrder) {
  installAgents({"ox", "yn", "xe"});
  setRunning({{"ox", "11"}, {"xe", "12", "host_one"}, {"xe", "13", "host_two"}});
  const Processor kxe = withDependents({"ox", "yn", "zz"});
  EXPECT_EQ(buildLines(kxe), pps({BuildEntry, "No running instances of kyn found",
                                  "Dependent product not found: kzz", BuildDone}));
  EXPECT_EQ(printed(kxe), Heading + "    kox\n    one instance of kxe\n    two instance of kxe\n\n");
  EXPECT_EQ(calls(), Names{}) << "a report stops nothing";
}

TEST_F(DependentsTest, PrintingIsTraced) {
  const Processor kxe = withDependents({});
  logLines();
  printed(kxe);
  EXPECT_EQ(ownLines(),
            pps({"PatchProcessor::printDependentsList() entry", BuildEntry,
                 "Dependent product not found: kxe", BuildDone, "PatchProcessor::printDependentsList = 1"}));
}

TEST_F(DependentsTest, ReportWithoutRunningInstancesSaysSo) {
  installAgents({"ox", "xe"});
  EXPECT_EQ(printed(withDependents({"ox"})), NoneRuns);
}

TEST_F(DependentsTest, ReportIsInTheOrderOfTheCodesNotOfTheList) {
  installAgents({"zz", "aa", "xe"});
  setRunning({{"zz", "11"}, {"aa", "12"}, {"xe", "13"}});
  EXPECT_EQ(printed(withDependents({"zz", "kaa"})), Heading + "    kaa\n    kxe\n    kzz\n\n")
      << "the dependents are listed as kaa, kzz";
}

// KEEP(report-own-code-twice)
TEST_F(DependentsTest, ReportLooksAtTheOwnProductTwiceAndStoppingOnce) {
  installAgents({"xe"});
  const Processor kxe = withDependents({"xe"});
  const std::string none = "No running instances of kxe found";
  EXPECT_EQ(buildLines(kxe), pps({BuildEntry, none, none, BuildDone}));
  EXPECT_EQ(stopLines(kxe), pps({StopEntry, none, StopDone}));
}

TEST_F(DependentsTest, UniversalAgentsMarkedInstancesAreLeftOut) {
  installAgents({"wn", "xe"});
  setRunning({{"wn", "11", "akwnsnetd_1"}, {"wn", "12", "other"}, {"wn", "13", "kwnstrap_"}});
  const Processor kxe = withDependents({"wn"});
  EXPECT_EQ(buildLines(kxe), pps({BuildEntry, "Found kwn instance of akwnsnetd_1, skipping.",
                                  "Found kwn instance of kwnstrap_, skipping.",
                                  "No running instances of kxe found", BuildDone}));
  EXPECT_EQ(printed(kxe), Heading + "    other instance of kwn\n\n");
  EXPECT_EQ(stopLines(kxe),
            pps({StopEntry, "Attempting to stop instance [akwnsnetd_1]",
                 "Found kwn instance of akwnsnetd_1, skipping.", "Attempting to stop instance [other]",
                 "Adding instance [other] to the list of stopped agents",
                 "Attempting to stop instance [kwnstrap_]", "Found kwn instance of kwnstrap_, skipping.",
                 "Stopped 1 instance(s) of kwn", "No running instances of kxe found", StopDone}));
  EXPECT_EQ(calls(), Names{"QuillAgent [-p] [other] [stop] [wn]"});
}

TEST_F(DependentsTest, MarkersMeanNothingForOtherProducts) {
  installAgents({"yn"});
  setRunning({{"yn", "11", "kwnsnetd_"}});
  stopLines(withDependents({"yn"}));
  EXPECT_EQ(calls(), Names{"QuillAgent [-o] [kwnsnetd_] [stop] [yn]"});
}

TEST_F(DependentsTest, ListedProductWhoseInstancesWereAllLeftOutStillStandsInTheMap) {
  installAgents({"wn"});
  setRunning({{"wn", "11", "kwnstrap_"}});
  const Processor kxe = withDependents({"wn"});
  EXPECT_EQ(printed(kxe), Heading + "\n");
  const Processor stopping = withDependents({"wn"});
  EXPECT_EQ(
      stopLines(stopping),
      pps({StopEntry, "Attempting to stop instance [kwnstrap_]", "Found kwn instance of kwnstrap_, skipping.",
           "No instances to stop for agent type: kwn", "Dependent product not found: kxe", StopDone}));
  EXPECT_EQ(
      startLines(stopping),
      pps({StartEntry, "There are no instances of agent type: kwn, that need to be started.", StartDone}));
}

/// A home with agents and other kinds of components, one instance of each of which runs.
class AllTest : public DependentsTest {
protected:
  void SetUp() override {
    DependentsTest::SetUp();
    installAgents({"yn", "wn", "xe"});
    install("qalpp266.ver", "06200000", "Server");
    install("ptlpp266.ver", "06200000", "Portal");
    install("ztlpp266.ver", "06200000", "Console");
    install("dklpp266.ver", "06200000", "Desktop");
    install("ynvms.ver", "06200000", "Support");
    setRunning({{"yn", "11"}, {"yn", "12", "two"}, {"wn", "13", "kwnsnetd_"}, {"qa", "14"}, {"pt", "15"}});
  }
  /// The lines for each version file, with these for the agent that has instances.
  LogLines linesOfAll(const std::string &nonStoppable, const Names &ofKyn) const {
    const auto left = [&](const std::string &name, const std::string &description) {
      return Names{"Processing instances for product: " + name + ": " + description,
                   nonStoppable + description};
    };
    Names kyn = {"Processing instances for product: kyn: kyn"};
    kyn.insert(kyn.end(), ofKyn.begin(), ofKyn.end());
    return inRegistryOrder(
        {{"ynlpp266.ver", kyn},
         {"wnlpp266.ver",
          {"Processing instances for product: kwn: kwn", "Found kwn instance of kwnsnetd_, skipping.",
           "No running instances for: kwn"}},
         {"xelpp266.ver", {"Processing instances for product: kxe: kxe", "No running instances for: kxe"}},
         {"qalpp266.ver", left("kqa", "Server")},
         {"ptlpp266.ver", left("kpt", "Portal")},
         {"ztlpp266.ver", left("kzt", "Console")},
         {"dklpp266.ver", left("kdk", "Desktop")},
         {"ynvms.ver", left("kyn", "Support")}});
  }
};

TEST_F(AllTest, ReportTakesEveryAgentInRegistryOrderAndNoOtherKind) {
  const Processor kxe = withDependents({"ALL", "zz"});
  EXPECT_EQ(buildLines(kxe),
            joined({pps({BuildEntry, "Processing ALL active instances"}),
                    linesOfAll("Non-stoppable component, will not be added to the list of agents to be "
                               "stopped: ",
                               {"Found active instance  for product: kyn.",
                                "Found active instance two for product: kyn."}),
                    pps({BuildDone})}));
  EXPECT_EQ(printed(kxe), Heading + "    kyn\n    two instance of kyn\n\n");
}

TEST_F(AllTest, StoppingTakesEveryAgentInRegistryOrderAndNoOtherKind) {
  const Processor kxe = withDependents({"all"});
  EXPECT_EQ(stopLines(kxe),
            joined({pps({StopEntry, "Stopping ALL active instances"}),
                    linesOfAll("Non-stoppable component, will not be added to the list of stopped agents: ",
                               {"Stopped active instance  for product: kyn, ",
                                "Stopped active instance two for product: kyn, "}),
                    pps({StopDone})}));
  EXPECT_EQ(calls(), (Names{"QuillAgent [stop] [yn]", "QuillAgent [-o] [two] [stop] [yn]"}));
  EXPECT_EQ(startLines(kxe), pps({StartEntry, "Attempting to start instance []",
                                  "Attempting to start instance [two]", StartDone}));
  EXPECT_EQ(calls(), (Names{"QuillAgent [start] [yn]", "QuillAgent [-o] [two] [start] [yn]"}));
}

// KEEP(stop-result-line)
TEST_F(AllTest, StopThatFailsEndsWithItsResultLine) {
  onCall("QuillAgent [-o] [two] [stop] [yn]", "exit 1");
  const Processor kxe = withDependents({"all"});
  PatchError err;
  EXPECT_FALSE(kxe->stopDependents(&err));
  EXPECT_EQ(err.code, 15);
  const LogLines lines = ownLines();
  ASSERT_GE(lines.size(), 3U);
  EXPECT_EQ(LogLines(lines.end() - 3, lines.end()),
            pps({"Stopped active instance  for product: kyn, ", "stop failed, exiting method prematurely",
                 StopFailed}));
  EXPECT_EQ(startLines(kxe), pps({StartEntry, StartDone})) << "what was stopped stays stopped";
}

TEST_F(AllTest, AllCountsAsTheFirstEntryOnly) {
  const Processor kxe = withDependents({"KZZ", "all"});
  EXPECT_EQ(buildLines(kxe),
            pps({BuildEntry, "Dependent product not found: kzz", "Dependent product not found: all",
                 "No running instances of kxe found", BuildDone}));
}

TEST_F(DependentsTest, LaterComponentOfTheSameNameReplacesTheEntryOfAll) {
  install("ynlpp266.ver", "06200000", "kyn");
  install("ynli6243.ver", "06200000", "kyn");
  setRunning({{"yn", "11", "one"}});
  EXPECT_EQ(printed(withDependents({"all"})), Heading + "    one instance of kyn\n\n");
}

TEST_F(DependentsTest, LaterComponentOfTheSameNameReplacesWhatAllHasStopped) {
  install("ynlpp266.ver", "06200000", "kyn");
  install("ynli6243.ver", "06200000", "kyn");
  setRunning({{"yn", "11", "one"}});
  const Processor kxe = withDependents({"all"});
  stopLines(kxe);
  const std::string call = "QuillAgent [-o] [one] [stop] [yn]";
  EXPECT_EQ(calls(), (Names{call, call})) << "each has its own list of active instances";
  startLines(kxe);
  EXPECT_EQ(calls(), Names{"QuillAgent [-o] [one] [start] [yn]"});
}

TEST_F(DependentsTest, StoppedInstancesAreStartedInTheOrderOfTheCodes) {
  installAgents({"yn", "hv", "aa"});
  setRunning({{"yn", "11", "b"}, {"yn", "12", "a"}, {"hv", "13"}, {"aa", "14"}});
  const Processor kaa = withDependents({"yn", "hv"}, "kaa_lpp266_vema_1.tar", "kaa");
  EXPECT_EQ(
      stopLines(kaa),
      pps({StopEntry, "Attempting to stop instance []", "Adding instance [] to the list of stopped agents",
           "Stopped 1 instance(s) of khv", "Attempting to stop instance [b]",
           "Adding instance [b] to the list of stopped agents", "Attempting to stop instance [a]",
           "Adding instance [a] to the list of stopped agents", "Stopped 2 instance(s) of kyn",
           "Attempting to stop instance []", "Adding instance [] to the list of stopped agents",
           "Stopped 1 instance(s) of kaa", StopDone}));
  EXPECT_EQ(calls(), (Names{"QuillAgent [stop] [hv]", "QuillAgent [-o] [b] [stop] [yn]",
                            "QuillAgent [-o] [a] [stop] [yn]", "QuillAgent [stop] [aa]"}));
  EXPECT_EQ(startLines(kaa),
            pps({StartEntry, "Attempting to start instance []", "Attempting to start instance []",
                 "Attempting to start instance [b]", "Attempting to start instance [a]", StartDone}));
  EXPECT_EQ(calls(), (Names{"QuillAgent [start] [aa]", "QuillAgent [start] [hv]",
                            "QuillAgent [-o] [b] [start] [yn]", "QuillAgent [-o] [a] [start] [yn]"}));
}

TEST_F(DependentsTest, ServerPatchStopsItsDependentsAndTheServerItself) {
  installAgents({"ox"});
  install("qalpp266.ver", "06200000", "Server");
  setRunning({{"qa", "11", "hub"}, {"ox", "12", "named"}});
  const Processor kqa = withDependents({"ox"}, "kqa_lpp266_vems_1.tar", "kqa");
  EXPECT_EQ(printed(withDependents({"ox"}, "kqa_lpp266_vems_1.tar", "kqa")),
            Heading + "    named instance of kox\n    hub instance of Server\n\n");
  stopLines(kqa);
  EXPECT_EQ(calls(), (Names{"QuillAgent [-o] [named] [stop] [ox]", "QuillServer [stop] [hub]"}));
  EXPECT_EQ(startLines(kqa), pps({StartEntry, "Attempting to start instance [hub]", StartDone}));
  EXPECT_EQ(calls(), Names{"QuillServer [start] [hub]"}) << "the OS agent is left to its own rule";
}

TEST_F(DependentsTest, ServerThatCannotBeStoppedIsItsOwnCode) {
  install("qalpp266.ver", "06200000", "Server");
  setRunning({{"qa", "11"}});
  onCall("QuillServer [stop] []", "exit 1");
  PatchError err;
  EXPECT_FALSE(withDependents({}, "kqa_lpp266_vems_1.tar", "kqa")->stopDependents(&err));
  EXPECT_EQ(err.code, 18);
}

TEST_F(DependentsTest, ListedStopThatFailsEndsAtOnceWithoutAResultLine) {
  installAgents({"hv", "yn", "xe"});
  setRunning({{"hv", "11"}, {"yn", "12", "a"}, {"yn", "13", "b"}, {"yn", "14", "c"}, {"xe", "15"}});
  onCall("QuillAgent [-o] [b] [stop] [yn]", "exit 1");
  const Processor kxe = withDependents({"hv", "yn"});
  PatchError err{99, "earlier"};
  EXPECT_FALSE(kxe->stopDependents(&err));
  EXPECT_EQ(recordOf(err), Record(15, "Unable to stop instance b of agent for product kyn.  The agent for "
                                      "product kyn may be running under a different userid and must be "
                                      "manually stopped before applying the patch."));
  EXPECT_EQ(ownLines(),
            pps({StopEntry, "Attempting to stop instance []",
                 "Adding instance [] to the list of stopped agents", "Stopped 1 instance(s) of khv",
                 "Attempting to stop instance [a]", "Adding instance [a] to the list of stopped agents",
                 "Attempting to stop instance [b]", "stop failed, exiting method prematurely"}));
  EXPECT_EQ(calls(), (Names{"QuillAgent [stop] [hv]", "QuillAgent [-o] [a] [stop] [yn]",
                            "QuillAgent [-o] [b] [stop] [yn]"}));
  EXPECT_EQ(startLines(kxe), pps({StartEntry, "Attempting to start instance []", StartDone}));
  EXPECT_EQ(calls(), Names{"QuillAgent [start] [hv]"}) << "the map holds the products stopped in full";
}

TEST_F(DependentsTest, FailuresWithoutARecordEndTheSameWay) {
  installAgents({"yn", "xe"});
  setRunning({{"yn", "11"}});
  onCall("QuillAgent [start] [yn]", "exit 1");
  const Processor kxe = withDependents({"yn"});
  EXPECT_TRUE(kxe->stopDependents(nullptr));
  logLines();
  EXPECT_FALSE(kxe->startDependents(nullptr));
  EXPECT_EQ(ownLines(), pps({StartEntry, "Attempting to start instance []",
                             "start failed, exiting method prematurely", StartFailed}));
  delete ORVComponentRegistry::getInstance(); // the next registry sees the instance running again
  onCall("QuillAgent [stop] [yn]", "exit 1");
  const Processor again = withDependents({"yn"});
  EXPECT_FALSE(again->stopDependents(nullptr));
  EXPECT_EQ(ownLines(),
            pps({StopEntry, "Attempting to stop instance []", "stop failed, exiting method prematurely"}));
}

TEST_F(DependentsTest, StartThatFailsLeavesTheLaterInstancesStopped) {
  installAgents({"yn", "xe"});
  setRunning({{"yn", "11", "a"}, {"yn", "12", "b"}, {"xe", "13", "host_x"}});
  onCall("QuillAgent [-o] [x] [start] [xe]", "exit 1");
  const Processor kxe = withDependents({"yn"});
  stopLines(kxe);
  calls();
  PatchError err{99, "earlier"};
  EXPECT_FALSE(kxe->startDependents(&err));
  EXPECT_EQ(recordOf(err), Record(13, "Unable to start instance x of agent for product kxe."));
  EXPECT_EQ(ownLines(), pps({StartEntry, "Attempting to start instance [x]",
                             "start failed, exiting method prematurely", StartFailed}));
  EXPECT_EQ(calls(), Names{"QuillAgent [-o] [x] [start] [xe]"}) << "kyn comes after kxe";
}

TEST_F(DependentsTest, OsAgentIsStoppedButNotStartedHere) {
  installAgents({"ox", "xe"});
  setRunning({{"ox", "11"}, {"xe", "12", "host_x"}});
  const Processor kxe = withDependents({"ox"});
  stopLines(kxe);
  EXPECT_EQ(calls(), (Names{"QuillAgent [stop] [ox]", "QuillAgent [-o] [x] [stop] [xe]"}));
  EXPECT_EQ(startLines(kxe), pps({StartEntry, "Attempting to start instance [x]", StartDone}));
  EXPECT_EQ(calls(), Names{"QuillAgent [-o] [x] [start] [xe]"});
}

TEST_F(DependentsTest, ProductThatHasLeftTheRegistryIsPassedOver) {
  installAgents({"yn", "xe"});
  setRunning({{"yn", "11"}, {"xe", "12", "host_x"}});
  const Processor kxe = withDependents({"yn"});
  stopLines(kxe);
  std::filesystem::remove(home() + "registry/xelpp266.ver");
  delete ORVComponentRegistry::getInstance();
  EXPECT_EQ(startLines(kxe), pps({StartEntry, "Could not find product in registry: kxe",
                                  "Attempting to start instance []", StartDone}));
}

TEST_F(DependentsTest, ProductThatHasLeftTheRegistryIsNotPrinted) {
  installAgents({"yn", "xe"});
  setRunning({{"yn", "11"}, {"xe", "12", "host_x"}});
  const Processor kxe = withDependents({"yn"});
  stopLines(kxe);
  std::filesystem::remove(home() + "registry/xelpp266.ver");
  delete ORVComponentRegistry::getInstance();
  const Printed printed = printedBy([&] { return kxe->printDependentsList(nullptr); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, Heading + "    kyn\n\n");
}

} // namespace
