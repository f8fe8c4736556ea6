#include "platform/linux/wire/OutgoingCalls.h"

#include <gtest/gtest.h>

#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {
namespace {

class OutgoingCallsTest : public testing::Test {
 protected:
  std::uint64_t add(bool wantsReply) {
    const std::uint64_t number = calls.nextID();
    QXRpcReply reply;
    if (wantsReply) reply = [](QXArray) {};
    calls.add({{}, std::move(reply), std::make_shared<const FailureHandler>()}, forgotten);
    return number;
  }

  OutgoingCalls calls;
  OutgoingCalls::Forgotten forgotten;
};

TEST_F(OutgoingCallsTest, NumbersRiseFromOne) {
  EXPECT_FALSE(calls.wasIssued(1));
  EXPECT_EQ(add(true), 1U);
  EXPECT_EQ(add(false), 2U);
  EXPECT_FALSE(calls.wasIssued(0));
  EXPECT_TRUE(calls.wasIssued(2));
  EXPECT_FALSE(calls.wasIssued(3));
}

TEST_F(OutgoingCallsTest, ACallIsSettledOnce) {
  add(true);
  EXPECT_TRUE(calls.settle(1, forgotten));
  EXPECT_FALSE(calls.settle(1, forgotten));
}

TEST_F(OutgoingCallsTest, AnAnswerShowsThatEarlierCallsWithoutReplyWereTaken) {
  add(false);
  add(true);
  add(false);
  EXPECT_TRUE(calls.settle(2, forgotten));
  EXPECT_EQ(forgotten.size(), 1U);
  EXPECT_FALSE(calls.settle(1, forgotten));
  EXPECT_TRUE(calls.settle(3, forgotten)) << "a later one may still be refused";
}

TEST_F(OutgoingCallsTest, CallsWithoutReplyDoNotPileUp) {
  constexpr std::size_t kCalls = 5000;
  for (std::size_t i = 0; i < kCalls; ++i) add(false);
  EXPECT_FALSE(calls.isFull());
  EXPECT_GT(forgotten.size(), kCalls / 2);
  EXPECT_FALSE(calls.settle(1, forgotten));
  EXPECT_TRUE(calls.settle(kCalls, forgotten));
}

TEST_F(OutgoingCallsTest, TheEndSettlesWhatWantsAReplyAndWhatWasNotWritten) {
  add(true);
  add(false);
  add(false);
  add(true);
  const auto lost = calls.settleAll({3, 4}, forgotten);
  ASSERT_EQ(lost.size(), 3U);
  EXPECT_EQ(lost[0].fate, MessageFate::unanswered);
  EXPECT_EQ(lost[1].fate, MessageFate::unsent);
  EXPECT_EQ(lost[2].fate, MessageFate::unsent);
  EXPECT_EQ(forgotten.size(), 1U);
  EXPECT_FALSE(calls.settle(4, forgotten));
}

}  // namespace
}  // namespace docuvend::linux_platform
