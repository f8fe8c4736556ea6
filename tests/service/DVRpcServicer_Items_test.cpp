// What a placeholder, the start and the end of providing have in common.
#include "tests/service/ItemsFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogSwitch;

class DVRpcServicerItemsTest : public ItemsFixtureOverRows {};

INSTANTIATE_TEST_SUITE_P(Each, DVRpcServicerItemsTest, testing::Values(kPlaceholder, kStart, kStop), titleOf);

// --- The whole way

TEST_P(DVRpcServicerItemsTest, IsForwardedToTheProviderWithTheURLAndLogsOnlyThatItIsServed) {
  grantAndAsk();
  ASSERT_EQ(answers_.size(), 1U);
  const auto& message = cellar_->vendor().messages().back();
  EXPECT_EQ(message.operation.name, operation_.message);
  EXPECT_EQ(message.arguments, QXArray{kReport});
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, operation_.serving}}));
  EXPECT_EQ(attic_->vendor().messages().size(), 1U) << "no other provider is asked";
}

TEST_P(DVRpcServicerItemsTest, TheReplyWaitsForTheProvider) {
  hold(operation_.message);
  grantAndAsk();
  platform_.queues.runAll();
  EXPECT_TRUE(answers_.empty());
  cellar_->vendor().answerLast(operation_.answer(/*error=*/std::nullopt));
  (void)lateAnswer();
}

TEST_P(DVRpcServicerItemsTest, TwoRequestsAtOnceAreAnsweredEachByItsOwn) {
  hold(operation_.message);
  grant(kCellar, kItem, kEditor);
  ask(kReport, kCellar, kEditor);
  const std::size_t first = cellar_->vendor().messages().size() - 1;
  ask(kReport, kCellar, kEditor);
  cellar_->vendor().answerLast(operation_.answer(kExtensionError));
  ASSERT_EQ(answers_.size(), 1U);
  cellar_->vendor().answer(first, operation_.answer(/*error=*/std::nullopt));
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_NE(answers_[0].error, answers_[1].error);
}

TEST_P(DVRpcServicerItemsTest, AProviderThatCannotBeReachedFailsTheRequest) {
  cellar_->failBegins(kExtensionError);
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
}

TEST_P(DVRpcServicerItemsTest, ChangesNothingInTheAccessControlList) {
  answerItemID(*attic_, /*error=*/std::nullopt, kItem.value);
  grant(kCellar, kItem, kEditor);
  ask(kReport, kCellar, kEditor);
  ask(kReport, kCellar, kStranger);
  ask(kReport, kAttic, kEditor);
  ask(std::nullopt, kCellar, kEditor);
  platform_.queues.runAll();
  EXPECT_EQ(answers_.size(), 4U);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_P(DVRpcServicerItemsTest, WithoutDebugAndInfoLoggingNothingIsWrittenOnSuccess) {
  grant(kCellar, kItem, kEditor);
  platform_.log.setEnabled(QXLogType::debug, FakeLogSwitch::off);
  platform_.log.setEnabled(QXLogType::info, FakeLogSwitch::off);
  const auto before = platform_.log.writes();
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(answers_.size(), 1U);
  EXPECT_EQ(platform_.log.writes(), before);
}

// --- The caller

TEST_P(DVRpcServicerItemsTest, ReadersMayAsk) {
  grantAndAsk();
  EXPECT_TRUE(wasForwarded());
}

TEST_P(DVRpcServicerItemsTest, WritersMayAskToo) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  entitle(kDVWriteEntitlement);
  grantAndAsk();
  EXPECT_TRUE(wasForwarded());
}

TEST_P(DVRpcServicerItemsTest, AClientWithNeitherEntitlementIsRefusedAndOnlyTheCheckLogs) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  grantAndAsk();
  EXPECT_EQ(earlyAnswer().error, DVClientLacksEntitlement());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, operation_.serving},
                               {QXLogType::fault,
                                "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-read\", \"com.orvane.docuvend.acl-write\")"}}));
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsTest, TheEntitlementIsCheckedBeforeTheArguments) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  ask(std::nullopt, std::nullopt, std::nullopt);
  EXPECT_EQ(earlyAnswer().error, DVClientLacksEntitlement());
}

