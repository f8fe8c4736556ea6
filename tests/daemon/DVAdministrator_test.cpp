#include "daemon/DVAdministrator.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "acl/DVAccessControlStore.h"
#include "common/DVErrors.h"
#include "daemon/DVGrantPage.h"
#include "platform/notification_center.h"
#include "providers/DVExtensionDocuvend.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogEntry;
using fake_platform::FakePlatform;
using fake_platform::FakeRpcConnection;
using fake_platform::FakeWriteFailure;

constexpr const char* kFile = "/home/fake/Library/Docuvend/AccessControl.plist";

const ProviderID kCellar{"com.orvane.cellar"};
const ProviderID kAttic{"com.orvane.attic"};
const ConsumerID kEditor{"com.example.editor"};
const ConsumerID kPicker{"com.example.picker"};
const ItemID kReport{"report"};
const ItemID kLetter{"letter"};

class DVAdministratorTest : public testing::Test {
 protected:
  struct Page {
    std::optional<QXError> error;
    std::optional<QXArray> grants;
    std::optional<std::int64_t> next;
  };

  DVAdministratorTest() { (void)store(); }

  static DVAccessControlStore& store() { return *DVAccessControlStore::sharedStore(); }
  static void grant(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
    store().allowProviderWithIdentifier(provider, item, consumer);
  }
  void registerCellar() {
    DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{});
    platform_.extensionHost.setExtensions({platform_.installProvider(kCellar.value)});
    platform_.queues.runAll();
  }

  // Answers are due inside the call, once.
  QXDictionary status() {
    std::vector<QXDictionary> answers;
    administrator_.statusCompletionHandler([&answers](const std::optional<QXError>& error, std::optional<QXDictionary> status) {
      EXPECT_EQ(error, std::nullopt);
      answers.push_back(status.value());
    });
    EXPECT_EQ(answers.size(), 1U);
    return answers.at(0);
  }
  Page page(std::optional<ProviderID> provider = std::nullopt, std::optional<ConsumerID> consumer = std::nullopt,
            std::optional<std::int64_t> start = std::nullopt) {
    std::vector<Page> answers;
    administrator_.grantsOfProviderID(
        std::move(provider), std::move(consumer), start,
        [&answers](std::optional<QXError> error, std::optional<QXArray> grants, std::optional<std::int64_t> next) {
          answers.push_back({error, grants, next});
        });
    EXPECT_EQ(answers.size(), 1U);
    return answers.at(0);
  }
  std::optional<QXError> revoke(std::optional<ItemID> item, std::optional<ProviderID> provider, std::optional<ConsumerID> consumer) {
    std::vector<std::optional<QXError>> answers;
    administrator_.revokeItemID(std::move(item), std::move(provider), std::move(consumer),
                                [&answers](std::optional<QXError> error) { answers.push_back(std::move(error)); });
    EXPECT_EQ(answers.size(), 1U);
    return answers.at(0);
  }
  static QXValue entry(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
    return QXDictionary{{"providerIdentifier", provider.value}, {"consumerIdentifier", consumer.value}, {"itemIdentifier", item.value}};
  }

  FakePlatform platform_;
  std::shared_ptr<FakeRpcConnection> connection_ = FakeRpcConnection::create();
  DVAdministrator administrator_{connection_};
};

// --- The list

TEST_F(DVAdministratorTest, AnEmptyListIsOneEmptyPage) {
  const auto empty = page();
  EXPECT_EQ(empty.error, std::nullopt);
  EXPECT_EQ(empty.grants, QXArray());
  EXPECT_EQ(empty.next, std::nullopt);
}

