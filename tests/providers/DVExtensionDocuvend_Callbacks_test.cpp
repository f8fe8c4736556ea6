#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

const QXCoordinationID kWriter{"writer-3"};
const char* const kMethod = "debug: [DEBUG] -[DVExtensionDocuvend itemChangedAtURL:]";
const char* const kBeginning = "debug: [DEBUG] Beginning extension request.";

class CallbacksTest : public ProvidersTest {
 protected:
  CallbacksTest() {
    cellar = installReady(kCellar);
    attic = installReady(kAttic);
    discover({cellar, attic});
    provider = DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar});
    EXPECT_TRUE(provider);
    url = FakePlatform::itemURL(kCellar, "report.txt");
    text = url->absoluteString();
    written();
  }

  std::string toldOf(const std::string& changed) {
    return "info: [INFO] QXFileCoordinator is telling us the item at URL " + changed + " was changed by writer ID writer-3.";
  }
  [[nodiscard]] Texts changesTold(FakeExtension& extension) const {
    Texts urls;
    for (const auto& message : extension.vendor().messages()) {
      if (message.operation.name == "_itemChangedAtURL:completion:") urls.push_back(message.arguments.at(0).as<QXURL>()->absoluteString());
    }
    return urls;
  }

  std::shared_ptr<TracingExtension> cellar;
  std::shared_ptr<TracingExtension> attic;
  std::shared_ptr<DVExtensionDocuvend> provider;
  std::optional<QXURL> url;
  std::string text;
};

TEST_F(CallbacksTest, AChangeIsToldToTheExtensionAndItsReplyEndsTheRequestWithoutAMessage) {
  provider->itemChangedAtURL(*url);
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning}));
  EXPECT_EQ(changesTold(*cellar), Texts{text});
  cellar->vendor().answerLast({QXValue()});
  EXPECT_EQ(written(), Lines{"~ cancel 2"});
}

TEST_F(CallbacksTest, AChangeThatTheExtensionRefusesIsLoggedAndEndsTheRequest) {
  provider->itemChangedAtURL(*url);
  written();
  cellar->vendor().answerLast({QXValue(broken)});
  EXPECT_EQ(written(), (Lines{"fault: [ERROR] Could not tell extension com.orvane.cellar that item at URL " + text +
                                  " has changed. Error: TestDomain 7: broken",
                              "~ cancel 2"}));
}

TEST_F(CallbacksTest, AChangeWhoseRequestHasNoContextIsLoggedWithoutTheErrorAndEndsTheRequest) {
  cellar->setHasContexts(false);
  provider->itemChangedAtURL(*url);
  EXPECT_EQ(written(),
            (Lines{kMethod, "~ begin", kBeginning,
                   "fault: [ERROR] Could not get extension context for request identifier 00000000-0000-0000-0000-000000000002",
                   "fault: [ERROR] Could not get proxy object for a request.",
                   "fault: [ERROR] Cannot tell extension com.orvane.cellar that item at URL " + text + " has changed.", "~ cancel 2"}));
}

TEST_F(CallbacksTest, AChangeWhoseRequestCannotBeginIsLoggedWithoutTheError) {
  cellar->failBegins(broken);
  provider->itemChangedAtURL(*url);
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, "fault: [ERROR] Extension request failed. Error: TestDomain 7: broken",
                              "fault: [ERROR] Cannot tell extension com.orvane.cellar that item at URL " + text + " has changed."}));
}

TEST_F(CallbacksTest, AChangeWhoseMessageIsLostIsLoggedAndEndsTheRequest) {
  provider->itemChangedAtURL(*url);
  written();
  cellar->vendor().failLastDelivery(lost);
  EXPECT_EQ(written(),
            (Lines{"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 8: lost",
                   "fault: [ERROR] Cannot tell extension com.orvane.cellar that item at URL " + text + " has changed.", "~ cancel 2"}));
}

