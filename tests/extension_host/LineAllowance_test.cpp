#include "platform/linux/extension_host/LineAllowance.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

class LineAllowanceTest : public ::testing::Test {
 protected:
  // The number of lines that were allowed.
  std::size_t write(std::size_t lines) {
    std::size_t count = 0;
    for (std::size_t i = 0; i < lines; ++i) count += allowance.line(now).isAllowed ? 1U : 0U;
    return count;
  }

  LineAllowance allowance;
  LineAllowance::Time now{std::chrono::hours(1)};
};

TEST_F(LineAllowanceTest, TheFirstLinesOfAPeriodAreAllowedAndNoMore) {
  EXPECT_EQ(write(LineAllowance::kLinesOfAPeriod + 5), LineAllowance::kLinesOfAPeriod);
  now += LineAllowance::kPeriod - std::chrono::milliseconds(1);
  EXPECT_EQ(write(1), 0U);
}

TEST_F(LineAllowanceTest, TheNextPeriodHasItsOwnAndTellsOnceWhatTheLastOneDropped) {
  write(LineAllowance::kLinesOfAPeriod + 5);
  now += LineAllowance::kPeriod;
  const auto first = allowance.line(now);
  EXPECT_TRUE(first.isAllowed);
  EXPECT_EQ(first.droppedBefore, 5U);
  const auto second = allowance.line(now);
  EXPECT_TRUE(second.isAllowed);
  EXPECT_EQ(second.droppedBefore, 0U);
  EXPECT_EQ(write(LineAllowance::kLinesOfAPeriod), LineAllowance::kLinesOfAPeriod - 2);
}

TEST_F(LineAllowanceTest, APeriodBeginsWithItsFirstLine) {
  write(1);
  now += 3 * LineAllowance::kPeriod;
  write(LineAllowance::kLinesOfAPeriod);
  now += LineAllowance::kPeriod - std::chrono::milliseconds(1);
  EXPECT_EQ(write(1), 0U);
}

TEST_F(LineAllowanceTest, AtTheEndWhatWasDroppedIsToldOnce) {
  EXPECT_EQ(allowance.finish(), 0U);
  write(LineAllowance::kLinesOfAPeriod + 2);
  EXPECT_EQ(allowance.finish(), 2U);
  EXPECT_EQ(allowance.finish(), 0U);
}

}  // namespace
}  // namespace docuvend::linux_platform
