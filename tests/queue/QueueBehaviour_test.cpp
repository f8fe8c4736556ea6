// What platform/queue.h promises, over every implementation there is.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeQueues.h"
#include "platform/linux/queue/LinuxQueues.h"
#include "tests/queue/Arrivals.h"

namespace docuvend {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

// How a test makes time and work go on.
struct FakeBench {
  std::optional<fake_platform::FakeQueues> queues{std::in_place};

  void settle(const Arrivals& arrivals, std::size_t count) {
    queues->runAll();
    EXPECT_GE(arrivals.names().size(), count);
  }
  void pass(std::chrono::nanoseconds duration) {
    queues->runAll();
    queues->advance(duration);
  }
  void turnMainRunLoop() { queues->runAll(); }
};

struct LinuxBench {
  std::optional<linux_platform::LinuxQueues> queues{std::in_place, linux_platform::PoolSize{3, 16}};

  void settle(const Arrivals& arrivals, std::size_t count) { EXPECT_TRUE(arrivals.waitFor(count)); }
  void pass(std::chrono::nanoseconds) {}  // it passes by itself
  void turnMainRunLoop() {
    linux_platform::LinuxRunLoop& loop = queues->mainRunLoop();
    loop.perform([&loop] { loop.stop(); });
    loop.run();
  }
};

template <class Bench>
class QueueBehaviour : public testing::Test {
 protected:
  QXQueueService& queues() { return *bench.queues; }
  void settle(std::size_t count) { bench.settle(arrivals, count); }
  QXTask arrival(std::string name) {
    return [this, name = std::move(name)] { arrivals.arrive(name); };
  }
  // Lets everything else go on for a while: whatever could run by mistake has had its chance.
  void roundTrip() {
    Arrivals there;
    const auto other = queues().serialQueue("round trip");
    for (int i = 0; i < 20; ++i) {
      queues().globalQueue().async([&there, other] { other->async([&there] { there.arrive("there"); }); });
    }
    bench.settle(there, 20);
  }

  Arrivals arrivals;  // outlives the tasks
  Bench bench;
};

using Benches = testing::Types<FakeBench, LinuxBench>;
class BenchNames {
 public:
  template <class Bench>
  static std::string GetName(int) {
    return std::is_same_v<Bench, FakeBench> ? "Fake" : "Linux";
  }
};
TYPED_TEST_SUITE(QueueBehaviour, Benches, BenchNames);

TYPED_TEST(QueueBehaviour, QueuesKeepTheirLabels) {
  EXPECT_EQ(this->queues().serialQueue("one")->label(), "one");
  EXPECT_EQ(this->queues().concurrentQueue("two")->label(), "two");
}

TYPED_TEST(QueueBehaviour, SerialTasksRunInTheOrderOfTheirSubmission) {
  const auto queue = this->queues().serialQueue("serial");
  std::vector<std::string> expected;
  for (int i = 0; i < 500; ++i) {
    expected.push_back(std::to_string(i));
    if (i % 2 == 0) {
      queue->async(this->arrival(expected.back()));
    } else {
      queue->barrierAsync(this->arrival(expected.back()));
    }
  }
  this->settle(500);
  EXPECT_EQ(this->arrivals.names(), expected);
}

TYPED_TEST(QueueBehaviour, SyncRunsAfterEverythingSubmittedBeforeIt) {
  const auto queue = this->queues().serialQueue("serial");
  queue->async(this->arrival("a"));
  queue->async(this->arrival("b"));
  queue->sync(this->arrival("sync"));
  EXPECT_THAT(this->arrivals.names(), ElementsAre("a", "b", "sync"));
}

TYPED_TEST(QueueBehaviour, SyncHandsItsResultBack) {
  const auto serial = this->queues().serialQueue("serial");
  const auto concurrent = this->queues().concurrentQueue("concurrent");
  EXPECT_EQ(qxSync(*serial, [] { return std::string("result"); }), "result");
  EXPECT_EQ(qxSync(*concurrent, [] { return 7; }), 7);
  EXPECT_EQ(qxSync(this->queues().globalQueue(), [] { return 8; }), 8);
}

TYPED_TEST(QueueBehaviour, ABarrierSubmittedBeforeASyncIsSeenByIt) {
  const auto queue = this->queues().concurrentQueue("concurrent");
  int value = 0;
  for (int i = 1; i <= 300; ++i) {
    queue->barrierAsync([&value, i] { value = i; });
    ASSERT_EQ(qxSync(*queue, [&value] { return value; }), i);
  }
}

TYPED_TEST(QueueBehaviour, ABarrierRunsAfterWhatStandsBeforeItAndBeforeWhatStandsBehindIt) {
  const auto queue = this->queues().concurrentQueue("concurrent");
  for (int round = 0; round < 20; ++round) {
    for (int i = 0; i < 5; ++i) queue->async(this->arrival("before"));
    queue->barrierAsync(this->arrival("barrier"));
    for (int i = 0; i < 5; ++i) queue->async(this->arrival("behind"));
    queue->barrierAsync(this->arrival("last"));
  }
  this->settle(20 * 12);
  const std::vector<std::string> names = this->arrivals.names();
  ASSERT_EQ(names.size(), 20u * 12u);
  for (std::size_t i = 0; i < names.size(); ++i) {
    const std::size_t place = i % 12;
    EXPECT_EQ(names[i], place < 5 ? "before" : place == 5 ? "barrier" : place < 11 ? "behind" : "last") << i;
  }
}

TYPED_TEST(QueueBehaviour, ABarrierWaitsForTheReaderThatRuns) {
  const auto queue = this->queues().concurrentQueue("concurrent");
  queue->sync([this, queue] {
    queue->barrierAsync(this->arrival("barrier"));
    queue->async(this->arrival("behind"));
    this->roundTrip();
    EXPECT_THAT(this->arrivals.names(), IsEmpty());
  });
  this->settle(2);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("barrier", "behind"));
}

