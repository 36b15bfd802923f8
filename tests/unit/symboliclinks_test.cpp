// No link survives in a tree, however deep or closed; all else does.
#include "symboliclinks.h"

#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include "fakehome.h"
#include "scratch.h"

namespace {

namespace fs = std::filesystem;

class SymbolicLinksTest : public ScratchHome {
protected:
  std::string tree() const { return home() + "tree"; }
  std::string plant(const std::string &name, const std::string &destination = "nowhere") const {
    fs::create_symlink(destination, home() + name);
    return home() + name;
  }
};

TEST_F(SymbolicLinksTest, LinkItselfGoesAndWhatItLeadsToStays) {
  makeDirectory("outside");
  const std::string inside = plant("outside/link");
  const std::string link = plant("link", "outside");
  removeSymbolicLinks(link + "/");
  EXPECT_FALSE(isThere(link));
  EXPECT_TRUE(isThere(inside));
}

TEST_F(SymbolicLinksTest, WhatIsNoDirectoryAndWhatIsNotThereAreLeft) {
  removeSymbolicLinks(write("file", "kept"));
  EXPECT_EQ(read(home() + "file"), "kept");
  removeSymbolicLinks(home() + "gone");
  EXPECT_EQ(logLines(), LogLines{});
}

TEST_F(SymbolicLinksTest, DepthTakesNoDescriptors) {
  makeDirectory("tree");
  std::string path = "tree";
  for (int depth = 0; depth < 300; ++depth)
    makeDirectory(path += "/d");
  const std::string link = plant(path + "/link");
  rlimit before = {};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &before), 0);
  rlimit few = before;
  few.rlim_cur = 40;
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &few), 0);
  removeSymbolicLinks(tree());
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &before), 0);
  EXPECT_FALSE(isThere(link));
  EXPECT_TRUE(isThere(home() + path));
}

TEST_F(SymbolicLinksTest, BranchesAreAllVisited) {
  std::string links[9];
  for (int first = 0; first < 3; ++first)
    for (int second = 0; second < 3; ++second) {
      const std::string name = "tree/" + std::to_string(first) + "/" + std::to_string(second);
      makeDirectory(name);
      links[3 * first + second] = plant(name + "/link");
    }
  removeSymbolicLinks(tree());
  for (const std::string &link : links)
    EXPECT_FALSE(isThere(link)) << link;
}

class ClosedDirectoryTest : public SymbolicLinksTest, public ::testing::WithParamInterface<unsigned> {};

TEST_P(ClosedDirectoryTest, IsOpenedForTheRemovalAndClosedAgain) {
  makeDirectory("tree/a/b");
  const std::string outer = plant("tree/a/link");
  const std::string inner = plant("tree/a/b/link");
  for (const char *name : {"tree/a/b", "tree/a", "tree"})
    fs::permissions(home() + name, fs::perms(GetParam()));
  {
    const BoundByPermissions bound(home());
    removeSymbolicLinks(tree());
  }
  for (const char *name : {"tree", "tree/a", "tree/a/b"}) {
    EXPECT_EQ(modeOf(home() + name), GetParam()) << name;
    fs::permissions(home() + name, fs::perms(0700));
  }
  EXPECT_FALSE(isThere(outer));
  EXPECT_FALSE(isThere(inner));
}

INSTANTIATE_TEST_SUITE_P(Modes, ClosedDirectoryTest, ::testing::Values(0U, 0100U, 0300U, 0500U, 0555U));

} // namespace
