#include "sdk/Administrator.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>

#include "common/DVErrors.h"
#include "service/DVAdministration.h"
#include "tests/sdk/ScriptedDaemon.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using namespace std::chrono_literals;

constexpr auto kNever = std::chrono::hours(24);

const ItemID kItem{"item"};

QXDictionary entry(const std::string& provider, const std::string& consumer, const std::string& item) {
  return {{"providerIdentifier", provider}, {"consumerIdentifier", consumer}, {"itemIdentifier", item}};
}

struct Page {
  std::optional<QXArray> grants;
  std::optional<std::int64_t> next;
};

class ScriptedAdministration : public DVAdministration {
 public:
  explicit ScriptedAdministration(Calls& calls) : calls_(calls) {}

  void statusCompletionHandler(StatusReply completionHandler) override {
    calls_.add("status");
    if (isSilent) return;
    if (error) return completionHandler(error, {});
    completionHandler({}, status);
  }
  void grantsOfProviderID(std::optional<ProviderID> providerID, std::optional<ConsumerID> toConsumerID,
                          std::optional<std::int64_t> startingAt, GrantsReply completionHandler) override {
    calls_.add("grants " + (providerID ? providerID->value : "*") + " " + (toConsumerID ? toConsumerID->value : "*") + " from " +
               std::to_string(startingAt.value_or(0)));
    if (isSilent) return;
    if (error) return completionHandler(error, {}, {});
    const auto page = pages.find(startingAt.value_or(0));
    if (page == pages.end()) return completionHandler({}, {}, {});
    completionHandler({}, page->second.grants, page->second.next);
  }
  void revokeItemID(std::optional<ItemID> itemID, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                    ErrorReply completionHandler) override {
    calls_.add("revoke " + itemID->value + " of " + fromProviderID->value + " from " + toConsumerID->value);
    completionHandler(error);
  }
  void announceFirstUnlockCompletionHandler(ErrorReply completionHandler) override {
    calls_.add("unlocked");
    completionHandler(error);
  }

  // Set before the first question.
  bool isSilent = false;
  std::optional<QXError> error;
  std::optional<QXDictionary> status = QXDictionary{{"version", "1"}};
  std::map<std::int64_t, Page> pages = {{0, {QXArray{}, std::nullopt}}};

 private:
  Calls& calls_;
};

class AdministratorTest : public LibraryTest {
 protected:
  ~AdministratorTest() override {
    administrator_.reset();
    stop(service_);
  }
  void startService() {
    service_ = std::make_unique<ScriptedService<DVAdministration>>(root_ + "/docuvend/" + kDVAdministrationServiceName, administration_);
  }
  Administrator& administrator() {
    auto connected = Administrator::connect({.deadline = kNever, .restartPatience = kNever});
    if (auto* made = std::get_if<std::unique_ptr<Administrator>>(&connected)) administrator_ = std::move(*made);
    if (!administrator_) throw std::runtime_error(std::get<QXError>(connected).description());
    return *administrator_;
  }

  Calls calls_;
  std::shared_ptr<ScriptedAdministration> administration_ = std::make_shared<ScriptedAdministration>(calls_);
  std::unique_ptr<ScriptedService<DVAdministration>> service_;
  std::unique_ptr<Administrator> administrator_;
};

TEST_F(AdministratorTest, WithoutADaemonItIsUnreachableAtOnce) {
  const auto connected = Administrator::connect({.deadline = kNever, .restartPatience = kNever});
  EXPECT_EQ(errorIn(connected), own(ConsumerErrorCode::unreachable));
  EXPECT_EQ(std::get<QXError>(connected).underlying->code, ENOENT);
  ::unsetenv("XDG_RUNTIME_DIR");
  EXPECT_EQ(errorIn(Administrator::connect({})), own(ConsumerErrorCode::unreachable));
}

