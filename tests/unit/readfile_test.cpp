// Reading whole files: as one buffer and as lines.
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "scratch.h"
#include "utilities.h"

namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;

constexpr int InvalidArgument = 22;

LogLine utilTrace(const std::string &message) {
  return trace("utilities.cpp", message);
}

struct FreeDeleter {
  void operator()(char *buffer) const { free(buffer); }
};

/// A result of readFile, and its buffer, which starts as a pointer that readFile has to replace.
struct ReadFile {
  explicit ReadFile(const char *name) {
    char notABuffer = 0;
    char *read = &notABuffer;
    result = Util::readFile(name, &read);
    buffer.reset(read);
  }
  int result;
  std::unique_ptr<char, FreeDeleter> buffer;
};

class ReadFileTest : public ScratchHome {
protected:
  LogLine entry(const std::string &name) { return utilTrace("Util::readFile(" + name + ") entry"); }

  LogLine failedExit(const std::string &name, int result) {
    return utilTrace("Util::readFile(" + name + ")=" + std::to_string(result) + "((nil)) exit");
  }
};

TEST_F(ReadFileTest, WholeFileIsReadIntoATerminatedBuffer) {
  const std::string content = "one\r\n\ntwo \xff\n";
  const ReadFile file(write("file", content).c_str());
  EXPECT_EQ(file.result, 0);
  ASSERT_NE(file.buffer, nullptr);
  EXPECT_STREQ(file.buffer.get(), content.c_str());
}

TEST_F(ReadFileTest, BytesAfterANulAreReadToo) {
  const std::string content("a\0b\0", 4);
  const ReadFile file(write("file", content).c_str());
  ASSERT_NE(file.buffer, nullptr);
  EXPECT_EQ(std::string(file.buffer.get(), content.size() + 1), content + std::string(1, '\0'));
}

TEST_F(ReadFileTest, EmptyFileIsAnEmptyText) {
  const ReadFile file(write("file", "").c_str());
  EXPECT_EQ(file.result, 0);
  ASSERT_NE(file.buffer, nullptr);
  EXPECT_STREQ(file.buffer.get(), "");
}

TEST_F(ReadFileTest, LargeFileIsReadToItsEnd) {
  const std::string content(3 * 1000 * 1000, 'c');
  const ReadFile file(write("file", content).c_str());
  ASSERT_NE(file.buffer, nullptr);
  EXPECT_EQ(std::strlen(file.buffer.get()), content.size());
}

TEST_F(ReadFileTest, SuccessIsTracedWithTheBuffer) {
  const std::string path = write("file", "text");
  const ReadFile file(path.c_str());
  char exit[256];
  std::snprintf(exit, sizeof exit, "Util::readFile(%s)=0(%p) exit", path.c_str(),
                static_cast<const void *>(file.buffer.get()));
  EXPECT_EQ(logLines(), (LogLines{entry(path), utilTrace(exit)}));
}

TEST_F(ReadFileTest, OmittedNameIsAnInvalidArgument) {
  const ReadFile file(nullptr);
  EXPECT_EQ(file.result, InvalidArgument);
  EXPECT_EQ(file.buffer, nullptr);
  const LogLines logged = logLines();
  ASSERT_EQ(logged.size(), 3U);
  EXPECT_THAT(logged[0].message, ::testing::EndsWith(" entry"));
  EXPECT_EQ(logged[1], error("utilities.cpp", "filename omitted"));
  EXPECT_THAT(logged[2].message, ::testing::EndsWith(")=22((nil)) exit"));
}

TEST_F(ReadFileTest, MissingFileIsReportedWithItsErrorNumber) {
  const std::string path = home() + "gone";
  const ReadFile file(path.c_str());
  EXPECT_EQ(file.result, ENOENT);
  EXPECT_EQ(file.buffer, nullptr);
  EXPECT_EQ(logLines(), (LogLines{entry(path), error("utilities.cpp", "unable to stat file: " + path),
                                  failedExit(path, ENOENT)}));
}

