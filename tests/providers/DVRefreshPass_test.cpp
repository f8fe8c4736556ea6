#include "providers/DVRefreshPass.h"

#include <algorithm>
#include <chrono>

#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

using fake_platform::FakeFileCoordinator;
using fake_platform::kFakeGlobalQueueLabel;
using Call = FakeFileCoordinator::Call;
using Action = FakeFileCoordinator::Action;

const std::string kConcurrentQueue = "DVExtensionDocuvend concurrent queue";
const std::string kRefreshQueue = "DVExtensionDocuvend refresh operations queue";
const char* const kUpdating = "info: [INFO] Updating provider list.";

// Discovery is begun; a pass starts with `platform.extensionHost.setExtensions`.
class RefreshPassTest : public ProvidersTest {
 protected:
  RefreshPassTest() {
    DVExtensionDocuvend::createInstancesCompletion([this] { trace("started"); });
  }

  static std::shared_ptr<DVExtensionDocuvend> provider(const std::string& identifier) {
    return DVExtensionDocuvend::providerWithIdentifier(ProviderID{identifier});
  }
  void refresh(Extensions extensions) {
    platform.extensionHost.setExtensions(std::move(extensions));
    platform.queues.runAll();
  }
  [[nodiscard]] bool passIsUnderWay() const { return platform.queues.suspendedCount(kRefreshQueue) == 1; }
};

TEST_F(RefreshPassTest, APassGoesFromTheRefreshQueueOverABarrierToTheGlobalQueue) {
  platform.extensionHost.setExtensions({installReady(kCellar)});
  EXPECT_EQ(platform.queues.pending(kRefreshQueue), 1U);
  EXPECT_EQ(written(), Lines{}) << "nothing happens inside the match handler";
  EXPECT_TRUE(platform.queues.runOne(kRefreshQueue));
  EXPECT_TRUE(passIsUnderWay());
  EXPECT_EQ(written(), Lines{kUpdating});
  EXPECT_EQ(platform.queues.pending(kConcurrentQueue), 1U);
  EXPECT_TRUE(platform.queues.runOne(kConcurrentQueue));
  EXPECT_EQ(written(), Lines{});
  EXPECT_EQ(platform.queues.pendingOnGlobalQueue(), 1U);
  EXPECT_TRUE(platform.queues.runOne(kFakeGlobalQueueLabel));
  EXPECT_TRUE(passIsUnderWay());
  EXPECT_EQ(platform.queues.pendingOperations(), 1U) << "the registration";
  EXPECT_TRUE(platform.queues.runOne("Operation queue for com.orvane.cellar"));
  EXPECT_EQ(platform.queues.pendingOnGlobalQueue(), 1U) << "the end of the chain";
  EXPECT_TRUE(passIsUnderWay());
  written();
  EXPECT_TRUE(platform.queues.runOne(kFakeGlobalQueueLabel));
  EXPECT_FALSE(passIsUnderWay());
  EXPECT_EQ(written(), Lines{"~ started"});
  EXPECT_EQ(platform.queues.pending(), 0U);
}

TEST_F(RefreshPassTest, APassSuspendsItsQueueThenSaysSoAndThenAsksForTheRebuild) {
  whenWritten("[INFO] Updating provider list.", [this] {
    EXPECT_TRUE(passIsUnderWay());
    EXPECT_EQ(platform.queues.pending(kConcurrentQueue), 0U);
  });
  refresh({});
  EXPECT_EQ(looks, 1);
}

TEST_F(RefreshPassTest, ALookupAfterTheStartOfAPassSeesItsProviders) {
  platform.extensionHost.setExtensions({installReady(kCellar)});
  EXPECT_EQ(provider(kCellar), nullptr);
  EXPECT_TRUE(platform.queues.runOne(kRefreshQueue));
  EXPECT_NE(provider(kCellar), nullptr) << "the read waits for the barrier that was submitted before it";
  EXPECT_TRUE(platform.fileCoordinator.calls().empty()) << "seen before it is registered";
}

