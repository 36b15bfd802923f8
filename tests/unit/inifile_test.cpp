// INI files: what the forgiving syntax makes of a file, and what is said about one that cannot be read.
#include "inifile.h"

#include <map>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "scratch.h"

namespace {

using Names = std::vector<std::string>;
using Entries = std::map<std::string, std::string>;
using Sections = std::map<std::string, Entries>;

LogLine iniTrace(const std::string &message) {
  return trace("inifile.cpp", message);
}
LogLine iniError(const std::string &message) {
  return error("inifile.cpp", message);
}
LogLine utilTrace(const std::string &message) {
  return trace("utilities.cpp", message);
}

const LogLine Parsing = iniTrace("IniFile::parse()");
const LogLine Destroyed = iniTrace("IniFile::~IniFile()");
const LogLine StrayLine = iniError("Properites start before section definition");

Entries entriesOf(const Section &section) {
  Entries entries;
  for (const std::string &key : section.getEntryNames())
    EXPECT_TRUE(section.getEntryValue(key, entries[key])) << key;
  return entries;
}

Sections sectionsOf(const IniFile &ini) {
  Sections sections;
  for (const std::string &name : ini.getSectionNames()) {
    const Section *section = ini.getSection(name);
    EXPECT_EQ(section->getName(), name);
    sections[name] = entriesOf(*section);
  }
  return sections;
}

class IniFileTest : public ScratchHome {
protected:
  std::string path() const { return home() + "patch.ini"; }

  std::unique_ptr<IniFile> parse(const std::string &content) {
    return std::unique_ptr<IniFile>(IniFile::parseFile(write("patch.ini", content), &err_));
  }

  LogLines parseFileTraces(const LogLines &between) {
    return framed(iniTrace("IniFile::parse(" + path() + ") entry"), between,
                  iniTrace("IniFile::parse(" + path() + ") exit"));
  }

  void expectUnreadable(const std::string &reason) {
    const std::string text = "Unable to read file [" + path() + "]: " + reason;
    EXPECT_EQ(err_.code, 5);
    EXPECT_EQ(err_.text, text);
    EXPECT_EQ(logLinesOf("inifile.cpp"),
              parseFileTraces({Parsing, iniError(text), Parsing,
                               iniError("Unable to parse ini file: " + path()), Destroyed}));
  }

