// The day of a run, from the one history line that it can have written.
#include "rundate.h"

#include <gtest/gtest.h>

namespace {

std::string record(const std::string &time, const std::string &result = "PASS",
                   const std::string &user = "root", const std::string &target = "vema") {
  return "kyn | lpp266 | " + target + " | x | " + result + " | " + user + " | " + time + "\n";
}

LogAttempt attempt(int from, int to, int days = 0) {
  return {"kyn_lpp266_vema_fp0002.tar", true, from, to, days};
}

constexpr int Two = 14 * 3600;

std::string dayOfRun(const std::string &history, const LogAttempt &made) {
  return RunDates(parseHistory(history)).dateOf(made, "root").day;
}

TEST(CtlRunDate, IsThatOfTheOneLine) {
  const RunDates dates(parseHistory("# comment\n" + record("03/09/2026 14:00:01")));
  const RunDate found = dates.dateOf(attempt(Two, Two + 2), "root");
  EXPECT_EQ(found.day, "2026-03-09");
  EXPECT_EQ(found.line, 2U);
}

TEST(CtlRunDate, IsNotKnownWhenNothingFits) {
  EXPECT_EQ(dayOfRun("", attempt(Two, Two)), "");
  EXPECT_EQ(dayOfRun(record("03/09/2026 14:00:03"), attempt(Two, Two + 2)), "");
  EXPECT_EQ(dayOfRun(record("03/09/2026 14:00:00", "FAIL"), attempt(Two, Two)), "");
  EXPECT_EQ(dayOfRun(record("03/09/2026 14:00:00", "PASS", "jo"), attempt(Two, Two)), "");
  EXPECT_EQ(dayOfRun(record("03/09/2026 14:00:00", "PASS", "root", "vems"), attempt(Two, Two)), "");
  EXPECT_EQ(dayOfRun(record(""), attempt(Two, Two)), "");
  EXPECT_EQ(dayOfRun(record(""), attempt(-1, -1)), "");
}

TEST(CtlRunDate, IsNotCertainWhenTwoLinesFit) {
  EXPECT_EQ(dayOfRun(record("03/09/2026 14:00:00") + record("03/10/2026 14:00:00"), attempt(Two, Two)), "");
}

TEST(CtlRunDate, IsTheDayOfTheFirstMessage) {
  EXPECT_EQ(dayOfRun(record("03/01/2026 14:00:00"), attempt(Two, Two, 1)), "2026-02-28");
  EXPECT_EQ(dayOfRun(record("01/01/2026 00:00:00"), attempt(86399, 1)), "2025-12-31")
      << "midnight passed before the line was written";
  EXPECT_EQ(dayOfRun(record("12/31/2025 23:59:59"), attempt(86399, 1)), "2025-12-31");
}

} // namespace
