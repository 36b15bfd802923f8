// Starting and stopping instances: what is run, as whom, and what is reported when it fails.
#include "orvcomponent.h"

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "fakehome.h"
#include "utilities.h"

namespace {

using Names = std::vector<std::string>;

LogLines own(const std::vector<std::string> &messages) {
  return traces("orvcomponent", messages);
}
LogLines ownError(const std::string &message) {
  return {error("orvcomponent", message)};
}

/// What a control command that ended with `rc` and printed nothing leaves in the log.
LogLines returned(int rc, const std::string &out = "", const std::string &err = "") {
  return own({"return code: " + std::to_string(rc), "stdout: " + out, "stderr: " + err});
}

std::string mayRunAsAnother(const std::string &what, const std::string &kind) {
  return "Unable to stop " + what + kind + " for product Sample.  The " + kind +
         " for product Sample may be running under a different userid and must be manually stopped before "
         "applying the patch.";
}

class ControlTest : public FakeHome {
public:
  /// The component of a product whose instances run as these rows say; the log is read up to here.
  std::unique_ptr<ORVComponent> running(const std::string &letters, const std::vector<RunRow> &rows) {
    setRunning(rows);
    auto made = std::make_unique<ORVComponent>(home(), letters, "Sample", "06200000", "lpp266", Names{"none"},
                                               ORVComponent::TYPE_AGENT, runInfoText(rows));
    logLines();
    return made;
  }
  std::string agentScript() const { return home() + "bin/QuillAgent"; }
  std::string serverScript() const { return home() + "bin/QuillServer"; }
  void removeScripts() const {
    std::filesystem::remove(agentScript());
    std::filesystem::remove(serverScript());
  }
  /// The command lines that a check of this process leaves in the log when it runs.
  static LogLines processCheck(const std::string &pid) {
    return joined({commandLines({"ps", "-p", pid}),
                   commandLines({"/bin/sh", "-c", "ps -ef | grep -v grep | grep " + pid})});
  }
};

class StartTest : public ControlTest {
public:
  /// A stopped component, and the failure of a start of `instance` whose script ends with status 3.
  LogLines expectStartFailure(const std::string &instance, const std::string &call, const Record &expected) {
    onCall(call, "echo told; echo why >&2; exit 3");
    const auto component = running("ox", {});
    PatchError err{99, "earlier"};
    EXPECT_FALSE(component->startInstance(instance, &err));
    EXPECT_EQ(recordOf(err), expected);
    EXPECT_EQ(component->getActiveInstances(), Names{});
    return logLines();
  }
};

// KEEP(start-double-blank)
TEST_F(StartTest, DefaultInstanceKeepsTheDoubleBlankOfItsCommandLine) {
  const auto kox = running("ox", {});
  PatchError err;
  EXPECT_TRUE(kox->startInstance("", &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(), joined({own({"startInstance() entry"}),
                                commandLines({"/bin/sh", "-c", agentScript() + "  start ox"}), returned(0),
                                own({"startInstance() exit"})}));
  EXPECT_EQ(journal(), Names{"QuillAgent [start] [ox]"});
  EXPECT_EQ(kox->getActiveInstances(), Names{""});
}

TEST_F(StartTest, NamedInstanceIsPassedWithO) {
  onCall("QuillAgent [-o] [abc] [start] [ox]", "echo told; echo why >&2");
  const auto kox = running("ox", {});
  EXPECT_TRUE(kox->startInstance("abc", nullptr));
  EXPECT_EQ(logLines(), joined({own({"startInstance(abc) entry"}),
                                commandLines({"/bin/sh", "-c", agentScript() + " -o abc start ox"}),
                                returned(0, "told\n", "why\n"), own({"startInstance(abc) exit"})}));
  EXPECT_EQ(journal(), Names{"QuillAgent [-o] [abc] [start] [ox]"});
  EXPECT_EQ(kox->getActiveInstances(), Names{"abc"});
}

TEST_F(StartTest, InstanceOfTheUniversalAgentIsPassedWithP) {
  const auto kwn = running("wn", {});
  EXPECT_TRUE(kwn->startInstance("abc", nullptr));
  EXPECT_TRUE(kwn->startInstance("", nullptr));
  EXPECT_EQ(journal(), (Names{"QuillAgent [-p] [abc] [start] [wn]", "QuillAgent [start] [wn]"}));
}

TEST_F(StartTest, InstanceThatIsActiveAlreadyIsNotListedTwice) {
  const auto kox = running("ox", {{"ox", "11", "abc"}});
  EXPECT_TRUE(kox->startInstance("abc", nullptr));
  EXPECT_EQ(kox->getActiveInstances(), Names{"abc"});
  EXPECT_TRUE(kox->startInstance("def", nullptr));
  EXPECT_EQ(kox->getActiveInstances(), (Names{"abc", "def"}));
}

TEST_F(StartTest, FailureOfTheDefaultInstanceIsCode12) {
  const std::string message = "Unable to start agent for product Sample.";
  EXPECT_EQ(
      expectStartFailure("", "QuillAgent [start] [ox]", {12, message}),
      joined({own({"startInstance() entry"}), commandLines({"/bin/sh", "-c", agentScript() + "  start ox"}),
              returned(3, "told\n", "why\n"), ownError(message), own({"startInstance() exit"})}));
}

TEST_F(StartTest, FailureOfANamedInstanceIsCode13) {
  const std::string message = "Unable to start instance abc of agent for product Sample.";
  EXPECT_EQ(expectStartFailure("abc", "QuillAgent [-o] [abc] [start] [ox]", {13, message}),
            joined({own({"startInstance(abc) entry"}),
                    commandLines({"/bin/sh", "-c", agentScript() + " -o abc start ox"}),
                    returned(3, "told\n", "why\n"), ownError(message), own({"startInstance(abc) exit"})}));
}

// KEEP(primary-unnamed)
TEST_F(StartTest, PrimaryIsStartedByItsNameButReportedAsTheDefaultInstance) {
  expectStartFailure("Primary", "QuillAgent [-o] [Primary] [start] [ox]",
                     {12, "Unable to start agent for product Sample."});
  EXPECT_EQ(journal(), Names{"QuillAgent [-o] [Primary] [start] [ox]"});
}

// KEEP(null-record-silent)
TEST_F(StartTest, PrimaryIsTheDefaultInstanceInThisSpellingOnly) {
  expectStartFailure("primary", "QuillAgent [-o] [primary] [start] [ox]",
                     {13, "Unable to start instance primary of agent for product Sample."});
}

TEST_F(StartTest, FailureWithoutARecordLeavesNoErrorLine) {
  onCall("QuillAgent [start] [ox]", "exit 3");
  const auto kox = running("ox", {});
  EXPECT_FALSE(kox->startInstance("", nullptr));
  EXPECT_EQ(logLines(), joined({own({"startInstance() entry"}),
                                commandLines({"/bin/sh", "-c", agentScript() + "  start ox"}), returned(3),
                                own({"startInstance() exit"})}));
}

TEST_F(StartTest, FailedStartLeavesTheActiveInstancesAlone) {
  onCall("QuillAgent [-o] [abc] [start] [ox]", "exit 1");
  const auto kox = running("ox", {{"ox", "11", "abc"}});
  EXPECT_FALSE(kox->startInstance("abc", nullptr));
  EXPECT_EQ(kox->getActiveInstances(), Names{"abc"});
}

TEST_F(StartTest, MissingScriptIsAFailedStart) {
  removeScripts();
  PatchError err;
  EXPECT_FALSE(running("ox", {})->startInstance("", &err));
  EXPECT_EQ(err.code, 12);
  EXPECT_EQ(linesOf("orvcomponent", logLines())[1], trace("orvcomponent", "return code: 127"));
}

TEST_F(StartTest, OwnInstanceIsStartedThroughTheShell) {
  const auto kox = running("ox", {{"ox", "11", "abc", RunRow::currentUser}});
  EXPECT_TRUE(kox->startInstance("abc", nullptr));
  EXPECT_EQ(linesOf("process.cpp", logLines()),
            commandLines({"/bin/sh", "-c", agentScript() + " -o abc start ox"}));
}

TEST_F(StartTest, OrdinaryUserCannotStartTheInstanceOfAnother) {
  const auto kox = running("ox", {{"ox", "11", "abc", "another"}});
  const RealUserScope ordinaryUser;
  const LogLines lines = {trace("orvcomponent", "startInstance(abc) entry"),
                          error("orvcomponent", "Unable to su to user: another"),
                          trace("orvcomponent", "startInstance(abc) exit")};
  PatchError err;
  EXPECT_FALSE(kox->startInstance("abc", &err));
  EXPECT_EQ(recordOf(err), Record(20, "Unable to su to user: another"));
  EXPECT_EQ(logLines(), lines);
  EXPECT_EQ(journal(), Names{}) << "nothing may be run";
  EXPECT_EQ(kox->getActiveInstances(), Names{"abc"});
}

TEST_F(StartTest, RefusedSwitchOfUserWithoutARecordLeavesNoErrorLine) {
  const auto kox = running("ox", {{"ox", "11", "abc", "another"}});
  const RealUserScope ordinaryUser;
  EXPECT_FALSE(kox->startInstance("abc", nullptr));
  EXPECT_EQ(logLines(), own({"startInstance(abc) entry", "startInstance(abc) exit"}));
}

TEST_F(StartTest, OwnerCountsForEachInstanceAlone) {
  const auto kox = running("ox", {{"ox", "11", "abc", "another"}, {"ox", "12"}});
  const RealUserScope ordinaryUser;
  PatchError err;
  EXPECT_FALSE(kox->startInstance("abc", &err));
  EXPECT_EQ(err.code, 20);
  logLines();
  kox->startInstance("new", &err);
  EXPECT_EQ(linesOf("process.cpp", logLines()),
            commandLines({"/bin/sh", "-c", agentScript() + " -o new start ox"}))
      << "an instance without an owner is the user's own";
}

TEST_F(StartTest, OwnerOfTheLastRowOfAnInstanceDecides) {
  const auto kox = running("ox", {{"ox", "11", "abc", "first"}, {"ox", "12", "abc", "second"}});
  const RealUserScope ordinaryUser;
  PatchError err;
  EXPECT_FALSE(kox->startInstance("abc", &err));
  EXPECT_EQ(recordOf(err), Record(20, "Unable to su to user: second"));
}

TEST_F(StartTest, RootStartsTheInstanceOfAnotherAsItsOwner) {
  REQUIRE_ROOT();
  const auto kox = running("ox", {{"ox", "11", "abc", "nosuchuser"}});
  PatchError err;
  EXPECT_FALSE(kox->startInstance("abc", &err)) << "su cannot know this user";
  EXPECT_EQ(linesOf("process.cpp", logLines()),
            commandLines({"/bin/su", "-", "nosuchuser", "-c", agentScript() + " -o abc start ox"}));
  EXPECT_EQ(err.code, 13);
  EXPECT_EQ(journal(), Names{});
}

TEST_F(StartTest, RootStartsTheDefaultInstanceOfAnotherAsItsOwner) {
  REQUIRE_ROOT();
  const auto kox = running("ox", {{"ox", "11", "None", "nosuchuser"}});
  PatchError err;
  EXPECT_FALSE(kox->startInstance("", &err));
  EXPECT_EQ(linesOf("process.cpp", logLines()),
            commandLines({"/bin/su", "-", "nosuchuser", "-c", agentScript() + "  start ox"}));
  EXPECT_EQ(err.code, 12);
}

class StopTest : public ControlTest {
public:
  /// An instance that runs as process 4711, the failure of whose stop is expected.
  LogLines expectStopFailure(const std::string &name, const std::string &instance, const std::string &call,
                             const Record &expected) {
    onCall(call, "echo told; echo why >&2; exit 3");
    const auto component = running("ox", {{"ox", "4711", name}});
    PatchError err{99, "earlier"};
    EXPECT_FALSE(component->stopInstance(instance, &err));
    EXPECT_EQ(recordOf(err), expected);
    EXPECT_EQ(component->getActiveInstances(), Names{instance});
    return logLines();
  }
};

TEST_F(StopTest, DefaultInstanceIsStoppedByTheScriptDirectly) {
  onCall("QuillAgent [stop] [ox]", "echo told; echo why >&2");
  const auto kox = running("ox", {{"ox", "4711"}});
  PatchError err;
  EXPECT_TRUE(kox->stopInstance("", &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(), joined({own({"stopInstance() entry"}), commandLines({agentScript(), "stop", "ox"}),
                                returned(0, "told\n", "why\n"), own({"stopInstance() exit"})}));
  EXPECT_EQ(journal(), Names{"QuillAgent [stop] [ox]"});
  EXPECT_EQ(kox->getActiveInstances(), Names{});
}

TEST_F(StopTest, NamedInstanceIsPassedWithO) {
  const auto kox = running("ox", {{"ox", "11", "abc"}});
  EXPECT_TRUE(kox->stopInstance("abc", nullptr));
  EXPECT_EQ(logLines(), joined({own({"stopInstance(abc) entry"}),
                                commandLines({agentScript(), "-o", "abc", "stop", "ox"}), returned(0),
                                own({"stopInstance(abc) exit"})}));
  EXPECT_EQ(journal(), Names{"QuillAgent [-o] [abc] [stop] [ox]"});
}

TEST_F(StopTest, InstanceOfTheUniversalAgentIsPassedWithP) {
  const auto kwn = running("wn", {{"wn", "11", "abc"}});
  EXPECT_TRUE(kwn->stopInstance("abc", nullptr));
  EXPECT_EQ(journal(), Names{"QuillAgent [-p] [abc] [stop] [wn]"});
}

// KEEP(stop-as-current-user)
TEST_F(StopTest, InstanceOfAnotherUserIsStoppedAsTheCurrentUserWithoutSu) {
  const auto kox = running("ox", {{"ox", "11", "abc", "another"}});
  EXPECT_TRUE(kox->stopInstance("abc", nullptr));
  EXPECT_EQ(linesOf("process.cpp", logLines()), commandLines({agentScript(), "-o", "abc", "stop", "ox"}));
}

TEST_F(StopTest, OnlyTheFirstOccurrenceIsRemoved) {
  const auto kox = running("ox", {{"ox", "11", "b"}, {"ox", "12", "a"}, {"ox", "13", "b"}});
  EXPECT_TRUE(kox->stopInstance("b", nullptr));
  EXPECT_EQ(kox->getActiveInstances(), (Names{"a", "b"}));
}

TEST_F(StopTest, InstanceThatWasNotActiveMayBeStopped) {
  const auto kox = running("ox", {{"ox", "11", "abc"}});
  EXPECT_TRUE(kox->stopInstance("other", nullptr));
  EXPECT_EQ(kox->getActiveInstances(), Names{"abc"});
}

TEST_F(StopTest, FailedScriptWhoseProcessHasGoneCountsAsSuccess) {
  onCall("QuillAgent [-o] [abc] [stop] [ox]", "exit 3");
  const auto kox = running("ox", {{"ox", "4711", "abc"}});
  endProcess("4711");
  PatchError err;
  EXPECT_TRUE(kox->stopInstance("abc", &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(kox->getActiveInstances(), Names{});
  EXPECT_EQ(logLines(), joined({own({"stopInstance(abc) entry"}),
                                commandLines({agentScript(), "-o", "abc", "stop", "ox"}), returned(3),
                                commandLines({"ps", "-p", "4711"}),
                                own({"QuillAgent stop failed, but the Process ID is no longer active. "
                                     "Assuming agent is now not running",
                                     "stopInstance(abc) exit"})}));
}

TEST_F(StopTest, ProcessOfTheLastRowOfAnInstanceDecides) {
  onCall("QuillAgent [-o] [abc] [stop] [ox]", "exit 3");
  const std::vector<RunRow> rows = {{"ox", "4711", "abc"}, {"ox", "4712", "abc"}};
  const auto firstHasGone = running("ox", rows);
  endProcess("4711");
  EXPECT_FALSE(firstHasGone->stopInstance("abc", nullptr));
  const auto lastHasGone = running("ox", rows);
  endProcess("4712");
  EXPECT_TRUE(lastHasGone->stopInstance("abc", nullptr));
}

TEST_F(StopTest, ProcessIsStillTheOneOfTheStartOfTheRunAfterAStopAndAStart) {
  const auto kox = running("ox", {{"ox", "4711", "abc"}});
  EXPECT_TRUE(kox->stopInstance("abc", nullptr));
  EXPECT_TRUE(kox->startInstance("abc", nullptr));
  onCall("QuillAgent [-o] [abc] [stop] [ox]", "exit 3");
  EXPECT_FALSE(kox->stopInstance("abc", nullptr));
  endProcess("4711");
  EXPECT_TRUE(kox->stopInstance("abc", nullptr));
}

TEST_F(StopTest, FailureOfTheDefaultInstanceIsCode14) {
  const std::string message = mayRunAsAnother("", "agent");
  EXPECT_EQ(expectStopFailure("None", "", "QuillAgent [stop] [ox]", {14, message}),
            joined({own({"stopInstance() entry"}), commandLines({agentScript(), "stop", "ox"}),
                    returned(3, "told\n", "why\n"), processCheck("4711"), ownError(message),
                    own({"stopInstance() exit"})}));
}

TEST_F(StopTest, FailureOfANamedInstanceIsCode15) {
  const std::string message = mayRunAsAnother("instance abc of ", "agent");
  EXPECT_EQ(expectStopFailure("abc", "abc", "QuillAgent [-o] [abc] [stop] [ox]", {15, message}),
            joined({own({"stopInstance(abc) entry"}),
                    commandLines({agentScript(), "-o", "abc", "stop", "ox"}), returned(3, "told\n", "why\n"),
                    processCheck("4711"), ownError(message), own({"stopInstance(abc) exit"})}));
}

TEST_F(StopTest, PrimaryIsStoppedByItsNameButReportedAsTheDefaultInstance) {
  expectStopFailure("Primary", "Primary", "QuillAgent [-o] [Primary] [stop] [ox]",
                    {14, mayRunAsAnother("", "agent")});
}

TEST_F(StopTest, FailureWithoutARecordLeavesNoErrorLine) {
  onCall("QuillAgent [stop] [ox]", "exit 3");
  const auto kox = running("ox", {{"ox", "4711"}});
  EXPECT_FALSE(kox->stopInstance("", nullptr));
  EXPECT_EQ(logLines(), joined({own({"stopInstance() entry"}), commandLines({agentScript(), "stop", "ox"}),
                                returned(3), processCheck("4711"), own({"stopInstance() exit"})}));
  EXPECT_EQ(kox->getActiveInstances(), Names{""});
}

TEST_F(StopTest, InstanceStartedInThisRunHasNoProcessToLookForSoItsFailedStopIsAFailure) {
  onCall("QuillAgent [-o] [abc] [stop] [ox]", "exit 1");
  const auto kox = running("ox", {});
  EXPECT_TRUE(kox->startInstance("abc", nullptr));
  PatchError err;
  EXPECT_FALSE(kox->stopInstance("abc", &err));
  EXPECT_EQ(err.code, 15);
  EXPECT_EQ(kox->getActiveInstances(), Names{"abc"});
}

TEST_F(StopTest, MissingScriptIsAFailedStopWhileTheProcessRuns) {
  const auto kox = running("ox", {{"ox", "4711"}});
  removeScripts();
  PatchError err;
  EXPECT_FALSE(kox->stopInstance("", &err));
  EXPECT_EQ(err.code, 14);
  EXPECT_EQ(linesOf("orvcomponent", logLines())[1], trace("orvcomponent", "return code: 2"));
}

TEST_F(ControlTest, ComponentWithoutACodeNamesNoneToTheScripts) {
  const auto nameless = running("", {});
  EXPECT_TRUE(nameless->startInstance("", nullptr));
  EXPECT_TRUE(nameless->stopInstance("", nullptr));
  EXPECT_EQ(journal(), (Names{"QuillAgent [start]", "QuillAgent [stop] []"}));
}

} // namespace
