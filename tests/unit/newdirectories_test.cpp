// Directories that stay closed until the work in them is done.
#include "newdirectories.h"

#include <cerrno>
#include <filesystem>
#include <memory>
#include <string>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "fakehome.h"
#include "scratch.h"

namespace {

namespace fs = std::filesystem;

class NewDirectoriesTest : public ScratchHome {
protected:
  std::string path(const std::string &name) const { return home() + name; }
  void open() { made_.reset(); }
  bool make(const std::string &path) { return made_->make(path); }

private:
  std::unique_ptr<NewDirectories> made_ = std::make_unique<NewDirectories>();
};

class MaskedTest : public NewDirectoriesTest, public ::testing::WithParamInterface<unsigned> {};

TEST_P(MaskedTest, ClosedToOthersAndUsableByTheOwnerWhateverTheUmask) {
  const UmaskScope mask(GetParam());
  EXPECT_TRUE(make(path("a/")));
  EXPECT_TRUE(make(path("a/b/")));
  EXPECT_EQ(modeOf(path("a")), 0700U);
  EXPECT_EQ(modeOf(path("a/b")), 0700U);
  open();
  EXPECT_EQ(modeOf(path("a")), 0777U);
  EXPECT_EQ(modeOf(path("a/b")), 0777U);
}

INSTANTIATE_TEST_SUITE_P(Masks, MaskedTest, ::testing::Values(0U, 022U, 077U, 0277U, 0777U));

TEST_F(NewDirectoriesTest, UmaskThatTakesFromTheOwnerDoesNotHoldUpAnOrdinaryUserEither) {
  const BoundByPermissions bound(home());
  const UmaskScope mask(0777);
  EXPECT_TRUE(make(path("a")));
  EXPECT_TRUE(make(path("a/b")));
  open();
  EXPECT_EQ(modeOf(path("a/b")), 0777U);
}

TEST_F(NewDirectoriesTest, SetGroupIdBitOfTheParentIsKept) {
  makeDirectory("parent");
  ASSERT_EQ(chmod(path("parent").c_str(), 02755), 0);
  EXPECT_TRUE(make(path("parent/child")));
  EXPECT_EQ(modeOf(path("parent/child")), 02700U);
  open();
  EXPECT_EQ(modeOf(path("parent/child")), 02777U);
}

TEST_F(NewDirectoriesTest, WhatCannotBeMadeIsLeftAsItIs) {
  makeDirectory("there");
  fs::permissions(path("there"), fs::perms(0700));
  EXPECT_FALSE(make(path("there")));
  EXPECT_EQ(errno, EEXIST);
  EXPECT_FALSE(make(path("gone/child")));
  EXPECT_EQ(errno, ENOENT);
  open();
  EXPECT_EQ(modeOf(path("there")), 0700U);
}

TEST_F(NewDirectoriesTest, LinkInThePlaceOfADirectoryIsNotFollowed) {
  makeDirectory("foreign");
  fs::permissions(path("foreign"), fs::perms(0700));
  EXPECT_TRUE(make(path("new")));
  fs::rename(path("new"), path("moved-away"));
  fs::create_symlink("foreign", path("new"));
  open();
  EXPECT_EQ(modeOf(path("foreign")), 0700U);
  EXPECT_EQ(modeOf(path("moved-away")), 0700U);
}

TEST_F(NewDirectoriesTest, OtherDirectoryInThePlaceOfOneIsLeftAlone) {
  EXPECT_TRUE(make(path("new")));
  fs::rename(path("new"), path("moved-away"));
  makeDirectory("new");
  fs::permissions(path("new"), fs::perms(0700));
  open();
  EXPECT_EQ(modeOf(path("new")), 0700U);
}

TEST_F(NewDirectoriesTest, WayThroughALinkedParentLeadsToNoForeignDirectory) {
  EXPECT_TRUE(make(path("a")));
  EXPECT_TRUE(make(path("a/b")));
  makeDirectory("foreign/b");
  fs::permissions(path("foreign/b"), fs::perms(0700));
  fs::rename(path("a"), path("moved-away"));
  fs::create_symlink("foreign", path("a"));
  open();
  EXPECT_EQ(modeOf(path("foreign/b")), 0700U);
}

TEST_F(NewDirectoriesTest, DirectoryThatIsNoLongerClosedIsLeftAlone) {
  EXPECT_TRUE(make(path("new")));
  ASSERT_EQ(chmod(path("new").c_str(), 0710), 0);
  open();
  EXPECT_EQ(modeOf(path("new")), 0710U);
}

TEST_F(NewDirectoriesTest, DirectoryOfAnotherOwnerIsLeftAlone) {
  REQUIRE_ROOT();
  EXPECT_TRUE(make(path("new")));
  ASSERT_EQ(chown(path("new").c_str(), 1234, 1234), 0);
  open();
  EXPECT_EQ(modeOf(path("new")), 0700U);
}

TEST_F(NewDirectoriesTest, NoDescriptorIsKeptForEach) {
  const std::size_t before = openDescriptors();
  for (int number = 0; number < 50; ++number)
    EXPECT_TRUE(make(path("new" + std::to_string(number))));
  EXPECT_EQ(openDescriptors(), before);
  open();
  for (int number = 0; number < 50; ++number)
    EXPECT_EQ(modeOf(path("new" + std::to_string(number))), 0777U);
}

} // namespace
