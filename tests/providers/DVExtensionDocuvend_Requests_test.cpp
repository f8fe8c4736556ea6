#include "common/DVErrors.h"
#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

const char* const kRequestOneNoContext =
    "fault: [ERROR] Could not get extension context for request identifier 00000000-0000-0000-0000-000000000001";

// Answers a begin request with both a request and an error.
class UndecidedExtension : public FakeExtension {
 public:
  using FakeExtension::FakeExtension;

  void beginExtensionRequest(BeginCompletion completion) override { completion(uuid(1), QXError::make("TestDomain", 7, "broken")); }
};

class RequestsTest : public ProvidersTest {
 protected:
  struct Call {
    std::optional<QXError> error;
    bool hasProxy;
    DVExtensionDocuvend::FinishHandler finish;
  };

  RequestsTest() {
    extension = install(kCellar);
    provider = DVExtensionDocuvend::initWithExtension(extension);
  }

  // A handler that records its calls, and marks them in the log.
  DVExtensionDocuvend::RequestHandler recorder() {
    return [this](std::optional<QXError> error, std::optional<DVExtensionDocuvend::VendorProxy> proxy,
                  DVExtensionDocuvend::FinishHandler finish) {
      trace("handler");
      calls.push_back({error, proxy.has_value(), std::move(finish)});
      lastProxy = std::move(proxy);
    };
  }

  std::shared_ptr<TracingExtension> extension;
  std::shared_ptr<DVExtensionDocuvend> provider;
  std::vector<Call> calls;
  std::optional<DVExtensionDocuvend::VendorProxy> lastProxy;
};

TEST_F(RequestsTest, AnAnsweredRequestHandsOutTheProxy) {
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].error, std::nullopt);
  EXPECT_TRUE(calls[0].hasProxy);
  EXPECT_EQ(written(), (Lines{"~ begin", "debug: [DEBUG] Beginning extension request.", "~ handler"}));
}

TEST_F(RequestsTest, TheProxySpeaksToTheExtension) {
  provider->performExtensionRequest(recorder());
  ASSERT_TRUE(lastProxy);
  lastProxy->call<&_QXDocuvendVendor::_itemChangedAtURL>(file("/a"), [](std::optional<QXError>) {});
  EXPECT_EQ(extension->vendor().operationNames(), Texts{"_itemChangedAtURL:completion:"});
}

TEST_F(RequestsTest, TheHandlerRunsWhenTheHostAnswersAndOnNoQueue) {
  extension->holdBegins();
  provider->performExtensionRequest(recorder());
  EXPECT_EQ(written(), Lines{"~ begin"}) << "nothing is said before the host answers";
  EXPECT_EQ(platform.queues.pending(), 0U);
  extension->answerHeldBegin(FakeExtension::uuid(1));
  EXPECT_EQ(calls.size(), 1U);
  EXPECT_EQ(platform.queues.pending(), 0U);
}

TEST_F(RequestsTest, ARequestThatCannotBeginCallsTheHandlerOnceWithTheHostsError) {
  extension->failBegins(broken);
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].error, broken);
  EXPECT_FALSE(calls[0].hasProxy);
  EXPECT_EQ(written(), (Lines{"~ begin", "debug: [DEBUG] Beginning extension request.",
                              "fault: [ERROR] Extension request failed. Error: TestDomain 7: broken", "~ handler"}));
}

TEST_F(RequestsTest, TheFinishHandlerOfARequestThatCouldNotBeginIsThereAndHasNothingToCancel) {
  extension->failBegins(broken);
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  ASSERT_TRUE(calls[0].finish);
  calls[0].finish();
  EXPECT_TRUE(extension->cancelled().empty());
}

TEST_F(RequestsTest, AnErrorBesideARequestWinsAndTheRequestCanBeFinished) {
  const auto undecided = std::make_shared<UndecidedExtension>(kCellar);
  provider->setExtension(undecided);
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].error, broken);
  EXPECT_FALSE(calls[0].hasProxy);
  EXPECT_EQ(written(), (Lines{"debug: [DEBUG] Beginning extension request.",
                              "fault: [ERROR] Extension request failed. Error: TestDomain 7: broken", "~ handler"}));
  calls[0].finish();
  EXPECT_EQ(undecided->cancelled(), std::vector{FakeExtension::uuid(1)});
}

TEST_F(RequestsTest, ARequestWithoutContextCallsTheHandlerOnceWithProxyNotFound) {
  extension->setHasContexts(false);
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].error, DVProxyNotFoundError(ProviderID{kCellar}));
  EXPECT_FALSE(calls[0].hasProxy);
  EXPECT_EQ(written(), (Lines{"~ begin", "debug: [DEBUG] Beginning extension request.", kRequestOneNoContext,
                              "fault: [ERROR] Could not get proxy object for a request.", "~ handler"}));
}

TEST_F(RequestsTest, ProxyNotFoundNamesThePresentIdentifier) {
  extension->setHasContexts(false);
  provider->setIdentifier(ProviderID{kAttic});
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].error, DVProxyNotFoundError(ProviderID{kAttic}));
}

TEST_F(RequestsTest, ARequestWithoutContextCanBeFinished) {
  extension->setHasContexts(false);
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  calls[0].finish();
  EXPECT_EQ(extension->cancelled(), std::vector{FakeExtension::uuid(1)});
}

