// Runs, steps and programs from the messages of the log.
#include "runlog.h"

#include <memory>

#include <gmock/gmock.h>

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

const std::string rule(78, '=');

std::string header(const std::string &pid = "4711") {
  return rule + "\n ORV Patch Log File\n   System Name: host1\n   User Name:   root\n   Process ID:  " + pid +
         "\n   Build Date:  3/5/07 21:48:44\n" + rule + "\n";
}

/// A log that is written line by line.
class Script {
public:
  Script &run(const std::string &pid = "4711") {
    text_ += header(pid);
    return *this;
  }
  Script &at(const std::string &time) {
    time_ = time;
    return *this;
  }
  Script &line(const std::string &component, const std::string &text, const std::string &level = "TRACE") {
    text_ += level + " " + time_ + " (" + component + ",1): " + text + "\n";
    return *this;
  }
  Script &main(const std::string &text) { return line("main", text); }
  Script &package(const std::string &text) { return line("dcfpackageprocessor", text); }
  Script &patch(const std::string &text) { return line("patchprocessor", text); }
  Script &error(const std::string &text) { return line("patchprocessor", text, "ERROR"); }
  Script &process(const std::vector<std::string> &words) {
    line("process.cpp", "runCommand entry");
    for (std::size_t i = 0; i < words.size(); ++i)
      line("process.cpp", "cmdArray[" + std::to_string(i) + "]: " + words[i]);
    return line("process.cpp", "runCommand exit");
  }
  Script &accept(const std::string &path) {
    return package("[" + path + "] is applicable.").package("Patch pushback succeeded.");
  }
  const std::string &text() const { return text_; }

private:
  std::string text_;
  std::string time_ = "14:00:00";
};

class Found : public RunEvents {
public:
  void onRunEnded(const LogRun &run) override { runs.push_back(run); }
  void onStepEnded(const LogStep &step) override {
    steps.push_back(step);
    static const char *const words[] = {"passed", "failed", "open"};
    results.push_back(step.name + " " + words[static_cast<int>(step.result)]);
  }
  void onStepBegan(const LogStep &step) override { begun.push_back(step.name); }
  void onFileMoved(const std::string &path) override { files.push_back(path); }
  void onChildEnded(const LogChild &child) override { children.push_back(child); }
  void onAttempt(const LogAttempt &attempt) override { attempts.push_back(attempt); }
  void onVerdict(const LogRun &run) override { verdicts.push_back(run.status.value_or(-1)); }

  std::vector<LogRun> runs;
  std::vector<LogStep> steps;
  std::vector<std::string> results;
  std::vector<std::string> begun;
  std::vector<std::string> files;
  std::vector<LogChild> children;
  std::vector<LogAttempt> attempts;
  std::vector<int> verdicts;
};

std::unique_ptr<Found> read(const Script &script) {
  auto found = std::make_unique<Found>();
  RunLog log(*found);
  log.feed(script.text());
  log.finish();
  return found;
}

Script arguments(const std::vector<std::string> &words) {
  Script script;
  script.run();
  for (std::size_t i = 0; i < words.size(); ++i)
    script.main("arg[" + std::to_string(i) + "]: " + words[i]);
  return script;
}

TEST(CtlRunLog, TellsActionAndPathInEitherOrder) {
  const auto first = read(arguments({"orvpatch", "-h", "/home", "-i", "/patch"}));
  EXPECT_EQ(first->runs.at(0).action, "install");
  EXPECT_EQ(first->runs.at(0).home, "/home");
  EXPECT_EQ(first->runs.at(0).path, "/patch");
  const auto second = read(arguments({"orvpatch", "-t", "/a\nb", "-h", "/home"}));
  EXPECT_EQ(second->runs.at(0).action, "report");
  EXPECT_EQ(second->runs.at(0).path, "/a\nb");
  EXPECT_EQ(read(arguments({"orvpatch", "-vi", "/x", "-h", "/home"}))->runs.at(0).action, "validate");
  const auto check = read(arguments({"orvpatch", "-h", "/home", "-utest"}));
  EXPECT_EQ(check->runs.at(0).action, "self-check");
  EXPECT_EQ(check->runs.at(0).home, "/home");
}

