// What remains of a patch: the level in the version file, and a line of the history.
#include "patchprocessor/patchprocessor.h"

#include <cerrno>
#include <ctime>
#include <filesystem>
#include <memory>
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "patchhome.h"
#include "utilities.h"

namespace {

using Names = std::vector<std::string>;

const std::string AgentPatch = "kxe_lpp266_vema_fp0001.tar";

/// A patch, the product of its descriptor, and the version file that records its level.
struct VersionFile {
  const char *patch;
  const char *product;
  const char *file;
};

class VersionFileOfPatchTest : public PatchHome, public ::testing::WithParamInterface<VersionFile> {
public:
  std::unique_ptr<PatchDescriptor> descriptor() const {
    return std::unique_ptr<PatchDescriptor>(
        PatchDescriptor::parseFile(write("patch.ini", patchIni(GetParam().product)), nullptr));
  }
};

TEST_P(VersionFileOfPatchTest, IsToldByTargetProductAndPlatform) {
  EXPECT_EQ(getVerFileName(descriptor().get(), "/home/", std::string("/dir_a_b_c.d/") + GetParam().patch),
            std::string("/home/registry/") + GetParam().file);
}

TEST_P(VersionFileOfPatchTest, HomeIsUsedUnchanged) {
  EXPECT_EQ(getVerFileName(descriptor().get(), "/home", GetParam().patch),
            std::string("/homeregistry/") + GetParam().file);
}

INSTANTIATE_TEST_SUITE_P(
    Table, VersionFileOfPatchTest,
    ::testing::Values(VersionFile{"kxe_lpp266_vema_1.tar", "kxe", "xelpp266.ver"},
                      VersionFile{"kxe_unix_vema_1.tar", "kxe", "xeunix.ver"},
                      VersionFile{"kxe_li6243_vema_1.tar", "xe", "xeli6243.ver"},
                      VersionFile{"kqa_lpp266_vema_1.tar", "kqa", "qalpp266.ver"},
                      VersionFile{"kxe_lpp266_vema_1.tar", "", "lpp266.ver"},
                      VersionFile{"kox_lpp266_vems_1.tar", "kox", "oxvms.ver"},
                      VersionFile{"kpt_lpp266_vems_1.tar", "kpt", "ptvms.ver"},
                      VersionFile{"kqa_lpp266_vems_1.tar", "kqa", "qalpp266.ver"},
                      VersionFile{"KQA_lpp266_vems_1.tar", "KQA", "qalpp266.ver"},
                      VersionFile{"kox_lpp266_veps_1.tar", "kox", "oxvps.ver"},
                      VersionFile{"kqa_lpp266_veps_1.tar", "kqa", "qavps.ver"},
                      VersionFile{"kpt_lpp266_veps_1.tar", "kpt", "ptlpp266.ver"},
                      VersionFile{"kox_lpp266_vepd_1.tar", "kox", "oxvpd.ver"},
                      VersionFile{"kpt_lpp266_vepd_1.tar", "kpt", "ptvpd.ver"},
                      VersionFile{"kdk_lpp266_vepd_1.tar", "kdk", "dklpp266.ver"},
                      VersionFile{"kzt_lpp266_vecm_1.tar", "kzt", "ztlpp266.ver"},
                      VersionFile{"kxe_lpp266_vecm_1.tar", "kxe", "ztlpp266.ver"},
                      VersionFile{"kxe_lpp266_vemx_1.tar", "kxe", "xelpp266.ver"},
                      // The product is that of the descriptor, whatever the file name says.
                      VersionFile{"kxe_lpp266_vema_1.tar", "kox", "oxlpp266.ver"}));

class VersionLineTest : public PatchHome {
public:
  std::string path() const { return home() + "registry/xelpp266.ver"; }
  Processor processor() { return loaded(AgentPatch, patchIni("kxe", "06200001")); }
  /// The version file with this text after the update.
  std::string updated(const std::string &text) {
    write("registry/xelpp266.ver", text);
    PatchError err;
    EXPECT_TRUE(processor()->updatePatchVerFile(&err));
    EXPECT_EQ(recordOf(err), NoError);
    return read(path());
  }
  LogLines expectFails(const Processor &processor, const std::string &reason) {
    const std::string message = "Could not update VRMF for " + path() + ": " + reason;
    const LogLines lines =
        expectOwnFailure({28, message}, [&](PatchError *err) { return processor->updatePatchVerFile(err); });
    EXPECT_EQ(lines, (LogLines{pp("PatchProcessor::updatePatchVerFile() entry"), ppError(message)}));
    return lines;
  }
};

TEST_F(VersionLineTest, UpdateIsTraced) {
  write("registry/xelpp266.ver", "VRMF = 06200000\n");
  const Processor kxe = processor();
  EXPECT_TRUE(kxe->updatePatchVerFile(nullptr));
  EXPECT_EQ(ownLines(),
            pps({"PatchProcessor::updatePatchVerFile() entry", "PatchProcessor::updatePatchVerFile() = 1"}));
}

TEST_F(VersionLineTest, LevelIsReplacedAndTheFileEndsInOneEmptyLine) {
  EXPECT_EQ(updated("a\nVRMF = 06100000\nb\n"), "a\nVRMF = 06200001\nb\n\n");
}

TEST_F(VersionLineTest, RepeatedUpdatesKeepOneEmptyLineAtTheEnd) {
  const std::string once = updated("a\nVRMF = 06100000\nb\n");
  EXPECT_EQ(updated(once), once);
  EXPECT_EQ(updated(once), once);
}

TEST_F(VersionLineTest, FileWithoutAFinalLineEndGetsOne) {
  EXPECT_EQ(updated("a\nVRMF = 06100000"), "a\nVRMF = 06200001\n");
}

TEST_F(VersionLineTest, EveryLineThatBeginsWithTheKeyIsReplaced) {
  EXPECT_EQ(updated("VRMF=1\nVRMF\nVRMFs = 2\n VRMF = 3\nold VRMF = 4\nvrmf = 5\n"),
            "VRMF = 06200001\nVRMF = 06200001\nVRMF = 06200001\n VRMF = 3\nold VRMF = 4\nvrmf = 5\n\n");
}

TEST_F(VersionLineTest, LineEndsBecomeLineFeedsAndEmptyLinesDisappear) {
  EXPECT_EQ(updated("a\r\n\r\n\n  \r\nVRMF = 1\r\n"), "a\n  \nVRMF = 06200001\n\n");
}

TEST_F(VersionLineTest, FileWithoutTheKeyKeepsItsLines) {
  EXPECT_EQ(updated("desc = Agent\n"), "desc = Agent\n\n");
  EXPECT_EQ(updated(""), "\n");
}

// KEEP(vecm-zt-file)
TEST_F(VersionLineTest, FourthKindUpdatesTheFileOfZt) {
  install("ztlpp266.ver", "06100000");
  install("xelpp266.ver", "06100000");
  EXPECT_TRUE(loaded("kxe_lpp266_vecm_1.tar", patchIni("kxe", "06200001"))->updatePatchVerFile(nullptr));
  EXPECT_EQ(read(home() + "registry/ztlpp266.ver"), "desc = \nVRMF = 06200001\n\n");
  EXPECT_EQ(read(path()), "desc = \nVRMF = 06100000\n");
}

TEST_F(VersionLineTest, FileIsRewrittenInPlace) {
  const std::string file = write("registry/xelpp266.ver", "VRMF = 1\n", 0604);
  const std::string link = home() + "link";
  std::filesystem::create_hard_link(file, link);
  EXPECT_TRUE(processor()->updatePatchVerFile(nullptr));
  EXPECT_EQ(read(link), "VRMF = 06200001\n\n");
  EXPECT_EQ(modeOf(file), 0604U);
  EXPECT_EQ(treeOf(home() + "registry"), Names{"xelpp266.ver"});
}

TEST_F(VersionLineTest, MissingFileIsCode28WithTheReadersNumber) {
  expectFails(processor(), std::to_string(ENOENT));
  EXPECT_FALSE(isThere(path()));
}

TEST_F(VersionLineTest, FileThatIsNoneIsCode28WithTheReadersNumber) {
  makeDirectory("registry/xelpp266.ver");
  expectFails(processor(), std::to_string(EINVAL));
  std::filesystem::remove(path());
  ASSERT_EQ(mkfifo(path().c_str(), 0644), 0);
  expectFails(processor(), std::to_string(EINVAL));
}

TEST_F(VersionLineTest, FileThatMayNotBeWrittenIsCode28WithTheSystemsText) {
  write("registry/xelpp266.ver", "VRMF = 1\n", 0444);
  const Processor kxe = processor();
  const BoundByPermissions bound(home());
  expectFails(kxe, "Permission denied");
  EXPECT_EQ(read(path()), "VRMF = 1\n");
}

const std::string HistoryHeader =
    "################################################################################\n"
    "# Norvik Veyra Monitoring Patch History File\n"
    "#\n"
    "# Format: <Product Code> | <Architecture> | <Comp> | <Patch Name> | PASS/FAIL | <user> | <date>\n"
    "################################################################################\n";

class HistoryTest : public PatchHome {
public:
  std::string path() const { return home() + "patchlogs/patches.hist"; }
  /// The text less the dates of its records, each of which must be of the last minute.
  static std::string withoutDates(std::string text) {
    static const std::regex date(R"((\d\d)/(\d\d)/(\d{4}) (\d\d):(\d\d):(\d\d)\n)");
    std::smatch match;
    for (std::string rest = text; std::regex_search(rest, match, date); rest = match.suffix())
      expectRecent(match);
    return std::regex_replace(text, date, "<date>\n");
  }
  static std::string padded(std::string text, std::size_t width) {
    return text.size() < width ? text.append(width - text.size(), ' ') : text;
  }
  /// A record of the sample patch.
  static std::string record(const std::string &result) {
    return "kxe | lpp266 | vema | " + padded("kxe fix pack", 20) + " | " + result + " | " +
           padded(Util::getUserName(), 15) + " | <date>\n";
  }

private:
  static void expectRecent(const std::smatch &match) {
    std::tm local{};
    local.tm_mon = std::stoi(match[1]) - 1;
    local.tm_mday = std::stoi(match[2]);
    local.tm_year = std::stoi(match[3]) - 1900;
    local.tm_hour = std::stoi(match[4]);
    local.tm_min = std::stoi(match[5]);
    local.tm_sec = std::stoi(match[6]);
    local.tm_isdst = -1;
    EXPECT_LE(std::abs(std::difftime(std::time(nullptr), std::mktime(&local))), 60.0) << match.str();
  }
};

TEST_F(HistoryTest, FirstRecordComesAfterTheHeaderAndLaterOnesDoNot) {
  const Processor kxe = loaded(AgentPatch, patchIni("kxe"));
  kxe->updatePatchRegistry(true);
  EXPECT_EQ(withoutDates(read(path())), HistoryHeader + record("PASS"));
  kxe->updatePatchRegistry(false);
  EXPECT_EQ(withoutDates(read(path())), HistoryHeader + record("PASS") + record("FAIL"));
}

TEST_F(HistoryTest, EmptyFileGetsTheHeaderAndAnyOtherKeepsWhatItHolds) {
  const Processor kxe = loaded(AgentPatch, patchIni("kxe"));
  write("patchlogs/patches.hist", "");
  kxe->updatePatchRegistry(false);
  EXPECT_EQ(withoutDates(read(path())), HistoryHeader + record("FAIL"));
  write("patchlogs/patches.hist", "x");
  kxe->updatePatchRegistry(true);
  EXPECT_EQ(withoutDates(read(path())), "x" + record("PASS"));
}

TEST_F(HistoryTest, RecordIsTraced) {
  const Processor kxe = loaded(AgentPatch, patchIni("kxe"));
  kxe->updatePatchRegistry(true);
  EXPECT_EQ(logLines(), pps({"PatchProcessor::updatePatchRegistry() entry",
                             "PatchProcessor::updatePatchRegistry() exit"}));
}

TEST_F(HistoryTest, LongNamesAreNotCut) {
  const std::string name = "a patch name of more than twenty characters";
  std::string ini = patchIni("kqa");
  ini.replace(ini.find("kqa fix pack"), 12, name);
  loaded("kqa_unix_vems_1.tar", ini)->updatePatchRegistry(true);
  EXPECT_EQ(withoutDates(read(path())), HistoryHeader + "kqa | unix | vems | " + name + " | PASS | " +
                                            padded(Util::getUserName(), 15) + " | <date>\n");
}

TEST_F(HistoryTest, ProductIsThatOfTheDescriptorPlatformAndTargetAreThoseOfTheFileName) {
  loaded("KXE_unixware_vems_fp0009.tar", patchIni("KYN"))->updatePatchRegistry(true);
  EXPECT_EQ(withoutDates(read(path())), HistoryHeader + "kyn | unixware | vems | " +
                                            padded("KYN fix pack", 20) + " | PASS | " +
                                            padded(Util::getUserName(), 15) + " | <date>\n");
}

TEST_F(HistoryTest, NameOfTwentyCharactersIsNotPadded) {
  const std::string name = "12345678901234567890";
  std::string ini = patchIni("kqa");
  ini.replace(ini.find("kqa fix pack"), 12, name);
  loaded("kqa_unix_vems_1.tar", ini)->updatePatchRegistry(true);
  EXPECT_NE(read(path()).find(" | " + name + " | PASS | "), std::string::npos);
}

TEST_F(HistoryTest, PercentSignsInAPatchNameAreJustText) {
  std::string ini = patchIni("kqa");
  ini.replace(ini.find("kqa fix pack"), 12, "100%s%n");
  loaded("kqa_unix_vems_1.tar", ini)->updatePatchRegistry(true);
  EXPECT_NE(read(path()).find(" | 100%s%n              | PASS | "), std::string::npos);
}

TEST_F(HistoryTest, FileThatCannotBeOpenedIsAnErrorLineAndNothingElse) {
  makeDirectory("patchlogs/patches.hist");
  const Processor kxe = loaded(AgentPatch, patchIni("kxe"));
  kxe->updatePatchRegistry(true);
  const LogLines lines = ownLines();
  ASSERT_GE(lines.size(), 2U);
  EXPECT_EQ(lines[0], pp("PatchProcessor::updatePatchRegistry() entry"));
  EXPECT_EQ(lines[1], ppError("Unable to update patch history file, " + path() + ": Is a directory"));
  EXPECT_EQ(LogLines(lines.begin() + 2, lines.end()), pps({"PatchProcessor::updatePatchRegistry() exit"}));
}

TEST_F(HistoryTest, FolderOfTheHistoryIsNotMade) {
  const Processor elsewhere(
      PatchProcessor::createProcessor(patchPath(AgentPatch), home() + "other/", nullptr));
  write("tmp/kxe/patch.ini", patchIni("kxe"));
  EXPECT_TRUE(elsewhere->parsePatchDescriptor(nullptr));
  elsewhere->updatePatchRegistry(true);
  EXPECT_FALSE(isThere(home() + "other"));
  EXPECT_FALSE(isThere(path()));
}

} // namespace
