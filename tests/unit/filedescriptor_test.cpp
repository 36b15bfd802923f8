// A descriptor that closes itself; signals and shortages come with the wrapped tests of its users.
#include "filedescriptor.h"

#include <cerrno>
#include <string>
#include <utility>

#include <fcntl.h>
#include <gtest/gtest.h>

#include "scratch.h"

namespace {

class FileDescriptorTest : public ScratchHome {
protected:
  std::string readAll(const FileDescriptor &file) {
    char buffer[64];
    const ssize_t count = file.read(buffer, sizeof buffer);
    return count < 0 ? "failed" : std::string(buffer, static_cast<std::size_t>(count));
  }
};

TEST_F(FileDescriptorTest, WhatIsWrittenCanBeRead) {
  const std::string path = home() + "file";
  EXPECT_TRUE(FileDescriptor(path.c_str(), O_WRONLY | O_CREAT).write(std::string("text\0more", 9)));
  EXPECT_EQ(readAll(FileDescriptor(path.c_str(), O_RDONLY)), std::string("text\0more", 9));
}

TEST_F(FileDescriptorTest, TheEndOfAFileIsNoFailureWhateverFailedBefore) {
  const FileDescriptor file(write("empty", "").c_str(), O_RDONLY);
  errno = EINTR; // of an earlier call: a reader that looked at it here would read for ever
  EXPECT_EQ(readAll(file), "");
}

TEST_F(FileDescriptorTest, WhatCannotBeOpenedTakesNoPartInAnything) {
  const FileDescriptor file((home() + "gone").c_str(), O_RDONLY);
  EXPECT_FALSE(file.isOpen());
  EXPECT_FALSE(file.write("text"));
  EXPECT_EQ(errno, EBADF);
  EXPECT_EQ(readAll(file), "failed");
}

TEST_F(FileDescriptorTest, AssignmentToItselfKeepsItOpen) {
  FileDescriptor file(home().c_str(), O_RDONLY);
  FileDescriptor &same = file;
  file = std::move(same);
  EXPECT_TRUE(file.isOpen());
}

TEST_F(FileDescriptorTest, ClosesOnce) {
  FileDescriptor file(write("file", "").c_str(), O_RDONLY);
  const int number = file.get();
  EXPECT_TRUE(file.close());
  EXPECT_FALSE(file.isOpen());
  EXPECT_EQ(fcntl(number, F_GETFD), -1);
  EXPECT_TRUE(file.close()); // there is nothing left to close
}

TEST_F(FileDescriptorTest, IsClosedBehindItsScopeAndInChildren) {
  int number = -1;
  {
    const FileDescriptor file(write("file", "").c_str(), O_RDONLY);
    number = file.get();
    EXPECT_NE(fcntl(number, F_GETFD) & FD_CLOEXEC, 0);
  }
  EXPECT_EQ(fcntl(number, F_GETFD), -1);
}

} // namespace
