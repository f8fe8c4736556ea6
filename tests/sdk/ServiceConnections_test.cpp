// Deadlines and restarts, through the consumer library where it shows them.
#include "sdk/ServiceConnections.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <future>
#include <thread>

#include "platform/linux/wire/SocketAddress.h"
#include "tests/sdk/ScriptedDaemon.h"
#include "tests/support/Eventually.h"

namespace docuvend::tests {
namespace {

using linux_platform::QXSandboxRedemption;
using linux_platform::UniqueDescriptor;
using sdk_detail::after;
using sdk_detail::Repeat;
using sdk_detail::ServiceConnections;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using namespace std::chrono_literals;

constexpr auto kNever = std::chrono::hours(24);

std::size_t openDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(all), end(all)));
}

class ServiceConnectionsTest : public ConsumerTest {
 protected:
  // Nothing but the restart's own bound ends a wait.
  static Consumer::Options patient(std::chrono::milliseconds restartPatience) {
    Consumer::Options options;
    options.deadline = options.materialisingDeadline = kNever;
    options.restartPatience = restartPatience;
    return options;
  }
  void restartServices() {
    stopServices();
    startServices();
  }
  Failure stopProviding() { return consumer_->stopProviding(*script_.url, kProvider, kConsumer); }

  Mailbox<QXSandboxRedemption::FileReply> redeemed_;
};

// Deadlines.

TEST_F(ServiceConnectionsTest, AnAnswerThatDoesNotComeIsTheDeadlinesErrorAndLateItIsDropped) {
  holdWakings();
  startServices();
  Consumer& daemon = consumer();
  EXPECT_EQ(errorIn(daemon.within(1ms).wakeUp()), own(ConsumerErrorCode::deadlinePassed));
  const auto late = taken_.take();
  ASSERT_TRUE(late);
  (*late)();
  EXPECT_EQ(errorIn(daemon.within(1ms).wakeUp()), own(ConsumerErrorCode::deadlinePassed)) << "the late answer is not this call's";
}

TEST_F(ServiceConnectionsTest, TheDeadlinesOfTheOptionsHoldForAnswersAndForMaterialising) {
  holdWakings();
  holdStarts();
  startServices();
  Consumer::Options options;
  options.deadline = 1ms;
  options.materialisingDeadline = kNever;
  Consumer& daemon = consumer(options);
  EXPECT_EQ(errorIn(daemon.wakeUp()), own(ConsumerErrorCode::deadlinePassed));
  auto answer = std::async(std::launch::async, [&daemon, this] { return daemon.startProviding(*script_.url, kProvider, kConsumer); });
  const auto reply = started_.take();
  ASSERT_TRUE(reply);
  EXPECT_EQ(errorIn(daemon.wakeUp()), own(ConsumerErrorCode::deadlinePassed)) << "that much time has passed for the other call, too";
  (*reply)(std::nullopt);
  EXPECT_EQ(answer.get(), std::nullopt);
  EXPECT_EQ(errorIn(daemon.within(1ms).startProviding(*script_.url, kProvider, kConsumer)), own(ConsumerErrorCode::deadlinePassed));
}

TEST_F(ServiceConnectionsTest, ADeadlineLongerThanTheClockReachesIsNoPastOne) {
  startServices();
  EXPECT_EQ(consumer().within(std::chrono::milliseconds::max()).wakeUp(), std::nullopt);
}

TEST_F(ServiceConnectionsTest, TenThousandCallsWithoutAnswersLeaveNothingBehind) {
  startServices();
  ASSERT_EQ(consumer().wakeUp(), std::nullopt);
  holdWakings();  // neither answered nor dropped
  constexpr int kCalls = 10'000;
  constexpr std::size_t kFewAtATime = 256;
  const std::size_t descriptors = openDescriptors();
  {
    ServiceConnections services(root_ + "/docuvend/public", std::nullopt, 0ms);
    const auto token = std::make_shared<const int>(1);
    for (int i = 0; i < kCalls; ++i) {
      const auto answer = services.ask<&DVDaemon::wakeUpCompletion>(kDVServiceName, {.until = after(0ms), .held = token}, Repeat::harmless);
      ASSERT_EQ(errorIn(answer), own(ConsumerErrorCode::deadlinePassed)) << "call " << i;
    }
    // What closed connections held goes on the library's own thread.
    eventually("only the last calls are waited for", [&token] { return token.use_count() <= static_cast<long>(kFewAtATime) + 1; });
    script_.waking = nullptr;
    EXPECT_EQ(errorIn(services.ask<&DVDaemon::wakeUpCompletion>(kDVServiceName, {after(kNever)}, Repeat::harmless)), std::nullopt);
  }
  eventually("all descriptors are closed", [descriptors] { return openDescriptors() <= descriptors; });
}

