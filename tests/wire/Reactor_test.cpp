#include "platform/linux/wire/Reactor.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <sys/resource.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <ostream>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/linux/base/Sanitizers.h"
#include "tests/wire/RawPeer.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {

static void PrintTo(Reactor::Waiting waiting, std::ostream* stream) {
  *stream << (waiting == Reactor::Waiting::byEpoll ? "by epoll" : "by poll alone");
}

namespace {

using tests::Mailbox;
using tests::socketPair;

// By epoll and without: everything holds either way.
class ReactorTest : public testing::TestWithParam<Reactor::Waiting> {};

INSTANTIATE_TEST_SUITE_P(Waiting, ReactorTest, testing::Values(Reactor::Waiting::byEpoll, Reactor::Waiting::byPollAlone),
                         [](const auto& instance) { return instance.param == Reactor::Waiting::byEpoll ? "ByEpoll" : "ByPollAlone"; });

void writeByte(int socket) { ASSERT_EQ(::write(socket, "x", 1), 1); }
void readByte(int socket) {
  char byte = 0;
  ASSERT_EQ(::read(socket, &byte, 1), 1);
}

TEST_P(ReactorTest, AHandlerRunsForEachReadinessItAsksFor) {
  auto [one, two] = socketPair();
  Mailbox<std::uint32_t> events;
  Reactor reactor(2, GetParam());
  const auto registration = reactor.watch(two.get(), EPOLLIN, [&events, socket = two.get()](std::uint32_t ready) -> std::uint32_t {
    readByte(socket);
    events.put(ready);
    return EPOLLIN;
  });
  for (int i = 0; i < 3; ++i) {
    writeByte(one.get());
    EXPECT_EQ(events.take(), static_cast<std::uint32_t>(EPOLLIN));
  }
}

TEST_P(ReactorTest, AHandlerThatAsksForNothingRunsAgainAfterRearm) {
  auto [one, two] = socketPair();
  Mailbox<int> runs;
  Mailbox<int> posted;
  Reactor reactor(2, GetParam());
  const auto registration = reactor.watch(two.get(), EPOLLIN, [&runs](std::uint32_t) -> std::uint32_t {
    runs.put(1);
    return 0;
  });
  writeByte(one.get());
  ASSERT_TRUE(runs.take());
  reactor.post([&posted] { posted.put(1); });
  ASSERT_TRUE(posted.take());
  EXPECT_EQ(runs.count(), 0U) << "the byte is still there, but nobody waits for it";
  registration->rearm(EPOLLIN);
  EXPECT_TRUE(runs.take());
}

TEST_P(ReactorTest, ARearmWhileTheHandlerRunsIsNotLost) {
  auto [one, two] = socketPair();
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  Reactor reactor(1, GetParam());
  const auto registration = reactor.watch(two.get(), EPOLLIN, [&](std::uint32_t) -> std::uint32_t {
    entered.put(1);
    mayLeave.take();
    return 0;
  });
  writeByte(one.get());
  ASSERT_TRUE(entered.take());
  registration->rearm(EPOLLIN);
  mayLeave.put(1);
  EXPECT_TRUE(entered.take());
  mayLeave.put(1);
}

TEST_P(ReactorTest, OneRegistrationsHandlerNeverRunsTwiceAtATime) {
  auto [one, two] = socketPair();
  std::atomic<int> inside = 0;
  std::atomic<bool> overlapped = false;
  Mailbox<int> done;
  Reactor reactor(4, GetParam());
  std::shared_ptr<Reactor::Registration> registration;
  registration = reactor.watch(two.get(), EPOLLIN | EPOLLOUT, [&](std::uint32_t) -> std::uint32_t {
    if (++inside > 1) overlapped = true;
    std::this_thread::yield();
    --inside;
    done.put(1);
    return 0;
  });
  constexpr int kRounds = 500;
  for (int i = 0; i < kRounds; ++i) {
    registration->rearm(EPOLLIN);
    registration->rearm(EPOLLOUT);
    ASSERT_TRUE(done.take());
    registration->rearm(EPOLLOUT);
  }
  registration.reset();
  EXPECT_FALSE(overlapped);
}

TEST_P(ReactorTest, ABlockedHandlerDoesNotHoldUpOthers) {
  auto [one, two] = socketPair();
  auto [three, four] = socketPair();
  Mailbox<int> blocked;
  Mailbox<int> mayLeave;
  Mailbox<int> other;
  Reactor reactor(2, GetParam());
  const auto first = reactor.watch(two.get(), EPOLLIN, [&](std::uint32_t) -> std::uint32_t {
    blocked.put(1);
    mayLeave.take();
    return 0;
  });
  const auto second = reactor.watch(four.get(), EPOLLIN, [&](std::uint32_t) -> std::uint32_t {
    other.put(1);
    return 0;
  });
  writeByte(one.get());
  ASSERT_TRUE(blocked.take());
  writeByte(three.get());
  EXPECT_TRUE(other.take());
  mayLeave.put(1);
}

TEST_P(ReactorTest, ADroppedRegistrationLetsItsHandlerGo) {
  auto [one, two] = socketPair();
  auto held = std::make_shared<int>(1);
  const std::weak_ptr<int> weak = held;
  Reactor reactor(2, GetParam());
  auto registration = reactor.watch(two.get(), EPOLLIN, [held = std::move(held)](std::uint32_t) -> std::uint32_t { return 0; });
  EXPECT_FALSE(weak.expired());
  registration.reset();
  EXPECT_TRUE(weak.expired());
}

TEST_P(ReactorTest, AHandlerMayDropItsOwnRegistration) {
  auto [one, two] = socketPair();
  Mailbox<int> runs;
  Mailbox<int> set;
  Reactor reactor(2, GetParam());
  auto registration = std::make_shared<std::shared_ptr<Reactor::Registration>>();
  *registration = reactor.watch(two.get(), EPOLLIN, [&, registration](std::uint32_t) -> std::uint32_t {
    set.take();
    registration->reset();
    runs.put(1);
    return EPOLLIN;
  });
  set.put(1);
  writeByte(one.get());
  EXPECT_TRUE(runs.take());
}

TEST_P(ReactorTest, WatchingWhatIsNoSocketIsRefused) {
  Reactor reactor(1, GetParam());
  EXPECT_EQ(reactor.watch(-1, EPOLLIN, [](std::uint32_t) -> std::uint32_t { return 0; }), nullptr);
}

TEST_P(ReactorTest, EveryPostedTaskRunsOnceOnAThreadOfTheReactor) {
  constexpr int kTasks = 1000;
  Mailbox<std::thread::id> ran;
  Reactor reactor(3, GetParam());
  for (int i = 0; i < kTasks; ++i) reactor.post([&ran] { ran.put(std::this_thread::get_id()); });
  for (int i = 0; i < kTasks; ++i) EXPECT_NE(ran.take(), std::this_thread::get_id());
  EXPECT_EQ(ran.count(), 0U);
}

TEST_P(ReactorTest, TasksThatWereAcceptedRunBeforeTheReactorIsGoneAndLaterOnesAreDropped) {
  constexpr int kTasks = 100;
  std::atomic<int> ran = 0;
  Reactor::Poster poster;
  {
    Reactor reactor(1, GetParam());
    poster = reactor.poster();
    for (int i = 0; i < kTasks; ++i) reactor.post([&ran] { ++ran; });
  }
  EXPECT_EQ(ran, kTasks);
  poster([&ran] { ++ran; });
  EXPECT_EQ(ran, kTasks);
}

TEST_P(ReactorTest, ARegistrationMayOutliveTheReactor) {
  auto [one, two] = socketPair();
  std::shared_ptr<Reactor::Registration> registration;
  {
    Reactor reactor(1, GetParam());
    registration = reactor.watch(two.get(), EPOLLIN, [](std::uint32_t) -> std::uint32_t { return EPOLLIN; });
  }
  registration->rearm(EPOLLOUT);
  registration.reset();
}

TEST_P(ReactorTest, AHangUpIsToldToWhoWaitsForNothingElse) {
  auto [one, two] = socketPair();
  Mailbox<std::uint32_t> events;
  Reactor reactor(1, GetParam());
  const auto registration = reactor.watch(two.get(), 0, [&events](std::uint32_t ready) -> std::uint32_t {
    events.put(ready);
    return 0;
  });
  one.reset();
  const auto told = events.take();
  ASSERT_TRUE(told);
  EXPECT_NE(*told & EPOLLHUP, 0U);
}

TEST_P(ReactorTest, AHandlerThatAsksForAnotherTurnGetsItAfterThoseWhoWaitForAThread) {
  auto [one, two] = socketPair();
  Mailbox<std::string> order;
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  int turns = 0;
  Reactor reactor(1, GetParam());
  const auto registration = reactor.watch(two.get(), EPOLLIN, [&](std::uint32_t events) -> std::uint32_t {
    ++turns;
    order.put("turn " + std::to_string(turns) + (events == 0 ? " without events" : " with events"));
    if (turns > 1) return 0;
    entered.put(1);
    mayLeave.take();
    return Reactor::kAgain | EPOLLIN;
  });
  writeByte(one.get());
  ASSERT_TRUE(entered.take());
  reactor.post([&order] { order.put("other"); });
  mayLeave.put(1);
  EXPECT_EQ(order.take(), "turn 1 with events");
  EXPECT_EQ(order.take(), "other");
  EXPECT_EQ(order.take(), "turn 2 without events");
}

TEST_P(ReactorTest, HandlersInOneLaneRunOneAtATimeInTheOrderInWhichTheyBecameReady) {
  constexpr int kHandlers = 8;
  std::vector<std::pair<UniqueDescriptor, UniqueDescriptor>> pairs;
  std::vector<std::shared_ptr<Reactor::Registration>> registrations;
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  std::atomic<int> inside = 0;
  std::atomic<bool> overlapped = false;
  Mailbox<int> passed;
  Reactor reactor(4, GetParam());
  const auto lane = Reactor::makeLane();
  for (int i = 0; i < kHandlers; ++i) {
    auto [one, two] = socketPair();
    registrations.push_back(reactor.watch(
        two.get(), EPOLLIN,
        [&, i](std::uint32_t) -> std::uint32_t {
          if (++inside > 1) overlapped = true;
          entered.put(i);
          mayLeave.take();
          --inside;
          return 0;
        },
        lane));
    pairs.emplace_back(std::move(one), std::move(two));
  }
  writeByte(pairs[0].first.get());
  ASSERT_EQ(entered.take(), 0);
  for (int i = 1; i < kHandlers; ++i) {
    writeByte(pairs[static_cast<std::size_t>(i)].first.get());
    // Whoever is told that the byte is there has lined the handler up.
    auto [near, far] = socketPair();
    const auto probe = reactor.watch(far.get(), EPOLLIN, [&passed](std::uint32_t) -> std::uint32_t {
      passed.put(1);
      return 0;
    });
    for (int k = 0; k < 4; ++k) {
      writeByte(near.get());
      ASSERT_TRUE(passed.take()) << "a busy lane keeps no thread";
      probe->rearm(EPOLLIN);
    }
  }
  for (int i = 1; i < kHandlers; ++i) {
    mayLeave.put(1);
    EXPECT_EQ(entered.take(), i);
  }
  mayLeave.put(1);
  registrations.clear();
  EXPECT_FALSE(overlapped);
}

TEST_P(ReactorTest, ALaneGoesOnWhenARegistrationInItsLineIsDropped) {
  auto [one, two] = socketPair();
  auto [three, four] = socketPair();
  auto [five, six] = socketPair();
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  Reactor reactor(2, GetParam());
  const auto lane = Reactor::makeLane();
  const auto handlerOf = [&](int number) {
    return [&entered, &mayLeave, number](std::uint32_t) -> std::uint32_t {
      entered.put(number);
      mayLeave.take();
      return 0;
    };
  };
  const auto first = reactor.watch(two.get(), EPOLLIN, handlerOf(1), lane);
  auto second = reactor.watch(four.get(), EPOLLIN, handlerOf(2), lane);
  writeByte(one.get());
  ASSERT_EQ(entered.take(), 1);
  writeByte(three.get());
  second.reset();  // in the line or on its way there
  mayLeave.put(1);
  const auto third = reactor.watch(six.get(), EPOLLIN, handlerOf(3), lane);
  writeByte(five.get());
  EXPECT_EQ(entered.take(), 3);
  mayLeave.put(1);
}

TEST_P(ReactorTest, AHandlerInALaneThatAsksForAnotherTurnLetsTheLaneGoOnFirst) {
  auto [one, two] = socketPair();
  auto [three, four] = socketPair();
  Mailbox<std::string> order;
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  Mailbox<int> lined;
  int turns = 0;
  Reactor reactor(2, GetParam());
  const auto lane = Reactor::makeLane();
  const auto first = reactor.watch(
      two.get(), EPOLLIN,
      [&](std::uint32_t) -> std::uint32_t {
        order.put("first");
        entered.put(1);
        mayLeave.take();
        return ++turns == 1 ? Reactor::kAgain : 0;
      },
      lane);
  writeByte(one.get());
  ASSERT_TRUE(entered.take());
  const auto second = reactor.watch(
      four.get(), EPOLLIN,
      [&](std::uint32_t) -> std::uint32_t {
        order.put("second");
        entered.put(2);
        return 0;
      },
      lane);
  writeByte(three.get());
  // The other thread lines the second one up before it comes to what was made ready after it.
  auto [five, six] = socketPair();
  const auto probe = reactor.watch(six.get(), EPOLLIN, [&](std::uint32_t) -> std::uint32_t {
    lined.put(1);
    return 0;
  });
  writeByte(five.get());
  ASSERT_TRUE(lined.take());
  mayLeave.put(1);
  mayLeave.put(1);
  EXPECT_EQ(order.take(), "first");
  EXPECT_EQ(order.take(), "second");
  EXPECT_EQ(order.take(), "first");
}

TEST_P(ReactorTest, LanesDoNotHoldUpEachOther) {
  auto [one, two] = socketPair();
  auto [three, four] = socketPair();
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  Reactor reactor(2, GetParam());
  const auto first = reactor.watch(
      two.get(), EPOLLIN,
      [&](std::uint32_t) -> std::uint32_t {
        entered.put(1);
        mayLeave.take();
        return 0;
      },
      Reactor::makeLane());
  const auto second = reactor.watch(
      four.get(), EPOLLIN,
      [&](std::uint32_t) -> std::uint32_t {
        entered.put(2);
        return 0;
      },
      Reactor::makeLane());
  writeByte(one.get());
  ASSERT_EQ(entered.take(), 1);
  writeByte(three.get());
  EXPECT_EQ(entered.take(), 2);
  mayLeave.put(1);
}

TEST(ReactorFallbackTest, WhatEpollDoesNotTakeIsWaitedForByPoll) {
  const std::string path = testing::TempDir() + "/docuvend-reactor-" + std::to_string(::getpid());
  UniqueDescriptor file(::open(path.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, 0600));
  ASSERT_TRUE(file);
  ::unlink(path.c_str());
  Mailbox<std::uint32_t> events;
  Reactor reactor(2);
  auto registration = reactor.watch(file.get(), EPOLLIN, [&events](std::uint32_t ready) -> std::uint32_t {
    events.put(ready);
    return 0;
  });
  ASSERT_TRUE(registration) << "epoll refuses plain files";
  EXPECT_EQ(events.take(), static_cast<std::uint32_t>(EPOLLIN));
  registration->rearm(EPOLLIN);
  EXPECT_EQ(events.take(), static_cast<std::uint32_t>(EPOLLIN));
  registration.reset();
}

constexpr int kAsExpected = 3;

void allowNoMore(int resource, rlim_t most) {
  const rlimit limit{most, most};
  if (::setrlimit(static_cast<__rlimit_resource>(resource), &limit) != 0) std::_Exit(EXIT_FAILURE);
}

TEST(ReactorDeathTest, SaysThatTheSystemGaveNoThread) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  const auto make = [] {
    allowNoMore(RLIMIT_NPROC, 1);
    bool ran = false;
    bool isRunning = true;
    {
      Reactor reactor(1);
      isRunning = reactor.isRunning();
      reactor.post([&ran] { ran = true; });
    }
    std::_Exit(!isRunning && ran ? kAsExpected : EXIT_FAILURE);
  };
  EXPECT_EXIT(make(), testing::ExitedWithCode(kAsExpected), "");
}

TEST(ReactorDeathTest, RunsWhatIsPostedWhenTheSystemGivesNoDescriptors) {
  if (kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  const auto make = [] {
    allowNoMore(RLIMIT_NOFILE, 0);
    Mailbox<int> posted;
    Reactor reactor(2);
    reactor.post([&posted] { posted.put(1); });
    const bool isRefused = reactor.watch(STDIN_FILENO, EPOLLIN, [](std::uint32_t) -> std::uint32_t { return 0; }) == nullptr;
    std::_Exit(reactor.isRunning() && posted.take() && isRefused ? kAsExpected : EXIT_FAILURE);
  };
  EXPECT_EXIT(make(), testing::ExitedWithCode(kAsExpected), "");
}

}  // namespace
}  // namespace docuvend::linux_platform
