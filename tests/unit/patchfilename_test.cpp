// Names of patch files: the grammar, what is taken from a name, and why a name is refused.
#include "patchfilename.h"

#include <string>

#include <gtest/gtest.h>

#include "fakehome.h"

namespace {

class PatchFileNameTest : public FakeHome {};

struct GoodName {
  const char *text;
  const char *product;
  const char *fullPlatform;
  const char *platform;
  const char *target;
  const char *fixPack;
};

class GoodNameTest : public FakeHome, public ::testing::WithParamInterface<GoodName> {};

TEST_P(GoodNameTest, IsSplitIntoItsParts) {
  const GoodName &expected = GetParam();
  const PatchFileName name(expected.text);
  EXPECT_TRUE(name.isValid());
  EXPECT_EQ(name.getProduct(), expected.product);
  EXPECT_EQ(name.getFullPlatform(), expected.fullPlatform);
  EXPECT_EQ(name.getPlatform(), expected.platform);
  EXPECT_EQ(name.getTarget(), expected.target);
  EXPECT_EQ(name.getFixPackName(), expected.fixPack);
  EXPECT_EQ(logLines(), LogLines{});
}

/// Same name for every platform: what differs is the family.
constexpr GoodName platform(const char *text, const char *full, const char *family) {
  return {text, "kxe", full, family, "vema", "fp0001"};
}

// KEEP(lia-is-li)
INSTANTIATE_TEST_SUITE_P(Platforms, GoodNameTest,
                         ::testing::Values(platform("kxe_li6243_vema_fp0001.tar", "li6243", "li"),
                                           platform("kxe_li_vema_fp0001.tar", "li", "li"),
                                           platform("kxe_ls3266_vema_fp0001.tar", "ls3266", "ls"),
                                           platform("kxe_lia266_vema_fp0001.tar", "lia266", "li"),
                                           platform("kxe_lx8266_vema_fp0001.tar", "lx8266", "lx"),
                                           platform("kxe_lpp266_vema_fp0001.tar", "lpp266", "lpp"),
                                           platform("kxe_aix526_vema_fp0001.tar", "aix526", "aix"),
                                           platform("kxe_hp11_vema_fp0001.tar", "hp11", "hp"),
                                           platform("kxe_sol286_vema_fp0001.tar", "sol286", "sol"),
                                           platform("kxe_winnt_vema_fp0001.cab", "winnt", "winnt"),
                                           platform("kxe_winnt64_vema_fp0001.tar", "winnt64", "winnt64"),
                                           platform("kxe_unix_vema_fp0001.tar", "unix", "unix"),
                                           platform("kxe_unixes_vema_fp0001.tar", "unixes", "unixes")));

INSTANTIATE_TEST_SUITE_P(
    Targets, GoodNameTest,
    ::testing::Values(GoodName{"kxe_unix_vems_fp0002.tar", "kxe", "unix", "unix", "vems", "fp0002"},
                      GoodName{"kpt_lpp266_veps_1.tar", "kpt", "lpp266", "lpp", "veps", "1"},
                      GoodName{"kdk_lpp266_vepd_1.tar", "kdk", "lpp266", "lpp", "vepd", "1"},
                      GoodName{"kzt_lpp266_vecm_1.tar", "kzt", "lpp266", "lpp", "vecm", "1"}));

INSTANTIATE_TEST_SUITE_P(
    UncheckedParts, GoodNameTest,
    ::testing::Values(GoodName{"kxe_li6243_vema_fp.0001.tar", "kxe", "li6243", "li", "vema", "fp"},
                      GoodName{"kxe_li6243_vema_.tar", "kxe", "li6243", "li", "vema", ""},
                      GoodName{"kxe_li6243_vema_fp0001.", "kxe", "li6243", "li", "vema", "fp0001"},
                      GoodName{"KXE_li6243_vema_fp0001.tar", "KXE", "li6243", "li", "vema", "fp0001"},
                      GoodName{"123_li6243_vema_fp0001.tar", "123", "li6243", "li", "vema", "fp0001"},
                      GoodName{"_kxe__li6243_vema_fp0001.tar_", "kxe", "li6243", "li", "vema", "fp0001"}));

struct BadName {
  const char *text;
  const char *reason;
  const char *product;
  const char *fullPlatform;
  const char *platform;
  const char *target;
};

class BadNameTest : public FakeHome, public ::testing::WithParamInterface<BadName> {};

TEST_P(BadNameTest, IsRefusedWithOneTraceAndKeepsWhatWasReached) {
  const BadName &expected = GetParam();
  const PatchFileName name(expected.text);
  EXPECT_FALSE(name.isValid());
  EXPECT_EQ(logLines(), LogLines{trace("patchfilename", expected.reason)});
  EXPECT_EQ(name.getProduct(), expected.product);
  EXPECT_EQ(name.getFullPlatform(), expected.fullPlatform);
  EXPECT_EQ(name.getPlatform(), expected.platform);
  EXPECT_EQ(name.getTarget(), expected.target);
  EXPECT_EQ(name.getFixPackName(), "");
}

INSTANTIATE_TEST_SUITE_P(
    NumberOfParts, BadNameTest,
    ::testing::Values(BadName{"", "invalid patch file name: ", "", "", "", ""},
                      BadName{"readme.txt", "invalid patch file name: readme.txt", "", "", "", ""},
                      BadName{"kxe_li6243_fp0001.tar", "invalid patch file name: kxe_li6243_fp0001.tar", "",
                              "", "", ""},
                      BadName{"kxe_li_6243_vema_fp0001.tar",
                              "invalid patch file name: kxe_li_6243_vema_fp0001.tar", "", "", "", ""}));

INSTANTIATE_TEST_SUITE_P(Product, BadNameTest,
                         ::testing::Values(BadName{"kx_li6243_vema_fp0001.tar",
                                                   "invalid product in patch file name: kx", "", "", "", ""},
                                           BadName{"kxee_li6243_vema_fp0001.tar",
                                                   "invalid product in patch file name: kxee", "", "", "",
                                                   ""}));

INSTANTIATE_TEST_SUITE_P(
    Platform, BadNameTest,
    ::testing::Values(
        BadName{"kxe_ia64_vema_fp0001.tar", "invalid platform architecture in patch file name: ia64", "kxe",
                "ia64", "ia64", ""},
        BadName{"kxe_xlpp266_vema_fp0001.tar", "invalid platform architecture in patch file name: xlpp266",
                "kxe", "xlpp266", "xlpp266", ""},
        BadName{"KXE_LI6243_VEMA_FP0001.TAR", "invalid platform architecture in patch file name: LI6243",
                "KXE", "LI6243", "LI6243", ""}));

INSTANTIATE_TEST_SUITE_P(Target, BadNameTest,
                         ::testing::Values(BadName{"kxe_li6243_vemx_fp0001.tar", "Invalid target: vemx",
                                                   "kxe", "li6243", "li", "vemx"},
                                           BadName{"kxe_li6243_VEMA_fp0001.tar", "Invalid target: VEMA",
                                                   "kxe", "li6243", "li", "VEMA"},
                                           BadName{"kxe_li6243_vemas_fp0001.tar", "Invalid target: vemas",
                                                   "kxe", "li6243", "li", "vemas"}));

INSTANTIATE_TEST_SUITE_P(FixPack, BadNameTest,
                         ::testing::Values(BadName{"kxe_li6243_vema_fp0001",
                                                   "invalid fixpack level in patch file name: fp0001", "kxe",
                                                   "li6243", "li", "vema"}));

TEST_F(PatchFileNameTest, CopyHoldsAllFields) {
  const PatchFileName original("kxe_lpp266_vema_fp0001.tar");
  const PatchFileName copy(original);
  EXPECT_TRUE(copy.isValid());
  EXPECT_EQ(copy.getProduct(), "kxe");
  EXPECT_EQ(copy.getFullPlatform(), "lpp266");
  EXPECT_EQ(copy.getPlatform(), "lpp");
  EXPECT_EQ(copy.getTarget(), "vema");
  EXPECT_EQ(copy.getFixPackName(), "fp0001");
  EXPECT_FALSE(PatchFileName(PatchFileName("readme.txt")).isValid());
}

TEST_F(PatchFileNameTest, PercentSignsInANameAreJustText) {
  EXPECT_FALSE(PatchFileName("%s%n%d").isValid());
  EXPECT_EQ(logLines(), LogLines{trace("patchfilename", "invalid patch file name: %s%n%d")});
}

} // namespace
