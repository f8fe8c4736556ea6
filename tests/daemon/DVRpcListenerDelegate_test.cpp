#include "daemon/DVRpcListenerDelegate.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "common/DVErrors.h"
#include "daemon/DVServer.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRpcServicer.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogEntry;
using fake_platform::FakePlatform;
using fake_platform::FakeRpcConnection;
using fake_platform::FakeRpcListener;

constexpr const char* kAccepted = "[INFO] New connection accepted.";

class DVRpcListenerDelegateTest : public testing::Test {
 protected:
  bool accept(const std::shared_ptr<FakeRpcConnection>& connection) { return delegate_->listener(listener_, connection); }

  static std::shared_ptr<DVRpcServicer> servicerOf(const FakeRpcConnection& connection) {
    const auto exported = std::dynamic_pointer_cast<QXRpcExport<DVDaemon>>(connection.exportedObject());
    return exported ? std::dynamic_pointer_cast<DVRpcServicer>(exported->object()) : nullptr;
  }

  FakePlatform platform_;
  FakeRpcListener listener_;
  std::shared_ptr<DVServer> server_ = std::make_shared<DVServer>();
  std::shared_ptr<DVRpcListenerDelegate> delegate_ = std::make_shared<DVRpcListenerDelegate>(server_);
  std::shared_ptr<FakeRpcConnection> connection_ = FakeRpcConnection::create();
};

TEST_F(DVRpcListenerDelegateTest, AcceptsEveryClient) {
  EXPECT_TRUE(accept(connection_));  // no entitlement, no bundle, no process identifier
}

TEST_F(DVRpcListenerDelegateTest, GivesTheConnectionItsInterfaceThenItsObjectAndResumesItThen) {
  std::vector<std::string> calls;
  connection_->setRecorder([&calls](const std::string& call) { calls.push_back(call); });
  accept(connection_);
  EXPECT_EQ(calls, (std::vector<std::string>{"setExportedInterface", "setExportedObject", "resume"}));
}

TEST_F(DVRpcListenerDelegateTest, LogsOnceForEachConnectionAfterItIsResumed) {
  std::vector<std::string> loggedBefore = {"never resumed"};
  connection_->setRecorder([&](const std::string& call) {
    if (call == "resume") loggedBefore = platform_.log.texts();
  });
  accept(connection_);
  EXPECT_TRUE(loggedBefore.empty());
  EXPECT_EQ(platform_.log.entries(), (std::vector<FakeLogEntry>{{QXLogType::info, kAccepted}}));
  accept(FakeRpcConnection::create());
  EXPECT_EQ(platform_.log.texts(), (std::vector<std::string>{kAccepted, kAccepted}));
}

TEST_F(DVRpcListenerDelegateTest, ExportsTheDaemonsProtocolInItsOrder) {
  accept(connection_);
  const auto interface = connection_->exportedInterface();
  ASSERT_TRUE(interface);
  EXPECT_EQ(interface->protocolName(), "DVDaemon");
  std::vector<std::string> names;
  for (const QXRpcOperation& operation : interface->operations()) names.push_back(operation.name);
  EXPECT_EQ(names,
            (std::vector<std::string>{"wakeUpCompletion:", "extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:",
                                      "providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:",
                                      "startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:",
                                      "stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:",
                                      "providersCompletionHandler:", "extendBookmarkForFileURL:toConsumerID:completionHandler:",
                                      "bookmarkableStringFromDocumentURL:completion:", "documentURLFromBookmarkableString:completion:"}));
}

TEST_F(DVRpcListenerDelegateTest, RestrictsTheListOfProvidersAndNothingElseOnEveryConnection) {
  for (const auto& connection : {connection_, FakeRpcConnection::create()}) {
    accept(connection);
    const auto interface = connection->exportedInterface();
    const auto* kinds = interface->acceptedReplyKinds("providersCompletionHandler:", 1);
    ASSERT_NE(kinds, nullptr);
    EXPECT_EQ(*kinds, (std::vector<QXValueKind>{QXValueKind::dictionary, QXValueKind::string, QXValueKind::url}));
    EXPECT_EQ(interface->restrictionCount(), 1U);
    EXPECT_EQ(interface->acceptedReplyKinds("providersCompletionHandler:", 0), nullptr);
  }
}