TEST_F(RefreshPassTest, TheRebuildWaitsForTheLookupThatIsRunning) {
  const auto cellar = installReady(kCellar);
  refresh({cellar});
  provider(kCellar)->setIdentifier(std::nullopt);  // so that a lookup asks the extension
  int lookups = 0;
  cellar->onIdentifier = [this, &lookups] {
    ++lookups;
    platform.extensionHost.setExtensions({});
    EXPECT_TRUE(platform.queues.runOne(kRefreshQueue));
    EXPECT_FALSE(platform.queues.runOne(kConcurrentQueue)) << "the rebuild runs alone";
  };
  EXPECT_EQ(DVExtensionDocuvend::providersInfo().size(), 1U);
  EXPECT_EQ(lookups, 1);
  cellar->onIdentifier = {};
  EXPECT_TRUE(platform.queues.runOne(kConcurrentQueue));
  EXPECT_EQ(provider(kCellar), nullptr);
}

TEST_F(RefreshPassTest, WithNothingInstalledTheStartUpCompletionRunsOnTheGlobalQueue) {
  platform.extensionHost.deliver();
  EXPECT_TRUE(platform.queues.runOne(kRefreshQueue));
  EXPECT_TRUE(platform.queues.runOne(kConcurrentQueue));
  EXPECT_TRUE(platform.queues.runOne(kFakeGlobalQueueLabel));
  EXPECT_EQ(written(), Lines{kUpdating}) << "the chain's empty end is submitted once more";
  EXPECT_TRUE(platform.queues.runOne(kFakeGlobalQueueLabel));
  EXPECT_EQ(written(), Lines{"~ started"});
  EXPECT_EQ(provider(kCellar), nullptr);
  EXPECT_TRUE(DVExtensionDocuvend::providersInfo().empty());
}

TEST_F(RefreshPassTest, OnlyTheFirstPassFindsTheStartUpCompletion) {
  refresh({});
  EXPECT_EQ(written(), (Lines{kUpdating, "~ started"}));
  refresh({installReady(kCellar)});
  refresh({});
  const Lines lines = written();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "~ started"), 0);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), kUpdating), 2);
}

TEST_F(RefreshPassTest, AnUnchangedExtensionKeepsItsProvider) {
  const auto cellar = installReady(kCellar);
  refresh({cellar});
  const auto before = provider(kCellar);
  ASSERT_NE(before, nullptr);
  refresh({std::make_shared<TracingExtension>(platform, kCellar, 1)});
  EXPECT_EQ(provider(kCellar), before);
  EXPECT_EQ(before->extension(), cellar);
  EXPECT_EQ(platform.fileCoordinator.calls(), (std::vector<Call>{{Action::add, before}})) << "neither unregistered nor registered again";
  EXPECT_EQ(cellar->beginCount(), 1);
}

TEST_F(RefreshPassTest, AnExtensionIsComparedWithTheOneThatTheProviderHasNow) {
  refresh({installReady(kCellar, 1)});
  const auto before = provider(kCellar);
  const auto updated = installReady(kCellar, 2);
  before->setExtension(updated);
  refresh({updated});
  EXPECT_EQ(provider(kCellar), before);
  EXPECT_EQ(platform.fileCoordinator.calls(), (std::vector<Call>{{Action::add, before}}));
}

TEST_F(RefreshPassTest, AnUpdatedExtensionGetsANewProviderAndTheOldOneIsUnregistered) {
  refresh({installReady(kCellar, 1)});
  const auto before = provider(kCellar);
  const auto updated = installReady(kCellar, 2);
  refresh({updated});
  const auto after = provider(kCellar);
  ASSERT_NE(after, nullptr);
  EXPECT_NE(after, before);
  EXPECT_EQ(after->extension(), updated);
  EXPECT_EQ(platform.fileCoordinator.calls(), (std::vector<Call>{{Action::add, before}, {Action::remove, before}, {Action::add, after}}));
}

TEST_F(RefreshPassTest, TheOldProviderIsUnregisteredInsideTheBarrier) {
  refresh({installReady(kCellar, 1)});
  platform.extensionHost.setExtensions({installReady(kCellar, 2)});
  EXPECT_TRUE(platform.queues.runOne(kRefreshQueue));
  EXPECT_EQ(platform.queues.pendingOperations(), 0U);
  EXPECT_TRUE(platform.queues.runOne(kConcurrentQueue));
  EXPECT_EQ(platform.queues.pendingOperations(), 1U);
  EXPECT_TRUE(platform.queues.runOne("Operation queue for com.orvane.cellar"));
  EXPECT_EQ(platform.fileCoordinator.calls().back().action, Action::remove);
}

