// What a target means: its kind, its place in the order of application, and version files both ways.
#include "target.h"

#include <string>

#include <gtest/gtest.h>

namespace {

using Kind = ORVComponent::Type;

struct Word {
  const char *name;
  Kind kind;
  std::size_t order;
};

class TargetTest : public ::testing::TestWithParam<Word> {};

TEST_P(TargetTest, WordTellsKindAndOrder) {
  EXPECT_EQ(targetKind(GetParam().name), GetParam().kind);
  EXPECT_EQ(targetOrder(GetParam().name), GetParam().order);
}

INSTANTIATE_TEST_SUITE_P(Words, TargetTest,
                         ::testing::Values(Word{"vecm", Kind::TYPE_CLI, 0}, Word{"vems", Kind::TYPE_VEMS, 1},
                                           Word{"veps", Kind::TYPE_VEPS, 2}, Word{"vepd", Kind::TYPE_VEPD, 3},
                                           Word{"vema", Kind::TYPE_AGENT, 4},
                                           Word{"VEMS", Kind::TYPE_AGENT, 5},
                                           Word{"vemsx", Kind::TYPE_AGENT, 5},
                                           Word{"", Kind::TYPE_AGENT, 5}));

TEST(TargetTableTest, EachTargetIsFoundByItsNameOnly) {
  for (const Target &target : targets)
    EXPECT_EQ(findTarget(target.name), &target);
  for (const char *name : {"vem", "vemsx", "VEMA", ""})
    EXPECT_EQ(findTarget(name), nullptr) << name;
}

TEST(TargetTableTest, VersionFileOfAnUnknownTargetIsThatOfTheProduct) {
  EXPECT_EQ(versionFileName(nullptr, "xe", "lpp266"), "xelpp266.ver");
  EXPECT_EQ(versionFileName(nullptr, "", "lpp266"), "lpp266.ver");
}

TEST(TargetTableTest, VersionFileOfAProductBelongsToTheComponentOfTheSameKind) {
  for (const Target &target : targets) {
    if (target.ownCode != nullptr) {
      EXPECT_EQ(versionFileKind("/home/registry/" + versionFileName(&target, target.ownCode, "lpp266")),
                target.kind);
    }
    EXPECT_EQ(versionFileKind("/home/registry/" + versionFileName(&target, "xe", "lpp266")),
              target.fileEnd == nullptr ? Kind::TYPE_AGENT : target.kind);
  }
}

} // namespace
