// What the log tells of each operation that succeeds, from its first line to its last: the lines of the store and of the providers' room
// too, which the other tests of this room pass over.
#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogEntry;
using fake_platform::FakeSandbox;

class WholeLog : public ServicerFixture {
 protected:
  void SetUp() override {
    registerProviders();
    entitle(kDVWriteEntitlement);
    platform_.sandbox.setAnswer(FakeSandbox::kAllowed);
    answerItemID(*cellar_, /*error=*/std::nullopt, kItem.value);
    answerURL(*cellar_, /*error=*/std::nullopt, kReport);
  }

  void succeed(const char* message, QXArray answer) {
    cellar_->vendor().respond(message, [answer = std::move(answer)](const QXArray&) { return answer; });
  }
  // What granting logged is forgotten.
  void grantToEditor() {
    grant(kCellar, kItem, kEditor);
    platform_.log.clear();
  }
  [[nodiscard]] Entries whole() const { return platform_.log.entries(); }

  static FakeLogEntry debug(const std::string& text) { return {QXLogType::debug, "[DEBUG] " + text}; }
  static FakeLogEntry info(const std::string& text) { return {QXLogType::info, "[INFO] " + text}; }

  const std::string kURL = kReport.absoluteString();
  const FakeLogEntry kResolved = info("Resolved URL to provider com.orvane.cellar.");
  const FakeLogEntry kBeginning = debug("Beginning extension request.");
  const FakeLogEntry kAsksForItem = debug("-[DVExtensionDocuvend itemIDForURL:completionHandler:]");
  const FakeLogEntry kHasItem = debug("Successfully got item ID “item 7” for URL " + kURL + " from extension com.orvane.cellar");
  const FakeLogEntry kCommitting = info("Committing access control list");
};

TEST_F(WholeLog, OfAWakeUp) {
  servicer_->wakeUpCompletion([] {});
  platform_.queues.runAll();
  EXPECT_EQ(whole(), Entries{debug("Serving: wakeUpCompletion:")});
}

TEST_F(WholeLog, OfASandboxGrant) {
  servicer_->extendSandboxForFileURL(kReport, kCellar, kEditor, sandboxReply());
  EXPECT_EQ(whole(),
            (Entries{debug("Serving: extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:"), kAsksForItem, kBeginning,
                     kHasItem, info("Allowing provider ID com.orvane.cellar to provide item ID “item 7” to consumer ID com.example.editor"),
                     kCommitting, kResolved,
                     info("Successfully extended sandbox for URL " + kURL +
                          " from provider ID com.orvane.cellar to consumer ID com.example.editor.")}));
}

TEST_F(WholeLog, OfAPlaceholder) {
  succeed("_providePlaceholderAtURL:completion:", {QXValue(), QXValue()});
  grantToEditor();
  servicer_->providePlaceholderForItemAtURL(kReport, kCellar, kEditor, errorReply());
  EXPECT_EQ(whole(),
            (Entries{debug("Serving: providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:"), kAsksForItem,
                     kBeginning, kHasItem, debug("-[DVExtensionDocuvend providePlaceholderForItemAtURL:completionHandler:]"), kBeginning,
                     debug("Successfully provided placeholder at URL " + kURL + " for extension com.orvane.cellar.")}));
}

TEST_F(WholeLog, OfTheStartOfProviding) {
  succeed("_startProvidingItemAtURL:completion:", {QXValue()});
  grantToEditor();
  servicer_->startProvidingItemAtURL(kReport, kCellar, kEditor, errorReply());
  EXPECT_EQ(whole(),
            (Entries{debug("Serving: startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"), kResolved, kAsksForItem,
                     kBeginning, kHasItem, debug("-[DVExtensionDocuvend startProvidingItemAtURL:completionHandler:]"), kBeginning,
                     debug("Successfully provided item at URL " + kURL + " for extension com.orvane.cellar.")}));
}

TEST_F(WholeLog, OfTheEndOfProviding) {
  succeed("_stopProvidingItemAtURL:completion:", {QXValue()});
  servicer_->stopProvidingItemAtURL(kReport, kCellar, kEditor, errorReply());
  EXPECT_EQ(whole(), (Entries{debug("Serving: stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"), kResolved,
                              debug("-[DVExtensionDocuvend stopProvidingItemAtURL:completionHandler:]"), kBeginning,
                              debug("Successfully stopped providing item at URL " + kURL + " for extension com.orvane.cellar.")}));
}

TEST_F(WholeLog, OfAListing) {
  platform_.extensionHost.setExtensions({});
  platform_.queues.runAll();
  platform_.log.clear();
  servicer_->providersCompletionHandler(providersReply());
  platform_.queues.runAll();
  EXPECT_EQ(whole(),
            (Entries{debug("Serving: providersCompletionHandler:"), debug("providersCompletionHandler:: returning providers {}")}));
}

TEST_F(WholeLog, OfABookmarkGrant) {
  servicer_->extendBookmarkForFileURL(kReport, kStranger, stringReply());
  EXPECT_EQ(
      whole(),
      (Entries{debug("Extending bookmark privileges for URL: “" + kURL + "” from bundle com.example.editor to com.example.stranger."),
               kResolved, kAsksForItem, kBeginning, kHasItem,
               info("Allowing provider ID com.orvane.cellar to provide item ID “item 7” to consumer ID com.example.stranger"), kCommitting,
               debug("Successfully generated bookmarkable string “docuvend:com.orvane.cellar/item 7” from URL " + kURL + ".")}));
}

TEST_F(WholeLog, OfAStringForAURL) {
  servicer_->bookmarkableStringFromDocumentURL(kReport, stringReply());
  EXPECT_EQ(whole(),
            (Entries{debug("Getting bookmarkable string for URL " + kURL), kResolved, kAsksForItem, kBeginning, kHasItem,
                     debug("Successfully generated bookmarkable string “docuvend:com.orvane.cellar/item 7” from URL " + kURL + ".")}));
}

TEST_F(WholeLog, OfAURLForAString) {
  grantToEditor();
  servicer_->documentURLFromBookmarkableString("docuvend:com.orvane.cellar/item 7", documentReply());
  EXPECT_EQ(whole(),
            (Entries{debug("Getting URL from bookmarkable string: “docuvend:com.orvane.cellar/item 7”."),
                     debug("-[DVExtensionDocuvend URLForItemID:completionHandler:]"), kBeginning,
                     debug("Successfully retrieved URL " + kURL + " for item ID “item 7” from extension com.orvane.cellar"), kResolved,
                     info("Successfully extended sandbox of URL " + kURL +
                          " from provider ID com.orvane.cellar to consumer ID com.example.editor.")}));
}

}  // namespace
}  // namespace docuvend
