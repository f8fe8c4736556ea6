// Providers as the daemon knows them, over real processes that fail: what is logged, who is told, and how often. The rest of the platform
// is of fakes; queues are real, and so is the time between two tries.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <memory>
#include <thread>

#include "common/DVErrors.h"
#include "platform/QXPlatform.h"
#include "platform/fake/FakeApplicationRegistry.h"
#include "platform/fake/FakeDeviceLock.h"
#include "platform/fake/FakeFileCoordinator.h"
#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeNotificationCenter.h"
#include "platform/fake/FakePropertyLists.h"
#include "platform/fake/FakeRpc.h"
#include "platform/fake/FakeSandbox.h"
#include "platform/fake/FakeStatus.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/linux/queue/LinuxQueues.h"
#include "providers/DVExtensionDocuvend.h"
#include "tests/extension_host/support/RealExtensions.h"
#include "tests/wire/Waiting.h"

namespace docuvend {
namespace {

using linux_platform::await;
using linux_platform::ExtensionHostErrorCode;
using linux_platform::ExtensionTimes;
using linux_platform::RealExtensions;
using std::chrono::milliseconds;
using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::SizeIs;
using ::testing::StartsWith;
using tests::Mailbox;

const std::string kBad = "com.orvane.bad";
const std::string kGood = "com.orvane.good";
constexpr const char* kPath = "/storage";

// Lives until the process ends: threads may still hold it when the test is over.
struct Platform {
  explicit Platform(QXExtensionHost& extensionHost) {
    QXPlatform::install({queues, log, rpc, applicationRegistry, sandbox, extensionHost, fileCoordinator, deviceLock, notificationCenter,
                         fileSystem, propertyLists, status});
    log.setEnabled(QXLogType::debug, fake_platform::FakeLogSwitch::off);
  }

