#include "daemon/DVServer.h"

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/DVRpcListenerDelegate.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVDaemon.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogEntry;
using fake_platform::FakePlatform;
using fake_platform::FakeRpcConnection;
using fake_platform::FakeRpcListener;

constexpr const char* kService = "com.orvane.Docuvend";
constexpr const char* kCellar = "com.orvane.cellar";
constexpr int kLocked = 1;
constexpr std::size_t kObserversOfTheStore = 1;

class DVServerTest : public testing::Test {
 protected:
  // What a moment of the start looked like.
  struct Moment {
    std::string call;
    std::vector<std::string> logged;
    std::size_t observers;
    std::size_t matches;
    std::size_t submitted;  // to the global queue
    int lockQuestions;
    bool hasDelegate;
    bool delegateKnowsServer;
  };

  DVServerTest() {
    platform_.rpc.setRecorder([this](const std::string& call) { noteMoment(call); });
    server_->setAccessControlStore(DVAccessControlStore::sharedStore());
    platform_.log.clear();
  }

  void lockDevice() { platform_.deviceLock.state = kLocked; }
  void lockDeviceUnlockedSinceBoot() {
    lockDevice();
    platform_.deviceLock.unlocked = true;
  }
  void start() {
    server_->startCompletion([this] { completions_.push_back(platform_.queues.currentLabel()); });
  }
  // The extensions that are installed, as the host announces them once the match has begun.
  void announceExtensions() { platform_.extensionHost.setExtensions({cellar_}); }
  void announceFirstUnlock() {
    platform_.notificationCenter.post(kQXFirstUnlockNotification);
    platform_.queues.runAll();
  }
  std::shared_ptr<FakeRpcListener> listener() { return platform_.rpc.listener(kService); }
  [[nodiscard]] std::vector<std::string> calls() const {
    std::vector<std::string> names;
    for (const Moment& moment : moments_) names.push_back(moment.call);
    return names;
  }

  FakePlatform platform_;
  std::shared_ptr<fake_platform::FakeExtension> cellar_ = platform_.installProvider(kCellar);
  std::shared_ptr<DVServer> server_ = std::make_shared<DVServer>();
  std::vector<Moment> moments_;
  std::vector<std::string> completions_;  // the queue of each

 private:
  void noteMoment(const std::string& call) {
    const bool hasDelegate = server_ && server_->listenerDelegate();
    const bool known = hasDelegate && server_->listenerDelegate()->server() == server_;
    moments_.push_back({call, platform_.log.texts(), platform_.notificationCenter.observers().size(),
                        platform_.extensionHost.begun().size(), platform_.queues.pendingOnGlobalQueue(),
                        platform_.deviceLock.lockStateQuestions, hasDelegate, known});
  }
};

// --- The steps that all starts share

TEST_F(DVServerTest, HasNothingBeforeItIsStarted) {
  EXPECT_EQ(server_->listener(), nullptr);
  EXPECT_EQ(server_->listenerDelegate(), nullptr);
  EXPECT_TRUE(platform_.rpc.createdNames().empty());
}

TEST_F(DVServerTest, PublishesItsNameAfterItsFirstLine) {
  start();
  EXPECT_EQ(platform_.rpc.createdNames(), std::vector<std::string>{kService});
  EXPECT_EQ(server_->listener(), listener());
  ASSERT_FALSE(moments_.empty());
  EXPECT_EQ(moments_[0].call, std::string("listenerForService:") + kService);
  EXPECT_EQ(moments_[0].logged, std::vector<std::string>{"[INFO] Server starting."});
}

TEST_F(DVServerTest, ItsDelegateKnowsTheServerBeforeTheListenerKnowsTheDelegate) {
  start();
  ASSERT_GE(moments_.size(), 2U);
  EXPECT_EQ(moments_[1].call, "setDelegate");
  EXPECT_TRUE(moments_[1].delegateKnowsServer);
  EXPECT_EQ(listener()->delegate(), server_->listenerDelegate());
}