TEST_F(ReadFileTest, EachReasonOfStatIsHandedBack) {
  fs::create_symlink("loop", home() + "loop");
  EXPECT_EQ(ReadFile((write("file", "") + "/below").c_str()).result, ENOTDIR);
  EXPECT_EQ(ReadFile((home() + "loop").c_str()).result, ELOOP);
  EXPECT_EQ(ReadFile((home() + std::string(300, 'n')).c_str()).result, ENAMETOOLONG);
  EXPECT_EQ(ReadFile("").result, ENOENT);
}

TEST_F(ReadFileTest, DirectoryIsAnInvalidArgument) {
  const std::string path = makeDirectory("dir");
  const ReadFile file(path.c_str());
  EXPECT_EQ(file.result, InvalidArgument);
  EXPECT_EQ(file.buffer, nullptr);
  EXPECT_EQ(logLines(), (LogLines{entry(path), utilTrace("Directory specified instead of a file: " + path),
                                  failedExit(path, InvalidArgument)}));
}

TEST_F(ReadFileTest, FileThatCannotBeOpenedIsAnInvalidArgument) {
  REQUIRE_ORDINARY_USER();
  const std::string path = write("secret", "text", 0);
  const ReadFile file(path.c_str());
  EXPECT_EQ(file.result, InvalidArgument);
  EXPECT_EQ(file.buffer, nullptr);
  EXPECT_EQ(logLines(), (LogLines{entry(path), error("utilities.cpp", "unable to open file: " + path),
                                  failedExit(path, InvalidArgument)}));
}

TEST_F(ReadFileTest, FileWhoseSizeNeedsMoreThan31BitsIsAnInvalidArgument) { // KEEP(size-limit)
  const std::string path = write("huge", "");
  for (const off_t size : {off_t{2147483647}, off_t{2147483648}, off_t{5} << 30}) {
    ASSERT_EQ(truncate(path.c_str(), size), 0);
    const ReadFile file(path.c_str());
    EXPECT_EQ(file.result, InvalidArgument) << size;
    EXPECT_EQ(file.buffer, nullptr) << size;
  }
}

TEST_F(ReadFileTest, FifoAndDeviceAreInvalidArgumentsAndNeverWaitedFor) {
  const std::string fifo = home() + "fifo";
  ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
  for (const std::string &path : {fifo, std::string("/dev/zero"), std::string("/dev/null")}) {
    const ReadFile file(path.c_str());
    EXPECT_EQ(file.result, InvalidArgument);
    EXPECT_EQ(file.buffer, nullptr);
    EXPECT_EQ(logLines(),
              (LogLines{entry(path), utilTrace("Special file specified instead of a file: " + path),
                        failedExit(path, InvalidArgument)}));
  }
}

TEST_F(ReadFileTest, LinkToAFileIsFollowed) {
  write("file", "text");
  fs::create_symlink("file", home() + "link");
  const ReadFile file((home() + "link").c_str());
  EXPECT_EQ(file.result, 0);
  EXPECT_STREQ(file.buffer.get(), "text");
}

struct FileOfLines {
  const char *name;
  std::string content;
  Lines lines;
};

class ReadFileByLinesTest : public ScratchHome, public ::testing::WithParamInterface<FileOfLines> {};

TEST_P(ReadFileByLinesTest, YieldsTheLinesThatAreNotEmpty) {
  Lines lines;
  EXPECT_EQ(Util::readFileByLines(write("file", GetParam().content).c_str(), lines), 0);
  EXPECT_EQ(lines, GetParam().lines);
}

