// The OS agent's own rule: its result file, and the start of its default instance.
#include "patchprocessor/patchprocessor.h"

#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "orvcomponentregistry.h"
#include "patchhome.h"

namespace {

using Names = std::vector<std::string>;

const std::string Entry = "PatchProcessor::startOSAgentIfNeeded() entry";
const std::string Succeeded = "PatchProcessor::startOSAgentIfNeeded() = 1";
const std::string Failed = "PatchProcessor::startOSAgentIfNeeded() = 0";

class OsAgentTest : public PatchHome {
public:
  std::string resultFile() const { return home() + "vmaorv6/agentdepot/rc.txt"; }
  /// A processor that has stopped these instances of the OS agent; the log is read up to here.
  Processor stopped(const std::vector<RunRow> &rows) {
    install("oxlpp266.ver", "06200000", "OS Agent");
    setRunning(rows);
    Processor kxe =
        loaded("kxe_lpp266_vema_1.tar", patchIni("kxe", "06200001", bareSection("Dependents", {"ox"})));
    EXPECT_TRUE(kxe->stopDependents(nullptr));
    std::filesystem::remove(home() + "journal");
    logLines();
    return kxe;
  }
};

TEST_F(OsAgentTest, WithoutAStoppedInstanceNothingIsWrittenOrStarted) {
  makeDirectory("vmaorv6/agentdepot");
  const Processor kxe = stopped({});
  PatchError err;
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(25, &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), pps({Entry, Succeeded}));
  EXPECT_FALSE(isThere(resultFile()));
  EXPECT_EQ(journal(), Names{});
}

TEST_F(OsAgentTest, StoppedAgentGetsTheResultAndIsStarted) {
  makeDirectory("vmaorv6/agentdepot");
  const Processor kxe = stopped({{"ox", "11"}});
  PatchError err;
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(0, &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), pps({Entry, "Writing out: " + resultFile(), Succeeded}));
  EXPECT_EQ(read(resultFile()), "0");
  EXPECT_EQ(journal(), Names{"QuillAgent [start] [ox]"});
}

TEST_F(OsAgentTest, ResultThatCannotBeWrittenDoesNotStopTheAgent) {
  makeDirectory("vmaorv6/agentdepot");
  std::filesystem::create_symlink("/dev/full", resultFile());
  const Processor kxe = stopped({{"ox", "11"}});
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(0, nullptr));
  EXPECT_EQ(ownLines(),
            pps({Entry, "Writing out: " + resultFile(),
                 "Unable to write file: " + resultFile() + ". No space left on device", Succeeded}));
  EXPECT_EQ(journal(), Names{"QuillAgent [start] [ox]"});
}

struct ResultCode {
  int code;
  const char *text;
};

class ResultFileTest : public OsAgentTest, public ::testing::WithParamInterface<ResultCode> {};

TEST_P(ResultFileTest, HoldsTheCodeAloneWhateverItHeldBefore) {
  write("vmaorv6/agentdepot/rc.txt", "a longer text of an earlier run\n");
  EXPECT_TRUE(stopped({{"ox", "11"}})->startOSAgentIfNeeded(GetParam().code, nullptr));
  EXPECT_EQ(read(resultFile()), GetParam().text);
}

INSTANTIATE_TEST_SUITE_P(Codes, ResultFileTest,
                         ::testing::Values(ResultCode{0, "0"}, ResultCode{25, "25"}, ResultCode{-1, "-1"},
                                           ResultCode{2147483647, "2147483647"}));

TEST_F(OsAgentTest, MissingDepotIsTracedAndTheAgentIsStarted) {
  const Processor kxe = stopped({{"ox", "11"}});
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(0, nullptr));
  EXPECT_EQ(ownLines(),
            pps({Entry, "Unable to write file: " + resultFile() + ". No such file or directory", Succeeded}));
  EXPECT_EQ(journal(), Names{"QuillAgent [start] [ox]"});
  EXPECT_FALSE(isThere(home() + "vmaorv6"));
}

// KEEP(osagent-default-instance)
TEST_F(OsAgentTest, DefaultInstanceIsStartedWhicheverWereStopped) {
  const Processor kxe = stopped({{"ox", "11", "named"}, {"ox", "12", "other"}});
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(0, nullptr));
  EXPECT_EQ(journal(), Names{"QuillAgent [start] [ox]"});
}

TEST_F(OsAgentTest, AgentThatHasLeftTheRegistryIsNoError) {
  makeDirectory("vmaorv6/agentdepot");
  const Processor kxe = stopped({{"ox", "11"}});
  std::filesystem::remove(home() + "registry/oxlpp266.ver");
  delete ORVComponentRegistry::getInstance();
  logLines();
  PatchError err;
  EXPECT_TRUE(kxe->startOSAgentIfNeeded(7, &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(),
            pps({Entry, "Writing out: " + resultFile(), "Could not get OSAgent from Registry", Succeeded}));
  EXPECT_EQ(read(resultFile()), "7");
}

TEST_F(OsAgentTest, FailedStartIsThatOfTheComponent) {
  makeDirectory("vmaorv6/agentdepot");
  onCall("QuillAgent [start] [ox]", "exit 1");
  const Processor kxe = stopped({{"ox", "11", "named"}});
  const LogLines lines = expectOwnFailure({12, "Unable to start agent for product OS Agent."},
                                          [&](PatchError *err) { return kxe->startOSAgentIfNeeded(0, err); });
  EXPECT_EQ(lines, pps({Entry, "Writing out: " + resultFile(), Failed}));
}

TEST_F(OsAgentTest, OrdinaryUserCannotStartTheAgentOfAnother) {
  const Processor kxe = stopped({{"ox", "11", "None", "another"}});
  const RealUserScope ordinaryUser;
  PatchError err;
  EXPECT_FALSE(kxe->startOSAgentIfNeeded(0, &err));
  EXPECT_EQ(recordOf(err), Record(20, "Unable to su to user: another"));
  EXPECT_EQ(journal(), Names{});
}

} // namespace
