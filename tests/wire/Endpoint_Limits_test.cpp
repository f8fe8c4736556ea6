// What a peer can take of memory and threads.
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

// Its own requests are what is answered.
TEST_F(EndpointTest, APeerThatDoesNotReadIsDroppedAndHoldsNobodyUp) {
  const std::string block(kMaximumTextBytes, 'a');
  auto raw = connectRaw(std::make_shared<Answerer>([block](const QXArray&) { return QXArray{QXValue(block)}; }));
  raw.sayHello();
  constexpr std::size_t kAnswers = 2 * kMaximumOutputBytes / kMaximumTextBytes;
  for (std::size_t i = 1; i <= kAnswers; ++i) {
    if (!raw.write(Frame(RequestFrame{i, true, kEcho.name, {QXValue("a")}}))) break;
  }
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::peerDoesNotRead));
  EXPECT_THAT(server.blamed->take(), IsRpcError(QXRpcErrorCode::peerDoesNotRead));
}

TEST_F(EndpointTest, APeerInALaneThatDoesNotReadIsServedNoFurtherUntilItDoes) {
  const std::string block(kMaximumTextBytes, 'a');
  const auto served = std::make_shared<std::atomic<std::size_t>>(0);
  CallRules rules;
  rules.lane = Reactor::makeLane();
  auto raw = connectRaw(std::make_shared<Answerer>([block, served](const QXArray&) {
                          ++*served;
                          return QXArray{QXValue(block)};
                        }),
                        std::move(rules));
  raw.sayHello();
  constexpr std::size_t kAnswers = 2 * kMaximumOutputBytes / kMaximumTextBytes;
  for (std::size_t i = 1; i <= kAnswers; ++i) ASSERT_TRUE(raw.write(Frame(RequestFrame{i, true, kEcho.name, {QXValue("a")}})));
  // It is left alone when nothing more happens, however often the threads come round.
  constexpr int kRounds = 1000;
  std::size_t before = 0;
  for (int quiet = 0; quiet < kRounds; ++quiet) {
    ASSERT_TRUE(aTaskRuns());
    if (std::exchange(before, *served) != *served || *served == 0) quiet = 0;
  }
  EXPECT_LT(*served, kAnswers);
  EXPECT_EQ(server.closed->count(), 0U);
  ASSERT_TRUE(raw.read<Hello>());
  for (std::size_t i = 1; i <= kAnswers; ++i) {
    const auto reply = raw.read<ReplyFrame>();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->callID, i);
  }
  EXPECT_EQ(*served, kAnswers);
}

TEST_F(EndpointTest, APeerInALaneThatLeavesWithoutReadingIsForgotten) {
  const std::string block(kMaximumTextBytes, 'a');
  const auto served = std::make_shared<Mailbox<int>>();
  CallRules rules;
  rules.lane = Reactor::makeLane();
  auto raw = connectRaw(std::make_shared<Answerer>([block, served](const QXArray&) {
                          served->put(1);
                          return QXArray{QXValue(block)};
                        }),
                        std::move(rules));
  raw.sayHello();
  for (std::size_t i = 1; i <= 100; ++i) ASSERT_TRUE(raw.write(Frame(RequestFrame{i, true, kEcho.name, {QXValue("a")}})));
  ASSERT_TRUE(served->take());
  raw.leave();
  EXPECT_TRUE(server.closed->take());
}

