#include "platform/linux/wire/Endpoint.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <thread>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Limits.h"
#include "tests/wire/RawPeer.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

using tests::Mailbox;
using tests::RawPeer;
using tests::socketPair;

const QXRpcOperation kEcho{"echo:", {QXValueKind::string}, {QXValueKind::string}};
const QXRpcOperation kOpen{"open:completion:", {QXValueKind::descriptor}, {QXValueKind::descriptor, QXValueKind::error}};
const QXRpcOperation kList{"list:", {}, {QXValueKind::dictionary}};

QXRpcInterface testInterface() { return {"Test", {kEcho, kOpen, kList}}; }

// Hands every request to the test.
class Recorder final : public QXRpcExportedObject {
 public:
  struct Request {
    std::size_t operation;
    QXArray arguments;
    QXRpcReply reply;
    std::thread::id thread;
  };

  void invoke(std::size_t operation, QXArray arguments, QXRpcReply reply) override {
    requests.put({operation, std::move(arguments), std::move(reply), std::this_thread::get_id()});
  }

  Mailbox<Request> requests;
};

// Answers each request on the spot with what the function makes of its arguments.
class Answerer final : public QXRpcExportedObject {
 public:
  explicit Answerer(std::function<QXArray(QXArray)> function) : function_(std::move(function)) {}
  void invoke(std::size_t, QXArray arguments, QXRpcReply reply) override {
    auto values = function_(std::move(arguments));
    if (reply) reply(std::move(values));
  }

 private:
  const std::function<QXArray(QXArray)> function_;
};

std::int64_t code(QXRpcErrorCode value) { return static_cast<std::int64_t>(value); }

MATCHER_P(IsRpcError, value, "") { return arg.has_value() && arg->domain == kQXRpcErrorDomain && arg->code == code(value); }
MATCHER_P(IsSystemError, value, "") { return arg.has_value() && arg->domain == kQXSystemErrorDomain && arg->code == value; }

std::size_t openDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(all), end(all)));
}

// Every test leaves as many open descriptors as it found.
class EndpointTest : public testing::Test {
 protected:
  void TearDown() override {
    client = {};
    server = {};
    reactor.reset();
    recorder.reset();
    EXPECT_EQ(openDescriptors(), descriptorsBefore);
  }

  struct Side {
    std::shared_ptr<Endpoint> endpoint;
    std::shared_ptr<Mailbox<QXError>> closed = std::make_shared<Mailbox<QXError>>();
    std::shared_ptr<Mailbox<QXError>> blamed = std::make_shared<Mailbox<QXError>>();
    std::shared_ptr<Mailbox<Hello>> hellos = std::make_shared<Mailbox<Hello>>();
  };

  Side makeSide(UniqueDescriptor socket, Hello hello = {}, CallRules rules = {}) {
    Side side;
    Endpoint::Handlers handlers;
    handlers.onHello = [hellos = side.hellos](const Hello& said) -> std::optional<QXError> {
      hellos->put(said);
      return std::nullopt;
    };
    handlers.onClose = [closed = side.closed](const QXError& reason) { closed->put(reason); };
    handlers.onMisbehaviour = [blamed = side.blamed](const QXError& reason) { blamed->put(reason); };
    side.endpoint = Endpoint::create(*reactor, std::move(socket), std::move(hello), std::move(handlers), std::move(rules));
    return side;
  }

  // Two endpoints that talk to each other; `object` is exported by the second.
  void connect(std::shared_ptr<QXRpcExportedObject> object) {
    auto [one, two] = socketPair();
    client = makeSide(std::move(one));
    server = makeSide(std::move(two));
    server.endpoint->setExportedInterface(testInterface());
    server.endpoint->setExportedObject(std::move(object));
    server.endpoint->resume();
    client.endpoint->resume();
  }

  // An endpoint that exports `object`, and a peer written by hand.
  RawPeer connectRaw(std::shared_ptr<QXRpcExportedObject> object, CallRules rules = {}) {
    auto [one, two] = socketPair();
    server = makeSide(std::move(one), {}, std::move(rules));
    server.endpoint->setExportedInterface(testInterface());
    server.endpoint->setExportedObject(std::move(object));
    server.endpoint->resume();
    return RawPeer(std::move(two));
  }

  std::shared_ptr<QXRpcProxy> proxy() {
    return client.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  }
  QXRpcReply intoReplies() {
    return [this](QXArray values) { replies.put(std::move(values)); };
  }

  const std::size_t descriptorsBefore = openDescriptors();

  // Destroyed from below: the reactor's threads end before what they fill goes.
  Mailbox<QXError> errors;
  Mailbox<QXArray> replies;
  std::shared_ptr<Recorder> recorder = std::make_shared<Recorder>();
  Side client;
  Side server;
  std::unique_ptr<Reactor> reactor = std::make_unique<Reactor>(2U);
};

TEST_F(EndpointTest, ARequestReachesTheObjectAndItsReplyTheCaller) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("hello")}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  EXPECT_EQ(request->operation, 0U);
  EXPECT_EQ(request->arguments, QXArray{QXValue("hello")});
  request->reply({QXValue("there")});
  EXPECT_EQ(replies.take(), QXArray{QXValue("there")});
  EXPECT_EQ(errors.count(), 0U);
}

