// A placeholder and the start of providing need a grant for the item that the provider names. The end of providing needs none.
#include "tests/service/ItemsFixture.h"

namespace docuvend {
namespace {

class DVRpcServicerGrantedItemsTest : public ItemsFixtureOverRows {};

INSTANTIATE_TEST_SUITE_P(Each, DVRpcServicerGrantedItemsTest, testing::Values(kPlaceholder, kStart), titleOf);

// --- The provider names the item

TEST_P(DVRpcServicerGrantedItemsTest, TheProviderNamesTheItemAndIsThenAskedAndItsAnswerIsTheReply) {
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(asked(), (std::vector<std::string>{kIdentifierMessage, operation_.message}));
  for (std::size_t message : {1U, 2U}) EXPECT_EQ(cellar_->vendor().messages()[message].arguments, QXArray{kReport});
}

TEST_P(DVRpcServicerGrantedItemsTest, AProviderThatCannotDoItGivesItsErrorStraightToTheConsumer) {
  answerOperation(kExtensionError);
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(kExtensionError));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, operation_.serving}}));
}

TEST_P(DVRpcServicerGrantedItemsTest, AProviderThatCannotNameTheItemFailsTheRequestWithoutALine) {
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  grantAndAsk();
  // The provider object wraps the extension's error, and the servicer wraps that one.
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, operation_.serving}}));
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, AnErrorCountsAlsoBesideAnIdentifier) {
  answerItemID(*cellar_, kExtensionError, kItem.value);
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, AnEmptyItemIdentifierIsLookedUp) {
  answerItemID(*cellar_, /*error=*/std::nullopt, "");
  grant(kCellar, ItemID{}, kEditor);
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, AnAnswerWithNeitherErrorNorItemIsNotPermitted) {
  answerItemID(*cellar_, /*error=*/std::nullopt, /*item=*/std::nullopt);
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged().back().text,
            "[ERROR] Consumer ID com.example.editor is not allowed to access item ID “(null)” from provider ID com.orvane.cellar.");
  EXPECT_FALSE(wasForwarded());
}

// --- The grant

TEST_P(DVRpcServicerGrantedItemsTest, WithoutAGrantTheConsumerIsNotPermitted) {
  ask(kReport, kCellar, kStranger);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, operation_.serving},
                               {QXLogType::fault,
                                "[ERROR] Consumer ID com.example.stranger is not allowed to access item ID “item 7” from provider ID "
                                "com.orvane.cellar."}}));
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, AGrantForAnotherItemConsumerOrProviderDoesNotCount) {
  grant(kCellar, ItemID{"item 8"}, kEditor);
  grant(kCellar, kItem, kStranger);
  grant(kAttic, kItem, kEditor);
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, TheListIsAskedWhenTheProviderHasNamedTheItem) {
  hold(kIdentifierMessage);
  ask(kReport, kCellar, kEditor);
  platform_.queues.runAll();
  EXPECT_TRUE(answers_.empty());
  EXPECT_FALSE(wasForwarded());
  grant(kCellar, kItem, kEditor);
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_TRUE(wasForwarded());
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_P(DVRpcServicerGrantedItemsTest, AGrantThatIsTakenBackMeanwhileDoesNotCount) {
  hold(kIdentifierMessage);
  grantAndAsk();
  store().disallowProviderWithIdentifier(kCellar, kItem, kEditor);
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, WithoutAStoreNobodyIsPermitted) {
  grant(kCellar, kItem, kEditor);
  source_->store.reset();
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, WithoutAServerNobodyIsPermitted) {
  grant(kCellar, kItem, kEditor);
  source_.reset();
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, TheListIsThatOfTheServersOwnStore) {
  const auto own = giveServerItsOwnStore();
  own->allowProviderWithIdentifier(kCellar, kItem, kEditor);
  ASSERT_FALSE(store().isProviderWithIdentifier(kCellar, kItem, kEditor));
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, AProviderThatIsUpdatedWhileItNamesTheItemIsTheOneThatIsAsked) {
  hold(kIdentifierMessage);
  grantAndAsk();
  const std::size_t question = cellar_->vendor().messages().size() - 1;
  const auto updated = updateCellar();
  cellar_->vendor().answer(question, {QXValue(), kItem.value});
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_TRUE(wasForwarded());
  EXPECT_EQ(updated->vendor().messages().size(), 1U);  // its initial setup
}

// --- Once too often, too late, or for nobody

TEST_P(DVRpcServicerGrantedItemsTest, AFailureAfterTheAnswerIsTolerated) {
  grantAndAsk();
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].error, std::nullopt);
  EXPECT_EQ(answers_[1].error, DVPluginOperationFailedError(kExtensionError));
}

TEST_P(DVRpcServicerGrantedItemsTest, AFailureAfterTheItemWasNamedIsAnAnswerOfItsOwn) {
  hold(operation_.message);
  grantAndAsk();
  cellar_->vendor().failDelivery(1, kExtensionError);
  ASSERT_EQ(answers_.size(), 1U);
  EXPECT_EQ(answers_[0].error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  cellar_->vendor().answerLast(operation_.answer(/*error=*/std::nullopt));
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[1].error, std::nullopt);
}

TEST_P(DVRpcServicerGrantedItemsTest, AProviderThatNamesTheItemTwiceIsJudgedTwice) {
  hold(kIdentifierMessage);
  grantAndAsk();
  cellar_->vendor().answer(1, {QXValue(), kItem.value});
  cellar_->vendor().answer(1, {QXValue(), "item 8"});
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].error, std::nullopt);
  EXPECT_EQ(answers_[1].error, DVNotPermittedError());
  EXPECT_EQ(std::ranges::count(asked(), std::string(operation_.message)), 1);
}

TEST_P(DVRpcServicerGrantedItemsTest, WithoutAReplyHandlerLateFailuresAreHarmless) {
  askWithoutReply(kReport);
  EXPECT_EQ(platform_.log.texts(QXLogType::fault).size(), 1U);
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  askWithoutReply(kReport);
  EXPECT_FALSE(wasForwarded());
}

TEST_P(DVRpcServicerGrantedItemsTest, ARequestWhoseClientHasLeftIsJudgedAndForwarded) {
  hold(kIdentifierMessage);
  grantAndAsk();
  servicer_.reset();
  letConnectionGo();
  cellar_->vendor().answerLast({QXValue(), kItem.value});
  EXPECT_TRUE(wasForwarded());
}

}  // namespace
}  // namespace docuvend