TYPED_TEST(QueueBehaviour, ASuspendedQueueRunsNothingUntilItIsResumed) {
  for (const auto& queue : {this->queues().serialQueue("serial"), this->queues().concurrentQueue("concurrent")}) {
    const std::size_t before = this->arrivals.names().size();
    queue->suspend();
    queue->async(this->arrival("a"));
    queue->barrierAsync(this->arrival("b"));
    queue->async(this->arrival("c"));
    this->roundTrip();
    EXPECT_EQ(this->arrivals.names().size(), before);
    queue->resume();
    this->settle(before + 3);
    EXPECT_EQ(this->arrivals.names().size(), before + 3);
  }
}

TYPED_TEST(QueueBehaviour, EachSuspendNeedsAResume) {
  const auto queue = this->queues().serialQueue("serial");
  queue->suspend();
  queue->suspend();
  queue->async(this->arrival("a"));
  queue->resume();
  this->roundTrip();
  EXPECT_THAT(this->arrivals.names(), IsEmpty());
  queue->resume();
  this->settle(1);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("a"));
}

TYPED_TEST(QueueBehaviour, ATaskThatSuspendsItsOwnQueueEndsAndIsTheLastUntilTheResume) {
  const auto queue = this->queues().serialQueue("serial");
  queue->async([this, queue] {
    queue->suspend();
    this->arrivals.arrive("suspends");
  });
  queue->async(this->arrival("next"));
  this->settle(1);
  this->roundTrip();
  EXPECT_THAT(this->arrivals.names(), ElementsAre("suspends"));
  this->queues().globalQueue().async([queue] { queue->resume(); });
  this->settle(2);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("suspends", "next"));
}

TYPED_TEST(QueueBehaviour, ABarrierThatSuspendsItsOwnQueueHoldsBackReadersAndBarriers) {
  const auto queue = this->queues().concurrentQueue("concurrent");
  queue->barrierAsync([this, queue] {
    queue->suspend();
    this->arrivals.arrive("suspends");
  });
  queue->async(this->arrival("reader"));
  queue->barrierAsync(this->arrival("barrier"));
  this->settle(1);
  this->roundTrip();
  EXPECT_THAT(this->arrivals.names(), ElementsAre("suspends"));
  queue->resume();
  this->settle(3);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("suspends", "reader", "barrier"));
}

TYPED_TEST(QueueBehaviour, ASyncOnASuspendedQueueWaitsForTheResume) {
  const auto queue = this->queues().serialQueue("serial");
  queue->suspend();
  queue->async(this->arrival("before"));
  this->queues().globalQueue().async([this, queue] {
    this->arrivals.arrive("resume");
    queue->resume();
  });
  queue->sync(this->arrival("sync"));
  EXPECT_THAT(this->arrivals.names(), ElementsAre("resume", "before", "sync"));
}

