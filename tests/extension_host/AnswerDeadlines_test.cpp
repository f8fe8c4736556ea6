#include "platform/linux/extension_host/AnswerDeadlines.h"

#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <vector>

#include "providers/_QXDocuvendVendor.h"

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kLimit{10'000};
constexpr milliseconds kOne{1};

class AnswerDeadlinesTest : public ::testing::Test {
 protected:
  AnswerDeadlines deadlines{kLimit};
  AnswerDeadlines::Time now{std::chrono::hours(1)};
};

TEST(AnswerLimit, SetupIdentifierAndURLHaveOneAndNoOtherOperationOfAVendor) {
  const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
  std::vector<std::string> limited;
  for (const QXRpcOperation& operation : vendor.operations()) {
    if (hasLimitedAnswer(operation.name)) limited.push_back(operation.name);
  }
  EXPECT_EQ(limited, (std::vector<std::string>{"_performInitialSetupWithCompletion:", "_identifierForItemAtURL:completion:",
                                               "_URLForItemIdentifier:completion:"}));
}

TEST_F(AnswerDeadlinesTest, TheFirstMessageSetsTheTimerAndTheNextOnesDoNot) {
  EXPECT_EQ(deadlines.sent("a", now).setTimer, now + kLimit);
  EXPECT_FALSE(deadlines.sent("b", now + kOne).setTimer);
}

TEST_F(AnswerDeadlinesTest, AnUnansweredMessageIsOverdueAtItsDeadline) {
  const auto sent = deadlines.sent("a", now);
  EXPECT_EQ(deadlines.timerFired(*sent.setTimer).overdue, "a");
}

TEST_F(AnswerDeadlinesTest, AnAnsweredMessageIsNotOverdueAndTheTimerRests) {
  const auto sent = deadlines.sent("a", now);
  deadlines.answered(sent.message);
  const auto verdict = deadlines.timerFired(*sent.setTimer);
  EXPECT_FALSE(verdict.overdue);
  EXPECT_FALSE(verdict.setTimer);
  EXPECT_TRUE(deadlines.sent("b", now + kLimit).setTimer);
}

TEST_F(AnswerDeadlinesTest, TheTimerIsSetAgainForTheOldestThatIsLeft) {
  const auto first = deadlines.sent("a", now);
  (void)deadlines.sent("b", now + kOne);
  (void)deadlines.sent("c", now + 2 * kOne);
  deadlines.answered(first.message);
  const auto verdict = deadlines.timerFired(now + kLimit);
  EXPECT_FALSE(verdict.overdue);
  EXPECT_EQ(verdict.setTimer, now + kOne + kLimit);
  EXPECT_FALSE(deadlines.sent("d", now + kLimit).setTimer);
  EXPECT_EQ(deadlines.timerFired(*verdict.setTimer).overdue, "b");
}

TEST_F(AnswerDeadlinesTest, WhenThisProcessDidNotRunNobodyIsBlamedBeforeAnotherLimit) {
  const auto sent = deadlines.sent("a", now);
  (void)deadlines.sent("b", now + kOne);
  const auto late = *sent.setTimer + AnswerDeadlines::kFarTooLate;
  const auto excused = deadlines.timerFired(late);
  EXPECT_FALSE(excused.overdue);
  ASSERT_EQ(excused.setTimer, late + kLimit);
  EXPECT_EQ(deadlines.timerFired(*excused.setTimer).overdue, "a");
}

TEST_F(AnswerDeadlinesTest, WhatIsExcusedKeepsItsOrder) {
  const auto first = deadlines.sent("a", now);
  (void)deadlines.sent("b", now + 2 * kOne);
  const auto excused = deadlines.timerFired(*first.setTimer + AnswerDeadlines::kFarTooLate);
  ASSERT_TRUE(excused.setTimer);
  deadlines.answered(first.message);
  (void)deadlines.sent("c", *excused.setTimer - kLimit + kOne);
  const auto next = deadlines.timerFired(*excused.setTimer);
  EXPECT_EQ(next.setTimer, *excused.setTimer + 2 * kOne);
  EXPECT_EQ(deadlines.timerFired(*next.setTimer).overdue, "b");
}

TEST_F(AnswerDeadlinesTest, ATimerThatIsALittleLateExcusesNobody) {
  const auto sent = deadlines.sent("a", now);
  EXPECT_EQ(deadlines.timerFired(*sent.setTimer + AnswerDeadlines::kFarTooLate - kOne).overdue, "a");
}

TEST_F(AnswerDeadlinesTest, AnAnswerMayComeTwice) {
  const auto first = deadlines.sent("a", now);
  const auto second = deadlines.sent("b", now);
  deadlines.answered(first.message);
  deadlines.answered(first.message);
  EXPECT_NE(first.message, second.message);
  EXPECT_EQ(deadlines.timerFired(now + kLimit).overdue, "b");
}

}  // namespace
}  // namespace docuvend::linux_platform
