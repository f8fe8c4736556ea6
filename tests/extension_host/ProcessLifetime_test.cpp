#include "platform/linux/extension_host/ProcessLifetime.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdint>

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;
using Begin = ProcessLifetime::Begin;
using Cause = ProcessLifetime::Cause;
using Next = ProcessLifetime::Next;

constexpr milliseconds kOne{1};

QXUUID request(std::uint8_t number) {
  QXUUID result;
  result.bytes[0] = number;
  return result;
}

class ProcessLifetimeTest : public ::testing::Test {
 protected:
  void startRunning(std::uint8_t number) {
    ASSERT_EQ(lifetime.begin(request(number), now), Begin::start);
    lifetime.started(now);
  }
  void dieAfter(milliseconds life, Cause cause = Cause::died) {
    now += life;
    lifetime.lost(cause, now);
    ASSERT_EQ(lifetime.gone(), Next::nothing);
  }

  const ExtensionTimes times{};
  ProcessLifetime lifetime{times};
  ProcessLifetime::Time now{std::chrono::hours(1)};
};

TEST_F(ProcessLifetimeTest, TheFirstRequestStartsTheProcessAndTheNextOnesWaitForIt) {
  EXPECT_EQ(lifetime.begin(request(1), now), Begin::start);
  EXPECT_EQ(lifetime.begin(request(2), now), Begin::wait);
  EXPECT_FALSE(lifetime.isOpen(request(1)));
  lifetime.started(now);
  EXPECT_TRUE(lifetime.isOpen(request(1)));
  EXPECT_TRUE(lifetime.isOpen(request(2)));
}

TEST_F(ProcessLifetimeTest, ARequestJoinsTheRunningProcess) {
  startRunning(1);
  EXPECT_EQ(lifetime.begin(request(2), now), Begin::join);
  EXPECT_TRUE(lifetime.isOpen(request(2)));
}

TEST_F(ProcessLifetimeTest, AFinishedRequestIsNotOpenAndTheOthersAre) {
  startRunning(1);
  ASSERT_EQ(lifetime.begin(request(2), now), Begin::join);
  lifetime.finish(request(1), now);
  EXPECT_FALSE(lifetime.isOpen(request(1)));
  EXPECT_TRUE(lifetime.isOpen(request(2)));
}

TEST_F(ProcessLifetimeTest, AnIdleProcessLingersFromTheEndOfItsLastRequest) {
  startRunning(1);
  ASSERT_EQ(lifetime.begin(request(2), now), Begin::join);
  lifetime.finish(request(1), now);
  EXPECT_FALSE(lifetime.deadline());
  now += kOne;
  lifetime.finish(request(2), now);
  EXPECT_EQ(lifetime.deadline(), now + times.linger);
}

TEST_F(ProcessLifetimeTest, FinishingTwiceOrTheUnknownDoesNotLengthenTheLinger) {
  startRunning(1);
  lifetime.finish(request(1), now);
  const auto deadline = lifetime.deadline();
  lifetime.finish(request(1), now + kOne);
  lifetime.finish(request(9), now + kOne);
  EXPECT_EQ(lifetime.deadline(), deadline);
}

TEST_F(ProcessLifetimeTest, ARequestDuringTheLingerKeepsTheProcess) {
  startRunning(1);
  lifetime.finish(request(1), now);
  EXPECT_EQ(lifetime.begin(request(2), now + times.linger - kOne), Begin::join);
  EXPECT_FALSE(lifetime.deadline());
}

TEST_F(ProcessLifetimeTest, ARetiredProcessServesRequestsUntilItsEndAndDoesNotLinger) {
  startRunning(1);
  const auto end = now + 2 * kOne;
  lifetime.retire(end);
  EXPECT_TRUE(lifetime.isRetired());
  EXPECT_EQ(lifetime.deadline(), end);
  now += kOne;
  EXPECT_FALSE(lifetime.isOver(now));
  EXPECT_EQ(lifetime.begin(request(2), now), Begin::join);
  lifetime.finish(request(1), now);
  EXPECT_EQ(lifetime.deadline(), end);
  lifetime.finish(request(2), now);
  EXPECT_EQ(lifetime.deadline(), now);
}