TEST_F(DVServerTest, ItsListenerIsMadeBeforeItsDelegate) {
  start();
  ASSERT_FALSE(moments_.empty());
  EXPECT_EQ(moments_[0].call, std::string("listenerForService:") + kService);
  EXPECT_FALSE(moments_[0].hasDelegate);
}

TEST_F(DVServerTest, AnotherStartReplacesItsListener) {
  lockDevice();
  start();
  const auto first = server_->listener();
  start();
  EXPECT_NE(server_->listener(), first);
  EXPECT_EQ(server_->listener(), listener());
  EXPECT_EQ(listener()->delegate(), server_->listenerDelegate());
  EXPECT_TRUE(listener()->isResumed());
}

TEST_F(DVServerTest, ObservesTheFirstUnlockOnceTheDelegateIsSetAndBeforeItListens) {
  lockDevice();
  start();
  EXPECT_EQ(calls(), (std::vector<std::string>{std::string("listenerForService:") + kService, "setDelegate", "resume"}));
  EXPECT_EQ(moments_[1].observers, kObserversOfTheStore);
  EXPECT_EQ(moments_[2].observers, kObserversOfTheStore + 1);
  const auto observer = platform_.notificationCenter.observers().back();
  EXPECT_EQ(observer.notification, "com.orvane.mobile.gatewardd.first_unlock");
  EXPECT_EQ(observer.behavior, QXSuspensionBehavior::deliverImmediately);
}

TEST_F(DVServerTest, ObservesTheFirstUnlockBeforeItAsksForTheLockState) {
  std::vector<std::size_t> observersWhenAsked;
  platform_.deviceLock.onLockStateQuestion = [&] { observersWhenAsked.push_back(platform_.notificationCenter.observers().size()); };
  start();
  EXPECT_EQ(observersWhenAsked, std::vector<std::size_t>{kObserversOfTheStore + 1});
}

TEST_F(DVServerTest, ObservesTheFirstUnlockAlsoWhenItNeedNotWaitForIt) {
  start();
  EXPECT_EQ(platform_.notificationCenter.observers().size(), kObserversOfTheStore + 1);
  lockDeviceUnlockedSinceBoot();
  start();
  EXPECT_EQ(platform_.notificationCenter.observers().size(), kObserversOfTheStore + 2);
}

TEST_F(DVServerTest, AsksForTheLockStateOnlyWhenTheDelegateIsSet) {
  lockDevice();
  start();
  EXPECT_EQ(moments_[1].lockQuestions, 0);
  EXPECT_EQ(moments_[2].lockQuestions, 1);
}

// --- A device without lock protection

TEST_F(DVServerTest, AnUnprotectedDeviceIsNotAskedWhetherItWasUnlocked) {
  start();
  EXPECT_EQ(platform_.deviceLock.lockStateQuestions, 1);
  EXPECT_EQ(platform_.deviceLock.unlockedSinceBootQuestions, 0);
  EXPECT_EQ(platform_.extensionHost.begun().size(), 1U);
}

TEST_F(DVServerTest, TheUnprotectedStateIsThree) {
  for (const int state : {0, 1, 2, 4}) {
    platform_.deviceLock.state = state;
    const auto server = std::make_shared<DVServer>();
    server->startCompletion(/*completion=*/{});
    EXPECT_TRUE(listener()->isResumed()) << state;  // the way of a device that is locked
  }
  platform_.deviceLock.state = 3;
  start();
  EXPECT_FALSE(listener()->isResumed());
}