TEST_F(RequestsTest, FinishingCancelsExactlyTheRequestThatTheHostGave) {
  extension->answerBeginsWith(FakeExtension::uuid(77));
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_TRUE(extension->cancelled().empty()) << "the request is ended by its handler alone";
  calls[0].finish();
  EXPECT_EQ(extension->cancelled(), std::vector{FakeExtension::uuid(77)});
}

TEST_F(RequestsTest, FinishingCancelsAtTheExtensionThatTheProviderHasThen) {
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 1U);
  const auto updated = install(kCellar, 2);
  provider->setExtension(updated);
  calls[0].finish();
  EXPECT_TRUE(extension->cancelled().empty());
  EXPECT_EQ(updated->cancelled(), std::vector{FakeExtension::uuid(1)});
}

TEST_F(RequestsTest, ARequestBeginsAtTheExtensionThatTheProviderHasNow) {
  const auto updated = install(kCellar, 2);
  provider->setExtension(updated);
  provider->performExtensionRequest(recorder());
  EXPECT_EQ(extension->beginCount(), 0);
  EXPECT_EQ(updated->beginCount(), 1);
}

TEST_F(RequestsTest, TheContextIsAskedOfTheExtensionThatTheProviderHasWhenTheRequestIsAnswered) {
  extension->holdBegins();
  provider->performExtensionRequest(recorder());
  provider->setExtension(install(kCellar, 2));
  extension->answerHeldBegin(FakeExtension::uuid(1));
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].error, DVProxyNotFoundError(ProviderID{kCellar})) << "the new extension knows no such request";
  EXPECT_FALSE(calls[0].hasProxy);
}

TEST_F(RequestsTest, AMessageThatCannotBeDeliveredCallsTheHandlerASecondTimeWithTheSameFinishHandler) {
  provider->performExtensionRequest(recorder());
  ASSERT_TRUE(lastProxy);
  lastProxy->call<&_QXDocuvendVendor::_itemChangedAtURL>(file("/a"), [](std::optional<QXError>) { ADD_FAILURE(); });
  written();
  extension->vendor().failLastDelivery(lost);
  ASSERT_EQ(calls.size(), 2U);
  EXPECT_EQ(calls[1].error, lost);
  EXPECT_FALSE(calls[1].hasProxy);
  EXPECT_EQ(written(),
            (Lines{"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 8: lost", "~ handler"}));
  calls[1].finish();
  EXPECT_EQ(extension->cancelled(), std::vector{FakeExtension::uuid(1)});
}

TEST_F(RequestsTest, AProxyWithoutContextIsNoneAndLeavesTheErrorHandlerAlone) {
  const auto proxy = provider->proxyForIdentifier(FakeExtension::uuid(1), [](const QXError&) { ADD_FAILURE(); });
  EXPECT_FALSE(proxy);
  EXPECT_EQ(written(), Lines{kRequestOneNoContext});
}

TEST_F(RequestsTest, AProxysErrorHandlerHearsOfEveryFailedMessageAfterTheLog) {
  provider->performExtensionRequest(recorder());
  const auto proxy = provider->proxyForIdentifier(FakeExtension::uuid(1), [this](const QXError& error) { trace(error.description()); });
  ASSERT_TRUE(proxy);
  written();
  proxy->call<&_QXDocuvendVendor::_itemChangedAtURL>(file("/a"), [](std::optional<QXError>) {});
  proxy->call<&_QXDocuvendVendor::_itemChangedAtURL>(file("/b"), [](std::optional<QXError>) {});
  extension->vendor().failDelivery(0, lost);
  extension->vendor().failDelivery(1, broken);
  EXPECT_EQ(written(), (Lines{"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 8: lost",
                              "~ TestDomain 8: lost",
                              "fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 7: broken",
                              "~ TestDomain 7: broken"}));
  EXPECT_EQ(calls.size(), 1U) << "each proxy has an error handler of its own";
}

TEST_F(RequestsTest, AProxyWithoutErrorHandlerOnlyLogs) {
  provider->performExtensionRequest(recorder());
  const auto proxy = provider->proxyForIdentifier(FakeExtension::uuid(1), /*errorHandler=*/{});
  ASSERT_TRUE(proxy);
  written();
  proxy->call<&_QXDocuvendVendor::_itemChangedAtURL>(file("/a"), [](std::optional<QXError>) {});
  extension->vendor().failLastDelivery(lost);
  EXPECT_EQ(written(), Lines{"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 8: lost"});
}

TEST_F(RequestsTest, RequestsOfOneProviderAreIndependent) {
  provider->performExtensionRequest(recorder());
  provider->performExtensionRequest(recorder());
  ASSERT_EQ(calls.size(), 2U);
  calls[1].finish();
  EXPECT_EQ(extension->cancelled(), std::vector{FakeExtension::uuid(2)});
  calls[0].finish();
  EXPECT_EQ(extension->cancelled(), (std::vector{FakeExtension::uuid(2), FakeExtension::uuid(1)}));
}

TEST_F(RequestsTest, ARequestThatIsUnderWayKeepsTheProviderAlive) {
  extension->holdBegins();
  provider->performExtensionRequest(recorder());
  const std::weak_ptr<DVExtensionDocuvend> weak = provider;
  provider.reset();
  EXPECT_FALSE(weak.expired());
  extension->answerHeldBegin(FakeExtension::uuid(1));
  EXPECT_EQ(calls.size(), 1U);
}

}  // namespace
}  // namespace docuvend