TEST_F(AdministratorTest, NoBundleIsDeclared) {
  startService();
  EXPECT_EQ(administrator().announceFirstUnlock(), std::nullopt);
  EXPECT_THAT(service_->declared(), ElementsAre(std::nullopt));
}

TEST_F(AdministratorTest, WhatIsAskedAndAnsweredComesThrough) {
  startService();
  Administrator& administrator = this->administrator();
  EXPECT_EQ(administrator.status(), Result<QXDictionary>(*administration_->status));
  EXPECT_EQ(administrator.revoke(kProvider, kItem, kConsumer), std::nullopt);
  EXPECT_EQ(administrator.announceFirstUnlock(), std::nullopt);
  EXPECT_THAT(calls_.all(), ElementsAre("status", "revoke item of com.example.provider from com.example.consumer", "unlocked"));
}

TEST_F(AdministratorTest, ErrorsComeThroughAsTheyWereAnswered) {
  administration_->error = DVNotPermittedError();
  startService();
  Administrator& administrator = this->administrator();
  EXPECT_EQ(std::get<QXError>(administrator.status()), DVNotPermittedError());
  EXPECT_EQ(std::get<QXError>(administrator.grants({}, {})), DVNotPermittedError());
  EXPECT_EQ(administrator.revoke(kProvider, kItem, kConsumer), DVNotPermittedError());
  EXPECT_EQ(administrator.announceFirstUnlock(), DVNotPermittedError());
}

TEST_F(AdministratorTest, GrantsAreThoseOfAllPagesInOrder) {
  administration_->pages = {{0, {QXArray{entry("p", "c", "1"), entry("p", "c", "2")}, 2}},
                            {2, {QXArray{entry("p", "d", "1")}, 3}},
                            {3, {QXArray{}, std::nullopt}}};
  startService();
  const auto grants = administrator().grants(kProvider, kConsumer);
  ASSERT_EQ(grants.index(), 0U);
  const ProviderID p{"p"};
  EXPECT_THAT(std::get<0>(grants), ElementsAre(Grant{p, ConsumerID{"c"}, ItemID{"1"}}, Grant{p, ConsumerID{"c"}, ItemID{"2"}},
                                               Grant{p, ConsumerID{"d"}, ItemID{"1"}}));
  EXPECT_THAT(calls_.all(), ElementsAre("grants com.example.provider com.example.consumer from 0",
                                        "grants com.example.provider com.example.consumer from 2",
                                        "grants com.example.provider com.example.consumer from 3"));
}

TEST_F(AdministratorTest, GrantsOfAllAreAskedWithoutNames) {
  startService();
  const auto grants = administrator().grants(std::nullopt, std::nullopt);
  ASSERT_EQ(grants.index(), 0U);
  EXPECT_THAT(std::get<0>(grants), IsEmpty());
  EXPECT_THAT(calls_.all(), ElementsAre("grants * * from 0"));
}

// The pages that follow on one connection are of one list: two walks at once must not share it.
TEST_F(AdministratorTest, EachWalkOverThePagesHasItsOwnConnection) {
  administration_->pages = {{0, {QXArray{}, 1}}, {1, {QXArray{}, std::nullopt}}};
  startService();
  Administrator& administrator = this->administrator();
  EXPECT_EQ(errorIn(administrator.grants({}, {})), std::nullopt);
  EXPECT_EQ(errorIn(administrator.grants({}, {})), std::nullopt);
  EXPECT_EQ(administrator.announceFirstUnlock(), std::nullopt);
  EXPECT_EQ(service_->declared().size(), 3U);
}

