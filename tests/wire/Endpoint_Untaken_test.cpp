// Open files that a peer is answered with and does not take, and peers to which nothing can be written any more.
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/socket.h>

#include <atomic>
#include <cerrno>
#include <memory>
#include <utility>
#include <vector>

#include "platform/linux/wire/FrameWriter.h"
#include "tests/wire/EndpointTest.h"
#include "tests/wire/TakingPeer.h"
#include "tests/wire/UsedUpPassing.h"

namespace docuvend::linux_platform {
namespace {

using tests::TakingPeer;

constexpr std::size_t kLimit = 8;
constexpr std::size_t kMany = 100;

UniqueDescriptor nothing() { return UniqueDescriptor(::open("/dev/null", O_RDWR | O_CLOEXEC)); }

class UntakenEndpointTest : public EndpointTest {
 protected:
  void TearDown() override {
    atServer.reset();
    untaken.reset();
    opener.reset();
    EndpointTest::TearDown();
  }

  [[nodiscard]] CallRules rules() const {
    CallRules rules;
    rules.lane = lane;
    rules.untaken = untaken;
    return rules;
  }
  TakingPeer connectTaking(CallRules given) { return connectTaking(std::move(given), opener); }
  // A peer of an endpoint that answers each request with an open file.
  TakingPeer connectTaking(CallRules given, std::shared_ptr<QXRpcExportedObject> object) {
    auto [one, two] = socketPair();
    atServer = UniqueDescriptor(::fcntl(one.get(), F_DUPFD_CLOEXEC, 0));
    server = makeSide(std::move(one), {}, std::move(given));
    server.endpoint->setExportedInterface(testInterface());
    server.endpoint->setExportedObject(std::move(object));
    server.endpoint->resume();
    TakingPeer peer(std::move(two));
    peer.sayHello();
    return peer;
  }
  // Asks for so many files, the first of them with that number.
  static bool askFor(const TakingPeer& peer, std::size_t count, std::uint64_t number = 1) {
    std::vector<std::uint8_t> requests;
    for (const std::uint64_t end = number + count; number < end; ++number) {
      const auto bytes = tests::bytesOf(Frame(RequestFrame{number, true, kOpen.name, {QXValue()}}));
      requests.insert(requests.end(), bytes.begin(), bytes.end());
    }
    return peer.write(requests);
  }
  // However often the threads come round, nothing more is served.
  [[nodiscard]] bool nothingMoreIsServed(std::size_t atLeast) {
    constexpr int kRounds = 1000;
    std::size_t before = 0;
    for (int quiet = 0; quiet < kRounds; ++quiet) {
      if (!aTaskRuns()) return false;
      if (std::exchange(before, *served) != *served || *served < atLeast) quiet = 0;
    }
    return true;
  }
  [[nodiscard]] int bufferSize() const {
    int size = 0;
    socklen_t length = sizeof size;
    EXPECT_EQ(::getsockopt(atServer.get(), SOL_SOCKET, SO_SNDBUF, &size, &length), 0);
    return size;
  }
  static bool isFile(const std::optional<ReplyFrame>& reply) { return reply && reply->values[0].as<QXDescriptor>() != nullptr; }

