#include <gmock/gmock.h>

#include <algorithm>
#include <chrono>

#include "providers/_QXDocuvendExtensionHostContext.h"
#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

using fake_platform::kFakeGlobalQueueLabel;

const std::string kConcurrentQueue = "DVExtensionDocuvend concurrent queue";
const std::string kRefreshQueue = "DVExtensionDocuvend refresh operations queue";

class RegistryTest : public ProvidersTest {
 protected:
  DVExtensionDocuvend::Completion recorder(const std::string& name) {
    return [this, name] {
      completions.push_back(name);
      labels.push_back(platform.queues.currentLabel());
    };
  }
  std::shared_ptr<DVExtensionDocuvend> makeProvider(const std::shared_ptr<FakeExtension>& extension) {
    return DVExtensionDocuvend::initWithExtension(extension);
  }
  void passRetryPause() {
    platform.queues.advance(std::chrono::seconds(2));
    platform.queues.runAll();
  }

  Texts completions;
  Texts labels;
};

TEST_F(RegistryTest, BeforeDiscoveryAllLookupsAnswerNone) {
  EXPECT_EQ(DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar}), nullptr);
  EXPECT_TRUE(DVExtensionDocuvend::providersInfo().empty());
  EXPECT_EQ(DVExtensionDocuvend::providerForURL(FakePlatform::itemURL(kCellar, "a")), nullptr);
  EXPECT_TRUE(platform.extensionHost.begun().empty());
  EXPECT_EQ(written(), Lines{});
}

TEST_F(RegistryTest, TheLookupsQueueIsConcurrentThePassesOneSerialAndBothAreLabelledAndMadeOnce) {
  discover({});
  EXPECT_TRUE(DVExtensionDocuvend::providersInfo().empty());
  EXPECT_THAT(platform.queues.createdQueues(), testing::UnorderedElementsAre(FakeCreatedQueue{FakeQueueKind::concurrent, kConcurrentQueue},
                                                                             FakeCreatedQueue{FakeQueueKind::serial, kRefreshQueue}));
}

TEST_F(RegistryTest, TheFirstCallBeginsOneMatchOfTheExtensionPoint) {
  DVExtensionDocuvend::createInstancesCompletion(recorder("first"));
  ASSERT_EQ(platform.extensionHost.begun().size(), 1U);
  const auto& begun = platform.extensionHost.begun()[0];
  EXPECT_EQ(begun.attributes, (QXExtensionHost::Attributes{{"QXExtensionPointName", "com.orvane.docuvend-nonui"}}));
  EXPECT_EQ(begun.hostInterface, &_QXDocuvendExtensionHostContext::_extensionAuxiliaryHostProtocol());
  EXPECT_EQ(begun.vendorInterface, &_QXDocuvendExtensionHostContext::_extensionAuxiliaryVendorProtocol());
  EXPECT_EQ(platform.queues.runAll(), 0U) << "the completion waits for the first pass";
  EXPECT_TRUE(completions.empty());
}

TEST_F(RegistryTest, ThePassOfAMatchThatAnswersBeforeItsBeginningIsOverFindsTheFirstCompletion) {
  platform.extensionHost.onBeginMatching([this] {
    platform.extensionHost.deliver();
    platform.queues.runAll();
  });
  DVExtensionDocuvend::createInstancesCompletion(recorder("first"));
  EXPECT_EQ(completions, Texts{"first"});
}

TEST_F(RegistryTest, TheMatchIsNeverEnded) {
  discover({});
  EXPECT_EQ(platform.extensionHost.liveMatchCount(), 1U);
}

TEST_F(RegistryTest, TheFirstCompletionRunsOnceAfterEveryProviderOfTheFirstPassWasRegistered) {
  DVExtensionDocuvend::createInstancesCompletion([this] {
    completions.push_back("first");
    EXPECT_EQ(platform.fileCoordinator.providers().size(), 2U);
    EXPECT_EQ(platform.queues.currentLabel(), kFakeGlobalQueueLabel);
  });
  platform.extensionHost.setExtensions({installReady(kCellar), installReady(kAttic)});
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"first"});
  platform.extensionHost.setExtensions({});
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"first"});
}

TEST_F(RegistryTest, TheFirstCompletionIsLetGoWhenItHasRun) {
  auto held = std::make_shared<int>();
  const std::weak_ptr<int> watched = held;
  DVExtensionDocuvend::createInstancesCompletion([held = std::move(held)] {});
  EXPECT_FALSE(watched.expired());
  platform.extensionHost.deliver();
  platform.queues.runAll();
  EXPECT_TRUE(watched.expired());
}

