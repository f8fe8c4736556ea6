#include "platform/linux/rpc/ConnectionLimiter.h"

#include <gtest/gtest.h>

#include <vector>

namespace docuvend::linux_platform {
namespace {

using Verdict = ConnectionLimiter::Verdict;

class ConnectionLimiterTest : public testing::Test {
 protected:
  static constexpr std::size_t kLimit = 3;

  ConnectionLimiter::Admission admit(const std::string& peer) { return limiter->admit(peer, kLimit); }
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
    auto admission = limiter->admit("two", kLimit + 1);
    ASSERT_EQ(admission.verdict, Verdict::admitted);
    places.push_back(std::move(admission.place));
  }
  EXPECT_EQ(limiter->admit("two", kLimit + 1).verdict, Verdict::refused);
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

}  // namespace
}  // namespace docuvend::linux_platform