TYPED_TEST(QueueBehaviour, ASyncThatIsAloneOnASuspendedQueueWaitsForTheResumeToo) {
  for (const auto& queue : {this->queues().serialQueue("serial"), this->queues().concurrentQueue("concurrent")}) {
    queue->suspend();
    this->queues().globalQueue().after(5ms, [this, queue] {
      this->arrivals.arrive("resume");
      queue->resume();
    });
    this->bench.pass(5ms);
    queue->sync(this->arrival("sync"));
  }
  EXPECT_THAT(this->arrivals.names(), ElementsAre("resume", "sync", "resume", "sync"));
}

TYPED_TEST(QueueBehaviour, DelayedTasksAreSubmittedInTheOrderOfTheirTimes) {
  const auto queue = this->queues().serialQueue("serial");
  // Where time passes by itself the first call may be so late that its task is rightly the last: then the order proves nothing.
  for (int attempt = 0; attempt < 20; ++attempt) {
    const auto begin = std::chrono::steady_clock::now();
    const std::size_t before = this->arrivals.names().size();
    queue->after(300ms, this->arrival("late"));
    queue->after(20ms, this->arrival("soon"));
    queue->after(0ms, this->arrival("at once"));
    const bool isFair = std::chrono::steady_clock::now() - begin < 15ms;
    this->bench.pass(300ms);
    this->settle(before + 3);
    if (!isFair) continue;
    auto names = this->arrivals.names();
    names.erase(names.begin(), names.begin() + static_cast<std::ptrdiff_t>(before));
    EXPECT_THAT(names, ElementsAre("at once", "soon", "late"));
    return;
  }
  FAIL() << "the machine never made three calls within 15 ms";
}

TYPED_TEST(QueueBehaviour, ADelayedTaskOfASuspendedQueueWaitsForTheResumeToo) {
  const auto queue = this->queues().serialQueue("serial");
  queue->suspend();
  queue->after(1ms, this->arrival("delayed"));
  this->queues().globalQueue().after(30ms, [this, queue] {
    this->arrivals.arrive("resume");
    queue->resume();
  });
  this->bench.pass(30ms);
  this->settle(2);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("resume", "delayed"));
}

TYPED_TEST(QueueBehaviour, AQueueMayBeReleasedWhileItHoldsWork) {
  auto serial = this->queues().serialQueue("serial");
  auto concurrent = this->queues().concurrentQueue("concurrent");
  auto operations = this->queues().operationQueue();
  for (int i = 0; i < 50; ++i) {
    serial->async(this->arrival("task"));
    concurrent->async(this->arrival("task"));
    concurrent->barrierAsync(this->arrival("task"));
    operations->addOperation(this->arrival("task"));
  }
  serial->after(5ms, this->arrival("task"));
  concurrent->after(5ms, this->arrival("task"));
  serial.reset();
  concurrent.reset();
  operations.reset();
  this->bench.pass(5ms);
  this->settle(202);
  EXPECT_EQ(this->arrivals.names().size(), 202u);
}

TYPED_TEST(QueueBehaviour, ATaskMayReleaseTheLastHandleOfItsQueue) {
  for (auto queue : {this->queues().serialQueue("serial"), this->queues().concurrentQueue("concurrent")}) {
    QXQueue& bare = *queue;
    auto last = std::make_shared<std::shared_ptr<QXQueue>>(std::move(queue));
    bare.async([this, last] {
      last->reset();
      this->arrivals.arrive("released");
    });
  }
  this->settle(2);
  auto held = this->queues().concurrentQueue("concurrent");
  QXQueue& bare = *held;
  bare.sync([this, &held] {
    held.reset();
    this->arrivals.arrive("released");
  });
  EXPECT_EQ(this->arrivals.names().size(), 3u);
}

TYPED_TEST(QueueBehaviour, TasksMaySubmitTasks) {
  const auto queue = this->queues().serialQueue("serial");
  queue->suspend();
  queue->async([this, queue] {
    this->arrivals.arrive("a");
    queue->async(this->arrival("c"));
    queue->async([this, queue] {
      this->arrivals.arrive("d");
      this->queues().globalQueue().async([this, queue] { queue->async(this->arrival("e")); });
    });
  });
  queue->async(this->arrival("b"));
  queue->resume();
  this->settle(5);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("a", "b", "c", "d", "e"));
}

