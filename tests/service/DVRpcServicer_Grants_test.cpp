#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogSwitch;
using fake_platform::FakePlatform;
using fake_platform::FakeWriteFailure;

constexpr const char* kServing = "[DEBUG] Serving: extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:";

class DVRpcServicerGrantsTest : public ServicerFixture {
 protected:
  void SetUp() override {
    registerProviders();
    entitle(kDVWriteEntitlement);
    answerItemID(*cellar_, /*error=*/std::nullopt, kItem.value);
  }

  void extend(std::optional<QXURL> url, std::optional<ProviderID> provider, std::optional<ConsumerID> consumer) {
    servicer_->extendSandboxForFileURL(std::move(url), std::move(provider), std::move(consumer), sandboxReply());
  }
  bool isGranted(const ProviderID& provider) { return store().isProviderWithIdentifier(provider, kItem, kEditor); }

  const std::string kSuccess = "[INFO] Successfully extended sandbox for URL " + kReport.absoluteString() +
                               " from provider ID com.orvane.cellar to consumer ID com.example.editor.";
};

// --- The whole way

TEST_F(DVRpcServicerGrantsTest, RecordsTheGrantAndRepliesWithTokensForTheItemAndItsSibling) {
  extend(kReport, kCellar, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.itemToken, QXData::fromText("token:" + kReportPath));
  EXPECT_EQ(answer.siblingURL, kSibling);
  EXPECT_EQ(answer.siblingToken, QXData::fromText("token:" + kSiblingPath));
  EXPECT_TRUE(isGranted(kCellar));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}, {QXLogType::info, kSuccess}}));
}

TEST_F(DVRpcServicerGrantsTest, AsksTheNamedProviderForTheItem) {
  extend(kReport, kCellar, kEditor);
  const auto& messages = cellar_->vendor().messages();
  EXPECT_EQ(messages.back().operation.name, "_identifierForItemAtURL:completion:");
  EXPECT_EQ(messages.back().arguments, QXArray{kReport});
}

TEST_F(DVRpcServicerGrantsTest, NothingIsGrantedOrIssuedBeforeTheProviderHasAnswered) {
  cellar_->vendor().respond("_identifierForItemAtURL:completion:", [](const QXArray&) { return std::nullopt; });
  extend(kReport, kCellar, kEditor);
  platform_.queues.runAll();
  EXPECT_TRUE(answers_.empty());
  EXPECT_FALSE(isGranted(kCellar));
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());

  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, TheGrantIsOnDiskBeforeTheReply) {
  std::optional<QXValue> onDisk;
  servicer_->extendSandboxForFileURL(kReport, kCellar, kEditor,
                                     [&](auto&&...) { onDisk = platform_.propertyLists.value(kAccessControlFile); });
  ASSERT_TRUE(onDisk);
  EXPECT_EQ(*onDisk,
            QXValue(QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, QXDictionary{{"AllowedItemIDs", QXArray{kItem.value}}}}}}}));
}

TEST_F(DVRpcServicerGrantsTest, TheGrantComesBeforeTheTokens) {
  extend(kReport, kCellar, kEditor);
  const auto texts = platform_.log.texts();
  const auto granted = std::ranges::find(texts, "[INFO] Committing access control list");
  const auto resolved = std::ranges::find(texts, "[INFO] Resolved URL to provider com.orvane.cellar.");
  const auto extended = std::ranges::find(texts, kSuccess);
  ASSERT_NE(extended, texts.end());
  EXPECT_LT(granted, resolved);
  EXPECT_LT(resolved, extended);
}

TEST_F(DVRpcServicerGrantsTest, AnExistingGrantIsNoObstacle) {
  grant(kCellar, kItem, kEditor);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_F(DVRpcServicerGrantsTest, TheGrantGoesToTheConsumerThatWasNamed) {
  extend(kReport, kCellar, kStranger);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(store().isProviderWithIdentifier(kCellar, kItem, kStranger));
  EXPECT_FALSE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, AGrantThatCannotBeWrittenStillAnswersWithTokens) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, TheGrantStandsInTheListOfTheServersOwnStore) {
  const auto own = giveServerItsOwnStore();
  extend(kReport, kCellar, kEditor);
  EXPECT_TRUE(own->isProviderWithIdentifier(kCellar, kItem, kEditor));
  EXPECT_FALSE(isGranted(kCellar));
}

