#include "common/DVErrors.h"
#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

const QXCoordinationID kReader{"reader-5"};
const char* const kBeginning = "debug: [DEBUG] Beginning extension request.";
const char* const kAskingForID = "debug: [DEBUG] -[DVExtensionDocuvend itemIDForURL:completionHandler:]";
const char* const kStarting = "debug: [DEBUG] -[DVExtensionDocuvend startProvidingItemAtURL:completionHandler:]";
const char* const kIdentifierOperation = "_identifierForItemAtURL:completion:";
const char* const kStartOperation = "_startProvidingItemAtURL:completion:";

class ReadsTest : public ProvidersTest {
 protected:
  ReadsTest() {
    cellar = installReady(kCellar);
    discover({cellar});
    provider = DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar});
    EXPECT_TRUE(provider);
    url = FakePlatform::itemURL(kCellar, "report.txt");
    text = url->absoluteString();
    written();
  }

  // What file coordination does for a reader; the completion leaves its trace.
  void read(const std::optional<QXCoordinationID>& reader) {
    provider->_provideItemAtURL(*url, reader, [this](const std::optional<QXError>& error) {
      outcomes.push_back(error);
      trace("read");
    });
  }
  [[nodiscard]] Texts asked() const {
    Texts operations;
    for (const auto& message : cellar->vendor().messages()) {
      if (message.operation.name == kIdentifierOperation || message.operation.name == kStartOperation) {
        EXPECT_EQ(message.arguments.at(0).as<QXURL>()->absoluteString(), text);
        operations.push_back(message.operation.name);
      }
    }
    return operations;
  }
  std::string requestedFor(const std::string& reader) {
    return "info: [INFO] QXFileCoordinator requested us to provide item at URL " + text + " for consumer " + reader;
  }
  std::string notProvided(const std::string& reader, const QXError& error) {
    return "fault: [ERROR] Could not provide item at URL " + text + " from extension com.orvane.cellar to reader " + reader +
           ". Error: " + error.description();
  }

  std::shared_ptr<TracingExtension> cellar;
  std::shared_ptr<DVExtensionDocuvend> provider;
  std::optional<QXURL> url;
  std::string text;
  std::vector<std::optional<QXError>> outcomes;
};

TEST_F(ReadsTest, AReadAsksForTheIdentifierThenOnTheGlobalQueueForTheItemAndIsThenAnswered) {
  read(kReader);
  EXPECT_EQ(written(), (Lines{requestedFor("reader-5"), kAskingForID, "~ begin", kBeginning}));
  EXPECT_EQ(asked(), Texts{kIdentifierOperation});

  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  EXPECT_EQ(written(), (Lines{"debug: [DEBUG] Successfully got item ID “item-7” for URL " + text + " from extension com.orvane.cellar",
                              "~ cancel 2"}));
  EXPECT_EQ(asked(), Texts{kIdentifierOperation}) << "not inside the answer";
  EXPECT_EQ(platform.queues.pendingOnGlobalQueue(), 1U);

  platform.queues.runAll();
  EXPECT_EQ(written(), (Lines{kStarting, "~ begin", kBeginning}));
  EXPECT_EQ(asked(), (Texts{kIdentifierOperation, kStartOperation}));
  EXPECT_TRUE(outcomes.empty());

  cellar->vendor().answerLast({QXValue()});
  EXPECT_EQ(written(), (Lines{"debug: [DEBUG] Successfully provided item at URL " + text + " for extension com.orvane.cellar.", "~ read",
                              "~ cancel 3"}));
  EXPECT_EQ(outcomes, std::vector<std::optional<QXError>>{std::nullopt});
}

TEST_F(ReadsTest, AReadForNobodyInParticularPrintsTheReaderAsAbsentAndGoesOn) {
  read(/*reader=*/std::nullopt);
  EXPECT_EQ(written().front(), requestedFor("(null)"));
  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  platform.queues.runAll();
  cellar->vendor().answerLast({QXValue()});
  EXPECT_EQ(outcomes, std::vector<std::optional<QXError>>{std::nullopt});
}

TEST_F(ReadsTest, TheDeprecatedCallbackSaysSoAndIsAReadForNobody) {
  provider->_provideItemAtURL(*url, [this](const std::optional<QXError>& error) { outcomes.push_back(error); });
  EXPECT_EQ(written(), (Lines{"fault: [ERROR] Calling deprecated method: _provideItemAtURL:completionHandler:", requestedFor("(null)"),
                              kAskingForID, "~ begin", kBeginning}));
  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  platform.queues.runAll();
  cellar->vendor().answerLast({QXValue()});
  EXPECT_EQ(outcomes, std::vector<std::optional<QXError>>{std::nullopt});
}