TEST_F(DVAdministratorTest, ListsWhatTheStoreHolds) {
  grant(kCellar, kReport, kEditor);
  grant(kAttic, kLetter, kPicker);
  EXPECT_EQ(page().grants, (QXArray{entry(kAttic, kLetter, kPicker), entry(kCellar, kReport, kEditor)}));
  EXPECT_EQ(page(kCellar).grants, QXArray{entry(kCellar, kReport, kEditor)});
  EXPECT_EQ(page(std::nullopt, kPicker).grants, QXArray{entry(kAttic, kLetter, kPicker)});
  EXPECT_EQ(page(kCellar, kPicker).grants, QXArray());
}

class DVAdministratorPagesTest : public DVAdministratorTest {
 protected:
  DVAdministratorPagesTest() {
    QXArray items;
    for (std::size_t i = 0; i <= 2 * kDVMaximumGrantsOfPage; ++i) items.emplace_back(std::to_string(i));
    platform_.propertyLists.setValue(
        kFile, QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, QXDictionary{{"AllowedItemIDs", std::move(items)}}}}}});
    store().rereadAccessControl();
    platform_.queues.runAll();
  }
};

TEST_F(DVAdministratorPagesTest, PagesFollowEachOtherToTheEnd) {
  std::vector<QXValue> all;
  std::optional<std::int64_t> start;
  int pages = 0;
  do {
    const auto next = page(std::nullopt, std::nullopt, start);
    ASSERT_TRUE(next.grants);
    all.insert(all.end(), next.grants->begin(), next.grants->end());
    start = next.next;
    ++pages;
  } while (start && pages < 10);
  EXPECT_EQ(pages, 3);
  ASSERT_EQ(all.size(), 2 * kDVMaximumGrantsOfPage + 1);
  for (std::size_t i = 0; i < all.size(); ++i) EXPECT_EQ(all[i], entry(kCellar, ItemID{std::to_string(i)}, kEditor));
}