// A provider is registered under one identifier and may say that it has another.
TEST_F(DVRpcServicerGrantsTest, TheGrantAndTheLinesNameTheProviderAsTheRequestDoes) {
  rename(kCellar, kAttic);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(isGranted(kCellar));
  EXPECT_FALSE(isGranted(kAttic));
  EXPECT_EQ(logged().back(), (fake_platform::FakeLogEntry{QXLogType::info, kSuccess}));
}

TEST_F(DVRpcServicerGrantsTest, SoDoesTheLineOfAFailure) {
  rename(kCellar, kNobody);
  extend(kElsewhere, kCellar, kEditor);
  EXPECT_EQ(logged().back(),
            (fake_platform::FakeLogEntry{QXLogType::fault, "[ERROR] Failed to extend sandbox for URL " + kElsewhere.absoluteString() +
                                                               " from provider ID com.orvane.cellar to consumer ID com.example.editor."}));
}

TEST_F(DVRpcServicerGrantsTest, TheOwnerOfTheURLIsHeldAgainstTheIdentifierThatTheProviderSaysItHas) {
  answerItemID(*attic_, /*error=*/std::nullopt, kItem.value);
  rename(kAttic, kCellar);
  extend(kReport, kAttic, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.itemToken, QXData::fromText("token:" + kReportPath));
  EXPECT_TRUE(isGranted(kAttic));
}

// --- The caller

TEST_F(DVRpcServicerGrantsTest, NothingIsAskedOfTheCallerButItsEntitlement) {
  extend(kReport, kCellar, kStranger);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(platform_.applicationRegistry.tokenQueryCount(), 0);
  EXPECT_TRUE(platform_.sandbox.checks().empty());
}

TEST_F(DVRpcServicerGrantsTest, AClientWithoutTheEntitlementIsRefusedAndOnlyTheCheckLogs) {
  connection_->setEntitlement("com.orvane.docuvend.acl-write", false);
  extend(kReport, kCellar, kEditor);
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, DVClientLacksEntitlement());
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault,
                                "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-write\")"}}));
  EXPECT_FALSE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, ReadingAloneDoesNotSuffice) {
  connection_->setEntitlement("com.orvane.docuvend.acl-write", 0);
  entitle(kDVReadEntitlement);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(earlyAnswer().error, DVClientLacksEntitlement());
}

TEST_F(DVRpcServicerGrantsTest, TheEntitlementIsCheckedBeforeTheArguments) {
  connection_->setEntitlement("com.orvane.docuvend.acl-write", false);
  extend(std::nullopt, std::nullopt, std::nullopt);
  EXPECT_EQ(earlyAnswer().error, DVClientLacksEntitlement());
}

TEST_F(DVRpcServicerGrantsTest, ARefusedClientThatWantsNoReplyCausesNoTask) {
  connection_->setEntitlement("com.orvane.docuvend.acl-write", false);
  servicer_->extendSandboxForFileURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

// --- Arguments and provider

TEST_F(DVRpcServicerGrantsTest, TheFirstMissingArgumentIsNamed) {
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
      {std::nullopt, kCellar, kEditor, "URL", "URL (null) from provider ID com.orvane.cellar to consumer ID com.example.editor"},
      {kReport, std::nullopt, std::nullopt, "providerID", "URL " + report + " from provider ID (null) to consumer ID (null)"},
      {kReport, kCellar, std::nullopt, "consumerID", "URL " + report + " from provider ID com.orvane.cellar to consumer ID (null)"},
  };
  for (const Case& c : cases) {
    answers_.clear();
    platform_.log.clear();
    extend(c.url, c.provider, c.consumer);
    const QXError error = DVInvalidParameterError(c.name, /*value=*/std::nullopt);
    const Answer& answer = earlyAnswer();
    EXPECT_EQ(answer.error, error) << c.name;
    EXPECT_TRUE(answer.hasNoValue());
    EXPECT_EQ(logged(),
              (Entries{{QXLogType::debug, kServing},
                       {QXLogType::fault, "[ERROR] Could not extend sandbox for " + c.inLog + ", error: " + error.description()}}));
  }
  EXPECT_EQ(cellar_->vendor().messages().size(), 1U);  // its initial setup
}