TEST_F(DVServerTest, ListensOnlyWhenEveryProviderHasBeenRegistered) {
  start();
  platform_.queues.runAll();
  EXPECT_FALSE(listener()->isResumed());
  EXPECT_TRUE(completions_.empty());

  announceExtensions();
  EXPECT_FALSE(listener()->isResumed());
  platform_.queues.runAll();
  EXPECT_EQ(listener()->resumeCount(), 1);
  EXPECT_EQ(platform_.fileCoordinator.providers().size(), 1U);
  EXPECT_NE(DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar}), nullptr);
}

TEST_F(DVServerTest, LogsNoWaitForTheFirstUnlockWhenThereIsNone) {
  start();
  EXPECT_EQ(platform_.log.entries(), (std::vector<FakeLogEntry>{{QXLogType::info, "[INFO] Server starting."}}));
}

TEST_F(DVServerTest, ListensBeforeItsCompletionIsCalled) {
  bool wasListening = false;
  server_->startCompletion([&] { wasListening = listener()->isResumed(); });
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_TRUE(wasListening);
}

TEST_F(DVServerTest, CallsItsCompletionOnceOnTheRegistrysQueue) {
  start();
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_EQ(completions_, std::vector<std::string>{fake_platform::kFakeGlobalQueueLabel});
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_EQ(completions_.size(), 1U);
  EXPECT_EQ(listener()->resumeCount(), 1);
}

TEST_F(DVServerTest, ListensAndCompletesThoughAProviderCannotBeRegistered) {
  cellar_->failBegins(QXError::make("CellarErrorDomain", 5, "the cellar is flooded"));
  start();
  announceExtensions();
  for (int wait = 0; wait < 3; ++wait) {
    platform_.queues.runAll();
    platform_.queues.advance(std::chrono::seconds(2));
  }
  platform_.queues.runAll();
  EXPECT_TRUE(platform_.fileCoordinator.providers().empty());
  EXPECT_EQ(listener()->resumeCount(), 1);
  EXPECT_EQ(completions_.size(), 1U);
}

TEST_F(DVServerTest, ListensWithoutAnyProviderInstalled) {
  start();
  platform_.extensionHost.setExtensions({});
  platform_.queues.runAll();
  EXPECT_TRUE(listener()->isResumed());
}

TEST_F(DVServerTest, AClientThatComesEarlyWaitsUntilTheProvidersExist) {
  start();
  const auto client = FakeRpcConnection::create();
  listener()->connect(client);
  platform_.queues.runAll();
  EXPECT_FALSE(client->isResumed());
  EXPECT_FALSE(client->isClosed());
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_TRUE(client->isResumed());
}

TEST_F(DVServerTest, TheWaitForTheProvidersKeepsTheServerAlive) {
  start();
  const std::weak_ptr<DVServer> weak = server_;
  server_.reset();
  EXPECT_FALSE(weak.expired());
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_TRUE(listener()->isResumed());
  EXPECT_EQ(completions_.size(), 1U);
  EXPECT_TRUE(weak.expired());
}

TEST_F(DVServerTest, NeedsNoCompletionOnAnUnlockedDevice) {
  server_->startCompletion(/*completion=*/{});
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_TRUE(listener()->isResumed());
}

// --- A device that has been unlocked since boot

TEST_F(DVServerTest, AnUnlockedDeviceListensOnlyWhenTheProvidersExist) {
  lockDeviceUnlockedSinceBoot();
  start();
  EXPECT_EQ(platform_.deviceLock.unlockedSinceBootQuestions, 1);
  EXPECT_EQ(platform_.extensionHost.begun().size(), 1U);
  EXPECT_FALSE(listener()->isResumed());
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[INFO] Server starting."});
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_TRUE(listener()->isResumed());
}

TEST_F(DVServerTest, ALaterFirstUnlockBeginsDiscoveryNoSecondTime) {
  lockDeviceUnlockedSinceBoot();
  start();
  announceExtensions();
  platform_.queues.runAll();
  announceFirstUnlock();
  EXPECT_EQ(platform_.extensionHost.begun().size(), 1U);
  EXPECT_EQ(listener()->resumeCount(), 1);
  EXPECT_EQ(completions_.size(), 1U);
}

