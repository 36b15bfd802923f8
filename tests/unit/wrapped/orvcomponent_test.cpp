// Components when no child can be made: nothing is known to run, and no control script is reached.
#include "orvcomponent.h"

#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "fakehome.h"
#include "systemcalls.h"

namespace {

using Names = std::vector<std::string>;

LogLines own(const std::vector<std::string> &messages) {
  return traces("orvcomponent", messages);
}

class ComponentFailureTest : public FakeHome {
protected:
  void SetUp() override {
    FakeHome::SetUp();
    restoreSystemCalls();
  }
  void TearDown() override {
    restoreSystemCalls();
    FakeHome::TearDown();
  }
};

TEST_F(ComponentFailureTest, ProcessIsNotRunningWhenPsCannotBeRun) {
  setProcess("4711");
  failCall("fork", EAGAIN);
  std::string owner;
  EXPECT_FALSE(isRunning("4711", owner));
  EXPECT_EQ(logLinesOf("orvcomponent"), own({"unable to running command"}));
}

TEST_F(ComponentFailureTest, ProcessRunsWithoutAnOwnerWhenThatCannotBeAskedFor) {
  setProcess("4711", "quill");
  failCall("fork", EAGAIN).after(1);
  std::string owner;
  EXPECT_TRUE(isRunning("4711", owner));
  EXPECT_EQ(owner, "");
  EXPECT_EQ(logLinesOf("orvcomponent"), own({"unable to determine owner of process id: 4711"}));
}

// KEEP(host-prefix)
TEST_F(ComponentFailureTest, HostThatRepeatsTheLocalNamesLetterIsTakenToo) {
  answerNodeName("aa");
  setRunning({{"ox", "11"}});
  const ORVComponent kox(home(), "ox", "Sample", "06200000", "", {}, ORVComponent::TYPE_AGENT,
                         "FIELDSEP=|\naaa|ox|11|abc|x\nba|ox|11|other|x\n");
  EXPECT_EQ(kox.getActiveInstances(), Names{"abc"});
}

TEST_F(ComponentFailureTest, LocalHostNameIsComparedInSmallLettersToo) {
  answerNodeName("MyHost.example");
  setRunning({{"ox", "11"}});
  const ORVComponent kox(home(), "ox", "Sample", "06200000", "", {}, ORVComponent::TYPE_AGENT,
                         "FIELDSEP=|\nmyhost|ox|11|a|x\nMYHOST.example|ox|11|b|x\nMyHost2|ox|11|c|x\n");
  EXPECT_EQ(kox.getActiveInstances(), (Names{"a", "b", "c"}));
}

// KEEP(host-prefix)
TEST_F(ComponentFailureTest, HostWithoutANameAcceptsTheRowsOfEveryHost) {
  answerNodeName(".local");
  setRunning({{"ox", "11"}});
  const ORVComponent kox(home(), "ox", "Sample", "06200000", "", {}, ORVComponent::TYPE_AGENT,
                         "FIELDSEP=|\nany|ox|11|a|x\n");
  EXPECT_EQ(kox.getActiveInstances(), Names{"a"});
}

/// Who may start the instance of "another" decides the name of the user, whatever the number.
struct Starter {
  const char *name;
  uid_t user;
  const char *userName; ///< empty: the user has no entry
  bool switches;
};

class StarterTest : public ComponentFailureTest, public ::testing::WithParamInterface<Starter> {};

TEST_P(StarterTest, SwitchesToAnotherOwnerOnlyAsTheUserCalledRoot) {
  const std::vector<RunRow> rows = {{"ox", "11", "abc", "another"}};
  setRunning(rows);
  ORVComponent kox(home(), "ox", "Sample", "06200000", "", {}, ORVComponent::TYPE_AGENT, runInfoText(rows));
  answerUser(GetParam().user);
  answerUserName(GetParam().userName);
  if (*GetParam().userName == '\0')
    failCall("getpwuid", 0);
  failCall("execvp", ENOENT).on("/bin/su");
  const int before = callsOf("fork");
  PatchError err;
  EXPECT_FALSE(kox.startInstance("abc", &err));
  const Record refused = {20, "Unable to su to user: another"};
  const Record failed = {13, "Unable to start instance abc of agent for product Sample."};
  EXPECT_EQ(recordOf(err), GetParam().switches ? failed : refused);
  EXPECT_EQ(callsOf("fork") - before, GetParam().switches ? 1 : 0);
  EXPECT_EQ(journal(), Names{});
}

INSTANTIATE_TEST_SUITE_P(Users, StarterTest,
                         ::testing::Values(Starter{"Root", 0, "root", true},
                                           Starter{"RootOfNoNumber", 77, "root", true},
                                           Starter{"SuperuserOfAnotherName", 0, "toor", false},
                                           Starter{"Ordinary", 77, "quill", false},
                                           Starter{"WithoutAName", 77, "", false},
                                           Starter{"SuperuserWithoutAName", 0, "", false}),
                         [](const auto &starter) { return starter.param.name; });

std::string stopText(const std::string &subject, const std::string &kind) {
  return "Unable to stop " + subject + " for product Sample.  The " + kind +
         " for product Sample may be running under a different userid and must be manually stopped before "
         "applying the patch.";
}

/// A start or a stop of an instance that runs, and what is reported when it cannot be tried.
struct Unreachable {
  const char *name;
  bool server;
  bool start;
  const char *instance;
  Record record;
};

class UnreachableTest : public ComponentFailureTest, public ::testing::WithParamInterface<Unreachable> {
public:
  static bool control(ORVComponent &component, PatchError *err) {
    return GetParam().start ? component.startInstance(GetParam().instance, err)
                            : component.stopInstance(GetParam().instance, err);
  }
  std::unique_ptr<ORVComponent> component() const {
    const std::string letters = GetParam().server ? "qa" : "ox";
    const std::vector<RunRow> rows = {{letters, "11"}, {letters, "12", "abc"}};
    setRunning(rows);
    if (GetParam().server)
      return std::make_unique<UNIXMonitoringServer>(home(), letters, "Sample", "06200000", "", Names{},
                                                    runInfoText(rows));
    return std::make_unique<ORVComponent>(home(), letters, "Sample", "06200000", "", Names{},
                                          ORVComponent::TYPE_AGENT, runInfoText(rows));
  }
};

TEST_P(UnreachableTest, IsReportedWithoutAReturnCode) {
  const auto made = component();
  logLines();
  failCall("fork", EAGAIN);
  PatchError err{99, "earlier"};
  EXPECT_FALSE(control(*made, &err));
  EXPECT_EQ(recordOf(err), GetParam().record);
  const std::string operation =
      std::string(GetParam().start ? "start" : "stop") + "Instance(" + GetParam().instance + ") ";
  EXPECT_EQ(logLinesOf("orvcomponent"), joined({own({operation + "entry"}),
                                                {error("orvcomponent", GetParam().record.second)},
                                                own({operation + "exit"})}));
  EXPECT_FALSE(control(*made, nullptr));
  EXPECT_EQ(logLinesOf("orvcomponent"), own({operation + "entry", operation + "exit"}));
  EXPECT_EQ(made->getActiveInstances(), (Names{"", "abc"}));
}

INSTANTIATE_TEST_SUITE_P(
    Controls, UnreachableTest,
    ::testing::Values(
        Unreachable{"AgentStart", false, true, "", {12, "Unable to start agent for product Sample."}},
        Unreachable{"AgentStartNamed",
                    false,
                    true,
                    "abc",
                    {13, "Unable to start instance abc of agent for product Sample."}},
        Unreachable{"AgentStop", false, false, "", {14, stopText("agent", "agent")}},
        Unreachable{"AgentStopNamed", false, false, "abc", {15, stopText("instance abc of agent", "agent")}},
        Unreachable{"ServerStart", true, true, "", {16, "Unable to start server for product Sample."}},
        Unreachable{"ServerStartNamed",
                    true,
                    true,
                    "abc",
                    {19, "Unable to start instance abc of server for product Sample."}},
        Unreachable{"ServerStop", true, false, "", {18, stopText("server", "server")}},
        Unreachable{
            "ServerStopNamed", true, false, "abc", {19, stopText("instance abc of server", "server")}}),
    [](const auto &test) { return test.param.name; });

TEST_F(ComponentFailureTest, FailedStopCountsAsDoneWhenTheProcessCannotBeLookedFor) {
  const std::vector<RunRow> rows = {{"ox", "11"}};
  setRunning(rows);
  ORVComponent kox(home(), "ox", "Sample", "06200000", "", {}, ORVComponent::TYPE_AGENT, runInfoText(rows));
  onCall("QuillAgent [stop] [ox]", "exit 1");
  logLines();
  failCall("fork", EAGAIN).after(1);
  EXPECT_TRUE(kox.stopInstance("", nullptr));
  EXPECT_EQ(kox.getActiveInstances(), Names{});
  EXPECT_EQ(
      logLinesOf("orvcomponent"),
      own({"stopInstance() entry", "return code: 1", "stdout: ", "stderr: ", "unable to running command",
           "QuillAgent stop failed, but the Process ID is no longer active. Assuming agent is now not "
           "running",
           "stopInstance() exit"}));
}

} // namespace
