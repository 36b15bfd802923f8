// The list of installed components: which version files count, what is taken from them, and the look-ups.
#include "orvcomponentregistry.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "fakehome.h"

namespace {

using Names = std::vector<std::string>;
using Kind = ORVComponent::Type;

LogLines own(const std::vector<std::string> &messages) {
  return traces("orvcomponentregistry", messages);
}

class RegistryTest : public FakeHome {
public:
  /// The registry, read anew from the home.
  static ORVComponentRegistry *registry() {
    delete ORVComponentRegistry::getInstance();
    return ORVComponentRegistry::getInstance();
  }
  /// The component of the only version file, which has this text; null when there is none.
  ORVComponent *componentOf(const std::string &text, const std::string &file = "oxlpp266.ver") const {
    write("registry/" + file, text);
    const auto *components = registry()->getInstalledComponents();
    EXPECT_LE(components->size(), 1U);
    return components->empty() ? nullptr : components->front();
  }
  /// What is logged while the registry is built anew.
  LogLines linesOfBuilding() {
    delete registry();
    logLines();
    ORVComponentRegistry::getInstance();
    return withoutPointers(logLines());
  }
  static bool contains(const LogLines &lines, const LogLine &line) {
    return std::find(lines.begin(), lines.end(), line) != lines.end();
  }
};

TEST_F(RegistryTest, IsBuiltOnFirstUseAndNeverAgain) {
  install("oxlpp266.ver");
  ORVComponentRegistry *first = registry();
  install("xelpp266.ver");
  install("oxlpp266.ver", "06200000");
  logLines();
  EXPECT_EQ(ORVComponentRegistry::getInstance(), first);
  EXPECT_EQ(logLines(), LogLines{});
  ASSERT_EQ(first->getInstalledComponents()->size(), 1U);
  EXPECT_EQ(first->getInstalledComponents()->front()->getVersion()->getVersionString(), "06100000");
}

TEST_F(RegistryTest, DestroyedRegistryIsTracedAndTheNextUseBuildsAnother) {
  ORVComponentRegistry *first = registry();
  logLines();
  delete first;
  EXPECT_EQ(logLines(), own({"ORVComponentRegistry::~ORVComponentRegistry entry"}));
  install("oxlpp266.ver");
  EXPECT_EQ(ORVComponentRegistry::getInstance()->getInstalledComponents()->size(), 1U);
}

TEST_F(RegistryTest, MissingRegistryDirectoryGivesAnEmptyList) {
  EXPECT_TRUE(registry()->getInstalledComponents()->empty());
  EXPECT_EQ(registry()->getInstalledComponent("kox", Kind::TYPE_AGENT), nullptr);
}

TEST_F(RegistryTest, BuildingIsTracedFromEndToEnd) {
  const std::string path = install("oxlpp266.ver", "06100000", "Agent", {"none"});
  const std::string runInfo = write("config/.ConfigData/RunInfo", "\n");
  const auto util = [](const std::vector<std::string> &messages) {
    return traces("utilities.cpp", messages);
  };
  EXPECT_EQ(
      linesOfBuilding(),
      joined(
          {own({"ORVComponentRegistry::ORVComponentRegistry entry",
                "ORVComponentRegistry::buildComponents entry",
                "ORVComponentRegistry::getCInfo_Running entry"}),
           util({"Util::readFile(" + runInfo + ") entry", "Util::readFile(" + runInfo + ")=0(buffer) exit"}),
           own({"ORVComponentRegistry::getCInfo exit"}),
           traces("file.cpp", {"loadDir() entry", "loadDir() exit"}),
           own({"ORVComponentRegistry::buildComponent(" + path + ") entry"}),
           util({"Util::readFileByLines(" + path + ") entry", "Util::readFile(" + path + ") entry",
                 "Util::readFile(" + path + ")=0(buffer) exit", "Util::readFileByLines(" + path + ") exit"}),
           own({"Added preReqALL value = none"}),
           traces("orvcomponent", {"ORVComponent::ORVComponent(ox) entry"}),
           traces("version.cpp", {"Version string provided: 06100000."}),
           traces("orvcomponent", {"ORVComponent::intialize entry", "no cinfo data",
                                   "ORVComponent::initialize exit", "ORVComponent::ORVComponent() exit"}),
           own({"ORVComponentRegistry::buildComponent exit", "ORVComponentRegistry::buildComponents exit",
                "ORVComponentRegistry::ORVComponentRegistry exit"})}));
}

struct VersionFileName {
  const char *file;
  const char *name;
  const char *arch;
  Kind type;
};

class VersionFileNameTest : public RegistryTest, public ::testing::WithParamInterface<VersionFileName> {};

TEST_P(VersionFileNameTest, TellsProductArchitectureAndKind) {
  const VersionFileName &expected = GetParam();
  const ORVComponent *component = componentOf("desc = Some Agent\nVRMF = 06100000\n", expected.file);
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getName(), expected.name);
  EXPECT_EQ(component->getArch(), expected.arch);
  EXPECT_EQ(component->getType(), expected.type);
  const bool isServer = dynamic_cast<const UNIXMonitoringServer *>(component) != nullptr;
  EXPECT_EQ(isServer, std::string(expected.file).rfind("qa", 0) == 0);
}

