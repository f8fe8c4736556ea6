// Signs of life.
#include <cstdint>
#include <memory>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

TEST_F(EndpointTest, APingIsAnsweredWithoutReachingTheObject) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  for (int i = 0; i < 3; ++i) {
    raw.write(Frame(PingFrame{}));
    EXPECT_TRUE(raw.read<PongFrame>());
  }
  EXPECT_EQ(recorder->requests.count(), 0U);
}

TEST_F(EndpointTest, APingIsAnsweredBeforeTheRequestsThatWereMadeEarlier) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  client.endpoint->ping(intoPongs());
  EXPECT_TRUE(pongs.take());
  EXPECT_EQ(replies.count(), 0U);
  client.endpoint->ping(intoPongs());
  EXPECT_TRUE(pongs.take());
}

TEST_F(EndpointTest, AnEndThatDoesNotReadGivesNoSignOfLife) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  server.endpoint->ping(intoPongs());
  // What the peer says otherwise is none either.
  raw.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("a")}}));
  ASSERT_TRUE(recorder->requests.take());
  EXPECT_EQ(pongs.count(), 0U);
  ASSERT_TRUE(raw.read<PingFrame>());
  raw.write(Frame(PongFrame{}));
  EXPECT_TRUE(pongs.take());
}

TEST_F(EndpointTest, APongThatIsAwaitedIsForgottenWithTheConnection) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  const auto held = std::make_shared<int>(0);
  server.endpoint->ping([held] { FAIL() << "no pong was sent"; });
  EXPECT_EQ(held.use_count(), 2);
  raw.leave();
  ASSERT_TRUE(server.closed->take());
  EXPECT_EQ(held.use_count(), 1);
  server.endpoint->ping([held] { FAIL() << "the connection is over"; });
  EXPECT_EQ(held.use_count(), 1);
}

TEST_F(EndpointTest, APongThatNobodyAskedForEndsTheConnection) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  server.endpoint->ping([] {});
  ASSERT_TRUE(raw.read<PingFrame>());
  raw.write(Frame(PongFrame{}));
  raw.write(Frame(PongFrame{}));
  const auto reason = server.blamed->take();
  EXPECT_THAT(reason, IsRpcError(QXRpcErrorCode::malformedFrame));
  EXPECT_EQ(reason->description(), "QXRpcErrorDomain 6: an answer to a ping that was not sent");
}

TEST_F(EndpointTest, APeerThatTakesNoPongCannotMakeThemPileUp) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  // The socket takes pongs until it is full; a ping behind one that it has not taken is one too many.
  const auto ping = tests::bytesOf(Frame(PingFrame{}));
  std::vector<std::uint8_t> pings;
  for (int i = 0; i < 1000; ++i) pings.insert(pings.end(), ping.begin(), ping.end());
  bool isOpen = true;
  for (int i = 0; i < 1000 && isOpen; ++i) isOpen = raw.write(pings);
  EXPECT_FALSE(isOpen);
  const auto reason = server.blamed->take();
  EXPECT_THAT(reason, IsRpcError(QXRpcErrorCode::malformedFrame));
  EXPECT_EQ(reason->description(), "QXRpcErrorDomain 6: a ping before the last one's answer was taken");
}

TEST_F(EndpointTest, APingBeforeTheHelloIsMalformed) {
  auto raw = connectRaw(nullptr);
  raw.write(Frame(PingFrame{}));
  EXPECT_THAT(server.blamed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

}  // namespace
}  // namespace docuvend::linux_platform
