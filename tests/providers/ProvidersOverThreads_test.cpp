// The registry and the forwarded operations under real threads: lookups and item operations while one refresh pass follows another. What
// is asserted is what holds in every order; a deadlock is the runner's time limit, a race the sanitizer's.
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/linux/queue/LinuxQueues.h"
#include "providers/DVExtensionDocuvend.h"
#include "tests/support/EagerExtension.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

constexpr int kPasses = 60;
constexpr int kReaders = 3;
constexpr int kRequests = 200;

using Platform = fake_platform::FakePlatformOver<linux_platform::LinuxQueues>;

using tests::EagerExtension;

class ProvidersOverThreadsTest : public testing::Test {
 protected:
  // Threads may still hold it when the test has ended.
  Platform& platform = *new Platform;
};

TEST_F(ProvidersOverThreadsTest, LookupsSeeWholeRegistriesWhilePassesFollowOneAnother) {
  const std::string kept = "com.orvane.kept";
  const std::string changing = "com.orvane.changing";
  const std::string passing = "com.orvane.passing";
  for (const std::string& identifier : {kept, changing, passing}) platform.installProviderBundle(identifier);

  std::promise<void> started;
  DVExtensionDocuvend::createInstancesCompletion([&started] { started.set_value(); });
  const auto keptExtension = std::make_shared<EagerExtension>(kept, 1);
  platform.extensionHost.setExtensions({keptExtension, std::make_shared<EagerExtension>(changing, 0)});
  started.get_future().wait();
  const auto keptProvider = DVExtensionDocuvend::providerWithIdentifier(ProviderID{kept});
  ASSERT_NE(keptProvider, nullptr);

  std::atomic<bool> passesAreOver = false;
  std::atomic<int> mistakes = 0;
  std::vector<std::thread> readers;
  for (int i = 0; i < kReaders; ++i) {
    readers.emplace_back([&] {
      while (!passesAreOver) {
        const auto changed = DVExtensionDocuvend::providerWithIdentifier(ProviderID{changing});
        const bool isWhole = changed && changed->identifier() == ProviderID{changing} &&
                             DVExtensionDocuvend::providerWithIdentifier(ProviderID{kept}) == keptProvider &&
                             DVExtensionDocuvend::providersInfo().size() >= 2 &&
                             DVExtensionDocuvend::providerForURL(Platform::itemURL(kept, "a")) == keptProvider;
        if (!isWhole) ++mistakes;
        keptProvider->setProvidedItemsURL(Platform::storageURL(kept));
      }
    });
  }
  for (int pass = 1; pass <= kPasses; ++pass) {
    fake_platform::FakeExtensionHost::Extensions extensions = {keptExtension, std::make_shared<EagerExtension>(changing, pass)};
    if (pass % 2 == 1) extensions.push_back(std::make_shared<EagerExtension>(passing, pass));
    platform.extensionHost.setExtensions(std::move(extensions));
  }
  const auto last = std::make_shared<EagerExtension>("com.orvane.last", 1);
  platform.extensionHost.setExtensions({keptExtension, std::make_shared<EagerExtension>(changing, kPasses), last});
  // Registered last in the last pass, and only when every pass before it has ended.
  while (last->cancelled == 0) std::this_thread::yield();
  passesAreOver = true;
  for (std::thread& reader : readers) reader.join();

  EXPECT_EQ(mistakes, 0);
  EXPECT_EQ(DVExtensionDocuvend::providersInfo().size(), 3U);
  EXPECT_EQ(DVExtensionDocuvend::providerWithIdentifier(ProviderID{passing}), nullptr);
  EXPECT_EQ(keptExtension->cancelled, 1) << "the provider that stayed was set up once";
}

TEST_F(ProvidersOverThreadsTest, EveryItemOperationIsAnsweredOnceAndEndsItsRequest) {
  const auto extension = std::make_shared<EagerExtension>("com.orvane.cellar", 1);
  const auto provider = DVExtensionDocuvend::initWithExtension(extension);
  const QXURL url = Platform::itemURL("com.orvane.cellar", "a");
  std::atomic<int> answers = 0;
  std::atomic<int> errors = 0;
  const auto count = [&answers, &errors](const std::optional<QXError>& error) {
    if (error) ++errors;
    ++answers;
  };
  for (int i = 0; i < kRequests; ++i) {
    provider->providePlaceholderForItemAtURL(url, count);
    provider->startProvidingItemAtURL(url, count);
    provider->stopProvidingItemAtURL(url, count);
    provider->itemIDForURL(url, [&count](std::optional<QXError> error, std::optional<ItemID>) { count(error); });
    provider->URLForItemID(ItemID{"1"}, [&count](std::optional<QXError> error, std::optional<QXURL>) { count(error); });
    provider->setIdentifier(ProviderID{"com.orvane.cellar." + std::to_string(i)});
  }
  while (extension->cancelled < 5 * kRequests) std::this_thread::yield();
  EXPECT_EQ(answers, 5 * kRequests);
  EXPECT_EQ(errors, 0);
  EXPECT_EQ(extension->cancelled, 5 * kRequests);
}

}  // namespace
}  // namespace docuvend