INSTANTIATE_TEST_SUITE_P(
    Names, VersionFileNameTest,
    ::testing::Values(VersionFileName{"oxli6243.ver", "kox", "li6243", Kind::TYPE_AGENT},
                      VersionFileName{"OXlpp266.ver", "kox", "lpp266", Kind::TYPE_AGENT},
                      VersionFileName{"oxvms.ver", "kox", "vms", Kind::TYPE_VEMS},
                      VersionFileName{"oxvps.ver", "kox", "vps", Kind::TYPE_VEPS},
                      VersionFileName{"oxvpd.ver", "kox", "vpd", Kind::TYPE_VEPD},
                      VersionFileName{"ztlpp266.ver", "kzt", "lpp266", Kind::TYPE_CLI},
                      VersionFileName{"ztvms.ver", "kzt", "vms", Kind::TYPE_VEMS},
                      VersionFileName{"qalpp266.ver", "kqa", "lpp266", Kind::TYPE_VEMS},
                      VersionFileName{"qavps.ver", "kqa", "vps", Kind::TYPE_VEMS},
                      VersionFileName{"ptlpp266.ver", "kpt", "lpp266", Kind::TYPE_VEPS},
                      VersionFileName{"ptvms.ver", "kpt", "vms", Kind::TYPE_VEPS},
                      VersionFileName{"dklpp266.ver", "kdk", "lpp266", Kind::TYPE_VEPD},
                      VersionFileName{"dkvps.ver", "kdk", "vps", Kind::TYPE_VEPD},
                      VersionFileName{"oxvms.ver.vps.ver", "kox", "vms.ver.vps", Kind::TYPE_VEMS},
                      VersionFileName{"oxvpd.ver.vps.ver", "kox", "vpd.ver.vps", Kind::TYPE_VEPS},
                      VersionFileName{"oxvps.verli.ver", "kox", "vps.verli", Kind::TYPE_VEPS},
                      VersionFileName{"oxzt266.ver", "kox", "zt266", Kind::TYPE_AGENT},
                      VersionFileName{"QAlpp266.ver", "kqa", "lpp266", Kind::TYPE_AGENT},
                      VersionFileName{"ox.1.ver", "kox", ".1", Kind::TYPE_AGENT},
                      VersionFileName{"ox.ver", "kox", "", Kind::TYPE_AGENT},
                      VersionFileName{"x.ver", "kx.", "", Kind::TYPE_AGENT},
                      VersionFileName{".ver", "k.v", "", Kind::TYPE_AGENT}));

