#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakePlatform;

constexpr const char* kServing = "[DEBUG] Serving: startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:";
constexpr const char* kStartMessage = "_startProvidingItemAtURL:completion:";

class DVRpcServicerItemsTest : public ServicerFixture {
 protected:
  void SetUp() override {
    registerProviders();
    entitle(kDVReadEntitlement);
    answerItemID(*cellar_, /*error=*/std::nullopt, kItem.value);
    answerStart(/*error=*/std::nullopt);
  }

  void answerStart(std::optional<QXError> error) {
    cellar_->vendor().respond(kStartMessage, [error](const QXArray&) { return QXArray{error ? QXValue(*error) : QXValue()}; });
  }
  void start(std::optional<QXURL> url, std::optional<ProviderID> provider, std::optional<ConsumerID> consumer) {
    servicer_->startProvidingItemAtURL(std::move(url), std::move(provider), std::move(consumer), errorReply());
  }
  [[nodiscard]] bool wasStarted() const {
    const auto names = cellar_->vendor().operationNames();
    return std::ranges::find(names, kStartMessage) != names.end();
  }
};

// --- The whole way

TEST_F(DVRpcServicerItemsTest, AGrantedItemIsStartedAndTheProvidersAnswerIsTheReply) {
  grant(kCellar, kItem, kEditor);
  platform_.log.clear();
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  const auto& messages = cellar_->vendor().messages();
  ASSERT_EQ(messages.size(), 3U);
  EXPECT_EQ(messages[1].operation.name, "_identifierForItemAtURL:completion:");
  EXPECT_EQ(messages[1].arguments, QXArray{kReport});
  EXPECT_EQ(messages[2].operation.name, kStartMessage);
  EXPECT_EQ(messages[2].arguments, QXArray{kReport});
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}}));
}

TEST_F(DVRpcServicerItemsTest, TheReplyWaitsForTheProvider) {
  grant(kCellar, kItem, kEditor);
  cellar_->vendor().respond(kStartMessage, [](const QXArray&) { return std::nullopt; });
  start(kReport, kCellar, kEditor);
  platform_.queues.runAll();
  EXPECT_TRUE(answers_.empty());
  cellar_->vendor().answerLast({QXValue()});
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerItemsTest, AProviderThatCannotStartGivesItsErrorToTheConsumer) {
  grant(kCellar, kItem, kEditor);
  answerStart(kExtensionError);
  platform_.log.clear();
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(kExtensionError));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}}));
}

TEST_F(DVRpcServicerItemsTest, AFailureAfterTheAnswerIsTolerated) {
  grant(kCellar, kItem, kEditor);
  start(kReport, kCellar, kEditor);
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].error, std::nullopt);
  EXPECT_EQ(answers_[1].error, DVPluginOperationFailedError(kExtensionError));
}

TEST_F(DVRpcServicerItemsTest, ChangesNothingInTheAccessControlList) {
  grant(kCellar, kItem, kEditor);
  start(kReport, kCellar, kEditor);
  start(kReport, kCellar, kStranger);
  start(kReport, kAttic, kEditor);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

// --- The caller

TEST_F(DVRpcServicerItemsTest, WritersMayStartToo) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  entitle(kDVWriteEntitlement);
  grant(kCellar, kItem, kEditor);
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerItemsTest, AClientWithNeitherEntitlementIsRefusedAndOnlyTheCheckLogs) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  grant(kCellar, kItem, kEditor);
  platform_.log.clear();
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(earlyAnswer().error, DVClientLacksEntitlement());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault,
                                "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-read\", \"com.orvane.docuvend.acl-write\")"}}));
  EXPECT_EQ(cellar_->vendor().messages().size(), 1U);
}

TEST_F(DVRpcServicerItemsTest, ARefusedClientThatWantsNoReplyCausesNoTask) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  servicer_->startProvidingItemAtURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_F(DVRpcServicerItemsTest, TheConsumerIsTheOneThatIsNamedNotTheCaller) {
  grant(kCellar, kItem, kStranger);
  start(kReport, kCellar, kStranger);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(platform_.applicationRegistry.tokenQueryCount(), 0);
}

// --- Arguments and provider

TEST_F(DVRpcServicerItemsTest, TheFirstMissingArgumentIsNamedBeneathNotFound) {
  struct Case {
    std::optional<QXURL> url;
    std::optional<ProviderID> provider;
    std::optional<ConsumerID> consumer;
    const char* name;
    std::string inLog;
  };
  const std::string report = kReport.absoluteString();
  const std::vector<Case> cases = {
      {std::nullopt, std::nullopt, std::nullopt, "URL", "URL (null) from provider ID (null) to consumer ID (null)"},
      {std::nullopt, std::nullopt, kEditor, "URL", "URL (null) from provider ID (null) to consumer ID com.example.editor"},
      {kReport, std::nullopt, std::nullopt, "providerID", "URL " + report + " from provider ID (null) to consumer ID (null)"},
      {kReport, kCellar, std::nullopt, "consumerID", "URL " + report + " from provider ID com.orvane.cellar to consumer ID (null)"},
  };
  for (const Case& c : cases) {
    answers_.clear();
    platform_.log.clear();
    start(c.url, c.provider, c.consumer);
    const QXError error = DVInvalidParameterError(c.name, /*value=*/std::nullopt);
    EXPECT_EQ(earlyAnswer().error, DVNotFoundError(error)) << c.name;
    EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                                 {QXLogType::fault, "[ERROR] Cannot provide item at " + c.inLog + ". Error: " + error.description()}}));
  }
  EXPECT_EQ(cellar_->vendor().messages().size(), 1U);
}

