#include <ostream>

#include "common/DVErrors.h"
#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

const std::string kURL = "file:///storage/report.txt";
const std::string kItem = "item-7";

// What the two kinds of completion have in common: the error, and the result as text.
using Outcome = std::function<void(std::optional<QXError> error, std::optional<std::string> result)>;

struct Row {
  std::string name;
  std::function<void(DVExtensionDocuvend&, const Outcome&)> call;
  std::string method;
  std::string vendorOperation;
  QXValue argument;
  QXArray success;                    // the extension's answer
  std::optional<std::string> result;  // what is passed on of it
  QXArray successWithoutValue;
  QXArray failure;  // with TestDomain 7
  std::string requestFailed;
  std::string proxyFailed;
  std::string succeeded;
  std::string succeededWithoutValue;
};

std::ostream& operator<<(std::ostream& out, const Row& row) { return out << row.name; }

DVExtensionDocuvend::ErrorCompletion errorOnly(const Outcome& outcome) {
  if (!outcome) return {};
  return [outcome](std::optional<QXError> error) { outcome(std::move(error), std::nullopt); };
}

QXURL url() { return *QXURL::fromString(kURL); }
QXValue failed() { return QXValue(QXError::make("TestDomain", 7, "broken")); }

std::vector<Row> rows() {
  using P = DVExtensionDocuvend;
  return {
      {.name = "ProvidePlaceholder",
       .call = [](P& provider, const Outcome& outcome) { provider.providePlaceholderForItemAtURL(url(), errorOnly(outcome)); },
       .method = "providePlaceholderForItemAtURL:completionHandler:",
       .vendorOperation = "_providePlaceholderAtURL:completion:",
       .argument = url(),
       .success = {QXValue(url()), QXValue()},
       .result = std::nullopt,
       .successWithoutValue = {QXValue(), QXValue()},
       .failure = {QXValue(), failed()},
       .requestFailed =
           "Cannot provide placeholder for item at URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .proxyFailed =
           "Proxy failed to provide placeholder at URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .succeeded = "Successfully provided placeholder at URL " + kURL + " for extension com.orvane.cellar.",
       .succeededWithoutValue = "Successfully provided placeholder at URL " + kURL + " for extension com.orvane.cellar."},
      {.name = "StartProviding",
       .call = [](P& provider, const Outcome& outcome) { provider.startProvidingItemAtURL(url(), errorOnly(outcome)); },
       .method = "startProvidingItemAtURL:completionHandler:",
       .vendorOperation = "_startProvidingItemAtURL:completion:",
       .argument = url(),
       .success = {QXValue()},
       .result = std::nullopt,
       .successWithoutValue = {QXValue()},
       .failure = {failed()},
       .requestFailed = "Cannot provide item at URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .proxyFailed =
           "Proxy failed to start providing item at URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .succeeded = "Successfully provided item at URL " + kURL + " for extension com.orvane.cellar.",
       .succeededWithoutValue = "Successfully provided item at URL " + kURL + " for extension com.orvane.cellar."},
      {.name = "StopProviding",
       .call = [](P& provider, const Outcome& outcome) { provider.stopProvidingItemAtURL(url(), errorOnly(outcome)); },
       .method = "stopProvidingItemAtURL:completionHandler:",
       .vendorOperation = "_stopProvidingItemAtURL:completion:",
       .argument = url(),
       .success = {QXValue()},
       .result = std::nullopt,
       .successWithoutValue = {QXValue()},
       .failure = {failed()},
       .requestFailed = "Cannot stop providing item at URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .proxyFailed =
           "Proxy failed to stop providing item at URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .succeeded = "Successfully stopped providing item at URL " + kURL + " for extension com.orvane.cellar.",
       .succeededWithoutValue = "Successfully stopped providing item at URL " + kURL + " for extension com.orvane.cellar."},
      {.name = "ItemIDForURL",
       .call =
           [](P& provider, const Outcome& outcome) {
             P::ItemIDCompletion completion;
             if (outcome) {
               completion = [outcome](std::optional<QXError> error, std::optional<ItemID> itemID) {
                 outcome(std::move(error), itemID ? std::optional(itemID->value) : std::nullopt);
               };
             }
             provider.itemIDForURL(url(), completion);
           },
       .method = "itemIDForURL:completionHandler:",
       .vendorOperation = "_identifierForItemAtURL:completion:",
       .argument = url(),
       .success = {QXValue(), QXValue(kItem)},
       .result = kItem,
       .successWithoutValue = {QXValue(), QXValue()},
       .failure = {failed(), QXValue(kItem)},
       .requestFailed = "Cannot get item ID for URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .proxyFailed = "Proxy failed to get item ID for URL " + kURL + " for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .succeeded = "Successfully got item ID “item-7” for URL " + kURL + " from extension com.orvane.cellar",
       .succeededWithoutValue = "Successfully got item ID “(null)” for URL " + kURL + " from extension com.orvane.cellar"},
      {.name = "URLForItemID",
       .call =
           [](P& provider, const Outcome& outcome) {
             P::URLCompletion completion;
             if (outcome) {
               completion = [outcome](std::optional<QXError> error, std::optional<QXURL> found) {
                 outcome(std::move(error), found ? std::optional(found->absoluteString()) : std::nullopt);
               };
             }
             provider.URLForItemID(ItemID{kItem}, completion);
           },
       .method = "URLForItemID:completionHandler:",
       .vendorOperation = "_URLForItemIdentifier:completion:",
       .argument = kItem,
       .success = {QXValue(), QXValue(url())},
       .result = kURL,
       .successWithoutValue = {QXValue(), QXValue()},
       .failure = {failed(), QXValue(url())},
       .requestFailed = "Cannot get URL for item ID “item-7” for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .proxyFailed = "Proxy failed to get URL for item ID “item-7” for extension com.orvane.cellar. Error: TestDomain 7: broken",
       .succeeded = "Successfully retrieved URL " + kURL + " for item ID “item-7” from extension com.orvane.cellar",
       .succeededWithoutValue = "Successfully retrieved URL (null) for item ID “item-7” from extension com.orvane.cellar"},
  };
}

