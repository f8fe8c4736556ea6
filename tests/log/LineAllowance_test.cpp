#include "platform/linux/log/LineAllowance.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;

class LineAllowanceTest : public ::testing::Test {
 protected:
  // How many of so many lines are allowed.
  std::size_t write(std::size_t lines) {
    std::size_t allowed = 0;
    for (std::size_t i = 0; i < lines; ++i) allowed += allowance.line(now) ? 1U : 0U;
    return allowed;
  }

  static constexpr LineAllowance::Rate kRate{7, milliseconds(50)};
  LineAllowance allowance{kRate};
  LineAllowance::Time now{std::chrono::hours(1)};
};

TEST_F(LineAllowanceTest, SoManyLinesMayComeAtOnceAndNoMore) {
  EXPECT_EQ(write(kRate.linesAtOnce + 5), kRate.linesAtOnce);
  EXPECT_EQ(write(1), 0U);
}

TEST_F(LineAllowanceTest, TimeBringsOneLineAfterTheOtherBack) {
  write(kRate.linesAtOnce);
  now += kRate.timeForALine - milliseconds(1);
  EXPECT_EQ(write(1), 0U);
  now += milliseconds(1);
  EXPECT_EQ(write(2), 1U);
  now += 3 * kRate.timeForALine;
  EXPECT_EQ(write(9), 3U);
}

TEST_F(LineAllowanceTest, DoesNotGrowBeyondTheWhole) {
  write(3);
  now += 2 * kRate.linesAtOnce * kRate.timeForALine;
  EXPECT_EQ(write(kRate.linesAtOnce + 5), kRate.linesAtOnce);
}

TEST_F(LineAllowanceTest, WhatIsLeftOutIsToldOnceAWhileAfterItsFirstLine) {
  EXPECT_EQ(allowance.dueCount(now), 0U);
  EXPECT_FALSE(allowance.timeOfCount());
  write(kRate.linesAtOnce + 5);
  const auto due = now + LineAllowance::kTimeUntilCount;
  EXPECT_EQ(allowance.timeOfCount(), due);
  now = due - milliseconds(1);
  EXPECT_EQ(allowance.dueCount(now), 0U);
  write(kRate.linesAtOnce + 2);
  now = due;
  EXPECT_EQ(allowance.dueCount(now), 7U);
  EXPECT_EQ(allowance.dueCount(now), 0U);
  EXPECT_FALSE(allowance.timeOfCount());
}

TEST_F(LineAllowanceTest, InTheEndWhatIsLeftOutIsToldOnceAndAtOnce) {
  EXPECT_EQ(allowance.finish(), 0U);
  write(kRate.linesAtOnce + 2);
  EXPECT_EQ(allowance.finish(), 2U);
  EXPECT_EQ(allowance.finish(), 0U);
}

TEST_F(LineAllowanceTest, IsUntouchedBeforeTheFirstLineAndWhenAllHasComeBackAndBeenTold) {
  EXPECT_TRUE(allowance.isUntouched(now));
  write(1);
  EXPECT_FALSE(allowance.isUntouched(now));
  now += kRate.timeForALine;
  EXPECT_TRUE(allowance.isUntouched(now));
  write(kRate.linesAtOnce + 1);
  now += 2 * LineAllowance::kTimeUntilCount;
  EXPECT_FALSE(allowance.isUntouched(now)) << "something was left out";
  EXPECT_EQ(allowance.dueCount(now), 1U);
  EXPECT_TRUE(allowance.isUntouched(now));
}

}  // namespace
}  // namespace docuvend::linux_platform