  const std::shared_ptr<std::atomic<std::size_t>> served = std::make_shared<std::atomic<std::size_t>>(0);
  std::shared_ptr<Answerer> opener = std::make_shared<Answerer>([served = served](const QXArray&) {
    ++*served;
    return QXArray{QXValue(toValue(nothing())), QXValue()};
  });
  std::shared_ptr<UntakenDescriptors> untaken = std::make_shared<UntakenDescriptors>(kLimit);
  const std::shared_ptr<Reactor::Lane> lane = Reactor::makeLane();
  UniqueDescriptor atServer;  // its socket
};

TEST_F(UntakenEndpointTest, APeerInALaneIsServedNoFurtherUntilItTakesTheFilesThatItWasGiven) {
  auto peer = connectTaking(rules());
  const int usual = bufferSize();
  ASSERT_TRUE(askFor(peer, kMany));
  ASSERT_TRUE(nothingMoreIsServed(kMaximumUntakenAnswers));
  EXPECT_EQ(*served, kMaximumUntakenAnswers);
  ASSERT_TRUE(peer.take<Hello>());
  for (std::uint64_t i = 1; i <= kMany; ++i) {
    const auto reply = peer.take<ReplyFrame>();
    ASSERT_TRUE(isFile(reply)) << i;
    EXPECT_EQ(reply->callID, i);
  }
  EXPECT_EQ(*served, kMany);
  // Whoever has taken all has a socket like any other.
  ASSERT_TRUE(nothingMoreIsServed(kMany));
  EXPECT_EQ(bufferSize(), usual);
}

TEST_F(UntakenEndpointTest, APeerInALaneIsServedNoFurtherWhileAnswersWithFilesAreDueToIt) {
  auto peer = connectTaking(rules(), recorder);
  ASSERT_TRUE(peer.take<Hello>());
  ASSERT_TRUE(askFor(peer, kMany));
  std::vector<Recorder::Request> held;
  const auto hold = [this, &held] {
    auto request = recorder->requests.take();
    ASSERT_TRUE(request);
    held.push_back(*std::move(request));
  };
  const auto nothingMoreComes = [this] {
    for (int round = 0; round < 1000; ++round) EXPECT_TRUE(aTaskRuns());
    return recorder->requests.count() == 0;
  };
  for (std::size_t i = 0; i < kMaximumUntakenAnswers; ++i) hold();
  EXPECT_TRUE(nothingMoreComes());
  held.back().reply({QXValue(), QXValue(QXError::make("Test", 1, "no"))});
  hold();
  held.back().reply({QXValue("not of the kind"), QXValue()});
  hold();
  held.pop_back();  // without an answer
  hold();
  EXPECT_TRUE(nothingMoreComes());
  for (auto& request : held) request.reply({QXValue(toValue(nothing())), QXValue()});
  EXPECT_TRUE(nothingMoreComes()) << "they lie in the socket";
  EXPECT_TRUE(peer.take<ReplyFrame>());
  EXPECT_TRUE(peer.take<FailureFrame>());
  for (std::size_t i = 0; i < kMaximumUntakenAnswers; ++i) EXPECT_TRUE(isFile(peer.take<ReplyFrame>()));
  hold();
}

TEST_F(UntakenEndpointTest, APeerThatIsTrustedIsServedWhateverItTakes) {
  auto peer = connectTaking({});
  ASSERT_TRUE(askFor(peer, kMany));
  ASSERT_TRUE(nothingMoreIsServed(kMany));
  ASSERT_TRUE(peer.take<Hello>());
  for (std::uint64_t i = 1; i <= kMany; ++i) ASSERT_TRUE(isFile(peer.take<ReplyFrame>()));
}

TEST_F(UntakenEndpointTest, WhereAPeersOtherConnectionsLeaveNoRoomItsRequestsForFilesFailUntilTheyAreTaken) {
  std::vector<TakingPeer> leaving;
  std::vector<Side> sides;
  for (std::size_t i = 0; i < kLimit / kMaximumUntakenAnswers; ++i) {
    leaving.push_back(connectTaking(rules()));
    sides.push_back(std::exchange(server, {}));
    ASSERT_TRUE(askFor(leaving.back(), kMaximumUntakenAnswers));
  }
  ASSERT_TRUE(nothingMoreIsServed(kLimit));
  auto peer = connectTaking(rules());
  ASSERT_TRUE(peer.take<Hello>());
  ASSERT_TRUE(askFor(peer, 1));
  const auto failure = peer.take<FailureFrame>();
  ASSERT_TRUE(failure);
  EXPECT_EQ(failure->callID, 1U);
  EXPECT_EQ(failure->error.code, code(QXRpcErrorCode::tooManyCalls));
  EXPECT_EQ(failure->error.texts.at("description"), "too many open files wait to be taken");
  EXPECT_EQ(*served, kLimit) << "it was not run";
  // What needs no room is answered.
  peer.write(Frame(RequestFrame{2, true, "unknown", {}}));
  EXPECT_EQ(peer.take<FailureFrame>().value_or(FailureFrame{}).callID, 2U);

  ASSERT_TRUE(leaving.front().take<Hello>());
  for (std::size_t i = 0; i < kMaximumUntakenAnswers; ++i) ASSERT_TRUE(isFile(leaving.front().take<ReplyFrame>()));
  ASSERT_TRUE(askFor(peer, 1, 3));
  EXPECT_TRUE(isFile(peer.take<ReplyFrame>()));
  // An end of this end's makes no room: only the peer can.
  sides.back().endpoint.reset();
  ASSERT_TRUE(sides.back().closed->take());
  const std::size_t room = kLimit - kMaximumUntakenAnswers;
  std::vector<std::unique_ptr<UntakenDescriptors::Share>> shares;
  const auto socket = std::make_shared<const UniqueDescriptor>();
  while (auto share = untaken->take(socket, 1)) shares.push_back(std::move(share));
  EXPECT_EQ(shares.size(), room);
}

TEST_F(UntakenEndpointTest, NothingOfAConnectionThatIsOverIsKeptWhenItsPeerHasTakenAllOrLeft) {
  for (const bool takesAll : {true, false}) {
    auto peer = connectTaking(rules());
    atServer.reset();
    ASSERT_TRUE(askFor(peer, 1));
    ASSERT_TRUE(peer.take<Hello>());
    if (takesAll) {
      ASSERT_TRUE(isFile(peer.take<ReplyFrame>()));
    }
    peer.leave();
    ASSERT_TRUE(server.closed->take());
    server = {};
    // Looked at once more: the system tells of a peer's leaving before it has dropped what lay there for it.
    EXPECT_TRUE(untaken->isEmpty()) << takesAll;
  }
}

// The user's own number of descriptors in sockets is used up by somebody else.
TEST_F(UntakenEndpointTest, AnAnswerThatTheSystemDoesNotPassOnFailsWithATellingAndTheConnectionGoesOn) {
  auto peer = connectTaking({});
  ASSERT_TRUE(peer.take<Hello>());
  std::optional<tests::UsedUpPassing> usedUp(std::in_place);
  const bool asked = askFor(peer, 1) && peer.write(Frame(RequestFrame{2, true, "unknown", {}}));
  const auto failure = peer.take<FailureFrame>();
  const auto next = peer.take<FailureFrame>();
  usedUp.reset();
  ASSERT_TRUE(asked);
  ASSERT_TRUE(failure);
  EXPECT_EQ(failure->callID, 1U);
  EXPECT_EQ(failure->error.code, code(QXRpcErrorCode::tooManyCalls));
  EXPECT_EQ(failure->error.texts.at("description"), "the system passes no more open files on for now");
  ASSERT_TRUE(next);
  EXPECT_EQ(next->callID, 2U);
  EXPECT_TRUE(server.unpassed->take());
  ASSERT_TRUE(askFor(peer, 1, 3));
  EXPECT_TRUE(isFile(peer.take<ReplyFrame>())) << "it may be asked again";
  EXPECT_EQ(server.closed->count(), 0U);
  EXPECT_EQ(server.unpassed->count(), 0U);
  atServer.reset();
}

// It could go on for ever otherwise, and be answered at no cost of its own.
TEST_F(UntakenEndpointTest, APeerThatShutsItsReadingHalfIsHeardOutAndNotServedFurther) {
  for (const bool isTrusted : {false, true}) {
    const std::size_t before = *served;
    auto peer = connectTaking(isTrusted ? CallRules{} : rules());
    atServer.reset();
    ASSERT_TRUE(peer.take<Hello>());
    ASSERT_EQ(::shutdown(peer.socket(), SHUT_RD), 0);
    std::size_t asked = 0;
    while (askFor(peer, 1, asked + 1)) ++asked;  // it is not able to for ever
    EXPECT_THAT(server.closed->take(), IsSystemError(ECONNRESET));
    EXPECT_EQ(*served - before, asked);
    EXPECT_EQ(server.blamed->count(), 0U);
    server = {};
  }
}

TEST_F(UntakenEndpointTest, WhatIsAnsweredToAPeerThatCannotBeWrittenToIsLetGoOfAtOnce) {
  auto peer = connectTaking(rules(), recorder);
  ASSERT_TRUE(peer.take<Hello>());
  ASSERT_TRUE(askFor(peer, 3));
  std::vector<Recorder::Request> held;
  for (int i = 0; i < 3; ++i) held.push_back(*recorder->requests.take());
  ASSERT_EQ(::shutdown(peer.socket(), SHUT_RD), 0);
  const std::size_t before = openDescriptors();
  for (auto& request : held) request.reply({QXValue(toValue(nothing())), QXValue()});
  EXPECT_LE(openDescriptors(), before);
  EXPECT_TRUE(untaken->isEmpty());
  EXPECT_TRUE(server.closed->take()) << "nothing more is said by it";
}

}  // namespace
}  // namespace docuvend::linux_platform
