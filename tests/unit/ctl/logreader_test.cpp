// The log's bytes, cut into headers and messages.
#include "logreader.h"

#include <gmock/gmock.h>

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

const std::string rule(78, '=');

std::string header(const std::string &user = "root", const std::string &pid = "4711") {
  return rule + "\n ORV Patch Log File\n   System Name: host1\n   User Name:   " + user +
         "\n   Process ID:  " + pid + "\n   Build Date:  3/5/07 21:48:44\n" + rule + "\n";
}

std::string line(const std::string &text, const std::string &time = "14:02:33") {
  return "TRACE " + time + " (main,12): " + text + "\n";
}

/// Keeps what it gets as texts.
class Found : public LogListener {
public:
  void onHeader(const LogHeader &header) override { headers.push_back(header); }
  void onMessage(const LogMessage &message) override {
    messages.push_back(message);
    texts.push_back(message.text);
  }
  void onStray() override { ++strays; }

  std::vector<LogHeader> headers;
  std::vector<LogMessage> messages;
  std::vector<std::string> texts;
  int strays = 0;
};

/// Reads a whole log, in pieces of this size.
void read(Found &found, const std::string &text, std::size_t piece = std::string::npos) {
  LogReader reader(found);
  for (std::size_t at = 0; at < text.size(); at += std::min(piece, text.size()))
    reader.feed(std::string_view(text).substr(at, piece));
  reader.finish();
}

TEST(CtlLogReader, ReadsTheFieldsOfAMessage) {
  Found found;
  read(found, "ERROR 14:02:33 (process.cpp,620): what, (it) is: x\nINFO  00:00:00 (a,1): \n");
  ASSERT_THAT(found.messages, SizeIs(2));
  EXPECT_EQ(found.messages[0].level, LogLevel::Error);
  EXPECT_EQ(found.messages[0].time, 14 * 3600 + 2 * 60 + 33);
  EXPECT_EQ(found.messages[0].component, "process.cpp");
  EXPECT_EQ(found.messages[0].line, 620);
  EXPECT_EQ(found.messages[0].text, "what, (it) is: x");
  EXPECT_EQ(found.messages[1].level, LogLevel::Info);
  EXPECT_EQ(found.messages[1].time, 0);
  EXPECT_EQ(found.messages[1].text, "");
}

TEST(CtlLogReader, ReadsTheFieldsOfAHeader) {
  Found found;
  read(found, line("before") + header("jo user", "17"));
  ASSERT_THAT(found.headers, SizeIs(1));
  EXPECT_EQ(found.headers[0].offset, line("before").size());
  EXPECT_EQ(found.headers[0].host, "host1");
  EXPECT_EQ(found.headers[0].user, "jo user");
  EXPECT_EQ(found.headers[0].pid, 17);
  EXPECT_THAT(found.texts, ElementsAre("before"));
}

TEST(CtlLogReader, PiecesOfAnySizeGiveTheSame) {
  const std::string text = header() + line("one\n\ntwo\n") + line("three") + header() + line("four");
  for (const std::size_t piece : {1U, 2U, 3U, 7U, 78U, 79U, 80U, 1000U}) {
    Found found;
    read(found, text, piece);
    EXPECT_THAT(found.texts, ElementsAre("one\n\ntwo\n", "three", "four")) << piece;
    ASSERT_THAT(found.headers, SizeIs(2)) << piece;
    EXPECT_EQ(found.headers[1].offset, text.size() - line("four").size() - header().size());
  }
}

TEST(CtlLogReader, WhatOnlyLooksLikeALineBelongsToTheMessage) {
  const std::string almost[] = {"TRACE 14:02:33 (main,12) no colon",
                                "TRACE 14:02 (main,12): short",
                                "TRACE 24:00:00 (main,12): hour",
                                "TRACE -1:00:00 (main,12): sign",
                                "trace 14:02:33 (main,12): case",
                                "TRACE 14:02:33 (main,x): number",
                                "TRACE 14:02:33 (ma(in,12): bracket",
                                " TRACE 14:02:33 (main,12): blank",
                                "INFO 14:02:33 (main,12): one blank",
                                rule,
                                rule + "\n ORV Patch Log File\n   System Name: x",
                                rule + "="};
  for (const std::string &text : almost) {
    Found found;
    read(found, line("first") + text + "\n" + line("second"));
    EXPECT_THAT(found.texts, ElementsAre("first\n" + text, "second"));
    EXPECT_THAT(found.headers, IsEmpty());
  }
}

