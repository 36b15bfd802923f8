// patch.ini: what is required, how each section is normalised, and what a faulty one reports.
#include "patchdescriptor.h"

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "fakehome.h"

namespace {

using Names = std::vector<std::string>;

const std::string Minimal = "[ProductInfo]\nproductCode = kxe\npatchName = p\npatchDescriptiveName = d\n"
                            "productVer = 06\nproductRel = 20\nproductMod = 00\nproductLvl = 01\n";
const std::string Parsing = "PatchDescriptor::parse entry";
const std::string Building = "PatchDescriptor::buildInfoSectionentry";
const std::string NoArch = "skipping optional property productBinArch";
const std::string NoExe = "skipping optional property productEXE";

LogLines own(const std::vector<std::string> &messages) {
  return traces("patchdescriptor.cpp", messages);
}

/// The traces of the optional sections when none is there; PrePatchCommands goes by the name of PreCommands.
const LogLines NoOptionalSection =
    own({"No PreReqs section found", "No Dependents section found", "No PreCommands section found",
         "No PreCommands section found", "No PostCommands section found"});

Section sectionOf(const std::string &name, const std::vector<Names> &entries) {
  Section section(name);
  for (const Names &entry : entries)
    section.writeEntry(entry.at(0), entry.size() > 1 ? entry[1] : "");
  return section;
}

class DescriptorTest : public FakeHome {
public:
  using Descriptor = std::unique_ptr<PatchDescriptor>;

