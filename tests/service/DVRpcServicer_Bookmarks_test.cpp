#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeApplicationRegistry;
using fake_platform::FakePlatform;

class DVRpcServicerBookmarksTest : public ServicerFixture {
 protected:
  void SetUp() override {
    registerProviders();
    answerItemID(*cellar_, /*error=*/std::nullopt, "item/7");
    answerURL(*cellar_, /*error=*/std::nullopt, kReport);
  }

  void toString(std::optional<QXURL> url) { servicer_->bookmarkableStringFromDocumentURL(std::move(url), stringReply()); }
  void toURL(std::optional<std::string> string) { servicer_->documentURLFromBookmarkableString(std::move(string), documentReply()); }
  void grantToEditor() {
    grant(kCellar, kSlashedItem, kEditor);
    platform_.log.clear();
  }
  [[nodiscard]] std::size_t cellarMessages() const { return cellar_->vendor().messages().size() - 1; }  // beside its initial setup

  const ItemID kSlashedItem{"item/7"};
  const std::string kString = "docuvend:com.orvane.cellar/item/7";
  const fake_platform::FakeLogEntry kGettingString{QXLogType::debug,
                                                   "[DEBUG] Getting bookmarkable string for URL " + kReport.absoluteString()};
  const fake_platform::FakeLogEntry kGettingURL{QXLogType::debug,
                                                "[DEBUG] Getting URL from bookmarkable string: “docuvend:com.orvane.cellar/item/7”."};
};

// --- The string for a URL

TEST_F(DVRpcServicerBookmarksTest, AnyClientGetsTheStringForAURLThatAProviderOwns) {
  toString(kReport);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.string, kString);
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(logged(), (Entries{kGettingString,
                               {QXLogType::debug, "[DEBUG] Successfully generated bookmarkable string “" + kString + "” from URL " +
                                                      kReport.absoluteString() + "."}}));
}

TEST_F(DVRpcServicerBookmarksTest, TheFirstLineIsLoggedBeforeTheProviderIsLookedFor) {
  toString(kReport);
  EXPECT_EQ(platform_.log.entries().front(), kGettingString);
  EXPECT_EQ(platform_.log.texts().at(1), "[INFO] Resolved URL to provider com.orvane.cellar.");
}

// A provider is registered under one identifier and may say that it has another.
TEST_F(DVRpcServicerBookmarksTest, TheStringNamesTheProviderAsItNamesItself) {
  rename(kCellar, kAttic);
  toString(kReport);
  EXPECT_EQ(lateAnswer().string, "docuvend:com.orvane.attic/item/7");
}

TEST_F(DVRpcServicerBookmarksTest, TheStringIsNoGrantAndAsksNothingOfTheCaller) {
  letConnectionGo();
  toString(kReport);
  EXPECT_EQ(lateAnswer().string, kString);
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
  EXPECT_TRUE(platform_.sandbox.checks().empty());
  EXPECT_EQ(platform_.applicationRegistry.tokenQueryCount(), 0);
}

TEST_F(DVRpcServicerBookmarksTest, AURLOfNobodyAnswersWithNeitherStringNorError) {
  toString(kElsewhere);
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, "[DEBUG] Getting bookmarkable string for URL file:///tmp/elsewhere.txt"},
                               {QXLogType::info, "[INFO] Could not find the provider for URL file:///tmp/elsewhere.txt"}}));
}

TEST_F(DVRpcServicerBookmarksTest, AnAbsentURLIsNobodys) {
  toString(std::nullopt);
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, "[DEBUG] Getting bookmarkable string for URL (null)"},
                               {QXLogType::info, "[INFO] Could not find the provider for URL (null)"}}));
}

TEST_F(DVRpcServicerBookmarksTest, AURLOfNobodyWithoutAReplyHandlerCausesNoTask) {
  servicer_->bookmarkableStringFromDocumentURL(kElsewhere, /*completion=*/{});
  EXPECT_EQ(platform_.queues.pending(), 0U);
  EXPECT_EQ(platform_.log.texts(QXLogType::info).size(), 1U);
}