TEST_F(EndpointTest, TheSecondCallOfAReplyIsDropped) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  auto first = recorder->requests.take();
  ASSERT_TRUE(first);
  first->reply({QXValue("first")});
  first->reply({QXValue("second")});
  proxy()->send(kEcho, {QXValue("b")}, intoReplies());
  auto second = recorder->requests.take();
  ASSERT_TRUE(second);
  second->reply({QXValue("other")});
  EXPECT_EQ(replies.take(), QXArray{QXValue("first")});
  EXPECT_EQ(replies.take(), QXArray{QXValue("other")});
  EXPECT_EQ(replies.count(), 0U);
  EXPECT_EQ(errors.count(), 0U);
}

TEST_F(EndpointTest, AReplyThatIsNeverCalledAnswersNothingUntilTheConnectionEnds) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  {
    auto request = recorder->requests.take();
    ASSERT_TRUE(request);
    request->reply = {};
  }
  proxy()->send(kEcho, {QXValue("b")}, intoReplies());
  auto second = recorder->requests.take();
  ASSERT_TRUE(second);
  second->reply({QXValue("b")});
  EXPECT_EQ(replies.take(), QXArray{QXValue("b")});
  EXPECT_EQ(errors.count(), 0U);
  server.endpoint.reset();
  EXPECT_THAT(errors.take(), IsSystemError(ECONNRESET));
  EXPECT_TRUE(client.closed->take());
  EXPECT_EQ(errors.count(), 0U);
}

TEST_F(EndpointTest, AReplyMayBeCalledAfterTheConnectionIsOver) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  client.endpoint->close(QXError::system(ECONNABORTED, "enough"));
  ASSERT_TRUE(server.closed->take());
  request->reply({QXValue("late")});
  EXPECT_THAT(errors.take(), IsSystemError(ECONNABORTED));
  EXPECT_EQ(replies.count(), 0U);
  server.endpoint.reset();
  request->reply({QXValue("later")});
}

TEST_F(EndpointTest, AMessageWithoutAReplyHandlerReachesTheObject) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("a")}, {});
  const auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  EXPECT_EQ(request->arguments, QXArray{QXValue("a")});
}

TEST_F(EndpointTest, ARequestThatWantsNoReplyGetsNone) {
  auto raw = connectRaw(std::make_shared<Answerer>([](QXArray arguments) { return arguments; }));
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  raw.write(Frame(RequestFrame{1, false, kEcho.name, {QXValue("a")}}));
  raw.write(Frame(RequestFrame{2, true, kEcho.name, {QXValue("b")}}));
  const auto reply = raw.read<ReplyFrame>();
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->callID, 2U);
}

TEST_F(EndpointTest, AMessageWithoutAReplyHandlerIsRefusedToItsErrorHandler) {
  connect(recorder);
  proxy()->send({"nothing:", {}, {}}, {}, {});
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::unknownOperation));
  proxy()->send(kEcho, {QXValue(1)}, {});
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidArguments));
  EXPECT_EQ(errors.count(), 0U);
}

TEST_F(EndpointTest, AnUnknownOperationIsRefusedAndTheConnectionGoesOn) {
  connect(recorder);
  proxy()->send({"nothing:", {}, {}}, {}, intoReplies());
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::unknownOperation));
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  EXPECT_TRUE(recorder->requests.take());
  EXPECT_EQ(replies.count(), 0U);
}

TEST_F(EndpointTest, WithoutAnExportedObjectEveryOperationIsUnknown) {
  connect(nullptr);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::unknownOperation));
}

TEST_F(EndpointTest, WrongArgumentsNeverReachTheObject) {
  connect(recorder);
  const std::vector<QXArray> wrong = {{}, {QXValue(1)}, {QXValue("a"), QXValue("b")}, {QXValue(QXArray{})}};
  for (const QXArray& arguments : wrong) {
    proxy()->send(kEcho, arguments, intoReplies());
    EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidArguments)) << QXValue(arguments).description();
  }
  proxy()->send(kEcho, {QXValue()}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  EXPECT_EQ(request->arguments, QXArray{QXValue()}) << "an absent value fits every position";
}

TEST_F(EndpointTest, AReplyThatDoesNotFitItsOperationBecomesAFailure) {
  connect(recorder);
  const std::vector<QXArray> wrong = {{}, {QXValue(1)}, {QXValue("a"), QXValue("b")}, {QXValue("\x01")}};
  for (const QXArray& values : wrong) {
    proxy()->send(kEcho, {QXValue("a")}, intoReplies());
    auto request = recorder->requests.take();
    ASSERT_TRUE(request);
    request->reply(values);
    EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidReply)) << QXValue(values).description();
  }
  EXPECT_EQ(replies.count(), 0U);
}

