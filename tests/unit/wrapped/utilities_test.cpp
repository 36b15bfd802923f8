// Look-ups and the reading of files when the system refuses what they need.
#include "utilities.h"

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <pwd.h>

#include "systemcalls.h"

namespace {

constexpr int InvalidArgument = 22;

LogLine utilTrace(const std::string &message) {
  return trace("utilities.cpp", message);
}
LogLine utilError(const std::string &message) {
  return error("utilities.cpp", message);
}

class LookUpFailureTest : public SystemCallTest {};

TEST_F(LookUpFailureTest, UserWithoutAnEntryHasAnEmptyName) {
  failCall("getpwuid", 0);
  EXPECT_EQ(Util::getUserName(), "");
}

TEST_F(LookUpFailureTest, UserNameIsThatOfTheRealUser) {
  constexpr uid_t SomeOther = 1;
  const passwd *entry = getpwuid(SomeOther);
  if (entry == nullptr)
    GTEST_SKIP() << "needs a user with the id 1";
  const std::string name = entry->pw_name;
  answerUser(SomeOther);
  EXPECT_EQ(Util::getUserName(), name);
}

TEST_F(LookUpFailureTest, UserZeroIsRoot) {
  answerUser(0);
  EXPECT_EQ(Util::getUserName(), "root");
}

TEST_F(LookUpFailureTest, HostThatTheSystemDoesNotNameHasAnEmptyName) {
  failCall("uname", EFAULT);
  EXPECT_EQ(Util::getHostName(), "");
}

struct NodeName {
  const char *name;
  const char *node;
  const char *host;
};

class HostNameTest : public SystemCallTest, public ::testing::WithParamInterface<NodeName> {};

TEST_P(HostNameTest, IsTheNodeNameUpToItsFirstDot) {
  answerNodeName(GetParam().node);
  EXPECT_EQ(Util::getHostName(), GetParam().host);
}

INSTANTIATE_TEST_SUITE_P(Nodes, HostNameTest,
                         ::testing::Values(NodeName{"WithDomain", "build7.lab.local", "build7"},
                                           NodeName{"WithoutADot", "build7", "build7"},
                                           NodeName{"DotAtItsEnd", "build7.", "build7"},
                                           NodeName{"DotAtItsStart", ".local", ""}),
                         [](const auto &node) { return node.param.name; });

TEST_F(LookUpFailureTest, UnknownCurrentDirectoryIsEmpty) {
  failCall("getcwd", EACCES);
  EXPECT_EQ(Util::getCurrentDirectory(), "");
}

TEST_F(LookUpFailureTest, RefusedChangeOfDirectoryIsFalse) {
  failCall("chdir", EACCES);
  EXPECT_FALSE(Util::setCurrentDirectory(home()));
}

TEST_F(LookUpFailureTest, PathThatIsNotAccessibleDoesNotExist) {
  const std::string path = write("file", "");
  failCall("access", EACCES).on(path);
  EXPECT_FALSE(Util::pathExists(path));
  EXPECT_EQ(logLines(), (LogLines{utilTrace("Util::pathExists(" + path + ") entry"),
                                  utilTrace("Path does not exist: " + path),
                                  utilTrace("Util::pathExists(" + path + ") exit")}));
}

TEST_F(LookUpFailureTest, ServersWhoseProbesAreNotAccessibleAreNotInstalled) {
  write("config/.ConfigData/kqaenv", "");
  write("registry/ptli6263.ver", "");
  write("registry/dkli6263.ver", "");
  failCall("access", EACCES);
  EXPECT_FALSE(Util::isVEMSInstalled());
  EXPECT_FALSE(Util::isVEPSInstalled("li6263"));
  EXPECT_FALSE(Util::isVEPDInstalled("li6263"));
}

TEST_F(LookUpFailureTest, ConsoleDoesNotRunWhenNobodyCanBeAsked) {
  failCall("fork", EAGAIN);
  EXPECT_FALSE(Util::isManageGUIRunning());
}

TEST_F(LookUpFailureTest, VariableThatFindsNoRoomEndsTheProcess) {
  failCall("putenv", ENOMEM);
  EXPECT_EXIT(Util::setEnvironment("QUILLHOME", "/elsewhere/"), ::testing::ExitedWithCode(71),
              "^orvpatch: out of memory\n$");
}

class ReadFileFailureTest : public SystemCallTest {
protected:
  static constexpr std::size_t Size = 12345;

