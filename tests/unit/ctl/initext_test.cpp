// A descriptor line for line.
#include "lint/initext.h"

#include <gtest/gtest.h>

namespace {

TEST(IniText, LinesAreCountedFromOneWithEmptyOnes) {
  const IniText ini = readIniText("\n# comment\r\n[PreCommands]\n a \n");
  ASSERT_EQ(ini.sections.size(), 1U);
  EXPECT_EQ(ini.sections[0].line, 3U);
  ASSERT_EQ(ini.sections[0].entries.size(), 1U);
  EXPECT_EQ(ini.sections[0].entries[0].line, 4U);
  EXPECT_EQ(ini.sections[0].entries[0].key, "a");
}

TEST(IniText, AnEntryIsCutAtTheFirstEqualsSign) {
  const IniText ini = readIniText("[S]\nkey = a = b\n");
  const IniEntry &entry = ini.sections.at(0).entries.at(0);
  EXPECT_EQ(entry.key, "key");
  EXPECT_EQ(entry.value, "a = b");
  EXPECT_TRUE(entry.isCut);
}

TEST(IniText, TheLastCharacterOfAHeaderIsDropped) {
  const IniText ini = readIniText("[PreReqs\n[PreReqs)\n[\n");
  EXPECT_EQ(ini.sections.at(0).name, "PreReq");
  EXPECT_EQ(ini.sections.at(1).name, "PreReqs");
  EXPECT_EQ(ini.sections.at(2).name, "");
}

TEST(IniText, OfSeveralSectionsTheLastOneCounts) {
  const IniText ini = readIniText("[A]\nx\n[B]\n[A]\ny\n");
  ASSERT_EQ(ini.effectiveSections().size(), 2U);
  EXPECT_EQ(ini.section("A")->entries.at(0).key, "y");
  EXPECT_EQ(ini.section("C"), nullptr);
}

TEST(IniText, NothingBehindANulByteIsRead) {
  const IniText ini = readIniText(std::string("a\n\0[A]\n", 7));
  EXPECT_TRUE(ini.hasNul);
  EXPECT_TRUE(ini.sections.empty());
  ASSERT_EQ(ini.stray.size(), 1U);
  EXPECT_EQ(ini.stray[0].key, "a");
}

} // namespace
