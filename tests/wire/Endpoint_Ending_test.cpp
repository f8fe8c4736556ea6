// The end of a connection, and what its messages learn of it.
#include <cerrno>
#include <memory>
#include <thread>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

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

// An exported object whose operation, and whose end, take as long as the test likes.
class Lingering final : public QXRpcExportedObject {
 public:
  struct Watch {
    Mailbox<std::thread::id> begun;  // by the operation, and by the end
    Mailbox<bool> mayGoOn;
  };

  explicit Lingering(std::shared_ptr<Watch> watch) : watch_(std::move(watch)) {}
  ~Lingering() override { linger(); }
  void invoke(std::size_t, QXArray, QXRpcReply) override { linger(); }

 private:
  void linger() const {
    watch_->begun.put(std::this_thread::get_id());
    (void)watch_->mayGoOn.take();
  }

  const std::shared_ptr<Watch> watch_;
};

TEST_F(EndpointTest, OneThatIsClosedOnTheReadingThreadLetsGoOfItsObjectThereWhateverThatTakes) {
  const auto watch = std::make_shared<Lingering::Watch>();
  auto raw = connectRaw(std::make_shared<Lingering>(watch));
  raw.sayHello();
  ASSERT_TRUE(server.hellos->take());
  server.endpoint->closeOnReadingThread(QXError::system(ECONNABORTED, "enough"));
  ASSERT_TRUE(raw.read<Hello>());
  EXPECT_TRUE(raw.read<EndFrame>()) << "the peer is told at once";
  const auto thread = watch->begun.take();
  ASSERT_TRUE(thread);
  EXPECT_NE(*thread, std::this_thread::get_id());
  EXPECT_EQ(server.closed->count(), 0U);
  watch->mayGoOn.put(true);
  EXPECT_THAT(server.closed->take(), IsSystemError(ECONNABORTED));
}

TEST_F(EndpointTest, OneThatIsClosedOnTheReadingThreadFinishesWhatRunsThereAndServesNothingMore) {
  const auto watch = std::make_shared<Lingering::Watch>();
  CallRules rules;
  rules.lane = Reactor::makeLane();
  auto raw = connectRaw(std::make_shared<Lingering>(watch), std::move(rules));
  raw.sayHello();
  for (std::uint64_t call : {1, 2}) ASSERT_TRUE(raw.write(Frame(RequestFrame{call, true, kEcho.name, {QXValue("a")}})));
  ASSERT_TRUE(watch->begun.take());
  server.endpoint->closeOnReadingThread(QXError::system(ECONNABORTED, "enough"));
  ASSERT_TRUE(aTaskRuns());
  EXPECT_EQ(watch->begun.count(), 0U) << "not while the request runs";
  watch->mayGoOn.put(true);
  ASSERT_TRUE(watch->begun.take());
  EXPECT_EQ(server.closed->count(), 0U);
  watch->mayGoOn.put(true);
  EXPECT_THAT(server.closed->take(), IsSystemError(ECONNABORTED));
  EXPECT_EQ(watch->begun.count(), 0U) << "the second request is never run";
}

TEST_F(EndpointTest, OneThatIsClosedOnTheReadingThreadBeforeThereIsOneEndsAtOnce) {
  auto [one, two] = socketPair();
  server = makeSide(std::move(one));
  server.endpoint->setExportedObject(recorder);
  server.endpoint->closeOnReadingThread(QXError::system(ECONNABORTED, "enough"));
  EXPECT_EQ(recorder.use_count(), 1);
  EXPECT_THAT(server.closed->take(), IsSystemError(ECONNABORTED));
}

TEST_F(EndpointTest, AMessageOnAnEndedConnectionFailsOnAnotherThread) {
  connect(recorder);
  client.endpoint->close(QXError::system(ECONNABORTED, "enough"));
  const auto threads = std::make_shared<Mailbox<std::thread::id>>();
  client.endpoint->remoteObjectProxy([threads](const QXError&) { threads->put(std::this_thread::get_id()); })
      ->send(kEcho, {QXValue("a")}, {});
  const auto thread = threads->take();
  ASSERT_TRUE(thread);
  EXPECT_NE(*thread, std::this_thread::get_id());
}