TEST_F(RegistryTest, KindIsLookedForInTheWholePath) {
  const std::pair<const char *, Kind> kinds[] = {{"vms.ver.d", Kind::TYPE_VEMS},
                                                 {"vps.ver.d", Kind::TYPE_VEPS},
                                                 {"vpd.ver.d", Kind::TYPE_VEPD},
                                                 {"zt", Kind::TYPE_AGENT}};
  ORVComponentRegistry *built = registry();
  for (const auto &[folder, kind] : kinds) {
    built->buildComponent(write(std::string(folder) + "/oxlpp266.ver", "VRMF = 06100000\n"), "");
    EXPECT_EQ(built->getInstalledComponents()->back()->getType(), kind) << folder;
  }
}

class IgnoredFileTest : public RegistryTest, public ::testing::WithParamInterface<const char *> {};

TEST_P(IgnoredFileTest, IsNotEvenRead) {
  write(std::string("registry/") + GetParam(), "VRMF = 06100000\n");
  for (const LogLine &line : linesOfBuilding())
    EXPECT_EQ(line.message.find("buildComponent("), std::string::npos) << line;
  EXPECT_TRUE(registry()->getInstalledComponents()->empty());
}

INSTANTIATE_TEST_SUITE_P(Names, IgnoredFileTest,
                         ::testing::Values("oxvpw.ver", "oxvpw.ver.lpp.ver", "abc.ver.bak", "oxlpp266.VER",
                                           "oxlpp266", "oxver", "oxlpp.versions", "folder.ver/oxlpp.ver"));

TEST_F(RegistryTest, DescriptionAndLevelAreTheTrimmedTextAfterTheFirstEqualSign) {
  const ORVComponent *component = componentOf("desc =\t Agent = good \nVRMF=06.20.00.01\n");
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getDescriptiveName(), "Agent = good");
  EXPECT_EQ(component->getVersion()->getVersionString(), "06200001");
}

// KEEP(key-prefix)
TEST_F(RegistryTest, KeysArePrefixesOfTheLine) {
  const ORVComponent *component = componentOf("description = Agent\nVRMFLevel = 06200000\npreReqALLs = qa\n");
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getDescriptiveName(), "Agent");
  EXPECT_EQ(component->getVersion()->getVersionString(), "06200000");
  EXPECT_EQ(component->getPrereqs(), Names{"qa"});
}

TEST_F(RegistryTest, KeysStandAtTheStartOfTheLineAndInTheirOwnCase) {
  const ORVComponent *component =
      componentOf("VRMF = 06200000\n vrmf = 1\n VRMF = 07000000\nvrmf = 08000000\n desc = a\nDESC = b\n"
                  "\tpreReqALL = qa\nprereqall = ox\n");
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getVersion()->getVersionString(), "06200000");
  EXPECT_EQ(component->getDescriptiveName(), "");
  EXPECT_EQ(component->getPrereqs(), Names{});
}

TEST_F(RegistryTest, LastDescriptionAndLastLevelWin) {
  const ORVComponent *component = componentOf("desc = a\nVRMF = 06100000\ndesc = b\nVRMF = 06200000\n");
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getDescriptiveName(), "b");
  EXPECT_EQ(component->getVersion()->getVersionString(), "06200000");
}

TEST_F(RegistryTest, LineWithoutAnEqualSignIsItsOwnValue) {
  const ORVComponent *component = componentOf("desc of the agent \nVRMF\npreReqALL\n");
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getDescriptiveName(), "desc of the agent");
  EXPECT_EQ(component->getVersion()->getVersionString(), "06100000") << "VRMF is no level";
  EXPECT_EQ(component->getPrereqs(), Names{}) << "but a prerequisite needs its equal sign";
}

TEST_F(RegistryTest, FileMayHaveCarriageReturns) {
  const ORVComponent *component = componentOf("desc = Agent\r\nVRMF = 06200000\r\n");
  ASSERT_NE(component, nullptr);
  EXPECT_EQ(component->getDescriptiveName(), "Agent");
  EXPECT_EQ(component->getVersion()->getVersionString(), "06200000");
}

