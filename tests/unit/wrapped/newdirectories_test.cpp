// New directories, and links in them, when the system refuses a second look or a change.
#include "newdirectories.h"

#include <cerrno>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "symboliclinks.h"
#include "systemcalls.h"

namespace {

namespace fs = std::filesystem;
using NewDirectoriesFailureTest = SystemCallTest;

TEST_F(NewDirectoriesFailureTest, DirectoryThatCannotBeLookedAtStaysClosed) {
  const std::string path = home() + "new";
  failCall("lstat", EIO).on(path);
  {
    NewDirectories made;
    EXPECT_TRUE(made.make(path)) << "it exists";
  }
  EXPECT_EQ(fs::status(path).permissions(), fs::perms::owner_all);
}

TEST_F(NewDirectoriesFailureTest, DirectoryThatCannotBeOpenedKeepsTheModeOfTheUmask) {
  const std::string path = home() + "new";
  failCall("openat", EACCES);
  const UmaskScope mask(0277);
  {
    NewDirectories made;
    EXPECT_TRUE(made.make(path));
  }
  restoreSystemCalls();
  EXPECT_EQ(modeOf(path), 0500U);
}

TEST_F(NewDirectoriesFailureTest, EntryThatCannotBeLookedAtIsLeftAndTheOthersGo) {
  const std::string tree = makeDirectory("tree");
  fs::create_symlink("/nowhere", tree + "/gone");
  fs::create_symlink("/nowhere", tree + "/link");
  failCall("fstatat", ENOENT).on("gone");
  removeSymbolicLinks(tree);
  EXPECT_TRUE(fs::is_symlink(tree + "/gone"));
  EXPECT_FALSE(fs::is_symlink(tree + "/link"));
}

/// A directory of a tree whose links are removed, and the opening that the system refuses.
struct Refused {
  const char *name;
  int after;
  mode_t mode;
  bool linkStays;
};

class RefusedOpeningTest : public NewDirectoriesFailureTest, public ::testing::WithParamInterface<Refused> {};

TEST_P(RefusedOpeningTest, LeavesTheModes) {
  const std::string inner = makeDirectory("tree/inner");
  fs::create_symlink("/nowhere", inner + "/link");
  ASSERT_EQ(chmod(inner.c_str(), GetParam().mode), 0);
  failCall("openat", EMFILE).on(GetParam().name).after(GetParam().after);
  removeSymbolicLinks(home() + "tree");
  restoreSystemCalls();
  EXPECT_EQ(modeOf(inner), GetParam().mode);
  EXPECT_EQ(fs::is_symlink(inner + "/link"), GetParam().linkStays);
}

// A directory is opened three times: to be held, to be entered, and for the way back from those below it.
INSTANTIATE_TEST_SUITE_P(Openings, RefusedOpeningTest,
                         ::testing::Values(Refused{"inner", 0, 0755, true}, Refused{"inner", 1, 0755, true},
                                           Refused{"inner", 1, 0500, true}, Refused{".", 0, 0755, true},
                                           Refused{".", 1, 0755, true}, Refused{"..", 0, 0500, false}));

TEST_F(NewDirectoriesFailureTest, LinksOfADirectoryThatStaysClosedAreRemovedAllTheSame) {
  const std::string closed = makeDirectory("tree/closed");
  fs::create_symlink("/nowhere", closed + "/link");
  ASSERT_EQ(chmod(closed.c_str(), 0500), 0);
  failCall("fchmod", EPERM);
  removeSymbolicLinks(home() + "tree");
  restoreSystemCalls();
  // Whether a closed directory lets its links go is the system's choice: root may remove them.
  EXPECT_EQ(fs::is_symlink(closed + "/link"), geteuid() != 0);
  EXPECT_EQ(modeOf(closed), 0500U);
}

} // namespace
