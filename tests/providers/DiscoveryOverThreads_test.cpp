// The start of discovery under real threads.
#include <gtest/gtest.h>

#include <atomic>
#include <latch>
#include <thread>
#include <vector>

#include "platform/linux/queue/LinuxQueues.h"
#include "providers/DVExtensionDocuvend.h"
#include "providers/DVProviderRegistry.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

constexpr int kCallers = 8;
constexpr int kPasses = 50;
constexpr int kTurnsForASecondMatch = 200;

using Platform = fake_platform::FakePlatformOver<linux_platform::LinuxQueues>;

class DiscoveryOverThreadsTest : public testing::Test {
 protected:
  // Threads may still hold it when the test has ended.
  Platform& platform = *new Platform;
};

TEST_F(DiscoveryOverThreadsTest, OfManyCallersAtOnceOneBeginsTheMatchAndEachIsAnsweredOnce) {
  std::atomic<int> begun = 0;
  platform.extensionHost.onBeginMatching([&begun] {
    ++begun;
    for (int turn = 0; begun == 1 && turn < kTurnsForASecondMatch; ++turn) std::this_thread::yield();
  });
  std::latch all(kCallers);
  std::vector<std::atomic<int>> answers(kCallers);
  std::vector<std::thread> callers;
  for (std::atomic<int>& answersOfOne : answers) {
    callers.emplace_back([&all, &answersOfOne] {
      all.arrive_and_wait();
      DVExtensionDocuvend::createInstancesCompletion([&answersOfOne] { ++answersOfOne; });
    });
  }
  for (std::thread& caller : callers) caller.join();
  EXPECT_EQ(begun, 1);
  platform.extensionHost.deliver();
  for (const std::atomic<int>& answersOfOne : answers) {
    while (answersOfOne == 0) std::this_thread::yield();
  }
  for (const std::atomic<int>& answersOfOne : answers) EXPECT_EQ(answersOfOne, 1);
}

// A pass resumes the queue before it takes the completion, so the ends of two passes may meet.
TEST_F(DiscoveryOverThreadsTest, OfPassesThatCrowdOneAnotherOneTakesTheStartCompletion) {
  std::atomic<int> starts = 0;
  DVExtensionDocuvend::createInstancesCompletion([&starts] { ++starts; });
  for (int pass = 0; pass < kPasses; ++pass) platform.extensionHost.deliver();
  DVProviderRegistry::shared().refreshOperationsQueue().sync([] {});
  while (starts == 0) std::this_thread::yield();
  EXPECT_EQ(starts, 1);
}

}  // namespace
}  // namespace docuvend
