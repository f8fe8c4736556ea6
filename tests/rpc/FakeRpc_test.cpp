// What the fake does beyond an RPC service: it remembers, and the test answers.
#include "platform/fake/FakeRpc.h"

#include <gtest/gtest.h>

#include "platform/rpc_errors.h"
#include "tests/rpc/TestProtocol.h"

namespace docuvend::fake_platform {
namespace {

using tests::TestProtocol;

const QXRpcOperation kEcho{"echo:completion:", {QXValueKind::string}, {QXValueKind::string}};

class FakeRpcProxyTest : public testing::Test {
 protected:
  std::shared_ptr<QXRpcProxy> proxy() {
    return connection->remoteObjectProxy([this](const QXError& error) { errors.push_back(error); });
  }
  QXRpcReply intoReplies() {
    return [this](QXArray values) { replies.push_back(std::move(values)); };
  }

  std::vector<QXError> errors;
  std::vector<QXArray> replies;
  std::shared_ptr<FakeRpcConnection> connection = FakeRpcConnection::create();
};

TEST_F(FakeRpcProxyTest, RemembersWhatIsSent) {
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  ASSERT_EQ(connection->proxies().size(), 1U);
  const auto sent = connection->proxies()[0];
  ASSERT_EQ(sent->count(), 1U);
  EXPECT_EQ(sent->sentNames(), std::vector<std::string>{"echo:completion:"});
  EXPECT_EQ(sent->sent(0).arguments, QXArray{QXValue("a")});
  EXPECT_TRUE(sent->sent(0).wantsReply);
  EXPECT_FALSE(sent->sent(0).settled);
  EXPECT_TRUE(replies.empty());
}

TEST_F(FakeRpcProxyTest, SettlesAMessageOnce) {
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  const auto sent = connection->proxies()[0];
  EXPECT_TRUE(sent->answer(0, {QXValue("b")}));
  EXPECT_FALSE(sent->answer(0, {QXValue("c")}));
  EXPECT_FALSE(sent->fail(0, QXError::make("d", 1, "")));
  EXPECT_FALSE(sent->answer(1, {QXValue("c")}));
  EXPECT_EQ(replies, (std::vector<QXArray>{{QXValue("b")}}));
  EXPECT_TRUE(errors.empty());
}

TEST_F(FakeRpcProxyTest, AFailureReachesTheErrorHandlerAlone) {
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  const QXError error = QXError::make("d", 1, "");
  EXPECT_TRUE(connection->proxies()[0]->fail(0, error));
  EXPECT_EQ(errors, std::vector<QXError>{error});
  EXPECT_TRUE(replies.empty());
}

TEST_F(FakeRpcProxyTest, AnAnswerThatDoesNotFitIsAFailure) {
  proxy()->send(kEcho, {QXValue("a")}, intoReplies());
  EXPECT_TRUE(connection->proxies()[0]->answer(0, {QXValue(1)}));
  ASSERT_EQ(errors.size(), 1U);
  EXPECT_EQ(errors[0].code, static_cast<std::int64_t>(QXRpcErrorCode::invalidReply));
  EXPECT_TRUE(replies.empty());
}

TEST_F(FakeRpcProxyTest, AMessageThatWantsNoReplyCannotBeAnsweredButCanFail) {
  proxy()->send(kEcho, {QXValue("a")}, {});
  EXPECT_FALSE(connection->proxies()[0]->answer(0, {QXValue("b")}));
  EXPECT_TRUE(connection->proxies()[0]->fail(0, QXError::make("d", 1, "")));
  EXPECT_EQ(errors.size(), 1U);
}

TEST_F(FakeRpcProxyTest, TheEndFailsWhatWaits) {
  const auto sender = proxy();
  sender->send(kEcho, {QXValue("a")}, intoReplies());
  sender->send(kEcho, {QXValue("b")}, intoReplies());
  connection->proxies()[0]->answer(0, {QXValue("a")});
  connection->close();
  EXPECT_EQ(errors.size(), 1U);
  EXPECT_EQ(replies.size(), 1U);
}

TEST(FakeRpcServiceTest, RemembersListenersAndTheOrderOfCalls) {
  std::vector<std::string> calls;
  FakeRpcService service;
  service.setRecorder([&calls](const std::string& call) { calls.push_back(call); });
  const auto listener = service.listenerForService("one");
  listener->setDelegate({});
  listener->resume();
  EXPECT_EQ(calls, (std::vector<std::string>{"listenerForService:one", "setDelegate", "resume"}));
  EXPECT_EQ(service.createdNames(), std::vector<std::string>{"one"});
  EXPECT_EQ(service.listener("one"), listener);
  EXPECT_EQ(service.listener("two"), nullptr);
  EXPECT_TRUE(service.listener("one")->isResumed());
}

TEST(FakeRpcConnectionTest, RemembersWhatIsExportedAndTheOrderOfCalls) {
  std::vector<std::string> calls;
  const auto connection = FakeRpcConnection::create();
  connection->setRecorder([&calls](const std::string& call) { calls.push_back(call); });
  EXPECT_FALSE(connection->exportedInterface());
  connection->setExportedInterface(qxInterfaceOf<TestProtocol>());
  const auto object = std::make_shared<QXRpcExport<TestProtocol>>(std::make_shared<tests::TestObject>());
  connection->setExportedObject(object);
  EXPECT_FALSE(connection->isResumed());
  connection->resume();
  EXPECT_EQ(calls, (std::vector<std::string>{"setExportedInterface", "setExportedObject", "resume"}));
  EXPECT_EQ(connection->exportedInterface()->protocolName(), "TestProtocol");
  EXPECT_EQ(connection->exportedObject(), object);
  connection->close();
  EXPECT_TRUE(connection->isClosed());
  EXPECT_EQ(connection->exportedObject(), nullptr);
}

TEST(FakeRpcConnectionTest, ARequestMadeInsideARequestWaitsForItsEnd) {
  const auto connection = FakeRpcConnection::create();
  std::vector<std::string> order;
  class Nested final : public QXRpcExportedObject {
   public:
    Nested(FakeRpcConnection& connection, std::vector<std::string>& order) : connection_(connection), order_(order) {}
    void invoke(std::size_t, QXArray arguments, QXRpcReply) override {
      const std::string text = *arguments[0].as<std::string>();
      order_.push_back("begin " + text);
      if (text == "outer") connection_.invoke("echo:completion:", {QXValue("inner")}, {});
      order_.push_back("end " + text);
    }

   private:
    FakeRpcConnection& connection_;
    std::vector<std::string>& order_;
  };
  connection->setExportedInterface(qxInterfaceOf<TestProtocol>());
  connection->setExportedObject(std::make_shared<Nested>(*connection, order));
  connection->invoke("echo:completion:", {QXValue("outer")}, {});
  EXPECT_TRUE(order.empty()) << "not resumed yet";
  connection->resume();
  EXPECT_EQ(order, (std::vector<std::string>{"begin outer", "end outer", "begin inner", "end inner"}));
}

}  // namespace
}  // namespace docuvend::fake_platform
