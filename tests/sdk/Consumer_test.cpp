#include "sdk/Consumer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>

#include <atomic>
#include <thread>

#include "common/DVErrors.h"
#include "platform/rpc_errors.h"
#include "tests/sdk/ScriptedDaemon.h"

namespace docuvend::tests {
namespace {

using linux_platform::UniqueDescriptor;
using ::testing::ElementsAre;

// Reaching the daemon.

TEST_F(ConsumerTest, WithoutARunTimeDirectoryTheDaemonIsUnreachable) {
  startServices();
  ::unsetenv("XDG_RUNTIME_DIR");
  EXPECT_EQ(errorIn(Consumer::connect({})), own(ConsumerErrorCode::unreachable));
  ::setenv("XDG_RUNTIME_DIR", "relative", 1);
  EXPECT_EQ(errorIn(Consumer::connect({})), own(ConsumerErrorCode::unreachable));
}

TEST_F(ConsumerTest, WithoutADaemonItIsUnreachableAtOnceAndSaysWhy) {
  Consumer::Options options;
  options.deadline = options.restartPatience = std::chrono::hours(1);
  const auto connected = Consumer::connect(options);
  EXPECT_EQ(errorIn(connected), own(ConsumerErrorCode::unreachable));
  ASSERT_TRUE(std::get<QXError>(connected).underlying);
  EXPECT_EQ(std::get<QXError>(connected).underlying->code, ENOENT);
}

TEST_F(ConsumerTest, TheBundleThatItActsForIsDeclaredToEveryService) {
  script_.redeem = [](const std::string&) { return linux_platform::toValue(UniqueDescriptor(::memfd_create("file", MFD_CLOEXEC))); };
  startServices();
  Consumer& daemon = consumer();
  EXPECT_EQ(daemon.ownIdentifier(), kConsumer);
  EXPECT_EQ(daemon.wakeUp(), std::nullopt);
  EXPECT_EQ(errorIn(daemon.redeem(QXData::fromText("item"), Access::read)), std::nullopt);
  EXPECT_EQ(daemon.finishedWriting(*script_.url), std::nullopt);
  EXPECT_THAT(daemon_->declared(), ElementsAre(kConsumer.value));
  EXPECT_THAT(sandbox_->declared(), ElementsAre(kConsumer.value));
  EXPECT_THAT(coordination_->declared(), ElementsAre(kConsumer.value));
}

TEST_F(ConsumerTest, OneConnectionServesManyCallsAndThreadsAndEveryDeadline) {
  startServices();
  Consumer& daemon = consumer();
  std::atomic<int> answered = 0;
  std::vector<std::thread> threads;
  for (int i = 0; i < 8; ++i) {
    threads.emplace_back([&daemon, &answered] {
      for (int call = 0; call < 50; ++call) {
        if (!daemon.within(std::chrono::hours(1)).wakeUp()) ++answered;
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(answered, 400);
  EXPECT_EQ(daemon_->declared().size(), 1U);
}

TEST_F(ConsumerTest, AServiceThatRefusesTheConnectionSaysWhy) {
  startServices();
  const QXError refusal = QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::refused), "not you");
  daemon_->refuse(refusal);
  EXPECT_EQ(consumer().wakeUp(), refusal);
  EXPECT_EQ(consumer_->stopProviding(*script_.url, kProvider, kConsumer), refusal);
}

// Answers.

TEST_F(ConsumerTest, ValuesComeThroughAsTheyWereAnswered) {
  startServices();
  Consumer& daemon = consumer();
  const auto extended = daemon.extendSandbox(*script_.url, kProvider, kConsumer);
  ASSERT_EQ(extended.index(), 0U);
  EXPECT_EQ(std::get<Document>(extended).url, *script_.url);
  EXPECT_EQ(std::get<Document>(extended).itemToken, script_.itemToken);
  EXPECT_EQ(std::get<Document>(extended).siblingURL, script_.siblingURL);
  EXPECT_EQ(std::get<Document>(extended).siblingToken, script_.siblingToken);
  EXPECT_EQ(std::get<Document>(extended).bookmarkableString, std::nullopt);
  const auto resolved = daemon.documentURL("docuvend:p/i");
  ASSERT_EQ(resolved.index(), 0U);
  EXPECT_EQ(std::get<Document>(resolved).url, *script_.url);
  EXPECT_EQ(std::get<Document>(resolved).itemToken, script_.itemToken);
  EXPECT_EQ(std::get<Document>(resolved).siblingURL, script_.siblingURL);
  EXPECT_EQ(std::get<Document>(resolved).siblingToken, script_.siblingToken);
  EXPECT_EQ(std::get<Document>(resolved).bookmarkableString, "docuvend:p/i");
  EXPECT_EQ(daemon.bookmarkableString(*script_.url), Result<std::string>("docuvend:p/i"));
  EXPECT_EQ(daemon.extendBookmark(*script_.url, kConsumer), Result<std::string>("docuvend:p/i"));
  EXPECT_EQ(daemon.providers(), Result<QXDictionary>(*script_.providers));
  EXPECT_EQ(daemon.startProviding(*script_.url, kProvider, kConsumer), std::nullopt);
  EXPECT_EQ(daemon.providePlaceholder(*script_.url, kProvider, kConsumer), std::nullopt);
  EXPECT_EQ(daemon.stopProviding(*script_.url, kProvider, kConsumer), std::nullopt);
  EXPECT_THAT(calls_.all(), ElementsAre("extend com.example.provider com.example.consumer", "document of docuvend:p/i",
                                        "string of file:///storage/letter.txt", "bookmark file:///storage/letter.txt com.example.consumer",
                                        "providers", "start file:///storage/letter.txt com.example.provider com.example.consumer",
                                        "placeholder file:///storage/letter.txt com.example.provider com.example.consumer",
                                        "stop file:///storage/letter.txt com.example.provider com.example.consumer"));
}

TEST_F(ConsumerTest, ErrorsComeThroughAsTheyWereAnswered) {
  script_.error = DVNotFoundError(DVInvalidParameterError("providerID", "p"));
  script_.finishedError = QXError::make("Test", 1, "nobody hears it");
  startServices();
  Consumer& daemon = consumer();
  EXPECT_EQ(std::get<QXError>(daemon.extendSandbox(*script_.url, kProvider, kConsumer)), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.documentURL("docuvend:p/i")), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.bookmarkableString(*script_.url)), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.extendBookmark(*script_.url, kConsumer)), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.providers()), *script_.error);
  EXPECT_EQ(daemon.startProviding(*script_.url, kProvider, kConsumer), script_.error);
  EXPECT_EQ(daemon.providePlaceholder(*script_.url, kProvider, kConsumer), script_.error);
  EXPECT_EQ(daemon.stopProviding(*script_.url, kProvider, kConsumer), script_.error);
  EXPECT_EQ(daemon.finishedWriting(*script_.url), script_.finishedError);
}

