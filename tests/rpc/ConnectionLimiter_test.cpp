#include "platform/linux/rpc/ConnectionLimiter.h"

#include <gtest/gtest.h>

#include <vector>

namespace docuvend::linux_platform {
namespace {

using Verdict = ConnectionLimiter::Verdict;

class ConnectionLimiterTest : public testing::Test {
 protected:
  void fill(const std::string& peer) {
    for (std::size_t i = 0; i < kMaximumConnectionsPerPeer; ++i) {
      auto admission = limiter->admit(peer);
      ASSERT_EQ(admission.verdict, Verdict::admitted);
      places.push_back(std::move(admission.place));
    }
  }

  std::shared_ptr<ConnectionLimiter> limiter = std::make_shared<ConnectionLimiter>();
  std::vector<std::unique_ptr<ConnectionLimiter::Place>> places;
};

TEST_F(ConnectionLimiterTest, OnePeersLimitIsNotAnothers) {
  fill("one");
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refused);
  EXPECT_EQ(limiter->admit("two").verdict, Verdict::admitted);
}

TEST_F(ConnectionLimiterTest, TheFirstRefusalIsToldFromTheOnesThatFollow) {
  fill("one");
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refused);
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refusedAgain);
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refusedAgain);
}

TEST_F(ConnectionLimiterTest, APlaceThatIsGivenBackAdmitsAgainAndTheNextRefusalIsAFirstOne) {
  fill("one");
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refused);
  places.pop_back();
  auto admission = limiter->admit("one");
  EXPECT_EQ(admission.verdict, Verdict::admitted);
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refused);
}

TEST_F(ConnectionLimiterTest, OpenConnectionsAreThoseOfAllPeersTogether) {
  EXPECT_EQ(limiter->openConnections(), 0U);
  fill("one");
  const auto admission = limiter->admit("two");
  EXPECT_EQ(limiter->admit("one").verdict, Verdict::refused);
  EXPECT_EQ(limiter->openConnections(), kMaximumConnectionsPerPeer + 1);
  places.clear();
  EXPECT_EQ(limiter->openConnections(), 1U);
}

}  // namespace
}  // namespace docuvend::linux_platform
