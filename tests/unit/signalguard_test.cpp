// Signals that wait for the end of a step.
#include "signalguard.h"

#include <gtest/gtest.h>

namespace {

volatile std::sig_atomic_t arrived = 0;

class SignalGuardTest : public ::testing::TestWithParam<int> {
protected:
  void SetUp() override {
    arrived = 0;
    before_ = std::signal(GetParam(), [](int number) { arrived = number; });
  }
  void TearDown() override { std::signal(GetParam(), before_); }

private:
  void (*before_)(int) = nullptr;
};

TEST_P(SignalGuardTest, SignalActsRightAfterTheStep) {
  {
    const SignalGuard guard;
    ASSERT_EQ(std::raise(GetParam()), 0);
    EXPECT_EQ(arrived, 0);
  }
  EXPECT_EQ(arrived, GetParam());
}

TEST_P(SignalGuardTest, WhatWasBlockedBeforeStaysBlocked) {
  sigset_t own;
  sigemptyset(&own);
  sigaddset(&own, GetParam());
  sigset_t before;
  ASSERT_EQ(sigprocmask(SIG_BLOCK, &own, &before), 0);
  { const SignalGuard guard; }
  ASSERT_EQ(std::raise(GetParam()), 0);
  EXPECT_EQ(arrived, 0);
  ASSERT_EQ(sigprocmask(SIG_SETMASK, &before, nullptr), 0);
  EXPECT_EQ(arrived, GetParam());
}

INSTANTIATE_TEST_SUITE_P(Ending, SignalGuardTest, ::testing::Values(SIGINT, SIGTERM, SIGHUP, SIGQUIT));

} // namespace
