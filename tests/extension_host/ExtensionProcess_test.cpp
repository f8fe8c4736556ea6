// An extension's process as its host sees it, with a peer that speaks by hand. The process itself does nothing.
#include "platform/linux/extension_host/ExtensionProcess.h"
#include "platform/linux/base/Sanitizers.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/resource.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <functional>
#include <future>
#include <memory>
#include <utility>
#include <vector>

#include "platform/fake/FakeLog.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/rpc_errors.h"
#include "providers/_QXDocuvendHostProtocol.h"
#include "providers/_QXDocuvendVendor.h"
#include "tests/wire/RawPeer.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

using fake_platform::FakeLogEntry;
using std::chrono::milliseconds;
using tests::Mailbox;
using tests::RawPeer;

constexpr milliseconds kOne{1};
constexpr std::chrono::hours kLong{1};

ExtensionTimes times(ExtensionTimes::Duration answerLimit, ExtensionTimes::Duration livenessInterval) {
  ExtensionTimes result;
  result.answerLimit = answerLimit;
  result.livenessInterval = livenessInterval;
  return result;
}

class ExtensionProcessTest : public ::testing::Test {
 protected:
  ~ExtensionProcessTest() override {
    process.reset();
    reactor.reset();
    spawner.stop();
  }

  void start(const ExtensionTimes& allTimes) {
    auto [ours, theirs] = tests::socketPair();
    ASSERT_EQ(fcntl(ours.get(), F_SETFL, O_NONBLOCK), 0);
    std::array<int, 2> pipe{};
    ASSERT_EQ(pipe2(pipe.data(), O_CLOEXEC), 0);
    UniqueDescriptor reading(pipe[0]);
    const UniqueDescriptor writing(pipe[1]);
    ASSERT_EQ(fcntl(reading.get(), F_SETFL, O_NONBLOCK), 0);
    ExtensionProcess::Handlers handlers;
    handlers.onLost = [this](ProcessLifetime::Cause cause) { lost.put(cause); };
    handlers.onGone = [this] { gone.put(true); };
    handlers.hasRequests = [this] {
      looks.put(true);
      return hasRequests.load();
    };
    process = ExtensionProcess::create({spawn(writing), std::move(ours), std::move(reading)}, "com.orvane.test",
                                       qxInterfaceOf<_QXDocuvendHostProtocol>(), allTimes, *reactor, log.defaultLog(), std::move(handlers));
    ASSERT_TRUE(process);
    peer.emplace(std::move(theirs));
    peer->sayHello();
    process->resume();
    ASSERT_TRUE(peer->read<Hello>());
  }

  // Null, or a process, when only so many descriptors can be had.
  std::shared_ptr<ExtensionProcess> createWith(std::size_t freeDescriptors) {
    auto [ours, theirs] = tests::socketPair();
    std::array<int, 2> pipe{};
    EXPECT_EQ(pipe2(pipe.data(), O_CLOEXEC | O_NONBLOCK), 0);
    EXPECT_EQ(fcntl(ours.get(), F_SETFL, O_NONBLOCK), 0);
    UniqueDescriptor reading(pipe[0]);
    const UniqueDescriptor writing(pipe[1]);
    ExtensionProcess::Handlers handlers;
    handlers.onLost = [](ProcessLifetime::Cause) {};
    handlers.onGone = [] {};
    handlers.hasRequests = [] { return false; };
    ExtensionProcess::Ends ends{spawn(writing), std::move(ours), std::move(reading)};
    rlimit usual{};
    EXPECT_EQ(getrlimit(RLIMIT_NOFILE, &usual), 0);
    const rlimit few{200, usual.rlim_max};
    EXPECT_EQ(setrlimit(RLIMIT_NOFILE, &few), 0);
    std::vector<UniqueDescriptor> taken;
    for (int copy = dup(writing.get()); copy >= 0; copy = dup(writing.get())) taken.emplace_back(copy);
    taken.resize(taken.size() - freeDescriptors);
    auto made = ExtensionProcess::create(std::move(ends), "com.orvane.test", qxInterfaceOf<_QXDocuvendHostProtocol>(), times(kLong, kLong),
                                         *reactor, log.defaultLog(), std::move(handlers));
    EXPECT_EQ(setrlimit(RLIMIT_NOFILE, &usual), 0);
    return made;
  }