TEST_F(DVRpcListenerDelegateTest, EachConnectionHasAServicerOfItsOwn) {
  const auto other = FakeRpcConnection::create();
  accept(connection_);
  accept(other);
  const auto first = servicerOf(*connection_);
  const auto second = servicerOf(*other);
  ASSERT_NE(first, nullptr);
  ASSERT_NE(second, nullptr);
  EXPECT_NE(first, second);
  EXPECT_EQ(first->connection(), connection_);
  EXPECT_EQ(second->connection(), other);
  EXPECT_EQ(first->server(), server_);
  EXPECT_EQ(second->server(), server_);
}

TEST_F(DVRpcListenerDelegateTest, TheConnectionAloneKeepsItsServicerAlive) {
  accept(connection_);
  const std::weak_ptr<DVRpcServicer> weak = servicerOf(*connection_);
  EXPECT_FALSE(weak.expired());
  connection_->close();
  EXPECT_TRUE(weak.expired());
}

TEST_F(DVRpcListenerDelegateTest, AServicerDoesNotKeepItsConnectionAlive) {
  accept(connection_);
  const std::weak_ptr<FakeRpcConnection> weak = connection_;
  connection_.reset();
  EXPECT_TRUE(weak.expired());
}

TEST_F(DVRpcListenerDelegateTest, WithoutAServerClientsAreAcceptedAllTheSame) {
  server_.reset();
  EXPECT_TRUE(accept(connection_));
  ASSERT_NE(servicerOf(*connection_), nullptr);
  EXPECT_EQ(servicerOf(*connection_)->server(), nullptr);
}

TEST_F(DVRpcListenerDelegateTest, NeverCallsBackIntoTheClient) {
  accept(connection_);
  EXPECT_TRUE(connection_->proxies().empty());
}

// --- As a client meets it

class DVRpcListenerDelegateClientTest : public DVRpcListenerDelegateTest {
 protected:
  void SetUp() override {
    server_->setAccessControlStore(DVAccessControlStore::sharedStore());
    DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{});
    platform_.extensionHost.setExtensions({cellar_});
    platform_.queues.runAll();
    listener_.setDelegate(delegate_);
    listener_.resume();
    listener_.connect(connection_);
  }

  QXRemote<DVDaemon> client() {
    return QXRemote<DVDaemon>(connection_->peer([this](const QXError& error) { failures_.push_back(error); }));
  }

  std::shared_ptr<fake_platform::FakeExtension> cellar_ = platform_.installProvider("com.orvane.cellar");
  const QXURL kReport = FakePlatform::itemURL("com.orvane.cellar", "report.txt");
  std::vector<QXError> failures_;
};

TEST_F(DVRpcListenerDelegateClientTest, WakesTheDaemon) {
  int replies = 0;
  client().call<&DVDaemon::wakeUpCompletion>([&replies] { ++replies; });
  EXPECT_EQ(replies, 0);
  platform_.queues.runAll();
  EXPECT_EQ(replies, 1);
}

TEST_F(DVRpcListenerDelegateClientTest, GetsTheListOfProvidersThroughItsRestriction) {
  connection_->setEntitlement("com.orvane.docuvend.acl-read", true);
  std::optional<QXDictionary> listed;
  client().call<&DVDaemon::providersCompletionHandler>(
      [&listed](std::optional<QXError>, std::optional<QXDictionary> providers) { listed = std::move(providers); });
  platform_.queues.runAll();
  EXPECT_TRUE(failures_.empty());
  ASSERT_TRUE(listed);
  EXPECT_TRUE(listed->contains("com.orvane.cellar"));
}

TEST_F(DVRpcListenerDelegateClientTest, ARefusedClientGetsItsErrorThroughTheRestriction) {
  std::optional<QXError> refused;
  std::optional<QXDictionary> listed;
  client().call<&DVDaemon::providersCompletionHandler>([&](std::optional<QXError> error, std::optional<QXDictionary> providers) {
    refused = std::move(error);
    listed = std::move(providers);
  });
  platform_.queues.runAll();
  EXPECT_TRUE(failures_.empty());
  EXPECT_EQ(refused, DVClientLacksEntitlement());
  EXPECT_EQ(listed, std::nullopt);
}

