// The patch history: what counts as a record, and when it was written.
#include "history.h"

#include <cstdlib>

#include <gmock/gmock.h>

#include "judgement.h"
#include "scratch.h"
#include "utilities.h"

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

const std::string header = std::string(80, '#') +
                           "\n# Norvik Veyra Monitoring Patch History File\n#\n"
                           "# Format: <Product Code> | <Architecture>\n" +
                           std::string(80, '#') + "\n";

std::string record(const std::string &name, const std::string &time = "03/09/2026 14:05:00") {
  return "kyn | lpp266 | vema | " + name + " | PASS | root            | " + time + "\n";
}

/// Local times are of this zone as long as it lives.
class Zone {
public:
  explicit Zone(const char *name) {
    setenv("TZ", name, 1);
    tzset();
  }
  Zone(const Zone &) = delete;
  Zone &operator=(const Zone &) = delete;
  ~Zone() {
    unsetenv("TZ");
    tzset();
  }
};

constexpr const char *Berlin = "CET-1CEST,M3.5.0,M10.5.0/3";

std::vector<std::time_t> moments(const std::string &time) {
  return momentsOf(parseHistory(record("x", time)).records.at(0));
}

TEST(CtlHistory, ReadsTheFieldsWithoutTheirPadding) {
  const History history = parseHistory(header + record("fixpack 2           "));
  ASSERT_THAT(history.records, SizeIs(1));
  const HistoryRecord &first = history.records.front();
  EXPECT_EQ(first.line, 6U);
  EXPECT_EQ(first.product, "kyn");
  EXPECT_EQ(first.platform, "lpp266");
  EXPECT_EQ(first.target, "vema");
  EXPECT_EQ(first.name, "fixpack 2");
  EXPECT_EQ(first.result, "PASS");
  EXPECT_EQ(first.user, "root");
  EXPECT_EQ(first.time, "03/09/2026 14:05:00");
  EXPECT_THAT(history.foreign, IsEmpty());
}

TEST(CtlHistory, ANameMayHoldSeparators) {
  EXPECT_EQ(parseHistory(record("a | b | FAIL")).records.at(0).name, "a | b | FAIL");
}

TEST(CtlHistory, ARecordMayLackItsTime) {
  const History history = parseHistory(record("x", ""));
  ASSERT_THAT(history.records, SizeIs(1));
  EXPECT_EQ(history.records[0].time, "");
  EXPECT_EQ(dayOf(history.records[0]), "");
  EXPECT_THAT(momentsOf(history.records[0]), IsEmpty());
}

TEST(CtlHistory, WhatIsNoRecordIsKeptWithItsLine) {
  const std::string texts[] = {"PASS", "kyn | lpp266 | vema | x | DONE | root | 03/09/2026 14:05:00",
                               "kyn | lpp266 | vema | x | PASS | root | yesterday",
                               "kyn | lpp266 | PASS | root | 03/09/2026 14:05:00"};
  for (const std::string &text : texts) {
    const History history = parseHistory(header + text);
    EXPECT_THAT(history.records, IsEmpty()) << text;
    ASSERT_THAT(history.foreign, SizeIs(1)) << text;
    EXPECT_EQ(history.foreign[0].line, 6U);
    EXPECT_EQ(history.foreign[0].text, text);
  }
}

TEST(CtlHistory, TheLastLineMayLackItsEnd) {
  std::string text = record("x") + record("y");
  text.pop_back();
  EXPECT_THAT(parseHistory(text).records, SizeIs(2));
}

TEST(CtlHistory, TheDayIsThatOfTheRecord) {
  EXPECT_EQ(dayOf(parseHistory(record("x")).records.at(0)), "2026-03-09");
}

TEST(CtlHistory, ALocalTimeIsOneMoment) {
  const Zone zone(Berlin);
  EXPECT_THAT(moments("01/02/2026 12:00:00"), ElementsAre(1767351600));
  EXPECT_THAT(moments("07/02/2026 12:00:00"), ElementsAre(1782986400));
}

TEST(CtlHistory, TheHourThatComesTwiceIsTwoMoments) {
  const Zone zone(Berlin);
  EXPECT_THAT(moments("10/25/2026 02:30:00"), testing::UnorderedElementsAre(1792888200, 1792891800));
}

TEST(CtlHistory, WithoutSummerTimeThereIsOneMoment) {
  const Zone zone("UTC0");
  EXPECT_THAT(moments("10/25/2026 02:30:00"), ElementsAre(1792895400));
}

class CtlHistoryFile : public ScratchHome {};

TEST_F(CtlHistoryFile, AHomeWithoutOneHasNoRecords) {
  EXPECT_THAT(readHistory(home()).records, IsEmpty());
}

TEST_F(CtlHistoryFile, IsReadFromTheHome) {
  write("patchlogs/patches.hist", header + record("x"));
  EXPECT_THAT(readHistory(home()).records, SizeIs(1));
}

TEST_F(CtlHistoryFile, ADirectoryInItsPlaceCannotBeJudged) {
  makeDirectory("patchlogs/patches.hist");
  EXPECT_THROW(readHistory(home()), JudgementError);
}

} // namespace