TEST_F(ProcessLifetimeTest, ARetiredProcessIsOverAtItsEndWhateverIsOpenAndItsRequestsAreForgotten) {
  startRunning(1);
  lifetime.retire(now + kOne);
  now += kOne;
  EXPECT_TRUE(lifetime.isOver(now));
  EXPECT_TRUE(lifetime.isOpen(request(1)));
  lifetime.ended();
  EXPECT_FALSE(lifetime.isOpen(request(1)));
  EXPECT_EQ(lifetime.requests(), 0U);
  EXPECT_FALSE(lifetime.deadline());
  lifetime.lost(Cause::died, now);
  EXPECT_EQ(lifetime.badLivesInARow(), 0) << "it did not die by itself";
  EXPECT_EQ(lifetime.gone(), Next::nothing);
}

TEST_F(ProcessLifetimeTest, WhatIsOverRefusesRequestsForGood) {
  lifetime.retire(now);
  EXPECT_EQ(lifetime.begin(request(1), now), Begin::refuse);
  EXPECT_EQ(lifetime.begin(request(1), now + 1000 * times.longestBackOff), Begin::refuse);
  EXPECT_EQ(lifetime.requests(), 0U);
}

TEST_F(ProcessLifetimeTest, WhatIsOverStartsNoProcessForThoseWhoWaitedForTheNextOne) {
  startRunning(1);
  lifetime.lost(Cause::died, now);
  ASSERT_EQ(lifetime.begin(request(2), now), Begin::wait);
  lifetime.retire(now);
  lifetime.ended();
  EXPECT_EQ(lifetime.gone(), Next::nothing);
}

TEST_F(ProcessLifetimeTest, AProcessThatIsStillStartingWhenItIsOverStartsWithoutRequests) {
  ASSERT_EQ(lifetime.begin(request(1), now), Begin::start);
  lifetime.retire(now);
  lifetime.ended();
  lifetime.started(now);
  EXPECT_FALSE(lifetime.isOpen(request(1)));
  EXPECT_EQ(lifetime.deadline(), now);
}

TEST_F(ProcessLifetimeTest, TheEarliestEndOfARetiredProcessCounts) {
  startRunning(1);
  lifetime.retire(now + 2 * kOne);
  lifetime.retire(now + kOne);
  lifetime.retire(now + 3 * kOne);
  EXPECT_EQ(lifetime.deadline(), now + kOne);
}

TEST_F(ProcessLifetimeTest, DeathForgetsTheRequests) {
  startRunning(1);
  lifetime.lost(Cause::died, now);
  EXPECT_FALSE(lifetime.isOpen(request(1)));
}

TEST_F(ProcessLifetimeTest, ARequestThatComesWhileAProcessEndsWaitsForTheNextOne) {
  startRunning(1);
  lifetime.finish(request(1), now);
  lifetime.endedIdle();
  EXPECT_EQ(lifetime.begin(request(2), now), Begin::wait);
  EXPECT_EQ(lifetime.gone(), Next::start);
  EXPECT_EQ(lifetime.begin(request(3), now), Begin::wait);
  lifetime.started(now);
  EXPECT_TRUE(lifetime.isOpen(request(2)));
  EXPECT_TRUE(lifetime.isOpen(request(3)));
}

TEST_F(ProcessLifetimeTest, NothingIsStartedAfterAnEndThatNobodyWaitsFor) {
  startRunning(1);
  lifetime.finish(request(1), now);
  lifetime.endedIdle();
  EXPECT_EQ(lifetime.gone(), Next::nothing);
  EXPECT_EQ(lifetime.begin(request(2), now), Begin::start);
}

TEST_F(ProcessLifetimeTest, ALossDuringTheEndingIsNoDeath) {
  startRunning(1);
  lifetime.finish(request(1), now);
  lifetime.endedIdle();
  lifetime.lost(Cause::died, now);
  EXPECT_EQ(lifetime.badLivesInARow(), 0);
}

