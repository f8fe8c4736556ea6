// Passing a document on to another application, by one that may write it.
#include "acl/DVGrantLimits.h"
#include "tests/service/AskedConnection.h"
#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogSwitch;
using fake_platform::FakePlatform;
using fake_platform::FakeSandbox;
using fake_platform::FakeWriteFailure;

constexpr const char* kString = "docuvend:com.orvane.cellar/item 7";
constexpr const char* kIdentifierMessage = "_identifierForItemAtURL:completion:";

class DVRpcServicerBookmarkGrantsTest : public ServicerFixture {
 protected:
  // The caller is the editor, which may write the report and no other file; it holds no entitlement.
  void SetUp() override {
    registerProviders();
    answerItemID(*cellar_, /*error=*/std::nullopt, kItem.value);
    platform_.sandbox.setAnswer(kReportPath, FakeSandbox::kAllowed);
  }

  void extend(std::optional<QXURL> url, std::optional<ConsumerID> consumer) {
    servicer_->extendBookmarkForFileURL(std::move(url), std::move(consumer), stringReply());
  }
  bool isGranted(const ConsumerID& consumer) { return store().isProviderWithIdentifier(kCellar, kItem, consumer); }
  [[nodiscard]] std::size_t askedOfCellar() const { return cellar_->vendor().messages().size() - 1; }  // without its initial setup

  static std::string opening(const std::string& url, const std::string& caller, const std::string& consumer) {
    return "[DEBUG] Extending bookmark privileges for URL: “" + url + "” from bundle " + caller + " to " + consumer + ".";
  }
  static std::string failure(const std::string& url, const std::string& caller, const std::string& consumer, const QXError& error) {
    return "[ERROR] Could not extend bookmark privileges for URL " + url + " from bundle " + caller + " to consumer ID " + consumer +
           ", error: " + error.description();
  }
  void expectRefused(const std::string& url, const std::string& caller, const std::string& consumer, const QXError& error) {
    const Answer& answer = earlyAnswer();
    EXPECT_EQ(answer.error, error);
    EXPECT_TRUE(answer.hasNoValue());
    EXPECT_EQ(logged(),
              (Entries{{QXLogType::debug, opening(url, caller, consumer)}, {QXLogType::fault, failure(url, caller, consumer, error)}}));
    EXPECT_EQ(askedOfCellar(), 0U);
    EXPECT_TRUE(platform_.propertyLists.writes().empty());
  }

  const std::string kReportText = kReport.absoluteString();
  const std::string kOpening = opening(kReportText, kEditor.value, kStranger.value);
  const std::string kSuccess =
      std::string("[DEBUG] Successfully generated bookmarkable string “") + kString + "” from URL " + kReportText + ".";
};

// --- The whole way

TEST_F(DVRpcServicerBookmarkGrantsTest, RecordsTheGrantAndRepliesWithTheString) {
  extend(kReport, kStranger);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.string, kString);
  EXPECT_TRUE(isGranted(kStranger));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kOpening}, {QXLogType::debug, kSuccess}}));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, NoServingLineIsLogged) {
  extend(kReport, kStranger);
  EXPECT_TRUE(std::ranges::none_of(platform_.log.texts(), [](const auto& text) { return text.starts_with("[DEBUG] Serving: "); }));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheGrantGoesToTheConsumerThatWasNamedNotToTheCaller) {
  extend(kReport, kStranger);
  EXPECT_TRUE(isGranted(kStranger));
  EXPECT_FALSE(isGranted(kEditor));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, ACallerMayNameItself) {
  extend(kReport, kEditor);
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_TRUE(isGranted(kEditor));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheProviderThatOwnsTheURLIsAskedForTheItemAndIsGranted) {
  const QXURL box = FakePlatform::itemURL(kAttic.value, "box.txt");
  platform_.sandbox.setAnswer(box.fileSystemPath(), FakeSandbox::kAllowed);
  answerItemID(*attic_, /*error=*/std::nullopt, "item/1");
  extend(box, kStranger);
  EXPECT_EQ(lateAnswer().string, "docuvend:com.orvane.attic/item/1");
  EXPECT_TRUE(store().isProviderWithIdentifier(kAttic, ItemID{"item/1"}, kStranger));
  EXPECT_EQ(attic_->vendor().messages().back().operation.name, kIdentifierMessage);
  EXPECT_EQ(attic_->vendor().messages().back().arguments, QXArray{box});
  EXPECT_EQ(askedOfCellar(), 0U);
}