TEST_F(DVServerTest, ALaterFirstUnlockHasNoCompletion) {
  start();
  announceExtensions();
  platform_.queues.runAll();
  platform_.notificationCenter.post(kQXFirstUnlockNotification);
  while (platform_.queues.runOne(fake_platform::kFakeMainRunLoopLabel)) continue;
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 0U);
}

// --- A device that has not been unlocked since boot

TEST_F(DVServerTest, ALockedDeviceListensAtOnceWithoutProviders) {
  lockDevice();
  start();
  EXPECT_EQ(listener()->resumeCount(), 1);
  EXPECT_TRUE(platform_.extensionHost.begun().empty());
  EXPECT_EQ(platform_.log.entries(),
            (std::vector<FakeLogEntry>{{QXLogType::info, "[INFO] Server starting."},
                                       {QXLogType::info, "[INFO] Not instantiating docuvends until first unlock."}}));
  EXPECT_TRUE(DVExtensionDocuvend::providersInfo().empty());
}

TEST_F(DVServerTest, ALockedDeviceLogsBeforeItListens) {
  lockDevice();
  start();
  EXPECT_EQ(moments_[2].call, "resume");
  EXPECT_EQ(moments_[2].logged.back(), "[INFO] Not instantiating docuvends until first unlock.");
}

TEST_F(DVServerTest, ALockedDeviceListensBeforeItsCompletionIsSubmitted) {
  lockDevice();
  start();
  EXPECT_EQ(moments_[2].call, "resume");
  EXPECT_EQ(moments_[2].submitted, 0U);
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
}

TEST_F(DVServerTest, ALockedDeviceCompletesOnTheGlobalQueue) {
  lockDevice();
  start();
  EXPECT_TRUE(completions_.empty());
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
  platform_.queues.runAll();
  EXPECT_EQ(completions_, std::vector<std::string>{fake_platform::kFakeGlobalQueueLabel});
}

TEST_F(DVServerTest, NeedsNoCompletionOnALockedDevice) {
  lockDevice();
  server_->startCompletion(/*completion=*/{});
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_F(DVServerTest, TheFirstUnlockBringsTheProvidersAndResumesNothingAgain) {
  lockDevice();
  start();
  platform_.queues.runAll();
  announceFirstUnlock();
  EXPECT_EQ(platform_.extensionHost.begun().size(), 1U);
  announceExtensions();
  platform_.queues.runAll();
  EXPECT_NE(DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar}), nullptr);
  EXPECT_EQ(listener()->resumeCount(), 1);
  EXPECT_EQ(completions_.size(), 1U);
}

TEST_F(DVServerTest, TheFirstUnlockIsAnsweredOnTheMainRunLoop) {
  lockDevice();
  start();
  platform_.queues.runAll();
  platform_.notificationCenter.post(kQXFirstUnlockNotification);
  EXPECT_TRUE(platform_.extensionHost.begun().empty());
  EXPECT_EQ(platform_.queues.pendingOnMainRunLoop(), 2U);  // the store's and the server's
}

// --- References

TEST_F(DVServerTest, HoldsTheStoreWeakly) {
  auto store = std::make_shared<DVAccessControlStore>();
  server_->setAccessControlStore(store);
  EXPECT_EQ(server_->accessControlStore(), store);
  store.reset();
  EXPECT_EQ(server_->accessControlStore(), nullptr);
}

TEST_F(DVServerTest, HoldsItsDelegateWhichHoldsItWeakly) {
  lockDevice();
  start();
  platform_.queues.runAll();
  const auto delegate = server_->listenerDelegate();
  const std::weak_ptr<DVServer> weak = server_;
  server_.reset();
  EXPECT_TRUE(weak.expired());
  EXPECT_EQ(delegate->server(), nullptr);
}

}  // namespace
}  // namespace docuvend