TEST_F(ConsumerTest, AnAnswerWithNeitherValueNorErrorIsAnError) {
  script_.url.reset();
  script_.string.reset();
  script_.providers.reset();
  startServices();
  Consumer& daemon = consumer();
  const QXURL url = *QXURL::fromString("file:///x");
  EXPECT_EQ(errorIn(daemon.documentURL("docuvend:p/i")), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.bookmarkableString(url)), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.extendBookmark(url, kConsumer)), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.providers()), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.redeem(QXData::fromText("item"), Access::read)), own(ConsumerErrorCode::noAnswer));
}

TEST_F(ConsumerTest, AStopThatTheProviderCarriedOutIsSuccessThoughItsAnswerIsAnError) {
  script_.error = DVPluginOperationFailedError(std::nullopt);
  startServices();
  Consumer& daemon = consumer();
  EXPECT_EQ(daemon.stopProviding(*script_.url, kProvider, kConsumer), std::nullopt);
  EXPECT_EQ(daemon.startProviding(*script_.url, kProvider, kConsumer), script_.error) << "of the others it is an error";
  EXPECT_EQ(daemon.providePlaceholder(*script_.url, kProvider, kConsumer), script_.error);
}

TEST_F(ConsumerTest, AStopThatTheProviderRefusedIsAnError) {
  startServices();
  Consumer& daemon = consumer();
  for (const QXError& error : {DVPluginOperationFailedError(QXError::make("Test", 1, "no")), DVNotFoundError(kProvider),
                               QXError::make("Test", static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed), "of another domain")}) {
    script_.error = error;
    EXPECT_EQ(daemon.stopProviding(*script_.url, kProvider, kConsumer), error);
  }
}

}  // namespace
}  // namespace docuvend::tests