  void SetUp() override {
    SystemCallTest::SetUp();
    path_ = write("file", std::string(Size, 'c'));
  }

  struct FreeDeleter {
    void operator()(char *buffer) const { free(buffer); }
  };
  using Buffer = std::unique_ptr<char, FreeDeleter>;

  int readFile(Buffer &buffer) {
    char notABuffer = 0;
    char *result = &notABuffer;
    const int errorNumber = Util::readFile(path_.c_str(), &result);
    buffer.reset(result);
    return errorNumber;
  }

  void expectFailure(int result, const LogLines &between) {
    Buffer buffer;
    EXPECT_EQ(readFile(buffer), result);
    EXPECT_EQ(buffer, nullptr);
    EXPECT_EQ(logLines(),
              framed(utilTrace("Util::readFile(" + path_ + ") entry"), between,
                     utilTrace("Util::readFile(" + path_ + ")=" + std::to_string(result) + "((nil)) exit")));
  }

  std::string path_;
};

TEST_F(ReadFileFailureTest, FailingStatusHandsItsErrorNumberBack) {
  failCall("stat", EACCES).on(path_);
  expectFailure(EACCES, {utilError("unable to stat file: " + path_)});
}

TEST_F(ReadFileFailureTest, FailingStatusWithoutAnErrorNumberIsAnInvalidArgument) {
  failCall("stat", 0).on(path_);
  expectFailure(InvalidArgument, {utilError("unable to stat file: " + path_)});
}

TEST_F(ReadFileFailureTest, FileThatCannotBeOpenedIsAnInvalidArgument) {
  failCall("open", EACCES).on(path_);
  expectFailure(InvalidArgument, {utilError("unable to open file: " + path_)});
}

TEST_F(ReadFileFailureTest, FileOfNegativeSizeIsAnInvalidArgument) {
  failCall("lseek", EINVAL);
  expectFailure(InvalidArgument, {});
}

TEST_F(ReadFileFailureTest, FileWhoseStartIsNotFoundAgainIsAnInvalidArgument) {
  failCall("lseek", EIO).after(1);
  expectFailure(InvalidArgument, {});
}

TEST_F(ReadFileFailureTest, FileThatFindsNoMemoryIsAnInvalidArgument) {
  failAllocationOf(Size + 1);
  expectFailure(InvalidArgument, {utilError("Unable to allocate file buffer: " + path_)});
}

TEST_F(ReadFileFailureTest, LinesThatFindNoMemoryAreNone) {
  failAllocationOf(Size + 1);
  std::vector<std::string> lines = {"left over"};
  EXPECT_EQ(Util::readFileByLines(path_.c_str(), lines), InvalidArgument);
  EXPECT_EQ(lines, std::vector<std::string>{});
}

TEST_F(ReadFileFailureTest, PartOfAFileIsNotTakenForTheFile) {
  limitTransfers(1000);
  failCall("read", EIO).after(3);
  Buffer buffer;
  EXPECT_EQ(readFile(buffer), EIO);
  EXPECT_EQ(buffer, nullptr);
}

TEST_F(ReadFileFailureTest, FileThatShrinksMeanwhileEndsAfterWhatWasRead) {
  endReadsAfter(5000);
  Buffer buffer;
  EXPECT_EQ(readFile(buffer), 0);
  ASSERT_NE(buffer, nullptr);
  EXPECT_EQ(std::string(buffer.get()), std::string(5000, 'c'));
}

TEST_F(ReadFileFailureTest, InterruptedReadIsTakenUpAgain) {
  failCall("read", EINTR).times(2);
  Buffer buffer;
  EXPECT_EQ(readFile(buffer), 0);
  EXPECT_EQ(std::string(buffer.get()), std::string(Size, 'c'));
}

TEST_F(ReadFileFailureTest, FileReadInPiecesIsWhole) {
  limitTransfers(1000);
  Buffer buffer;
  EXPECT_EQ(readFile(buffer), 0);
  restoreSystemCalls();
  EXPECT_EQ(std::string(buffer.get()), std::string(Size, 'c'));
}

} // namespace
