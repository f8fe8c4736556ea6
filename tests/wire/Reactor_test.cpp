#include "platform/linux/wire/Reactor.h"

#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <unistd.h>

#include <atomic>
#include <thread>
#include <vector>

#include "tests/wire/RawPeer.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

using tests::Mailbox;
using tests::socketPair;

void writeByte(int socket) { ASSERT_EQ(::write(socket, "x", 1), 1); }
void readByte(int socket) {
  char byte = 0;
  ASSERT_EQ(::read(socket, &byte, 1), 1);
}

TEST(ReactorTest, AHandlerRunsForEachReadinessItAsksFor) {
  auto [one, two] = socketPair();
  Mailbox<std::uint32_t> events;
  Reactor reactor(2);
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

TEST(ReactorTest, AHandlerThatAsksForNothingRunsAgainAfterRearm) {
  auto [one, two] = socketPair();
  Mailbox<int> runs;
  Reactor reactor(2);
  const auto registration = reactor.watch(two.get(), EPOLLIN, [&runs](std::uint32_t) -> std::uint32_t {
    runs.put(1);
    return 0;
  });
  writeByte(one.get());
  ASSERT_TRUE(runs.take());
  Mailbox<int> posted;
  reactor.post([&posted] { posted.put(1); });
  ASSERT_TRUE(posted.take());
  EXPECT_EQ(runs.count(), 0U) << "the byte is still there, but nobody waits for it";
  registration->rearm(EPOLLIN);
  EXPECT_TRUE(runs.take());
}

TEST(ReactorTest, ARearmWhileTheHandlerRunsIsNotLost) {
  auto [one, two] = socketPair();
  Mailbox<int> entered;
  Mailbox<int> mayLeave;
  Reactor reactor(1);
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

TEST(ReactorTest, OneRegistrationsHandlerNeverRunsTwiceAtATime) {
  auto [one, two] = socketPair();
  std::atomic<int> inside = 0;
  std::atomic<bool> overlapped = false;
  Mailbox<int> done;
  Reactor reactor(4);
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

TEST(ReactorTest, ABlockedHandlerDoesNotHoldUpOthers) {
  auto [one, two] = socketPair();
  auto [three, four] = socketPair();
  Mailbox<int> blocked;
  Mailbox<int> mayLeave;
  Mailbox<int> other;
  Reactor reactor(2);
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

TEST(ReactorTest, ADroppedRegistrationLetsItsHandlerGo) {
  auto [one, two] = socketPair();
  auto held = std::make_shared<int>(1);
  const std::weak_ptr<int> weak = held;
  Reactor reactor(2);
  auto registration = reactor.watch(two.get(), EPOLLIN, [held = std::move(held)](std::uint32_t) -> std::uint32_t { return 0; });
  EXPECT_FALSE(weak.expired());
  registration.reset();
  EXPECT_TRUE(weak.expired());
}

TEST(ReactorTest, AHandlerMayDropItsOwnRegistration) {
  auto [one, two] = socketPair();
  Mailbox<int> runs;
  Reactor reactor(2);
  auto registration = std::make_shared<std::shared_ptr<Reactor::Registration>>();
  Mailbox<int> set;
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

TEST(ReactorTest, WatchingWhatIsNoSocketIsRefused) {
  Reactor reactor(1);
  EXPECT_EQ(reactor.watch(-1, EPOLLIN, [](std::uint32_t) -> std::uint32_t { return 0; }), nullptr);
}

TEST(ReactorTest, EveryPostedTaskRunsOnceOnAThreadOfTheReactor) {
  constexpr int kTasks = 1000;
  Mailbox<std::thread::id> ran;
  Reactor reactor(3);
  for (int i = 0; i < kTasks; ++i) reactor.post([&ran] { ran.put(std::this_thread::get_id()); });
  for (int i = 0; i < kTasks; ++i) EXPECT_NE(ran.take(), std::this_thread::get_id());
  EXPECT_EQ(ran.count(), 0U);
}

TEST(ReactorTest, TasksThatWereAcceptedRunBeforeTheReactorIsGoneAndLaterOnesAreDropped) {
  constexpr int kTasks = 100;
  std::atomic<int> ran = 0;
  Reactor::Poster poster;
  {
    Reactor reactor(1);
    poster = reactor.poster();
    for (int i = 0; i < kTasks; ++i) reactor.post([&ran] { ++ran; });
  }
  EXPECT_EQ(ran, kTasks);
  poster([&ran] { ++ran; });
  EXPECT_EQ(ran, kTasks);
}

TEST(ReactorTest, ARegistrationMayOutliveTheReactor) {
  auto [one, two] = socketPair();
  std::shared_ptr<Reactor::Registration> registration;
  {
    Reactor reactor(1);
    registration = reactor.watch(two.get(), EPOLLIN, [](std::uint32_t) -> std::uint32_t { return EPOLLIN; });
  }
  registration->rearm(EPOLLOUT);
  registration.reset();
}

}  // namespace
}  // namespace docuvend::linux_platform