TEST_F(DVAdministratorPagesTest, TheFirstPageIsTheListAsItIsThenAndTheOthersAreOfThatSameList) {
  const auto first = page();
  store().disallowProviderWithIdentifier(kCellar, ItemID{"0"}, kEditor);
  store().disallowProviderWithIdentifier(kCellar, ItemID{"1999"}, kEditor);
  const auto second = page(std::nullopt, std::nullopt, first.next);
  ASSERT_TRUE(second.grants);
  EXPECT_EQ(second.grants->front(), entry(kCellar, ItemID{"1000"}, kEditor));
  EXPECT_EQ(second.grants->back(), entry(kCellar, ItemID{"1999"}, kEditor));
  EXPECT_EQ(page().grants->front(), entry(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(page(std::nullopt, std::nullopt, 0).grants->front(), entry(kCellar, ItemID{"1"}, kEditor));
}

TEST_F(DVAdministratorPagesTest, EachConnectionHasItsOwnList) {
  const auto first = page();
  DVAdministrator other(connection_);
  std::optional<QXError> error;
  other.grantsOfProviderID(std::nullopt, std::nullopt, first.next,
                           [&error](std::optional<QXError> given, const auto&, const auto&) { error = std::move(given); });
  EXPECT_EQ(error, DVInvalidParameterError("startingAt", "1000"));
}

TEST_F(DVAdministratorTest, APageThatStartsWhereThereIsNoListIsAnError) {
  grant(kCellar, kReport, kEditor);
  for (const std::int64_t start : {std::int64_t{-1}, std::int64_t{1}}) {
    const auto given = page(std::nullopt, std::nullopt, start);
    EXPECT_EQ(given.error, DVInvalidParameterError("startingAt", std::to_string(start)));
    EXPECT_EQ(given.grants, std::nullopt);
    EXPECT_EQ(given.next, std::nullopt);
  }
  (void)page();
  EXPECT_EQ(page(std::nullopt, std::nullopt, 1).grants, QXArray());
  EXPECT_EQ(page(std::nullopt, std::nullopt, 2).error, DVInvalidParameterError("startingAt", "2"));
}

TEST_F(DVAdministratorTest, ListingLogsNothing) {
  platform_.log.clear();
  (void)page();
  EXPECT_TRUE(platform_.log.entries().empty());
}

// --- Revoking

TEST_F(DVAdministratorTest, NamesTheFirstMissingArgumentInTheProtocolsOrder) {
  EXPECT_EQ(revoke(std::nullopt, std::nullopt, std::nullopt), DVInvalidParameterError("itemID", std::nullopt));
  EXPECT_EQ(revoke(kReport, std::nullopt, std::nullopt), DVInvalidParameterError("providerID", std::nullopt));
  EXPECT_EQ(revoke(kReport, kCellar, std::nullopt), DVInvalidParameterError("consumerID", std::nullopt));
  EXPECT_TRUE(platform_.sandbox.invalidations().empty());
}

TEST_F(DVAdministratorTest, WhatIsNotGrantedIsNotFoundAndNothingIsTakenBack) {
  grant(kCellar, kReport, kEditor);
  platform_.log.clear();
  EXPECT_EQ(revoke(kLetter, kCellar, kEditor), DVNotFoundError(kLetter));
  EXPECT_EQ(revoke(kReport, kAttic, kEditor), DVNotFoundError(kReport));
  EXPECT_EQ(revoke(kReport, kCellar, kPicker), DVNotFoundError(kReport));
  EXPECT_TRUE(platform_.sandbox.invalidations().empty());
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_TRUE(store().isProviderWithIdentifier(kCellar, kReport, kEditor));
}

TEST_F(DVAdministratorTest, ARevokedGrantIsGoneFromTheFileAndLoggedByTheStoreAlone) {
  grant(kCellar, kReport, kEditor);
  grant(kCellar, kReport, kPicker);
  platform_.log.clear();
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  EXPECT_EQ(platform_.propertyLists.value(kFile),
            QXValue(QXDictionary{{kCellar.value, QXDictionary{{kPicker.value, QXDictionary{{"AllowedItemIDs", QXArray{"report"}}}}}}}));
  EXPECT_EQ(platform_.log.texts(), (std::vector<std::string>{"[INFO] No longer allowing provider ID com.orvane.cellar to provide item ID "
                                                             "“report” to consumer ID com.example.editor",
                                                             "[INFO] Committing access control list"}));
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), DVNotFoundError(kReport));
}

TEST_F(DVAdministratorTest, TakesTheGrantFromTheListThenTheTokensAndAnswersThen) {
  grant(kCellar, kReport, kEditor);
  std::vector<std::string> steps;
  platform_.sandbox.onInvalidation([&] {
    const bool listed = store().isProviderWithIdentifier(kCellar, kReport, kEditor);
    const bool written = platform_.propertyLists.value(kFile) == QXValue(QXDictionary());
    steps.emplace_back(std::string(listed ? "listed" : "not listed") + (written ? ", written" : ", not written"));
  });
  administrator_.revokeItemID(kReport, kCellar, kEditor,
                              [&steps](const auto& error) { steps.emplace_back(error ? "failed" : "answered"); });
  EXPECT_EQ(steps, (std::vector<std::string>{"not listed, written", "answered"}));
}

TEST_F(DVAdministratorTest, TheTokensOfEveryContainerOfTheProvidersGroupsAreTakenBack) {
  registerCellar();
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  EXPECT_EQ(platform_.sandbox.invalidations(), std::vector<std::optional<std::string>>{FakePlatform::containerPath(kCellar.value)});

  // Its documents were in another group once, or will be.
  platform_.applicationRegistry.setRecord(kCellar.value, {},
                                          {{"com.orvane.cellar.v1", QXURL::fileURL("/groups/v1", QXURLKind::directory)},
                                           {"com.orvane.cellar.v2", QXURL::fileURL("/groups/v2", QXURLKind::directory)}});
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  EXPECT_EQ(platform_.sandbox.invalidations(),
            (std::vector<std::optional<std::string>>{FakePlatform::containerPath(kCellar.value), "/groups/v1", "/groups/v2"}));
}

