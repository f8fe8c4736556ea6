#include "platform/linux/sandbox/UsesInFlight.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <optional>
#include <thread>
#include <vector>

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr std::chrono::seconds kPatience{60};
constexpr const char* kFile = "/a/b/c";

void waitFor(UsesInFlight& uses) { EXPECT_THAT(uses.waitForEarlier({"/a/b/"}, kPatience), IsEmpty()); }

TEST(UsesInFlight, AreNotWaitedForWhenThereAreNone) {
  UsesInFlight uses;
  waitFor(uses);
  { const auto over = uses.begin(kFile); }
  waitFor(uses);
  waitFor(uses);
}

TEST(UsesInFlight, AreWaitedForToTheLastByAllWhoCameLater) {
  constexpr int kRounds = 50;
  constexpr int kWaiters = 2;
  UsesInFlight uses;
  for (int round = 0; round < kRounds; ++round) {
    auto first = std::make_optional(uses.begin(kFile));
    auto second = std::make_optional(uses.begin(kFile));
    std::atomic<int> ended{0};
    std::atomic<int> called{0};
    std::vector<std::thread> waiters;
    for (int i = 0; i < kWaiters; ++i) {
      waiters.emplace_back([&uses, &ended, &called] {
        ++called;
        waitFor(uses);
        EXPECT_EQ(ended.load(), 2);
      });
    }
    while (called.load() < kWaiters) std::this_thread::yield();
    for (int i = 0; i < 10; ++i) std::this_thread::yield();  // time for one that does not wait to show it
    ++ended;
    first.reset();
    ++ended;
    second.reset();
    for (auto& waiter : waiters) waiter.join();
  }
}

TEST(UsesInFlight, DelayNobodyWhenTheyBeginLater) {
  UsesInFlight uses;
  // Without end somebody is in a use: each begins before the one before it ends.
  std::atomic<bool> stop{false};
  std::promise<void> begun;
  std::thread user([&uses, &stop, &begun] {
    auto current = std::make_optional(uses.begin(kFile));
    begun.set_value();
    while (!stop.load()) {
      auto next = uses.begin(kFile);
      current.reset();
      current.emplace(std::move(next));
    }
  });
  begun.get_future().wait();
  for (int round = 0; round < 100; ++round) waitFor(uses);
  stop.store(true);
  user.join();
}

TEST(UsesInFlight, AreNotWaitedForElsewhere) {
  UsesInFlight uses;
  const auto use = uses.begin(kFile);
  EXPECT_THAT(uses.waitForEarlier({"/a/c/", "/b/", "/a/b/c/", "/a/b/cc/"}, kPatience), IsEmpty());
  EXPECT_THAT(uses.waitForEarlier({}, kPatience), IsEmpty());
  EXPECT_THAT(uses.waitForEarlier({"/b/", "/"}, std::chrono::milliseconds(1)), ElementsAre(kFile));
}

TEST(UsesInFlight, AreNotWaitedForForEver) {
  UsesInFlight uses;
  const auto first = uses.begin("/a/first");
  auto over = std::make_optional(uses.begin("/a/second"));
  const auto beside = uses.begin("/b/third");
  const auto fourth = uses.begin("/a/b/fourth");
  over.reset();
  EXPECT_THAT(uses.waitForEarlier({"/a/"}, std::chrono::milliseconds(1)), ElementsAre("/a/first", "/a/b/fourth"));
  EXPECT_THAT(uses.waitForEarlier({"/a/b/"}, std::chrono::milliseconds(1)), ElementsAre("/a/b/fourth"));
}

TEST(UsesInFlight, EndOnceHoweverOftenTheyAreMoved) {
  UsesInFlight uses;
  auto outer = std::make_optional(uses.begin(kFile));
  {
    const auto moved = *std::move(outer);
    outer.reset();
    EXPECT_FALSE(outer);
  }
  waitFor(uses);
  const auto another = uses.begin(kFile);  // a count that was ended twice would be of the next round
  static_cast<void>(another);
}

// Some act while they see that they may; somebody forbids it and waits: none acts then.
TEST(UsesInFlight, LeaveNobodyActingOnWhatHeSawBefore) {
  constexpr int kRounds = 50;
  UsesInFlight uses;
  std::atomic<bool> allowed{true};
  std::atomic<int> acting{0};
  std::atomic<int> acted{0};
  std::atomic<bool> stop{false};
  std::vector<std::thread> actors;
  for (int i = 0; i < 3; ++i) {
    actors.emplace_back([&uses, &allowed, &acting, &acted, &stop] {
      while (!stop.load()) {
        const auto use = uses.begin(kFile);
        if (!allowed.load()) continue;
        ++acting;
        std::this_thread::yield();
        ++acted;
        --acting;
      }
    });
  }
  for (int round = 0; round < kRounds; ++round) {
    const int before = acted.load();
    while (acted.load() == before) std::this_thread::yield();
    allowed.store(false);
    waitFor(uses);
    EXPECT_EQ(acting.load(), 0) << round;
    allowed.store(true);
  }
  stop.store(true);
  for (auto& actor : actors) actor.join();
}

}  // namespace
}  // namespace docuvend::linux_platform