TEST_F(EndpointTest, AReplyMustHoldOnlyTheTypesThatItsPositionAccepts) {
  auto [one, two] = socketPair();
  client = makeSide(std::move(one));
  server = makeSide(std::move(two));
  QXRpcInterface interface = testInterface();
  interface.setAcceptedReplyKinds(kList.name, 0, {QXValueKind::dictionary, QXValueKind::string});
  server.endpoint->setExportedInterface(std::move(interface));
  server.endpoint->setExportedObject(recorder);
  server.endpoint->resume();
  client.endpoint->resume();

  proxy()->send(kList, {}, intoReplies());
  auto first = recorder->requests.take();
  ASSERT_TRUE(first);
  first->reply({QXValue(QXDictionary{{"a", QXValue(QXDictionary{{"b", QXValue(1)}})}})});
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidReply));

  const QXArray good = {QXValue(QXDictionary{{"a", QXValue(QXDictionary{{"b", QXValue("c")}})}})};
  proxy()->send(kList, {}, intoReplies());
  auto second = recorder->requests.take();
  ASSERT_TRUE(second);
  second->reply(good);
  EXPECT_EQ(replies.take(), good);
}

TEST_F(EndpointTest, AnAnswerOfAPeerIsCheckedAgainstTheOperation) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  const auto remote = server.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  remote->send(kEcho, {QXValue("a")}, intoReplies());
  const auto request = raw.read<RequestFrame>();
  ASSERT_TRUE(request);
  raw.write(Frame(ReplyFrame{request->callID, {QXValue(5)}}));
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidReply));
  EXPECT_EQ(replies.count(), 0U);
}

TEST_F(EndpointTest, WhatTheWireCannotCarryFailsWithoutBeingSent) {
  connect(recorder);
  QXValue deep("bottom");
  for (std::size_t i = 0; i <= kMaximumNesting; ++i) deep = QXValue(QXArray{deep});
  const std::vector<QXValue> wrong = {
      QXValue("\x01"),
      QXValue("\xFF"),
      QXValue(std::string(kMaximumTextBytes + 1, 'a')),
      QXValue(QXData{std::vector<std::uint8_t>(kMaximumFrameBytes)}),
      deep,
      QXValue(QXArray(kMaximumElements + 1)),
      QXValue(QXArray{QXValue(QXDescriptor{0, nullptr})}),
      QXValue(QXDescriptor{-1, nullptr}),
  };
  for (const QXValue& value : wrong) {
    proxy()->send(kEcho, {value}, intoReplies());
    EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::notTransmissible)) << qxKindName(value.kind());
  }
  proxy()->send(kEcho, {QXValue("good")}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  EXPECT_EQ(request->arguments, QXArray{QXValue("good")});
}

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
  Mailbox<bool> pongs;
  client.endpoint->ping([&pongs] { pongs.put(true); });
  EXPECT_TRUE(pongs.take());
  EXPECT_EQ(replies.count(), 0U);
  client.endpoint->ping([&pongs] { pongs.put(true); });
  EXPECT_TRUE(pongs.take());
}

TEST_F(EndpointTest, AnEndThatDoesNotReadGivesNoSignOfLife) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  Mailbox<bool> pongs;
  server.endpoint->ping([&pongs] { pongs.put(true); });
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

TEST_F(EndpointTest, AnEndpointAwaitsAnswersUntilTheLastHasCome) {
  connect(recorder);
  EXPECT_FALSE(client.endpoint->awaitsAnswers());
  proxy()->send(kEcho, {QXValue("a")}, {});
  EXPECT_FALSE(client.endpoint->awaitsAnswers()) << "nobody waits for this one";
  proxy()->send(kEcho, {QXValue("b")}, intoReplies());
  EXPECT_TRUE(client.endpoint->awaitsAnswers());
  ASSERT_TRUE(recorder->requests.take());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  request->reply({QXValue("b")});
  ASSERT_TRUE(replies.take());
  EXPECT_FALSE(client.endpoint->awaitsAnswers());
}

TEST_F(EndpointTest, WhenTheSystemPassesNoMoreDescriptorsOnTheConnectionEndsAndNobodyWaitsForEver) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  const rlimit tight{64, usual.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &tight), 0);
  // What lies in the socket counts, and the peer takes nothing.
  const auto remote = server.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  for (int i = 0; i < 200 && server.closed->count() == 0; ++i) {
    remote->send(kOpen, {toValue(UniqueDescriptor(::open("/dev/null", O_RDWR | O_CLOEXEC)))}, intoReplies());
  }
  EXPECT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
  EXPECT_THAT(server.closed->take(), IsSystemError(ETOOMANYREFS));
  EXPECT_THAT(errors.take(), IsSystemError(ETOOMANYREFS));
  EXPECT_EQ(server.blamed->count(), 0U);
}

TEST_F(EndpointTest, DescriptorsTravelInBothDirections) {
  connect(recorder);
  UniqueDescriptor file(::open("/dev/null", O_RDWR | O_CLOEXEC));
  struct stat sent {};
  ASSERT_EQ(::fstat(file.get(), &sent), 0);
  proxy()->send(kOpen, {QXValue(toValue(std::move(file)))}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  const auto* received = request->arguments[0].as<QXDescriptor>();
  ASSERT_NE(received, nullptr);
  struct stat arrived {};
  ASSERT_EQ(::fstat(received->number, &arrived), 0);
  EXPECT_EQ(arrived.st_rdev, sent.st_rdev);
  EXPECT_NE(static_cast<unsigned>(::fcntl(received->number, F_GETFD)) & static_cast<unsigned>(FD_CLOEXEC), 0U);
  request->reply({request->arguments[0], QXValue()});
  const auto reply = replies.take();
  ASSERT_TRUE(reply);
  ASSERT_NE((*reply)[0].as<QXDescriptor>(), nullptr);
  EXPECT_GE(::fcntl((*reply)[0].as<QXDescriptor>()->number, F_GETFD), 0);
}

TEST_F(EndpointTest, DescriptorsOfARefusedRequestAreClosed) {
  connect(recorder);
  for (int i = 0; i < 10; ++i) {
    proxy()->send(kEcho, {QXValue(toValue(UniqueDescriptor(::open("/dev/null", O_RDWR | O_CLOEXEC))))}, intoReplies());
    EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidArguments));
  }
}

