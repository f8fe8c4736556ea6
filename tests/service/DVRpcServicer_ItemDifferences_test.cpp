// How a placeholder, the start and the end of providing differ, each on purpose.
#include "tests/service/ItemsFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakePlatform;

class DVRpcServicerPlaceholderTest : public ItemsFixture {
 protected:
  DVRpcServicerPlaceholderTest() : ItemsFixture(kPlaceholder) {}
};

class DVRpcServicerStartTest : public ItemsFixture {
 protected:
  DVRpcServicerStartTest() : ItemsFixture(kStart) {}
};

class DVRpcServicerStopTest : public ItemsFixture {
 protected:
  DVRpcServicerStopTest() : ItemsFixture(kStop) {}

  [[nodiscard]] std::string failureLine(const QXError& error) const {
    return "[ERROR] Could not ask provider ID com.orvane.cellar to stop providing item at URL " + kReport.absoluteString() +
           ". Error: " + error.description();
  }
};

// --- A placeholder's provider is found by its identifier alone

TEST_F(DVRpcServicerPlaceholderTest, AnUnknownProviderIsNotFoundAndItsErrorIsPassedOnAsItIs) {
  ask(kReport, kNobody, kEditor);
  const QXError error = DVNotFoundError(kNobody);
  EXPECT_EQ(earlyAnswer().error, error);
  EXPECT_EQ(logged(), refusalLines(requestText(kReport, kNobody), error));
  EXPECT_TRUE(asked().empty()) << "whose the URL is does not matter";
}

TEST_F(DVRpcServicerPlaceholderTest, AURLOutsideTheProvidersDirectoryIsTheProvidersToJudge) {
  answerItemID(*cellar_, kExtensionError, /*item=*/std::nullopt);
  ask(kElsewhere, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_EQ(cellar_->vendor().messages().back().arguments, QXArray{kElsewhere});
}

TEST_F(DVRpcServicerPlaceholderTest, AURLOfAnotherProviderGoesToTheNamedOne) {
  answerItemID(*attic_, /*error=*/std::nullopt, kItem.value);
  attic_->vendor().respond(kPlaceholder.message, [](const QXArray&) { return kPlaceholder.answer(/*error=*/std::nullopt); });
  grant(kAttic, kItem, kEditor);
  ask(kReport, kAttic, kEditor);
  EXPECT_EQ(lateAnswer().error, std::nullopt);
  EXPECT_EQ(attic_->vendor().messages().back().arguments, QXArray{kReport});
  EXPECT_TRUE(asked().empty());
}

// A provider is registered under one identifier and may say that it has another.
TEST_F(DVRpcServicerPlaceholderTest, TheListIsAskedAboutTheProviderAsTheRequestNamesIt) {
  rename(kCellar, kAttic);
  grant(kAttic, kItem, kEditor);
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVNotPermittedError());
  EXPECT_EQ(logged().back(), (fake_platform::FakeLogEntry{QXLogType::fault,
                                                          "[ERROR] Consumer ID com.example.editor is not allowed to access item ID “item "
                                                          "7” from provider ID com.orvane.cellar."}));
  EXPECT_FALSE(wasForwarded());
  answers_.clear();
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

TEST_F(DVRpcServicerPlaceholderTest, NoDirectoryIsLookedAt) {
  grantAndAsk();
  EXPECT_TRUE(std::ranges::none_of(platform_.log.texts(), [](const auto& text) { return text.starts_with("[INFO] Resolved URL"); }));
}

TEST_F(DVRpcServicerPlaceholderTest, TheProvidersDirectoryItselfIsTheProvidersToJudgeToo) {
  ask(FakePlatform::storageURL(kCellar.value), kCellar, kEditor);
  EXPECT_EQ(asked(), std::vector<std::string>{kIdentifierMessage});
}

TEST_F(DVRpcServicerPlaceholderTest, TheURLThatTheProviderAnswersIsNotUsed) {
  cellar_->vendor().respond(kPlaceholder.message, [this](const QXArray&) { return QXArray{kElsewhere, QXValue()}; });
  grantAndAsk();
  EXPECT_EQ(lateAnswer().error, std::nullopt);
}

// --- Start and stop find the provider by the URL, and hold it against the identifier

class DVRpcServicerItemsByURLTest : public ItemsFixtureOverRows {};

INSTANTIATE_TEST_SUITE_P(Each, DVRpcServicerItemsByURLTest, testing::Values(kStart, kStop), titleOf);

TEST_P(DVRpcServicerItemsByURLTest, AURLOfNobodyIsNotFoundTwiceOverWhoeverIsNamed) {
  ask(kElsewhere, kCellar, kEditor);
  const QXError error = DVNotFoundError(kCellar);
  EXPECT_EQ(earlyAnswer().error, DVNotFoundError(error));
  EXPECT_EQ(logged(), refusalLines(requestText(kElsewhere, kCellar), error));
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsByURLTest, TheProvidersDirectoryItselfIsNoItem) {
  ask(FakePlatform::storageURL(kCellar.value), kCellar, kEditor);
  EXPECT_EQ(earlyAnswer().error, DVNotFoundError(DVNotFoundError(kCellar)));
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsByURLTest, IdentifiersAreComparedToTheCharacter) {
  for (const char* similar : {"com.orvane.Cellar", "com.orvane.cellar ", "com.orvane", ""}) {
    answers_.clear();
    ask(kReport, ProviderID{similar}, kEditor);
    const auto& error = earlyAnswer().error;
    ASSERT_TRUE(error && error->underlying) << similar;
    EXPECT_EQ(error->underlying->code, static_cast<std::int64_t>(DVErrorCode::invalidParameter)) << similar;
  }
  EXPECT_TRUE(asked().empty());
}

TEST_P(DVRpcServicerItemsByURLTest, TheIdentifierIsHeldAgainstTheOneThatTheProviderSaysItHas) {
  rename(kCellar, kAttic);
  grant(kAttic, kItem, kEditor);
  ask(kReport, kAttic, kEditor);
  EXPECT_EQ(answers_.size(), 1U);
  EXPECT_TRUE(wasForwarded());
  answers_.clear();
  ask(kReport, kCellar, kEditor);
  const auto& error = earlyAnswer().error;
  ASSERT_TRUE(error && error->underlying);
  EXPECT_EQ(error->underlying->code, static_cast<std::int64_t>(DVErrorCode::invalidParameter));
}

TEST_F(DVRpcServicerStartTest, AURLOfAnotherProviderThanTheNamedOneIsAnInvalidParameterWithThatIdentifierBeneathNotFound) {
  for (const ProviderID& named : {kAttic, kNobody}) {
    answers_.clear();
    platform_.log.clear();
    ask(kReport, named, kEditor);
    const QXError error = DVInvalidParameterError("providerID", named.value);
    EXPECT_EQ(earlyAnswer().error, DVNotFoundError(error));
    EXPECT_EQ(logged(), refusalLines(requestText(kReport, named), error));
  }
  EXPECT_TRUE(asked().empty());
  EXPECT_EQ(attic_->vendor().messages().size(), 1U);
}

TEST_F(DVRpcServicerStopTest, AURLOfAnotherProviderThanTheNamedOneIsAnInvalidParameterWithoutAValueBeneathNotFound) {
  for (const ProviderID& named : {kAttic, kNobody}) {
    answers_.clear();
    platform_.log.clear();
    ask(kReport, named, kEditor);
    const QXError error = DVInvalidParameterError("providerID", /*value=*/std::nullopt);
    EXPECT_EQ(earlyAnswer().error, DVNotFoundError(error));
    EXPECT_EQ(logged(), refusalLines(requestText(kReport, named), error));
  }
  EXPECT_TRUE(asked().empty());
  EXPECT_EQ(attic_->vendor().messages().size(), 1U);
}

// --- Stop asks nobody's leave, and always answers with an error

TEST_F(DVRpcServicerStopTest, NeitherTheItemsIdentifierNorTheListIsAskedFor) {
  ask(kReport, kCellar, kStranger);
  EXPECT_EQ(asked(), std::vector<std::string>{kStop.message});
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(std::nullopt));
}