TEST(CtlRunLog, CountsRunsLinesAndErrors) {
  const auto found = read(Script().run("1").main("a").error("b").main("main = 3").run("2").main("c"));
  ASSERT_THAT(found->runs, SizeIs(2));
  EXPECT_EQ(found->runs[0].number, 1U);
  EXPECT_EQ(found->runs[0].pid, 1);
  EXPECT_EQ(found->runs[0].lines, 3U);
  EXPECT_EQ(found->runs[0].errors, 1U);
  EXPECT_EQ(found->runs[0].status, 3);
  EXPECT_TRUE(found->runs[0].hasEnded);
  EXPECT_EQ(found->runs[1].number, 2U);
  EXPECT_FALSE(found->runs[1].hasEnded);
  EXPECT_EQ(found->runs[1].status, std::nullopt);
  EXPECT_THAT(found->verdicts, ElementsAre(3));
}

TEST(CtlRunLog, WhatStandsBeforeTheFirstHeaderIsRunNought) {
  const auto found = read(Script().main("x").main("main = 0").run().main("y"));
  ASSERT_THAT(found->runs, SizeIs(2));
  EXPECT_EQ(found->runs[0].number, 0U);
  EXPECT_EQ(found->runs[0].pid, std::nullopt);
  EXPECT_EQ(found->runs[0].status, 0);
  EXPECT_EQ(found->runs[1].number, 1U);
}

TEST(CtlRunLog, AnEmptyLogHasNoRuns) {
  EXPECT_THAT(read(Script())->runs, IsEmpty());
}

TEST(CtlRunLog, LinesBehindTheVerdictAreThoseOfAnother) {
  const auto found = read(Script().run("1").main("a").run("2").main("main = 0").main("b").main("main = 21"));
  ASSERT_THAT(found->runs, SizeIs(2));
  EXPECT_FALSE(found->runs[0].hasEnded);
  EXPECT_TRUE(found->runs[1].isMixed);
  EXPECT_EQ(found->runs[1].status, std::nullopt) << "whose of the two is not known";
  EXPECT_EQ(read(Script().run().main("main = 21").main("b").main("main = 21"))->runs.at(0).status, 21);
}

Script installation() {
  Script script;
  script.run().accept("/p/kyn_lpp266_vema_fp0002.tar").package("DCFPackageProcessor::run() entry");
  return script.patch("PatchProcessor::run() entry");
}

TEST(CtlRunLog, StepsEndWithTheirResult) {
  const auto found = read(installation()
                              .patch("PatchProcessor::extract() entry")
                              .at("14:00:07")
                              .patch("PatchProcessor::extract() = 1")
                              .patch("PatchProcessor::runPrePatchScripts() entry")
                              .patch("PatchProcessor::runPrePatchScripts() = 0")
                              .patch("PatchProcessor::run() = 0")
                              .main("main = 22"));
  EXPECT_THAT(found->results, ElementsAre("extract passed", "runPrePatchScripts failed"));
  EXPECT_EQ(found->steps.at(0).seconds, 7);
  EXPECT_EQ(found->steps.at(0).time, 14 * 3600);
  EXPECT_EQ(found->steps.at(0).patch, "kyn_lpp266_vema_fp0002.tar");
  EXPECT_EQ(found->steps.at(1).time, 14 * 3600 + 7);
}

