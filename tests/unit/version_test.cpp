// Product levels: what the textual forms mean, and the two families of comparison.
#include "version.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "scratch.h"

namespace {

using Fields = std::vector<std::string>;

Fields fieldsOf(const Version &version) {
  return {version.getVV(), version.getRR(), version.getMM(), version.getFF()};
}

const Fields DefaultLevel = {"06", "10", "00", "00"};

std::string taken(const std::string &text) {
  return "Version string provided: " + text + ".";
}
std::string unrecognized(const std::string &text) {
  return "Unrecognized VVRRMMFF version string format provided: " + text + ". Defaulting to 06100000";
}

struct ParsedText {
  const char *name;
  std::string text;
  Fields fields;
  std::string traced;
};

class VersionTextTest : public ScratchHome, public ::testing::WithParamInterface<ParsedText> {};

TEST_P(VersionTextTest, ConstructorTakesTheFieldsAndTracesHow) {
  const Version version(GetParam().text);
  EXPECT_EQ(fieldsOf(version), GetParam().fields);
  EXPECT_EQ(logLines(), LogLines{trace("version.cpp", GetParam().traced)});
}

TEST_P(VersionTextTest, SetOverwritesAllFieldsAndTracesHow) {
  Version version("99", "98", "97", "96");
  version.set(GetParam().text);
  EXPECT_EQ(fieldsOf(version), GetParam().fields);
  EXPECT_EQ(logLines(), LogLines{trace("version.cpp", GetParam().traced)});
}

INSTANTIATE_TEST_SUITE_P(
    AllForms, VersionTextTest,
    ::testing::Values(
        ParsedText{"SixCharacters",
                   "123456",
                   {"12", "34", "56", "00"},
                   taken("123456") + " Will pad with 00 on the end."},
        ParsedText{"SixCharactersWithDots",
                   "12.4.6",
                   {"12", ".4", ".6", "00"},
                   taken("12.4.6") + " Will pad with 00 on the end."},
        ParsedText{"EightWithDots",
                   "12.34.56",
                   {"12", "34", "56", "00"},
                   taken("12.34.56") + " Will pad ff with 00."},
        ParsedText{"EightOfAnythingWithDots",
                   "ab.cd.ef",
                   {"ab", "cd", "ef", "00"},
                   taken("ab.cd.ef") + " Will pad ff with 00."},
        ParsedText{"Eight", "12345678", {"12", "34", "56", "78"}, taken("12345678")},
        ParsedText{"EightWithOneDotAtItsPlace", "12.45678", {"12", ".4", "56", "78"}, taken("12.45678")},
        ParsedText{"EightWithTheOtherDotAtItsPlace", "12345.78", {"12", "34", "5.", "78"}, taken("12345.78")},
        ParsedText{"EightWithDotsElsewhere",
                   "12.345.6",
                   {"12", ".3", "45", ".6"},
                   taken("12.345.6")}, // KEEP(version-unchecked)
        ParsedText{"EightLetters", "abcdefgh", {"ab", "cd", "ef", "gh"}, taken("abcdefgh")},
        ParsedText{"Eleven", "12.34.56.78", {"12", "34", "56", "78"}, taken("12.34.56.78")},
        ParsedText{"ElevenOfLetters", "ab.cd.ef.gh", {"ab", "cd", "ef", "gh"}, taken("ab.cd.ef.gh")},
        ParsedText{"ElevenOfDots", "...........", {"..", "..", "..", ".."}, taken("...........")},
        ParsedText{"ElevenWithoutDots", "12x34x56x78", DefaultLevel, unrecognized("12x34x56x78")},
        ParsedText{"ElevenWithoutTheFirstDot", "12x34.56.78", DefaultLevel, unrecognized("12x34.56.78")},
        ParsedText{"ElevenWithoutTheSecondDot", "12.34x56.78", DefaultLevel, unrecognized("12.34x56.78")},
        ParsedText{"ElevenWithoutTheThirdDot", "12.34.56x78", DefaultLevel, unrecognized("12.34.56x78")},
        ParsedText{"One", "6", DefaultLevel, unrecognized("6")},
        ParsedText{"Five", "12345", DefaultLevel, unrecognized("12345")},
        ParsedText{"Seven", "1234567", DefaultLevel, unrecognized("1234567")},
        ParsedText{"Nine", "123456789", DefaultLevel, unrecognized("123456789")},
        ParsedText{"Ten", "12.34.56.7", DefaultLevel, unrecognized("12.34.56.7")},
        ParsedText{"Twelve", "12.34.56.789", DefaultLevel, unrecognized("12.34.56.789")},
        ParsedText{"VeryLong", std::string(3000, '9'), DefaultLevel, unrecognized(std::string(3000, '9'))},
        ParsedText{"WithPercentSigns", "%s%n", DefaultLevel, unrecognized("%s%n")},
        ParsedText{"Empty", "", DefaultLevel, "Missing VVRRMMFF version string:  Defaulting to 06100000"}),
    [](const auto &form) { return form.param.name; });

class VersionTest : public ScratchHome {};

TEST_F(VersionTest, DefaultIs06100000WithoutATrace) {
  const Version version;
  EXPECT_EQ(fieldsOf(version), DefaultLevel);
  EXPECT_EQ(version.getVersionString(), "06100000");
  EXPECT_EQ(version.getDottedVersionString(), "06.10.00.00");
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(VersionTest, SixCharactersArePrintedWithAFixLevel) {
  const Version version("123456");
  EXPECT_EQ(version.getVersionString(), "12345600");
  EXPECT_EQ(version.getDottedVersionString(), "12.34.56.00");
}

TEST_F(VersionTest, DottedLevelIsPrintedBothWays) {
  const Version version("12.34.56.78");
  EXPECT_EQ(version.getVersionString(), "12345678");
  EXPECT_EQ(version.getDottedVersionString(), "12.34.56.78");
}

TEST_F(VersionTest, FourPartsAreStoredWithoutATrace) {
  const Version version("06", "22", "01", "09");
  EXPECT_EQ(fieldsOf(version), (Fields{"06", "22", "01", "09"}));
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(VersionTest, ShortPartsAreNotPadded) {
  const Version version("6", "1", "0", "0");
  EXPECT_EQ(version.getVersionString(), "6100");
  EXPECT_EQ(version.getDottedVersionString(), "6.1.0.0");
}

TEST_F(VersionTest, EmptyPartsStayEmpty) {
  const Version version("", "", "", "");
  EXPECT_EQ(fieldsOf(version), (Fields{"", "", "", ""}));
  EXPECT_EQ(version.getDottedVersionString(), "...");
}

TEST_F(VersionTest, LongPartsAreCutAfterTwoCharacters) {
  const Version version("0611", "22x", "000000", "01 ");
  EXPECT_EQ(fieldsOf(version), (Fields{"06", "22", "00", "01"}));
}

TEST_F(VersionTest, CopyHoldsAllFourFieldsAndLivesOnItsOwn) {
  Version original("12345678");
  const Version copy(original);
  original.set("87654321");
  EXPECT_EQ(fieldsOf(copy), (Fields{"12", "34", "56", "78"}));
}

struct ComparedLevels {
  const char *name;
  Version left;
  Version right;
  bool equal;
  int order; ///< of the whole level: -1, 0 or 1
};

class VersionComparisonTest : public ::testing::TestWithParam<ComparedLevels> {};

TEST_P(VersionComparisonTest, EqualityLooksAtThreeFields) {
  const auto &[name, left, right, equal, order] = GetParam();
  EXPECT_EQ(left == right, equal);
  EXPECT_EQ(right == left, equal);
  EXPECT_EQ(left != right, !equal);
  EXPECT_EQ(right != left, !equal);
}

TEST_P(VersionComparisonTest, OrderLooksAtAllFour) {
  const auto &[name, left, right, equal, order] = GetParam();
  EXPECT_EQ(left < right, order < 0);
  EXPECT_EQ(left <= right, order <= 0);
  EXPECT_EQ(left > right, order > 0);
  EXPECT_EQ(left >= right, order >= 0);
}

Version level(const char *vv, const char *rr, const char *mm, const char *ff) {
  return {vv, rr, mm, ff};
}

INSTANTIATE_TEST_SUITE_P(
    Pairs, VersionComparisonTest,
    ::testing::Values(ComparedLevels{"Same", level("06", "10", "00", "00"), level("06", "10", "00", "00"),
                                     true, 0},
                      ComparedLevels{"OlderFixLevelOnly", level("12", "34", "56", "00"),
                                     level("12", "34", "56", "78"), true, -1},
                      ComparedLevels{"NewerFixLevelOnly", level("06", "10", "00", "01"),
                                     level("06", "10", "00", "00"), true, 1},
                      ComparedLevels{"OlderVersion", level("05", "99", "99", "99"),
                                     level("06", "00", "00", "00"), false, -1},
                      ComparedLevels{"NewerRelease", level("06", "20", "00", "00"),
                                     level("06", "10", "99", "99"), false, 1},
                      ComparedLevels{"OlderModification", level("06", "10", "01", "99"),
                                     level("06", "10", "02", "00"), false, -1},
                      ComparedLevels{"LettersAfterDigits", level("06", "1a", "00", "00"),
                                     level("06", "19", "00", "00"), false, 1},
                      ComparedLevels{"BytesAboveAsciiLast", level("06", "10", "00", "\xff"),
                                     level("06", "10", "00", "zz"), true, 1},
                      ComparedLevels{"UnpaddedAgainstPadded", level("6", "1", "0", "0"),
                                     level("06", "10", "00", "00"), false, 1},
                      ComparedLevels{"PrefixOfTheOther", level("06", "10", "00", ""),
                                     level("06", "10", "00", "00"), true, -1},
                      ComparedLevels{"SameDigitsInOtherFields", level("06", "1", "00", "00"),
                                     level("06", "10", "0", "00"), false, 0}),
    [](const auto &pair) { return pair.param.name; });

TEST_F(VersionTest, TheTwoFamiliesDisagreeOnTheFixLevel) {
  EXPECT_TRUE(Version("123456") == Version("12.34.56.78"));
  EXPECT_TRUE(Version("123456") < Version("12.34.56.78"));
  EXPECT_TRUE(Version("06100001") == Version("06100000")); // KEEP(version-equality)
  EXPECT_TRUE(Version("06100001") > Version("06100000"));
}

} // namespace
