// What every RPC service does.
#include "platform/rpc.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <vector>

#include "platform/rpc_errors.h"
#include "platform/rpc_protocol.h"
#include "service/DVDaemon.h"
#include "tests/rpc/RpcDrivers.h"
#include "tests/rpc/TestProtocol.h"

namespace docuvend {
namespace {

using tests::FakeDriver;
using tests::LinuxDriver;
using tests::Mailbox;
using tests::TestObject;
using tests::TestProtocol;

std::int64_t code(QXRpcErrorCode value) { return static_cast<std::int64_t>(value); }
MATCHER_P(IsRpcError, value, "") { return arg.has_value() && arg->domain == kQXRpcErrorDomain && arg->code == code(value); }

class Delegate final : public QXRpcListenerDelegate {
 public:
  using Accept = std::function<bool(const std::shared_ptr<QXRpcConnection>&)>;
  explicit Delegate(Accept accept) : accept_(std::move(accept)) {}
  bool listener(QXRpcListener&, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override {
    return accept_(shouldAcceptNewConnection);
  }

 private:
  const Accept accept_;
};

template <class Driver>
class RpcTest : public testing::Test {
 protected:
  // Exports one object per connection, and hands both to the test.
  bool accept(const std::shared_ptr<QXRpcConnection>& connection) {
    auto object = std::make_shared<TestObject>();
    connection->setExportedInterface(interface);
    connection->setExportedObject(std::make_shared<QXRpcExport<TestProtocol>>(object));
    connection->resume();
    objects.put(object);
    connections.put(connection);
    return true;
  }

  void serve() {
    delegate = std::make_shared<Delegate>([this](const auto& connection) { return accept(connection); });
    listener->setDelegate(delegate);
    listener->resume();
  }

  QXErrorHandler intoErrors() {
    return [this](const QXError& error) { errors.put(error); };
  }
  TestProtocol::TextReply intoTexts() {
    return [this](std::optional<std::string> text) { texts.put(std::move(text)); };
  }
  QXRemote<TestProtocol> remote(const typename Driver::Client& client) { return QXRemote<TestProtocol>(client.proxy(intoErrors())); }
  // What the client sent before has been run when this returns.
  void roundTrip(const typename Driver::Client& client) {
    Mailbox<int> pong;
    remote(client).template call<&TestProtocol::ping>([&pong] { pong.put(1); });
    ASSERT_TRUE(pong.take());
  }