TEST_F(DVRpcServicerGrantsTest, TheArgumentsAreCheckedBeforeTheProvider) {
  extend(kReport, kNobody, std::nullopt);
  EXPECT_EQ(earlyAnswer().error, DVInvalidParameterError("consumerID", /*value=*/std::nullopt));
}

TEST_F(DVRpcServicerGrantsTest, AnUnknownProviderIsNotFound) {
  extend(kReport, kNobody, kEditor);
  const QXError error = DVNotFoundError(kNobody);
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, error);
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault, "[ERROR] Could not extend sandbox for URL " + kReport.absoluteString() +
                                                      " from provider ID com.orvane.nobody to consumer ID com.example.editor, error: " +
                                                      error.description()}}));
}

TEST_F(DVRpcServicerGrantsTest, AnEarlyFailureWithoutAReplyHandlerIsLoggedAndATaskThatCallsNothing) {
  servicer_->extendSandboxForFileURL(kReport, kNobody, kEditor, /*completionHandler=*/{});
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
  platform_.queues.runAll();
}

// --- The provider's answer

TEST_F(DVRpcServicerGrantsTest, AProviderThatCannotNameTheItemFailsTheRequestWithoutALine) {
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  extend(kReport, kCellar, kEditor);
  const Answer& answer = lateAnswer();
  // The provider object wraps the extension's error, and the servicer wraps that one.
  EXPECT_EQ(answer.error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}}));
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

TEST_F(DVRpcServicerGrantsTest, AProviderThatCannotBeReachedFailsTheRequest) {
  cellar_->failBegins(kExtensionError);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
}

TEST_F(DVRpcServicerGrantsTest, AnAnswerWithNeitherErrorNorItemFailsTheRequestAndRecordsNothing) {
  answerItemID(*cellar_, /*error=*/std::nullopt, /*item=*/std::nullopt);
  extend(kReport, kCellar, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVPluginOperationFailedError(std::nullopt));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

TEST_F(DVRpcServicerGrantsTest, AURLOfAnotherProviderLeavesTheGrantAndFails) {
  answerItemID(*attic_, /*error=*/std::nullopt, kItem.value);
  extend(kReport, kAttic, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVSandboxExtensionFailedError(kReport));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_TRUE(isGranted(kAttic));
  EXPECT_FALSE(isGranted(kCellar));
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault, "[ERROR] Failed to extend sandbox for URL " + kReport.absoluteString() +
                                                      " from provider ID com.orvane.attic to consumer ID com.example.editor."}}));
}

TEST_F(DVRpcServicerGrantsTest, AURLOfNobodyLeavesTheGrantAndFails) {
  extend(kElsewhere, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVSandboxExtensionFailedError(kElsewhere));
  EXPECT_TRUE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, AProviderThatIsRemovedWhileItNamesTheItemLeavesTheGrantAndFails) {
  cellar_->vendor().respond("_identifierForItemAtURL:completion:", [](const QXArray&) { return std::nullopt; });
  extend(kReport, kCellar, kEditor);
  const std::size_t question = cellar_->vendor().messages().size() - 1;
  removeCellar();
  cellar_->vendor().answer(question, {QXValue(), kItem.value});
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVSandboxExtensionFailedError(kReport));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_TRUE(isGranted(kCellar));
  EXPECT_EQ(logged().back(),
            (fake_platform::FakeLogEntry{QXLogType::fault, "[ERROR] Failed to extend sandbox for URL " + kReport.absoluteString() +
                                                               " from provider ID com.orvane.cellar to consumer ID com.example.editor."}));
}

TEST_F(DVRpcServicerGrantsTest, TheProvidersDirectoryItselfIsNoItem) {
  extend(FakePlatform::storageURL(kCellar.value), kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVSandboxExtensionFailedError(FakePlatform::storageURL(kCellar.value)));
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

TEST_F(DVRpcServicerGrantsTest, TheItemIsIssuedBeforeItsSibling) {
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(platform_.sandbox.issueCalls(), (std::vector<std::string>{kReportPath, kSiblingPath}));
}

TEST_F(DVRpcServicerGrantsTest, ARefusedItemTokenIsNoFailure) {
  platform_.sandbox.refuseIssuing(kReportPath);
  extend(kReport, kCellar, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.itemToken, std::nullopt);
  EXPECT_EQ(answer.siblingURL, kSibling);
  EXPECT_TRUE(answer.siblingToken);
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}, {QXLogType::info, kSuccess}}));
}

