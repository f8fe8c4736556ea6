#include "platform/linux/log/LogAllowance.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class LogAllowanceTest : public ::testing::Test {
 protected:
  // How many of so many lines are allowed.
  std::size_t write(std::size_t lines, const std::string& subject = "one") {
    std::size_t allowed = 0;
    for (std::size_t i = 0; i < lines; ++i) allowed += allowance.line(subject, now) ? 1 : 0;
    return allowed;
  }
  // The counts that are due, as text.
  std::string counts() {
    std::string text;
    for (const auto& [subject, lines] : allowance.dueCounts(now)) text += subject + " " + std::to_string(lines) + "\n";
    return text;
  }

  static constexpr std::size_t kMost = LogAllowance::kLinesAtOnce;
  LogAllowance allowance;
  LogAllowance::Time now{std::chrono::hours(1)};
};

TEST_F(LogAllowanceTest, SoManyLinesMayComeAtOnceAndNoMore) {
  EXPECT_EQ(write(kMost + 5), kMost);
  EXPECT_EQ(write(1), 0U);
}

TEST_F(LogAllowanceTest, TimeBringsLinesBack) {
  write(kMost);
  now += 3 * LogAllowance::kTimeForALine;
  EXPECT_EQ(write(9), 3U);
}

TEST_F(LogAllowanceTest, EachSubjectHasItsOwn) {
  EXPECT_EQ(write(kMost + 1, "one"), kMost);
  EXPECT_EQ(write(kMost + 1, "two"), kMost);
  EXPECT_EQ(write(1, "one"), 0U) << "nor does another's coming forget it";
}

TEST_F(LogAllowanceTest, WhatIsLeftOutIsCountedAndToldOnceAndNotAtOnce) {
  EXPECT_EQ(counts(), "");
  write(kMost + 5);
  now += LineAllowance::kTimeUntilCount - milliseconds(1);
  EXPECT_EQ(counts(), "");
  write(kMost + 2);  // of which what has come back meanwhile is written
  const std::size_t back = (LineAllowance::kTimeUntilCount - milliseconds(1)) / LogAllowance::kTimeForALine;
  now += milliseconds(1);
  EXPECT_EQ(counts(), "one " + std::to_string(5 + kMost + 2 - back) + "\n");
  EXPECT_EQ(counts(), "");
  now += LineAllowance::kTimeUntilCount;
  EXPECT_EQ(counts(), "");
}

TEST_F(LogAllowanceTest, EachCountIsDueInItsOwnTime) {
  write(kMost + 1, "one");
  now += seconds(4);
  write(kMost + 2, "two");
  now += LineAllowance::kTimeUntilCount - seconds(4);
  EXPECT_EQ(counts(), "one 1\n");
  now += seconds(4);
  EXPECT_EQ(counts(), "two 2\n");
}

TEST_F(LogAllowanceTest, ACountOutlastsAllThatIsForgotten) {
  write(kMost + 1, "one");
  now += 2 * kMost * LogAllowance::kTimeForALine;
  write(1, "two");
  EXPECT_EQ(counts(), "one 1\n");
}

}  // namespace
}  // namespace docuvend::linux_platform