// A provider is registered under one identifier and may say that it has another.
TEST_F(DVRpcServicerBookmarkGrantsTest, TheGrantAndTheStringNameTheProviderAsItNamesItself) {
  rename(kCellar, kAttic);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().string, "docuvend:com.orvane.attic/item 7");
  EXPECT_TRUE(store().isProviderWithIdentifier(kAttic, kItem, kStranger));
  EXPECT_FALSE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheGrantStandsInTheListOfTheServersOwnStore) {
  const auto own = giveServerItsOwnStore();
  extend(kReport, kStranger);
  EXPECT_TRUE(own->isProviderWithIdentifier(kCellar, kItem, kStranger));
  EXPECT_FALSE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, NothingIsGrantedBeforeTheProviderHasAnswered) {
  cellar_->vendor().respond(kIdentifierMessage, [](const QXArray&) { return std::nullopt; });
  extend(kReport, kStranger);
  platform_.queues.runAll();
  EXPECT_TRUE(answers_.empty());
  EXPECT_FALSE(isGranted(kStranger));
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_TRUE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheGrantIsOnDiskBeforeTheReply) {
  std::optional<QXValue> onDisk;
  servicer_->extendBookmarkForFileURL(kReport, kStranger, [&](auto&&...) { onDisk = platform_.propertyLists.value(kAccessControlFile); });
  ASSERT_TRUE(onDisk);
  EXPECT_EQ(
      *onDisk,
      QXValue(QXDictionary{{kCellar.value, QXDictionary{{kStranger.value, QXDictionary{{"AllowedItemIDs", QXArray{kItem.value}}}}}}}));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheGrantComesBeforeTheLineOfTheString) {
  extend(kReport, kStranger);
  const auto texts = platform_.log.texts();
  const auto granted = std::ranges::find(texts, "[INFO] Committing access control list");
  const auto generated = std::ranges::find(texts, kSuccess);
  ASSERT_NE(generated, texts.end());
  EXPECT_LT(granted, generated);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AnExistingGrantIsNoObstacle) {
  grant(kCellar, kItem, kStranger);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheCallerNeedsNoGrantOfItsOwn) {
  ASSERT_FALSE(isGranted(kEditor));
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AGrantThatCannotBeWrittenStillAnswersWithTheString) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_TRUE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AConsumerThatTheListCannotHoldIsNotPermittedAndLaterGrantsAreWritten) {
  for (const std::string& name : {std::string("\x01"), std::string(kDVLongestGrantedConsumerID + 1, 'c')}) {
    platform_.log.clear();
    extend(kReport, ConsumerID{name});
    const Answer answer = lateAnswer();
    EXPECT_EQ(answer.error, DVNotPermittedError());
    EXPECT_TRUE(answer.hasNoValue());
    EXPECT_FALSE(isGranted(ConsumerID{name}));
    EXPECT_EQ(logged().back(),
              (fake_platform::FakeLogEntry{
                  QXLogType::fault, "[ERROR] The access control list cannot hold provider ID com.orvane.cellar, item ID “" + kItem.value +
                                        "” and consumer ID " + name + "."}));
    EXPECT_TRUE(platform_.propertyLists.writes().empty());
    answers_.clear();
  }
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_TRUE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, WhoMayWriteADocumentCannotUseUpTheRoomOfThoseWhoAreEntitledToGrant) {
  constexpr std::size_t kRoom = kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled;
  for (std::size_t i = 0; i < kRoom; ++i) grant(kCellar, kItem, ConsumerID{std::to_string(i)});
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_FALSE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, WhoMayWriteADocumentCannotUseUpTheRoomOfOthersWhoMay) {
  constexpr std::size_t kRoom = kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled;
  const auto answerTo = [this](const ConsumerID& consumer) {
    answers_.clear();
    extend(kReport, consumer);
    return lateAnswer().error;
  };
  for (std::size_t i = 0; i < kRoom / 2; ++i) ASSERT_EQ(answerTo(ConsumerID{std::to_string(i)}), std::nullopt) << i;
  EXPECT_EQ(answerTo(kStranger), DVNotPermittedError());
  platform_.applicationRegistry.setBundleIdentifier(token_, "com.example.other");
  EXPECT_EQ(answerTo(kStranger), std::nullopt);
  EXPECT_TRUE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AnItemThatTheListCannotHoldIsNotPermitted) {
  answerItemID(*cellar_, /*error=*/std::nullopt, "\x01");
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, NoTokensAreIssued) {
  extend(kReport, kStranger);
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, WithoutDebugAndInfoLoggingNothingIsWrittenOnSuccess) {
  platform_.log.setEnabled(QXLogType::debug, FakeLogSwitch::off);
  platform_.log.setEnabled(QXLogType::info, FakeLogSwitch::off);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(platform_.log.writes(), 0U);
}

// --- The caller

