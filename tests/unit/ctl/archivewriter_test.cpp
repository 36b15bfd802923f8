// The archive of a source tree: order, owners, modes and times of its members.
#include "archivewriter.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "judgement.h"
#include "patcharchive.h"
#include "scratch.h"

namespace {

using ::testing::ElementsAre;

class ArchiveWriterTest : public ScratchHome {
protected:
  std::string make(const std::string &name, const std::string &content, unsigned mode, time_t time) const {
    const std::string path = write("tree/" + name, content, mode);
    const timespec times[2] = {{time, 5}, {time, 5}};
    EXPECT_EQ(utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0);
    return path;
  }
  std::vector<Member> written(std::optional<std::int64_t> latest = {}) const {
    writePatchArchive(home() + "tree", home() + "patch.tar", latest);
    const Listing listing = listArchive(home() + "patch.tar");
    EXPECT_EQ(listing.problem, "");
    return listing.members;
  }
};

std::vector<std::string> namesOf(const std::vector<Member> &members) {
  std::vector<std::string> names;
  names.reserve(members.size());
  for (const Member &member : members)
    names.push_back(member.name);
  return names;
}

TEST_F(ArchiveWriterTest, DescriptorComesFirstFilesLastAndTheRestByBytes) {
  for (const char *const name : {"updated_files/lib/b", "updated_files/lib/a", "updated_files/Z", "10-b.sh",
                                 "zeta/x", "patch.ini", "05-a.sh", ".hidden/y", ".gitignore", "zeta/.kept"})
    make(name, name, 0644, 1000);
  EXPECT_THAT(namesOf(written()),
              ElementsAre("patch.ini", "05-a.sh", "10-b.sh", "zeta/", "zeta/.kept", "zeta/x",
                          "updated_files/", "updated_files/Z", "updated_files/lib/", "updated_files/lib/a",
                          "updated_files/lib/b"));
}

TEST_F(ArchiveWriterTest, MembersBelongToRootAndHavePlainModes) {
  make("patch.ini", "", 0600, 1000);
  make("run.sh", "", 04711, 1000);
  make("updated_files/tool", "", 0700, 1000);
  make("updated_files/shared", "", 0666, 1000);
  ASSERT_EQ(chmod((home() + "tree/updated_files").c_str(), 0700), 0);
  std::vector<unsigned> modes;
  for (const Member &member : written()) {
    EXPECT_EQ(member.user, 0) << member.name;
    EXPECT_EQ(member.group, 0) << member.name;
    modes.push_back(member.mode);
  }
  EXPECT_THAT(modes, ElementsAre(0644U, 0755U, 0755U, 0644U, 0755U));
}

TEST_F(ArchiveWriterTest, DirectoriesBearTheTimeOfTheNewestFileAndNothingIsLaterThanTheLatest) {
  make("patch.ini", "", 0644, 1000);
  make("updated_files/new", "", 0644, 3000);
  make("updated_files/old", "", 0644, 500);
  const auto times = [](const std::vector<Member> &members) {
    std::vector<std::int64_t> found;
    found.reserve(members.size());
    for (const Member &member : members)
      found.push_back(member.time);
    return found;
  };
  EXPECT_THAT(times(written()), ElementsAre(1000, 3000, 3000, 500));
  EXPECT_THAT(times(written(2000)), ElementsAre(1000, 2000, 2000, 500));
}

TEST_F(ArchiveWriterTest, ContentOfSeveralBlocksAndTargetsOfLinksAreKept) {
  const std::string content(200001, 'x');
  make("updated_files/large", content, 0644, 1000);
  ASSERT_EQ(symlink("../else where", (home() + "tree/updated_files/link").c_str()), 0);
  writePatchArchive(home() + "tree", home() + "patch.tar", {});
  ArchiveReader reader(home() + "patch.tar");
  Member member;
  ASSERT_TRUE(reader.next(member));
  ASSERT_TRUE(reader.next(member));
  EXPECT_EQ(member.name, "updated_files/large");
  EXPECT_EQ(reader.content(content.size() + 1), content);
  ASSERT_TRUE(reader.next(member));
  EXPECT_EQ(member.type, Member::Type::SymbolicLink);
  EXPECT_EQ(member.linkTarget, "../else where");
  EXPECT_FALSE(reader.next(member));
  EXPECT_TRUE(reader.hasEndMark());
}

TEST_F(ArchiveWriterTest, WhatCannotBeReadOrWrittenIsNamed) {
  make("patch.ini", "", 0644, 1000);
  const auto reasonOf = [](const std::string &tree, const std::string &archive) {
    try {
      writePatchArchive(tree, archive, {});
    } catch (const JudgementError &error) {
      return std::string(error.what());
    }
    return std::string();
  };
  EXPECT_EQ(reasonOf(home() + "none", home() + "a"),
            "cannot read " + home() + "none: No such file or directory");
  EXPECT_THAT(reasonOf(home() + "tree", home() + "no/a"),
              ::testing::StartsWith("cannot write " + home() + "no/a: "));
  EXPECT_THAT(reasonOf(home() + "tree", "/dev/full"), ::testing::StartsWith("cannot write /dev/full: "));
}

} // namespace