TEST_F(EndpointTest, RequestsOfOneConnectionRunOneAfterAnotherInOrder) {
  constexpr int kMessages = 500;
  std::atomic<int> inside = 0;
  std::atomic<bool> overlapped = false;
  Mailbox<std::string> seen;
  connect(std::make_shared<Answerer>([&](QXArray arguments) {
    if (++inside > 1) overlapped = true;
    seen.put(*arguments[0].as<std::string>());
    --inside;
    return arguments;
  }));
  const auto remote = proxy();
  for (int i = 0; i < kMessages; ++i) remote->send(kEcho, {QXValue(std::to_string(i))}, intoReplies());
  for (int i = 0; i < kMessages; ++i) {
    EXPECT_EQ(seen.take(), std::to_string(i));
    EXPECT_EQ(replies.take(), QXArray{QXValue(std::to_string(i))});
  }
  EXPECT_FALSE(overlapped);
}

TEST_F(EndpointTest, ManyThreadsMaySendAtOnce) {
  constexpr int kThreads = 8;
  constexpr int kMessages = 100;
  connect(std::make_shared<Answerer>([](QXArray arguments) { return arguments; }));
  const auto remote = proxy();
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([this, remote, t] {
      for (int i = 0; i < kMessages; ++i) {
        const QXArray arguments = {QXValue(std::to_string(t) + "/" + std::to_string(i))};
        remote->send(kEcho, arguments, [this, arguments](QXArray values) { replies.put(values == arguments ? values : QXArray{}); });
      }
    });
  }
  for (auto& thread : threads) thread.join();
  for (int i = 0; i < kThreads * kMessages; ++i) {
    const auto reply = replies.take();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->size(), 1U) << "an answer went to another request";
  }
  EXPECT_EQ(errors.count(), 0U);
}

TEST_F(EndpointTest, AReplyMayComeFromAnyThread) {
  connect(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  std::thread([reply = request->reply] { reply({QXValue("from afar")}); }).join();
  EXPECT_EQ(replies.take(), QXArray{QXValue("from afar")});
}

TEST_F(EndpointTest, WhenThePeerLeavesEveryWaitingMessageFailsOnceAndThenTheEndIsTold) {
  connect(recorder);
  constexpr int kMessages = 20;
  for (int i = 0; i < kMessages; ++i) proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  std::vector<Recorder::Request> held;
  for (int i = 0; i < kMessages; ++i) held.push_back(*recorder->requests.take());
  server.endpoint.reset();
  EXPECT_THAT(client.closed->take(), IsSystemError(ECONNRESET));
  EXPECT_EQ(errors.count(), static_cast<std::size_t>(kMessages)) << "all have failed before the end is told";
  EXPECT_EQ(replies.count(), 0U);
  EXPECT_EQ(client.closed->count(), 0U);
  EXPECT_EQ(client.blamed->count(), 0U);
}

TEST_F(EndpointTest, AMessageOnAnEndedConnectionFailsOnAnotherThread) {
  connect(recorder);
  client.endpoint->close(QXError::system(ECONNABORTED, "enough"));
  Mailbox<std::thread::id> threads;
  client.endpoint->remoteObjectProxy([&threads](const QXError&) { threads.put(std::this_thread::get_id()); })
      ->send(kEcho, {QXValue("a")}, {});
  const auto thread = threads.take();
  ASSERT_TRUE(thread);
  EXPECT_NE(*thread, std::this_thread::get_id());
}

TEST_F(EndpointTest, AFailedMessageSaysHowFarItCame) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(server.hellos->take());
  Mailbox<MessageFate> fates;
  const auto remote = server.endpoint->remoteObjectProxy([&fates](const QXError&, MessageFate fate) { fates.put(fate); });

  // This end would not send it.
  remote->send({"text:", {QXValueKind::string}, {}}, {QXValue(std::string(kMaximumTextBytes + 1, 'x'))}, intoReplies());
  EXPECT_EQ(fates.take(), MessageFate::refused);
  // The peer would not run it.
  remote->send(kList, {}, intoReplies());
  ASSERT_TRUE(raw.read<Hello>());
  const auto request = raw.read<RequestFrame>();
  ASSERT_TRUE(request);
  raw.write(tests::bytesOf(FailureFrame{request->callID, QXError::make("Test", 1, "no")}));
  EXPECT_EQ(fates.take(), MessageFate::refused);

  // One that the socket took whole, then more than any socket takes.
  remote->send(kList, {}, intoReplies());
  const QXRpcOperation operation{"data:", {QXValueKind::data}, {}};
  const QXValue block(QXData{std::vector<std::uint8_t>(kMaximumFrameBytes / 2)});
  for (int i = 0; i < 4; ++i) remote->send(operation, {block}, intoReplies());
  server.endpoint->close(QXError::system(ECONNABORTED, "enough"));
  EXPECT_EQ(fates.take(), MessageFate::unanswered);
  ASSERT_TRUE(server.closed->take());
  ASSERT_EQ(fates.count(), 4U);
  for (int i = 0; i < 3; ++i) fates.take();
  EXPECT_EQ(fates.take(), MessageFate::unsent);

  remote->send(kList, {}, intoReplies());
  EXPECT_EQ(fates.take(), MessageFate::unsent) << "the connection is over";
}

