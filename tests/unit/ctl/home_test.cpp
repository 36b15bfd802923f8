// The home as the installer sees it; what the installer would pass over in silence cannot be judged.
#include "home.h"

#include <cstdlib>

#include <gmock/gmock.h>
#include <unistd.h>

#include "fakehome.h"
#include "judgement.h"
#include "utilities.h"

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

class CtlHome : public FakeHome {
protected:
  void SetUp() override {
    FakeHome::SetUp();
    makeDirectory("registry");
    setProcess(std::to_string(getpid()));
  }

  std::vector<InstalledComponent> components() const { return Home(home()).components(); }
};

TEST_F(CtlHome, EndsInASlash) {
  const std::string without = home().substr(0, home().size() - 1);
  EXPECT_EQ(Home(without).path(), home());
  EXPECT_EQ(Util::getQuillHome(), home());
  EXPECT_EQ(Home(home()).at("tmp/kyn"), home() + "tmp/kyn");
}

TEST_F(CtlHome, MustExist) {
  EXPECT_THROW(Home(home() + "nowhere"), JudgementError);
  write("file", "");
  EXPECT_THROW(Home(home() + "file"), JudgementError);
}

TEST_F(CtlHome, DescribesEachComponent) {
  install("ynlpp266.ver", "06100002", "Application servers");
  const std::vector<InstalledComponent> found = components();
  ASSERT_THAT(found, SizeIs(1));
  EXPECT_EQ(found[0].code, "kyn");
  EXPECT_EQ(found[0].name, "Application servers");
  EXPECT_EQ(found[0].type, ORVComponent::TYPE_AGENT);
  EXPECT_EQ(found[0].level, "06.10.00.02");
  EXPECT_EQ(found[0].platform, "lpp266");
  EXPECT_THAT(found[0].instances, IsEmpty());
}

TEST_F(CtlHome, SortsByCodeAndKind) {
  for (const char *file : {"ztlpp266.ver", "ynvms.ver", "ynlpp266.ver", "qalpp266.ver", "dklpp266.ver"})
    install(file);
  std::vector<std::string> texts;
  for (const InstalledComponent &component : components())
    texts.push_back(component.code + " " + kindName(component.type) + " " + component.platform);
  EXPECT_THAT(texts, ElementsAre("kdk desktop-client lpp266", "kqa monitoring-server lpp266",
                                 "kyn agent lpp266", "kyn monitoring-server vms", "kzt cli lpp266"));
  EXPECT_STREQ(kindName(ORVComponent::TYPE_VEPS), "portal-server");
}

TEST_F(CtlHome, NamesTheInstancesThatRun) {
  install("ynlpp266.ver");
  setRunning({{"yn", "4711", "east", "operator"}, {"yn", "4712"}, {"yn", "4713", "gone"}});
  endProcess("4713");
  setProcess(std::to_string(getpid()));
  const std::vector<InstalledComponent> found = components();
  ASSERT_THAT(found, SizeIs(1));
  ASSERT_THAT(found[0].instances, SizeIs(2));
  EXPECT_EQ(found[0].instances[0].name, "east");
  EXPECT_EQ(found[0].instances[0].pid, "4711");
  EXPECT_EQ(found[0].instances[0].user, "operator");
  EXPECT_EQ(found[0].instances[1].name, "");
}

TEST_F(CtlHome, ReadsAnewEachTime) {
  const Home read(home());
  EXPECT_THAT(read.components(), IsEmpty());
  install("ynlpp266.ver");
  EXPECT_THAT(read.components(), SizeIs(1));
}

TEST_F(CtlHome, WithoutARegistryCannotBeJudged) {
  rmdir((home() + "registry").c_str());
  EXPECT_THROW(components(), JudgementError);
}

TEST_F(CtlHome, WithoutPsCannotBeJudged) {
  const std::string path = getenv("PATH");
  Util::setEnvironment("PATH", home() + "registry");
  EXPECT_THROW(components(), JudgementError);
  Util::setEnvironment("PATH", path);
}

TEST_F(CtlHome, AVersionFileThatCannotBeReadCannotBeJudged) {
  install("ynlpp266.ver");
  chmod((home() + "registry/ynlpp266.ver").c_str(), 0);
  const BoundByPermissions bound(home());
  EXPECT_THROW(components(), JudgementError);
}

TEST_F(CtlHome, RunInformationThatCannotBeReadCannotBeJudged) {
  setRunning({{"yn", "4711"}});
  setProcess(std::to_string(getpid()));
  chmod((home() + "config/.ConfigData/RunInfo").c_str(), 0);
  const BoundByPermissions bound(home());
  EXPECT_THROW(components(), JudgementError);
}

TEST_F(CtlHome, AVersionFileWithoutALevelIsNoComponentAndNoFailure) {
  write("registry/ynlpp266.ver", "");
  EXPECT_THAT(components(), IsEmpty());
}

TEST_F(CtlHome, FindsTheTemporaryDirectoriesOfPatches) {
  for (const char *name : {"tmp/kyn", "tmp/KOX", "tmp/abc", "tmp/abd", "tmp/kynx", "tmp/other"})
    makeDirectory(name);
  write("tmp/abd/patch.ini", "");
  write("tmp/kqa", "a file");
  EXPECT_THAT(Home(home()).leftovers(), ElementsAre("tmp/KOX", "tmp/abd", "tmp/kyn"));
}

TEST_F(CtlHome, WithoutTmpThereAreNoLeftovers) {
  EXPECT_THAT(Home(home()).leftovers(), IsEmpty());
}

} // namespace