TYPED_TEST(QueueBehaviour, ATaskMaySyncOnOtherQueues) {
  const auto first = this->queues().serialQueue("first");
  const auto second = this->queues().concurrentQueue("second");
  const auto third = this->queues().serialQueue("third");
  third->async(this->arrival("third, before"));
  second->barrierAsync(this->arrival("second, before"));
  first->async([this, second, third] {
    second->sync([this, third] {
      third->sync(this->arrival("third"));
      this->arrivals.arrive("second");
    });
    this->arrivals.arrive("first");
  });
  this->settle(5);
  EXPECT_THAT(this->arrivals.names(), UnorderedElementsAre("third, before", "second, before", "third", "second", "first"));
  const std::vector<std::string> names = this->arrivals.names();
  EXPECT_THAT(std::vector<std::string>(names.begin() + 2, names.end()), ElementsAre("third", "second", "first"));
}

TYPED_TEST(QueueBehaviour, AQueueIsCurrentInsideItsTasksOnly) {
  const auto serial = this->queues().serialQueue("serial");
  const auto concurrent = this->queues().concurrentQueue("concurrent");
  QXQueue& global = this->queues().globalQueue();
  EXPECT_FALSE(serial->isCurrent() || concurrent->isCurrent() || global.isCurrent());
  serial->sync([&] {
    EXPECT_TRUE(serial->isCurrent());
    EXPECT_FALSE(concurrent->isCurrent() || global.isCurrent());
    concurrent->sync([&] { EXPECT_TRUE(serial->isCurrent() && concurrent->isCurrent()); });
    EXPECT_FALSE(concurrent->isCurrent());
  });
  concurrent->barrierAsync([&] {
    EXPECT_TRUE(concurrent->isCurrent());
    EXPECT_FALSE(serial->isCurrent() || global.isCurrent());
    this->arrivals.arrive("barrier");
  });
  global.async([&] {
    EXPECT_TRUE(global.isCurrent());
    EXPECT_FALSE(serial->isCurrent() || concurrent->isCurrent());
    this->arrivals.arrive("global");
  });
  this->settle(2);
  EXPECT_FALSE(serial->isCurrent() || concurrent->isCurrent() || global.isCurrent());
}

TYPED_TEST(QueueBehaviour, ATaskThatIsRunInsideAnothersSyncIsNotATaskOfTheWaitersQueue) {
  const auto waiter = this->queues().serialQueue("waiter");
  const auto queue = this->queues().serialQueue("queue");
  queue->suspend();
  queue->async([&] {
    EXPECT_TRUE(queue->isCurrent());
    EXPECT_FALSE(waiter->isCurrent());
  });
  this->queues().globalQueue().async([queue] { queue->resume(); });
  waiter->sync([&] { queue->sync([&] { EXPECT_TRUE(waiter->isCurrent()); }); });
}

TYPED_TEST(QueueBehaviour, TheGlobalQueueRunsTasks) {
  QXQueue& global = this->queues().globalQueue();
  global.async(this->arrival("async"));
  global.barrierAsync(this->arrival("barrier"));
  global.after(2ms, this->arrival("after"));
  global.sync(this->arrival("sync"));
  this->bench.pass(2ms);
  this->settle(4);
  EXPECT_THAT(this->arrivals.names(), UnorderedElementsAre("async", "barrier", "after", "sync"));
}

TYPED_TEST(QueueBehaviour, AnOperationQueueHasANameAndRunsOperations) {
  const auto operations = this->queues().operationQueue();
  EXPECT_EQ(operations->name(), "");
  operations->setName("Operation queue for a");
  EXPECT_EQ(operations->name(), "Operation queue for a");
  operations->addOperation(this->arrival("a"));
  operations->addOperation(this->arrival("b"));
  this->settle(2);
  EXPECT_THAT(this->arrivals.names(), UnorderedElementsAre("a", "b"));
}

TYPED_TEST(QueueBehaviour, TheMainRunLoopPerformsInOrderWhatItWasGivenBeforeItRanToo) {
  QXRunLoop& loop = this->queues().mainRunLoop();
  loop.perform([this, &loop] {
    this->arrivals.arrive("a");
    loop.perform(this->arrival("c"));
  });
  loop.perform(this->arrival("b"));
  this->bench.turnMainRunLoop();
  const std::vector<std::string> names = this->arrivals.names();
  ASSERT_GE(names.size(), 2u);
  EXPECT_EQ(names[0], "a");
  EXPECT_EQ(names[1], "b");
}