TEST_F(DVRpcServicerBookmarksTest, AProvidersErrorIsPassedOnUnchanged) {
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  toString(kReport);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVPluginOperationFailedError(kExtensionError));  // the provider object's own
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{kGettingString}));
}

TEST_F(DVRpcServicerBookmarksTest, NeitherErrorNorItemIsLoggedAndAnsweredWithNeither) {
  answerItemID(*cellar_, /*error=*/std::nullopt, /*item=*/std::nullopt);
  toString(kReport);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(),
            (Entries{kGettingString, {QXLogType::fault, "[ERROR] Could not get Item ID for URL " + kReport.absoluteString() + "."}}));
}

TEST_F(DVRpcServicerBookmarksTest, AProviderWithoutAnIdentifierHasNoStrings) {
  answerItemID(*loseIdentifier(kCellar), /*error=*/std::nullopt, "item/7");
  toString(kReport);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(),
            (Entries{kGettingString, {QXLogType::fault, "[ERROR] Could not get Item ID for URL " + kReport.absoluteString() + "."}}));
}

TEST_F(DVRpcServicerBookmarksTest, AnEmptyItemIdentifierMakesAStringAllTheSame) {
  answerItemID(*cellar_, /*error=*/std::nullopt, "");
  toString(kReport);
  EXPECT_EQ(lateAnswer().string, "docuvend:com.orvane.cellar/");
}

TEST_F(DVRpcServicerBookmarksTest, AStringThatNobodyWaitsForIsMadeAndLoggedAllTheSame) {
  servicer_->bookmarkableStringFromDocumentURL(kReport, /*completion=*/{});
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  servicer_->bookmarkableStringFromDocumentURL(kReport, /*completion=*/{});
  answerItemID(*cellar_, /*error=*/std::nullopt, /*item=*/std::nullopt);
  servicer_->bookmarkableStringFromDocumentURL(kReport, /*completion=*/{});
  EXPECT_EQ(cellarMessages(), 3U);
  EXPECT_EQ(logged(), (Entries{kGettingString,
                               {QXLogType::debug, "[DEBUG] Successfully generated bookmarkable string “" + kString + "” from URL " +
                                                      kReport.absoluteString() + "."},
                               kGettingString,
                               kGettingString,
                               {QXLogType::fault, "[ERROR] Could not get Item ID for URL " + kReport.absoluteString() + "."}}));
}

// --- The URL for a string

TEST_F(DVRpcServicerBookmarksTest, AGrantedCallerGetsTheURLWithFreshTokens) {
  grantToEditor();
  toURL(kString);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.url, kReport);
  EXPECT_EQ(answer.itemToken, QXData::fromText("token:" + kReportPath));
  EXPECT_EQ(answer.siblingURL, kSibling);
  EXPECT_EQ(answer.siblingToken, QXData::fromText("token:" + kSiblingPath));
  EXPECT_EQ(cellar_->vendor().messages().back().arguments, QXArray{"item/7"});
  EXPECT_EQ(logged(), (Entries{kGettingURL,
                               {QXLogType::info, "[INFO] Successfully extended sandbox of URL " + kReport.absoluteString() +
                                                     " from provider ID com.orvane.cellar to consumer ID com.example.editor."}}));
}

TEST_F(DVRpcServicerBookmarksTest, NeedsNoEntitlementAndNoSandboxAccess) {
  grantToEditor();
  toURL(kString);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(platform_.sandbox.checks().empty());
}

TEST_F(DVRpcServicerBookmarksTest, AStringMadeHereReadsBack) {
  grantToEditor();
  toString(kReport);
  const std::string string = *lateAnswer().string;
  answers_.clear();
  toURL(string);
  EXPECT_EQ(lateAnswer().url, kReport);
}

TEST_F(DVRpcServicerBookmarksTest, AFinalSlashBelongsToTheItem) {
  grant(kCellar, ItemID{"i/"}, kEditor);
  toURL("docuvend:com.orvane.cellar/i/");
  EXPECT_EQ(lateAnswer().url, kReport);
  EXPECT_EQ(cellar_->vendor().messages().back().arguments, QXArray{"i/"});
}