TEST_F(EndpointTest, AFloodOfRequestsLeavesOthersTheirTurns) {
  reactor = std::make_unique<Reactor>(1U);
  constexpr std::size_t kFlood = 200;
  struct Turns {
    Mailbox<int> mayGoOn;
    Mailbox<std::size_t> servedBefore;
    std::atomic<std::size_t> served = 0;
  };
  const auto turns = std::make_shared<Turns>();
  auto raw = connectRaw(std::make_shared<Answerer>([turns](QXArray values) {
    if (turns->served++ == 0) turns->mayGoOn.take();
    std::this_thread::sleep_for(2 * kTurn);  // what a request costs, not what is waited for
    return values;
  }));
  const Side flooded = std::exchange(server, {});
  auto other = connectRaw(std::make_shared<Answerer>([turns](QXArray values) {
    turns->servedBefore.put(turns->served);
    return values;
  }));
  raw.sayHello();
  std::vector<std::uint8_t> flood;
  for (std::size_t i = 1; i <= kFlood; ++i) {
    const auto bytes = tests::bytesOf(Frame(RequestFrame{i, true, kEcho.name, {QXValue("a")}}));
    flood.insert(flood.end(), bytes.begin(), bytes.end());
  }
  ASSERT_TRUE(raw.write(flood));
  other.sayHello();
  ASSERT_TRUE(other.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("b")}})));
  turns->mayGoOn.put(1);
  ASSERT_TRUE(other.read<Hello>());
  ASSERT_TRUE(other.read<ReplyFrame>());
  const auto count = turns->servedBefore.take();
  ASSERT_TRUE(count);
  EXPECT_LT(*count, 5U);
  ASSERT_TRUE(raw.read<Hello>());
  for (std::size_t i = 1; i <= kFlood; ++i) ASSERT_TRUE(raw.read<ReplyFrame>());
}

TEST_F(EndpointTest, WhatTheSocketDoesNotTakeAtOnceIsWrittenWhenThePeerReads) {
  reactor = std::make_unique<Reactor>(1U);
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(server.hellos->take());
  // With one thread, a task that was posted afterwards runs when nothing but reading is waited for.
  ASSERT_TRUE(aTaskRuns());
  const auto remote = server.endpoint->remoteObjectProxy(QXErrorHandler());
  const QXRpcOperation operation{"data:", {QXValueKind::data}, {}};
  constexpr std::size_t kBlocks = 4;
  const QXValue block(QXData{std::vector<std::uint8_t>(kMaximumFrameBytes / 2, 7)});
  for (std::size_t i = 0; i < kBlocks; ++i) remote->send(operation, {block}, {});
  ASSERT_TRUE(raw.read<Hello>());
  for (std::size_t i = 0; i < kBlocks; ++i) {
    const auto request = raw.read<RequestFrame>();
    ASSERT_TRUE(request);
    EXPECT_EQ(request->callID, i + 1);
    EXPECT_EQ(request->arguments, QXArray{block});
  }
}

TEST_F(EndpointTest, WhatAPeerIsAskedForNeverPilesUpSoFarThatItIsBlamed) {
  reactor = std::make_unique<Reactor>(1U);
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(server.hellos->take());
  const auto remote = server.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  const QXRpcOperation operation{"data:", {QXValueKind::data}, {}};
  const QXValue block(QXData{std::vector<std::uint8_t>(kMaximumFrameBytes / 2)});
  constexpr std::size_t kBlocks = 3 * kMaximumOutputBytes / (kMaximumFrameBytes / 2);
  for (std::size_t i = 0; i + 1 < kBlocks; ++i) remote->send(operation, {block}, intoReplies());
  remote->send(operation, {block}, {});  // whether an answer is wanted or not
  // With one thread, what is posted afterwards runs when all refusals have been told.
  ASSERT_TRUE(aTaskRuns());
  const std::size_t refused = errors.count();
  ASSERT_GT(refused, kBlocks / 2);
  for (std::size_t i = 0; i < refused; ++i) EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::tooManyCalls));
  ASSERT_TRUE(raw.read<Hello>());
  for (std::size_t i = 1; i <= kBlocks - refused; ++i) {
    const auto request = raw.read<RequestFrame>();
    ASSERT_TRUE(request);
    EXPECT_EQ(request->callID, i) << "what was not sent took no number";
  }
  remote->send(operation, {block}, intoReplies());
  EXPECT_TRUE(raw.read<RequestFrame>()) << "there is room again";
  EXPECT_EQ(server.closed->count(), 0U);
  EXPECT_EQ(server.blamed->count(), 0U);
}