  linux_platform::LinuxQueues queues;
  fake_platform::FakeLog log;
  fake_platform::FakeRpcService rpc;
  fake_platform::FakeApplicationRegistry applicationRegistry;
  fake_platform::FakeSandbox sandbox;
  fake_platform::FakeFileCoordinator fileCoordinator;
  fake_platform::FakeDeviceLock deviceLock;
  fake_platform::FakeNotificationCenter notificationCenter{queues.mainRunLoop()};
  fake_platform::FakeFileSystem fileSystem;
  fake_platform::FakePropertyLists propertyLists{fileSystem};
  fake_platform::FakeStatus status;
};

// What a request handler was given.
struct Handed {
  std::optional<QXError> error;
  std::optional<DVExtensionDocuvend::VendorProxy> proxy;
  DVExtensionDocuvend::FinishHandler finish;
};

bool soon(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + linux_platform::kPatience;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

// A request that has begun, of which whoever began it does not know yet.
struct BegunRequest {
  std::optional<QXUUID> request;
  std::function<void()> tell;
};

// An extension whose requests begin as the real one's, and are handed to the test to tell of them.
class ToldLater final : public QXExtension {
 public:
  ToldLater(std::shared_ptr<QXExtension> real, std::shared_ptr<Mailbox<BegunRequest>> begun)
      : real_(std::move(real)), begun_(std::move(begun)) {}

  [[nodiscard]] std::optional<std::string> identifier() const override { return real_->identifier(); }
  [[nodiscard]] std::string description() const override { return real_->description(); }
  [[nodiscard]] bool isEqual(const QXExtension& other) const override { return real_->isEqual(other); }
  void beginExtensionRequest(BeginCompletion completion) override {
    real_->beginExtensionRequest(
        [begun = begun_, completion = std::move(completion)](std::optional<QXUUID> request, std::optional<QXError> error) {
          begun->put({request, [completion, request, error = std::move(error)] { completion(request, error); }});
        });
  }
  void cancelExtensionRequest(const QXUUID& request) override { real_->cancelExtensionRequest(request); }
  [[nodiscard]] std::shared_ptr<QXExtensionContext> extensionContextForRequest(const QXUUID& request) override {
    return real_->extensionContextForRequest(request);
  }

 private:
  const std::shared_ptr<QXExtension> real_;
  const std::shared_ptr<Mailbox<BegunRequest>> begun_;
};

class ProvidersOverProcesses : public testing::Test {
 protected:
  void SetUp() override {
    if (!RealExtensions::mayRun()) GTEST_FAIL();
  }

  void begin(const ExtensionTimes& times = {}) {
    real = std::make_unique<RealExtensions>(times);
    platform = new Platform(real->host());
    for (const std::string& identifier : {kBad, kGood}) {
      platform->applicationRegistry.setProviderRecord(identifier, "group." + identifier, kPath + ("/" + identifier));
      platform->fileSystem.addDirectory(kPath + ("/" + identifier) + "/Docuvend Storage");
    }
  }
  std::shared_ptr<DVExtensionDocuvend> provider() { return DVExtensionDocuvend::initWithExtension(real->extension(kBad)); }
  std::vector<linux_platform::Bundle> both() const { return {real->makeBundle(kBad), real->makeBundle(kGood)}; }

  // What its setup does from now on: "hang", or the number of times that it fails.
  void tellSetup(const std::string& what) const {
    const std::string container = real->home() + "/containers/" + kBad;
    std::filesystem::create_directories(container);
    std::ofstream(container + "/setup") << what;
  }

  void perform(const std::shared_ptr<DVExtensionDocuvend>& provider) {
    provider->performExtensionRequest([this](std::optional<QXError> error, std::optional<DVExtensionDocuvend::VendorProxy> proxy,
                                             DVExtensionDocuvend::FinishHandler finish) {
      handed.put({std::move(error), std::move(proxy), std::move(finish)});
    });
  }
  std::future<std::optional<QXError>> registerWithTries(const std::shared_ptr<DVExtensionDocuvend>& provider, std::int32_t tries) const {
    const auto promise = std::make_shared<std::promise<std::optional<QXError>>>();
    provider->registerWithFileCoordinatorRetryCount(tries,
                                                    [promise](std::optional<QXError> error) { promise->set_value(std::move(error)); });
    return promise->get_future();
  }
  // What the daemon logged that is neither debug nor info.
  std::vector<std::string> notable() const {
    std::vector<std::string> result;
    for (const auto& entry : platform->log.entries()) {
      if (entry.type != QXLogType::info) result.push_back(entry.text);
    }
    return result;
  }
  static bool isOfHost(const std::optional<QXError>& error, ExtensionHostErrorCode code) {
    return error && error->domain == linux_platform::kExtensionHostErrorDomain && error->code == static_cast<std::int64_t>(code);
  }

  std::unique_ptr<RealExtensions> real;
  Platform* platform = nullptr;
  Mailbox<Handed> handed;
};

TEST_F(ProvidersOverProcesses, ARequestThatCannotBeginIsHandedTheHostsErrorOnce) {
  begin();
  const auto one = provider();
  std::filesystem::remove(real->makeBundle(kBad).executable);
  perform(one);
  const auto given = handed.take();
  ASSERT_TRUE(given);
  EXPECT_TRUE(isOfHost(given->error, ExtensionHostErrorCode::notStarted));
  EXPECT_FALSE(given->proxy);
  given->finish();
  EXPECT_THAT(notable(), ElementsAre(StartsWith("[ERROR] Extension request failed. Error: QXExtensionHostErrorDomain 2: ")));
  EXPECT_EQ(handed.count(), 0U);
}

TEST_F(ProvidersOverProcesses, ARequestWhoseProcessIsGoneBeforeItsContextIsAskedForIsHandedAMissingProxy) {
  begin();
  const auto extension = real->extension(kBad);
  const auto begun = std::make_shared<Mailbox<BegunRequest>>();
  perform(DVExtensionDocuvend::initWithExtension(std::make_shared<ToldLater>(extension, begun)));
  const auto one = begun->take();
  ASSERT_TRUE(one && one->request);
  (void)await(linux_platform::Conversation(extension).start("crash"));
  ASSERT_TRUE(soon([&extension, &one] { return extension->extensionContextForRequest(*one->request) == nullptr; }));
  one->tell();
  const auto given = handed.take();
  ASSERT_TRUE(given && given->error);
  EXPECT_EQ(given->error->domain, kDVErrorDomain);
  EXPECT_EQ(given->error->code, static_cast<std::int64_t>(DVErrorCode::proxyNotFound));
  EXPECT_FALSE(given->proxy);
  given->finish();
  EXPECT_THAT(notable(), ElementsAre(StartsWith("[ERROR] Could not get extension context for request identifier "),
                                     "[ERROR] Could not get proxy object for a request."));
  EXPECT_EQ(handed.count(), 0U);
}

TEST_F(ProvidersOverProcesses, AfterAProxyTheFailureOfItsMessageIsHandedToo) {
  begin();
  perform(provider());
  const auto first = handed.take();
  ASSERT_TRUE(first && first->proxy);
  EXPECT_FALSE(first->error);
  std::atomic<int> replies = 0;
  first->proxy->call<&_QXDocuvendVendor::_startProvidingItemAtURL>(QXURL::fileURL("/crash", QXURLKind::file),
                                                                   [&replies](std::optional<QXError>) { ++replies; });
  const auto second = handed.take();
  ASSERT_TRUE(second);
  EXPECT_TRUE(second->error);
  EXPECT_FALSE(second->proxy);
  EXPECT_THAT(notable(), ElementsAre(StartsWith("[ERROR] Error getting remote proxy object for provider extension. Error: ")));
  second->finish();
  EXPECT_EQ(replies, 0);
  EXPECT_EQ(handed.count(), 0U);
}

TEST_F(ProvidersOverProcesses, AnItemOperationDuringTheBackOffFailsAtOnceAndSaysForHowLong) {
  ExtensionTimes slow;
  slow.quickDeath = slow.firstBackOff = slow.longestBackOff = std::chrono::minutes(10);
  begin(slow);
  const auto one = provider();
  const auto start = [&one](const std::string& name) {
    const auto promise = std::make_shared<std::promise<std::optional<QXError>>>();
    one->startProvidingItemAtURL(QXURL::fileURL("/" + name, QXURLKind::file),
                                 [promise](std::optional<QXError> error) { promise->set_value(std::move(error)); });
    return await(promise->get_future()).value_or(std::nullopt);
  };
  for (int i = 0; i < 2; ++i) ASSERT_TRUE(start("crash"));
  const auto refused = start("anything");
  ASSERT_TRUE(refused && refused->underlying);
  EXPECT_EQ(refused->domain, kDVErrorDomain);
  EXPECT_TRUE(isOfHost(*refused->underlying, ExtensionHostErrorCode::backingOff));
  EXPECT_THAT(refused->underlying->description(),
              AllOf(HasSubstr("ended too soon 2 times in a row; it can be started again in "), HasSubstr(" ms.")));
}

TEST_F(ProvidersOverProcesses, ASetupThatFailsOnceIsTriedAgainAfterTwoSecondsAndTheProviderRegistered) {
  begin();
  tellSetup("1");
  const auto before = std::chrono::steady_clock::now();
  const auto error = await(registerWithTries(provider(), 3));
  EXPECT_GE(std::chrono::steady_clock::now() - before, std::chrono::seconds(2));
  ASSERT_TRUE(error);
  EXPECT_FALSE(*error);
  EXPECT_THAT(notable(), ElementsAre("[ERROR] Docuvend extension com.orvane.bad failed to initialize. Error: TestProvider 2: not yet.",
                                     "[NOTICE] Trying to register docuvend extension com.orvane.bad again. Tries left: 2"));
  EXPECT_THAT(platform->fileCoordinator.providers(), SizeIs(1));
}

TEST_F(ProvidersOverProcesses, ASetupThatNeverSucceedsIsTriedThreeTimesAndTheLastErrorIsTheResult) {
  begin();
  tellSetup("3");
  const auto error = await(registerWithTries(provider(), 3));
  ASSERT_TRUE(error && *error);
  EXPECT_EQ((*error)->domain, "TestProvider");
  EXPECT_THAT(notable(), ElementsAre("[ERROR] Docuvend extension com.orvane.bad failed to initialize. Error: TestProvider 2: not yet.",
                                     "[NOTICE] Trying to register docuvend extension com.orvane.bad again. Tries left: 2",
                                     "[ERROR] Docuvend extension com.orvane.bad failed to initialize. Error: TestProvider 2: not yet.",
                                     "[NOTICE] Trying to register docuvend extension com.orvane.bad again. Tries left: 1",
                                     "[ERROR] Docuvend extension com.orvane.bad failed to initialize. Error: TestProvider 2: not yet."));
  EXPECT_THAT(platform->fileCoordinator.providers(), SizeIs(0));
}

TEST_F(ProvidersOverProcesses, ARegistrationWhoseRequestsCannotBeginIsTriedAsOften) {
  begin();
  const auto one = provider();
  std::filesystem::remove(real->makeBundle(kBad).executable);
  const auto error = await(registerWithTries(one, 2));
  ASSERT_TRUE(error);
  EXPECT_TRUE(isOfHost(*error, ExtensionHostErrorCode::notStarted));
  const auto failedRequest = StartsWith("[ERROR] Extension request failed. Error: ");
  const auto failedTry = StartsWith("[ERROR] Error registering docuvend extension com.orvane.bad: QXExtensionHostErrorDomain 2: ");
  EXPECT_THAT(notable(),
              ElementsAre(failedRequest, failedTry, "[NOTICE] Trying to register docuvend extension com.orvane.bad again. Tries left: 1",
                          failedRequest, failedTry));
}

// The registration of one follows that of the other, so this is bounded by three tries of the bad one: its limit three times, and the
// pauses.
TEST_F(ProvidersOverProcesses, ASetupThatHangsDelaysTheNextProvidersRegistrationButNotItsRequests) {
  ExtensionTimes times;
  times.answerLimit = milliseconds(1'000);
  begin(times);
  tellSetup("hang");
  real->install(both());
  std::promise<void> discovered;
  DVExtensionDocuvend::createInstancesCompletion([&discovered] { discovered.set_value(); });
  ASSERT_TRUE(soon([] { return DVExtensionDocuvend::providerWithIdentifier(ProviderID{kGood}) != nullptr; }));

  // Before it is registered.
  const auto good = DVExtensionDocuvend::providerWithIdentifier(ProviderID{kGood});
  std::promise<std::optional<QXError>> provided;
  good->startProvidingItemAtURL(QXURL::fileURL("/item", QXURLKind::file),
                                [&provided](std::optional<QXError> error) { provided.set_value(std::move(error)); });
  const auto early = await(provided.get_future());
  ASSERT_TRUE(early);
  EXPECT_FALSE(*early);

  ASSERT_EQ(discovered.get_future().wait_for(linux_platform::kPatience), std::future_status::ready);
  EXPECT_THAT(platform->fileCoordinator.providers(), ElementsAre(std::static_pointer_cast<QXDocuvend>(good)));
  const auto lines = platform->log.texts();
  const auto failure =
      StartsWith("[ERROR] Error getting remote proxy object for provider extension. Error: QXExtensionHostErrorDomain 3: ");
  EXPECT_THAT(lines, testing::Contains(failure).Times(3));
  EXPECT_THAT(lines, testing::Contains("[NOTICE] Trying to register docuvend extension com.orvane.bad again. Tries left: 2"));
  EXPECT_THAT(lines, testing::Contains("[NOTICE] Trying to register docuvend extension com.orvane.bad again. Tries left: 1"));
  EXPECT_THAT(lines,
              testing::Contains(StartsWith("[ERROR] Could not register docuvend com.orvane.bad. Error: QXExtensionHostErrorDomain 3: ")));
}

}  // namespace
}  // namespace docuvend