  // Start providing has no limit of its own.
  std::future<QXError> sendMessage(const char* operationName = "_startProvidingItemAtURL:completion:") {
    const auto failed = std::make_shared<std::promise<QXError>>();
    const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
    const auto& operation = vendor.operations()[vendor.indexOf(operationName).value()];
    QXArray arguments;
    if (!operation.arguments.empty()) arguments.emplace_back(QXURL::fileURL("/item", QXURLKind::file));
    process->remoteObjectProxy([failed](const QXError& error) { failed->set_value(error); })
        ->send(operation, std::move(arguments), [this](QXArray values) { replies.put(std::move(values)); });
    return failed->get_future();
  }
  static void expectNoRoom(std::future<QXError> failed) {
    ASSERT_EQ(failed.wait_for(std::chrono::seconds(60)), std::future_status::ready);
    const QXError error = failed.get();
    EXPECT_EQ(error.domain, kQXRpcErrorDomain);
    EXPECT_EQ(error.code, static_cast<std::int64_t>(QXRpcErrorCode::tooManyCalls));
    EXPECT_NE(error.description().find("too many messages wait for their answers"), std::string::npos);
  }

  // What the reactor's one thread was about is over then.
  void settle() {
    std::promise<void> settled;
    reactor->post([&settled] { settled.set_value(); });
    settled.get_future().wait();
  }
  // A process's own timer that is set for sooner has fired then.
  void waitForATimer() {
    std::promise<void> fired;
    Timer later(*reactor, [&fired] { fired.set_value(); });
    later.setFor(std::chrono::steady_clock::now() + 20 * kOne);
    fired.get_future().wait();
    settle();
  }
  bool isSilent() const {
    pollfd ready{peer->socket(), POLLIN, 0};
    return poll(&ready, 1, 0) == 0;
  }
  // False when nothing comes to the peer in all that time.
  [[nodiscard]] bool awaitFrame() const {
    pollfd ready{peer->socket(), POLLIN, 0};
    return poll(&ready, 1, static_cast<int>(milliseconds(tests::kPatience).count())) == 1;
  }

  fake_platform::FakeLog log;
  Mailbox<ProcessLifetime::Cause> lost;
  Mailbox<bool> gone;
  Mailbox<bool> looks;
  Mailbox<QXArray> replies;
  std::atomic<bool> hasRequests = false;
  ProcessSpawner spawner;
  std::unique_ptr<Reactor> reactor = std::make_unique<Reactor>(1U);
  std::shared_ptr<ExtensionProcess> process;
  std::optional<RawPeer> peer;

 private:
  SpawnedProcess spawn(const UniqueDescriptor& output) {
    std::promise<SpawnedProcess> spawned;
    EXPECT_TRUE(spawner.perform([this, &spawned, &output] {
      LaunchPlan plan;
      plan.arguments = {"/bin/sleep", "1000"};
      spawned.set_value(std::get<SpawnedProcess>(spawner.spawn(std::move(plan), output)));
    }));
    return spawned.get_future().get();
  }
};

TEST_F(ExtensionProcessTest, OneWithARequestIsAskedForASignOfLifeAgainAndAgain) {
  hasRequests = true;
  start(times(kLong, kOne));
  process->watchLiveness();
  for (int i = 0; i < 3; ++i) {
    ASSERT_TRUE(peer->read<PingFrame>());
    peer->write(Frame(PongFrame{}));
  }
  EXPECT_EQ(lost.count(), 0U);
}

TEST_F(ExtensionProcessTest, OneWhoseRequestsAreOverIsNotAskedAndNoTimerRuns) {
  start(times(kLong, kOne));
  process->watchLiveness();
  ASSERT_TRUE(looks.take());
  settle();
  EXPECT_TRUE(isSilent());
  waitForATimer();
  EXPECT_EQ(looks.count(), 0U);
}

TEST_F(ExtensionProcessTest, OneThatOwesAnAnswerIsAskedUntilItHasGivenIt) {
  start(times(kLong, kOne));
  auto failed = sendMessage();
  const auto request = peer->read<RequestFrame>();
  ASSERT_TRUE(request);
  for (int i = 0; i < 2; ++i) {
    ASSERT_TRUE(peer->read<PingFrame>());
    peer->write(Frame(PongFrame{}));
  }
  peer->write(Frame(ReplyFrame{request->callID, {QXValue()}}));
  ASSERT_TRUE(replies.take());
  waitForATimer();
  while (looks.count() > 0) looks.take();
  waitForATimer();
  EXPECT_EQ(looks.count(), 0U);
}

