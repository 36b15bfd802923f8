// A file held by its descriptor.
#include "heldfile.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "scratch.h"

namespace {

using HeldFileTest = ScratchHome;

TEST_F(HeldFileTest, NothingHeldTakesNeitherOwnerNorMode) {
  const HeldFile missing(home() + "missing", HeldFile::Kind::Regular);
  struct stat status = {};
  EXPECT_FALSE(missing.isHeld());
  EXPECT_FALSE(missing.isLink());
  EXPECT_FALSE(missing.setOwner(geteuid(), getegid()));
  EXPECT_FALSE(missing.setMode(0600));
  EXPECT_FALSE(missing.look(status));
}

TEST(FileIdentityTest, DeviceAndInodeCount) {
  const FileIdentity one = {1, 2};
  EXPECT_TRUE(one == (FileIdentity{1, 2}));
  EXPECT_FALSE(one == (FileIdentity{1, 3}));
  EXPECT_FALSE(one == (FileIdentity{2, 2}));
}

} // namespace