TEST_F(RefreshPassTest, EveryNewProviderIsMadeBeforeAnyOldOneIsUnregistered) {
  refresh({installReady(kCellar, 1)});
  platform.applicationRegistry.removeRecord(kCellar);
  whenWritten("[ERROR] Cannot instantiate a Bundlery proxy", [this] { EXPECT_EQ(platform.queues.pendingOperations(), 0U); });
  refresh({std::make_shared<TracingExtension>(platform, kCellar, 2)});
  EXPECT_EQ(looks, 1);
}

TEST_F(RefreshPassTest, AVanishedExtensionsProviderIsUnregisteredAndForgotten) {
  refresh({installReady(kCellar), installReady(kAttic)});
  const auto cellar = provider(kCellar);
  const auto attic = provider(kAttic);
  refresh({attic->extension()});
  EXPECT_EQ(provider(kCellar), nullptr);
  EXPECT_EQ(provider(kAttic), attic);
  EXPECT_EQ(platform.fileCoordinator.providers(), std::vector<std::shared_ptr<QXDocuvend>>{attic});
  EXPECT_EQ(platform.fileCoordinator.calls().back(), (Call{Action::remove, cellar}));
}

TEST_F(RefreshPassTest, AnExtensionWithoutIdentifierIsLoggedAndSkipped) {
  const auto nameless = std::make_shared<TracingExtension>(platform, std::nullopt, 4);
  refresh({nameless, installReady(kCellar)});
  const Lines lines = written();
  ASSERT_GE(lines.size(), 2U);
  EXPECT_EQ(lines[0], kUpdating);
  EXPECT_EQ(lines[1], "default: [NOTICE] Docuvend extension <FakeExtension (null) 4> has no identifier. Ignoring.");
  EXPECT_EQ(DVExtensionDocuvend::providersInfo().size(), 1U);
  EXPECT_NE(provider(kCellar), nullptr);
  EXPECT_EQ(nameless->beginCount(), 0);
}

TEST_F(RefreshPassTest, ProvidersAreMadeInTheOrderOfTheExtensions) {
  refresh({std::make_shared<TracingExtension>(platform, kShed, 1), std::make_shared<TracingExtension>(platform, std::nullopt, 4),
           std::make_shared<TracingExtension>(platform, kAttic, 1)});
  const Lines lines = written();
  ASSERT_GE(lines.size(), 4U);
  EXPECT_EQ(Lines(lines.begin(), lines.begin() + 4),
            (Lines{kUpdating, "fault: [ERROR] Cannot instantiate a Bundlery proxy for <FakeExtension com.orvane.shed 1>",
                   "default: [NOTICE] Docuvend extension <FakeExtension (null) 4> has no identifier. Ignoring.",
                   "fault: [ERROR] Cannot instantiate a Bundlery proxy for <FakeExtension com.orvane.attic 1>"}));
}

TEST_F(RefreshPassTest, OfTwoNewExtensionsOfOneIdentifierTheLaterEndsInTheRegistryAndBothAreRegistered) {
  const auto earlier = installReady(kCellar, 1);
  const auto later = installReady(kCellar, 2);
  refresh({earlier, later});
  ASSERT_NE(provider(kCellar), nullptr);
  EXPECT_EQ(provider(kCellar)->extension(), later);
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 2U);
}

TEST_F(RefreshPassTest, AKeptProviderThatASecondExtensionDisplacesIsNotUnregistered) {
  const auto earlier = installReady(kCellar, 1);
  refresh({earlier});
  const auto displaced = provider(kCellar);
  const auto later = installReady(kCellar, 2);
  refresh({earlier, later});
  const auto present = provider(kCellar);
  EXPECT_EQ(present->extension(), later);
  EXPECT_EQ(platform.fileCoordinator.calls(), (std::vector<Call>{{Action::add, displaced}, {Action::add, present}}));
}

