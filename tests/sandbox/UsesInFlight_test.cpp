#include "platform/linux/sandbox/UsesInFlight.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <optional>
#include <thread>
#include <vector>

namespace docuvend::linux_platform {
namespace {

TEST(UsesInFlight, AreNotWaitedForWhenThereAreNone) {
  UsesInFlight uses;
  uses.waitForEarlier();
  { const auto over = uses.begin(); }
  uses.waitForEarlier();
  uses.waitForEarlier();
}

TEST(UsesInFlight, AreWaitedForToTheLastByAllWhoCameLater) {
  constexpr int kRounds = 50;
  constexpr int kWaiters = 2;
  UsesInFlight uses;
  for (int round = 0; round < kRounds; ++round) {
    auto first = std::make_optional(uses.begin());
    auto second = std::make_optional(uses.begin());
    std::atomic<int> ended{0};
    std::atomic<int> called{0};
    std::vector<std::thread> waiters;
    for (int i = 0; i < kWaiters; ++i) {
      waiters.emplace_back([&uses, &ended, &called] {
        ++called;
        uses.waitForEarlier();
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
    auto current = std::make_optional(uses.begin());
    begun.set_value();
    while (!stop.load()) {
      auto next = uses.begin();
      current.reset();
      current.emplace(std::move(next));
    }
  });
  begun.get_future().wait();
  for (int round = 0; round < 100; ++round) uses.waitForEarlier();
  stop.store(true);
  user.join();
}

TEST(UsesInFlight, EndOnceHoweverOftenTheyAreMoved) {
  UsesInFlight uses;
  auto outer = std::make_optional(uses.begin());
  {
    const auto moved = *std::move(outer);
    outer.reset();
    EXPECT_FALSE(outer);
  }
  uses.waitForEarlier();
  const auto another = uses.begin();  // a count that was ended twice would be of the next round
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
        const auto use = uses.begin();
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
    uses.waitForEarlier();
    EXPECT_EQ(acting.load(), 0) << round;
    allowed.store(true);
  }
  stop.store(true);
  for (auto& actor : actors) actor.join();
}

}  // namespace
}  // namespace docuvend::linux_platform