TEST_F(DVRpcServicerItemsTest, AURLOfNobodyIsNotFoundTwiceOver) {
  start(kElsewhere, kCellar, kEditor);
  const QXError error = DVNotFoundError(kCellar);
  EXPECT_EQ(earlyAnswer().error, DVNotFoundError(error));
  EXPECT_EQ(logged(),
            (Entries{{QXLogType::debug, kServing},
                     {QXLogType::fault,
                      "[ERROR] Cannot provide item at URL file:///tmp/elsewhere.txt from provider ID com.orvane.cellar to consumer "
                      "ID com.example.editor. Error: " +
                          error.description()}}));
}

TEST_F(DVRpcServicerItemsTest, AURLOfAnotherProviderThanTheNamedOneIsAnInvalidParameterBeneathNotFound) {
  start(kReport, kAttic, kEditor);
  const QXError error = DVInvalidParameterError("providerID", kAttic.value);
  EXPECT_EQ(earlyAnswer().error, DVNotFoundError(error));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault, "[ERROR] Cannot provide item at URL " + kReport.absoluteString() +
                                                      " from provider ID com.orvane.attic to consumer ID com.example.editor. Error: " +
                                                      error.description()}}));
  EXPECT_EQ(cellar_->vendor().messages().size(), 1U);
  EXPECT_EQ(attic_->vendor().messages().size(), 1U);
}

TEST_F(DVRpcServicerItemsTest, TheURLDecidesEvenWhenNobodyHasTheNamedIdentifier) {
  start(kReport, kNobody, kEditor);
  EXPECT_EQ(earlyAnswer().error, DVNotFoundError(DVInvalidParameterError("providerID", kNobody.value)));
}

TEST_F(DVRpcServicerItemsTest, TheProvidersDirectoryItselfIsNoItem) {
  start(FakePlatform::storageURL(kCellar.value), kCellar, kEditor);
  EXPECT_EQ(earlyAnswer().error, DVNotFoundError(DVNotFoundError(kCellar)));
}

TEST_F(DVRpcServicerItemsTest, AnEarlyFailureWithoutAReplyHandlerIsLoggedAndHarmless) {
  servicer_->startProvidingItemAtURL(kElsewhere, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  platform_.queues.runAll();
}

// --- The provider's answer and the grant

TEST_F(DVRpcServicerItemsTest, AProviderThatCannotNameTheItemFailsTheRequestWithoutALine) {
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}}));
  EXPECT_FALSE(wasStarted());
}

TEST_F(DVRpcServicerItemsTest, WithoutAGrantTheConsumerIsNotPermitted) {
  start(kReport, kCellar, kStranger);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault,
                                "[ERROR] Consumer ID com.example.stranger is not allowed to access item ID “item 7” from provider ID "
                                "com.orvane.cellar."}}));
  EXPECT_FALSE(wasStarted());
}

TEST_F(DVRpcServicerItemsTest, AGrantForAnotherItemConsumerOrProviderDoesNotCount) {
  grant(kCellar, ItemID{"item 8"}, kEditor);
  grant(kCellar, kItem, kStranger);
  grant(kAttic, kItem, kEditor);
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_FALSE(wasStarted());
}

TEST_F(DVRpcServicerItemsTest, AnEmptyItemIdentifierIsLookedUp) {
  answerItemID(*cellar_, /*error=*/std::nullopt, "");
  grant(kCellar, ItemID{}, kEditor);
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(wasStarted());
}

TEST_F(DVRpcServicerItemsTest, AnAnswerWithNeitherErrorNorItemIsNotPermitted) {
  answerItemID(*cellar_, /*error=*/std::nullopt, /*item=*/std::nullopt);
  start(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged().back().text,
            "[ERROR] Consumer ID com.example.editor is not allowed to access item ID “(null)” from provider ID com.orvane.cellar.");
}

TEST_F(DVRpcServicerItemsTest, WithoutAServerOrItsStoreNobodyIsPermitted) {
  grant(kCellar, kItem, kEditor);
  source_->store.reset();
  start(kReport, kCellar, kEditor);
  source_.reset();
  start(kReport, kCellar, kEditor);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].error, DVNotPermittedError());
  EXPECT_EQ(answers_[1].error, DVNotPermittedError());
  EXPECT_FALSE(wasStarted());
}

// --- Without a reply handler

TEST_F(DVRpcServicerItemsTest, WithoutAReplyHandlerTheItemIsStartedAllTheSame) {
  grant(kCellar, kItem, kEditor);
  servicer_->startProvidingItemAtURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_TRUE(wasStarted());
}

TEST_F(DVRpcServicerItemsTest, WithoutAReplyHandlerLateFailuresAreHarmless) {
  servicer_->startProvidingItemAtURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  servicer_->startProvidingItemAtURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
}

TEST_F(DVRpcServicerItemsTest, ARequestUnderWayOutlivesItsClient) {
  grant(kCellar, kItem, kEditor);
  cellar_->vendor().respond("_identifierForItemAtURL:completion:", [](const QXArray&) { return std::nullopt; });
  start(kReport, kCellar, kEditor);
  servicer_.reset();
  letConnectionGo();
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_TRUE(wasStarted());
}

}  // namespace
}  // namespace docuvend