TEST_F(AdministratorTest, AWalkThatTheDaemonLeavesBeginsAnewOnce) {
  administration_->pages = {{0, {QXArray{entry("p", "c", "1")}, 1}}, {1, {QXArray{entry("p", "c", "2")}, std::nullopt}}};
  startService();
  int ended = 0;
  const std::function<void()> endSecondPage = [this, &ended, &endSecondPage] {
    if (calls_.all().back() == "grants * * from 1") {
      ++ended;
      service_->endConnections();
    }
    if (ended < 1) calls_.atTheNext(endSecondPage);
  };
  calls_.atTheNext(endSecondPage);
  const auto grants = administrator().grants({}, {});
  ASSERT_EQ(grants.index(), 0U);
  EXPECT_EQ(std::get<0>(grants).size(), 2U) << "nothing of the first walk is left";
  EXPECT_THAT(calls_.all(), ElementsAre("grants * * from 0", "grants * * from 1", "grants * * from 0", "grants * * from 1"));
}

TEST_F(AdministratorTest, AWalkThatTheDaemonLeavesTwiceIsAnError) {
  startService();
  const std::function<void()> end = [this, &end] {
    service_->endConnections();
    if (calls_.all().size() < 2) calls_.atTheNext(end);
  };
  calls_.atTheNext(end);
  EXPECT_EQ(errorIn(administrator().grants({}, {})), own(ConsumerErrorCode::connectionLost));
  EXPECT_THAT(calls_.all(), ElementsAre("grants * * from 0", "grants * * from 0"));
}

TEST_F(AdministratorTest, AnAnswerThatMakesNoSenseIsAnError) {
  const std::vector<std::map<std::int64_t, Page>> senseless = {
      {{0, {std::nullopt, std::nullopt}}},
      {{0, {QXArray{QXValue("no dictionary")}, std::nullopt}}},
      {{0, {QXArray{QXDictionary{{"providerIdentifier", "p"}, {"consumerIdentifier", "c"}}}, std::nullopt}}},
      {{0, {QXArray{QXDictionary{{"providerIdentifier", "p"}, {"itemIdentifier", "i"}}}, std::nullopt}}},
      {{0, {QXArray{QXDictionary{{"consumerIdentifier", "c"}, {"itemIdentifier", "i"}}}, std::nullopt}}},
      {{0, {QXArray{}, 0}}},
      {{0, {QXArray{}, 1}}, {1, {QXArray{}, 1}}},
  };
  startService();
  Administrator& administrator = this->administrator();
  for (const auto& pages : senseless) {
    administration_->pages = pages;
    EXPECT_EQ(errorIn(administrator.grants({}, {})), own(ConsumerErrorCode::noAnswer));
  }
  administration_->status.reset();
  EXPECT_EQ(errorIn(administrator.status()), own(ConsumerErrorCode::noAnswer));
}

TEST_F(AdministratorTest, OfWhatTheDaemonHadInHandEverythingButARevocationIsAskedAgain) {
  startService();
  Administrator& administrator = this->administrator();
  const auto endIt = [this] { service_->endConnections(); };
  calls_.atTheNext(endIt);
  EXPECT_EQ(errorIn(administrator.status()), std::nullopt);
  calls_.atTheNext(endIt);
  EXPECT_EQ(administrator.announceFirstUnlock(), std::nullopt);
  calls_.atTheNext(endIt);
  EXPECT_EQ(errorIn(administrator.revoke(kProvider, kItem, kConsumer)), own(ConsumerErrorCode::connectionLost));
  EXPECT_THAT(calls_.all(),
              ElementsAre("status", "status", "unlocked", "unlocked", "revoke item of com.example.provider from com.example.consumer"));
}

TEST_F(AdministratorTest, ADeadlineOfItsOwnHoldsForTheCallsMadeWithIt) {
  administration_->isSilent = true;
  startService();
  Administrator& administrator = this->administrator();
  EXPECT_EQ(errorIn(administrator.within(1ms).status()), own(ConsumerErrorCode::deadlinePassed));
  EXPECT_EQ(errorIn(administrator.within(1ms).grants({}, {})), own(ConsumerErrorCode::deadlinePassed));
}

}  // namespace
}  // namespace docuvend::tests