TEST(CtlLogReader, AHeaderMayFollowARuleOfAMessage) {
  Found found;
  read(found, line("first") + rule + "\n" + header());
  EXPECT_THAT(found.texts, ElementsAre("first\n" + rule));
  EXPECT_THAT(found.headers, SizeIs(1));
}

TEST(CtlLogReader, ATimeMayBeMissing) {
  Found found;
  read(found, "TRACE  (main,12): x\n");
  ASSERT_THAT(found.messages, SizeIs(1));
  EXPECT_EQ(found.messages[0].time, -1);
}

TEST(CtlLogReader, LinesWithoutAMessageAreStrays) {
  Found found;
  read(found, "the end of a line\nanother\n" + line("first"));
  EXPECT_EQ(found.strays, 2);
  EXPECT_THAT(found.texts, ElementsAre("first"));
}

TEST(CtlLogReader, ACutLineIsTheLastOne) {
  Found found;
  std::string text = line("first") + line("second");
  text.resize(text.size() - 3);
  read(found, text);
  EXPECT_THAT(found.texts, ElementsAre("first", "seco"));
}

TEST(CtlLogReader, ACutHeaderIsNone) {
  Found found;
  read(found, line("first") + header().substr(0, 120));
  EXPECT_THAT(found.headers, IsEmpty());
  EXPECT_THAT(found.texts, SizeIs(1));
}

TEST(CtlLogReader, NulBytesAreBytes) {
  Found found;
  read(found, line(std::string("a\0b", 3)));
  EXPECT_THAT(found.texts, ElementsAre(std::string("a\0b", 3)));
}

TEST(CtlLogReader, KeepsTheStartOfALongMessageAndCountsTheRest) {
  const std::size_t size = 3 * LogReader::LongestMessage;
  const std::string longLine = line(std::string(size, 'x'));
  Found found;
  read(found, longLine, 1000);
  ASSERT_THAT(found.messages, SizeIs(1));
  EXPECT_EQ(found.messages[0].text.size() + found.messages[0].omitted, size);
  EXPECT_LE(found.messages[0].text.size(), LogReader::LongestMessage);
}

TEST(CtlLogReader, KeepsTheStartOfAMessageOfManyLinesToo) {
  std::string text = line("first");
  for (int i = 0; i < 10000; ++i)
    text += std::string(99, 'y') + "\n";
  Found found;
  read(found, text);
  ASSERT_THAT(found.messages, SizeIs(1));
  EXPECT_EQ(found.messages[0].text.size() + found.messages[0].omitted, 5U + 10000 * 100);
  EXPECT_LE(found.messages[0].text.size(), LogReader::LongestMessage);
}

TEST(CtlLogReader, SettledItHandsOutTheLastMessageAtOnce) {
  Found found;
  LogReader reader(found);
  reader.feed(line("first"));
  EXPECT_THAT(found.texts, IsEmpty()) << "another line of it could come";
  reader.settle();
  EXPECT_THAT(found.texts, ElementsAre("first"));
  reader.feed("TRACE 14:02");
  reader.settle();
  EXPECT_THAT(found.texts, SizeIs(1)) << "the line is not complete";
  reader.feed(":33 (main,12): second\n");
  reader.settle();
  reader.finish();
  EXPECT_THAT(found.texts, ElementsAre("first", "second"));
}

TEST(CtlLogReader, WritesTimesAsTheLogDoes) {
  EXPECT_EQ(clockText(0), "00:00:00");
  EXPECT_EQ(clockText(86399), "23:59:59");
  EXPECT_EQ(clockText(-1), "");
}

} // namespace
