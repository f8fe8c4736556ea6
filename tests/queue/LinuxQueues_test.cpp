// What only threads can show: overlap, exclusion under load, progress with every thread blocked, and what a wait costs.
#include "platform/linux/queue/LinuxQueues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <system_error>
#include <thread>
#include <vector>

#include "platform/linux/base/LogSubject.h"
#include "tests/queue/Arrivals.h"

namespace docuvend::linux_platform {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

// Where so many threads must be at once before any goes on.
class Meeting {
 public:
  explicit Meeting(std::size_t size) : size_(size) {}
  [[nodiscard]] bool attend() {
    arrivals_.arrive("");
    return arrivals_.waitFor(size_);
  }

 private:
  Arrivals arrivals_;
  const std::size_t size_;
};

TEST(LinuxQueues, AsynchronousReadersOfAConcurrentQueueOverlap) {
  Meeting meeting(3);
  Arrivals arrivals;
  LinuxQueues queues({3, 3});
  const auto queue = queues.concurrentQueue("concurrent");
  for (int i = 0; i < 3; ++i) queue->async([&] { arrivals.arrive(meeting.attend() ? "met" : "alone"); });
  ASSERT_TRUE(arrivals.waitFor(3));
  EXPECT_THAT(arrivals.names(), ElementsAre("met", "met", "met"));
}

// Also when it is run by a thread that is at work for somebody else, and waits for its turn meanwhile.
TEST(LinuxQueues, ATaskIsForWhomItsSubmitterWasAtWork) {
  Arrivals arrivals;
  Arrivals others;
  const auto tell = [&arrivals] {
    const auto subject = LogSubject::current();
    arrivals.arrive(subject ? *subject : "nobody in particular");
  };
  LinuxQueues queues({2, 2});
  const auto queue = queues.serialQueue("serial");
  {
    const LogSubject subject(std::make_shared<const std::string>("one"));
    for (QXQueue* each : {queue.get(), &queues.globalQueue()}) {
      each->async(tell);
      each->barrierAsync(tell);
      each->sync(tell);
      each->after(1ms, tell);
    }
    queues.operationQueue()->addOperation(tell);
  }
  ASSERT_TRUE(arrivals.waitFor(9));
  EXPECT_THAT(arrivals.names(), testing::Each("one"));

  const auto other = queues.serialQueue("other");
  other->suspend();
  for (int i = 0; i < 2; ++i) {
    other->async([&others] {
      const auto subject = LogSubject::current();
      others.arrive(subject ? *subject : "nobody in particular");
    });
  }
  std::thread waiting([&other, &others] {
    const LogSubject subject(std::make_shared<const std::string>("two"));
    other->sync([&others] { others.arrive(*LogSubject::current()); });
  });
  other->resume();
  waiting.join();
  EXPECT_THAT(others.names(), ElementsAre("nobody in particular", "nobody in particular", "two"));
}

TEST(LinuxQueues, SynchronousReadersOfAConcurrentQueueOverlap) {
  Meeting meeting(3);
  std::atomic<int> met = 0;
  LinuxQueues queues({1, 1});
  const auto queue = queues.concurrentQueue("concurrent");
  std::vector<std::thread> threads;
  for (int i = 0; i < 3; ++i) {
    threads.emplace_back([&] { queue->sync([&] { met += meeting.attend() ? 1 : 0; }); });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(met, 3);
}

TEST(LinuxQueues, ReadersBehindABarrierOverlapAgain) {
  Meeting meeting(3);
  Arrivals arrivals;
  LinuxQueues queues({3, 3});
  const auto queue = queues.concurrentQueue("concurrent");
  queue->barrierAsync([&] { arrivals.arrive("barrier"); });
  for (int i = 0; i < 3; ++i) queue->async([&] { arrivals.arrive(meeting.attend() ? "met" : "alone"); });
  ASSERT_TRUE(arrivals.waitFor(4));
  EXPECT_THAT(arrivals.names(), ElementsAre("barrier", "met", "met", "met"));
}

TEST(LinuxQueues, OperationsOfOneQueueOverlap) {
  Meeting meeting(3);
  Arrivals arrivals;
  LinuxQueues queues({3, 3});
  const auto operations = queues.operationQueue();
  for (int i = 0; i < 3; ++i) operations->addOperation([&] { arrivals.arrive(meeting.attend() ? "met" : "alone"); });
  ASSERT_TRUE(arrivals.waitFor(3));
  EXPECT_THAT(arrivals.names(), ElementsAre("met", "met", "met"));
}

TEST(LinuxQueues, ASyncOnAnIdleQueueRunsOnTheCallingThreadAndWakesNobody) {
  LinuxQueues queues;
  const auto self = std::this_thread::get_id();
  const auto serial = queues.serialQueue("serial");
  const auto concurrent = queues.concurrentQueue("concurrent");
  for (int i = 0; i < 100; ++i) {
    EXPECT_EQ(qxSync(*serial, [] { return std::this_thread::get_id(); }), self);
    EXPECT_EQ(qxSync(*concurrent, [] { return std::this_thread::get_id(); }), self);
    EXPECT_EQ(qxSync(queues.globalQueue(), [] { return std::this_thread::get_id(); }), self);
  }
  EXPECT_EQ(queues.wakeUps(), 0u);
}

TEST(LinuxQueues, AReadWhileOthersReadWakesNobody) {
  LinuxQueues queues;
  const auto queue = queues.concurrentQueue("concurrent");
  queue->sync([&queue] {
    std::thread other([&queue] { queue->sync([] {}); });
    other.join();
  });
  EXPECT_EQ(queues.wakeUps(), 0u);
}

TEST(LinuxQueues, AThreadThatEndsItsTaskPicksUpWhatWasSubmittedMeanwhileWithoutBeingWoken) {
  Arrivals arrivals;
  std::atomic<int> ran = 0;
  LinuxQueues queues({1, 1});
  queues.globalQueue().async([&] {
    const auto self = std::this_thread::get_id();
    for (int i = 0; i < 100; ++i) {
      queues.globalQueue().async([&, self] {
        EXPECT_EQ(std::this_thread::get_id(), self);
        if (++ran == 100) arrivals.arrive("all");
      });
    }
  });
  ASSERT_TRUE(arrivals.waitFor(1));
  EXPECT_EQ(queues.wakeUps(), 1u);
}

TEST(LinuxQueues, ADelayedTaskIsNotEarly) {
  Arrivals arrivals;
  LinuxQueues queues;
  const auto queue = queues.serialQueue("serial");
  const auto begin = std::chrono::steady_clock::now();
  queue->after(20ms, [&] { arrivals.arrive("delayed"); });
  ASSERT_TRUE(arrivals.waitFor(1));
  EXPECT_GE(std::chrono::steady_clock::now() - begin, 20ms);
}

TEST(LinuxQueues, AnEndlessDelayNeitherOverflowsNorRuns) {
  Arrivals arrivals;
  LinuxQueues queues;
  const auto queue = queues.serialQueue("serial");
  queue->after(std::chrono::nanoseconds::max(), [&] { arrivals.arrive("endless"); });
  queue->after(std::chrono::nanoseconds::min(), [&] { arrivals.arrive("past"); });
  queue->after(1ms, [&] { arrivals.arrive("delayed"); });
  ASSERT_TRUE(arrivals.waitFor(2));
  EXPECT_THAT(arrivals.names(), ElementsAre("past", "delayed"));
}

// Every thread of the pool and four more are blocked in reads behind a barrier that is pending because of a read in progress; the pool may
// not grow. Whoever waits must run the barrier.
TEST(LinuxQueues, ReadsBehindAPendingBarrierNeverStarveWithEveryThreadBlocked) {
  constexpr int kPoolThreads = 2;
  constexpr int kGlobalReads = 6;
  constexpr int kOtherThreads = 4;
  for (int round = 0; round < 100; ++round) {
    Arrivals started;
    Arrivals reading;
    Arrivals blocking;
    Arrivals released;
    Arrivals finished;
    int value = 0;
    LinuxQueues queues({kPoolThreads, kPoolThreads});
    const auto queue = queues.concurrentQueue("concurrent");
    std::thread firstReader([&] {
      queue->sync([&] {
        reading.arrive("");
        (void)released.waitFor(1);
      });
    });
    ASSERT_TRUE(reading.waitFor(1));
    queue->barrierAsync([&] { value = 1; });
    const auto read = [&] {
      blocking.arrive("");
      queue->sync([&] { finished.arrive(std::to_string(value)); });
    };
    for (int i = 0; i < kGlobalReads; ++i) queues.globalQueue().async(read);
    std::vector<std::thread> others;
    for (int i = 0; i < kOtherThreads; ++i) others.emplace_back(read);
    ASSERT_TRUE(blocking.waitFor(kPoolThreads + kOtherThreads));
    EXPECT_THAT(finished.names(), IsEmpty());
    released.arrive("");
    EXPECT_TRUE(finished.waitFor(kGlobalReads + kOtherThreads)) << "round " << round;
    firstReader.join();
    for (std::thread& thread : others) thread.join();
    EXPECT_EQ(finished.names(), std::vector<std::string>(kGlobalReads + kOtherThreads, "1"));
  }
}

// The one pool thread blocks in a sync on a queue whose head task is not begun; only that thread is left to run it.
TEST(LinuxQueues, ABlockedSyncRunsTheHeadOfItsQueueItself) {
  Arrivals arrivals;
  LinuxQueues queues({1, 1});
  const auto queue = queues.serialQueue("serial");
  queues.globalQueue().async([&] {
    const auto self = std::this_thread::get_id();
    for (int i = 0; i < 3; ++i) queue->async([&arrivals, self] { arrivals.arrive(self == std::this_thread::get_id() ? "self" : "other"); });
    queue->sync([&arrivals] { arrivals.arrive("sync"); });
  });
  ASSERT_TRUE(arrivals.waitFor(4));
  EXPECT_THAT(arrivals.names(), ElementsAre("self", "self", "self", "sync"));
}

// Every pool thread sleeps in a sync on a suspended queue when it is resumed from outside: a sleeper must be woken to run the head.
TEST(LinuxQueues, AResumeWithEveryThreadBlockedOnTheQueueSetsItGoing) {
  for (int round = 0; round < 100; ++round) {
    Arrivals blocking;
    Arrivals finished;
    LinuxQueues queues({2, 2});
    const auto queue = queues.serialQueue("serial");
    queue->suspend();
    queue->async([&] { finished.arrive("head"); });
    for (int i = 0; i < 2; ++i) {
      queues.globalQueue().async([&] {
        blocking.arrive("");
        queue->sync([&] { finished.arrive("sync"); });
      });
    }
    ASSERT_TRUE(blocking.waitFor(2));
    queue->resume();
    ASSERT_TRUE(finished.waitFor(3)) << "round " << round;
    EXPECT_THAT(finished.names(), ElementsAre("head", "sync", "sync"));
  }
}

// A task may wait for something else than a queue: then another thread has to take the place of the blocked one.
TEST(LinuxQueues, ThePoolGrowsWhileItsThreadsAreBlockedInSync) {
  Arrivals reading;
  Arrivals blocking;
  Arrivals released;
  Arrivals finished;
  LinuxQueues queues({1, 2});
  const auto queue = queues.serialQueue("serial");
  std::thread holder([&] {
    queue->sync([&] {
      reading.arrive("");
      finished.arrive(released.waitFor(1) ? "released" : "stuck");
    });
  });
  ASSERT_TRUE(reading.waitFor(1));
  queues.globalQueue().async([&] {
    blocking.arrive("");
    queue->sync([&] { finished.arrive("sync"); });
  });
  ASSERT_TRUE(blocking.waitFor(1));
  queues.globalQueue().async([&] { released.arrive(""); });
  EXPECT_TRUE(finished.waitFor(2));
  EXPECT_THAT(finished.names(), ElementsAre("released", "sync"));
  holder.join();
}

// Chains of waits through several queues, all from a pool that may not grow, with barriers and reads mixed.
TEST(LinuxQueues, WaitsThroughSeveralQueuesNeverStarve) {
  constexpr std::size_t kTasks = 600;
  Arrivals finished;
  std::vector<std::shared_ptr<QXQueue>> chain;
  const std::function<void(std::size_t, std::size_t)> descend = [&](std::size_t level, std::size_t seed) {
    if (level == chain.size()) {
      finished.arrive("");
      return;
    }
    chain[level]->async([] {});
    if (seed % 3 == level % 3) chain[level]->barrierAsync([] {});
    chain[level]->sync([&descend, level, seed] { descend(level + 1, seed); });
  };
  LinuxQueues queues({2, 2});  // ends the tasks before that which they use goes
  for (int i = 0; i < 5; ++i) {
    chain.push_back(i % 2 == 0 ? queues.serialQueue("serial") : queues.concurrentQueue("concurrent"));
  }
  for (std::size_t i = 0; i < kTasks; ++i) {
    switch (i % 3) {
      case 0:
        queues.globalQueue().async([&descend, i] { descend(0, i); });
        break;
      case 1:
        chain[0]->async([&descend, i] { descend(1, i); });
        break;
      default:
        chain[1]->barrierAsync([&descend, i] { descend(2, i); });
        break;
    }
  }
  EXPECT_TRUE(finished.waitFor(kTasks));
}

TEST(LinuxQueues, ABarrierIsAloneUnderLoad) {
  constexpr int kThreads = 4;
  constexpr int kRounds = 1500;
  std::atomic<int> readers = 0;
  std::atomic<int> writers = 0;
  std::atomic<int> violations = 0;
  std::atomic<int> ran = 0;
  int guarded = 0;  // on the queue's barriers only
  LinuxQueues queues({3, 8});
  const auto queue = queues.concurrentQueue("concurrent");
  const auto read = [&] {
    ++readers;
    std::this_thread::yield();
    violations += writers;
    --readers;
    ++ran;
  };
  const auto write = [&] {
    violations += writers++ + readers;
    ++guarded;
    std::this_thread::yield();
    violations += readers;
    --writers;
    ++ran;
  };
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      for (int i = 0; i < kRounds; ++i) {
        switch ((i * 7 + thread) % 5) {
          case 0:
            queue->barrierAsync(write);
            break;
          case 1:
          case 2:
            queue->async(read);
            break;
          default:
            queue->sync(read);
            break;
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  queue->barrierAsync([] {});
  queue->sync([] {});
  EXPECT_EQ(violations, 0);
  EXPECT_EQ(ran, kThreads * kRounds);
  EXPECT_EQ(qxSync(*queue, [&guarded] { return guarded; }), kThreads * kRounds / 5);
}

TEST(LinuxQueues, ASerialQueueKeepsEachThreadsOrderUnderLoad) {
  constexpr int kThreads = 4;
  constexpr int kRounds = 3000;
  std::vector<int> last(kThreads, -1);  // on the queue only
  int disorder = 0;                     // on the queue only
  LinuxQueues queues({3, 8});
  const auto queue = queues.serialQueue("serial");
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      for (int i = 0; i < kRounds; ++i) {
        const auto task = [&last, &disorder, thread, i] {
          if (last[thread] != i - 1) ++disorder;
          last[thread] = i;
        };
        if (i % 4 == 0) {
          queue->sync(task);
        } else {
          queue->async(task);
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(qxSync(*queue, [&disorder] { return disorder; }), 0);
  EXPECT_EQ(qxSync(*queue, [&last] { return last; }), std::vector<int>(kThreads, kRounds - 1));
}

TEST(LinuxQueues, NothingIsLostWhileAQueueIsSuspendedAndResumedUnderLoad) {
  constexpr int kRounds = 2000;
  std::atomic<int> ran = 0;
  LinuxQueues queues({2, 2});
  for (const auto& queue : {queues.serialQueue("serial"), queues.concurrentQueue("concurrent")}) {
    ran = 0;
    std::thread suspender([&queue] {
      for (int i = 0; i < kRounds; ++i) {
        queue->suspend();
        if (i % 3 == 0) std::this_thread::yield();
        queue->resume();
      }
    });
    std::thread submitter([&queue, &queues, &ran] {
      for (int i = 0; i < kRounds; ++i) {
        if (i % 5 == 0) {
          queue->barrierAsync([&ran] { ++ran; });
        } else if (i % 5 == 1) {
          queues.globalQueue().async([&ran, queue] { queue->sync([&ran] { ++ran; }); });
        } else if (i % 5 == 2) {
          queue->sync([&ran] { ++ran; });
        } else {
          queue->async([&ran] { ++ran; });
        }
      }
    });
    suspender.join();
    submitter.join();
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    while (ran < kRounds && std::chrono::steady_clock::now() < deadline) queue->sync([] {});
    EXPECT_EQ(ran, kRounds);
  }
}

TEST(LinuxQueues, SuspendHoldsBackATaskThatWasLetInButNotBegun) {
  Arrivals running;
  Arrivals released;
  Arrivals arrivals;
  Arrivals passed;
  LinuxQueues queues({1, 1});
  const auto queue = queues.serialQueue("serial");
  queues.globalQueue().async([&] {
    running.arrive("");
    (void)released.waitFor(1);
  });
  ASSERT_TRUE(running.waitFor(1));  // the only thread is taken
  queue->async([&] { arrivals.arrive("held back"); });
  queue->suspend();
  released.arrive("");
  queues.globalQueue().async([&] { passed.arrive(""); });  // runs after the pool came by for the queue
  ASSERT_TRUE(passed.waitFor(1));
  EXPECT_THAT(arrivals.names(), IsEmpty());
  queue->resume();
  ASSERT_TRUE(arrivals.waitFor(1));
}

TEST(LinuxQueues, ASyncThatWaitsForAResumeIsNotLetInByWhatIsSubmittedMeanwhile) {
  for (int round = 0; round < 50; ++round) {
    Arrivals waiting;
    Arrivals finished;
    LinuxQueues queues({1, 2});
    const auto queue = queues.concurrentQueue("concurrent");
    queue->suspend();
    std::thread reader([&] {
      waiting.arrive("");
      queue->sync([&] { finished.arrive("sync"); });
    });
    ASSERT_TRUE(waiting.waitFor(1));
    for (int i = 0; i < 20; ++i) {
      queue->async([] {});
      std::this_thread::yield();
    }
    EXPECT_THAT(finished.names(), IsEmpty());
    queue->resume();
    reader.join();
    EXPECT_THAT(finished.names(), ElementsAre("sync"));
  }
}

TEST(LinuxQueues, NothingIsPerformedBeforeTheMainRunLoopRuns) {
  LinuxQueues queues;
  std::vector<std::string> names;
  const auto self = std::this_thread::get_id();
  LinuxRunLoop& loop = queues.mainRunLoop();
  std::thread submitter([&] {
    for (const char* name : {"a", "b", "c"}) {
      loop.perform([&names, name, self] {
        EXPECT_EQ(std::this_thread::get_id(), self);
        names.emplace_back(name);
      });
    }
    loop.perform([&loop] { loop.stop(); });
  });
  submitter.join();
  EXPECT_THAT(names, IsEmpty());
  loop.run();
  EXPECT_THAT(names, ElementsAre("a", "b", "c"));
}

TEST(LinuxQueues, TheEndOfTheServiceWaitsForTheTaskThatRuns) {
  for (int round = 0; round < 50; ++round) {
    Arrivals started;
    bool isFinished = false;
    {
      LinuxQueues queues({2, 2});
      queues.globalQueue().async([&] {
        started.arrive("");
        for (int i = 0; i < 200; ++i) std::this_thread::yield();
        isFinished = true;
      });
      ASSERT_TRUE(started.waitFor(1));
    }
    EXPECT_TRUE(isFinished);
  }
}

TEST(LinuxQueues, TheServiceMayEndWithWorkInEveryState) {
  for (int round = 0; round < 50; ++round) {
    auto held = std::make_shared<std::atomic<int>>(0);
    {
      LinuxQueues queues({2, 4});
      const auto serial = queues.serialQueue("serial");
      const auto concurrent = queues.concurrentQueue("concurrent");
      for (int i = 0; i < 50; ++i) {
        serial->async([held, concurrent] { concurrent->sync([&held] { ++*held; }); });
        concurrent->barrierAsync([held, concurrent] { concurrent->async([held] { ++*held; }); });
        queues.globalQueue().async([held, serial] { serial->sync([&held] { ++*held; }); });
        concurrent->after(std::chrono::microseconds(i), [held, serial] { serial->async([held] { ++*held; }); });
      }
    }
    EXPECT_EQ(held.use_count(), 1);
  }
}

TEST(LinuxQueues, AQueueThatOutlivesTheServiceStillSyncs) {
  std::shared_ptr<QXQueue> queue;
  {
    LinuxQueues queues;
    queue = queues.concurrentQueue("concurrent");
  }
  EXPECT_EQ(qxSync(*queue, [] { return 1; }), 1);
}

// Submits when static objects are destroyed, after everything that the test could have destroyed before.
struct SubmitsAtTheEnd {
  std::shared_ptr<QXQueue> queue;
  ~SubmitsAtTheEnd() {
    LinuxQueues& queues = LinuxQueues::processWide();
    for (int i = 0; i < 200; ++i) {
      queues.globalQueue().async([] {});
      queue->async([] {});
      queue->after(std::chrono::microseconds(i), [] {});
    }
    queue->sync([] {});
    queues.mainRunLoop().perform([] {});
  }
};

TEST(LinuxQueuesDeathTest, WorkMayBeSubmittedWhileTheProcessEnds) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  const auto endWithWork = [] {
    static const SubmitsAtTheEnd atTheEnd{LinuxQueues::processWide().serialQueue("serial")};
    std::exit(3);
  };
  EXPECT_EXIT(endWithWork(), testing::ExitedWithCode(3), "");
}

constexpr int kAsExpected = 3;
constexpr int kNotAsExpected = 4;

// As when somebody has taken all the processes that the user may have. It stays so for this process.
void allowNoFurtherThread() {
  const rlimit none{1, 1};
  bool isRefused = ::setrlimit(RLIMIT_NPROC, &none) != 0;
  try {
    std::thread([] {}).join();
  } catch (const std::system_error&) {
    isRefused = true;
  }
  if (!isRefused) std::_Exit(kNotAsExpected);
}

TEST(LinuxQueuesDeathTest, AllWorkIsDoneByTheFirstThreadsWhenTheSystemHasNoOther) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  const auto work = [] {
    Arrivals arrivals;
    LinuxQueues queues({2, 4});
    const auto serial = queues.serialQueue("serial");
    const auto concurrent = queues.concurrentQueue("concurrent");
    allowNoFurtherThread();
    serial->after(1ms, [&] { arrivals.arrive("delayed"); });
    for (int i = 0; i < 3; ++i) {
      concurrent->async([&] {
        serial->sync([] {});  // it waits, and no other thread can take its place
        arrivals.arrive("read");
      });
      serial->async([&] { arrivals.arrive("written"); });
    }
    queues.globalQueue().async([&] { arrivals.arrive("anywhere"); });
    std::_Exit(arrivals.waitFor(8) ? kAsExpected : kNotAsExpected);
  };
  EXPECT_EXIT(work(), testing::ExitedWithCode(kAsExpected), "");
}

TEST(LinuxQueuesDeathTest, TheServiceIsNotMadeWithoutItsFirstThreads) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  const auto make = [] {
    allowNoFurtherThread();
    try {
      const LinuxQueues queues;
    } catch (const std::system_error&) {
      std::_Exit(kAsExpected);
    }
    std::_Exit(kNotAsExpected);
  };
  EXPECT_EXIT(make(), testing::ExitedWithCode(kAsExpected), "");
}

}  // namespace
}  // namespace docuvend::linux_platform