TYPED_TEST(QueueBehaviour, WhatATaskHeldIsReleasedBeforeTheNextTaskOfASerialQueue) {
  const auto queue = this->queues().serialQueue("serial");
  for (int i = 0; i < 100; ++i) {
    auto held = std::make_shared<int>(0);
    const std::weak_ptr<int> weak = held;
    queue->async([held = std::move(held)] { ++*held; });
    EXPECT_TRUE(qxSync(*queue, [&weak] { return weak.expired(); }));
  }
}

TYPED_TEST(QueueBehaviour, WhatATaskHeldIsReleasedAsPartOfTheTask) {
  const auto queue = this->queues().serialQueue("serial");
  const auto release = [this, queue](int*) {
    this->arrivals.arrive(queue->isCurrent() ? "released on the queue" : "released elsewhere");
    queue->async(this->arrival("submitted by the release"));
  };
  static int thing = 0;
  queue->async([held = std::shared_ptr<int>(&thing, release)] { ++*held; });
  this->settle(2);
  EXPECT_THAT(this->arrivals.names(), ElementsAre("released on the queue", "submitted by the release"));
}

TYPED_TEST(QueueBehaviour, TasksThatNeverRunAreDestroyedWithTheService) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> weak = held;
  auto queue = this->queues().serialQueue("serial");
  auto other = this->queues().concurrentQueue("concurrent");
  queue->suspend();
  other->suspend();
  const auto never = [held, queue, other] { ADD_FAILURE() << "ran"; };
  queue->async(never);
  other->async(never);
  other->barrierAsync(never);
  queue->after(1h, never);
  this->queues().globalQueue().after(1h, never);
  this->queues().mainRunLoop().perform(never);
  held.reset();
  queue.reset();
  EXPECT_EQ(weak.use_count(), 7);  // `never` and its six copies
  this->bench.queues.reset();      // `other` outlives it
  EXPECT_EQ(weak.use_count(), 1);
  other->async(never);
  other->resume();
  EXPECT_EQ(weak.use_count(), 1);
}

TYPED_TEST(QueueBehaviour, TasksOfASuspendedQueueAreDestroyedWithItsLastHandle) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> weak = held;
  auto queue = this->queues().serialQueue("serial");
  queue->suspend();
  queue->async([held = std::move(held)] { ADD_FAILURE() << "ran " << *held; });
  queue.reset();
  EXPECT_TRUE(weak.expired());
  this->roundTrip();
}

#ifndef NDEBUG

template <class Bench>
class QueueBehaviourDeathTest : public QueueBehaviour<Bench> {
 protected:
  void SetUp() override { testing::GTEST_FLAG(death_test_style) = "threadsafe"; }
};
TYPED_TEST_SUITE(QueueBehaviourDeathTest, Benches, BenchNames);

TYPED_TEST(QueueBehaviourDeathTest, SyncFromATaskOfTheSameSerialQueueIsCaught) {
  const auto queue = this->queues().serialQueue("serial");
  const auto nested = [&] { queue->sync([&] { queue->sync([] {}); }); };
  EXPECT_DEATH(nested(), "sync from a task of the queue itself");
}

TYPED_TEST(QueueBehaviourDeathTest, AReadNestedInAReadOfTheSameQueueIsCaught) {
  const auto queue = this->queues().concurrentQueue("concurrent");
  const auto other = this->queues().serialQueue("other");
  const auto nested = [&] { queue->sync([&] { other->sync([&] { queue->sync([] {}); }); }); };
  EXPECT_DEATH(nested(), "sync from a task of the queue itself");
}

TYPED_TEST(QueueBehaviourDeathTest, SyncFromABarrierOfTheSameQueueIsCaught) {
  const auto queue = this->queues().concurrentQueue("concurrent");
  const auto nested = [&] {
    queue->barrierAsync([&] { queue->sync([] {}); });
    queue->sync([] {});
  };
  EXPECT_DEATH(nested(), "sync from a task of the queue itself");
}

TYPED_TEST(QueueBehaviourDeathTest, OneResumeTooManyIsCaught) {
  const auto queue = this->queues().serialQueue("serial");
  queue->suspend();
  queue->resume();
  EXPECT_DEATH(queue->resume(), "one resume too many");
}

TYPED_TEST(QueueBehaviourDeathTest, SuspendingTheGlobalQueueIsCaught) {
  EXPECT_DEATH(this->queues().globalQueue().suspend(), "cannot be suspended");
  EXPECT_DEATH(this->queues().globalQueue().resume(), "cannot be suspended");
}

#endif

}  // namespace
}  // namespace docuvend