TEST(CtlRunLog, AStepWithoutResultPassedWhenTheNextOneFollows) {
  const auto found = read(installation()
                              .patch("PatchProcessor::stopDependents() entry")
                              .patch("PatchProcessor::runPreScripts() entry")
                              .patch("PatchProcessor::runPreScripts() = 1")
                              .patch("PatchProcessor::moveFiles() entry")
                              .patch("PatchProcessor::updateProductEXEFiles() entry"));
  EXPECT_THAT(found->results, ElementsAre("stopDependents passed", "runPreScripts passed", "moveFiles passed",
                                          "updateProductEXEFiles open"));
}

TEST(CtlRunLog, AStepWithoutResultFailedWhenTheOsAgentFollows) {
  const auto found = read(installation()
                              .patch("PatchProcessor::stopDependents() entry")
                              .patch("PatchProcessor::startOSAgentIfNeeded() entry")
                              .patch("PatchProcessor::startOSAgentIfNeeded() = 1"));
  EXPECT_THAT(found->results, ElementsAre("stopDependents failed", "startOSAgentIfNeeded passed"));
}

TEST(CtlRunLog, AReportWithoutFilesFailsInListFiles) {
  const auto found = read(Script()
                              .run()
                              .accept("/p/kyn_lpp266_vema_fp0002.tar")
                              .package("DCFPackageProcessor::testRun() entry")
                              .patch("PatchProcessor::listFiles() entry")
                              .patch("PatchProcessor::listFiles() exit")
                              .patch("PatchProcessor::testRun() = 0"));
  EXPECT_THAT(found->results, ElementsAre("listFiles failed"));
}

TEST(CtlRunLog, PatchesAreAppliedInTheOrderOfTheirTargets) {
  Script script;
  script.run().accept("/p/kyn_lpp266_vema_fp0002.tar").accept("/p/kqa_lpp266_vems_fp0002.tar");
  script.package("DCFPackageProcessor::run() entry");
  for (int i = 0; i < 2; ++i)
    script.patch("PatchProcessor::cleanUp() entry")
        .patch("PatchProcessor::cleanUp() = 1")
        .patch("PatchProcessor::extract() entry")
        .patch("PatchProcessor::extract() = 1")
        .patch("PatchProcessor::run() = 1")
        .patch("PatchProcessor::cleanUp() entry")
        .patch("PatchProcessor::cleanUp() = 1");
  const auto found = read(script);
  std::vector<std::string> patches;
  for (const LogStep &step : found->steps)
    patches.push_back(step.patch.substr(0, 3));
  EXPECT_THAT(patches, ElementsAre("kqa", "kqa", "kqa", "kyn", "kyn", "kyn"));
}

TEST(CtlRunLog, WithoutItsStartTheArchiveNamesThePatch) {
  const auto found = read(Script()
                              .package("DCFPackageProcessor::run() entry")
                              .patch("PatchProcessor::extract() entry")
                              .process({"tar", "-xf", "/p/kyn_lpp266_vema_fp0002.tar"})
                              .patch("PatchProcessor::extract() = 1"));
  EXPECT_EQ(found->steps.at(0).patch, "kyn_lpp266_vema_fp0002.tar");
}

TEST(CtlRunLog, CountsTheFilesOfAStep) {
  const auto found =
      read(installation()
               .patch("PatchProcessor::moveFiles() entry")
               .line("patchprocessor", "Successfully moved file from /h/tmp/kyn/updated_files/./a to /h/./a",
                     "INFO ")
               .line("patchprocessor",
                     "Successfully moved file from /h/tmp/kyn/updated_files/./x to y to /h/./x to y", "INFO ")
               .patch("PatchProcessor::moveFile() = 1"));
  EXPECT_THAT(found->files, ElementsAre("a", "x to y"));
  EXPECT_EQ(found->steps.at(0).files, 2U);
}