TEST_F(ServiceConnectionsTest, CallsThatRunOverAConnectionGoOnWhenItIsLeftBehind) {
  startServices();
  Consumer& daemon = consumer(patient(0ms));
  holdStops();
  auto running = std::async(std::launch::async, [this] { return stopProviding(); });
  const auto reply = stopped_.take();
  ASSERT_TRUE(reply);
  script_.waking = [](const DVDaemon::Done&) {};
  for (int i = 0; i < 2000; ++i) ASSERT_EQ(errorIn(daemon.within(0ms).wakeUp()), own(ConsumerErrorCode::deadlinePassed));
  script_.waking = nullptr;
  ASSERT_EQ(daemon.wakeUp(), std::nullopt);
  ASSERT_GT(daemon_->declared().size(), 1U);
  (*reply)(std::nullopt);
  EXPECT_EQ(running.get(), std::nullopt);
}

TEST_F(ServiceConnectionsTest, AFileInALateAnswerIsClosed) {
  script_.redeeming = [this](QXSandboxRedemption::FileReply reply) { redeemed_.put(std::move(reply)); };
  startServices();
  Consumer& daemon = consumer();
  EXPECT_EQ(errorIn(daemon.within(1ms).redeem(QXData::fromText("item"), Access::read)), own(ConsumerErrorCode::deadlinePassed));
  auto late = redeemed_.take();
  ASSERT_TRUE(late);
  // The last end of a pipe: who reads it learns when every copy is closed.
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  const UniqueDescriptor reading(ends[0]);
  (*late)({}, linux_platform::toValue(UniqueDescriptor(ends[1])));
  pollfd waiting{reading.get(), 0, 0};
  ASSERT_EQ(::poll(&waiting, 1, std::chrono::milliseconds(kPatience).count()), 1);
  EXPECT_EQ(waiting.revents, POLLHUP);
}