TEST_F(ReadsTest, AnItemThatTheExtensionCannotNameIsNotProvided) {
  read(kReader);
  written();
  cellar->vendor().answerLast({QXValue(broken), QXValue()});
  const QXError failure = DVPluginOperationFailedError(broken);
  EXPECT_EQ(written(), (Lines{"fault: [ERROR] Proxy failed to get item ID for URL " + text +
                                  " for extension com.orvane.cellar. Error: TestDomain 7: broken",
                              notProvided("reader-5", failure), "~ read", "~ cancel 2"}));
  EXPECT_EQ(outcomes, std::vector<std::optional<QXError>>{failure});
  platform.queues.runAll();
  EXPECT_EQ(asked(), Texts{kIdentifierOperation}) << "the item itself is not asked for";
}

TEST_F(ReadsTest, AnExtensionThatCannotBeReachedFailsTheReadAndItsRequestIsNotEnded) {
  cellar->failBegins(broken);
  read(/*reader=*/std::nullopt);
  const QXError failure = DVPluginOperationFailedError(broken);
  EXPECT_EQ(written(),
            (Lines{requestedFor("(null)"), kAskingForID, "~ begin", kBeginning,
                   "fault: [ERROR] Extension request failed. Error: TestDomain 7: broken",
                   "fault: [ERROR] Cannot get item ID for URL " + text + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
                   notProvided("(null)", failure), "~ read"}));
  EXPECT_EQ(outcomes, std::vector<std::optional<QXError>>{failure});
}

TEST_F(ReadsTest, AnExtensionThatNamesTheItemWithNothingIsAskedForItAllTheSame) {
  read(kReader);
  cellar->vendor().answerLast({QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(asked(), (Texts{kIdentifierOperation, kStartOperation}));
}

TEST_F(ReadsTest, AnItemThatCannotBeStartedFailsTheReadWithTheMessagesOfStartingAlone) {
  read(kReader);
  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  platform.queues.runAll();
  written();
  cellar->vendor().answerLast({QXValue(broken)});
  EXPECT_EQ(written(), (Lines{"fault: [ERROR] Proxy failed to start providing item at URL " + text +
                                  " for extension com.orvane.cellar. Error: TestDomain 7: broken",
                              "~ read", "~ cancel 3"}));
  EXPECT_EQ(outcomes, std::vector<std::optional<QXError>>{DVPluginOperationFailedError(broken)});
}

TEST_F(ReadsTest, ADeliveryThatFailsAfterTheAnswerReachesTheReadASecondTime) {
  read(kReader);
  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  platform.queues.runAll();
  cellar->vendor().answerLast({QXValue()});
  cellar->vendor().failLastDelivery(lost);
  EXPECT_EQ(outcomes, (std::vector<std::optional<QXError>>{std::nullopt, DVPluginOperationFailedError(lost)}));
}

TEST_F(ReadsTest, AnAnswerThatComesAfterItsMessageWasTakenForLostReachesTheReadASecondTime) {
  read(kReader);
  cellar->vendor().failLastDelivery(lost);
  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  platform.queues.runAll();
  EXPECT_EQ(asked(), (Texts{kIdentifierOperation, kStartOperation}));
  cellar->vendor().answerLast({QXValue()});
  EXPECT_EQ(outcomes, (std::vector<std::optional<QXError>>{DVPluginOperationFailedError(lost), std::nullopt}));
}

TEST_F(ReadsTest, AReadThatNobodyWaitsForIsTolerated) {
  provider->_provideItemAtURL(*url, kReader, /*completionHandler=*/{});
  cellar->vendor().answerLast({QXValue(), QXValue("item-7")});
  platform.queues.runAll();
  EXPECT_EQ(asked(), (Texts{kIdentifierOperation, kStartOperation}));
  cellar->vendor().answerLast({QXValue()});

  provider->_provideItemAtURL(*url, kReader, /*completionHandler=*/{});
  provider->setIdentifier(ProviderID{kAttic});
  written();
  cellar->vendor().answerLast({QXValue(broken), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(asked(), (Texts{kIdentifierOperation, kStartOperation, kIdentifierOperation}));
  const Lines lines = written();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_EQ(lines[1], Line("fault: [ERROR] Could not provide item at URL " + text + " from extension com.orvane.attic to reader " +
                           "reader-5. Error: " + DVPluginOperationFailedError(broken).description()))
      << "and named as it is now";
}

}  // namespace
}  // namespace docuvend