TEST_F(DVRpcServicerGrantsTest, ARefusedSiblingTokenIsNoFailure) {
  platform_.sandbox.refuseIssuing(kSiblingPath);
  extend(kReport, kCellar, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.itemToken);
  EXPECT_EQ(answer.siblingURL, kSibling);
  EXPECT_EQ(answer.siblingToken, std::nullopt);
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}, {QXLogType::info, kSuccess}}));
}

TEST_F(DVRpcServicerGrantsTest, ASiblingThatWouldNotLieBesideTheItemIsReturnedWithoutAToken) {
  const std::string storage = FakePlatform::storageURL(kCellar.value).absoluteString();
  extend(QXURL::fromString(storage + "sub%2Ffile"), kCellar, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.itemToken);
  EXPECT_EQ(answer.siblingURL, QXURL::fromString(storage + ".sub%2Ffile"));
  EXPECT_EQ(answer.siblingToken, std::nullopt);
  EXPECT_EQ(platform_.sandbox.issueCalls().size(), 1U) << "nobody asks for the other file's";
}

TEST_F(DVRpcServicerGrantsTest, TokensAreIssuedAnewEachTime) {
  extend(kReport, kCellar, kEditor);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(platform_.sandbox.issueCalls().size(), 4U);
}

TEST_F(DVRpcServicerGrantsTest, ADirectorysSiblingHasNoFinalSlash) {
  const QXURL directory = *QXURL::fromString(FakePlatform::storageURL(kCellar.value).absoluteString() + "Folder/Sub/");
  extend(directory, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().siblingURL->absoluteString(), FakePlatform::storageURL(kCellar.value).absoluteString() + "Folder/.Sub");
}

// --- Without a reply handler

TEST_F(DVRpcServicerGrantsTest, WithoutAReplyHandlerTheGrantIsRecordedAllTheSame) {
  servicer_->extendSandboxForFileURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_TRUE(isGranted(kCellar));
  EXPECT_EQ(logged().back().text, kSuccess);
}

TEST_F(DVRpcServicerGrantsTest, WithoutAReplyHandlerLateFailuresAreHarmless) {
  servicer_->extendSandboxForFileURL(kElsewhere, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  servicer_->extendSandboxForFileURL(kReport, kCellar, kEditor, /*completionHandler=*/{});
}

// --- Lifetimes

TEST_F(DVRpcServicerGrantsTest, ARequestUnderWayOutlivesItsClient) {
  cellar_->vendor().respond("_identifierForItemAtURL:completion:", [](const QXArray&) { return std::nullopt; });
  extend(kReport, kCellar, kEditor);
  servicer_.reset();
  letConnectionGo();
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_TRUE(isGranted(kCellar));
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerGrantsTest, AServerThatHasGoneRecordsNothing) {
  source_.reset();
  extend(kReport, kCellar, kEditor);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.itemToken) << "tokens are no matter of the list";
  EXPECT_FALSE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, AFailureAfterTheAnswerIsToleratedAndTakesNothingBack) {
  extend(kReport, kCellar, kEditor);
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].error, std::nullopt);
  EXPECT_EQ(answers_[1].error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_TRUE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, WithoutDebugAndInfoLoggingNothingIsWrittenOnSuccess) {
  platform_.log.setEnabled(QXLogType::debug, FakeLogSwitch::off);
  platform_.log.setEnabled(QXLogType::info, FakeLogSwitch::off);
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(platform_.log.writes(), 0U);
}

// --- What the list cannot hold

TEST_F(DVRpcServicerGrantsTest, TheRoomThatIsKeptForTheEntitledIsTheirs) {
  for (std::size_t i = 0; i + 1 < kDVMaximumConsumersOfItem; ++i) grant(kCellar, kItem, ConsumerID{std::to_string(i)});
  extend(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(isGranted(kCellar));
}

TEST_F(DVRpcServicerGrantsTest, AConsumerThatTheListCannotHoldIsNotPermittedAndGetsNoTokens) {
  extend(kReport, kCellar, ConsumerID{"\x01"});
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVNotPermittedError());
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(
      logged(),
      (Entries{{QXLogType::debug, kServing},
               {QXLogType::fault,
                "[ERROR] The access control list cannot hold provider ID com.orvane.cellar, item ID “item 7” and consumer ID \x01."}}));
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

}  // namespace
}  // namespace docuvend
