// Writing when the system takes nothing.
#include "filedescriptor.h"

#include <cerrno>

#include <fcntl.h>
#include <gtest/gtest.h>

#include "systemcalls.h"

namespace {

class WriteTest : public SystemCallTest {};

TEST_F(WriteTest, ThatIsAnsweredWithNothingIsAFailureAndNoLoop) {
  const std::string path = write("file", "");
  const FileDescriptor file(path.c_str(), O_WRONLY);
  limitTransfers(0);
  const bool written = file.write("text");
  const int reason = errno;
  EXPECT_FALSE(written);
  EXPECT_EQ(reason, ENOSPC);
  EXPECT_EQ(callsOf("write"), 1);
}

TEST_F(WriteTest, ThatIsTakenInPiecesGoesOnToTheEnd) {
  const std::string path = write("file", "");
  const FileDescriptor file(path.c_str(), O_WRONLY);
  limitTransfers(3);
  EXPECT_TRUE(file.write("12345678"));
  EXPECT_EQ(callsOf("write"), 3);
  restoreSystemCalls();
  EXPECT_EQ(read(path), "12345678");
}

} // namespace
