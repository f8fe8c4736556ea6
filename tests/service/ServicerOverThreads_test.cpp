// Servicers under real threads: every operation on several connections at once, while extensions come and go. What is asserted is what
// holds in every order; a deadlock is the runner's time limit, a race the sanitizer's.
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <latch>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include "platform/linux/queue/LinuxQueues.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRpcServicer.h"
#include "tests/support/EagerExtension.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakeApplicationRegistry;
using fake_platform::FakeRpcConnection;
using fake_platform::FakeSandbox;
using tests::EagerExtension;

constexpr int kPasses = 40;
constexpr int kClients = 3;
constexpr int kRounds = 40;

using Platform = fake_platform::FakePlatformOver<linux_platform::LinuxQueues>;

const ProviderID kKept{"com.orvane.kept"};
const ProviderID kChanging{"com.orvane.changing"};
const ProviderID kPassing{"com.orvane.passing"};
const ConsumerID kEditor{"com.example.editor"};
const ItemID kItem{"item 7"};

QXURL itemOf(const ProviderID& provider) { return Platform::itemURL(provider.value, "report.txt"); }

std::shared_ptr<EagerExtension> extension(const ProviderID& provider, int version) {
  return std::make_shared<EagerExtension>(provider.value, version,
                                          tests::EagerAnswers{{"_identifierForItemAtURL:completion:", {QXValue(), kItem.value}},
                                                              {"_URLForItemIdentifier:completion:", {QXValue(), itemOf(provider)}}});
}

class StoreSource final : public DVAccessControlSource {
 public:
  [[nodiscard]] std::shared_ptr<DVAccessControlStore> accessControlStore() const override { return DVAccessControlStore::sharedStore(); }
};

// What all clients have heard.
struct Tally {
  std::atomic<int> asked = 0;
  std::atomic<int> answered = 0;
  std::atomic<int> answeredTwice = 0;
  std::atomic<int> answeredOnItsOwnThread = 0;
  std::atomic<int> failedWithTheKept = 0;
};

// A reply handler of whatever kind, made on the thread that asks.
class Heard {
 public:
  explicit Heard(Tally& tally) : tally_(&tally) {}

  template <class... Values>
  void operator()(const Values&...) const {
    if (isAnswered_->test_and_set()) ++tally_->answeredTwice;
    if (std::this_thread::get_id() == asker_) ++tally_->answeredOnItsOwnThread;
    ++tally_->answered;
  }

 private:
  Tally* tally_;
  std::thread::id asker_ = std::this_thread::get_id();
  std::shared_ptr<std::atomic_flag> isAnswered_ = std::make_shared<std::atomic_flag>();
};

// A client that asks for everything from the thread that `run` is called on.
class Client {
 public:
  Client(Platform& platform, std::uint8_t number, Tally& tally) : tally_(tally) {
    const QXAuditToken token = FakeApplicationRegistry::token(number);
    platform.applicationRegistry.setBundleIdentifier(token, kEditor.value);
    connection_->setAuditToken(token);
    connection_->setEntitlement(std::string(kDVWriteEntitlement), true);
  }

  void run() {
    for (int round = 0; round < kRounds; ++round) {
      askAbout(kKept);
      askAbout(kChanging);
      askAbout(kPassing);
      servicer_->wakeUpCompletion(reply());
      servicer_->providersCompletionHandler(reply());
      servicer_->startProvidingItemAtURL(std::nullopt, kKept, kEditor, reply());
      servicer_->extendBookmarkForFileURL(std::nullopt, kEditor, reply());
      servicer_->documentURLFromBookmarkableString("nonsense", reply());
      // Of the others a string may go unanswered, while they are away.
      servicer_->documentURLFromBookmarkableString("docuvend:" + kKept.value + "/" + kItem.value,
                                                   [this, heard = reply()](const auto&... values) {
                                                     countFailure(std::get<sizeof...(values) - 1>(std::tie(values...)));
                                                     heard();
                                                   });
    }
  }