TEST_F(ProcessLifetimeTest, AfterOneQuickDeathTheNextRequestStartsAtOnce) {
  startRunning(1);
  dieAfter(milliseconds(0));
  EXPECT_FALSE(lifetime.refusedUntil(now));
  EXPECT_EQ(lifetime.begin(request(2), now), Begin::start);
}

TEST_F(ProcessLifetimeTest, AfterTwoQuickDeathsRequestsAreRefusedForTheBackOffAndNotLonger) {
  startRunning(1);
  dieAfter(times.quickDeath - kOne);
  startRunning(2);
  dieAfter(times.quickDeath - kOne);
  EXPECT_EQ(lifetime.refusedUntil(now), now + times.firstBackOff);
  EXPECT_EQ(lifetime.begin(request(3), now + times.firstBackOff - kOne), Begin::refuse);
  EXPECT_EQ(lifetime.begin(request(4), now + times.firstBackOff), Begin::start);
  lifetime.started(now + times.firstBackOff);
  EXPECT_FALSE(lifetime.isOpen(request(3)));
  EXPECT_TRUE(lifetime.isOpen(request(4)));
}

TEST_F(ProcessLifetimeTest, EachFurtherQuickDeathDoublesTheBackOffUpToTheLongest) {
  milliseconds expected = times.firstBackOff;
  startRunning(1);
  dieAfter(milliseconds(0));
  for (int i = 0; i < 20; ++i) {
    startRunning(1);
    dieAfter(milliseconds(0));
    ASSERT_EQ(lifetime.refusedUntil(now), now + expected) << "death " << i;
    now += expected;
    expected = std::min(expected * 2, times.longestBackOff);
  }
  EXPECT_EQ(expected, times.longestBackOff);
}

TEST_F(ProcessLifetimeTest, ADeathAfterALongLifeEndsTheRow) {
  startRunning(1);
  dieAfter(milliseconds(0));
  startRunning(2);
  dieAfter(times.quickDeath);
  EXPECT_EQ(lifetime.badLivesInARow(), 0);
  startRunning(3);
  dieAfter(milliseconds(0));
  EXPECT_FALSE(lifetime.refusedUntil(now));
}

TEST_F(ProcessLifetimeTest, AnEndAfterIdlenessEndsTheRow) {
  startRunning(1);
  dieAfter(milliseconds(0));
  startRunning(2);
  lifetime.finish(request(2), now);
  lifetime.endedIdle();
  ASSERT_EQ(lifetime.gone(), Next::nothing);
  startRunning(3);
  dieAfter(milliseconds(0));
  EXPECT_FALSE(lifetime.refusedUntil(now));
}

TEST_F(ProcessLifetimeTest, AProcessThatDidNotAnswerCountsHoweverLongItLived) {
  startRunning(1);
  dieAfter(times.quickDeath * 2, Cause::notAnswering);
  startRunning(2);
  dieAfter(times.quickDeath * 2, Cause::notAnswering);
  EXPECT_TRUE(lifetime.refusedUntil(now));
}

TEST_F(ProcessLifetimeTest, AProcessThatCouldNotBeStartedCountsAndForgetsWhoWaited) {
  ASSERT_EQ(lifetime.begin(request(1), now), Begin::start);
  lifetime.startFailed(now);
  EXPECT_EQ(lifetime.badLivesInARow(), 1);
  startRunning(2);
  EXPECT_FALSE(lifetime.isOpen(request(1)));
}

TEST_F(ProcessLifetimeTest, DuringABackOffRequestsAreRefusedWhileTheDeadProcessIsStillToBeReaped) {
  startRunning(1);
  dieAfter(milliseconds(0));
  startRunning(2);
  lifetime.lost(Cause::died, now);
  EXPECT_EQ(lifetime.begin(request(3), now), Begin::refuse);
  EXPECT_EQ(lifetime.gone(), Next::nothing);
}

}  // namespace
}  // namespace docuvend::linux_platform