TEST_F(DVRpcServicerBookmarkGrantsTest, NoEntitlementIsAskedForAndNoneHelps) {
  platform_.sandbox.setAnswer(kReportPath, FakeSandbox::kRefused);
  entitle(kDVReadEntitlement);
  entitle(kDVWriteEntitlement);
  extend(kReport, kStranger);
  expectRefused(kReportText, kEditor.value, kStranger.value, DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, NoEntitlementIsLookedAt) {
  const auto connection = std::make_shared<AskedConnection>(std::string(kDVWriteEntitlement), token_);
  const auto servicer = std::make_shared<DVRpcServicer>(source_, connection);
  servicer->extendBookmarkForFileURL(kReport, kStranger, stringReply());
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_TRUE(connection->asked.empty());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AnUnknownCallerIsNotPermittedAndLoggedAsAbsent) {
  const QXAuditToken unknown = fake_platform::FakeApplicationRegistry::token(2);
  connection_->setAuditToken(unknown);
  extend(kReport, kStranger);
  expectRefused(kReportText, "(null)", kStranger.value, DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, ACallerWithoutAccessToTheFileIsNotPermitted) {
  platform_.sandbox.setAnswer(kReportPath, FakeSandbox::kRefused);
  extend(kReport, kStranger);
  expectRefused(kReportText, kEditor.value, kStranger.value, DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AQueryThatFailsIsNoAccess) {
  for (const int code : {-1, 2}) {
    answers_.clear();
    platform_.sandbox.setAnswer(kReportPath, code);
    extend(kReport, kStranger);
    EXPECT_EQ(earlyAnswer().error, DVNotPermittedError()) << code;
  }
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheSandboxIsAskedOnceForTheCallerAboutWritingTheItem) {
  extend(kReport, kStranger);
  EXPECT_EQ(platform_.sandbox.checks(), (std::vector<FakeSandbox::Check>{{token_, "file-write-data", kReportPath}}));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheSandboxIsAskedAlsoWhenTheRequestHasFailedAlready) {
  extend(kReport, std::nullopt);
  EXPECT_EQ(platform_.sandbox.checks().size(), 1U);
  connection_->setAuditToken(fake_platform::FakeApplicationRegistry::token(2));
  extend(kReport, kStranger);
  EXPECT_EQ(platform_.sandbox.checks().size(), 2U);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AccessDoesNotMakeUpForAMissingConsumer) {
  extend(kReport, std::nullopt);
  expectRefused(kReportText, kEditor.value, "(null)", DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, ACallerWhoseConnectionHasGoneIsNobody) {
  letConnectionGo();
  extend(kReport, kStranger);
  expectRefused(kReportText, "(null)", kStranger.value, DVNotPermittedError());
  ASSERT_EQ(platform_.sandbox.checks().size(), 1U);
  EXPECT_EQ(platform_.sandbox.checks().front().token, QXAuditToken{});
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheCallersIdentifierIsLookedUpBeforeTheFirstLine) {
  // The line carries it; of a caller that is known it is never "(null)".
  extend(kReport, kStranger);
  EXPECT_EQ(platform_.applicationRegistry.tokenQueryCount(), 1);
  EXPECT_EQ(platform_.log.texts().front(), kOpening);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheSandboxIsAskedOnlyWhenTheCallerIsKnownAndTheFirstLineIsLogged) {
  std::vector<std::pair<int, std::size_t>> askedAtEachLine;
  platform_.log.onWrite([&](const auto&) {
    askedAtEachLine.emplace_back(platform_.applicationRegistry.tokenQueryCount(), platform_.sandbox.checks().size());
  });
  extend(kReport, kStranger);
  ASSERT_FALSE(askedAtEachLine.empty());
  EXPECT_EQ(askedAtEachLine.front(), std::pair(1, std::size_t{0}));
  EXPECT_EQ(platform_.sandbox.checks().size(), 1U);
}

// --- Arguments and provider

TEST_F(DVRpcServicerBookmarkGrantsTest, AMissingURLIsNotPermitted) {
  platform_.sandbox.setAnswer(FakeSandbox::kAllowed);
  extend(std::nullopt, kStranger);
  expectRefused("(null)", kEditor.value, kStranger.value, DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, NothingAtAllIsNotPermitted) {
  extend(std::nullopt, std::nullopt);
  expectRefused("(null)", kEditor.value, "(null)", DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AURLOfNobodyIsNotFound) {
  platform_.sandbox.setAnswer(FakeSandbox::kAllowed);
  extend(kElsewhere, kStranger);
  expectRefused(kElsewhere.absoluteString(), kEditor.value, kStranger.value, DVNotFoundErrorURL(kElsewhere));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, TheProvidersDirectoryItselfIsNotFound) {
  platform_.sandbox.setAnswer(FakeSandbox::kAllowed);
  const QXURL storage = FakePlatform::storageURL(kCellar.value);
  extend(storage, kStranger);
  expectRefused(storage.absoluteString(), kEditor.value, kStranger.value, DVNotFoundErrorURL(storage));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, WhoHasNoAccessDoesNotLearnThatNobodyOwnsTheURL) {
  extend(kElsewhere, kStranger);
  expectRefused(kElsewhere.absoluteString(), kEditor.value, kStranger.value, DVNotPermittedError());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, NoProviderIsLookedForWhenTheRequestHasFailed) {
  platform_.sandbox.setAnswer(kReportPath, FakeSandbox::kRefused);
  extend(kReport, kStranger);
  EXPECT_TRUE(std::ranges::none_of(platform_.log.texts(), [](const auto& text) { return text.starts_with("[INFO] Resolved URL"); }));
}

// --- The provider's answer

TEST_F(DVRpcServicerBookmarkGrantsTest, AProviderThatCannotNameTheItemFailsTheRequestWithoutALine) {
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  extend(kReport, kStranger);
  const Answer& answer = lateAnswer();
  // The provider object wraps the extension's error, and the servicer wraps that one.
  EXPECT_EQ(answer.error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kOpening}}));
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AnErrorCountsAlsoBesideAnIdentifier) {
  answerItemID(*cellar_, kExtensionError, kItem.value);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_FALSE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AProviderThatCannotBeReachedFailsTheRequest) {
  cellar_->failBegins(kExtensionError);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AnAnswerWithNeitherErrorNorItemFailsTheRequestAndRecordsNothing) {
  answerItemID(*cellar_, /*error=*/std::nullopt, /*item=*/std::nullopt);
  extend(kReport, kStranger);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVPluginOperationFailedError(std::nullopt));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kOpening}}));
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AProviderWithoutAnIdentifierFailsTheRequestAndRecordsNothing) {
  answerItemID(*loseIdentifier(kCellar), /*error=*/std::nullopt, kItem.value);
  extend(kReport, kStranger);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(std::nullopt));
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AProviderThatAnswersTwiceIsHeardTwiceAndTheConnectionTakesTheFirst) {
  cellar_->vendor().respond(kIdentifierMessage, [](const QXArray&) { return std::nullopt; });
  extend(kReport, kStranger);
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].string, kString);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AFailureAfterTheAnswerIsToleratedAndTakesNothingBack) {
  extend(kReport, kStranger);
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].string, kString);
  EXPECT_EQ(answers_[1].error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_TRUE(answers_[1].hasNoValue());
  EXPECT_TRUE(isGranted(kStranger));
}