  Descriptor parse(const std::string &text, PatchError *err = nullptr) {
    return Descriptor(PatchDescriptor::parseFile(write("patch.ini", text), err));
  }
  /// A descriptor that must be accepted.
  Descriptor accepted(const std::string &text) {
    PatchError err;
    Descriptor descriptor = parse(text, &err);
    EXPECT_NE(descriptor, nullptr) << text;
    EXPECT_EQ(recordOf(err), NoError);
    return descriptor;
  }
  /// The text less the line of one key.
  static std::string without(const std::string &key) {
    const std::size_t start = Minimal.find("\n" + key + " ") + 1;
    return Minimal.substr(0, start) + Minimal.substr(Minimal.find('\n', start) + 1);
  }
  /// Code and text of the record that parsing leaves.
  Record recordAfter(const std::string &text) {
    PatchError err{99, "earlier"};
    EXPECT_EQ(parse(text, &err), nullptr);
    return recordOf(err);
  }
  LogLines ownLines() { return logLinesOf("patchdescriptor.cpp"); }
};

TEST_F(DescriptorTest, MinimalDescriptorIsValid) {
  const Descriptor descriptor = accepted(Minimal);
  EXPECT_EQ(descriptor->getProductCode(), "kxe");
  EXPECT_EQ(descriptor->getPatchName(), "p");
  EXPECT_EQ(descriptor->getPatchDescriptiveName(), "d");
  EXPECT_EQ(descriptor->getVersion()->getDottedVersionString(), "06.20.00.01");
  EXPECT_EQ(descriptor->getProductEXE(), "");
  for (const Names &list :
       {descriptor->getArch(), descriptor->getPrereqs(), descriptor->getDependents(),
        descriptor->getPrePatchCommands(), descriptor->getPreCommands(), descriptor->getPostCommands()})
    EXPECT_EQ(list, Names{});
}

TEST_F(DescriptorTest, FullDescriptorIsTakenWhateverTheOrderOfItsSections) {
  const Descriptor descriptor =
      accepted("[PostCommands]\npost\n[PreCommands]\npre\n[PrePatchCommands]\nprepatch\n[Dependents]\nox\n"
               "[PreReqs]\nox = 061000\n" +
               Minimal + "productBinArch = li6243\nproductEXE = agent.bin\n");
  EXPECT_EQ(descriptor->getArch(), Names{"li6243"});
  EXPECT_EQ(descriptor->getProductEXE(), "agent.bin");
  EXPECT_EQ(descriptor->getPrereqs(), Names{"kox"});
  EXPECT_EQ(descriptor->getDependents(), Names{"kox"});
  EXPECT_EQ(descriptor->getPrePatchCommands(), Names{"prepatch"});
  EXPECT_EQ(descriptor->getPreCommands(), Names{"pre"});
  EXPECT_EQ(descriptor->getPostCommands(), Names{"post"});
}

// KEEP(prepatch-missing-name)
TEST_F(DescriptorTest, MinimalDescriptorIsTracedFromEndToEnd) {
  const std::string path = home() + "patch.ini";
  accepted(Minimal);
  EXPECT_EQ(ownLines(),
            joined({own({"PatchDescriptor::parseFile(" + path + ") entry", Parsing, Building, NoArch, NoExe,
                         "PatchDescriptor::buildInfoSection = 1"}),
                    NoOptionalSection,
                    own({"PatchDescriptor::parse = 1", "PatchDescriptor::parseFile(" + path + ") exit",
                         "PatchDescriptor::~PatchDescriptor entry"})}));
}

TEST_F(DescriptorTest, FullDescriptorIsTracedFromEndToEnd) {
  const std::string path = home() + "patch.ini";
  const Descriptor kept =
      accepted("[PostCommands]\npost\n[PreCommands]\npre\n[PrePatchCommands]\nprepatch\n[Dependents]\nox\n"
               "kxe\n[PreReqs]\nox = 061000\nkqa = 1\n" +
               Minimal + "productBinArch = li6243\nproductEXE = agent.bin\n");
  EXPECT_EQ(
      ownLines(),
      own({"PatchDescriptor::parseFile(" + path + ") entry", Parsing, Building,
           "PatchDescriptor::buildInfoSection = 1", "PatchDescriptor::buildPreReqsSectionentry",
           "2 letter pre-req, prepending a 'k'", "PatchDescriptor::buildPreReqsSection = 1",
           "PatchDescriptor::buildDependentsSectionentry",
           "read a two-letter dependent, prepending 'k' to it", "PatchDescriptor::buildDependentsSection = 1",
           "PatchDescriptor::buildPrePatchCmdsSectionentry", "PatchDescriptor::buildPrePatchCmdsSection = 1",
           "PatchDescriptor::buildPreCmdsSectionentry", "PatchDescriptor::buildPreCmdsSection = 1",
           "PatchDescriptor::buildPostCmdsSection entry", "PatchDescriptor::buildPostCmdsSection = 1",
           "PatchDescriptor::parse = 1", "PatchDescriptor::parseFile(" + path + ") exit"}));
}

TEST_F(DescriptorTest, UnreadableFileIsReportedByTheLayerBelow) {
  const std::string path = home() + "missing.ini";
  const LogLines lines = expectFailure(
      "patchdescriptor.cpp", {5, "Unable to read file [" + path + "]: No such file or directory"},
      [&](PatchError *err) { return PatchDescriptor::parseFile(path, err) != nullptr; });
  EXPECT_EQ(lines, own({"PatchDescriptor::parseFile(" + path + ") entry"}));
}

TEST_F(DescriptorTest, MissingProductInfoIsCode6AndLoggedAsAParseErrorOnly) {
  const std::string path = write("patch.ini", "[PreReqs]\nox = 061000\n");
  const LogLines lines =
      expectFailure("patchdescriptor.cpp", {6, "Missing required section: ProductInfo"},
                    [&](PatchError *err) { return PatchDescriptor::parseFile(path, err) != nullptr; });
  EXPECT_EQ(
      lines,
      joined({own({"PatchDescriptor::parseFile(" + path + ") entry", Parsing, "PatchDescriptor::parse = 0"}),
              {error("patchdescriptor.cpp", "Error parsing patch file")},
              own({"PatchDescriptor::~PatchDescriptor entry",
                   "PatchDescriptor::parseFile(" + path + ") exit"})}));
}

TEST_F(DescriptorTest, SectionsAndKeysAreFoundInTheirOwnCaseOnly) {
  EXPECT_EQ(recordAfter("[productinfo]\nproductCode = kxe\n").first, 6);
  EXPECT_EQ(recordAfter(without("patchName") + "patchname = p\nproductBinArch = a\nproductEXE = e\n"),
            Record(7, "Missing required property: patchName"));
}

class RequiredKeyTest : public DescriptorTest, public ::testing::WithParamInterface<const char *> {};

TEST_P(RequiredKeyTest, MissingKeyIsCode7) {
  const std::string key = GetParam();
  const std::string optional = "productBinArch = li6243\nproductEXE = agent.bin\n";
  EXPECT_EQ(recordAfter(without(key) + optional), Record(7, "Missing required property: " + key));
}

TEST_P(RequiredKeyTest, MissingKeyWithoutARecordIsAFailureToo) {
  EXPECT_EQ(parse(without(GetParam())), nullptr);
}

// KEEP(no-section-after-failure)
TEST_P(RequiredKeyTest, SectionsThatAreThereAreThenTracedAsMissing) {
  parse("[PreReqs]\nox = 1\n[Dependents]\nox\n[PrePatchCommands]\na\n[PreCommands]\nb\n[PostCommands]\nc\n" +
        without(GetParam()));
  const std::string path = home() + "patch.ini";
  EXPECT_EQ(ownLines(), joined({own({"PatchDescriptor::parseFile(" + path + ") entry", Parsing, Building,
                                     NoArch, NoExe, "PatchDescriptor::buildInfoSection = 0"}),
                                NoOptionalSection,
                                own({"PatchDescriptor::parse = 0"}),
                                {error("patchdescriptor.cpp", "Error parsing patch file")},
                                own({"PatchDescriptor::~PatchDescriptor entry",
                                     "PatchDescriptor::parseFile(" + path + ") exit"})}));
}

INSTANTIATE_TEST_SUITE_P(Keys, RequiredKeyTest,
                         ::testing::Values("productCode", "patchName", "patchDescriptiveName", "productVer",
                                           "productRel", "productMod", "productLvl"));

// KEEP(optional-hides-cause)
TEST_F(DescriptorTest, OptionalKeyThatIsMissingTooHidesTheCause) {
  EXPECT_EQ(recordAfter(without("patchName")), Record(7, "Missing required property: productEXE"));
  EXPECT_EQ(recordAfter(without("patchName") + "productEXE = e\n"),
            Record(7, "Missing required property: productBinArch"));
}

TEST_F(DescriptorTest, RecordNamesTheLastMissingKey) {
  EXPECT_EQ(recordAfter("[ProductInfo]\nproductCode = kxe\nproductVer = 06\nproductBinArch = a\n"
                        "productEXE = e\n"),
            Record(7, "Missing required property: productLvl"));
}

TEST_F(DescriptorTest, MissingOptionalKeysClearARecordOfBefore) {
  PatchError err{4, "of a line before the first section"};
  const Section info = [this] {
    std::unique_ptr<IniFile> ini(IniFile::parseFile(write("patch.ini", Minimal), nullptr));
    return Section(*ini->getSection("ProductInfo"));
  }();
  PatchDescriptor descriptor;
  EXPECT_TRUE(descriptor.buildInfoSection(&info, &err));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_TRUE(descriptor.buildInfoSection(&info, nullptr));
}

TEST_F(DescriptorTest, CodeOfAStrayLineStaysOnlyWhenBothOptionalKeysAreThere) {
  const std::string stray = "x = 1\n" + Minimal;
  accepted(stray);
  accepted(stray + "productBinArch = a\n");
  PatchError err;
  EXPECT_NE(parse(stray + "productBinArch = a\nproductEXE = e\n", &err), nullptr);
  EXPECT_EQ(recordOf(err), Record(4, "Properites start before section definition"));
}

struct NormalisedCode {
  const char *written;
  const char *stored;
};

class DescriptorCodeTest : public DescriptorTest, public ::testing::WithParamInterface<NormalisedCode> {};

TEST_P(DescriptorCodeTest, IsLowerCasedAndOfTwoLettersGetsItsK) {
  const NormalisedCode &code = GetParam();
  const Descriptor descriptor =
      accepted(without("productCode") + "productCode = " + std::string(code.written) + "\n");
  EXPECT_EQ(descriptor->getProductCode(), code.stored);
  const LogLine prepended = trace("patchdescriptor.cpp", "2 letter product code, prepending the letter k, "
                                                         "result: " +
                                                             std::string(code.stored));
  EXPECT_EQ(ownLines()[3] == prepended, std::string(code.written).size() == 2);
}

INSTANTIATE_TEST_SUITE_P(Codes, DescriptorCodeTest,
                         ::testing::Values(NormalisedCode{"QA", "kqa"}, NormalisedCode{"qa", "kqa"},
                                           NormalisedCode{"kqa", "kqa"}, NormalisedCode{"Abc", "abc"},
                                           NormalisedCode{"x", "x"}, NormalisedCode{"KXEE", "kxee"}));

TEST_F(DescriptorTest, LevelFieldsHoldAtMostTwoCharactersAndAreNotPadded) {
  const Descriptor descriptor =
      accepted("[ProductInfo]\nproductCode = kxe\npatchName = p\npatchDescriptiveName = d\nproductVer = 6\n"
               "productRel = 123\nproductMod = x\nproductLvl =\n");
  EXPECT_EQ(descriptor->getVersion()->getDottedVersionString(), "6.12.x.");
}

TEST_F(DescriptorTest, ArchitecturesAreSplitAtCommasAndBlanks) {
  EXPECT_EQ(accepted(Minimal + "productBinArch = li6243, aix526\n")->getArch(), (Names{"li6243", "aix526"}));
  EXPECT_EQ(accepted(Minimal + "productBinArch = li6243,,aix526\n")->getArch(), (Names{"li6243", "aix526"}));
  EXPECT_EQ(accepted(Minimal + "productBinArch = , ,\n")->getArch(), Names{});
  EXPECT_EQ(accepted(Minimal + "productBinArch =\n")->getArch(), Names{});
}

TEST_F(DescriptorTest, PrerequisitesAreNormalisedAndParsedWhenAskedFor) {
  const Descriptor descriptor =
      accepted(Minimal + "[PreReqs]\nOX = 061000\nKQA = 06.20.00.05\nkHV = unknown\nbn =\n");
  EXPECT_EQ(descriptor->getPrereqs(), (Names{"kbn", "khv", "kox", "kqa"}));
  Version level("99", "99", "99", "99");
  EXPECT_TRUE(descriptor->getPrereqVersion("kox", level));
  EXPECT_EQ(level.getDottedVersionString(), "06.10.00.00");
  EXPECT_TRUE(descriptor->getPrereqVersion("kqa", level));
  EXPECT_EQ(level.getDottedVersionString(), "06.20.00.05");
  for (const char *withoutLevel : {"khv", "kbn"}) {
    level.set("99999999");
    EXPECT_TRUE(descriptor->getPrereqVersion(withoutLevel, level));
    EXPECT_EQ(level.getDottedVersionString(), "06.10.00.00");
  }
}

TEST_F(DescriptorTest, PrerequisiteIsLookedUpInItsNormalisedFormOnly) {
  const Descriptor descriptor = accepted(Minimal + "[PreReqs]\nOX = 061000\n");
  Version level("99", "98", "97", "96");
  EXPECT_FALSE(descriptor->getPrereqVersion("ox", level));
  EXPECT_FALSE(descriptor->getPrereqVersion("KOX", level));
  EXPECT_FALSE(descriptor->getPrereqVersion("", level));
  EXPECT_EQ(level.getVersionString(), "99989796");
}

TEST_F(DescriptorTest, LaterPrerequisiteOfTheSameCodeWins) {
  const Descriptor descriptor = accepted(Minimal + "[PreReqs]\nox = 063000\nOX = 061000\nkox = 062000\n");
  EXPECT_EQ(descriptor->getPrereqs(), Names{"kox"});
  Version level;
  EXPECT_TRUE(descriptor->getPrereqVersion("kox", level)); // in byte-wise order: OX, kox, ox
  EXPECT_EQ(level.getVersionString(), "06300000");
}

TEST_F(DescriptorTest, DependentsAreSortedAsWrittenAndThenNormalised) {
  EXPECT_EQ(accepted(Minimal + "[Dependents]\nxe = ignored\nKOX\nALL\nkqa\n")->getDependents(),
            (Names{"all", "kox", "kqa", "kxe"}));
  EXPECT_EQ(accepted(Minimal + "[Dependents]\nox\nOX\n")->getDependents(), (Names{"kox", "kox"}));
}

TEST_F(DescriptorTest, CommandsAreSortedKeptAsWrittenAndCutAtTheirEqualSign) {
  for (const char *section : {"PrePatchCommands", "PreCommands", "PostCommands"}) {
    const Descriptor descriptor =
        accepted(Minimal + "[" + section + "]\nb.sh\na.sh arg\nB.sh\nrun.sh x=1\nb.sh\nb.sh = again\nqa\n");
    const Names commands = {"B.sh", "a.sh arg", "b.sh", "qa", "run.sh x"};
    const std::string name = section;
    EXPECT_EQ(descriptor->getPrePatchCommands(), name == "PrePatchCommands" ? commands : Names{});
    EXPECT_EQ(descriptor->getPreCommands(), name == "PreCommands" ? commands : Names{});
    EXPECT_EQ(descriptor->getPostCommands(), name == "PostCommands" ? commands : Names{});
  }
}

TEST_F(DescriptorTest, EachSectionHasABuilderOfItsOwn) {
  PatchDescriptor descriptor;
  PatchError err;
  const Section bare = sectionOf("any", {{"ox", "061000"}});
  EXPECT_TRUE(descriptor.buildPreReqsSection(&bare, &err));
  EXPECT_TRUE(descriptor.buildDependentsSection(&bare, nullptr));
  EXPECT_TRUE(descriptor.buildPrePatchCmdsSection(&bare, nullptr));
  EXPECT_TRUE(descriptor.buildPreCmdsSection(&bare, &err));
  EXPECT_TRUE(descriptor.buildPostCmdsSection(&bare, nullptr));
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(descriptor.getPrereqs(), Names{"kox"});
  EXPECT_EQ(descriptor.getDependents(), Names{"kox"});
  EXPECT_EQ(descriptor.getPrePatchCommands(), Names{"ox"});
  EXPECT_EQ(descriptor.getPreCommands(), Names{"ox"});
  EXPECT_EQ(descriptor.getPostCommands(), Names{"ox"});
}

TEST_F(DescriptorTest, ParsingAnIniFileFillsAnObject) {
  std::unique_ptr<IniFile> ini(IniFile::parseFile(write("patch.ini", Minimal), nullptr));
  PatchDescriptor descriptor;
  logLines();
  EXPECT_TRUE(descriptor.parse(ini.get(), nullptr));
  EXPECT_EQ(descriptor.getPatchName(), "p");
  EXPECT_EQ(ownLines().front(), trace("patchdescriptor.cpp", Parsing));
}

TEST_F(DescriptorTest, ListsThatAreReadAgainAreReplaced) {
  PatchDescriptor descriptor;
  for (const char *name : {"first", "second"}) {
    const Section section = sectionOf("Any", {{name}});
    descriptor.buildDependentsSection(&section, nullptr);
    descriptor.buildPrePatchCmdsSection(&section, nullptr);
    descriptor.buildPreCmdsSection(&section, nullptr);
    descriptor.buildPostCmdsSection(&section, nullptr);
  }
  for (const Names &list : {descriptor.getDependents(), descriptor.getPrePatchCommands(),
                            descriptor.getPreCommands(), descriptor.getPostCommands()})
    EXPECT_EQ(list, Names{"second"});
}

TEST_F(DescriptorTest, CopyHoldsEverythingAndOwnsItsLevel) {
  const std::string text = Minimal + "productBinArch = a b\nproductEXE = e\n[PreReqs]\nox = 061000\n"
                                     "[Dependents]\nox\n[PrePatchCommands]\n1\n[PreCommands]\n2\n"
                                     "[PostCommands]\n3\n";
  Descriptor original = accepted(text);
  logLines();
  const PatchDescriptor copy(*original);
  EXPECT_EQ(ownLines(), own({"PatchDescriptor::PatchDescriptor(PatchDescriptor) entry"}));
  original->getVersion()->set("99999999");
  original.reset();
  EXPECT_EQ(ownLines(), own({"PatchDescriptor::~PatchDescriptor entry"}));
  EXPECT_EQ(copy.getProductCode(), "kxe");
  EXPECT_EQ(copy.getPatchName(), "p");
  EXPECT_EQ(copy.getPatchDescriptiveName(), "d");
  EXPECT_EQ(copy.getProductEXE(), "e");
  EXPECT_EQ(copy.getVersion()->getVersionString(), "06200001");
  EXPECT_EQ(copy.getArch(), (Names{"a", "b"}));
  EXPECT_EQ(copy.getPrereqs(), Names{"kox"});
  EXPECT_EQ(copy.getDependents(), Names{"kox"});
  EXPECT_EQ(copy.getPrePatchCommands(), Names{"1"});
  EXPECT_EQ(copy.getPreCommands(), Names{"2"});
  EXPECT_EQ(copy.getPostCommands(), Names{"3"});
}

TEST_F(DescriptorTest, CopyOfOneThatHasReadNothingHasNoLevel) {
  const PatchDescriptor original;
  const PatchDescriptor copy(original);
  EXPECT_EQ(copy.getVersion(), nullptr);
  EXPECT_EQ(copy.getProductCode(), "");
}

TEST_F(DescriptorTest, PropertyIsReadOrReportedWithoutALogLine) {
  const Section section = sectionOf("S", {{"key", "one, two"}});
  PatchError err{99, "earlier"};
  std::string value;
  EXPECT_TRUE(getSectionProperty(&section, "key", value, &err));
  EXPECT_EQ(value, "one, two");
  EXPECT_EQ(recordOf(err), Record(99, "earlier")) << "a success leaves the record alone";
  EXPECT_FALSE(getSectionProperty(&section, "Key", value, &err));
  EXPECT_EQ(recordOf(err), Record(7, "Missing required property: Key"));
  EXPECT_FALSE(getSectionProperty(&section, "Key", value, nullptr));
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(DescriptorTest, PropertyIsSplitOrEmpty) {
  const Section section = sectionOf("S", {{"key", ",one,  two ,"}});
  PatchError err;
  Names values = {"stale"};
  EXPECT_TRUE(getSectionProperty(&section, "key", values, &err));
  EXPECT_EQ(values, (Names{"one", "two"}));
  EXPECT_FALSE(getSectionProperty(&section, "other", values, &err));
  EXPECT_EQ(values, Names{});
  EXPECT_EQ(recordOf(err), Record(7, "Missing required property: other"));
  EXPECT_FALSE(getSectionProperty(&section, "other", values, nullptr));
  EXPECT_EQ(logLines(), LogLines{});
}

} // namespace