TEST_F(RegistryTest, TheFirstCompletionRunsAfterTheRefreshQueueWasResumed) {
  DVExtensionDocuvend::createInstancesCompletion([this] {
    completions.push_back("first");
    EXPECT_EQ(platform.queues.suspendedCount(kRefreshQueue), 0U);
  });
  platform.extensionHost.deliver();
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"first"});
}

TEST_F(RegistryTest, ALaterCallIsAnsweredOnTheGlobalQueueWhileTheFirstPassIsUnderWay) {
  const auto cellar = install(kCellar);
  DVExtensionDocuvend::createInstancesCompletion(recorder("first"));
  platform.extensionHost.setExtensions({cellar});
  platform.queues.runAll();
  DVExtensionDocuvend::createInstancesCompletion(recorder("second"));
  EXPECT_TRUE(completions.empty()) << "never inside the call";
  EXPECT_EQ(platform.queues.pendingOnGlobalQueue(), 1U);
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"second"});
  EXPECT_EQ(labels, Texts{kFakeGlobalQueueLabel});
  EXPECT_EQ(platform.extensionHost.begun().size(), 1U) << "discovery is not begun again";
  cellar->vendor().answerLast({QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(completions, (Texts{"second", "first"}));
}

TEST_F(RegistryTest, ALaterCallBeforeTheFirstPassLeavesTheFirstCompletionInPlace) {
  DVExtensionDocuvend::createInstancesCompletion(recorder("first"));
  DVExtensionDocuvend::createInstancesCompletion(recorder("second"));
  platform.extensionHost.deliver();
  platform.queues.runAll();
  std::sort(completions.begin(), completions.end());
  EXPECT_EQ(completions, (Texts{"first", "second"}));
}

TEST_F(RegistryTest, CompletionsMayBeAbsent) {
  DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{});
  DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{});
  EXPECT_EQ(platform.queues.pending(), 0U);
  platform.extensionHost.setExtensions({installReady(kCellar)});
  platform.queues.runAll();
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 1U);
  EXPECT_EQ(platform.queues.suspendedCount(kRefreshQueue), 0U);
}

TEST_F(RegistryTest, RegisteringNobodySubmitsTheCompletionToTheGlobalQueue) {
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders({}, recorder("done"));
  EXPECT_TRUE(completions.empty());
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"done"});
  EXPECT_EQ(labels, Texts{kFakeGlobalQueueLabel});
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders({}, /*completion=*/{});
  EXPECT_EQ(platform.queues.pending(), 0U);
}

TEST_F(RegistryTest, ProvidersAreRegisteredStrictlyOneAfterAnother) {
  const auto cellar = install(kCellar);
  const auto attic = install(kAttic);
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders({makeProvider(cellar), makeProvider(attic)}, recorder("done"));
  platform.queues.runAll();
  EXPECT_EQ(cellar->beginCount(), 1);
  EXPECT_EQ(attic->beginCount(), 0);
  cellar->vendor().answerLast({QXValue(), QXValue(), QXValue()});
  EXPECT_EQ(attic->beginCount(), 0) << "not before the registration itself";
  platform.queues.runAll();
  EXPECT_EQ(attic->beginCount(), 1);
  EXPECT_TRUE(completions.empty());
  attic->vendor().answerLast({QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"done"});
  EXPECT_EQ(labels, Texts{kFakeGlobalQueueLabel});
}

TEST_F(RegistryTest, EachProviderHasThreeTries) {
  const auto cellar = install(kCellar);
  cellar->failBegins(broken);
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders({makeProvider(cellar)}, recorder("done"));
  passRetryPause();
  EXPECT_TRUE(completions.empty());
  passRetryPause();
  EXPECT_EQ(completions, Texts{"done"});
  EXPECT_EQ(cellar->beginCount(), 3);
}