TEST_F(EndpointTest, AFailedMessageSaysHowFarItCame) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  ASSERT_TRUE(server.hellos->take());
  const auto remote = server.endpoint->remoteObjectProxy(intoFates());

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
  server.endpoint->remoteObjectProxy(intoFates())->send(kList, {}, intoReplies());
  server.endpoint->resume();
  EXPECT_EQ(fates.take(), MessageFate::unsent);
}

TEST_F(EndpointTest, AMessageToAPeerThatLeavesWithoutItsHelloWasNotTaken) {
  auto raw = connectRaw(nullptr);
  const auto remote = server.endpoint->remoteObjectProxy(intoFates());
  remote->send(kList, {}, intoReplies());
  ASSERT_TRUE(raw.read<Hello>());
  ASSERT_TRUE(raw.read<RequestFrame>());
  raw.leave();
  EXPECT_EQ(fates.take(), MessageFate::unsent);
}

TEST_F(EndpointTest, AMessageThatIsRefusedWithTheConnectionWasNotTaken) {
  auto raw = connectRaw(nullptr);
  const auto remote = server.endpoint->remoteObjectProxy(intoFates());
  remote->send(kList, {}, intoReplies());
  raw.write(tests::bytesOf(EndFrame{QXError::make("Test", 1, "no")}));
  EXPECT_EQ(fates.take(), MessageFate::unsent);
}

TEST_F(EndpointTest, AMessageToAPeerThatLeavesAfterItsHelloMayHaveBeenRun) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  const auto remote = server.endpoint->remoteObjectProxy(intoFates());
  remote->send(kList, {}, intoReplies());
  raw.leave();
  EXPECT_EQ(fates.take(), MessageFate::unanswered);
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

TEST_F(EndpointTest, CloseTellsThePeerWhy) {
  connect(recorder);
  const QXError reason = QXError::make("Some domain", 7, "because");
  server.endpoint->close(reason);
  EXPECT_EQ(client.closed->take(), reason);
  EXPECT_EQ(server.closed->take(), reason);
  EXPECT_EQ(client.blamed->count(), 0U);
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

TEST_F(EndpointTest, AnErrorOfTheHelloHandlerEndsTheConnectionAndThePeerSeesIt) {
  const QXError refusal = QXError::make("Some domain", 3, "not you");
  auto [one, two] = socketPair();
  Hello hello;
  hello.declaredBundle = "com.example.App";
  client = makeSide(std::move(one), hello);
  Endpoint::Handlers handlers;
  handlers.onHello = [hellos = server.hellos, refusal](const Hello& said) -> std::optional<QXError> {
    hellos->put(said);
    return refusal;
  };
  server.endpoint = Endpoint::create(*reactor, std::move(two), {}, std::move(handlers));
  server.endpoint->setExportedInterface(testInterface());
  server.endpoint->setExportedObject(recorder);
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  server.endpoint->resume();
  client.endpoint->resume();
  const auto said = server.hellos->take();
  ASSERT_TRUE(said);
  EXPECT_EQ(said->declaredBundle, "com.example.App");
  EXPECT_EQ(said->version, kProtocolVersion);
  EXPECT_EQ(errors.take(), refusal);
  EXPECT_EQ(client.closed->take(), refusal);
  EXPECT_EQ(recorder->requests.count(), 0U);
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

TEST_F(EndpointTest, TheOwnerMayLetTheEndpointGoInsideItsOwnHandlers) {
  connect(std::make_shared<Answerer>([this](QXArray arguments) {
    server.endpoint.reset();
    return arguments;
  }));
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  EXPECT_THAT(errors.take(), IsSystemError(ECONNRESET));
  EXPECT_THAT(server.closed->take(), IsSystemError(ECONNABORTED));
}

}  // namespace
}  // namespace docuvend::linux_platform