class ItemsTest : public ProvidersTest, public testing::WithParamInterface<Row> {
 protected:
  struct Completed {
    std::optional<QXError> error;
    std::optional<std::string> result;
    std::string label;
  };

  ItemsTest() {
    extension = install(kCellar);
    provider = DVExtensionDocuvend::initWithExtension(extension);
  }

  Outcome recorder() {
    return [this](std::optional<QXError> error, std::optional<std::string> result) {
      trace("completion");
      completed.push_back({std::move(error), std::move(result), platform.queues.currentLabel()});
    };
  }

  [[nodiscard]] Lines opening() const {
    return {"debug: [DEBUG] -[DVExtensionDocuvend " + GetParam().method + "]", "~ begin", "debug: [DEBUG] Beginning extension request."};
  }
  // The lines of a call whose request succeeded, and then these.
  [[nodiscard]] Lines opened(const Lines& then) const {
    Lines lines = opening();
    lines.insert(lines.end(), then.begin(), then.end());
    return lines;
  }

  std::shared_ptr<TracingExtension> extension;
  std::shared_ptr<DVExtensionDocuvend> provider;
  std::vector<Completed> completed;
};

TEST_P(ItemsTest, OneMessageWithTheArgumentIsSent) {
  GetParam().call(*provider, recorder());
  ASSERT_EQ(extension->vendor().operationNames(), Texts{GetParam().vendorOperation});
  EXPECT_EQ(extension->vendor().messages()[0].arguments, QXArray{GetParam().argument});
  EXPECT_EQ(written(), opening());
  EXPECT_TRUE(completed.empty()) << "a reply that never comes leaves the completion uncalled";
  EXPECT_TRUE(extension->cancelled().empty()) << "and the request open";
}

