// How long an installation still takes, by what it has done.
#include "transaction/progress.h"

#include <gtest/gtest.h>

namespace {

TEST(CtlProgress, TellsNoTimeBeforeThereIsSomethingToTellItFrom) {
  EXPECT_FALSE(secondsLeft(0, 100, 60));
  EXPECT_FALSE(secondsLeft(5, 100, 0.9));
}

TEST(CtlProgress, TakesTheRestToGoOnAsTheFilesBefore) {
  EXPECT_EQ(secondsLeft(50, 100, 30).value_or(-1), 30);
  EXPECT_EQ(secondsLeft(1, 50000, 1).value_or(-1), 49999);
  EXPECT_EQ(secondsLeft(75, 100, 10).value_or(-1), 3); // 3.3
  EXPECT_EQ(secondsLeft(100, 100, 30).value_or(-1), 0);
  EXPECT_EQ(secondsLeft(110, 100, 30).value_or(-1), 0); // a file that two patches bring
}

} // namespace
