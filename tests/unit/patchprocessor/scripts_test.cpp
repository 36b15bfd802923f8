// The three command lists of a patch: what they run in, how they end, and that nothing of it stays behind.
#include "patchprocessor/patchprocessor.h"

#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "patchhome.h"
#include "utilities.h"

namespace {

namespace fs = std::filesystem;
using Names = std::vector<std::string>;

/// Passes when PATH and the working directory are what they were when it was made.
class NothingStays {
public:
  NothingStays() : path_(getenv("PATH")), directory_(Util::getCurrentDirectory()) {}
  void check() const {
    EXPECT_EQ(getenv("PATH"), path_);
    EXPECT_EQ(Util::getCurrentDirectory(), directory_);
  }

private:
  std::string path_;
  std::string directory_;
};

class ScriptsTest : public PatchHome {
public:
  std::string tempDir() const { return home() + "tmp/kxe"; }
  /// Puts a command into the temporary directory, as an extraction would.
  void bring(const Member &member) const { write("tmp/kxe/" + member.path, member.content, member.mode); }
  Processor processor(const std::string &sections = "") {
    return loaded("kxe_lpp266_vema_fp0001.tar", patchIni("kxe", "06200001", sections));
  }
  /// The lines of runScripts around what happens in the temporary directory.
  static LogLines around(const std::string &tempDir, const std::string &path, const LogLines &between,
                         bool result) {
    return joined({pps({"PatchProcessor::runScripts() entry", "old PATH=" + path,
                        "Setting PATH=" + tempDir + ":" + path}),
                   between,
                   pps({"Restoring PATH=" + path,
                        std::string("PatchProcessor::runScripts() = ") + (result ? "1" : "0")})});
  }
  LogLines expectScriptsFail(const Names &commands, const Record &expected) {
    const Processor kxe = processor();
    const NothingStays nothing;
    const LogLines lines =
        expectOwnFailure(expected, [&](PatchError *err) { return kxe->runScripts(commands, err); });
    nothing.check();
    return lines;
  }
};

TEST_F(ScriptsTest, CommandsRunInOrderFromTheTemporaryDirectoryWhichLeadsThePath) {
  bring(command("1.sh", "one", "echo told; echo why >&2"));
  bring(command("2.sh", "two", "pwd >>\"$QUILLHOME/journal\"; echo \"$PATH\" >>\"$QUILLHOME/journal\""));
  const Processor kxe = processor();
  const NothingStays nothing;
  const std::string path = getenv("PATH");
  PatchError err;
  EXPECT_TRUE(kxe->runScripts({"1.sh", "2.sh"}, &err));
  EXPECT_EQ(recordOf(err), NoError);
  nothing.check();
  EXPECT_EQ(ownLines(), around(tempDir(), path,
                               {ppInfo("Processing 2 scripts."), ppInfo("Attempting to execute: 1.sh"),
                                ppInfo("Successfully executed: 1.sh"), pp("stdOut: told\n"),
                                pp("stdErr: why\n"), ppInfo("Attempting to execute: 2.sh"),
                                ppInfo("Successfully executed: 2.sh"), pp("stdOut: "), pp("stdErr: ")},
                               true));
  EXPECT_EQ(journal(), (Names{"one", "two", tempDir(), tempDir() + ":" + path}));
}

TEST_F(ScriptsTest, CommandMayCallWhatWasShippedBesideItByItsBareName) {
  bring(command("main.sh", "main", "helper.sh"));
  bring(command("helper.sh", "helper"));
  EXPECT_TRUE(processor()->runScripts({"main.sh"}, nullptr));
  EXPECT_EQ(journal(), (Names{"main", "helper"}));
}

TEST_F(ScriptsTest, CommandOfThePatchHidesAProgramOfTheSystem) {
  bring(command("ls", "own ls"));
  EXPECT_TRUE(processor()->runScripts({"ls"}, nullptr));
  EXPECT_EQ(journal(), Names{"own ls"});
}

// KEEP(two-temp-directories)
TEST_F(ScriptsTest, TemporaryDirectoryIsThatOfTheDescriptorsProduct) {
  const Processor other = loaded("KXE_lpp266_vema_fp0001.tar", patchIni("KXE"));
  bring(command("1.sh", "found"));
  EXPECT_TRUE(other->runScripts({"1.sh"}, nullptr)) << "in tmp/kxe, not in tmp/KXE";
  EXPECT_EQ(journal(), Names{"found"});
}

TEST_F(ScriptsTest, FailedCommandStopsTheListAndItsOutputGoesToTheLogOnly) {
  bring(command("1.sh", "one", "echo told 100%s; echo why %n >&2; exit 3"));
  bring(command("2.sh", "two"));
  const std::string path = getenv("PATH");
  const std::string message = "Bad return code from 1.sh: 3";
  EXPECT_EQ(expectScriptsFail({"1.sh", "2.sh"}, {-1, message}),
            around(tempDir(), path,
                   {ppInfo("Processing 2 scripts."), ppInfo("Attempting to execute: 1.sh"), ppError(message),
                    ppError("stdOut: told 100%s\n"), ppError("stdErr: why %n\n")},
                   false));
  EXPECT_EQ(printedByFailure().out + printedByFailure().err, "");
  EXPECT_EQ(journal(), (Names{"one", "one"})) << "once for each of the two calls";
}

TEST_F(ScriptsTest, ProgramThatDoesNotExistEndsWithStatus2) {
  const std::string path = getenv("PATH");
  const std::string message = "Bad return code from missing.sh: 2";
  EXPECT_EQ(expectScriptsFail({"missing.sh"}, {-1, message}),
            around(tempDir(), path,
                   {ppInfo("Processing 1 scripts."), ppInfo("Attempting to execute: missing.sh"),
                    ppError(message), ppError("stdOut: "), ppError("stdErr: ")},
                   false));
}

// KEEP(command-is-program)
TEST_F(ScriptsTest, CommandWithBlanksIsTakenWholeAsTheProgram) {
  bring(command("run.sh", "without arguments"));
  bring(command("run.sh now", "$# arguments"));
  EXPECT_TRUE(processor()->runScripts({"run.sh now"}, nullptr));
  EXPECT_EQ(journal(), Names{"$# arguments"});
  expectScriptsFail({"run.sh later"}, {-1, "Bad return code from run.sh later: 2"});
}

TEST_F(ScriptsTest, CommandThatMayNotBeExecutedEndsWithStatus13) {
  Member script = command("1.sh", "never");
  script.mode = 0644;
  bring(script);
  expectScriptsFail({"1.sh"}, {-1, "Bad return code from 1.sh: 13"});
}

TEST_F(ScriptsTest, MissingTemporaryDirectoryIsCode24) {
  const Processor kxe = processor();
  fs::remove_all(tempDir());
  const NothingStays nothing;
  const std::string path = getenv("PATH");
  const std::string message = "Could not change current working directory to: " + tempDir();
  const LogLines lines =
      expectOwnFailure({24, message}, [&](PatchError *err) { return kxe->runScripts({"1.sh"}, err); });
  EXPECT_EQ(lines, around(tempDir(), path, {ppError(message)}, false));
  nothing.check();
}

TEST_F(ScriptsTest, DirectoryThatIsGoneAfterwardsIsCode24EvenAfterSuccess) {
  bring(command("1.sh", "one", "rmdir \"$QUILLHOME/away\""));
  const Processor kxe = processor();
  const std::string away = makeDirectory("away");
  fs::current_path(away);
  const std::string path = getenv("PATH");
  const std::string message = "Could not change current working directory to: " + away;
  PatchError err;
  EXPECT_FALSE(kxe->runScripts({"1.sh"}, &err));
  EXPECT_EQ(recordOf(err), Record(24, message));
  EXPECT_EQ(ownLines(),
            around(tempDir(), path,
                   {ppInfo("Processing 1 scripts."), ppInfo("Attempting to execute: 1.sh"),
                    ppInfo("Successfully executed: 1.sh"), pp("stdOut: "), pp("stdErr: "), ppError(message)},
                   false));
  EXPECT_EQ(getenv("PATH"), path);
}

TEST_F(ScriptsTest, PathThatIsNotSetCountsAsEmpty) {
  bring({"1.sh", "#!/bin/sh\necho \"$PATH\" >\"$QUILLHOME/journal\"\n", 0755});
  const Processor kxe = processor();
  unsetenv("PATH");
  EXPECT_TRUE(kxe->runScripts({"1.sh"}, nullptr));
  EXPECT_STREQ(getenv("PATH"), "");
  EXPECT_EQ(journal(), Names{tempDir() + ":"});
  const LogLines lines = ownLines();
  EXPECT_EQ(LogLines(lines.begin() + 1, lines.begin() + 3),
            pps({"old PATH=", "Setting PATH=" + tempDir() + ":"}));
  EXPECT_EQ(lines[lines.size() - 2], pp("Restoring PATH="));
}

/// One of the three lists: its section, its operation, its code, and how its exit line reads.
struct List {
  const char *section;
  bool (PatchProcessor::*run)(PatchError *);
  int code;
  const char *entry;
  const char *exit;
};

class ListTest : public ScriptsTest, public ::testing::WithParamInterface<List> {
public:
  Processor withCommands(const Names &commands) {
    return processor(commands.empty() ? "" : bareSection(GetParam().section, commands));
  }
  static bool run(const Processor &processor, PatchError *err) {
    return (processor.get()->*GetParam().run)(err);
  }
  static LogLines entryLine() { return pps({GetParam().entry}); }
  static LogLines exitLine(bool result) { return pps({GetParam().exit + std::string(result ? "1" : "0")}); }
};

TEST_P(ListTest, EmptyListIsTracedAndTouchesNothing) {
  const Processor kxe = withCommands({});
  const NothingStays nothing;
  PatchError err;
  EXPECT_TRUE(run(kxe, &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(ownLines(), joined({entryLine(), exitLine(true)}));
  nothing.check();
}

TEST_P(ListTest, CommandsOfItsOwnSectionRunInSortedOrder) {
  bring(command("a.sh", "a"));
  bring(command("b.sh", "b"));
  const Processor kxe = withCommands({"b.sh", "a.sh"});
  EXPECT_TRUE(run(kxe, nullptr));
  EXPECT_EQ(journal(), (Names{"a", "b"}));
  const LogLines lines = ownLines();
  EXPECT_EQ(LogLines{lines.front()}, entryLine());
  EXPECT_EQ(lines[1], pp("PatchProcessor::runScripts() entry"));
  EXPECT_EQ(LogLines(lines.end() - 2, lines.end()),
            joined({pps({"PatchProcessor::runScripts() = 1"}), exitLine(true)}));
}

TEST_P(ListTest, CommandsOfTheOtherSectionsDoNotRun) {
  std::string sections;
  for (const char *section : {"PrePatchCommands", "PreCommands", "PostCommands"})
    if (section != std::string(GetParam().section))
      sections += bareSection(section, {"1.sh"});
  bring(command("1.sh", "other"));
  EXPECT_TRUE(run(processor(sections), nullptr));
  EXPECT_EQ(journal(), Names{});
}

// KEEP(script-code-replaced)
TEST_P(ListTest, FailureHasTheCodeOfItsPlaceAndTheTextOfItsCause) {
  bring(command("1.sh", "one", "exit 3"));
  const Processor kxe = withCommands({"1.sh"});
  const LogLines lines = expectOwnFailure({GetParam().code, "Bad return code from 1.sh: 3"},
                                          [&](PatchError *err) { return run(kxe, err); });
  EXPECT_EQ(LogLines(lines.end() - 2, lines.end()),
            joined({pps({"PatchProcessor::runScripts() = 0"}), exitLine(false)}));
}

TEST_P(ListTest, FailedChangeOfDirectoryHasTheCodeOfItsPlaceToo) {
  const Processor kxe = withCommands({"1.sh"});
  fs::remove_all(tempDir());
  expectOwnFailure({GetParam().code, "Could not change current working directory to: " + tempDir()},
                   [&](PatchError *err) { return run(kxe, err); });
}

INSTANTIATE_TEST_SUITE_P(
    Lists, ListTest,
    ::testing::Values(List{"PrePatchCommands", &PatchProcessor::runPrePatchScripts, 22,
                           "PatchProcessor::runPrePatchScripts() entry",
                           "PatchProcessor::runPrePatchScripts() = "},
                      List{"PreCommands", &PatchProcessor::runPreScripts, 21,
                           "PatchProcessor::runPreScripts() entry", "PatchProcessor::runPreScripts() = "},
                      List{"PostCommands", &PatchProcessor::runPostScripts, 23,
                           "PatchProcessor::runPostScripts() entry", "PatchProcessor::runPostScripts() "}),
    [](const auto &test) { return test.param.section; });

} // namespace