TEST_P(ItemsTest, ASuccessIsLoggedThenPassedOnThenEndsTheRequest) {
  GetParam().call(*provider, recorder());
  extension->vendor().answerLast(GetParam().success);
  EXPECT_EQ(written(), opened({"debug: [DEBUG] " + GetParam().succeeded, "~ completion", "~ cancel 1"}));
  ASSERT_EQ(completed.size(), 1U);
  EXPECT_EQ(completed[0].error, std::nullopt);
  EXPECT_EQ(completed[0].result, GetParam().result);
}

TEST_P(ItemsTest, ASuccessWithoutValueIsPassedOnUnchanged) {
  GetParam().call(*provider, recorder());
  extension->vendor().answerLast(GetParam().successWithoutValue);
  EXPECT_EQ(written(), opened({"debug: [DEBUG] " + GetParam().succeededWithoutValue, "~ completion", "~ cancel 1"}));
  ASSERT_EQ(completed.size(), 1U);
  EXPECT_EQ(completed[0].error, std::nullopt);
  EXPECT_EQ(completed[0].result, std::nullopt);
}

TEST_P(ItemsTest, AnExtensionThatCannotBeReachedIsAFailureAndItsRequestIsLeftAlone) {
  extension->failBegins(broken);
  GetParam().call(*provider, recorder());
  EXPECT_EQ(written(), opened({"fault: [ERROR] Extension request failed. Error: TestDomain 7: broken",
                               "fault: [ERROR] " + GetParam().requestFailed, "~ completion"}));
  ASSERT_EQ(completed.size(), 1U);
  EXPECT_EQ(completed[0].error, DVPluginOperationFailedError(broken));
  EXPECT_EQ(completed[0].result, std::nullopt);
}

TEST_P(ItemsTest, AMissingProxyIsWrappedAndItsRequestIsLeftAlone) {
  extension->setHasContexts(false);
  GetParam().call(*provider, recorder());
  ASSERT_EQ(completed.size(), 1U);
  const QXError proxyNotFound = DVProxyNotFoundError(ProviderID{kCellar});
  EXPECT_EQ(completed[0].error, DVPluginOperationFailedError(proxyNotFound));
  EXPECT_EQ(completed[0].result, std::nullopt);
  std::string requestFailed = "fault: [ERROR] " + GetParam().requestFailed;
  requestFailed.replace(requestFailed.find(broken.description()), std::string::npos, proxyNotFound.description());
  EXPECT_EQ(written(), opened({"fault: [ERROR] Could not get extension context for request identifier 00000000-0000-0000-0000-000000000001",
                               "fault: [ERROR] Could not get proxy object for a request.", requestFailed, "~ completion"}));
  EXPECT_TRUE(extension->cancelled().empty());
}

TEST_P(ItemsTest, AnErrorOfTheExtensionIsWrappedWithoutResultAndEndsTheRequest) {
  GetParam().call(*provider, recorder());
  extension->vendor().answerLast(GetParam().failure);
  EXPECT_EQ(written(), opened({"fault: [ERROR] " + GetParam().proxyFailed, "~ completion", "~ cancel 1"}));
  ASSERT_EQ(completed.size(), 1U);
  EXPECT_EQ(completed[0].error, DVPluginOperationFailedError(broken));
  EXPECT_EQ(completed[0].result, std::nullopt);
}

TEST_P(ItemsTest, TheLinesNameTheProviderAsItIsWhenTheyAreWritten) {
  const auto renamed = [](std::string text) {
    const std::string usual = kCellar;
    const std::size_t place = text.find(usual);
    return place == std::string::npos ? text : text.replace(place, usual.size(), kAttic);
  };
  GetParam().call(*provider, recorder());
  provider->setIdentifier(ProviderID{kAttic});
  extension->vendor().answerLast(GetParam().success);
  EXPECT_EQ(written(), opened({"debug: [DEBUG] " + renamed(GetParam().succeeded), "~ completion", "~ cancel 1"}));
  GetParam().call(*provider, recorder());
  extension->vendor().answerLast(GetParam().failure);
  EXPECT_EQ(written(), opened({"fault: [ERROR] " + renamed(GetParam().proxyFailed), "~ completion", "~ cancel 2"}));
  extension->failBegins(broken);
  GetParam().call(*provider, recorder());
  EXPECT_EQ(written(), opened({"fault: [ERROR] Extension request failed. Error: TestDomain 7: broken",
                               "fault: [ERROR] " + renamed(GetParam().requestFailed), "~ completion"}));
}