TEST_F(EndpointTest, AMessageToAPeerThatHasLeftIsUnsentAlsoBeforeItsLeavingIsSeen) {
  auto [one, two] = socketPair();
  server = makeSide(std::move(one));
  two.reset();
  Mailbox<MessageFate> fates;
  server.endpoint->remoteObjectProxy([&fates](const QXError&, MessageFate fate) { fates.put(fate); })->send(kList, {}, intoReplies());
  server.endpoint->resume();
  EXPECT_EQ(fates.take(), MessageFate::unsent);
}

TEST_F(EndpointTest, AMessageToAPeerThatLeavesWithoutItsHelloWasNotTaken) {
  auto raw = connectRaw(nullptr);
  Mailbox<MessageFate> fates;
  const auto remote = server.endpoint->remoteObjectProxy([&fates](const QXError&, MessageFate fate) { fates.put(fate); });
  remote->send(kList, {}, intoReplies());
  ASSERT_TRUE(raw.read<Hello>());
  ASSERT_TRUE(raw.read<RequestFrame>());
  raw.leave();
  EXPECT_EQ(fates.take(), MessageFate::unsent);
}

TEST_F(EndpointTest, AMessageThatIsRefusedWithTheConnectionWasNotTaken) {
  auto raw = connectRaw(nullptr);
  Mailbox<MessageFate> fates;
  const auto remote = server.endpoint->remoteObjectProxy([&fates](const QXError&, MessageFate fate) { fates.put(fate); });
  remote->send(kList, {}, intoReplies());
  raw.write(tests::bytesOf(EndFrame{QXError::make("Test", 1, "no")}));
  EXPECT_EQ(fates.take(), MessageFate::unsent);
}

TEST_F(EndpointTest, AMessageToAPeerThatLeavesAfterItsHelloMayHaveBeenRun) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  Mailbox<MessageFate> fates;
  const auto remote = server.endpoint->remoteObjectProxy([&fates](const QXError&, MessageFate fate) { fates.put(fate); });
  remote->send(kList, {}, intoReplies());
  raw.leave();
  EXPECT_EQ(fates.take(), MessageFate::unanswered);
}

TEST_F(EndpointTest, CloseTellsThePeerWhy) {
  connect(recorder);
  const QXError reason = QXError::make("Some domain", 7, "because");
  server.endpoint->close(reason);
  EXPECT_EQ(client.closed->take(), reason);
  EXPECT_EQ(server.closed->take(), reason);
  EXPECT_EQ(client.blamed->count(), 0U);
}

TEST_F(EndpointTest, TheEndLetsTheExportedObjectGo) {
  auto object = std::make_shared<Recorder>();
  const std::weak_ptr<Recorder> weak = object;
  connect(std::move(object));
  EXPECT_FALSE(weak.expired());
  client.endpoint.reset();
  ASSERT_TRUE(server.closed->take());
  EXPECT_TRUE(weak.expired());
}

TEST_F(EndpointTest, AnErrorOfTheHelloHandlerEndsTheConnectionAndThePeerSeesIt) {
  const QXError refusal = QXError::make("Some domain", 3, "not you");
  auto [one, two] = socketPair();
  Hello hello;
  hello.declaredBundle = "com.example.App";
  client = makeSide(std::move(one), hello);
  Mailbox<Hello> hellos;
  Endpoint::Handlers handlers;
  handlers.onHello = [&hellos, refusal](const Hello& said) -> std::optional<QXError> {
    hellos.put(said);
    return refusal;
  };
  server.endpoint = Endpoint::create(*reactor, std::move(two), {}, std::move(handlers));
  server.endpoint->setExportedInterface(testInterface());
  server.endpoint->setExportedObject(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  server.endpoint->resume();
  client.endpoint->resume();
  const auto said = hellos.take();
  ASSERT_TRUE(said);
  EXPECT_EQ(said->declaredBundle, "com.example.App");
  EXPECT_EQ(said->version, kProtocolVersion);
  EXPECT_EQ(errors.take(), refusal);
  EXPECT_EQ(client.closed->take(), refusal);
  EXPECT_EQ(recorder->requests.count(), 0U);
}

TEST_F(EndpointTest, NothingIsReadBeforeResume) {
  auto [one, two] = socketPair();
  server = makeSide(std::move(one));
  server.endpoint->setExportedInterface(testInterface());
  server.endpoint->setExportedObject(recorder);
  const RawPeer raw(std::move(two));
  raw.sayHello();
  raw.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("a")}}));
  EXPECT_TRUE(raw.read<Hello>()) << "the hello does not wait";
  // Another connection's whole conversation goes through the same reactor meanwhile.
  auto [three, four] = socketPair();
  const Side other = makeSide(std::move(three));
  other.endpoint->resume();
  const RawPeer otherRaw(std::move(four));
  otherRaw.sayHello();
  EXPECT_TRUE(other.hellos->take());
  EXPECT_EQ(recorder->requests.count(), 0U);
  EXPECT_EQ(server.hellos->count(), 0U);
  server.endpoint->resume();
  EXPECT_TRUE(recorder->requests.take());
}