TEST_F(DVRpcServicerBookmarksTest, AnUnknownCallerIsNotPermittedWhateverTheString) {
  grantToEditor();
  platform_.applicationRegistry.removeBundleIdentifier(token_);
  for (const char* string : {"docuvend:com.orvane.cellar/item/7", "nonsense"}) {
    answers_.clear();
    platform_.log.clear();
    toURL(string);
    const Answer& answer = earlyAnswer();
    EXPECT_EQ(answer.error, DVNotPermittedError()) << string;
    EXPECT_TRUE(answer.hasNoValue());
    EXPECT_EQ(logged(), (Entries{{QXLogType::debug, std::string("[DEBUG] Getting URL from bookmarkable string: “") + string + "”."}}));
  }
  EXPECT_EQ(cellarMessages(), 0U);
}

TEST_F(DVRpcServicerBookmarksTest, AClientThatHasGoneIsKnownByTheZeroToken) {
  grantToEditor();
  letConnectionGo();
  toURL(kString);
  EXPECT_EQ(earlyAnswer().error, DVNotPermittedError());

  // Whom the platform knows by that token is the platform's business.
  answers_.clear();
  platform_.applicationRegistry.setBundleIdentifier(FakeApplicationRegistry::token(0), kEditor.value);
  toURL(kString);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerBookmarksTest, AStringOfAnotherFormIsInvalid) {
  grantToEditor();
  for (const char* bad : {"", "Docuvend:p/i", "docuvend:p", "docuvend:/i", "docuvend:p/", "docuvend:p//a"}) {
    answers_.clear();
    platform_.log.clear();
    toURL(bad);
    const Answer& answer = earlyAnswer();
    EXPECT_EQ(answer.error, DVInvalidBookmarkableStringError()) << bad;
    EXPECT_TRUE(answer.hasNoValue());
    EXPECT_EQ(logged(), (Entries{{QXLogType::debug, std::string("[DEBUG] Getting URL from bookmarkable string: “") + bad + "”."}}));
  }
}

TEST_F(DVRpcServicerBookmarksTest, AnAbsentStringIsInvalid) {
  toURL(std::nullopt);
  EXPECT_EQ(earlyAnswer().error, DVInvalidBookmarkableStringError());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, "[DEBUG] Getting URL from bookmarkable string: “(null)”."}}));
}

TEST_F(DVRpcServicerBookmarksTest, AnotherApplicationsGrantIsOfNoUse) {
  grant(kCellar, kSlashedItem, kStranger);
  platform_.log.clear();
  toURL(kString);
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, DVNotPermittedError());
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{kGettingURL,
                               {QXLogType::fault,
                                "[ERROR] Provider ID com.orvane.cellar is not allowed to provide item ID “item/7” to consumer ID "
                                "com.example.editor"}}));
  EXPECT_EQ(cellarMessages(), 0U);
}

TEST_F(DVRpcServicerBookmarksTest, TheSharedStoreIsAskedNotTheServers) {
  grantToEditor();
  source_->store.reset();
  toURL(kString);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerBookmarksTest, WithoutAGrantTheCallerIsNotPermittedWhetherTheProviderIsRegisteredOrNot) {
  toURL("docuvend:com.orvane.nobody/x");
  EXPECT_EQ(earlyAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged().back(), (fake_platform::FakeLogEntry{QXLogType::fault,
                                                          "[ERROR] Provider ID com.orvane.nobody is not allowed to provide item ID “x” to "
                                                          "consumer ID com.example.editor"}));
}

