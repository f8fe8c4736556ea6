#include "platform/linux/files/LinuxNotificationCenter.h"

#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/fake/FakeNotificationCenter.h"
#include "platform/fake/FakeQueues.h"

namespace docuvend {
namespace {

// What every notification center does, the fake included.
template <class Center>
class NotificationCenterBehavior : public ::testing::Test {
 protected:
  void observe(const std::string& notification, const std::string& mark) {
    center_.addObserver(
        notification, [this, mark] { heard_ += mark; }, QXSuspensionBehavior::deliverImmediately);  // the center dies with this test
  }

  fake_platform::FakeQueues queues_;
  Center center_{queues_.mainRunLoop()};
  std::string heard_;
};

using Adapters = ::testing::Types<fake_platform::FakeNotificationCenter, linux_platform::LinuxNotificationCenter>;
TYPED_TEST_SUITE(NotificationCenterBehavior, Adapters);

TYPED_TEST(NotificationCenterBehavior, CallsBackOnTheMainRunLoopAndNotBefore) {
  this->observe("a", "1");
  this->center_.post("a");
  EXPECT_EQ(this->heard_, "");
  EXPECT_EQ(this->queues_.pendingOnMainRunLoop(), 1U);
  this->queues_.runAll();
  EXPECT_EQ(this->heard_, "1");
}

TYPED_TEST(NotificationCenterBehavior, EachPostCallsEachObserverOnceInTheOrderOfRegistration) {
  this->observe("a", "1");
  this->observe("a", "2");
  this->center_.post("a");
  this->center_.post("a");
  this->queues_.runAll();
  EXPECT_EQ(this->heard_, "1212");
}

TYPED_TEST(NotificationCenterBehavior, OnlyObserversOfThatNameAreCalled) {
  this->observe("a", "1");
  this->observe("b", "2");
  this->center_.post("b");
  this->center_.post("c");
  this->queues_.runAll();
  EXPECT_EQ(this->heard_, "2");
}

TYPED_TEST(NotificationCenterBehavior, AnObserverDoesNotHearWhatWasPostedBefore) {
  this->center_.post("a");
  this->observe("a", "1");
  this->queues_.runAll();
  EXPECT_EQ(this->heard_, "");
}

TYPED_TEST(NotificationCenterBehavior, AnObserverMayAddAnotherAndPost) {
  this->center_.addObserver(
      "a",
      [this] {
        this->observe("b", "2");
        this->center_.post("b");
      },
      QXSuspensionBehavior::deliverImmediately);
  this->center_.post("a");
  this->queues_.runAll();
  EXPECT_EQ(this->heard_, "2");
}

// Runs everything at once, on the thread that gives it.
class ImmediateRunLoop : public QXRunLoop {
 public:
  void run() override {}
  void perform(QXTask task) override { task(); }
};

TEST(LinuxNotificationCenter, NothingIsLostWhenThreadsPostAndObserveTogether) {
  constexpr int kThreads = 4;
  constexpr int kPosts = 200;
  ImmediateRunLoop runLoop;
  linux_platform::LinuxNotificationCenter center(runLoop);
  std::atomic<int> calls = 0;
  center.addObserver(
      "a", [&calls] { ++calls; }, QXSuspensionBehavior::deliverImmediately);
  {
    std::vector<std::jthread> threads;
    for (int i = 0; i < kThreads; ++i) {
      threads.emplace_back([&center] {
        for (int k = 0; k < kPosts; ++k) {
          center.addObserver(
              "b", [] {}, QXSuspensionBehavior::deliverImmediately);
          center.post("a");
        }
      });
    }
  }
  EXPECT_EQ(calls, kThreads * kPosts);
}

}  // namespace
}  // namespace docuvend