TEST_F(DVAdministratorTest, WhenOneOfItsContainersCannotBeCutTheOthersAreAllTheSameAndTheErrorIsTheAnswer) {
  registerCellar();
  platform_.applicationRegistry.setRecord(kCellar.value, {},
                                          {{"com.orvane.cellar.v1", QXURL::fileURL("/groups/v1", QXURLKind::directory)},
                                           {"com.orvane.cellar.v2", QXURL::fileURL("/groups/v2", QXURLKind::directory)}});
  const QXError error = QXError::system(ENOSPC, "no room for it");
  platform_.sandbox.setInvalidationError(error);
  platform_.sandbox.onInvalidation([this] {
    if (platform_.sandbox.invalidations().size() == 2) platform_.sandbox.setInvalidationError(std::nullopt);
  });
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), error);
  EXPECT_EQ(platform_.sandbox.invalidations().size(), 2U);
}

TEST_F(DVAdministratorTest, AProviderWithoutARecordOrWithoutGroupsHasAllTokensTakenBack) {
  registerCellar();
  platform_.applicationRegistry.setRecord(kCellar.value, {}, {});
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  platform_.applicationRegistry.removeRecord(kCellar.value);
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  EXPECT_EQ(platform_.sandbox.invalidations(), (std::vector<std::optional<std::string>>{std::nullopt, std::nullopt}));
}

TEST_F(DVAdministratorTest, AProviderThatIsNotRegisteredOrHasNoDirectoryHasAllTokensTakenBack) {
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  registerCellar();
  DVExtensionDocuvend::providerWithIdentifier(kCellar)->setProvidedItemsURL(std::nullopt);
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  EXPECT_EQ(platform_.sandbox.invalidations(), (std::vector<std::optional<std::string>>{std::nullopt, std::nullopt}));
}

TEST_F(DVAdministratorTest, WhenTheTokensCannotBeTakenBackTheirErrorIsTheAnswerAndTheGrantIsGone) {
  const QXError error = QXError::system(ENOSPC, "no room for it");
  platform_.sandbox.setInvalidationError(error);
  grant(kCellar, kReport, kEditor);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), error);
  EXPECT_FALSE(store().isProviderWithIdentifier(kCellar, kReport, kEditor));
}

TEST_F(DVAdministratorTest, ARevocationThatCannotBeWrittenIsAnErrorAndTheTokensAreTakenBackAllTheSame) {
  platform_.sandbox.setInvalidationError(QXError::system(ENOSPC, "no room for it"));
  grant(kCellar, kReport, kEditor);
  platform_.propertyLists.failWrite(2, FakeWriteFailure::once);
  const auto error = revoke(kReport, kCellar, kEditor);
  ASSERT_TRUE(error);
  EXPECT_EQ(*error, QXError::system(EIO, "the access control list could not be written; when it is read again the grant is back"));
  EXPECT_EQ(platform_.sandbox.invalidations().size(), 1U);
  EXPECT_FALSE(store().isProviderWithIdentifier(kCellar, kReport, kEditor));
}

TEST_F(DVAdministratorTest, ARevocationThatCouldNotBeWrittenIsWrittenWhenItIsAskedForAgain) {
  grant(kCellar, kReport, kEditor);
  platform_.propertyLists.failWrite(2, FakeWriteFailure::once);
  ASSERT_TRUE(revoke(kReport, kCellar, kEditor));
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), std::nullopt);
  EXPECT_FALSE(store().hasUnwrittenChanges());
  EXPECT_EQ(platform_.sandbox.invalidations().size(), 2U);
  EXPECT_EQ(revoke(kReport, kCellar, kEditor), DVNotFoundError(kReport)) << "now there is nothing left to do";
}

// --- The first unlock

