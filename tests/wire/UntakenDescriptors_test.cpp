#include "platform/linux/wire/UntakenDescriptors.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>

#include <optional>
#include <utility>
#include <vector>

#include "platform/linux/wire/FrameWriter.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/SendBuffer.h"
#include "tests/wire/TakingPeer.h"

namespace docuvend::linux_platform {
namespace {

using tests::TakingPeer;

using Room = UntakenDescriptors::Room;

constexpr std::size_t kLimit = 20;

// A socket of this end's, as a connection holds it.
struct Connection {
  Connection() : Connection(tests::socketPair()) {}
  explicit Connection(std::pair<UniqueDescriptor, UniqueDescriptor> ends)
      : socket(std::make_shared<const UniqueDescriptor>(std::move(ends.first))), peer(std::move(ends.second)) {}

  UntakenDescriptors::Socket socket;
  TakingPeer peer;
  FrameWriter writer;
};

class UntakenDescriptorsTest : public testing::Test {
 protected:
  // False when there is no room.
  bool add(Connection& connection, std::size_t count = 1) {
    auto share = untaken->take(connection.socket, count);
    if (!share) return false;
    ReplyFrame reply{++number, {}};
    for (std::size_t i = 0; i < count; ++i) {
      reply.values.emplace_back(toValue(UniqueDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC))));
    }
    connection.writer.add(std::get<EncodedFrame>(encodeFrame(std::move(reply))), {.answerTo = number}, std::move(share));
    return true;
  }
  bool send(Connection& connection, std::size_t count = 1) {
    return add(connection, count) && connection.writer.write(connection.socket->get()) == FrameWriter::Progress::drained;
  }
  // How many of one are let in before there is no room: what is left of the limit.
  std::size_t room() {
    Connection other;
    std::vector<std::unique_ptr<UntakenDescriptors::Share>> shares;
    while (auto share = untaken->take(other.socket, 1)) shares.push_back(std::move(share));
    return shares.size();
  }

  const std::shared_ptr<UntakenDescriptors> untaken = std::make_shared<UntakenDescriptors>(kLimit);
  std::uint64_t number = 0;
};

TEST_F(UntakenDescriptorsTest, AreOfALimitedNumberOverAllConnections) {
  Connection one;
  Connection other;
  for (std::size_t i = 0; i < kLimit; ++i) EXPECT_TRUE(add(i % 2 == 0 ? one : other));
  EXPECT_FALSE(add(one));
  EXPECT_FALSE(add(other));
}

TEST_F(UntakenDescriptorsTest, AreCountedOneByOneAndAFrameThatDoesNotFitTakesNothing) {
  Connection one;
  EXPECT_TRUE(send(one, kMaximumDescriptors));
  EXPECT_FALSE(add(one, kLimit - kMaximumDescriptors + 1));
  EXPECT_EQ(room(), kLimit - kMaximumDescriptors);
}

TEST_F(UntakenDescriptorsTest, OfFramesThatAreNotSentCountNoMore) {
  Connection one;
  ASSERT_TRUE(add(one));
  ASSERT_TRUE(add(one));
  one.writer = {};
  EXPECT_EQ(room(), kLimit);
  EXPECT_TRUE(untaken->isEmpty());
}

TEST_F(UntakenDescriptorsTest, ThatArePassedOnCountUntilThePeerTakesThem) {
  Connection one;
  for (std::size_t i = 0; i < kLimit; ++i) ASSERT_TRUE(send(one));
  EXPECT_EQ(room(), 0U);
  EXPECT_FALSE(untaken->isEmpty());
  for (std::size_t i = 0; i < kLimit; ++i) ASSERT_TRUE(one.peer.take());
  EXPECT_EQ(room(), kLimit);
  EXPECT_TRUE(untaken->isEmpty());
}

// However the kernel accounts for what lies there: never too little.
TEST_F(UntakenDescriptorsTest, ThatLieInASocketAreNotForgottenThoughTheirFramesAreSmall) {
  Connection one;
  for (std::size_t i = 0; i < kLimit; ++i) ASSERT_TRUE(send(one));
  for (std::size_t taken = 1; taken < kLimit; ++taken) {
    ASSERT_TRUE(one.peer.takeOneMessage());
    EXPECT_LE(room(), taken);
  }
}

TEST_F(UntakenDescriptorsTest, ThatAreLeftAreTheLastThatWereSent) {
  Connection one;
  for (const std::size_t count : {std::size_t{1}, std::size_t{1}, std::size_t{1}, std::size_t{15}}) ASSERT_TRUE(send(one, count));
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(one.peer.takeOneMessage());
  EXPECT_EQ(room(), kLimit - 15);
}

TEST_F(UntakenDescriptorsTest, CountAlsoWhenTheConnectionIsOverUntilThePeerLeaves) {
  auto one = std::make_unique<Connection>();
  ASSERT_TRUE(send(*one));
  TakingPeer peer = std::move(one->peer);
  one.reset();
  EXPECT_EQ(room(), kLimit - 1);
  EXPECT_FALSE(untaken->isEmpty());
  peer.leave();
  EXPECT_EQ(room(), kLimit);
  EXPECT_TRUE(untaken->isEmpty());
}

TEST_F(UntakenDescriptorsTest, LeaveAConnectionNoRoomForFurtherAnswersBeforeSomeAreSentOrDropped) {
  Connection one;
  Connection other;
  ASSERT_TRUE(send(one));
  for (std::size_t i = 1; i < kMaximumUntakenAnswers; ++i) {
    EXPECT_EQ(untaken->roomOf(one.socket), Room::free) << i;
    ASSERT_TRUE(add(one));
  }
  EXPECT_EQ(untaken->roomOf(one.socket), Room::waitsForAnswers);
  EXPECT_EQ(untaken->roomOf(other.socket), Room::free);
  ASSERT_TRUE(one.peer.take());
  EXPECT_EQ(untaken->roomOf(one.socket), Room::free);
}

// Whoever waits for that is told of it by the socket, and only then.
TEST_F(UntakenDescriptorsTest, ThatLieInASocketLeaveNoRoomBeforeItIsWritableWithTheNarrowestOfBuffers) {
  Connection one;
  SendBuffer().narrow(one.socket->get());
  const auto isWritable = [&one] {
    pollfd socket{one.socket->get(), POLLOUT, 0};
    return ::poll(&socket, 1, 0) == 1;
  };
  EXPECT_TRUE(isWritable());
  for (std::size_t i = 0; i < kMaximumUntakenAnswers; ++i) ASSERT_TRUE(send(one));
  while (untaken->roomOf(one.socket) == Room::waitsForPeer) {
    EXPECT_FALSE(isWritable());
    ASSERT_TRUE(one.peer.takeOneMessage());
  }
  while (!isWritable()) ASSERT_TRUE(one.peer.takeOneMessage());
  EXPECT_EQ(untaken->roomOf(one.socket), Room::free);
}

}  // namespace
}  // namespace docuvend::linux_platform