// An error handler that lets the test act whenever it is copied, as it is when a message is sent whose answer has a limit.
class ToldWhenCopied {
 public:
  explicit ToldWhenCopied(std::shared_ptr<std::function<void()>> act) : act_(std::move(act)) {}
  ToldWhenCopied(const ToldWhenCopied& other) : act_(other.act_) {
    if (*act_) (*act_)();
  }
  ToldWhenCopied& operator=(const ToldWhenCopied&) = delete;
  ~ToldWhenCopied() = default;

  void operator()(const QXError&) const {}

 private:
  const std::shared_ptr<std::function<void()>> act_;
};

TEST_F(ExtensionProcessTest, OneThatIsSentAMessageIsAskedHoweverLongTheSendingTakes) {
  start(times(kLong, kOne));
  const auto whenCopied = std::make_shared<std::function<void()>>();
  const auto proxy = process->remoteObjectProxy(ToldWhenCopied(whenCopied));
  int copies = 0;
  *whenCopied = [this, &copies] {
    ++copies;
    waitForATimer();
  };
  const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
  const auto& operation = vendor.operations()[vendor.indexOf("_identifierForItemAtURL:completion:").value()];
  proxy->send(operation, {QXURL::fileURL("/item", QXURLKind::file)}, [](const QXArray&) {});
  *whenCopied = {};
  ASSERT_GT(copies, 0) << "there was no time for a look in the middle";
  ASSERT_TRUE(peer->read<RequestFrame>());
  ASSERT_TRUE(awaitFrame());
  EXPECT_TRUE(peer->read<PingFrame>());
}

TEST_F(ExtensionProcessTest, NoSecondSignIsAskedForWhileTheFirstIsAwaited) {
  hasRequests = true;
  start(times(kLong, kOne));
  process->watchLiveness();
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(looks.take());
  settle();
  ASSERT_TRUE(peer->read<PingFrame>());
  EXPECT_TRUE(isSilent());
  peer->write(Frame(PongFrame{}));
  EXPECT_TRUE(peer->read<PingFrame>());
}

TEST_F(ExtensionProcessTest, WithoutASignInTimeItIsEndedAndItsMessagesFail) {
  start(times(kOne, kOne));
  auto failed = sendMessage();
  EXPECT_EQ(lost.take(), ProcessLifetime::Cause::notAnswering);
  EXPECT_TRUE(gone.take());
  const QXError error = failed.get();
  EXPECT_EQ(error.domain, kExtensionHostErrorDomain);
  EXPECT_EQ(error.code, static_cast<std::int64_t>(ExtensionHostErrorCode::notAnswering));
  EXPECT_NE(error.description().find("The process of com.orvane.test did not answer a ping in time."), std::string::npos);
  EXPECT_THAT(
      log.entries(),
      ::testing::ElementsAre(FakeLogEntry{QXLogType::defaultType, "[NOTICE] The process of com.orvane.test did not answer a ping in time."},
                             FakeLogEntry{QXLogType::defaultType, "[NOTICE] The process of com.orvane.test was ended by signal 9."}));
  EXPECT_EQ(lost.count(), 0U);
}

TEST_F(ExtensionProcessTest, OneThatIsLetGoEndsWithLessToSayThanOneThatDies) {
  ExtensionTimes impatient = times(kLong, kLong);
  impatient.endGrace = kOne;
  start(impatient);
  process->end();
  EXPECT_TRUE(gone.take());
  EXPECT_THAT(log.entries(),
              ::testing::ElementsAre(FakeLogEntry{QXLogType::info, "[INFO] The process of com.orvane.test was ended by signal 15."}));
}