  QXRpcInterface interface = qxInterfaceOf<TestProtocol>();
  Mailbox<std::shared_ptr<TestObject>> objects;
  Mailbox<std::shared_ptr<QXRpcConnection>> connections;
  Mailbox<QXError> errors;
  Mailbox<std::optional<std::string>> texts;
  std::shared_ptr<Delegate> delegate;
  Driver driver;
  std::shared_ptr<QXRpcListener> listener = driver.listener();
};

using Drivers = testing::Types<FakeDriver, LinuxDriver>;
TYPED_TEST_SUITE(RpcTest, Drivers);

TYPED_TEST(RpcTest, ClientsThatConnectBeforeTheListenerIsResumedAreAcceptedThen) {
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("early", this->intoTexts());
  EXPECT_EQ(this->connections.count(), 0U);
  EXPECT_EQ(this->errors.count(), 0U);
  this->serve();
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  const auto echo = (*object)->echoes.take();
  ASSERT_TRUE(echo);
  EXPECT_EQ(echo->text, "early");
  echo->completion("late");
  EXPECT_EQ(this->texts.take(), std::optional<std::string>("late"));
}

TYPED_TEST(RpcTest, ValuesOfEveryTypeGoThereAndBack) {
  this->serve();
  auto client = this->driver.connect();
  const QXData data{{0, 1, 2}};
  const QXURL url = QXURL::fileURL("/a b/c", QXURLKind::file);
  const QXUUID uuid{{1, 2, 3}};
  const QXArray array = {QXValue(1), QXValue("two"), QXValue()};
  const QXDictionary dictionary = {{"k", QXValue(url)}};
  QXError error = QXError::make("domain", 7, "text");
  error.underlying = std::make_shared<const QXError>(QXError::make("below", 8, "below"));
  Mailbox<bool> matched;
  this->remote(client).template call<&TestProtocol::echoMany>(
      true, 5, 1.5, data, url, uuid, array, dictionary, error, ItemID{"item"},
      [&](std::optional<bool> flag, std::optional<std::int64_t> number, std::optional<double> real, std::optional<QXData> someData,
          std::optional<QXURL> someURL, std::optional<QXUUID> someUUID, std::optional<QXArray> someArray,
          std::optional<QXDictionary> someDictionary, std::optional<QXError> someError, std::optional<ItemID> item) {
        matched.put(flag == true && number == 5 && real == 1.5 && someData == data && someURL == url && someUUID == uuid &&
                    someArray == array && someDictionary == dictionary && someError == error && item == ItemID{"item"});
      });
  EXPECT_EQ(matched.take(), true);
}

TYPED_TEST(RpcTest, AbsentValuesStayAbsent) {
  this->serve();
  auto client = this->driver.connect();
  Mailbox<bool> absent;
  this->remote(client).template call<&TestProtocol::echoMany>(std::nullopt, std::nullopt, std::nullopt, std::nullopt, std::nullopt,
                                                              std::nullopt, std::nullopt, std::nullopt, std::nullopt, std::nullopt,
                                                              [&absent](auto... values) { absent.put((!values.has_value() && ...)); });
  EXPECT_EQ(absent.take(), true);
}

TYPED_TEST(RpcTest, TheFirstCallOfAReplyWins) {
  this->serve();
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  auto echo = (*object)->echoes.take();
  ASSERT_TRUE(echo);
  echo->completion("first");
  echo->completion("second");
  this->roundTrip(client);
  EXPECT_EQ(this->texts.take(), std::optional<std::string>("first"));
  EXPECT_EQ(this->texts.count(), 0U);
  EXPECT_EQ(this->errors.count(), 0U);
}

TYPED_TEST(RpcTest, AReplyThatIsNeverCalledAnswersNothing) {
  this->serve();
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  {
    const auto echo = (*object)->echoes.take();
    ASSERT_TRUE(echo);
  }
  this->roundTrip(client);
  EXPECT_EQ(this->texts.count(), 0U);
  EXPECT_EQ(this->errors.count(), 0U);
  client.leave();
  EXPECT_TRUE(this->errors.take()) << "the end of the connection is told";
}

TYPED_TEST(RpcTest, AMessageThatWantsNoReplyArrivesAndMayBeAnsweredToNobody) {
  this->serve();
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("a", TestProtocol::TextReply{});
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  const auto echo = (*object)->echoes.take();
  ASSERT_TRUE(echo);
  EXPECT_EQ(echo->text, "a");
  if (echo->completion) echo->completion("b");
  this->roundTrip(client);
  EXPECT_EQ(this->errors.count(), 0U);
}

TYPED_TEST(RpcTest, AnUnknownOperationReachesTheErrorHandler) {
  this->serve();
  auto client = this->driver.connect();
  const auto proxy = client.proxy(this->intoErrors());
  proxy->send({"unheard:of:", {}, {}}, {}, [](QXArray) { ADD_FAILURE() << "answered"; });
  EXPECT_THAT(this->errors.take(), IsRpcError(QXRpcErrorCode::unknownOperation));
  proxy->send({"unheard:of:", {}, {}}, {}, {});
  EXPECT_THAT(this->errors.take(), IsRpcError(QXRpcErrorCode::unknownOperation));
  this->roundTrip(client);
  EXPECT_EQ(this->errors.count(), 0U);
}

TYPED_TEST(RpcTest, ArgumentsOfAnotherTypeOrNumberNeverReachTheObject) {
  this->serve();
  auto client = this->driver.connect();
  const auto proxy = client.proxy(this->intoErrors());
  for (const QXArray& arguments : {QXArray{}, QXArray{QXValue(1)}, QXArray{QXValue("a"), QXValue("b")}}) {
    proxy->send({"echo:completion:", {}, {}}, arguments, [](QXArray) { ADD_FAILURE() << "answered"; });
    EXPECT_THAT(this->errors.take(), IsRpcError(QXRpcErrorCode::invalidArguments));
  }
  this->roundTrip(client);
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  EXPECT_EQ((*object)->echoes.count(), 0U);
}

TYPED_TEST(RpcTest, AReplyWithATypeThatItsPositionDoesNotAcceptReachesTheErrorHandler) {
  this->interface.setAcceptedReplyKinds("list:", 1, {QXValueKind::dictionary, QXValueKind::string, QXValueKind::url});
  this->serve();
  auto client = this->driver.connect();
  Mailbox<std::optional<QXDictionary>> lists;
  const auto ask = [&] {
    this->remote(client).template call<&TestProtocol::list>(
        [&lists](std::optional<QXError>, std::optional<QXDictionary> list) { lists.put(std::move(list)); });
  };
  ask();
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  auto first = (*object)->lists.take();
  ASSERT_TRUE(first);
  (*first)(std::nullopt, QXDictionary{{"p", QXValue(QXDictionary{{"n", QXValue(1)}})}});
  EXPECT_THAT(this->errors.take(), IsRpcError(QXRpcErrorCode::invalidReply));
  ask();
  auto second = (*object)->lists.take();
  ASSERT_TRUE(second);
  const QXDictionary good = {{"p", QXValue(QXDictionary{{"n", QXValue("text")}})}};
  (*second)(std::nullopt, good);
  EXPECT_EQ(lists.take(), std::optional<QXDictionary>(good));
}

TYPED_TEST(RpcTest, RequestsOfOneConnectionArriveInOrder) {
  constexpr int kMessages = 200;
  this->serve();
  auto client = this->driver.connect();
  const auto remote = this->remote(client);
  for (int i = 0; i < kMessages; ++i) remote.template call<&TestProtocol::echo>(std::to_string(i), TestProtocol::TextReply{});
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  for (int i = 0; i < kMessages; ++i) {
    const auto echo = (*object)->echoes.take();
    ASSERT_TRUE(echo);
    EXPECT_EQ(echo->text, std::to_string(i));
  }
}

TYPED_TEST(RpcTest, RepliesMayComeInAnotherOrder) {
  this->serve();
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  this->remote(client).template call<&TestProtocol::echo>("b", this->intoTexts());
  auto object = this->objects.take();
  ASSERT_TRUE(object);
  auto first = (*object)->echoes.take();
  auto second = (*object)->echoes.take();
  ASSERT_TRUE(first && second);
  second->completion(second->text);
  first->completion(first->text);
  EXPECT_EQ(this->texts.take(), std::optional<std::string>("b"));
  EXPECT_EQ(this->texts.take(), std::optional<std::string>("a"));
}

TYPED_TEST(RpcTest, WhenTheClientLeavesItsMessagesFailOnceAndTheObjectIsReleased) {
  this->serve();
  auto client = this->driver.connect();
  constexpr int kMessages = 5;
  for (int i = 0; i < kMessages; ++i) this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  std::weak_ptr<TestObject> weak;
  std::vector<TestObject::Echo> held;
  {
    auto object = this->objects.take();
    ASSERT_TRUE(object);
    weak = *object;
    for (int i = 0; i < kMessages; ++i) held.push_back(*(*object)->echoes.take());
  }
  client.leave();
  for (int i = 0; i < kMessages; ++i) EXPECT_TRUE(this->errors.take());
  for (auto& echo : held) echo.completion("too late");
  held.clear();
  // The other end learns of it in its own time: another client's round trip goes through the same service.
  for (int i = 0; i < 1000 && !weak.expired(); ++i) {
    auto other = this->driver.connect();
    this->roundTrip(other);
    other.leave();
  }
  EXPECT_TRUE(weak.expired());
  EXPECT_EQ(this->texts.count(), 0U);
  EXPECT_EQ(this->errors.count(), 0U);
}

TYPED_TEST(RpcTest, EachConnectionHasItsOwnObject) {
  this->serve();
  auto one = this->driver.connect();
  this->roundTrip(one);
  auto two = this->driver.connect();
  this->roundTrip(two);
  auto first = this->objects.take();
  auto second = this->objects.take();
  ASSERT_TRUE(first && second);
  EXPECT_NE(*first, *second);
  this->remote(two).template call<&TestProtocol::echo>("two", TestProtocol::TextReply{});
  EXPECT_EQ((*second)->echoes.take()->text, "two");
  EXPECT_EQ((*first)->echoes.count(), 0U);
}

TYPED_TEST(RpcTest, AConnectionKnowsItsPeer) {
  this->driver.setNextPeer({{"yes", QXValue(true)}, {"text", QXValue("true")}});
  this->serve();
  auto client = this->driver.connect();
  const auto connection = this->connections.take();
  ASSERT_TRUE(connection);
  EXPECT_EQ((*connection)->processIdentifier(), ::getpid());
  EXPECT_EQ((*connection)->auditToken(), tests::TestPeerDirectory::tokenOf(1));
  EXPECT_EQ((*connection)->valueForEntitlement("yes"), QXValue(true));
  EXPECT_EQ((*connection)->valueForEntitlement("text"), QXValue("true"));
  EXPECT_EQ((*connection)->valueForEntitlement("no"), std::nullopt);
}

TYPED_TEST(RpcTest, ADelegateThatSaysNoEndsTheConnection) {
  this->delegate = std::make_shared<Delegate>([](const auto&) { return false; });
  this->listener->setDelegate(this->delegate);
  this->listener->resume();
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  EXPECT_TRUE(this->errors.take());
  EXPECT_EQ(this->texts.count(), 0U);
}

TYPED_TEST(RpcTest, WithoutADelegateNobodyIsAccepted) {
  this->listener->setDelegate(std::make_shared<Delegate>([](const auto&) { return true; }));  // belongs to nobody
  this->listener->resume();
  auto client = this->driver.connect();
  this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  EXPECT_TRUE(this->errors.take());
}

TYPED_TEST(RpcTest, ASendOnAnEndedConnectionFails) {
  this->serve();
  auto client = this->driver.connect();
  this->roundTrip(client);
  client.leave();
  this->remote(client).template call<&TestProtocol::echo>("a", this->intoTexts());
  EXPECT_TRUE(this->errors.take());
  this->remote(client).template call<&TestProtocol::echo>("a", TestProtocol::TextReply{});
  EXPECT_TRUE(this->errors.take());
}

// One operation of the daemon's own protocol, in its own types.
class Daemon final : public DVDaemon {
 public:
  void wakeUpCompletion(Done completion) override { completion(); }
  void extendSandboxForFileURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                               SandboxReply completionHandler) override {
    if (!toConsumerID) {
      completionHandler(QXError::make("domain", 1, "no consumer"), std::nullopt, std::nullopt, std::nullopt);
      return;
    }
    completionHandler(std::nullopt, QXData::fromText(fromProviderID->value), url, std::nullopt);
  }
  void providePlaceholderForItemAtURL(std::optional<QXURL>, std::optional<ProviderID>, std::optional<ConsumerID>, ErrorReply) override {}
  void startProvidingItemAtURL(std::optional<QXURL>, std::optional<ProviderID>, std::optional<ConsumerID>, ErrorReply) override {}
  void stopProvidingItemAtURL(std::optional<QXURL>, std::optional<ProviderID>, std::optional<ConsumerID>, ErrorReply) override {}
  void providersCompletionHandler(ProvidersReply) override {}
  void extendBookmarkForFileURL(std::optional<QXURL>, std::optional<ConsumerID>, StringReply) override {}
  void bookmarkableStringFromDocumentURL(std::optional<QXURL>, StringReply) override {}
  void documentURLFromBookmarkableString(std::optional<std::string>, DocumentReply) override {}
};

TYPED_TEST(RpcTest, TheDaemonsProtocolTravelsInItsOwnTypes) {
  this->delegate = std::make_shared<Delegate>([](const auto& connection) {
    connection->setExportedInterface(qxInterfaceOf<DVDaemon>());
    connection->setExportedObject(std::make_shared<QXRpcExport<DVDaemon>>(std::make_shared<Daemon>()));
    connection->resume();
    return true;
  });
  this->listener->setDelegate(this->delegate);
  this->listener->resume();
  auto client = this->driver.connect();
  const QXRemote<DVDaemon> remote(client.proxy(this->intoErrors()));
  struct Answer {
    std::optional<QXError> error;
    std::optional<QXData> item;
    std::optional<QXURL> sibling;
    std::optional<QXData> siblingToken;
  };
  Mailbox<Answer> answers;
  const auto into = [&answers](std::optional<QXError> error, std::optional<QXData> item, std::optional<QXURL> sibling,
                               std::optional<QXData> siblingToken) {
    answers.put({std::move(error), std::move(item), std::move(sibling), std::move(siblingToken)});
  };
  const QXURL url = QXURL::fileURL("/a/b", QXURLKind::file);
  remote.call<&DVDaemon::extendSandboxForFileURL>(url, ProviderID{"provider"}, ConsumerID{"consumer"}, into);
  auto answer = answers.take();
  ASSERT_TRUE(answer);
  EXPECT_FALSE(answer->error);
  EXPECT_EQ(answer->item, QXData::fromText("provider"));
  EXPECT_EQ(answer->sibling, url);
  EXPECT_FALSE(answer->siblingToken);
  remote.call<&DVDaemon::extendSandboxForFileURL>(url, ProviderID{"provider"}, std::nullopt, into);
  answer = answers.take();
  ASSERT_TRUE(answer);
  EXPECT_EQ(answer->error, QXError::make("domain", 1, "no consumer"));
  Mailbox<int> awake;
  remote.call<&DVDaemon::wakeUpCompletion>([&awake] { awake.put(1); });
  EXPECT_TRUE(awake.take());
  EXPECT_EQ(this->errors.count(), 0U);
}

}  // namespace
}  // namespace docuvend