TEST_F(CallbacksTest, AChangeThatWasAnsweredAndThenLostIsLoggedAndItsRequestIsEndedAgain) {
  provider->itemChangedAtURL(*url);
  cellar->vendor().answerLast({QXValue()});
  written();
  cellar->vendor().failLastDelivery(lost);
  EXPECT_EQ(written(),
            (Lines{"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 8: lost",
                   "fault: [ERROR] Cannot tell extension com.orvane.cellar that item at URL " + text + " has changed.", "~ cancel 2"}));
  EXPECT_EQ(cellar->cancelled(), (std::vector{FakeExtension::uuid(1), FakeExtension::uuid(2), FakeExtension::uuid(2)}));
}

TEST_F(CallbacksTest, TheLinesOfAChangeNameTheProviderAsItIsWhenTheyAreWritten) {
  provider->itemChangedAtURL(*url);
  provider->setIdentifier(ProviderID{kShed});
  written();
  cellar->vendor().answerLast({QXValue(broken)});
  EXPECT_EQ(written().front(), Line("fault: [ERROR] Could not tell extension com.orvane.shed that item at URL " + text +
                                    " has changed. Error: TestDomain 7: broken"));
  cellar->failBegins(broken);
  provider->itemChangedAtURL(*url);
  EXPECT_EQ(written().back(), Line("fault: [ERROR] Cannot tell extension com.orvane.shed that item at URL " + text + " has changed."));
}

TEST_F(CallbacksTest, AFinishedWriteIsToldToTheProviderThatOwnsTheURL) {
  provider->_writerWithID(kWriter, *url);
  EXPECT_EQ(written(), (Lines{toldOf(text), "info: [INFO] Resolved URL to provider com.orvane.cellar.",
                              "debug: [DEBUG] The item at URL " + text + " is provided by the etxension com.orvane.cellar", kMethod,
                              "~ begin", kBeginning}));
  EXPECT_EQ(changesTold(*cellar), Texts{text});
}

TEST_F(CallbacksTest, TheOwnerIsLookedUpAfreshWhateverObjectHeardOfTheWrite) {
  const QXURL other = FakePlatform::itemURL(kAttic, "list.txt");
  provider->_writerWithID(kWriter, other);
  EXPECT_EQ(changesTold(*cellar), Texts{});
  EXPECT_EQ(changesTold(*attic), Texts{other.absoluteString()});
}

TEST_F(CallbacksTest, AFinishedWriteToAURLOfNobodyIsLoggedAndForwardedToNobody) {
  const int begins = cellar->beginCount() + attic->beginCount();
  provider->_writerWithID(kWriter, file("/nowhere/a"));
  EXPECT_EQ(written(), (Lines{toldOf("file:///nowhere/a"),
                              "fault: [ERROR] Could not find any extension that provides an item at URL file:///nowhere/a"}));
  EXPECT_EQ(cellar->beginCount() + attic->beginCount(), begins);
}

TEST_F(CallbacksTest, AFinishedWriteToTheDirectoryItselfIsForwardedToNobodyAndNoError) {
  const int begins = cellar->beginCount() + attic->beginCount();
  const QXURL root = FakePlatform::storageURL(kCellar);
  provider->_writerWithID(kWriter, root);
  EXPECT_EQ(written(),
            (Lines{toldOf(root.absoluteString()), "debug: [DEBUG] Ignoring URLs that exactly match the document container folder"}));
  EXPECT_EQ(cellar->beginCount() + attic->beginCount(), begins);
}

TEST_F(CallbacksTest, FileCoordinationReachesTheCallbackThroughItsOwnProtocol) {
  const auto registered = platform.fileCoordinator.providers();
  ASSERT_EQ(registered.size(), 2U);
  EXPECT_EQ(registered[0]->_fileReactorID(), kCellar);
  EXPECT_EQ(registered[0]->_providedItemsURL(), FakePlatform::storageURL(kCellar));
  registered[0]->_writerWithID(kWriter, *url);
  EXPECT_EQ(changesTold(*cellar), Texts{text});
}

}  // namespace
}  // namespace docuvend
