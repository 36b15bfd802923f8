// The monitoring server: a component with a control script and error codes of its own.
#include "orvcomponent.h"

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "fakehome.h"

namespace {

using Names = std::vector<std::string>;

const std::string StopAdvice = "for product Server.  The server for product Server may be running under a "
                               "different userid and must be manually stopped before applying the patch.";

class ServerTest : public FakeHome {
public:
  std::unique_ptr<UNIXMonitoringServer> server(const std::vector<RunRow> &rows = {}) {
    setRunning(rows);
    auto made = std::make_unique<UNIXMonitoringServer>(home(), "qa", "Server", "06200000", "lpp266",
                                                       Names{"oxlpp266"}, runInfoText(rows));
    logLines();
    return made;
  }
  std::string script() const { return home() + "bin/QuillServer"; }

  /// The lines of a control operation whose script ended with `rc` and printed what SpeakingScript prints.
  LogLines controlLines(const std::string &verb, const std::string &instance, int rc,
                        const LogLines &verdict = {}) const {
    const std::string operation = verb + "Instance(" + instance + ") ";
    return joined(
        {traces("orvcomponent", {operation + "entry"}), commandLines({script(), verb, instance}),
         traces("orvcomponent", {"return code: " + std::to_string(rc), "stdout: told\n", "stderr: why\n"}),
         verdict, traces("orvcomponent", {operation + "exit"})});
  }
};

std::string speaking(int status) {
  return "echo told; echo why >&2; exit " + std::to_string(status);
}

TEST_F(ServerTest, IsAMonitoringServerWhoseInstancesAreReadFromTheRunInformation) {
  const auto made = server({{"qa", "11"}, {"qa", "12", "hub"}, {"ox", "13"}});
  EXPECT_EQ(made->getName(), "kqa");
  EXPECT_EQ(made->getType(), ORVComponent::TYPE_VEMS);
  EXPECT_EQ(made->getDescriptiveName(), "Server");
  EXPECT_EQ(made->getArch(), "lpp266");
  EXPECT_EQ(made->getVersion()->getVersionString(), "06200000");
  EXPECT_EQ(made->getPrereqs(), Names{"oxlpp266"});
  EXPECT_EQ(made->getActiveInstances(), (Names{"", "hub"}));
}

TEST_F(ServerTest, ConstructionIsThatOfAComponent) {
  const UNIXMonitoringServer made(home(), "qa", "Server", "06200000", "", {}, "");
  EXPECT_EQ(logLinesOf("orvcomponent"),
            traces("orvcomponent",
                   {"ORVComponent::ORVComponent(qa) entry", "ORVComponent::intialize entry", "no cinfo data",
                    "ORVComponent::initialize exit", "ORVComponent::ORVComponent() exit"}));
}

TEST_F(ServerTest, StartOfTheDefaultInstancePassesAnEmptyArgument) {
  onCall("QuillServer [start] []", speaking(0));
  const auto made = server();
  PatchError err;
  EXPECT_TRUE(made->startInstance("", &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(), controlLines("start", "", 0));
  EXPECT_EQ(journal(), Names{"QuillServer [start] []"});
  EXPECT_EQ(made->getActiveInstances(), Names{""});
}

TEST_F(ServerTest, StartOfANamedInstancePassesItThirdWithoutAProductCode) {
  onCall("QuillServer [start] [hub]", speaking(0));
  const auto made = server({{"qa", "11"}});
  EXPECT_TRUE(made->startInstance("hub", nullptr));
  EXPECT_EQ(logLines(), controlLines("start", "hub", 0));
  EXPECT_TRUE(made->startInstance("hub", nullptr));
  EXPECT_EQ(made->getActiveInstances(), (Names{"", "hub"})) << "listed once";
}

TEST_F(ServerTest, ServerOfAnotherUserIsStartedDirectlyAsTheCurrentUser) {
  const auto made = server({{"qa", "11", "None", "another"}});
  EXPECT_TRUE(made->startInstance("", nullptr));
  EXPECT_EQ(linesOf("process.cpp", logLines()), commandLines({script(), "start", ""}));
}

TEST_F(ServerTest, StopRemovesTheFirstOccurrence) {
  onCall("QuillServer [stop] [hub]", speaking(0));
  const auto made = server({{"qa", "11", "hub"}, {"qa", "12"}, {"qa", "13", "hub"}});
  PatchError err;
  EXPECT_TRUE(made->stopInstance("hub", &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(), controlLines("stop", "hub", 0));
  EXPECT_EQ(made->getActiveInstances(), (Names{"", "hub"}));
  EXPECT_TRUE(made->stopInstance("", nullptr));
  EXPECT_EQ(journal(), (Names{"QuillServer [stop] [hub]", "QuillServer [stop] []"}));
  EXPECT_EQ(made->getActiveInstances(), Names{"hub"});
}

struct ServerFailure {
  const char *name;
  const char *verb;
  const char *instance;
  int code;
  std::string message;
};

class ServerFailureTest : public ServerTest, public ::testing::WithParamInterface<ServerFailure> {
public:
  /// Runs the operation on a server of which the instance runs, whatever its script makes of it.
  bool control(PatchError *err) {
    const ServerFailure &failure = GetParam();
    const std::string row = *failure.instance == '\0' ? "None" : failure.instance;
    onCall(std::string("QuillServer [") + failure.verb + "] [" + failure.instance + "]", speaking(5));
    server_ = server({{"qa", "11", row}});
    endProcess("11"); // a process that has gone changes nothing for a server
    return failure.verb == std::string("start") ? server_->startInstance(failure.instance, err)
                                                : server_->stopInstance(failure.instance, err);
  }

protected:
  std::unique_ptr<UNIXMonitoringServer> server_;
};

// KEEP(server-stop-unchecked)
TEST_P(ServerFailureTest, CarriesItsOwnCodeAndText) {
  const ServerFailure &failure = GetParam();
  PatchError err{99, "earlier"};
  EXPECT_FALSE(control(&err));
  EXPECT_EQ(recordOf(err), Record(failure.code, failure.message));
  EXPECT_EQ(logLines(),
            controlLines(failure.verb, failure.instance, 5, {error("orvcomponent", failure.message)}));
  EXPECT_EQ(server_->getActiveInstances(), Names{failure.instance});
}

TEST_P(ServerFailureTest, WithoutARecordLeavesNoErrorLine) {
  EXPECT_FALSE(control(nullptr));
  EXPECT_EQ(logLines(), controlLines(GetParam().verb, GetParam().instance, 5));
}

// KEEP(server-instance-code)
INSTANTIATE_TEST_SUITE_P(
    Codes, ServerFailureTest,
    ::testing::Values(
        ServerFailure{"StartDefault", "start", "", 16, "Unable to start server for product Server."},
        ServerFailure{"StartNamed", "start", "hub", 19,
                      "Unable to start instance hub of server for product Server."},
        ServerFailure{"StartPrimary", "start", "Primary", 19,
                      "Unable to start instance Primary of server for product Server."},
        ServerFailure{"StopDefault", "stop", "", 18, "Unable to stop server " + StopAdvice},
        ServerFailure{"StopNamed", "stop", "hub", 19, "Unable to stop instance hub of server " + StopAdvice},
        ServerFailure{"StopPrimary", "stop", "Primary", 19,
                      "Unable to stop instance Primary of server " + StopAdvice}),
    [](const auto &test) { return test.param.name; });

TEST_F(ServerTest, MissingScriptIsAFailure) {
  const auto made = server({{"qa", "11"}});
  std::filesystem::remove(script());
  PatchError err;
  EXPECT_FALSE(made->stopInstance("", &err));
  EXPECT_EQ(err.code, 18);
  EXPECT_FALSE(made->startInstance("", &err));
  EXPECT_EQ(err.code, 16);
  EXPECT_EQ(made->getActiveInstances(), Names{""});
}

} // namespace