TEST_F(RefreshPassTest, OfTwoThatStayTheFirstIsMadeAnewByEachPassAndRegisteredWithoutEnteringTheRegistry) {
  const auto earlier = installReady(kCellar, 1);
  const auto later = installReady(kCellar, 2);
  refresh({earlier, later});
  const auto present = provider(kCellar);
  const auto before = platform.fileCoordinator.providers().size();
  refresh({earlier, later});
  EXPECT_EQ(provider(kCellar), present) << "the later one is kept";
  EXPECT_EQ(earlier->beginCount(), 2);
  EXPECT_EQ(later->beginCount(), 1);
  EXPECT_EQ(platform.fileCoordinator.providers().size(), before + 1) << "nothing is unregistered";
}

TEST_F(RefreshPassTest, EveryExtensionWithoutIdentifierIsLogged) {
  refresh({std::make_shared<TracingExtension>(platform, std::nullopt, 1), std::make_shared<TracingExtension>(platform, std::nullopt, 2)});
  EXPECT_EQ(written(), (Lines{kUpdating, "default: [NOTICE] Docuvend extension <FakeExtension (null) 1> has no identifier. Ignoring.",
                              "default: [NOTICE] Docuvend extension <FakeExtension (null) 2> has no identifier. Ignoring.", "~ started"}));
}

TEST_F(RefreshPassTest, AProviderWhoseIdentifierWasSetIsStillFoundByTheRegistrysKey) {
  const auto cellar = installReady(kCellar);
  refresh({cellar});
  const auto before = provider(kCellar);
  before->setIdentifier(ProviderID{kAttic});
  refresh({cellar, installReady(kAttic)});
  EXPECT_EQ(provider(kCellar), before);
  ASSERT_NE(provider(kAttic), nullptr);
  EXPECT_NE(provider(kAttic), before);
  refresh({});
  EXPECT_TRUE(platform.fileCoordinator.providers().empty());
}

TEST_F(RefreshPassTest, AnExtensionThatLosesItsIdentifierLosesItsProvider) {
  refresh({installReady(kCellar)});
  const auto before = provider(kCellar);
  refresh({std::make_shared<TracingExtension>(platform, std::nullopt, 1)});
  EXPECT_EQ(provider(kCellar), nullptr);
  EXPECT_EQ(platform.fileCoordinator.calls().back(), (Call{Action::remove, before}));
}

TEST_F(RefreshPassTest, AReinstalledExtensionGetsANewProvider) {
  const auto cellar = installReady(kCellar);
  refresh({cellar});
  const auto before = provider(kCellar);
  refresh({});
  refresh({cellar});
  ASSERT_NE(provider(kCellar), nullptr);
  EXPECT_NE(provider(kCellar), before);
  EXPECT_EQ(cellar->beginCount(), 2) << "set up again";
}

TEST_F(RefreshPassTest, EveryLeftoverIsUnregisteredBeforeAnyNewProviderIsRegistered) {
  refresh({installReady(kCellar, 1), installReady(kAttic)});
  const auto oldCellar = provider(kCellar);
  const auto attic = provider(kAttic);
  const auto before = platform.fileCoordinator.calls().size();
  refresh({installReady(kShed), installReady(kCellar, 2)});
  const auto calls = platform.fileCoordinator.calls();
  EXPECT_EQ(std::vector<Call>(calls.begin() + static_cast<std::ptrdiff_t>(before), calls.end()),
            (std::vector<Call>{
                {Action::remove, attic}, {Action::remove, oldCellar}, {Action::add, provider(kShed)}, {Action::add, provider(kCellar)}}));
}

TEST_F(RefreshPassTest, AnErrorOfTheMatchIsNotLookedAtAndItsEmptySetRemovesEveryProvider) {
  refresh({installReady(kCellar), installReady(kAttic)});
  written();
  platform.extensionHost.deliverError(broken);
  platform.queues.runAll();
  EXPECT_EQ(written(), Lines{kUpdating});
  EXPECT_TRUE(DVExtensionDocuvend::providersInfo().empty());
  EXPECT_TRUE(platform.fileCoordinator.providers().empty());
}