TEST_F(DVRpcServicerStopTest, WithoutAServerOrItsStoreTheProviderIsAskedAllTheSame) {
  source_->store.reset();
  ask(kReport, kCellar, kEditor);
  source_.reset();
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(asked(), (std::vector<std::string>{kStop.message, kStop.message}));
}

TEST_F(DVRpcServicerStopTest, SuccessIsAnErrorWithNothingBeneathItAndNoLine) {
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(std::nullopt));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kStop.serving}}));
}

TEST_F(DVRpcServicerStopTest, AProviderThatCannotStopIsLoggedAndItsErrorWrappedOnceMore) {
  answerOperation(kExtensionError);
  ask(kReport, kCellar, kEditor);
  const QXError error = DVPluginOperationFailedError(kExtensionError);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(error));
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kStop.serving}, {QXLogType::fault, failureLine(error)}}));
}

TEST_F(DVRpcServicerStopTest, AProviderThatCannotBeReachedIsLoggedAsOneThatCannotStop) {
  cellar_->failBegins(kExtensionError);
  ask(kReport, kCellar, kEditor);
  EXPECT_EQ(lateAnswer().error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_EQ(logged().back().text, failureLine(DVPluginOperationFailedError(kExtensionError)));
}

TEST_F(DVRpcServicerStopTest, AFailureAfterTheAnswerIsLoggedAndAnAnswerOfItsOwn) {
  ask(kReport, kCellar, kEditor);
  cellar_->vendor().failLastDelivery(kExtensionError);
  ASSERT_EQ(answers_.size(), 2U);
  EXPECT_EQ(answers_[0].error, DVPluginOperationFailedError(std::nullopt));
  EXPECT_EQ(answers_[1].error, DVPluginOperationFailedError(DVPluginOperationFailedError(kExtensionError)));
  EXPECT_EQ(logged().back().text, failureLine(DVPluginOperationFailedError(kExtensionError)));
}

TEST_F(DVRpcServicerStopTest, WithoutAReplyHandlerAFailureIsLoggedAllTheSame) {
  answerOperation(kExtensionError);
  askWithoutReply(kReport);
  EXPECT_EQ(logged().back().text, failureLine(DVPluginOperationFailedError(kExtensionError)));
}

TEST_F(DVRpcServicerStopTest, AFailureIsLoggedAlsoWhenTheClientHasLeft) {
  hold(kStop.message);
  ask(kReport, kCellar, kEditor);
  servicer_.reset();
  letConnectionGo();
  cellar_->vendor().answerLast(kStop.answer(kExtensionError));
  EXPECT_EQ(logged().back().text, failureLine(DVPluginOperationFailedError(kExtensionError)));
}

}  // namespace
}  // namespace docuvend