// KEEP(prereq-first-piece)
TEST_F(RegistryTest, EveryPrerequisiteLineAddsItsFirstPiece) {
  const std::string path = write("registry/oxlpp266.ver",
                                 "VRMF = 06100000\npreReqALL = kox|kqa\npreReqALL = none\n"
                                 "preReqALL = qalpp266 | x\npreReqALL = ||\npreReqALL =\npreReqALL = NONE\n");
  EXPECT_EQ(
      linesOf("orvcomponentregistry", linesOfBuilding()),
      own({"ORVComponentRegistry::ORVComponentRegistry entry", "ORVComponentRegistry::buildComponents entry",
           "ORVComponentRegistry::getCInfo_Running entry", "unable to read RunInfo file",
           "ORVComponentRegistry::getCInfo exit", "ORVComponentRegistry::buildComponent(" + path + ") entry",
           "Added preReqALL value = kox", "Added preReqALL value = none", "Added preReqALL value = qalpp266 ",
           "preReqALL syntax unknown: Defaulting preReqALL value = none",
           "preReqALL syntax unknown: Defaulting preReqALL value = none", "Added preReqALL value = NONE",
           "ORVComponentRegistry::buildComponent exit", "ORVComponentRegistry::buildComponents exit",
           "ORVComponentRegistry::ORVComponentRegistry exit"}));
  EXPECT_EQ(ORVComponentRegistry::getInstance()->getInstalledComponents()->front()->getPrereqs(),
            (Names{"kox", "none", "qalpp266 ", "none", "none", "NONE"}));
}

TEST_F(RegistryTest, OnlyBarsDivideAPrerequisite) {
  const ORVComponent *component = componentOf("VRMF = 06100000\npreReqALL = k~o x,y;z_-.:=|q\n");
  EXPECT_EQ(component->getPrereqs(), Names{"k~o x,y;z_-.:="});
}

TEST_F(RegistryTest, FileWithoutALevelIsReadButYieldsNoComponent) {
  EXPECT_EQ(componentOf("desc = Agent\n"), nullptr);
  EXPECT_EQ(componentOf("desc = Agent\nVRMF =\n"), nullptr);
  EXPECT_EQ(componentOf("desc = Agent\nVRMF = 06100000\nVRMF = \n"), nullptr) << "the last line wins";
  EXPECT_TRUE(contains(linesOfBuilding(),
                       trace("orvcomponentregistry", "ORVComponentRegistry::buildComponent exit")));
}

TEST_F(RegistryTest, NameWithoutAPointBehindTheCodeHasNoArchitecture) {
  ORVComponentRegistry *empty = registry();
  for (const char *name : {"x", "ox", "oxlpp266", ".ver", "x.ver", "ox.ver"})
    empty->buildComponent(write(std::string("registry/") + name, "VRMF = 06100000\n"), "");
  ASSERT_EQ(empty->getInstalledComponents()->size(), 6U);
  for (const ORVComponent *component : *empty->getInstalledComponents())
    EXPECT_EQ(component->getArch(), "") << component->getName();
}

TEST_F(RegistryTest, UnreadableVersionFileIsSkippedWithATrace) {
  ORVComponentRegistry *empty = registry();
  const std::string missing = home() + "registry/oxlpp266.ver";
  logLines();
  empty->buildComponent(missing, "");
  EXPECT_EQ(logLinesOf("orvcomponentregistry"),
            own({"ORVComponentRegistry::buildComponent(" + missing + ") entry",
                 "Could not read " + missing + ": No such file or directory"}));
  EXPECT_TRUE(empty->getInstalledComponents()->empty());
}