TEST_F(RefreshPassTest, AChangeDuringAPassWaitsForItsEnd) {
  const auto cellar = install(kCellar);
  refresh({cellar});
  EXPECT_TRUE(passIsUnderWay()) << "the setup has not been answered";
  platform.extensionHost.setExtensions({cellar, installReady(kAttic)});
  platform.queues.runAll();
  EXPECT_EQ(provider(kAttic), nullptr);
  EXPECT_EQ(platform.queues.pending(kRefreshQueue), 1U);
  written();
  cellar->vendor().answerLast({QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_FALSE(passIsUnderWay());
  EXPECT_NE(provider(kAttic), nullptr);
  const Lines lines = written();
  const auto started = std::find(lines.begin(), lines.end(), "~ started");
  const auto updating = std::find(lines.begin(), lines.end(), kUpdating);
  EXPECT_TRUE(started < updating && updating != lines.end());
}

TEST_F(RefreshPassTest, ChangesDuringAPassMakeAPassEachInTheirOrder) {
  const auto cellar = install(kCellar);
  refresh({cellar});
  platform.extensionHost.setExtensions({});
  platform.extensionHost.setExtensions({installReady(kAttic)});
  platform.extensionHost.setExtensions({installReady(kShed)});
  written();
  cellar->vendor().answerLast({QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  const Lines lines = written();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), kUpdating), 3);
  EXPECT_EQ(provider(kCellar), nullptr);
  EXPECT_EQ(provider(kAttic), nullptr);
  EXPECT_NE(provider(kShed), nullptr);
}

TEST_F(RefreshPassTest, AProviderWhoseRegistrationFailsStaysAndThePassEnds) {
  const auto cellar = install(kCellar);
  cellar->failBegins(broken);
  refresh({cellar});
  for (int tries = 1; tries < 3; ++tries) {
    EXPECT_TRUE(passIsUnderWay());
    platform.queues.advance(std::chrono::seconds(2));
    platform.queues.runAll();
  }
  EXPECT_FALSE(passIsUnderWay());
  EXPECT_EQ(cellar->beginCount(), 3);
  EXPECT_NE(provider(kCellar), nullptr);
  const Lines lines = written();
  EXPECT_EQ(lines[lines.size() - 2], "fault: [ERROR] Could not register docuvend com.orvane.cellar. Error: TestDomain 7: broken");
  EXPECT_EQ(lines.back(), "~ started");
}

TEST_F(RefreshPassTest, AProviderWhoseRegistrationFailedIsNotTriedAgainByTheNextPass) {
  const auto cellar = install(kCellar);
  cellar->failBegins(broken);
  refresh({cellar});
  for (int pause = 0; pause < 2; ++pause) {
    platform.queues.advance(std::chrono::seconds(2));
    platform.queues.runAll();
  }
  ASSERT_FALSE(passIsUnderWay());
  const auto before = provider(kCellar);
  written();
  refresh({cellar});
  EXPECT_EQ(written(), Lines{kUpdating});
  EXPECT_EQ(provider(kCellar), before);
  EXPECT_EQ(cellar->beginCount(), 3);
}

TEST_F(RefreshPassTest, AProviderThatVanishesWhileItsRegistrationIsTriedIsTriedToTheEndAndThenUnregistered) {
  const auto cellar = install(kCellar);
  cellar->failBegins(broken);
  refresh({cellar});
  const auto before = provider(kCellar);
  refresh({});
  EXPECT_EQ(provider(kCellar), before) << "the next pass waits";
  EXPECT_TRUE(platform.fileCoordinator.calls().empty());
  for (int pause = 0; pause < 2; ++pause) {
    platform.queues.advance(std::chrono::seconds(2));
    platform.queues.runAll();
  }
  EXPECT_EQ(cellar->beginCount(), 3);
  EXPECT_EQ(provider(kCellar), nullptr);
  EXPECT_EQ(platform.fileCoordinator.calls(), (std::vector<Call>{{Action::remove, before}})) << "also one that never was registered";
}

TEST_F(RefreshPassTest, ARegistrationThatReportsTwiceEndsThePassOnce) {
  const auto cellar = install(kCellar);
  refresh({cellar});
  cellar->vendor().failDelivery(0, lost);
  cellar->vendor().answer(0, {QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_FALSE(passIsUnderWay());
  platform.queues.advance(std::chrono::seconds(2));
  platform.queues.runAll();
  cellar->vendor().answer(1, {QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(platform.queues.suspendedCount(kRefreshQueue), 0U) << "resumed once; one resume more would have ended the process";
  const Lines lines = written();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "~ started"), 1);
}

}  // namespace
}  // namespace docuvend