TEST_F(DVRpcServicerBookmarksTest, TheLinesNameTheProviderAsTheStringDoes) {
  grantToEditor();
  rename(kCellar, kAttic);
  toURL(kString);
  EXPECT_EQ(lateAnswer().url, kReport);
  EXPECT_EQ(logged().back().text, "[INFO] Successfully extended sandbox of URL " + kReport.absoluteString() +
                                      " from provider ID com.orvane.cellar to consumer ID com.example.editor.");
  answers_.clear();
  answerURL(*cellar_, /*error=*/std::nullopt, kElsewhere);
  toURL(kString);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged().back().text,
            "[ERROR] Failed to extend sandbox of URL " + kElsewhere.absoluteString() +
                " from provider ID com.orvane.cellar to consumer ID com.example.editor. Error: " + DVNotPermittedError().description());
}

TEST_F(DVRpcServicerBookmarksTest, AProviderThatIsRemovedWhileItFindsTheItemIsNotTakenForOneThatIsRegistered) {
  grantToEditor();
  cellar_->vendor().respond("_URLForItemIdentifier:completion:", [](const QXArray&) { return std::nullopt; });
  toURL(kString);
  const std::size_t question = cellar_->vendor().messages().size() - 1;
  removeCellar();
  cellar_->vendor().answer(question, {QXValue(), kReport});
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVNotPermittedError());
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged().back(), (fake_platform::FakeLogEntry{
                                 QXLogType::fault, "[ERROR] Failed to extend sandbox of URL " + kReport.absoluteString() +
                                                       " from provider ID com.orvane.cellar to consumer ID com.example.editor. Error: " +
                                                       DVNotPermittedError().description()}));
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

TEST_F(DVRpcServicerBookmarksTest, AProviderThatIsNotRegisteredNeverAnswers) {
  grant(kNobody, kItem, kEditor);
  platform_.log.clear();
  toURL("docuvend:com.orvane.nobody/item 7");
  platform_.queues.runAll();
  EXPECT_TRUE(answers_.empty());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, "[DEBUG] Getting URL from bookmarkable string: “docuvend:com.orvane.nobody/item 7”."}}));
}

TEST_F(DVRpcServicerBookmarksTest, AReplyThatNeverComesIsNotKept) {
  grant(kNobody, kItem, kEditor);
  const auto alive = std::make_shared<int>(0);
  servicer_->documentURLFromBookmarkableString(
      "docuvend:com.orvane.nobody/item 7",
      [alive](std::optional<QXURL>, std::optional<QXData>, std::optional<QXURL>, std::optional<QXData>, std::optional<QXError>) {});
  platform_.queues.runAll();
  EXPECT_EQ(alive.use_count(), 1);
}

TEST_F(DVRpcServicerBookmarksTest, AFailureAfterTheAnswerIsToleratedInBothDirections) {
  grantToEditor();
  answerItemID(*cellar_, /*error=*/std::nullopt, kItem.value);
  toString(kReport);
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_TRUE(answers_[0].string);
  EXPECT_EQ(answers_[1].error, DVPluginOperationFailedError(kExtensionError));
  answerURL(*cellar_, /*error=*/std::nullopt, kReport);
  toURL(kString);
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 4U);
  EXPECT_EQ(answers_[2].url, kReport);
  EXPECT_EQ(answers_[3].error, DVSandboxExtensionFailedError(std::nullopt));
}

TEST_F(DVRpcServicerBookmarksTest, AProviderThatCannotMapTheItemFailsTheRequestAndItsErrorIsDropped) {
  grantToEditor();
  answerURL(*cellar_, kExtensionError, /*url=*/std::nullopt);
  toURL(kString);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, DVSandboxExtensionFailedError(std::nullopt));
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{kGettingURL}));
}

TEST_F(DVRpcServicerBookmarksTest, AURLOutsideTheNamedProviderIsNotPermitted) {
  grantToEditor();
  for (const QXURL& url : {kElsewhere, FakePlatform::itemURL(kAttic.value, "a.txt"), FakePlatform::storageURL(kCellar.value)}) {
    answers_.clear();
    platform_.log.clear();
    answerURL(*cellar_, /*error=*/std::nullopt, url);
    toURL(kString);
    const Answer& answer = lateAnswer();
    EXPECT_EQ(answer.error, DVNotPermittedError()) << url.absoluteString();
    EXPECT_TRUE(answer.hasNoValue());
    EXPECT_EQ(logged(), (Entries{kGettingURL,
                                 {QXLogType::fault, "[ERROR] Failed to extend sandbox of URL " + url.absoluteString() +
                                                        " from provider ID com.orvane.cellar to consumer ID com.example.editor. Error: " +
                                                        DVNotPermittedError().description()}}));
  }
  EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
}