  PatchError err_;
};

TEST_F(IniFileTest, SampleFileIsReadIntoItsSections) {
  const auto ini = parse("# Comment line\n #comment line\n[Section1]\ns1k1 = prop1\ns1k2 = prop2\n\n"
                         "[ Section2]\nline1\nline2\nline3\n");
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(ini->getSectionNames(), (Names{"Section1", "Section2"}));
  EXPECT_EQ(sectionsOf(*ini), (Sections{{"Section1", {{"s1k1", "prop1"}, {"s1k2", "prop2"}}},
                                        {"Section2", {{"line1", ""}, {"line2", ""}, {"line3", ""}}}}));
  EXPECT_EQ(err_.code, 0);
  EXPECT_EQ(err_.text, "");
}

TEST_F(IniFileTest, ParsingIsTracedWithEverySection) {
  const auto ini = parse("[One]\na = b\n[ Two ]\n");
  EXPECT_EQ(withoutPointers(logLines()),
            parseFileTraces({Parsing, utilTrace("Util::readFileByLines(" + path() + ") entry"),
                             utilTrace("Util::readFile(" + path() + ") entry"),
                             utilTrace("Util::readFile(" + path() + ")=0(buffer) exit"),
                             utilTrace("Util::readFileByLines(" + path() + ") exit"),
                             iniTrace("Created section: One"), iniTrace("Created section: Two"), Parsing}));
}

struct ParsedFile {
  const char *name;
  std::string content;
  Sections sections;
};

class IniSyntaxTest : public IniFileTest, public ::testing::WithParamInterface<ParsedFile> {};

TEST_P(IniSyntaxTest, FileIsAcceptedSilently) {
  const auto ini = parse(GetParam().content);
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(sectionsOf(*ini), GetParam().sections);
  EXPECT_EQ(err_.code, 0);
  for (const LogLine &line : logLines())
    EXPECT_EQ(line.level, "TRACE") << line;
}

INSTANTIATE_TEST_SUITE_P(
    Headers, IniSyntaxTest,
    ::testing::Values(
        ParsedFile{"EmptyFile", "", {}}, ParsedFile{"OnlyCommentsAndBlanks", "# a\n \t\n\t# b\r\n\n", {}},
        ParsedFile{"BlankLinesBeforeTheFirstHeader", "\n \t \n\r\n[A]\nk=v\n", {{"A", {{"k", "v"}}}}},
        ParsedFile{"EmptySection", "[A]\n[B]\n", {{"A", {}}, {"B", {}}}},
        ParsedFile{"BlanksAroundAndInside", "  [ \t A B \t]\t\r\nk=v", {{"A B", {{"k", "v"}}}}},
        ParsedFile{
            "WithoutItsBracket", "[abc\nk=v\n", {{"ab", {{"k", "v"}}}}}, // KEEP(section-last-character)
        ParsedFile{"TextBehindTheBracket", "[abc] x\n", {{"abc]", {}}}},
        ParsedFile{"CommentBehindTheBracket", "[abc] # x\n", {{"abc] #", {}}}},
        ParsedFile{"EmptyName", "[]\nk=v\n", {{"", {{"k", "v"}}}}},
        ParsedFile{"NameOfBlanks", "[ \t ]\n", {{"", {}}}}, ParsedFile{"OneBracketAlone", "[\n", {{"", {}}}},
        ParsedFile{"TwoCharacters", "[a\n", {{"", {}}}},
        ParsedFile{"EqualSignInTheName", "[a=b]\n", {{"a=b", {}}}},
        ParsedFile{"BracketInTheName", "[[a]]\n", {{"[a]", {}}}},
        ParsedFile{"NamesDifferInCase", "[a]\nk=1\n[A]\nk=2\n", {{"a", {{"k", "1"}}}, {"A", {{"k", "2"}}}}},
        ParsedFile{"RepeatedHeaderDiscardsTheEarlierEntries", // KEEP(section-replaced)
                   "[S]\na=1\nb=2\n[T]\nc=3\n[S]\nd=4\n",
                   {{"S", {{"d", "4"}}}, {"T", {{"c", "3"}}}}},
        ParsedFile{"RepeatedHeaderThatDiffersInBlanksOnly", "[S]\na=1\n[ S ]\n", {{"S", {}}}},
        ParsedFile{"RepeatedHeaderAtOnce", "[S]\na=1\n[S]\n[S]\nb\n", {{"S", {{"b", ""}}}}}),
    [](const auto &file) { return file.param.name; });

INSTANTIATE_TEST_SUITE_P(
    Entries, IniSyntaxTest,
    ::testing::Values(
        ParsedFile{"PlainEntry", "[A]\nkey=value\n", {{"A", {{"key", "value"}}}}},
        ParsedFile{"BlanksAroundKeyAndValue", "[A]\n  key   =   value  \n", {{"A", {{"key", "value"}}}}},
        ParsedFile{"TabsAroundKeyAndValue", "[A]\n\tkey\t=\tvalue\t\r\n", {{"A", {{"key", "value"}}}}},
        ParsedFile{"BlanksInsideStay", "[A]\na key = a  value\n", {{"A", {{"a key", "a  value"}}}}},
        ParsedFile{"EmptyValue", "[A]\nkey =\n", {{"A", {{"key", ""}}}}},
        ParsedFile{"ValueOfBlanks", "[A]\nkey= \t \n", {{"A", {{"key", ""}}}}},
        ParsedFile{
            "LaterEqualSignsBelongToTheValue", "[A]\na=b=c\nd==\n", {{"A", {{"a", "b=c"}, {"d", "="}}}}},
        ParsedFile{"EmptyKey", "[A]\n= x\n", {{"A", {{"", "x"}}}}},
        ParsedFile{"EqualSignAlone", "[A]\n=\n", {{"A", {{"", ""}}}}},
        ParsedFile{"BareLine", "[A]\n./run.sh -a \"b c\"\n", {{"A", {{"./run.sh -a \"b c\"", ""}}}}},
        ParsedFile{"BareLinesCollapse", "[A]\nx\nx\n x \n", {{"A", {{"x", ""}}}}},
        ParsedFile{"RepeatedKeyKeepsTheLastValue", "[A]\nk=1\nk=2\n", {{"A", {{"k", "2"}}}}},
        ParsedFile{"BareLineEmptiesAnEarlierEntry", "[A]\nk=1\nk\n", {{"A", {{"k", ""}}}}},
        ParsedFile{"KeysDifferInCase", "[A]\nk=1\nK=2\n", {{"A", {{"k", "1"}, {"K", "2"}}}}},
        ParsedFile{
            "NumberSignInsideIsText", "[A]\nkey = a # b\nx#y\n", {{"A", {{"key", "a # b"}, {"x#y", ""}}}}},
        ParsedFile{"CommentsBetweenEntries", "[A]\n#a=1\n  # b=2\n\t#c\nd=4\n", {{"A", {{"d", "4"}}}}},
        ParsedFile{"SemicolonIsNoComment", "[A]\n; x = 1\n", {{"A", {{"; x", "1"}}}}},
        ParsedFile{"QuotesAndBackslashesAreText", "[A]\nk = \"v\\\n", {{"A", {{"k", "\"v\\"}}}}},
        ParsedFile{"BracketInsideIsText", "[A]\nk=[x]\nx[y]\n", {{"A", {{"k", "[x]"}, {"x[y]", ""}}}}},
        ParsedFile{"OtherWhiteSpaceIsText", "[A]\n\fk\f=\vv\v\n", {{"A", {{"\fk\f", "\vv\v"}}}}},
        ParsedFile{
            "LineEndsOfBothKinds", "[A]\r\na=1\r\nb=2\nc=3", {{"A", {{"a", "1"}, {"b", "2"}, {"c", "3"}}}}},
        ParsedFile{"PercentSigns", "[%s]\n%n=%d\n", {{"%s", {{"%n", "%d"}}}}},
        ParsedFile{"NothingAfterANul", std::string("[A]\na=1\n\0b=2\n", 13), {{"A", {{"a", "1"}}}}}),
    [](const auto &file) { return file.param.name; });

TEST_F(IniFileTest, NamesComeBackSortedByTheirBytes) {
  const auto ini = parse("[zz]\n[a]\n[Z]\n[\xe4]\n[10]\n[9]\n");
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(ini->getSectionNames(), (Names{"10", "9", "Z", "a", "zz", "\xe4"})); // KEEP(sorted-names)
}

TEST_F(IniFileTest, EntryNamesComeBackSortedByTheirBytes) {
  const auto ini = parse("[A]\nzz.sh\naa.sh\nZ\n2\n10\n");
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(ini->getSection("A")->getEntryNames(), (Names{"10", "2", "Z", "aa.sh", "zz.sh"}));
}

TEST_F(IniFileTest, LookUpsAreCaseSensitiveAndExact) {
  const auto ini = parse("[ProductInfo]\nproductCode = kox\n");
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(ini->getSection("productinfo"), nullptr);
  EXPECT_EQ(ini->getSection(" ProductInfo"), nullptr);
  EXPECT_EQ(ini->getSection(""), nullptr);
  const Section *section = ini->getSection("ProductInfo");
  ASSERT_NE(section, nullptr);
  std::string value = "untouched";
  EXPECT_FALSE(section->getEntryValue("productcode", value));
  EXPECT_FALSE(section->getEntryValue("productCode ", value));
  EXPECT_EQ(value, "untouched");
  EXPECT_TRUE(section->getEntryValue("productCode", value));
  EXPECT_EQ(value, "kox");
}

TEST_F(IniFileTest, StrayLineLeavesCode4InARecordOfASuccess) {
  const auto ini = parse("x = 1\n[A]\nk=v\n");
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(sectionsOf(*ini), (Sections{{"A", {{"k", "v"}}}}));
  EXPECT_EQ(err_.code, 4); // KEEP(stray-entry)
  EXPECT_EQ(err_.text, "Properites start before section definition");
  EXPECT_EQ(logLinesOf("inifile.cpp"),
            parseFileTraces({Parsing, StrayLine, iniTrace("Created section: A"), Parsing}));
}

TEST_F(IniFileTest, EachStrayLineIsLogged) {
  const auto ini = parse("x\n\n# comment\ny = 2\n]\n");
  ASSERT_NE(ini, nullptr);
  EXPECT_EQ(sectionsOf(*ini), Sections{});
  EXPECT_EQ(logLinesOf("inifile.cpp"), parseFileTraces({Parsing, StrayLine, StrayLine, StrayLine, Parsing}));
}

TEST_F(IniFileTest, StrayLineReplacesAnEarlierErrorInTheRecord) {
  err_.code = 25;
  err_.text = "earlier";
  EXPECT_NE(parse("stray\n"), nullptr);
  EXPECT_EQ(err_.code, 4);
  EXPECT_EQ(err_.text, "Properites start before section definition");
}

TEST_F(IniFileTest, SuccessLeavesTheRecordAlone) {
  err_.code = 25;
  err_.text = "earlier";
  EXPECT_NE(parse("[A]\n"), nullptr);
  EXPECT_EQ(err_.code, 25);
  EXPECT_EQ(err_.text, "earlier");
}

TEST_F(IniFileTest, MissingFileCannotBeRead) {
  EXPECT_EQ(IniFile::parseFile(path(), &err_), nullptr);
  expectUnreadable("No such file or directory");
}

TEST_F(IniFileTest, DirectoryCannotBeRead) {
  makeDirectory("patch.ini");
  EXPECT_EQ(IniFile::parseFile(path(), &err_), nullptr);
  expectUnreadable("Invalid argument");
}

TEST_F(IniFileTest, PipeCannotBeReadAndIsNotWaitedFor) {
  ASSERT_EQ(mkfifo(path().c_str(), 0600), 0);
  EXPECT_EQ(IniFile::parseFile(path(), &err_), nullptr);
  expectUnreadable("Invalid argument");
}

TEST_F(IniFileTest, PathBelowAFileCannotBeRead) {
  IniFile ini(write("file", "") + "/patch.ini");
  EXPECT_FALSE(ini.parse(&err_));
  EXPECT_EQ(err_.code, 5);
  EXPECT_EQ(err_.text, "Unable to read file [" + home() + "file/patch.ini]: Not a directory");
}

TEST_F(IniFileTest, NullRecordIsLeftOut) {
  EXPECT_EQ(IniFile::parseFile(path(), nullptr), nullptr);
  write("patch.ini", "stray\n[A]\n");
  logLines();
  const std::unique_ptr<IniFile> ini(IniFile::parseFile(path(), nullptr));
  EXPECT_NE(ini, nullptr);
  EXPECT_EQ(logLinesOf("inifile.cpp"),
            parseFileTraces({Parsing, StrayLine, iniTrace("Created section: A"), Parsing}));
}

TEST_F(IniFileTest, NothingIsReadBeforeParse) {
  const IniFile ini(home() + "gone");
  EXPECT_EQ(ini.getSectionNames(), Names{});
  EXPECT_EQ(ini.getSection("A"), nullptr);
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(IniFileTest, ParseOfAnObjectTracesItsTwoLines) {
  IniFile ini(write("patch.ini", "[A]\n"));
  EXPECT_TRUE(ini.parse(&err_));
  EXPECT_EQ(logLinesOf("inifile.cpp"), (LogLines{Parsing, iniTrace("Created section: A"), Parsing}));
}

TEST_F(IniFileTest, ParseOfAnUnreadableObjectTracesItsSecondLineToo) {
  IniFile ini(path());
  EXPECT_FALSE(ini.parse(&err_));
  EXPECT_EQ(logLinesOf("inifile.cpp"),
            (LogLines{Parsing, iniError("Unable to read file [" + path() + "]: No such file or directory"),
                      Parsing}));
}

TEST_F(IniFileTest, DestructionIsTraced) {
  auto ini = parse("[A]\nk=v\n");
  logLines();
  ini.reset();
  EXPECT_EQ(logLines(), LogLines{Destroyed});
}

TEST_F(IniFileTest, CopyHasSectionsOfItsOwn) {
  auto original = parse("[A]\nk=v\n[B]\nline\n");
  ASSERT_NE(original, nullptr);
  const IniFile copy(*original);
  EXPECT_NE(copy.getSection("A"), original->getSection("A"));
  copy.getSection("A")->writeEntry("k", "changed");
  EXPECT_EQ(entriesOf(*original->getSection("A")), (Entries{{"k", "v"}}));
  original.reset();
  EXPECT_EQ(sectionsOf(copy), (Sections{{"A", {{"k", "changed"}}}, {"B", {{"line", ""}}}}));
}

TEST_F(IniFileTest, CopyReadsTheSameFile) {
  const IniFile original(write("patch.ini", "[A]\n"));
  IniFile copy(original);
  EXPECT_TRUE(copy.parse(nullptr));
  EXPECT_EQ(copy.getSectionNames(), Names{"A"});
}

TEST_F(IniFileTest, FileIsNeverWritten) {
  const auto ini = parse("[A]\nk=v\n");
  ini->getSection("A")->writeEntry("k", "changed");
  EXPECT_EQ(read(path()), "[A]\nk=v\n");
}

TEST(SectionTest, NewSectionHasItsNameAndNoEntries) {
  const Section section("Name");
  EXPECT_EQ(section.getName(), "Name");
  EXPECT_EQ(section.getEntryNames(), Names{});
}

TEST(SectionTest, EntryIsAddedThenOverwritten) {
  Section section("S");
  section.writeEntry("k", "1");
  section.writeEntry("k", "2");
  section.writeEntry("", "empty key");
  EXPECT_EQ(entriesOf(section), (Entries{{"k", "2"}, {"", "empty key"}}));
}

TEST(SectionTest, MissingEntryLeavesTheValueUntouched) {
  const Section section("S");
  std::string value = "untouched";
  EXPECT_FALSE(section.getEntryValue("k", value));
  EXPECT_EQ(value, "untouched");
}

TEST(SectionTest, FoundEntryReplacesTheValue) {
  Section section("S");
  section.writeEntry("k", "");
  std::string value = "replaced";
  EXPECT_TRUE(section.getEntryValue("k", value));
  EXPECT_EQ(value, "");
}

TEST(SectionTest, CopyHasItsOwnNameAndEntries) {
  Section original("S");
  original.writeEntry("k", "v");
  Section copy(original);
  copy.writeEntry("k", "changed");
  EXPECT_EQ(copy.getName(), "S");
  EXPECT_EQ(entriesOf(original), (Entries{{"k", "v"}}));
}

} // namespace