TEST_F(DVAdministratorTest, TheFirstUnlockIsPostedAndThenAnswered) {
  connection_->setProcessIdentifier(4711);
  platform_.log.clear();
  platform_.log.onWrite([this](const FakeLogEntry&) { EXPECT_EQ(platform_.queues.pendingOnMainRunLoop(), 0U) << "not posted yet"; });
  std::vector<std::size_t> posted;
  administrator_.announceFirstUnlockCompletionHandler([&](const std::optional<QXError>& error) {
    EXPECT_EQ(error, std::nullopt);
    posted.push_back(platform_.queues.pendingOnMainRunLoop());
  });
  EXPECT_EQ(posted, std::vector<std::size_t>{1}) << "the store observes it";
  EXPECT_EQ(platform_.log.entries(),
            (std::vector<FakeLogEntry>{{QXLogType::defaultType, "[NOTICE] PID 4711 announces the first unlock."}}));
}

TEST_F(DVAdministratorTest, AnAdministratorWhoseConnectionIsGoneIsStillServed) {
  connection_.reset();
  platform_.log.clear();
  administrator_.announceFirstUnlockCompletionHandler(/*completionHandler=*/{});
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[NOTICE] PID 0 announces the first unlock."});
  EXPECT_EQ(platform_.queues.pendingOnMainRunLoop(), 1U);
}

// --- The status

TEST_F(DVAdministratorTest, TheStatusSaysHowTheDaemonIs) {
  platform_.deviceLock.state = 1;
  platform_.deviceLock.unlocked = true;
  registerCellar();
  grant(kCellar, kReport, kEditor);
  grant(kCellar, kLetter, kEditor);
  const auto given = status();
  ASSERT_NE(qxFind<std::string>(given, "version"), nullptr);
  EXPECT_EQ(*qxFind<std::string>(given, "version"), DOCUVEND_VERSION);
  EXPECT_EQ(*qxFind<std::int64_t>(given, "lockState"), 1);
  EXPECT_EQ(*qxFind<bool>(given, "unlockedSinceBoot"), true);
  EXPECT_EQ(*qxFind<std::int64_t>(given, "grants"), 2);
  EXPECT_EQ(*qxFind<QXDictionary>(given, "providers"), DVExtensionDocuvend::providersInfo());
  const auto* cellar = qxFind<QXDictionary>(*qxFind<QXDictionary>(given, "providers"), kCellar.value);
  ASSERT_NE(cellar, nullptr);
  EXPECT_EQ(*qxFind<QXURL>(*cellar, "documentStorageURL"), FakePlatform::storageURL(kCellar.value));
  EXPECT_EQ(given.size(), 5U);
}

TEST_F(DVAdministratorTest, TheStatusHoldsThePlatformsOwn) {
  platform_.status.set({{"processIdentifier", 7}, {"version", "the platform's"}});
  const auto given = status();
  EXPECT_EQ(*qxFind<std::int64_t>(given, "processIdentifier"), 7);
  EXPECT_EQ(*qxFind<std::string>(given, "version"), DOCUVEND_VERSION);
  EXPECT_EQ(*qxFind<bool>(given, "unlockedSinceBoot"), false);
}

TEST_F(DVAdministratorTest, WhoWantsNoReplyIsServed) {
  grant(kCellar, kReport, kEditor);
  administrator_.statusCompletionHandler(/*completionHandler=*/{});
  administrator_.grantsOfProviderID(std::nullopt, std::nullopt, std::nullopt, /*completionHandler=*/{});
  administrator_.grantsOfProviderID(std::nullopt, std::nullopt, -1, /*completionHandler=*/{});
  administrator_.revokeItemID(std::nullopt, std::nullopt, std::nullopt, /*completionHandler=*/{});
  administrator_.revokeItemID(kReport, kCellar, kEditor, /*completionHandler=*/{});
  EXPECT_FALSE(store().isProviderWithIdentifier(kCellar, kReport, kEditor));
}

}  // namespace
}  // namespace docuvend
