// Whether a patch can apply to this system, judged by its name and by what is installed.
#include "dcfpackageprocessor.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "patchhome.h"

namespace {

using Names = std::vector<std::string>;

LogLines own(const std::vector<std::string> &messages) {
  return traces("dcfpackageprocessor", messages);
}

/// A file name, what the home holds, and the answer: nothing more in the log when `reason` is empty.
struct Candidate {
  const char *label;
  const char *file;
  Names inHome;
  bool applies;
  std::string reason;
};

const std::string Env = "config/.ConfigData/kqaenv"; // the monitoring server is installed

std::string noPatchName(const std::string &file) {
  return "Specified filename: " + file +
         ", is not a valid patch filename, therefore the file is not an applicable patch.";
}
std::string foreign(const std::string &family) {
  return "Platform specified in patch filename: " + family +
         ", does not match current platform: lpp. Patch is not applicable.";
}

class ApplicabilityTest : public PatchHome, public ::testing::WithParamInterface<Candidate> {
public:
  bool applies() {
    const Candidate &candidate = GetParam();
    for (const std::string &path : candidate.inHome)
      write(path, "");
    const File file(write(std::string("patches/") + candidate.file, ""));
    logLines();
    return DCFPackageProcessor::isApplicable(home(), file);
  }
};

TEST_P(ApplicabilityTest, IsDecidedAndTraced) {
  const Candidate &candidate = GetParam();
  EXPECT_EQ(applies(), candidate.applies);
  LogLines expected = own(
      {"DCFPackageProcessor::isApplicable('" + home() + "','" + candidate.file + "')  entry"}); // two blanks
  if (!candidate.reason.empty())
    expected.push_back(trace("dcfpackageprocessor", candidate.reason));
  expected.push_back(trace("dcfpackageprocessor", std::string("DCFPackageProcessor::isApplicable() "
                                                              "retval: [") +
                                                      (candidate.applies ? "1" : "0") + "]"));
  EXPECT_EQ(logLinesOf("dcfpackageprocessor"), expected);
}

const auto LabelOf = [](const ::testing::TestParamInfo<Candidate> &test) { return test.param.label; };

INSTANTIATE_TEST_SUITE_P(
    Names, ApplicabilityTest,
    ::testing::Values(Candidate{"Readme", "readme.txt", {}, false, noPatchName("readme.txt")},
                      Candidate{"NoExtension",
                                "kxe_lpp266_vema_fp0001",
                                {"registry/xelpp266.ver"},
                                false,
                                noPatchName("kxe_lpp266_vema_fp0001")},
                      Candidate{"UnknownTarget",
                                "kxe_lpp266_vemx_1.tar",
                                {"registry/xelpp266.ver"},
                                false,
                                noPatchName("kxe_lpp266_vemx_1.tar")},
                      Candidate{
                          "AnyExtension", "kxe_lpp266_vema_1.zip", {"registry/xelpp266.ver"}, true, ""}),
    LabelOf);

INSTANTIATE_TEST_SUITE_P(
    Platforms, ApplicabilityTest,
    ::testing::Values(
        Candidate{"Own", "kxe_lpp266_vema_fp0001.tar", {"registry/xelpp266.ver"}, true, ""},
        Candidate{"Family", "kxe_lpp_vema_fp0001.tar", {"registry/xelpp.ver"}, true, ""},
        Candidate{"Unix", "kxe_unix_vema_fp0001.tar", {"registry/xeunix.ver"}, true, ""},
        Candidate{"UnixAndMore", "kxe_unix5_vema_1.tar", {"registry/xeunix5.ver"}, false, foreign("unix5")},
        Candidate{"Li", "kxe_li6243_vema_fp0001.tar", {"registry/xeli6243.ver"}, false, foreign("li")},
        Candidate{"Aix", "kxe_aix526_vema_fp0001.tar", {"registry/xeaix526.ver"}, false, foreign("aix")},
        Candidate{"Winnt", "kxe_winnt_vema_fp0001.tar", {"registry/xewinnt.ver"}, false, foreign("winnt")}),
    LabelOf);

INSTANTIATE_TEST_SUITE_P(
    Agents, ApplicabilityTest,
    ::testing::Values(
        Candidate{"Missing",
                  "kxe_lpp266_vema_1.tar",
                  {"registry/xelpp263.ver", "registry/XElpp266.ver", "registry/kxelpp266.ver"},
                  false,
                  "VEMA support not installed for: kxe"},
        Candidate{"ProductInCapitals", "KXE_lpp266_vema_1.tar", {"registry/xelpp266.ver"}, true, ""},
        Candidate{
            "MissingInCapitals", "KXE_lpp266_vema_1.tar", {}, false, "VEMA support not installed for: KXE"},
        Candidate{"FourthKind", "kzt_lpp266_vecm_1.tar", {"registry/ztlpp266.ver"}, true, ""},
        Candidate{"FourthKindOfAnother", "kxe_lpp266_vecm_1.tar", {"registry/xelpp266.ver"}, true, ""},
        Candidate{"FourthKindMissing",
                  "kxe_lpp266_vecm_1.tar",
                  {"registry/ztlpp266.ver"},
                  false,
                  "VECM support not installed for: kxe"}),
    LabelOf);

INSTANTIATE_TEST_SUITE_P(
    MonitoringServer, ApplicabilityTest,
    ::testing::Values(
        Candidate{"ItsOwn", "kqa_lpp266_vems_1.tar", {Env, "registry/qalpp266.ver"}, true, ""},
        Candidate{"ItsOwnInCapitals", "KQA_lpp266_vems_1.tar", {Env, "registry/qalpp266.ver"}, true, ""},
        Candidate{"ItsOwnMissing",
                  "kqa_lpp266_vems_1.tar",
                  {Env, "registry/qavms.ver"},
                  false,
                  "VEMS support not installed for: kqa"},
        Candidate{"ServerMissing", "kqa_lpp266_vems_1.tar", {"registry/qalpp266.ver"}, false, ""},
        Candidate{"Support", "kxe_lpp266_vems_1.tar", {Env, "registry/xevms.ver"}, true, ""},
        Candidate{"SupportMissing",
                  "kxe_lpp266_vems_1.tar",
                  {Env, "registry/xelpp266.ver"},
                  false,
                  "VEMS support not installed for: kxe"},
        Candidate{"SupportWithoutServer", "kxe_lpp266_vems_1.tar", {"registry/xevms.ver"}, false, ""}),
    LabelOf);

INSTANTIATE_TEST_SUITE_P(
    PortalServer, ApplicabilityTest,
    ::testing::Values(
        Candidate{"ItsOwn", "kpt_lpp266_veps_1.tar", {"registry/ptlpp266.ver"}, true, ""},
        Candidate{"ServerMissing", "kpt_lpp266_veps_1.tar", {"registry/ptvps.ver"}, false, ""},
        Candidate{
            "Support", "kxe_lpp266_veps_1.tar", {"registry/ptlpp266.ver", "registry/xevps.ver"}, true, ""},
        Candidate{"SupportMissing",
                  "kxe_lpp266_veps_1.tar",
                  {"registry/ptlpp266.ver", "registry/xelpp266.ver"},
                  false,
                  "VEPS support not installed for: kxe"},
        Candidate{"OtherArchitecture",
                  "kxe_lpp266_veps_1.tar",
                  {"registry/ptlpp263.ver", "registry/xevps.ver"},
                  false,
                  ""}),
    LabelOf);

// KEEP(vepd-veps-words)
INSTANTIATE_TEST_SUITE_P(
    DesktopClient, ApplicabilityTest,
    ::testing::Values(
        Candidate{"ItsOwn", "kdk_lpp266_vepd_1.tar", {"registry/dklpp266.ver"}, true, ""},
        Candidate{"ClientMissing", "kdk_lpp266_vepd_1.tar", {"registry/dkvpd.ver"}, false, ""},
        Candidate{
            "Support", "kxe_lpp266_vepd_1.tar", {"registry/dklpp266.ver", "registry/xevpd.ver"}, true, ""},
        Candidate{"SupportMissing",
                  "kxe_lpp266_vepd_1.tar",
                  {"registry/dklpp266.ver"},
                  false,
                  "VEPS support not installed for: kxe"},
        Candidate{"PortalServerIsNotEnough",
                  "kxe_lpp266_vepd_1.tar",
                  {"registry/ptlpp266.ver", "registry/xevpd.ver"},
                  false,
                  ""}),
    LabelOf);

TEST(PlatformTest, IsLinuxOnPower) {
  EXPECT_STREQ(DCFPackageProcessor::getPlatform(), "lpp");
}

class ApplicabilityLookUpTest : public PatchHome {};

TEST_F(ApplicabilityLookUpTest, InstalledCheckComesBeforeTheVersionFile) {
  write(Env, "");
  const File file(write("patches/kqa_lpp266_vems_1.tar", ""));
  logLines();
  EXPECT_FALSE(DCFPackageProcessor::isApplicable(home(), file));
  const std::string env = home() + Env;
  const std::string versionFile = home() + "registry/qalpp266.ver";
  EXPECT_EQ(logLinesOf("utilities.cpp"),
            traces("utilities.cpp",
                   {"Util::pathExists(" + env + ") entry", "Util::pathExists(" + env + ") exit",
                    "Util::pathExists(" + versionFile + ") entry", "Path does not exist: " + versionFile,
                    "Util::pathExists(" + versionFile + ") exit"}));
}

TEST_F(ApplicabilityLookUpTest, InvalidNameIsExplainedByTheNameToo) {
  const File file(write("patches/readme.txt", ""));
  logLines();
  EXPECT_FALSE(DCFPackageProcessor::isApplicable(home(), file));
  EXPECT_EQ(logLinesOf("patchfilename"), traces("patchfilename", {"invalid patch file name: readme.txt"}));
}

} // namespace