TEST_F(RegistryTest, VersionFilesThatAreNoFilesDoNotHideTheOthers) {
  install("oxlpp266.ver");
  std::filesystem::create_symlink("nowhere", home() + "registry/xelpp266.ver");
  const std::string pipe = home() + "registry/hvlpp266.ver";
  ASSERT_EQ(mkfifo(pipe.c_str(), 0644), 0);
  ORVComponentRegistry *built = registry();
  ASSERT_EQ(built->getInstalledComponents()->size(), 1U);
  EXPECT_TRUE(
      contains(logLines(), trace("orvcomponentregistry", "Could not read " + pipe + ": Invalid argument")));
}

TEST_F(RegistryTest, VersionFileThatMayNotBeReadIsSkipped) {
  const std::string path = install("oxlpp266.ver");
  chmod(path.c_str(), 0);
  const BoundByPermissions bound(home());
  EXPECT_TRUE(registry()->getInstalledComponents()->empty());
  EXPECT_TRUE(
      contains(logLines(), trace("orvcomponentregistry", "Could not read " + path + ": Invalid argument")));
}

TEST_F(RegistryTest, ComponentsStandInTheOrderOfTheListing) {
  for (const char *file : {"xelpp266.ver", "oxlpp266.ver", "qalpp266.ver", "aalpp266.ver", "ztlpp266.ver"})
    install(file, "06100000", file);
  Names descriptions;
  for (const ORVComponent *component : *registry()->getInstalledComponents())
    descriptions.push_back(component->getDescriptiveName());
  EXPECT_EQ(descriptions, listedNames(home() + "registry"));
}

TEST_F(RegistryTest, LookUpIsByExactNameAndKind) {
  install("oxlpp266.ver", "06100000", "agent");
  install("oxvms.ver", "06100000", "support");
  const ORVComponentRegistry *built = registry();
  ASSERT_NE(built->getInstalledComponent("kox", Kind::TYPE_AGENT), nullptr);
  EXPECT_EQ(built->getInstalledComponent("kox", Kind::TYPE_AGENT)->getDescriptiveName(), "agent");
  ASSERT_NE(built->getInstalledComponent("kox", Kind::TYPE_VEMS), nullptr);
  EXPECT_EQ(built->getInstalledComponent("kox", Kind::TYPE_VEMS)->getDescriptiveName(), "support");
  EXPECT_EQ(built->getInstalledComponent("kox", Kind::TYPE_VEPS), nullptr);
  EXPECT_EQ(built->getInstalledComponent("ox", Kind::TYPE_AGENT), nullptr);
  EXPECT_EQ(built->getInstalledComponent("KOX", Kind::TYPE_AGENT), nullptr);
}

TEST_F(RegistryTest, FirstOfTwoArchitecturesIsFoundByNameAndEachByItsArchitecture) {
  install("oxlpp266.ver", "06100000", "oxlpp266.ver");
  install("oxli6243.ver", "06200000", "oxli6243.ver");
  const ORVComponentRegistry *built = registry();
  EXPECT_EQ(built->getInstalledComponent("kox", Kind::TYPE_AGENT)->getDescriptiveName(),
            listedNames(home() + "registry").front());
  for (const char *arch : {"lpp266", "li6243"}) {
    const ORVComponent *found = built->getInstalledComponentByArch("kox", Kind::TYPE_AGENT, arch);
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(found->getDescriptiveName(), std::string("ox") + arch + ".ver");
  }
}

TEST_F(RegistryTest, LookUpByArchitectureNeedsNameKindAndArchitecture) {
  install("oxlpp266.ver");
  const ORVComponentRegistry *built = registry();
  EXPECT_EQ(built->getInstalledComponentByArch("kox", Kind::TYPE_AGENT, "lpp"), nullptr);
  EXPECT_EQ(built->getInstalledComponentByArch("kox", Kind::TYPE_AGENT, ""), nullptr);
  EXPECT_EQ(built->getInstalledComponentByArch("kox", Kind::TYPE_CLI, "lpp266"), nullptr);
  EXPECT_EQ(built->getInstalledComponentByArch("kxe", Kind::TYPE_AGENT, "lpp266"), nullptr);
}