TEST_P(ItemsTest, AnAbsentCompletionIsToleratedAndTheRequestStillEndsAfterAReply) {
  GetParam().call(*provider, /*outcome=*/{});
  extension->vendor().answerLast(GetParam().success);
  EXPECT_EQ(written(), opened({"debug: [DEBUG] " + GetParam().succeeded, "~ cancel 1"}));
  GetParam().call(*provider, /*outcome=*/{});
  extension->vendor().answerLast(GetParam().failure);
  EXPECT_EQ(written(), opened({"fault: [ERROR] " + GetParam().proxyFailed, "~ cancel 2"}));
  extension->failBegins(broken);
  GetParam().call(*provider, /*outcome=*/{});
  EXPECT_EQ(written(),
            opened({"fault: [ERROR] Extension request failed. Error: TestDomain 7: broken", "fault: [ERROR] " + GetParam().requestFailed}));
}

TEST_P(ItemsTest, AMessageThatIsLostIsAFailureThatDoesNotEndTheRequest) {
  GetParam().call(*provider, recorder());
  extension->vendor().failLastDelivery(broken);
  EXPECT_EQ(written(), opened({"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 7: broken",
                               "fault: [ERROR] " + GetParam().requestFailed, "~ completion"}));
  ASSERT_EQ(completed.size(), 1U);
  EXPECT_EQ(completed[0].error, DVPluginOperationFailedError(broken));
}

TEST_P(ItemsTest, AReplyAndALostMessageBothReachTheCompletionAndOnlyTheReplyEndsTheRequest) {
  GetParam().call(*provider, recorder());
  extension->vendor().failLastDelivery(broken);
  extension->vendor().answerLast(GetParam().success);
  extension->vendor().failLastDelivery(broken);
  ASSERT_EQ(completed.size(), 3U);
  EXPECT_EQ(completed[0].error, DVPluginOperationFailedError(broken));
  EXPECT_EQ(completed[1].error, std::nullopt);
  EXPECT_EQ(completed[1].result, GetParam().result);
  EXPECT_EQ(completed[2].error, DVPluginOperationFailedError(broken));
  EXPECT_EQ(extension->cancelled(), std::vector{FakeExtension::uuid(1)});
}

TEST_P(ItemsTest, CompletionsRunWhereTheAnswerArrivesAndOnNoQueue) {
  GetParam().call(*provider, recorder());
  platform.queues.globalQueue().async([this] { extension->vendor().answerLast(GetParam().success); });
  EXPECT_EQ(platform.queues.runAll(), 1U);
  extension->failBegins(broken);
  GetParam().call(*provider, recorder());
  ASSERT_EQ(completed.size(), 2U);
  EXPECT_EQ(completed[0].label, fake_platform::kFakeGlobalQueueLabel);
  EXPECT_EQ(completed[1].label, "");
  EXPECT_EQ(platform.queues.pending(), 0U);
}

TEST_P(ItemsTest, AConversationThatIsUnderWayKeepsTheProviderAliveAndLetsItGoAfterwards) {
  const std::weak_ptr<DVExtensionDocuvend> weak = provider;
  extension->holdBegins();
  GetParam().call(*provider, recorder());
  provider.reset();
  extension->failHeldBegin(broken);
  EXPECT_EQ(completed.size(), 1U);
  EXPECT_TRUE(weak.expired());
}

INSTANTIATE_TEST_SUITE_P(Each, ItemsTest, testing::ValuesIn(rows()),
                         [](const testing::TestParamInfo<Row>& info) { return info.param.name; });

}  // namespace
}  // namespace docuvend
