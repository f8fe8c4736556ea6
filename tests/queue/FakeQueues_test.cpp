// What the fake adds to the contract: the turning by hand.
#include "platform/fake/FakeQueues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace docuvend::fake_platform {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

TEST(FakeQueues, NothingRunsBeforeItIsTurned) {
  FakeQueues queues;
  int ran = 0;
  const auto run = [&ran] { ++ran; };
  const auto serial = queues.serialQueue("serial");
  const auto operations = queues.operationQueue();
  operations->setName("operations");
  serial->async(run);
  serial->async(run);
  queues.globalQueue().async(run);
  operations->addOperation(run);
  queues.mainRunLoop().perform(run);
  queues.mainRunLoop().run();
  EXPECT_EQ(ran, 0);
  EXPECT_EQ(queues.runLoopRuns(), 1u);
  EXPECT_EQ(queues.pending(), 5u);
  EXPECT_EQ(queues.pending("serial"), 2u);
  EXPECT_EQ(queues.pending("operations"), 1u);
  EXPECT_EQ(queues.pendingOperations(), 1u);
  EXPECT_EQ(queues.pendingOnGlobalQueue(), 1u);
  EXPECT_EQ(queues.pendingOnMainRunLoop(), 1u);
  EXPECT_EQ(queues.runAll(), 5u);
  EXPECT_EQ(ran, 5);
  EXPECT_EQ(queues.pending(), 0u);
}

TEST(FakeQueues, TasksAreTurnedOneByOneOldestFirstAndSeeWhereTheyRun) {
  FakeQueues queues;
  std::vector<std::string> labels;
  const auto note = [&] { labels.push_back(queues.currentLabel()); };
  const auto first = queues.serialQueue("first");
  const auto second = queues.concurrentQueue("second");
  second->async(note);
  first->async([&] {
    note();
    second->sync(note);
    note();
  });
  queues.globalQueue().async(note);
  queues.mainRunLoop().perform(note);
  EXPECT_TRUE(queues.runOne());
  EXPECT_THAT(labels, ElementsAre("second"));
  EXPECT_TRUE(queues.runOne(kFakeMainRunLoopLabel));
  EXPECT_FALSE(queues.runOne(kFakeMainRunLoopLabel));
  EXPECT_TRUE(queues.runOne());
  EXPECT_TRUE(queues.runOne());
  EXPECT_FALSE(queues.runOne());
  EXPECT_THAT(labels, ElementsAre("second", kFakeMainRunLoopLabel, "first", "second", "first", kFakeGlobalQueueLabel));
  EXPECT_EQ(queues.currentLabel(), "");
}

TEST(FakeQueues, TimePassesByHandAndDueTasksAreSubmittedNotRun) {
  FakeQueues queues;
  int ran = 0;
  queues.globalQueue().after(2s, [&ran] { ++ran; });
  queues.advance(1999ms);
  queues.runAll();
  EXPECT_EQ(ran, 0);
  EXPECT_EQ(queues.pendingTimers(), 1u);
  queues.advance(1ms);
  EXPECT_EQ(ran, 0);
  EXPECT_EQ(queues.pendingTimers(), 0u);
  EXPECT_EQ(queues.pendingOnGlobalQueue(), 1u);
  queues.runAll();
  EXPECT_EQ(ran, 1);
}

TEST(FakeQueues, CreatedQueuesAreRememberedWithTheirKindsAndLabelsAfterTheirReleaseToo) {
  FakeQueues queues;
  (void)queues.serialQueue("one after another");
  const auto held = queues.concurrentQueue("side by side");
  EXPECT_THAT(queues.createdQueues(), ElementsAre(FakeCreatedQueue{FakeQueueKind::serial, "one after another"},
                                                  FakeCreatedQueue{FakeQueueKind::concurrent, "side by side"}));
}

TEST(FakeQueues, SuspensionIsCounted) {
  FakeQueues queues;
  const auto queue = queues.serialQueue("serial");
  EXPECT_EQ(queues.suspendedCount("serial"), 0u);
  queue->suspend();
  queue->suspend();
  EXPECT_EQ(queues.suspendedCount("serial"), 2u);
  queue->async([] {});
  EXPECT_EQ(queues.runAll(), 0u);
  EXPECT_EQ(queues.pending("serial"), 1u);
  queue->resume();
  queue->resume();
  EXPECT_EQ(queues.runAll(), 1u);
}

TEST(FakeQueues, ATurnInsideATaskRespectsWhatRuns) {
  FakeQueues queues;
  std::vector<std::string> names;
  const auto note = [&names](std::string name) { return [&names, name = std::move(name)] { names.push_back(name); }; };
  const auto serial = queues.serialQueue("serial");
  const auto concurrent = queues.concurrentQueue("concurrent");
  serial->async([&] {
    serial->async(note("serial"));
    concurrent->sync([&] {
      concurrent->async(note("reader"));
      concurrent->barrierAsync(note("barrier"));
      concurrent->async(note("behind"));
      queues.runAll();
      EXPECT_THAT(names, ElementsAre("reader"));
    });
  });
  queues.runAll();
  EXPECT_THAT(names, ElementsAre("reader", "serial", "barrier", "behind"));
}

TEST(FakeQueuesDeathTest, ASyncThatWouldWaitForEverIsCaught) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  FakeQueues queues;
  const auto queue = queues.serialQueue("serial");
  queue->suspend();
  EXPECT_DEATH(queue->sync([] {}), "serial: sync would wait for ever");
}

TEST(FakeQueuesDeathTest, UseFromASecondThreadIsCaught) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  FakeQueues queues;
  const auto useElsewhere = [&queues] { std::thread([&queues] { queues.globalQueue().async([] {}); }).join(); };
  EXPECT_DEATH(useElsewhere(), "used from two threads");
}

TEST(FakeQueuesDeathTest, WorkWithoutEndIsCaught) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  FakeQueues queues;
  std::function<void()> again = [&] { queues.globalQueue().async(again); };
  again();
  EXPECT_DEATH(queues.runAll(), "runAll sees no end");
}

}  // namespace
}  // namespace docuvend::fake_platform