TEST_F(RegistryTest, LookUpsTraceEntryAndExitWhetherTheyFindOrNot) {
  install("oxlpp266.ver");
  const ORVComponentRegistry *built = registry();
  for (const char *name : {"kox", "kxe"}) {
    logLines();
    built->getInstalledComponent(name, Kind::TYPE_AGENT);
    built->getInstalledComponentByArch(name, Kind::TYPE_AGENT, "lpp266");
    EXPECT_EQ(logLines(), own({"ORVComponentRegistry::getInstalledComponent entry",
                               "ORVComponentRegistry::getInstalledComponent exit",
                               "ORVComponentRegistry::getInstalledComponentByArch entry",
                               "ORVComponentRegistry::getInstalledComponentByArch exit"}));
  }
}

TEST_F(RegistryTest, RunInformationReachesEveryComponent) {
  for (const char *file : {"oxlpp266.ver", "qalpp266.ver", "ptlpp266.ver", "ztlpp266.ver"})
    install(file);
  setRunning({{"ox", "11", "abc"}, {"qa", "12"}, {"pt", "13", "portal"}, {"zt", "14"}});
  std::map<std::string, Names> active;
  for (const ORVComponent *component : *registry()->getInstalledComponents())
    active[component->getName()] = component->getActiveInstances();
  const std::map<std::string, Names> expected = {
      {"kox", {"abc"}}, {"kqa", {""}}, {"kpt", {"portal"}}, {"kzt", {}}};
  EXPECT_EQ(active, expected);
}

// KEEP(cinfo-exit-name)
TEST_F(RegistryTest, RunInformationIsReadWhole) {
  const std::string text = "FIELDSEP=|\n\nrow\r\n";
  write("config/.ConfigData/RunInfo", text);
  EXPECT_EQ(getCInfo_Running(home()), text);
  EXPECT_EQ(logLinesOf("orvcomponentregistry"),
            own({"ORVComponentRegistry::getCInfo_Running entry", "ORVComponentRegistry::getCInfo exit"}));
}

TEST_F(RegistryTest, RunInformationThatCannotBeReadIsEmpty) {
  EXPECT_EQ(getCInfo_Running(home()), "");
  makeDirectory("config/.ConfigData/RunInfo");
  EXPECT_EQ(getCInfo_Running(home()), "");
  EXPECT_TRUE(contains(logLines(), trace("orvcomponentregistry", "unable to read RunInfo file")));
}

TEST_F(RegistryTest, EndOfAnotherRegistryLeavesTheOneInstance) {
  ORVComponentRegistry *const instance = ORVComponentRegistry::getInstance();
  { const ORVComponentRegistry another; }
  EXPECT_EQ(ORVComponentRegistry::getInstance(), instance);
}

TEST_F(RegistryTest, ComponentOfACodeIsTheServerOrTheAgent) {
  for (const char *file : {"qalpp266.ver", "qavms.ver", "ptlpp266.ver", "oxlpp266.ver", "oxvms.ver",
                           "dklpp266.ver", "ztlpp266.ver", "xevps.ver"})
    install(file, "06100000", file);
  static_cast<void>(registry());
  ASSERT_NE(getComponent("kqa"), nullptr);
  EXPECT_EQ(getComponent("kqa")->getType(), ORVComponent::TYPE_VEMS);
  ASSERT_NE(getComponent("kpt"), nullptr);
  EXPECT_EQ(getComponent("kpt")->getType(), ORVComponent::TYPE_VEPS);
  ASSERT_NE(getComponent("kox"), nullptr);
  EXPECT_EQ(getComponent("kox")->getDescriptiveName(), "oxlpp266.ver");
  for (const char *code : {"kdk", "kzt", "kxe", "ox", ""})
    EXPECT_EQ(getComponent(code), nullptr) << code;
}

} // namespace
