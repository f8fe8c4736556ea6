#include "platform/linux/extension_host/AnswerDeadlines.h"

#include <gtest/gtest.h>

#include <chrono>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "providers/_QXDocuvendVendor.h"

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kLimit{10'000};
constexpr milliseconds kOne{1};

class AnswerDeadlinesTest : public ::testing::Test {
 protected:
  AnswerDeadlines::Sent sent(const std::string& name, AnswerDeadlines::Time when, AnswerLine line = AnswerLine::names) {
    return deadlines.sent(line, name, when);
  }

  AnswerDeadlines deadlines{kLimit};
  AnswerDeadlines::Time now{std::chrono::hours(1)};
};

TEST(AnswerLimit, SetupIdentifierAndURLHaveOneAndNoOtherOperationOfAVendor) {
  const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
  std::vector<std::pair<std::string, AnswerLine>> limited;
  for (const QXRpcOperation& operation : vendor.operations()) {
    if (const auto line = answerLineOf(operation.name)) limited.emplace_back(operation.name, *line);
  }
  EXPECT_EQ(limited, (std::vector<std::pair<std::string, AnswerLine>>{{"_performInitialSetupWithCompletion:", AnswerLine::setup},
                                                                      {"_identifierForItemAtURL:completion:", AnswerLine::names},
                                                                      {"_URLForItemIdentifier:completion:", AnswerLine::names}}));
}

TEST_F(AnswerDeadlinesTest, TheFirstMessageSetsTheTimerAndTheNextOnesDoNot) {
  EXPECT_EQ(sent("a", now).setTimer, now + kLimit);
  EXPECT_FALSE(sent("b", now + kOne).setTimer);
  EXPECT_FALSE(sent("c", now + kOne, AnswerLine::setup).setTimer);
}

TEST_F(AnswerDeadlinesTest, AnUnansweredMessageIsOverdueAtItsDeadline) {
  const auto asked = sent("a", now);
  EXPECT_EQ(deadlines.timerFired(*asked.setTimer).overdue, "a");
}

TEST_F(AnswerDeadlinesTest, AnAnsweredMessageIsNotOverdueAndTheTimerRests) {
  const auto asked = sent("a", now);
  deadlines.answered(asked.message, now + kOne);
  const auto verdict = deadlines.timerFired(*asked.setTimer);
  EXPECT_FALSE(verdict.overdue);
  EXPECT_FALSE(verdict.setTimer);
  EXPECT_EQ(sent("b", now + kLimit).setTimer, now + 2 * kLimit);
}

TEST_F(AnswerDeadlinesTest, AMessageThatHadNothingBeforeItHasTheLimitFromItsSending) {
  const auto first = sent("a", now);
  deadlines.answered(first.message, now + kOne);
  (void)sent("b", now + 3 * kOne);
  const auto verdict = deadlines.timerFired(now + kLimit);
  EXPECT_FALSE(verdict.overdue);
  EXPECT_EQ(verdict.setTimer, now + 3 * kOne + kLimit);
  EXPECT_FALSE(sent("c", now + kLimit).setTimer);
  EXPECT_EQ(deadlines.timerFired(*verdict.setTimer).overdue, "b");
}

TEST_F(AnswerDeadlinesTest, AMessageHasTheLimitFromWhenThoseBeforeItWereAnswered) {
  const auto first = sent("a", now);
  (void)sent("b", now);
  deadlines.answered(first.message, now + kLimit - kOne);
  const auto verdict = deadlines.timerFired(now + kLimit);
  EXPECT_FALSE(verdict.overdue);
  EXPECT_EQ(verdict.setTimer, now + 2 * kLimit - kOne);
  EXPECT_EQ(deadlines.timerFired(*verdict.setTimer).overdue, "b");
}

TEST_F(AnswerDeadlinesTest, WhoAnswersOneAfterAnotherInTimeIsNeverOverdueHoweverManyWereAskedAtOnce) {
  std::vector<AnswerDeadlines::Message> messages;
  std::optional<AnswerDeadlines::Time> timer;
  for (int i = 0; i < 1000; ++i) {
    const auto asked = sent("a", now);
    messages.push_back(asked.message);
    if (asked.setTimer) timer = asked.setTimer;
  }
  auto answered = now;
  for (const auto& message : messages) {
    answered += kLimit - kOne;
    while (timer && *timer <= answered) {
      const auto verdict = deadlines.timerFired(*timer);
      ASSERT_FALSE(verdict.overdue);
      timer = verdict.setTimer;
    }
    deadlines.answered(message, answered);
  }
  ASSERT_TRUE(timer);
  const auto last = deadlines.timerFired(*timer);
  EXPECT_FALSE(last.overdue);
  EXPECT_FALSE(last.setTimer);
}

TEST_F(AnswerDeadlinesTest, AnswersToLaterMessagesGainNothingForTheFirst) {
  (void)sent("a", now);
  for (int i = 1; i < 10'000; ++i) deadlines.answered(sent("b", now + i * kOne).message, now + i * kOne);
  EXPECT_EQ(deadlines.timerFired(now + kLimit).overdue, "a");
}

TEST_F(AnswerDeadlinesTest, EachLineIsAwaitedForItself) {
  const auto name = sent("name", now);
  (void)sent("setup", now + kOne, AnswerLine::setup);
  (void)sent("ping", now + 2 * kOne, AnswerLine::signsOfLife);
  (void)sent("name", now + 2 * kOne);
  deadlines.answered(name.message, now + kLimit - kOne);
  const auto verdict = deadlines.timerFired(now + kLimit);
  EXPECT_FALSE(verdict.overdue);
  ASSERT_EQ(verdict.setTimer, now + kLimit + kOne) << "an answer of another line gains a setup nothing";
  EXPECT_EQ(deadlines.timerFired(*verdict.setTimer).overdue, "setup");
}

TEST_F(AnswerDeadlinesTest, ASignOfLifeWaitsForNothingElse) {
  const auto name = sent("name", now);
  (void)sent("ping", now + kOne, AnswerLine::signsOfLife);
  deadlines.answered(name.message, now + kLimit - kOne);
  const auto verdict = deadlines.timerFired(now + kLimit);
  ASSERT_EQ(verdict.setTimer, now + kOne + kLimit);
  EXPECT_EQ(deadlines.timerFired(*verdict.setTimer).overdue, "ping");
}

TEST_F(AnswerDeadlinesTest, WhenThisProcessDidNotRunNobodyIsBlamedBeforeAnotherLimit) {
  const auto first = sent("a", now);
  (void)sent("b", now + kOne);
  (void)sent("ping", now + kOne, AnswerLine::signsOfLife);
  const auto late = *first.setTimer + AnswerDeadlines::kFarTooLate;
  const auto excused = deadlines.timerFired(late);
  EXPECT_FALSE(excused.overdue);
  ASSERT_EQ(excused.setTimer, late + kLimit);
  deadlines.answered(first.message, late + kOne);
  EXPECT_EQ(deadlines.timerFired(*excused.setTimer).overdue, "ping") << "no line less and none more";
}

TEST_F(AnswerDeadlinesTest, WhoIsNotDueYetIsNotExcused) {
  const auto first = sent("a", now);
  const auto answered = now + kLimit - kOne;
  (void)sent("b", now);
  deadlines.answered(first.message, answered);
  const auto verdict = deadlines.timerFired(*first.setTimer + AnswerDeadlines::kFarTooLate);
  EXPECT_FALSE(verdict.overdue);
  EXPECT_EQ(verdict.setTimer, answered + kLimit);
}

TEST_F(AnswerDeadlinesTest, ATimerThatIsALittleLateExcusesNobody) {
  const auto asked = sent("a", now);
  EXPECT_EQ(deadlines.timerFired(*asked.setTimer + AnswerDeadlines::kFarTooLate - kOne).overdue, "a");
}

TEST_F(AnswerDeadlinesTest, AnAnswerMayComeTwice) {
  const auto first = sent("a", now);
  const auto second = sent("b", now);
  deadlines.answered(first.message, now + kOne);
  deadlines.answered(first.message, now + 2 * kOne);
  EXPECT_NE(first.message, second.message);
  const auto verdict = deadlines.timerFired(now + kLimit);
  ASSERT_EQ(verdict.setTimer, now + kOne + kLimit) << "the second time says nothing";
  EXPECT_EQ(deadlines.timerFired(*verdict.setTimer).overdue, "b");
}

}  // namespace
}  // namespace docuvend::linux_platform