TEST_F(DVRpcListenerDelegateClientTest, AProviderThatAnswersTwiceIsHeardOnce) {
  connection_->setEntitlement("com.orvane.docuvend.acl-write", true);
  std::vector<std::optional<QXError>> answers;
  client().call<&DVDaemon::extendSandboxForFileURL>(kReport, ProviderID{"com.orvane.cellar"}, ConsumerID{"com.example.editor"},
                                                    [&answers](std::optional<QXError> error, auto&&...) { answers.push_back(error); });
  cellar_->vendor().answerLast({QXValue(), "item 7"});
  cellar_->vendor().failLastDelivery(QXError::make("CellarErrorDomain", 5, "the cellar is flooded"));
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0], std::nullopt);
  EXPECT_TRUE(failures_.empty());
}

TEST_F(DVRpcListenerDelegateClientTest, TheEndOfProvidingIsHeardOnceTooAndSuccessIsAnError) {
  connection_->setEntitlement("com.orvane.docuvend.acl-read", true);
  std::vector<std::optional<QXError>> answers;
  client().call<&DVDaemon::stopProvidingItemAtURL>(kReport, ProviderID{"com.orvane.cellar"}, ConsumerID{"com.example.editor"},
                                                   [&answers](std::optional<QXError> error) { answers.push_back(error); });
  cellar_->vendor().answerLast({QXValue()});
  cellar_->vendor().answerLast({QXError::make("CellarErrorDomain", 5, "the cellar is flooded")});
  EXPECT_EQ(answers, (std::vector<std::optional<QXError>>{DVPluginOperationFailedError(std::nullopt)}));
  EXPECT_TRUE(failures_.empty());
}

TEST_F(DVRpcListenerDelegateClientTest, AClientThatWantsNoReplyIsServed) {
  connection_->setEntitlement("com.orvane.docuvend.acl-write", true);
  connection_->invoke("wakeUpCompletion:", {}, /*reply=*/{});
  connection_->invoke("providersCompletionHandler:", {}, /*reply=*/{});
  connection_->invoke("documentURLFromBookmarkableString:completion:", {"nonsense"}, /*reply=*/{});
  connection_->invoke("bookmarkableStringFromDocumentURL:completion:", {kReport}, /*reply=*/{});
  for (const char* operation : {"providePlaceholderForItemAtURL:", "startProvidingItemAtURL:", "stopProvidingItemAtURL:"}) {
    connection_->invoke(std::string(operation).append("fromProviderID:forConsumerID:completionHandler:"), {QXValue(), QXValue(), QXValue()},
                        /*reply=*/{});
  }
  connection_->invoke("extendBookmarkForFileURL:toConsumerID:completionHandler:", {QXValue(), QXValue()}, /*reply=*/{});
  connection_->invoke("extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:",
                      {kReport, "com.orvane.cellar", "com.example.editor"}, /*reply=*/{});
  platform_.queues.runAll();
  cellar_->vendor().answerLast({QXValue(), "item 7"});
  EXPECT_TRUE(DVAccessControlStore::sharedStore()->isProviderWithIdentifier(ProviderID{"com.orvane.cellar"}, ItemID{"item 7"},
                                                                            ConsumerID{"com.example.editor"}));
}

TEST_F(DVRpcListenerDelegateClientTest, AnUnknownOperationReachesNoServicer) {
  platform_.log.clear();
  connection_->invoke(
      "forgetItemAtURL:fromProviderID:forConsumerID:completionHandler:", {QXValue(), QXValue(), QXValue()}, [](QXArray) { FAIL(); },
      [this](const QXError& error) { failures_.push_back(error); });
  platform_.queues.runAll();
  EXPECT_EQ(failures_.size(), 1U);
  EXPECT_TRUE(platform_.log.entries().empty());
}

}  // namespace
}  // namespace docuvend