// Its own requests are what is answered.
TEST_F(EndpointTest, APeerThatDoesNotReadIsDroppedAndHoldsNobodyUp) {
  const std::string block(kMaximumTextBytes, 'a');
  auto raw = connectRaw(std::make_shared<Answerer>([&block](const QXArray&) { return QXArray{QXValue(block)}; }));
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
  std::atomic<std::size_t> served = 0;
  CallRules rules;
  rules.lane = Reactor::makeLane();
  auto raw = connectRaw(std::make_shared<Answerer>([&](const QXArray&) {
                          ++served;
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
    Mailbox<int> passed;
    reactor->post([&passed] { passed.put(1); });
    ASSERT_TRUE(passed.take());
    if (std::exchange(before, served) != served || served == 0) quiet = 0;
  }
  EXPECT_LT(served, kAnswers);
  EXPECT_EQ(server.closed->count(), 0U);
  ASSERT_TRUE(raw.read<Hello>());
  for (std::size_t i = 1; i <= kAnswers; ++i) {
    const auto reply = raw.read<ReplyFrame>();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->callID, i);
  }
  EXPECT_EQ(served, kAnswers);
}

TEST_F(EndpointTest, APeerInALaneThatLeavesWithoutReadingIsForgotten) {
  const std::string block(kMaximumTextBytes, 'a');
  Mailbox<int> served;
  CallRules rules;
  rules.lane = Reactor::makeLane();
  auto raw = connectRaw(std::make_shared<Answerer>([&](const QXArray&) {
                          served.put(1);
                          return QXArray{QXValue(block)};
                        }),
                        std::move(rules));
  raw.sayHello();
  for (std::size_t i = 1; i <= 100; ++i) ASSERT_TRUE(raw.write(Frame(RequestFrame{i, true, kEcho.name, {QXValue("a")}})));
  ASSERT_TRUE(served.take());
  raw.leave();
  EXPECT_TRUE(server.closed->take());
}

TEST_F(EndpointTest, AFloodOfRequestsLeavesOthersTheirTurns) {
  reactor = std::make_unique<Reactor>(1U);
  constexpr std::size_t kFlood = 200;
  Mailbox<int> mayGoOn;
  Mailbox<std::size_t> servedBefore;
  std::atomic<std::size_t> served = 0;
  auto raw = connectRaw(std::make_shared<Answerer>([&](QXArray values) {
    if (served++ == 0) mayGoOn.take();
    std::this_thread::sleep_for(2 * kTurn);  // what a request costs, not what is waited for
    return values;
  }));
  const Side flooded = std::exchange(server, {});
  auto other = connectRaw(std::make_shared<Answerer>([&](QXArray values) {
    servedBefore.put(served);
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
  mayGoOn.put(1);
  ASSERT_TRUE(other.read<Hello>());
  ASSERT_TRUE(other.read<ReplyFrame>());
  const auto count = servedBefore.take();
  ASSERT_TRUE(count);
  EXPECT_LT(*count, 5U);
  ASSERT_TRUE(raw.read<Hello>());
  for (std::size_t i = 1; i <= kFlood; ++i) ASSERT_TRUE(raw.read<ReplyFrame>());
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
  Mailbox<int> idle;
  reactor->post([&idle] { idle.put(1); });
  ASSERT_TRUE(idle.take());
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

TEST_F(EndpointTest, APeerMayAskForNoMoreThanItsRulesSay) {
  auto raw = connectRaw(recorder, {{}, std::vector<std::string>{kEcho.name}, {}, {}, {}});
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  for (const auto& [number, operation] : {std::pair(1U, kList.name), std::pair(2U, std::string("unheard:of:"))}) {
    raw.write(Frame(RequestFrame{number, true, operation, {}}));
    const auto refused = raw.read<FailureFrame>();
    ASSERT_TRUE(refused);
    EXPECT_EQ(refused->callID, number);
    EXPECT_EQ(refused->error.code, code(QXRpcErrorCode::notPermitted));
  }
  raw.write(Frame(RequestFrame{3, true, kEcho.name, {QXValue("a")}}));
  EXPECT_TRUE(recorder->requests.take());
  EXPECT_EQ(recorder->requests.count(), 0U);
}

TEST_F(EndpointTest, ARequestAndWhatFollowsFromItElsewhereAreForThePeer) {
  const auto peersName = std::make_shared<const std::string>("peer");
  Mailbox<LogSubject::Name> subjects;
  auto raw = connectRaw(std::make_shared<Answerer>([&subjects](QXArray values) {
                          subjects.put(LogSubject::current());
                          return values;
                        }),
                        {{}, {}, {}, peersName, {}});
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  raw.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("a")}}));
  EXPECT_EQ(subjects.take(), peersName);
  ASSERT_TRUE(raw.read<ReplyFrame>());

  const auto tell = [&subjects](const auto&...) { subjects.put(LogSubject::current()); };
  const auto ask = [this, &tell, &raw](std::uint64_t number) {
    server.endpoint->remoteObjectProxy(QXErrorHandler(tell))->send(kEcho, {QXValue("b")}, tell);
    ASSERT_TRUE(raw.read<RequestFrame>());
    if (number % 2 == 0) {
      raw.write(Frame(ReplyFrame{number, {QXValue("b")}}));
    } else {
      raw.write(Frame(FailureFrame{number, QXError::make("Some domain", 1, "no")}));
    }
  };
  const auto somebody = std::make_shared<const std::string>("somebody");
  for (const std::uint64_t number : {1U, 2U}) {
    const LogSubject subject(somebody);
    ask(number);
    EXPECT_EQ(subjects.take(), somebody);
  }
  for (const std::uint64_t number : {3U, 4U}) {
    ask(number);
    EXPECT_EQ(subjects.take(), LogSubject::Name());
  }
}

TEST_F(EndpointTest, WhatTheSocketDoesNotTakeAtOnceIsWrittenWhenThePeerReads) {
  reactor = std::make_unique<Reactor>(1U);
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(server.hellos->take());
  // With one thread, a task that was posted afterwards runs when nothing but reading is waited for.
  Mailbox<int> idle;
  reactor->post([&idle] { idle.put(1); });
  ASSERT_TRUE(idle.take());
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

TEST_F(EndpointTest, AMessageWithoutAReplyHandlerThatWasNotWrittenFailsWithTheConnection) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  const auto remote = server.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  const QXRpcOperation operation{"data:", {QXValueKind::data}, {}};
  const QXValue block(QXData{std::vector<std::uint8_t>(kMaximumFrameBytes / 2)});
  remote->send(operation, {QXValue(QXData{})}, {});
  for (int i = 0; i < 4; ++i) remote->send(operation, {block}, {});
  server.endpoint->close(QXError::system(ECONNABORTED, "enough"));
  ASSERT_TRUE(server.closed->take());
  EXPECT_GE(errors.count(), 3U) << "blocks that no socket buffer holds";
  EXPECT_LE(errors.count(), 4U) << "the first message was written";
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

TEST_F(EndpointTest, ARefusalReachesAPeerThatHasLeftMuchUnread) {
  // The peer's requests are still on their way when this end closes: the peer reads the reason all the same.
  connect(recorder);
  const QXError reason = QXError::make("Some domain", 1, "no");
  const auto remote = proxy();
  for (int i = 0; i < 50; ++i) remote->send(kEcho, {QXValue(std::string(1000, 'a'))}, intoReplies());
  server.endpoint->close(reason);
  EXPECT_EQ(client.closed->take(), reason);
  for (int i = 0; i < 50; ++i) EXPECT_EQ(errors.take(), reason);
}

TEST_F(EndpointTest, TheOwnerMayLetTheEndpointGoInsideItsOwnHandlers) {
  connect(std::make_shared<Answerer>([this](QXArray arguments) {
    server.endpoint.reset();
    return arguments;
  }));
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  EXPECT_THAT(errors.take(), IsSystemError(ECONNRESET));
  EXPECT_THAT(server.closed->take(), IsSystemError(ECONNABORTED));
}

TEST(ConnectToSocketTest, SaysWhyThereIsNoConnection) {
  const auto result = connectToSocket("/nonexistent/socket");
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_EQ(std::get<QXError>(result).code, ENOENT);
}

TEST(ConnectToSocketTest, WaitsForAFullQueueNoLongerThanItIsTold) {
  std::string pattern = (std::filesystem::temp_directory_path() / "dvXXXXXX").string();
  ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
  const std::string path = pattern + "/s";
  UniqueDescriptor service(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof(address.sun_path) - 1);
  ASSERT_EQ(::bind(service.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  ASSERT_EQ(::listen(service.get(), 0), 0);
  std::vector<UniqueDescriptor> clients;
  std::optional<QXError> failure;
  for (int i = 0; i < 3 && !failure; ++i) {
    auto connected = connectToSocket(path, std::chrono::milliseconds(1));
    if (auto* error = std::get_if<QXError>(&connected)) {
      failure = *error;
    } else {
      clients.push_back(std::get<UniqueDescriptor>(std::move(connected)));
    }
  }
  EXPECT_THAT(failure, IsSystemError(EAGAIN));
  EXPECT_EQ(clients.size(), 1U);
  std::filesystem::remove_all(pattern);
}

// What a peer must not send, and the reason that ends the connection.
struct Misbehaviour {
  std::string name;
  std::vector<std::uint8_t> bytes;
  std::string reason;
};
void PrintTo(const Misbehaviour& misbehaviour, std::ostream* out) { *out << misbehaviour.name; }

std::vector<std::uint8_t> joined(std::initializer_list<Frame> frames) {
  std::vector<std::uint8_t> all;
  for (const Frame& frame : frames) {
    const auto bytes = tests::bytesOf(frame);
    all.insert(all.end(), bytes.begin(), bytes.end());
  }
  return all;
}

const Hello kHello{kProtocolVersion, std::nullopt};

class EndpointMisbehaviourTest : public EndpointTest, public testing::WithParamInterface<Misbehaviour> {};

TEST_P(EndpointMisbehaviourTest, EndsTheConnectionWithItsReasonToldToBothEnds) {
  auto raw = connectRaw(recorder);
  raw.write(GetParam().bytes);
  const auto closed = server.closed->take();
  ASSERT_TRUE(closed);
  EXPECT_EQ(closed->domain, kQXRpcErrorDomain);
  EXPECT_THAT(closed->texts.at("description"), testing::HasSubstr(GetParam().reason));
  EXPECT_EQ(server.blamed->take(), closed);
  ASSERT_TRUE(raw.read<Hello>());
  const auto end = raw.read<EndFrame>();
  ASSERT_TRUE(end);
  EXPECT_EQ(end->error, *closed);
  EXPECT_TRUE(raw.atEnd());
  EXPECT_EQ(recorder->requests.count(), 0U);
}

INSTANTIATE_TEST_SUITE_P(
    Table, EndpointMisbehaviourTest,
    testing::Values(Misbehaviour{"over-long frame", {0xFF, 0xFF, 0xFF, 0xFF, 0x01, 0x00}, "a frame of 4294967295 bytes"},
                    Misbehaviour{"just over-long frame", {0x01, 0x00, 0x10, 0x00}, "a frame of 1048577 bytes"},
                    Misbehaviour{"empty frame", {0x00, 0x00, 0x00, 0x00}, "a frame without a head"},
                    Misbehaviour{"no hello", joined({RequestFrame{1, true, kEcho.name, {QXValue("a")}}}), "a frame before the hello"},
                    Misbehaviour{"two hellos", joined({kHello, kHello}), "a second hello"},
                    Misbehaviour{"another version", joined({Hello{9, std::nullopt}}), "version 9 of the protocol is not supported"},
                    Misbehaviour{"unknown frame type", {0x02, 0x00, 0x00, 0x00, 0x63, 0x00}, "a frame of unknown type 99"},
                    Misbehaviour{"request number 0", joined({kHello, RequestFrame{0, true, kEcho.name, {}}}),
                                 "a request whose number does not rise"},
                    Misbehaviour{"an answer to nothing", joined({kHello, ReplyFrame{1, {}}}), "an answer to a request that was not made"},
                    Misbehaviour{"a failure of nothing", joined({kHello, FailureFrame{1, {}}}), "an answer to a request that was not made"},
                    Misbehaviour{"a descriptor that is declared and not sent",
                                 {0x07, 0x00, 0x00, 0x00, 0x01, 0x01, 0x01, 0x00, 0x00, 0x00, 0x00},
                                 "a frame without the descriptors that it declares"}));

TEST_F(EndpointTest, ARequestNumberMustRise) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  raw.write(Frame(RequestFrame{5, false, kEcho.name, {QXValue("a")}}));
  raw.write(Frame(RequestFrame{5, false, kEcho.name, {QXValue("b")}}));
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
  EXPECT_EQ(recorder->requests.count(), 1U);
}

TEST_F(EndpointTest, AConnectionThatEndsInsideAFrameIsMalformed) {
  auto raw = connectRaw(recorder);
  ASSERT_TRUE(raw.read<Hello>());
  auto bytes = joined({kHello, RequestFrame{1, true, kEcho.name, {QXValue("a")}}});
  bytes.pop_back();
  raw.write(bytes);
  raw.leave();
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

TEST_F(EndpointTest, ASecondAnswerToOneRequestIsIgnored) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  const auto remote = server.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  remote->send(kEcho, {QXValue("a")}, intoReplies());
  ASSERT_TRUE(raw.read<RequestFrame>());
  raw.write(Frame(ReplyFrame{1, {QXValue("once")}}));
  raw.write(Frame(ReplyFrame{1, {QXValue("twice")}}));
  raw.write(Frame(FailureFrame{1, {}}));
  remote->send(kEcho, {QXValue("b")}, intoReplies());
  ASSERT_TRUE(raw.read<RequestFrame>());
  raw.write(Frame(ReplyFrame{2, {QXValue("other")}}));
  EXPECT_EQ(replies.take(), QXArray{QXValue("once")});
  EXPECT_EQ(replies.take(), QXArray{QXValue("other")});
  EXPECT_EQ(errors.count(), 0U);
}

TEST_F(EndpointTest, DescriptorsThatNoFrameDeclaresEndTheConnection) {
  auto raw = connectRaw(recorder);
  const std::array<int, 1> one{raw.socket()};
  raw.write(tests::bytesOf(kHello), one);
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

TEST_F(EndpointTest, MoreDescriptorsThanAFrameMayHaveEndTheConnection) {
  auto raw = connectRaw(recorder);
  std::vector<int> many(kMaximumDescriptors + 1, raw.socket());
  raw.write(tests::bytesOf(kHello), many);
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

}  // namespace
}  // namespace docuvend::linux_platform
