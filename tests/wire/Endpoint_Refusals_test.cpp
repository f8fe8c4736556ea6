// What is refused at either end while the connection goes on.
#include <cstddef>
#include <string>
#include <utility>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

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

}  // namespace
}  // namespace docuvend::linux_platform