TEST_F(DVRpcServicerBookmarksTest, AnAnswerWithNeitherErrorNorURLIsNotPermitted) {
  grantToEditor();
  answerURL(*cellar_, /*error=*/std::nullopt, /*url=*/std::nullopt);
  toURL(kString);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged().back().text,
            "[ERROR] Failed to extend sandbox of URL (null) from provider ID com.orvane.cellar to consumer ID com.example.editor. Error: " +
                DVNotPermittedError().description());
}

TEST_F(DVRpcServicerBookmarksTest, ARefusedTokenIsNoFailure) {
  grantToEditor();
  platform_.sandbox.refuseIssuing(kReportPath);
  platform_.sandbox.refuseIssuing(kSiblingPath);
  toURL(kString);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.url, kReport);
  EXPECT_EQ(answer.itemToken, std::nullopt);
  EXPECT_EQ(answer.siblingURL, kSibling);
  EXPECT_EQ(answer.siblingToken, std::nullopt);
}

TEST_F(DVRpcServicerBookmarksTest, ARefusedSiblingTokenIsTheOnlyOneThatIsAbsent) {
  grantToEditor();
  platform_.sandbox.refuseIssuing(kSiblingPath);
  toURL(kString);
  const Answer& answer = lateAnswer();
  EXPECT_EQ(answer.url, kReport);
  EXPECT_TRUE(answer.itemToken);
  EXPECT_EQ(answer.siblingURL, kSibling);
  EXPECT_EQ(answer.siblingToken, std::nullopt);
}

TEST_F(DVRpcServicerBookmarksTest, AnEarlyFailureWithoutAReplyHandlerCausesNoTask) {
  servicer_->documentURLFromBookmarkableString("nonsense", /*completion=*/{});
  servicer_->documentURLFromBookmarkableString(kString, /*completion=*/{});
  EXPECT_EQ(platform_.queues.pending(), 0U);
  const auto faults = platform_.log.texts(QXLogType::fault);
  ASSERT_EQ(faults.size(), 1U) << "of the second, which nobody granted";
  EXPECT_NE(faults[0].find("com.example.editor"), std::string::npos) << faults[0];
}

TEST_F(DVRpcServicerBookmarksTest, AURLThatNobodyWaitsForIsMadeAndLoggedAllTheSame) {
  grantToEditor();
  servicer_->documentURLFromBookmarkableString(kString, /*completion=*/{});
  EXPECT_EQ(platform_.sandbox.issueCalls(), (std::vector<std::string>{kReportPath, kSiblingPath}));
  answerURL(*cellar_, /*error=*/std::nullopt, kElsewhere);
  servicer_->documentURLFromBookmarkableString(kString, /*completion=*/{});
  answerURL(*cellar_, kExtensionError, /*url=*/std::nullopt);
  servicer_->documentURLFromBookmarkableString(kString, /*completion=*/{});
  EXPECT_EQ(cellarMessages(), 3U);
  EXPECT_EQ(logged(), (Entries{kGettingURL,
                               {QXLogType::info, "[INFO] Successfully extended sandbox of URL " + kReport.absoluteString() +
                                                     " from provider ID com.orvane.cellar to consumer ID com.example.editor."},
                               kGettingURL,
                               {QXLogType::fault, "[ERROR] Failed to extend sandbox of URL " + kElsewhere.absoluteString() +
                                                      " from provider ID com.orvane.cellar to consumer ID com.example.editor. Error: " +
                                                      DVNotPermittedError().description()},
                               kGettingURL}));
}

TEST_F(DVRpcServicerBookmarksTest, NeitherDirectionWritesTheList) {
  grantToEditor();
  toString(kReport);
  toURL(kString);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

}  // namespace
}  // namespace docuvend