INSTANTIATE_TEST_SUITE_P(
    Files, ReadFileByLinesTest,
    ::testing::Values(
        FileOfLines{"FinalTerminatorAddsAnEmptyOne", "a\nb\n", {"a", "b", ""}}, // KEEP(final-empty-line)
        FileOfLines{"NoFinalTerminator", "a\nb", {"a", "b"}},
        FileOfLines{"CarriageReturnLineFeed", "a\r\nb\r\n", {"a", "b", ""}},
        FileOfLines{"BothKindsMixed", "a\r\nb\nc\r\nd", {"a", "b", "c", "d"}},
        FileOfLines{"BlankLinesVanish", "a\n\n\r\n\nb\n", {"a", "b", ""}},
        FileOfLines{"LeadingBlankLinesVanish", "\n\r\na", {"a"}},
        FileOfLines{"LinesOfBlanksStay", "a\n \n\t\nb", {"a", " ", "\t", "b"}},
        FileOfLines{"Empty", "", {""}}, FileOfLines{"OnlyATerminator", "\n", {""}},
        FileOfLines{"OnlyTerminators", "\n\r\n\n", {""}},
        FileOfLines{"LoneCarriageReturnIsText", "a\rb\nc", {"a\rb", "c"}},
        FileOfLines{"LastOfTwoCarriageReturnsEndsTheLine", "a\r\r\nb", {"a\r", "b"}},
        FileOfLines{"FinalCarriageReturnIsText", "a\nb\r", {"a", "b\r"}},
        FileOfLines{"LineFeedCarriageReturn", "a\n\rb", {"a", "\rb"}},
        FileOfLines{"NulEndsTheText", std::string("a\nb\0c\nd\n", 8), {"a", "b"}},
        FileOfLines{"NulAfterATerminator", std::string("a\n\0b\n", 5), {"a", ""}},
        FileOfLines{"NulFirst", std::string("\0a\n", 3), {""}},
        FileOfLines{"NulBetweenCarriageReturnAndLineFeed", std::string("a\r\0\n", 4), {"a\r"}}),
    [](const auto &file) { return file.param.name; });

class ReadLinesTest : public ScratchHome {
protected:
  Lines lines_ = {"left", "over"};
};

TEST_F(ReadLinesTest, LinesReplaceWhatTheVectorHeld) {
  EXPECT_EQ(Util::readFileByLines(write("file", "new").c_str(), lines_), 0);
  EXPECT_EQ(lines_, Lines{"new"});
}

TEST_F(ReadLinesTest, SuccessIsTracedAroundTheReading) {
  const std::string path = write("file", "a\n");
  Util::readFileByLines(path.c_str(), lines_);
  EXPECT_EQ(withoutPointers(logLines()), (LogLines{utilTrace("Util::readFileByLines(" + path + ") entry"),
                                                   utilTrace("Util::readFile(" + path + ") entry"),
                                                   utilTrace("Util::readFile(" + path + ")=0(buffer) exit"),
                                                   utilTrace("Util::readFileByLines(" + path + ") exit")}));
}

TEST_F(ReadLinesTest, FailureOfTheReadingIsHandedBackWithoutLinesOrExitTrace) {
  const std::string path = home() + "gone";
  EXPECT_EQ(Util::readFileByLines(path.c_str(), lines_), ENOENT);
  EXPECT_EQ(lines_, Lines{});
  EXPECT_EQ(logLines(), (LogLines{utilTrace("Util::readFileByLines(" + path + ") entry"),
                                  utilTrace("Util::readFile(" + path + ") entry"),
                                  error("utilities.cpp", "unable to stat file: " + path),
                                  utilTrace("Util::readFile(" + path + ")=2((nil)) exit")}));
}

TEST_F(ReadLinesTest, DirectoryHasNoLines) {
  EXPECT_EQ(Util::readFileByLines(makeDirectory("dir").c_str(), lines_), InvalidArgument);
  EXPECT_EQ(lines_, Lines{});
}

TEST_F(ReadLinesTest, OmittedNameHasNoLines) {
  EXPECT_EQ(Util::readFileByLines(nullptr, lines_), InvalidArgument);
  EXPECT_EQ(lines_, Lines{});
  // As printf shows a null pointer.
  EXPECT_EQ(logLines(),
            (LogLines{utilTrace("Util::readFileByLines((null)) entry"),
                      utilTrace("Util::readFile((null)) entry"), error("utilities.cpp", "filename omitted"),
                      utilTrace("Util::readFile((null))=22((nil)) exit")}));
}

} // namespace
