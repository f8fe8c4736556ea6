// The consumer library over restarts of the daemon.
#include <gtest/gtest.h>

#include <cstdlib>
#include <future>

#include "sdk/Administrator.h"
#include "sdk/Consumer.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

const ProviderID kCellarID{kCellar};
const ProviderID kTricksterID{kTrickster};
const ConsumerID kPickerID{kPicker};

class Reconnect : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kPicker);
    house_.installTrickster();
    letter_ = QXURL::fileURL(house_.putInCloud("letter.txt", "Dear all\n"), QXURLKind::file);
    house_.startDaemon();
    ::setenv("XDG_RUNTIME_DIR", house_.runtime().c_str(), 1);
    Consumer::Options options;
    options.actAs = kPicker;
    options.restartPatience = options.deadline = options.materialisingDeadline = kPatience;
    auto connected = Consumer::connect(options);
    ASSERT_EQ(connected.index(), 0U);
    consumer_ = std::move(std::get<0>(connected));
    auto granted = consumer_->extendSandbox(*letter_, kCellarID, kPickerID);
    ASSERT_EQ(granted.index(), 0U);
    document_ = std::get<Document>(granted);
  }
  void restart() {
    house_.killDaemon();
    house_.startDaemon();
  }
  [[nodiscard]] bool opens(Access access) { return consumer_->open(*document_, kCellarID, access).index() == 0; }

  std::optional<QXURL> letter_;
  std::unique_ptr<Consumer> consumer_;
  std::optional<Document> document_;
};

TEST_F(Reconnect, NoCallNoticesARestartBetweenCalls) {
  ASSERT_TRUE(opens(Access::read));
  for (int round = 0; round < 5; ++round) {
    restart();
    // Not repeated once it was sent: it goes to the new daemon alone.
    EXPECT_EQ(consumer_->stopProviding(*letter_, kCellarID, kPickerID), std::nullopt);
    EXPECT_TRUE(opens(Access::readWrite));
    EXPECT_EQ(consumer_->finishedWriting(*letter_), std::nullopt);
  }
}

TEST_F(Reconnect, ACallThatFindsNoDaemonIsAnsweredByTheNextOne) {
  house_.killDaemon();
  auto answer = std::async(std::launch::async, [this] { return consumer_->bookmarkableString(*letter_); });
  EXPECT_EQ(answer.wait_for(std::chrono::milliseconds(20)), std::future_status::timeout);
  house_.startDaemon();
  EXPECT_EQ(answer.get().index(), 0U);
}

TEST_F(Reconnect, WithoutADaemonACallIsUnreachableAfterTheTimeOfARestart) {
  house_.killDaemon();
  const Failure failure = consumer_->within(std::chrono::milliseconds(50)).wakeUp();
  ASSERT_TRUE(failure);
  EXPECT_EQ(failure->domain, kConsumerErrorDomain);
}

TEST_F(Reconnect, ARestartWhileAProviderWorksBeginsTheWorkAnew) {
  const QXURL stuck = QXURL::fileURL(house_.storage(kTrickster) + "/stuck", QXURLKind::file);
  ASSERT_EQ(consumer_->extendSandbox(stuck, kTricksterID, kPickerID).index(), 0U);
  auto answer = std::async(std::launch::async, [this, &stuck] { return consumer_->startProviding(stuck, kTricksterID, kPickerID); });
  ASSERT_TRUE(house_.awaitLog("is stuck"));
  restart();
  ASSERT_TRUE(house_.awaitLog("is stuck", 2));
  writeFile(house_.container(kTrickster) + "/free", "");
  EXPECT_EQ(answer.get(), std::nullopt);
}

TEST_F(Reconnect, TheAdministratorOutlivesRestartsToo) {
  auto connected = Administrator::connect({});
  ASSERT_EQ(connected.index(), 0U);
  Administrator& administrator = *std::get<0>(connected);
  const auto before = administrator.grants(kCellarID, std::nullopt);
  ASSERT_EQ(before.index(), 0U);
  ASSERT_EQ(std::get<0>(before).size(), 1U);
  restart();
  EXPECT_EQ(administrator.grants(kCellarID, std::nullopt), before);
  const Grant& grant = std::get<0>(before).front();
  restart();
  EXPECT_EQ(administrator.revoke(grant.provider, grant.item, grant.consumer), std::nullopt);
  EXPECT_EQ(administrator.status().index(), 0U);
}

}  // namespace
}  // namespace docuvend::tests