TEST_P(DVRpcServicerItemsTest, ARefusedClientThatWantsNoReplyCausesNoTask) {
  connection_->setEntitlement(std::string(kDVReadEntitlement), false);
  askWithoutReply(kReport);
  EXPECT_EQ(platform_.queues.pending(), 0U);
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsTest, AClientWhoseConnectionHasGoneHoldsNothing) {
  letConnectionGo();
  grantAndAsk();
  EXPECT_EQ(earlyAnswer().error, DVClientLacksEntitlement());
  EXPECT_TRUE(logged().back().text.starts_with("[ERROR] Rejecting request from PID 0 ")) << logged().back().text;
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsTest, TheConsumerIsTheOneThatIsNamedNotTheCaller) {
  grant(kCellar, kItem, kStranger);
  ask(kReport, kCellar, kStranger);
  EXPECT_TRUE(wasForwarded());
  EXPECT_EQ(platform_.applicationRegistry.tokenQueryCount(), 0);
}

TEST_P(DVRpcServicerItemsTest, WhetherTheCallerCouldWriteTheFileIsNotAsked) {
  grantAndAsk();
  EXPECT_TRUE(platform_.sandbox.checks().empty());
}

// --- Arguments

TEST_P(DVRpcServicerItemsTest, TheFirstMissingArgumentIsNamed) {
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
      {std::nullopt, kCellar, std::nullopt, "URL", "URL (null) from provider ID com.orvane.cellar to consumer ID (null)"},
      {std::nullopt, kCellar, kEditor, "URL", "URL (null) from provider ID com.orvane.cellar to consumer ID com.example.editor"},
      {kReport, std::nullopt, std::nullopt, "providerID", "URL " + report + " from provider ID (null) to consumer ID (null)"},
      {kReport, std::nullopt, kEditor, "providerID", "URL " + report + " from provider ID (null) to consumer ID com.example.editor"},
      {kReport, kCellar, std::nullopt, "consumerID", "URL " + report + " from provider ID com.orvane.cellar to consumer ID (null)"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.inLog);
    answers_.clear();
    platform_.log.clear();
    ask(c.url, c.provider, c.consumer);
    const QXError error = DVInvalidParameterError(c.name, /*value=*/std::nullopt);
    EXPECT_EQ(earlyAnswer().error, operation_.refused(error));
    EXPECT_EQ(logged(), refusalLines(c.inLog, error));
  }
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsTest, TheArgumentsAreCheckedBeforeTheProvider) {
  ask(kElsewhere, kNobody, std::nullopt);
  EXPECT_EQ(earlyAnswer().error, operation_.refused(DVInvalidParameterError("consumerID", /*value=*/std::nullopt)));
}

TEST_P(DVRpcServicerItemsTest, AURLAndAProviderOfNobodyAreNotFound) {
  ask(kElsewhere, kNobody, kEditor);
  const QXError error = DVNotFoundError(kNobody);
  EXPECT_EQ(earlyAnswer().error, operation_.refused(error));
  EXPECT_EQ(logged(), refusalLines(requestText(kElsewhere, kNobody), error));
}

TEST_P(DVRpcServicerItemsTest, AnEarlyFailureWithoutAReplyHandlerIsLoggedAndATaskThatCallsNothing) {
  askFor(/*url=*/std::nullopt, kCellar, kEditor, /*reply=*/{});
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
  platform_.queues.runAll();
}

// --- Once too often, too late, or for nobody

TEST_P(DVRpcServicerItemsTest, AProviderThatAnswersTwiceIsRepeatedToTheConnectionWhichTakesTheFirst) {
  hold(operation_.message);
  grantAndAsk();
  cellar_->vendor().answerLast(operation_.answer(/*error=*/std::nullopt));
  cellar_->vendor().answerLast(operation_.answer(kExtensionError));
  EXPECT_EQ(answers_.size(), 2U);
  EXPECT_EQ(std::ranges::count(asked(), std::string(operation_.message)), 1);
}

TEST_P(DVRpcServicerItemsTest, WithoutAReplyHandlerTheProviderIsAskedAllTheSame) {
  grant(kCellar, kItem, kEditor);
  askWithoutReply(kReport);
  EXPECT_TRUE(wasForwarded());
  answerOperation(kExtensionError);
  askWithoutReply(kReport);
}

TEST_P(DVRpcServicerItemsTest, WithoutAReplyHandlerAProviderThatCannotBeReachedIsHarmless) {
  cellar_->failBegins(kExtensionError);
  askWithoutReply(kReport);
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_P(DVRpcServicerItemsTest, ARequestUnderWayOutlivesItsClient) {
  hold(operation_.message);
  grantAndAsk();
  servicer_.reset();
  letConnectionGo();
  source_.reset();
  cellar_->vendor().answerLast(operation_.answer(/*error=*/std::nullopt));
  (void)lateAnswer();
}

}  // namespace
}  // namespace docuvend