TEST(CtlRunLog, ProgramsHaveTheirWordsAndStatus) {
  const auto found = read(installation()
                              .patch("PatchProcessor::extract() entry")
                              .process({"tar", "-xf", "/p/x.tar"})
                              .patch("tar returned: 2")
                              .patch("PatchProcessor::extract() = 0")
                              .process({"bin/QuillAgent", "", "stop", "yn"})
                              .line("orvcomponent", "return code: 0")
                              .process({"10_do.sh"})
                              .error("Bad return code from 10_do.sh: 3")
                              .process({"20_do.sh"})
                              .line("patchprocessor", "Successfully executed: 20_do.sh", "INFO ")
                              .process({"ps", "-p", "1"})
                              .patch("something else"));
  ASSERT_THAT(found->children, SizeIs(5));
  EXPECT_EQ(found->children[0].step, "extract");
  EXPECT_EQ(found->children[0].status, 2);
  EXPECT_EQ(found->children[1].step, "");
  EXPECT_THAT(found->children[1].words, ElementsAre("bin/QuillAgent", "", "stop", "yn"));
  EXPECT_EQ(found->children[1].status, 0);
  EXPECT_EQ(found->children[2].status, 3);
  EXPECT_EQ(found->children[3].status, 0);
  EXPECT_EQ(found->children[4].status, std::nullopt);
}

TEST(CtlRunLog, AttemptsTellWhenTheHistoryLineWasWritten) {
  const auto found = read(installation()
                              .at("23:59:58")
                              .patch("PatchProcessor::updatePatchRegistry() entry")
                              .at("00:00:01")
                              .patch("PatchProcessor::updatePatchRegistry() exit")
                              .patch("PatchProcessor::run() = 1"));
  ASSERT_THAT(found->attempts, SizeIs(1));
  EXPECT_EQ(found->attempts[0].patch, "kyn_lpp266_vema_fp0002.tar");
  EXPECT_TRUE(found->attempts[0].passed);
  EXPECT_EQ(found->attempts[0].from, 86398);
  EXPECT_EQ(found->attempts[0].to, 1);
  EXPECT_EQ(found->attempts[0].days, 0);
}

TEST(CtlRunLog, EventsComeAsSoonAsTheLogTellsThem) {
  Found found;
  RunLog log(found);
  log.feed(installation().patch("PatchProcessor::extract() entry").text());
  log.settle();
  EXPECT_THAT(found.begun, ElementsAre("extract"));
  EXPECT_THAT(found.steps, IsEmpty());
  log.feed("TRACE 14:00:00 (patchprocessor,1): PatchProcessor::extract() = 1\n");
  log.settle();
  EXPECT_THAT(found.results, ElementsAre("extract passed"));
  log.feed("TRACE 14:00:00 (main,1): main = 0\n");
  log.settle();
  EXPECT_THAT(found.verdicts, ElementsAre(0));
}

long secondsOver(const std::vector<int> &times, int *days = nullptr) {
  RunClock clock;
  for (const int time : times)
    clock.tick(time);
  if (days != nullptr)
    *days = clock.days();
  return clock.seconds();
}

TEST(CtlRunClock, GoesOn) {
  EXPECT_EQ(secondsOver({100, 100, 107}), 7);
  EXPECT_EQ(secondsOver({}), 0);
  EXPECT_EQ(secondsOver({100, -1, 103}), 3) << "a line without a time is passed over";
}

TEST(CtlRunClock, PassesMidnight) {
  int days = 0;
  EXPECT_EQ(secondsOver({86398, 1, 50000, 86399, 0}, &days), 3 + 86398 + 1);
  EXPECT_EQ(days, 2);
  EXPECT_EQ(secondsOver({86398, 1}, &days), 3);
  EXPECT_EQ(days, 1);
}

TEST(CtlRunClock, AClockThatIsSetBackCountsAsNoTime) {
  int days = 0;
  EXPECT_EQ(secondsOver({10000, 6400, 6402}, &days), 2);
  EXPECT_EQ(days, 0);
  EXPECT_EQ(secondsOver({0, 86399, 0}, &days), 1) << "set back over midnight, which then comes again";
  EXPECT_EQ(days, 0);
}

} // namespace
