// The store under real threads: grants, queries and rereads at once. What is asserted is what holds in every order; a deadlock is the
// runner's time limit, a race the sanitizer's.
#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "acl/DVAccessControlStore.h"
#include "platform/linux/queue/LinuxQueues.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

constexpr int kGranters = 3;
constexpr int kGrantsOfEach = 40;
constexpr const char* kFile = "/home/fake/Library/Docuvend/AccessControl.plist";

using Platform = fake_platform::FakePlatformOver<linux_platform::LinuxQueues>;

const ProviderID kProvider{"com.orvane.cellar"};
const ConsumerID kConsumer{"com.example.editor"};

ItemID item(int granter, int number) { return ItemID{std::to_string(granter) + "/" + std::to_string(number)}; }

TEST(StoreOverThreads, AGrantIsSeenAndOnDiskWhenItsCallReturnsWhateverOthersDo) {
  Platform platform;
  DVAccessControlStore& store = *DVAccessControlStore::sharedStore();
  std::atomic<int> missing = 0;
  std::atomic<bool> done = false;

  std::vector<std::thread> granters;
  for (int granter = 0; granter < kGranters; ++granter) {
    granters.emplace_back([&, granter] {
      for (int number = 0; number < kGrantsOfEach; ++number) {
        const ItemID granted = item(granter, number);
        store.allowProviderWithIdentifier(kProvider, granted, kConsumer);
        if (!store.isProviderWithIdentifier(kProvider, granted, kConsumer)) ++missing;
        const auto onDisk = DVGrantTree::fromPropertyList(*platform.propertyLists.value(kFile));
        if (!std::get<DVGrantTree>(onDisk).allows(kProvider, granted, kConsumer)) ++missing;
      }
    });
  }
  std::thread rereader([&] {
    while (!done) {
      store.rereadAccessControl();
      (void)store.isProviderIdentifier(kProvider, item(0, 0), kConsumer);
    }
  });
  for (std::thread& granter : granters) granter.join();
  done = true;
  rereader.join();

  EXPECT_EQ(missing, 0);
  for (int granter = 0; granter < kGranters; ++granter) {
    for (int number = 0; number < kGrantsOfEach; ++number) {
      EXPECT_TRUE(store.isProviderWithIdentifier(kProvider, item(granter, number), kConsumer)) << granter << "/" << number;
    }
  }
}

}  // namespace
}  // namespace docuvend