TEST_F(ServiceConnectionsTest, AServiceWhoseQueueIsFullIsWaitedForNoLongerThanTheDeadline) {
  startServices();
  stopServices();
  const std::string path = root_ + "/docuvend/public/" + kDVServiceName;
  std::filesystem::remove(path);
  const UniqueDescriptor service(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const auto found = linux_platform::SocketAddress::forPath(path);
  ASSERT_EQ(found.index(), 0U);
  const auto& address = std::get<linux_platform::SocketAddress>(found);
  ASSERT_EQ(::bind(service.get(), address.address(), address.length()), 0);
  ASSERT_EQ(::listen(service.get(), 0), 0);
  // One waits in the queue, for the answer; the next would have to wait for the queue.
  ServiceConnections first(root_ + "/docuvend/public", std::nullopt, 0ms);
  EXPECT_EQ(errorIn(first.connect(kDVServiceName, after(kNever))), std::nullopt);
  // This one has no earlier connection, whose end it would have to notice within the same millisecond.
  ServiceConnections second(root_ + "/docuvend/public", std::nullopt, kNever);
  EXPECT_EQ(errorIn(second.connect(kDVServiceName, after(1ms))), own(ConsumerErrorCode::unreachable));
}

// Restarts.

TEST_F(ServiceConnectionsTest, ACallThatFindsItsConnectionEndedIsMadeOverANewOne) {
  startServices();
  Consumer& daemon = consumer(patient(0ms));
  constexpr int kRounds = 50;
  for (int i = 0; i < kRounds; ++i) {
    restartServices();
    // One that is not repeated once it was sent: it must never have been sent over the connection that ended.
    ASSERT_EQ(stopProviding(), std::nullopt) << "round " << i;
    ASSERT_EQ(daemon.wakeUp(), std::nullopt);
  }
  EXPECT_THAT(calls_.all(), SizeIs(2 * kRounds));
}

TEST_F(ServiceConnectionsTest, ADaemonThatIsGoneIsWaitedForAndThenUnreachable) {
  startServices();
  consumer(patient(200ms));
  stopServices();
  const auto begin = std::chrono::steady_clock::now();
  const Failure failure = stopProviding();
  EXPECT_GE(std::chrono::steady_clock::now() - begin, 200ms);
  EXPECT_EQ(errorIn(failure), own(ConsumerErrorCode::unreachable));
  ASSERT_TRUE(failure && failure->underlying);
  EXPECT_EQ(failure->underlying->domain, kQXSystemErrorDomain);
  startServices();
  EXPECT_EQ(stopProviding(), std::nullopt) << "it serves again";
}

TEST_F(ServiceConnectionsTest, ADaemonThatIsGoneIsWaitedForNoLongerThanTheDeadline) {
  ServiceConnections services(root_ + "/docuvend/public", std::nullopt, kNever);
  EXPECT_EQ(errorIn(services.ask<&DVDaemon::wakeUpCompletion>(kDVServiceName, {after(1ms)}, Repeat::harmless)),
            own(ConsumerErrorCode::unreachable));
}

TEST_F(ServiceConnectionsTest, ACallDuringARestartIsAnsweredByTheNewDaemon) {
  startServices();
  consumer(patient(kNever));
  stopServices();
  auto answer = std::async(std::launch::async, [this] { return stopProviding(); });
  EXPECT_EQ(answer.wait_for(20ms), std::future_status::timeout);
  EXPECT_THAT(calls_.all(), IsEmpty());
  startServices();
  EXPECT_EQ(answer.get(), std::nullopt);
  EXPECT_THAT(calls_.all(), SizeIs(1));
}

TEST_F(ServiceConnectionsTest, AHarmlessRequestThatWasInHandIsAskedOnceMore) {
  holdWakings();
  startServices();
  Consumer& daemon = consumer(patient(kNever));
  auto answer = std::async(std::launch::async, [&daemon] { return daemon.wakeUp(); });
  ASSERT_TRUE(taken_.take());
  restartServices();
  const auto second = taken_.take();
  ASSERT_TRUE(second);
  (*second)();
  EXPECT_EQ(answer.get(), std::nullopt);
  EXPECT_THAT(calls_.all(), ElementsAre("wake", "wake"));
}

TEST_F(ServiceConnectionsTest, ARequestThatEndsTheDaemonTwiceIsNotAskedAThirdTime) {
  holdWakings();
  startServices();
  Consumer& daemon = consumer(patient(kNever));
  auto answer = std::async(std::launch::async, [&daemon] { return daemon.wakeUp(); });
  ASSERT_TRUE(taken_.take());
  restartServices();
  ASSERT_TRUE(taken_.take());
  restartServices();
  const Failure failure = answer.get();
  EXPECT_EQ(errorIn(failure), own(ConsumerErrorCode::connectionLost));
  ASSERT_TRUE(failure->underlying);
  EXPECT_EQ(failure->underlying->code, ECONNRESET);
  EXPECT_THAT(calls_.all(), ElementsAre("wake", "wake"));
}

TEST_F(ServiceConnectionsTest, ARequestThatIsNotHarmlessIsNotAskedAgain) {
  holdStops();
  startServices();
  consumer(patient(kNever));
  auto answer = std::async(std::launch::async, [this] { return stopProviding(); });
  ASSERT_TRUE(stopped_.take());
  restartServices();
  EXPECT_EQ(errorIn(answer.get()), own(ConsumerErrorCode::connectionLost));
  EXPECT_THAT(calls_.all(), SizeIs(1));
}

// Each operation, with the daemon gone while it has the request in hand: the harmless ones are asked twice.
TEST_F(ServiceConnectionsTest, WhatIsHarmlessIsAskedAgainAndNothingElse) {
  struct Row {
    const char* name;
    bool isRepeated;
    std::function<bool(Consumer&)> succeeds;
  };
  const QXURL url = *script_.url;
  const std::vector<Row> rows = {
      {"wakeUp", true, [](Consumer& daemon) { return !daemon.wakeUp(); }},
      {"extendSandbox", true, [&url](Consumer& daemon) { return !errorIn(daemon.extendSandbox(url, kProvider, kConsumer)); }},
      {"providePlaceholder", true, [&url](Consumer& daemon) { return !daemon.providePlaceholder(url, kProvider, kConsumer); }},
      {"startProviding", true, [&url](Consumer& daemon) { return !daemon.startProviding(url, kProvider, kConsumer); }},
      {"stopProviding", false, [&url](Consumer& daemon) { return !daemon.stopProviding(url, kProvider, kConsumer); }},
      {"providers", true, [](Consumer& daemon) { return !errorIn(daemon.providers()); }},
      {"extendBookmark", true, [&url](Consumer& daemon) { return !errorIn(daemon.extendBookmark(url, kConsumer)); }},
      {"bookmarkableString", true, [&url](Consumer& daemon) { return !errorIn(daemon.bookmarkableString(url)); }},
      {"documentURL", true, [](Consumer& daemon) { return !errorIn(daemon.documentURL("docuvend:p/i")); }},
      {"redeem", true, [](Consumer& daemon) { return !errorIn(daemon.redeem(QXData::fromText("item"), Access::read)); }},
      {"finishedWriting", true, [&url](Consumer& daemon) { return !daemon.finishedWriting(url); }},
  };
  script_.redeem = [](const std::string&) { return linux_platform::toValue(UniqueDescriptor(::memfd_create("f", MFD_CLOEXEC))); };
  for (const Row& row : rows) {
    SCOPED_TRACE(row.name);
    startServices();
    Consumer& daemon = consumer(patient(kNever));
    const std::size_t before = calls_.all().size();
    calls_.atTheNext([this] {
      daemon_->endConnections();
      sandbox_->endConnections();
      coordination_->endConnections();
    });
    EXPECT_EQ(row.succeeds(daemon), row.isRepeated);
    EXPECT_EQ(calls_.all().size() - before, row.isRepeated ? 2U : 1U);
    consumer_.reset();
    stopServices();
  }
}

}  // namespace
}  // namespace docuvend::tests