TEST_F(RegistryTest, OfThreeProvidersWhoseFirstFailsTheOthersAreStillRegisteredInOrder) {
  const auto cellar = installReady(kCellar);
  const auto attic = installReady(kAttic);
  const auto shed = installReady(kShed);
  cellar->failBegins(broken);
  const auto second = makeProvider(attic);
  const auto third = makeProvider(shed);
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders({makeProvider(cellar), second, third}, recorder("done"));
  passRetryPause();
  EXPECT_EQ(attic->beginCount(), 0);
  passRetryPause();
  EXPECT_EQ(platform.fileCoordinator.providers(), (std::vector<std::shared_ptr<QXDocuvend>>{second, third}));
  EXPECT_EQ(completions, Texts{"done"});
  const Lines lines = written();
  const auto isFailure = [](const Line& line) { return line.text().find("Could not register") != std::string::npos; };
  EXPECT_EQ(std::count_if(lines.begin(), lines.end(), isFailure), 1);
  const auto failure = std::find_if(lines.begin(), lines.end(), isFailure);
  ASSERT_LT(failure, lines.end() - 1);
  EXPECT_EQ(Lines(failure, failure + 2), (Lines{"fault: [ERROR] Could not register docuvend com.orvane.cellar. Error: TestDomain 7: broken",
                                                "debug: [DEBUG] -[DVExtensionDocuvend registerWithFileCoordinatorRetryCount:completion:]"}))
      << "the failure is logged, and then the next one's turn comes";
}

TEST_F(RegistryTest, AProviderThatReportsTwiceDoesNotRegisterTheRestTwice) {
  const auto cellar = install(kCellar);
  const auto attic = installReady(kAttic);
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders({makeProvider(cellar), makeProvider(attic)}, recorder("done"));
  cellar->vendor().failDelivery(0, lost);
  cellar->vendor().answer(0, {QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(completions, Texts{"done"});
  cellar->failBegins(broken);
  passRetryPause();
  passRetryPause();
  EXPECT_EQ(cellar->beginCount(), 3);
  EXPECT_EQ(attic->beginCount(), 1);
  EXPECT_EQ(completions, Texts{"done"});
  const Lines lines = written();
  EXPECT_EQ(lines.back(), "fault: [ERROR] Could not register docuvend com.orvane.cellar. Error: TestDomain 7: broken")
      << "the second report is not lost";
}

TEST_F(RegistryTest, ALookupFindsExactlyTheProviderOfTheIdentifier) {
  const auto cellar = installReady(kCellar);
  discover({cellar, installReady(kAttic)});
  const auto found = DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar});
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->extension(), cellar);
  EXPECT_EQ(DVExtensionDocuvend::providerWithIdentifier(ProviderID{kShed}), nullptr);
  EXPECT_EQ(DVExtensionDocuvend::providerWithIdentifier(ProviderID{"com.orvane.Cellar"}), nullptr);
}

TEST_F(RegistryTest, TheInfoNamesEachProvidersDirectoryAndIdentifier) {
  discover({installReady(kCellar), installReady(kAttic)});
  const QXDictionary expected = {
      {kCellar, QXDictionary{{"documentStorageURL", FakePlatform::storageURL(kCellar)}, {"providerIdentifier", kCellar}}},
      {kAttic, QXDictionary{{"documentStorageURL", FakePlatform::storageURL(kAttic)}, {"providerIdentifier", kAttic}}}};
  EXPECT_EQ(DVExtensionDocuvend::providersInfo(), expected);
}

TEST_F(RegistryTest, TheInfoOfAProviderWithoutDirectoryIsEmpty) {
  discover({std::make_shared<TracingExtension>(platform, kCellar, 1)});
  EXPECT_EQ(DVExtensionDocuvend::providersInfo(), (QXDictionary{{kCellar, QXDictionary{}}}));
}

// Has an identifier when it is discovered, and none later.
class ForgetfulExtension : public TracingExtension {
 public:
  using TracingExtension::TracingExtension;
  [[nodiscard]] std::optional<std::string> identifier() const override {
    if (hasForgotten) return std::nullopt;
    return TracingExtension::identifier();
  }
  bool hasForgotten = false;
};

TEST_F(RegistryTest, TheInfoOfAProviderWithoutIdentifierHoldsTheDirectoryAlone) {
  platform.installProviderBundle(kCellar);
  const auto forgetful = std::make_shared<ForgetfulExtension>(platform, kCellar, 1);
  discover({forgetful});
  forgetful->hasForgotten = true;
  DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar})->setIdentifier(std::nullopt);
  EXPECT_EQ(DVExtensionDocuvend::providersInfo(),
            (QXDictionary{{kCellar, QXDictionary{{"documentStorageURL", FakePlatform::storageURL(kCellar)}}}}));
}

TEST_F(RegistryTest, TheInfoIsKeyedByTheRegistrysKey) {
  discover({installReady(kCellar)});
  DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar})->setIdentifier(ProviderID{kShed});
  const QXDictionary expected = {
      {kCellar, QXDictionary{{"documentStorageURL", FakePlatform::storageURL(kCellar)}, {"providerIdentifier", kShed}}}};
  EXPECT_EQ(DVExtensionDocuvend::providersInfo(), expected);
}

}  // namespace
}  // namespace docuvend
