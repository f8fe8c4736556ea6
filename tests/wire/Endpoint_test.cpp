#include "platform/linux/wire/Endpoint.h"

#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

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

TEST_F(EndpointTest, RequestsOfOneConnectionRunOneAfterAnotherInOrder) {
  constexpr int kMessages = 500;
  struct Runs {
    std::atomic<int> inside = 0;
    std::atomic<bool> overlapped = false;
    Mailbox<std::string> seen;
  };
  const auto runs = std::make_shared<Runs>();
  connect(std::make_shared<Answerer>([runs](QXArray arguments) {
    if (++runs->inside > 1) runs->overlapped = true;
    runs->seen.put(*arguments[0].as<std::string>());
    --runs->inside;
    return arguments;
  }));
  const auto remote = proxy();
  for (int i = 0; i < kMessages; ++i) remote->send(kEcho, {QXValue(std::to_string(i))}, intoReplies());
  for (int i = 0; i < kMessages; ++i) {
    EXPECT_EQ(runs->seen.take(), std::to_string(i));
    EXPECT_EQ(replies.take(), QXArray{QXValue(std::to_string(i))});
  }
  EXPECT_FALSE(runs->overlapped);
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

TEST_F(EndpointTest, ARequestAndWhatFollowsFromItElsewhereAreForThePeer) {
  const auto peersName = std::make_shared<const std::string>("peer");
  const auto subjects = std::make_shared<Mailbox<LogSubject::Name>>();
  auto raw = connectRaw(std::make_shared<Answerer>([subjects](QXArray values) {
                          subjects->put(LogSubject::current());
                          return values;
                        }),
                        {{}, {}, {}, peersName, {}});
  raw.sayHello();
  ASSERT_TRUE(raw.read<Hello>());
  raw.write(Frame(RequestFrame{1, true, kEcho.name, {QXValue("a")}}));
  EXPECT_EQ(subjects->take(), peersName);
  ASSERT_TRUE(raw.read<ReplyFrame>());

  const auto tell = [subjects](const auto&...) { subjects->put(LogSubject::current()); };
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
    EXPECT_EQ(subjects->take(), somebody);
  }
  for (const std::uint64_t number : {3U, 4U}) {
    ask(number);
    EXPECT_EQ(subjects->take(), LogSubject::Name());
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