// --- Without a reply handler, a server or a client

TEST_F(DVRpcServicerBookmarkGrantsTest, WithoutAReplyHandlerTheGrantIsRecordedAllTheSame) {
  servicer_->extendBookmarkForFileURL(kReport, kStranger, /*completionHandler=*/{});
  EXPECT_TRUE(isGranted(kStranger));
  EXPECT_EQ(logged().back().text, kSuccess);
}

TEST_F(DVRpcServicerBookmarkGrantsTest, WithoutAReplyHandlerFailuresAreLoggedAndHarmless) {
  servicer_->extendBookmarkForFileURL(kElsewhere, kStranger, /*completionHandler=*/{});
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
  platform_.queues.runAll();
  EXPECT_EQ(logged().back().text, failure(kElsewhere.absoluteString(), kEditor.value, kStranger.value, DVNotPermittedError()));
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  servicer_->extendBookmarkForFileURL(kReport, kStranger, /*completionHandler=*/{});
  EXPECT_FALSE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, AServerOrAStoreThatHasGoneRecordsNothing) {
  source_->store.reset();
  extend(kReport, kStranger);
  source_.reset();
  extend(kReport, kStranger);
  ASSERT_EQ(answers_.size(), 2U);
  for (const Answer& answer : answers_) EXPECT_EQ(answer.string, kString) << "the string is no matter of the list";
  EXPECT_FALSE(isGranted(kStranger));
}

TEST_F(DVRpcServicerBookmarkGrantsTest, ARequestUnderWayOutlivesItsClient) {
  cellar_->vendor().respond(kIdentifierMessage, [](const QXArray&) { return std::nullopt; });
  extend(kReport, kStranger);
  servicer_.reset();
  letConnectionGo();
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_TRUE(isGranted(kStranger));
  EXPECT_EQ(lateAnswer().string, kString);
}

}  // namespace
}  // namespace docuvend