 private:
  void askAbout(const ProviderID& provider) {
    const QXURL url = itemOf(provider);
    const bool isKept = provider == kKept;
    servicer_->extendSandboxForFileURL(url, provider, kEditor, [this, isKept, heard = reply()](std::optional<QXError> error, auto&&...) {
      if (isKept) countFailure(error);
      heard();
    });
    servicer_->providePlaceholderForItemAtURL(url, provider, kEditor, reply());
    servicer_->startProvidingItemAtURL(url, provider, kEditor, reply());
    servicer_->stopProvidingItemAtURL(url, provider, kEditor, reply());
    servicer_->extendBookmarkForFileURL(url, kEditor, reply());
    servicer_->bookmarkableStringFromDocumentURL(url, reply());
  }

  void countFailure(const std::optional<QXError>& error) const {
    if (error) ++tally_.failedWithTheKept;
  }

  [[nodiscard]] Heard reply() const {
    ++tally_.asked;
    return Heard(tally_);
  }

  Tally& tally_;
  const std::shared_ptr<StoreSource> source_ = std::make_shared<StoreSource>();
  const std::shared_ptr<FakeRpcConnection> connection_ = FakeRpcConnection::create();
  const std::shared_ptr<DVRpcServicer> servicer_ = std::make_shared<DVRpcServicer>(source_, connection_);
};

TEST(ServicerOverThreads, EveryRequestIsAnsweredOnceAndNeverOnItsOwnThreadWhileExtensionsComeAndGo) {
  // Threads may still hold these when the test has ended.
  Platform& platform = *new Platform;
  static Tally tally;
  static std::vector<std::unique_ptr<Client>> clients;
  for (const ProviderID& provider : {kKept, kChanging, kPassing}) platform.installProviderBundle(provider.value);
  platform.sandbox.setAnswer(FakeSandbox::kAllowed);
  DVAccessControlStore::sharedStore()->allowProviderWithIdentifier(kKept, kItem, kEditor);

  std::promise<void> started;
  DVExtensionDocuvend::createInstancesCompletion([&started] { started.set_value(); });
  const auto kept = extension(kKept, 1);
  platform.extensionHost.setExtensions({kept, extension(kChanging, 0)});
  started.get_future().wait();

  std::latch haveAsked(kClients);
  std::promise<void> answered;
  const std::shared_future<void> allAreAnswered = answered.get_future().share();
  std::vector<std::thread> threads;
  for (int i = 1; i <= kClients; ++i) {
    clients.push_back(std::make_unique<Client>(platform, static_cast<std::uint8_t>(i), tally));
    // Who asks stays until the last answer: a thread that has ended leaves its number to the next one.
    threads.emplace_back([client = clients.back().get(), &haveAsked, allAreAnswered] {
      client->run();
      haveAsked.count_down();
      allAreAnswered.wait();
    });
  }
  for (int pass = 1; pass <= kPasses; ++pass) {
    fake_platform::FakeExtensionHost::Extensions extensions = {kept, extension(kChanging, pass)};
    if (pass % 2 == 1) extensions.push_back(extension(kPassing, pass));
    platform.extensionHost.setExtensions(std::move(extensions));
  }
  haveAsked.wait();
  while (tally.answered < tally.asked) std::this_thread::yield();
  answered.set_value();
  for (std::thread& thread : threads) thread.join();

  EXPECT_EQ(tally.answered, tally.asked);
  EXPECT_EQ(tally.answeredTwice, 0);
  EXPECT_EQ(tally.answeredOnItsOwnThread, 0);
  EXPECT_EQ(tally.failedWithTheKept, 0);
  EXPECT_TRUE(DVAccessControlStore::sharedStore()->isProviderWithIdentifier(kKept, kItem, kEditor));
}

}  // namespace
}  // namespace docuvend