TEST_F(ExtensionProcessTest, OneWhoseBundleIsGoneIsEndedAtOnceAndEachOfItsMessagesFailsOnce) {
  start(times(kLong, kLong));
  auto answered = sendMessage();
  auto unanswered = sendMessage("_identifierForItemAtURL:completion:");
  const auto request = peer->read<RequestFrame>();
  ASSERT_TRUE(request);
  ASSERT_TRUE(peer->read<RequestFrame>());
  // The answer to the first lies in the socket, and is not looked at before it is too late.
  std::promise<void> mayGoOn;
  std::promise<void> isHeldUp;
  reactor->post([&mayGoOn, &isHeldUp] {
    isHeldUp.set_value();
    mayGoOn.get_future().wait();
  });
  isHeldUp.get_future().wait();
  peer->write(Frame(ReplyFrame{request->callID, {QXValue()}}));
  process->endWithItsBundle();
  mayGoOn.set_value();
  // A second failure of one of them would throw.
  for (auto* failed : {&answered, &unanswered}) {
    ASSERT_EQ(failed->wait_for(std::chrono::seconds(60)), std::future_status::ready);
    const QXError error = failed->get();
    EXPECT_EQ(error.domain, kExtensionHostErrorDomain);
    EXPECT_EQ(error.code, static_cast<std::int64_t>(ExtensionHostErrorCode::bundleIsGone));
    EXPECT_NE(error.description().find("The bundle of com.orvane.test was removed or replaced."), std::string::npos);
  }
  EXPECT_TRUE(gone.take());
  settle();
  EXPECT_EQ(replies.count(), 0U);
  EXPECT_EQ(lost.take(), ProcessLifetime::Cause::died);
  EXPECT_EQ(lost.count(), 0U);
  EXPECT_THAT(log.entries(),
              ::testing::ElementsAre(FakeLogEntry{QXLogType::defaultType,
                                                  "[NOTICE] The bundle of com.orvane.test was removed or replaced: its process is ended."},
                                     FakeLogEntry{QXLogType::info, "[INFO] The process of com.orvane.test was ended by signal 9."}));
}

TEST_F(ExtensionProcessTest, OneThatWasLetGoHasNoMorePatienceWhenItsBundleIsGone) {
  ExtensionTimes patient = times(kLong, kLong);
  patient.endGrace = kLong;
  start(patient);
  process->end();
  process->endWithItsBundle();
  EXPECT_TRUE(gone.take());
  EXPECT_EQ(lost.count(), 0U);
  EXPECT_THAT(log.entries(),
              ::testing::ElementsAre(FakeLogEntry{QXLogType::info, "[INFO] The process of com.orvane.test was ended by signal 9."}));
}

TEST_F(ExtensionProcessTest, WhatApplicationsAskForLeavesRoomForNoticesAndTheSetup) {
  constexpr const char* kName = "_identifierForItemAtURL:completion:";
  constexpr const char* kNotice = "_itemChangedAtURL:completion:";
  constexpr const char* kSetup = "_performInitialSetupWithCompletion:";
  start(times(kLong, kLong));
  std::vector<std::future<QXError>> waiting;
  for (std::size_t i = 0; i < ExtensionProcess::kMaximumQuestions; ++i) {
    waiting.push_back(sendMessage(i % 2 == 0 ? kName : "_startProvidingItemAtURL:completion:"));
  }
  for (std::size_t i = 0; i + 1 < ExtensionProcess::kMaximumQuestions; ++i) ASSERT_TRUE(peer->read<RequestFrame>());
  const auto last = peer->read<RequestFrame>();
  ASSERT_TRUE(last);
  expectNoRoom(sendMessage());
  expectNoRoom(sendMessage(kName));
  std::size_t kept = 0;
  for (const char* name : {kSetup, kNotice}) {
    waiting.push_back(sendMessage(name));
    ASSERT_TRUE(awaitFrame()) << "there is no room for " << name;
    ASSERT_TRUE(peer->read<RequestFrame>());
    ++kept;
  }
  for (; kept < ExtensionProcess::kRoomForNotices; ++kept) {
    waiting.push_back(sendMessage(kNotice));
    ASSERT_TRUE(awaitFrame());
    ASSERT_TRUE(peer->read<RequestFrame>());
  }
  expectNoRoom(sendMessage(kNotice));
  peer->write(Frame(ReplyFrame{last->callID, {QXValue()}}));
  ASSERT_TRUE(replies.take());
  waiting.push_back(sendMessage());
  EXPECT_TRUE(peer->read<RequestFrame>());
  process->endAtOnce();
  EXPECT_TRUE(gone.take());
}

TEST_F(ExtensionProcessTest, OneOfWhichNotAllCanBeKnownIsNoneAndItsProcessIsEnded) {
  if (kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  constexpr std::size_t kNeeded = 4;  // a look at the socket and three timers
  for (std::size_t i = 0; i < kNeeded; ++i) EXPECT_FALSE(createWith(i)) << i;
  EXPECT_TRUE(createWith(kNeeded));
}

TEST_F(ExtensionProcessTest, ASignThatWasNotAskedForEndsIt) {
  start(times(kLong, kLong));
  peer->write(Frame(PongFrame{}));
  EXPECT_EQ(lost.take(), ProcessLifetime::Cause::died);
  EXPECT_TRUE(gone.take());
}

}  // namespace
}  // namespace docuvend::linux_platform
