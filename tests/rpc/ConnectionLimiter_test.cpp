#include "platform/linux/rpc/ConnectionLimiter.h"

#include <gtest/gtest.h>

#include <vector>

namespace docuvend::linux_platform {
namespace {

using Verdict = ConnectionLimiter::Verdict;

class ConnectionLimiterTest : public testing::Test {
 protected:
  static constexpr std::size_t kLimit = 3;

  static constexpr std::size_t kCalls = 2;
  static constexpr std::size_t kBytes = 100;

  ConnectionLimiter::Admission admit(const std::string& peer, std::size_t limit = kLimit) {
    return limiter->admit(peer, {limit, {kCalls, kBytes}});
  }
  void fill(const std::string& peer) {
    for (std::size_t i = 0; i < kLimit; ++i) {
      auto admission = admit(peer);
      ASSERT_EQ(admission.verdict, Verdict::admitted);
      places.push_back(std::move(admission.place));
    }
  }

  std::shared_ptr<ConnectionLimiter> limiter = std::make_shared<ConnectionLimiter>();
  std::vector<std::unique_ptr<ConnectionLimiter::Place>> places;
};

TEST_F(ConnectionLimiterTest, OnePeersLimitIsNotAnothers) {
  fill("one");
  EXPECT_EQ(admit("one").verdict, Verdict::refused);
  EXPECT_EQ(admit("two").verdict, Verdict::admitted);
}

TEST_F(ConnectionLimiterTest, APeerMayHaveAnotherLimit) {
  fill("one");
  for (std::size_t i = 0; i < kLimit + 1; ++i) {
    auto admission = admit("two", kLimit + 1);
    ASSERT_EQ(admission.verdict, Verdict::admitted);
    places.push_back(std::move(admission.place));
  }
  EXPECT_EQ(admit("two", kLimit + 1).verdict, Verdict::refused);
}

TEST_F(ConnectionLimiterTest, TheFirstRefusalIsToldFromTheOnesThatFollow) {
  fill("one");
  EXPECT_EQ(admit("one").verdict, Verdict::refused);
  EXPECT_EQ(admit("one").verdict, Verdict::refusedAgain);
  EXPECT_EQ(admit("one").verdict, Verdict::refusedAgain);
}

TEST_F(ConnectionLimiterTest, APlaceThatIsGivenBackAdmitsAgainAndTheNextRefusalIsAFirstOne) {
  fill("one");
  EXPECT_EQ(admit("one").verdict, Verdict::refused);
  places.pop_back();
  auto admission = admit("one");
  EXPECT_EQ(admission.verdict, Verdict::admitted);
  EXPECT_EQ(admit("one").verdict, Verdict::refused);
}

TEST_F(ConnectionLimiterTest, OpenConnectionsAreThoseOfAllPeersTogether) {
  EXPECT_EQ(limiter->openConnections(), 0U);
  fill("one");
  const auto admission = admit("two");
  EXPECT_EQ(admit("one").verdict, Verdict::refused);
  EXPECT_EQ(limiter->openConnections(), kLimit + 1);
  places.clear();
  EXPECT_EQ(limiter->openConnections(), 1U);
}

TEST_F(ConnectionLimiterTest, OnePeersConnectionsShareItsBudgetOfRequestsAndAnotherHasItsOwn) {
  const auto first = admit("one");
  const auto second = admit("one");
  const auto share = first.budget->take(1);
  const auto another = second.budget->take(1);
  ASSERT_TRUE(share && another);
  EXPECT_FALSE(first.budget->take(1));
  EXPECT_FALSE(second.budget->take(1));
  EXPECT_TRUE(admit("two").budget->take(1));
}

TEST_F(ConnectionLimiterTest, APeerThatComesBackFindsTheRequestsThatItLeftBehind) {
  std::vector<std::unique_ptr<CallBudget::Share>> left;
  {
    const auto admission = admit("one");
    for (std::size_t i = 0; i < kCalls; ++i) left.push_back(admission.budget->take(1));
  }
  EXPECT_EQ(limiter->openConnections(), 0U);
  EXPECT_EQ(admit("two").verdict, Verdict::admitted) << "whose leaving forgets those who left nothing";
  const auto back = admit("one");
  EXPECT_FALSE(back.budget->take(1));
  left.pop_back();
  EXPECT_TRUE(back.budget->take(1));
}

TEST_F(ConnectionLimiterTest, OnePeersConnectionsShareItsLaneAndAnotherHasItsOwn) {
  const auto first = admit("one");
  EXPECT_TRUE(first.lane);
  EXPECT_EQ(admit("one").lane, first.lane);
  EXPECT_NE(admit("two").lane, first.lane);
}

TEST_F(ConnectionLimiterTest, APeerWhoseRequestsStillRunFindsItsLaneAgain) {
  std::shared_ptr<Reactor::Lane> busy;
  {
    const auto admission = admit("one");
    busy = admission.lane;
  }
  EXPECT_EQ(limiter->openConnections(), 0U);
  EXPECT_EQ(admit("one").lane, busy);
}

TEST_F(ConnectionLimiterTest, OnePeersConnectionsShareItsRoomForDescriptorsAndAnotherHasItsOwn) {
  const auto first = admit("a");
  const auto socket = std::make_shared<const UniqueDescriptor>();
  const auto share = first.untaken->take(socket, kMaximumUntakenDescriptors);
  EXPECT_TRUE(share);
  EXPECT_FALSE(admit("a").untaken->take(socket, 1));
  EXPECT_TRUE(admit("b").untaken->take(socket, 1));
}

TEST_F(ConnectionLimiterTest, APeerThatComesBackFindsTheDescriptorsThatItHasNotTaken) {
  const auto socket = std::make_shared<const UniqueDescriptor>();
  {
    const auto gone = admit("a");
    const auto share = gone.untaken->take(socket, kMaximumUntakenDescriptors);
    share->setSent();
  }
  fill("b");
  places.clear();  // whose end it is does not matter
  EXPECT_FALSE(admit("a").untaken->take(socket, 1));
}

TEST_F(ConnectionLimiterTest, APeerThatLeftNothingBehindIsForgotten) {
  std::weak_ptr<CallBudget> budget;
  {
    auto admission = admit("one");
    budget = admission.budget;
    admission.budget.reset();
    admission.lane.reset();
    EXPECT_FALSE(budget.expired());
  }
  EXPECT_TRUE(budget.expired());
}

}  // namespace
}  // namespace docuvend::linux_platform