TEST_F(EndpointTest, TooManyMessagesThatWaitForAnswersFail) {
  connect(recorder);
  const auto remote = proxy();
  for (std::size_t i = 0; i < kMaximumPendingCalls; ++i) remote->send(kEcho, {QXValue("a")}, intoReplies());
  EXPECT_EQ(errors.count(), 0U);
  remote->send(kEcho, {QXValue("one more")}, intoReplies());
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::tooManyCalls));
  auto first = recorder->requests.take();
  ASSERT_TRUE(first);
  first->reply({QXValue("a")});
  ASSERT_TRUE(replies.take());
  remote->send(kEcho, {QXValue("again")}, intoReplies());
  for (std::size_t i = 1; i < kMaximumPendingCalls; ++i) ASSERT_TRUE(recorder->requests.take());
  auto last = recorder->requests.take();
  ASSERT_TRUE(last);
  EXPECT_EQ(last->arguments, QXArray{QXValue("again")});
}

TEST_F(EndpointTest, APeerMayNotKeepTooManyRequestsUnanswered) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  std::vector<Recorder::Request> held;
  for (std::size_t i = 1; i <= kMaximumPendingCalls; ++i) {
    raw.write(Frame(RequestFrame{i, i % 2 == 0, kEcho.name, {QXValue("a")}}));  // whether it wants an answer or not
    auto request = recorder->requests.take();
    ASSERT_TRUE(request);
    held.push_back(*std::move(request));
  }
  raw.write(Frame(RequestFrame{kMaximumPendingCalls + 1, true, kEcho.name, {QXValue("a")}}));
  const auto refused = raw.read<FailureFrame>();
  ASSERT_TRUE(refused);
  EXPECT_EQ(refused->callID, kMaximumPendingCalls + 1);
  EXPECT_EQ(refused->error.code, code(QXRpcErrorCode::tooManyCalls));
  held.pop_back();  // dropping a reply makes room too
  raw.write(Frame(RequestFrame{kMaximumPendingCalls + 2, true, kEcho.name, {QXValue("b")}}));
  EXPECT_TRUE(recorder->requests.take());
}

TEST_F(EndpointTest, UnansweredRequestsMayNotHoldTooManyBytes) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  const QXValue text(std::string(kMaximumTextBytes, 'a'));
  constexpr std::size_t kFitting = kMaximumCallBytes / (kMaximumTextBytes + 1) - 1;  // each is a little longer than its text
  std::vector<Recorder::Request> held;
  for (std::size_t i = 1; i <= kFitting; ++i) {
    raw.write(Frame(RequestFrame{i, true, kEcho.name, {text}}));
    auto request = recorder->requests.take();
    ASSERT_TRUE(request);
    held.push_back(*std::move(request));
  }
  for (const std::uint64_t number : {kFitting + 1, kFitting + 2}) raw.write(Frame(RequestFrame{number, true, kEcho.name, {text}}));
  const auto refused = raw.read<FailureFrame>();
  ASSERT_TRUE(refused);
  EXPECT_EQ(refused->error.code, code(QXRpcErrorCode::tooManyCalls));
}

TEST_F(EndpointTest, ConnectionsOfOneBudgetHaveTogetherNoMoreRequestsUnansweredThanItGives) {
  const auto budget = std::make_shared<CallBudget>(CallLimits{1, kMaximumCallBytes});
  auto first = connectRaw(recorder, {budget, {}, {}, {}, {}});
  const Side other = std::exchange(server, {});
  auto second = connectRaw(recorder, {budget, {}, {}, {}, {}});
  for (const auto* peer : {&first, &second}) {
    peer->sayHello();
    ASSERT_TRUE(peer->read<Hello>());
  }
  first.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("a")}}));
  auto held = recorder->requests.take();
  ASSERT_TRUE(held);
  second.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("b")}}));
  const auto refused = second.read<FailureFrame>();
  ASSERT_TRUE(refused);
  EXPECT_EQ(refused->error.code, code(QXRpcErrorCode::tooManyCalls));

  first.leave();
  ASSERT_TRUE(other.closed->take());
  EXPECT_FALSE(budget->take(1)) << "the request outlives its connection";
  held->reply({QXValue("a")});
  second.write(Frame(RequestFrame{2, true, kEcho.name, {QXValue("c")}}));
  EXPECT_TRUE(recorder->requests.take());
}

}  // namespace
}  // namespace docuvend::linux_platform
