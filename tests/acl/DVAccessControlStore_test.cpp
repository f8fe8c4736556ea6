#include "acl/DVAccessControlStore.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "acl/DVGrantLimits.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakeCreatedQueue;
using fake_platform::FakeLogEntry;
using fake_platform::FakeLogSwitch;
using fake_platform::FakePlatform;
using fake_platform::FakeQueueKind;
using fake_platform::FakeWriteFailure;

constexpr const char* kDirectory = "/home/fake/Library/Docuvend";
constexpr const char* kFile = "/home/fake/Library/Docuvend/AccessControl.plist";
constexpr const char* kQueue = "DVAccessControlStore sync queue";

const ProviderID kCellar{"com.orvane.cellar"};
const ProviderID kAttic{"com.orvane.attic"};
const ConsumerID kEditor{"com.example.editor"};
const ItemID kReport{"report"};
const ItemID kLetter{"letter"};

QXDictionary listOf(const ProviderID& provider, const ConsumerID& consumer, QXArray items) {
  return {{provider.value, QXDictionary{{consumer.value, QXDictionary{{"AllowedItemIDs", std::move(items)}}}}}};
}

class DVAccessControlStoreTest : public testing::Test {
 protected:
  DVAccessControlStore& store() { return *DVAccessControlStore::sharedStore(); }

  void grant(const ItemID& item) { store().allowProviderWithIdentifier(kCellar, item, kEditor); }
  bool isGranted(const ItemID& item) { return store().isProviderWithIdentifier(kCellar, item, kEditor); }

  void announceFirstUnlock() {
    platform_.notificationCenter.post(kQXFirstUnlockNotification);
    ASSERT_TRUE(platform_.queues.runOne(fake_platform::kFakeMainRunLoopLabel));
  }

  FakePlatform platform_;
};

// --- Creation

TEST_F(DVAccessControlStoreTest, ThereIsOneSharedStore) {
  const DVAccessControlStore* first = &store();
  EXPECT_EQ(&store(), first);
  EXPECT_EQ(platform_.queues.createdQueues(), (std::vector{FakeCreatedQueue{FakeQueueKind::serial, kQueue}}));
  EXPECT_EQ(platform_.notificationCenter.observers().size(), 1U);
}

TEST_F(DVAccessControlStoreTest, NothingHappensBeforeTheFirstNeed) {
  EXPECT_TRUE(platform_.fileSystem.calls().empty());
  EXPECT_TRUE(platform_.notificationCenter.observers().empty());
}

TEST_F(DVAccessControlStoreTest, TheSharedStoreKeepsItselfAlive) {
  const std::weak_ptr<DVAccessControlStore> weak = DVAccessControlStore::sharedStore();
  EXPECT_FALSE(weak.expired());
}

TEST_F(DVAccessControlStoreTest, ItsQueueIsSerialUnderItsOwnLabel) { EXPECT_EQ(store().syncQueue()->label(), kQueue); }

TEST_F(DVAccessControlStoreTest, CreationMakesTheDirectoryThenLooksForTheFile) {
  (void)store();
  EXPECT_EQ(platform_.fileSystem.calls(),
            (std::vector<std::string>{std::string("exists ") + kDirectory, std::string("createDirectory ") + kDirectory,
                                      std::string("exists ") + kFile}));
  EXPECT_TRUE(platform_.fileSystem.isDirectory(kDirectory));
}

TEST_F(DVAccessControlStoreTest, CreationReadsOnTheCallingThreadAndLeavesNoTask) {
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  (void)store();
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[INFO] Successfully read access control from disk."});
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_F(DVAccessControlStoreTest, AHomeDirectoryMayEndInASlash) {
  platform_.fileSystem.setHomeDirectory("/home/fake/");
  grant(kReport);
  EXPECT_EQ(platform_.propertyLists.writes().at(0).path, kFile);
}

TEST_F(DVAccessControlStoreTest, AnExistingDirectoryIsNotMadeAgain) {
  platform_.fileSystem.addDirectory(kDirectory);
  (void)store();
  EXPECT_EQ(platform_.fileSystem.calls(), (std::vector<std::string>{std::string("exists ") + kDirectory, std::string("exists ") + kFile}));
}

TEST_F(DVAccessControlStoreTest, AnythingAtTheDirectorysPathCountsAsTheDirectory) {
  platform_.fileSystem.addFile(kDirectory);
  (void)store();
  EXPECT_TRUE(platform_.fileSystem.isFile(kDirectory));
  EXPECT_TRUE(platform_.log.entries().empty());
}

TEST_F(DVAccessControlStoreTest, PathsAreComputedOnce) {
  (void)store();
  platform_.fileSystem.remove("/home/fake/Library");
  platform_.fileSystem.setHomeDirectory("/home/other");
  platform_.fileSystem.forgetCalls();
  store().rereadAccessControl();
  platform_.queues.runAll();
  EXPECT_EQ(platform_.fileSystem.calls(), std::vector<std::string>{std::string("exists ") + kFile});
  EXPECT_FALSE(platform_.fileSystem.isDirectory(kDirectory));
}

TEST_F(DVAccessControlStoreTest, ADirectoryThatCannotBeMadeIsLoggedAndThePathsAreUsedAllTheSame) {
  const QXError error = QXError::system(13, "no");
  platform_.fileSystem.setCreateDirectoryError(error);
  (void)store();
  EXPECT_EQ(
      platform_.log.entries(),
      (std::vector<FakeLogEntry>{{QXLogType::fault, "[ERROR] Cannot create access control directory. Error: " + error.description()}}));
  platform_.log.clear();
  grant(kReport);
  EXPECT_EQ(platform_.log.texts(QXLogType::fault), std::vector<std::string>{std::string("[ERROR] Could not write to ") + kFile});
  EXPECT_TRUE(isGranted(kReport));
}

// --- Reading

TEST_F(DVAccessControlStoreTest, AMissingFileLogsNothingAndAllowsNothing) {
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
}

TEST_F(DVAccessControlStoreTest, AFileThatIsReadIsLoggedAtInfoLevel) {
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_FALSE(isGranted(kLetter));
  EXPECT_EQ(platform_.log.entries(), (std::vector<FakeLogEntry>{{QXLogType::info, "[INFO] Successfully read access control from disk."}}));
}

TEST_F(DVAccessControlStoreTest, ACorruptFileIsLoggedAndLeftAloneByReading) {
  platform_.propertyLists.setCorrupt(kFile);
  EXPECT_FALSE(isGranted(kReport));
  const auto entries = platform_.log.entries();
  ASSERT_EQ(entries.size(), 1U);
  EXPECT_EQ(entries[0].type, QXLogType::fault);
  EXPECT_EQ(entries[0].text,
            "[ERROR] Cannot read access control from disk. Error: QXGeneralErrorDomain 300: The file is not a property list.");
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
}

TEST_F(DVAccessControlStoreTest, AFileOfAnotherShapeIsKeptBesideBeforeItIsReplaced) {
  const QXDictionary misshapen{{"com.orvane.cellar", QXDictionary{{"com.example.editor", 1}}}};
  platform_.propertyLists.setValue(kFile, misshapen);
  grant(kReport);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report"})));
  EXPECT_EQ(platform_.propertyLists.value(std::string(kFile) + ".unreadable-1"), QXValue(misshapen));
  grant(kLetter);
  EXPECT_FALSE(platform_.propertyLists.value(std::string(kFile) + ".unreadable-2"));
}

TEST_F(DVAccessControlStoreTest, TheFirstGrantReplacesACorruptFileWithOnlyThatGrant) {
  platform_.propertyLists.setCorrupt(kFile);
  grant(kReport);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report"})));
}

TEST_F(DVAccessControlStoreTest, AFileWithoutAStreamLogsNothingAndChangesNothing) {
  grant(kReport);
  platform_.propertyLists.setNoStream(kFile);
  platform_.log.clear();
  store().rereadAccessControl();
  platform_.queues.runAll();
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_TRUE(isGranted(kReport));
}

TEST_F(DVAccessControlStoreTest, AFileWithoutAStreamAtStartIsAnEmptyList) {
  platform_.propertyLists.setNoStream(kFile);
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_TRUE(platform_.log.entries().empty());
}

TEST_F(DVAccessControlStoreTest, TheReportedErrorDecidesTheMessageAndTheValueTheList) {
  const QXError error = QXError::make(kQXGeneralErrorDomain, 1, "half read");
  platform_.propertyLists.setReadResult(kFile, {QXValue(listOf(kCellar, kEditor, {"report"})), error});
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[ERROR] Cannot read access control from disk. Error: " + error.description()});
}

TEST_F(DVAccessControlStoreTest, NeitherValueNorErrorIsASuccessfulReadOfNothing) {
  platform_.propertyLists.setReadResult(kFile, {std::nullopt, std::nullopt});
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[INFO] Successfully read access control from disk."});
}

TEST_F(DVAccessControlStoreTest, AFileOfAnotherShapeIsRejectedLikeAnUnreadableOne) {
  grant(kReport);
  platform_.propertyLists.setValue(kFile, QXDictionary{{kCellar.value, "all of it"}});
  platform_.log.clear();
  store().rereadAccessControl();
  platform_.queues.runAll();
  EXPECT_EQ(platform_.log.entries(),
            (std::vector<FakeLogEntry>{{QXLogType::fault,
                                        "[ERROR] Cannot read access control from disk. Error: DVGrantTreeErrorDomain 1: The access control "
                                        "list is not laid out as one: provider com.orvane.cellar is not a dictionary."}}));
  EXPECT_FALSE(isGranted(kReport));
  grant(kLetter);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"letter"})));
}

TEST_F(DVAccessControlStoreTest, AFileOfAnotherShapeIsKeptOnceHoweverOftenWritingFails) {
  platform_.propertyLists.setValue(kFile, QXArray{"a"});
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  grant(kLetter);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report", "letter"})));
  EXPECT_TRUE(platform_.fileSystem.isFile(std::string(kFile) + ".unreadable-1"));
  EXPECT_FALSE(platform_.fileSystem.isFile(std::string(kFile) + ".unreadable-2"));
}

TEST_F(DVAccessControlStoreTest, AFileOfAnotherShapeThatIsGoneByThenIsNoObstacle) {
  platform_.propertyLists.setValue(kFile, QXArray{"a"});
  (void)store();
  platform_.fileSystem.remove(kFile);
  grant(kReport);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report"})));
}

TEST_F(DVAccessControlStoreTest, WhatCannotBeKeptBesideIsNotReplaced) {
  platform_.propertyLists.setValue(kFile, QXArray{"a"});
  (void)store();
  platform_.fileSystem.remove(kFile);
  platform_.fileSystem.addDirectory(kFile);
  grant(kReport);
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_TRUE(store().hasUnwrittenChanges());
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
  EXPECT_TRUE(platform_.fileSystem.isDirectory(kFile));
  EXPECT_EQ(platform_.log.entries().back(), (FakeLogEntry{QXLogType::fault, "[ERROR] Could not write to " + std::string(kFile)}));
}

TEST_F(DVAccessControlStoreTest, AFileOfAnotherShapeThatHasBeenMendedIsReplacedWithoutACopy) {
  platform_.propertyLists.setValue(kFile, QXArray{"a"});
  (void)store();
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  store().rereadAccessControl();
  platform_.queues.runAll();
  grant(kLetter);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report", "letter"})));
  EXPECT_FALSE(platform_.fileSystem.isFile(std::string(kFile) + ".unreadable-1"));
}

TEST_F(DVAccessControlStoreTest, AFileThatIsNoDictionaryIsRejectedAtStart) {
  platform_.propertyLists.setValue(kFile, QXArray{"a"});
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_EQ(
      platform_.log.texts(),
      std::vector<std::string>{"[ERROR] Cannot read access control from disk. Error: DVGrantTreeErrorDomain 1: The access control list "
                               "is not laid out as one: the top level is not a dictionary."});
}

TEST_F(DVAccessControlStoreTest, TheReadersOwnErrorIsTheOneThatIsLogged) {
  const QXError error = QXError::make(kQXGeneralErrorDomain, 1, "half read");
  platform_.propertyLists.setReadResult(kFile, {QXValue(QXArray{}), error});
  (void)store();
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[ERROR] Cannot read access control from disk. Error: " + error.description()});
}

// --- Granting

TEST_F(DVAccessControlStoreTest, AGrantIsLoggedThenCommittedAndOnDiskWhenTheCallReturns) {
  (void)store();
  grant(kReport);
  EXPECT_EQ(platform_.log.entries(),
            (std::vector<FakeLogEntry>{{QXLogType::info,
                                        "[INFO] Allowing provider ID com.orvane.cellar to provide item ID “report” to consumer ID "
                                        "com.example.editor"},
                                       {QXLogType::info, "[INFO] Committing access control list"}}));
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report"})));
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_F(DVAccessControlStoreTest, GrantingTwiceLogsAndLeavesTheFileUntouched) {
  grant(kReport);
  platform_.log.clear();
  grant(kReport);
  EXPECT_EQ(platform_.log.entries(),
            (std::vector<FakeLogEntry>{{QXLogType::info,
                                        "[INFO] Provider ID com.orvane.cellar is already allowed to provide item ID “report” to consumer "
                                        "ID com.example.editor."}}));
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_F(DVAccessControlStoreTest, ItemsAreWrittenInTheOrderOfTheirGrants) {
  grant(kReport);
  grant(kLetter);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report", "letter"})));
}

TEST_F(DVAccessControlStoreTest, AWriteThatFailsIsLoggedAndKeptForTheNextOne) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  EXPECT_EQ(platform_.log.entries().back(), (FakeLogEntry{QXLogType::fault, std::string("[ERROR] Could not write to ") + kFile}));
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_EQ(platform_.propertyLists.value(kFile), std::nullopt);

  platform_.log.clear();
  grant(kLetter);
  EXPECT_TRUE(platform_.log.texts(QXLogType::fault).empty());
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report", "letter"})));
}

TEST_F(DVAccessControlStoreTest, AGrantThatCouldNotBeWrittenIsNotWrittenByRepeatingIt) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  grant(kReport);
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_F(DVAccessControlStoreTest, AChangeAndItsWritingAreOneStepOfItsQueue) {
  (void)store();
  std::vector<std::optional<QXValue>> seen;
  platform_.log.onWrite([&](const FakeLogEntry& entry) {
    const bool isOfAChange = entry.text.starts_with("[INFO] Allowing") || entry.text.starts_with("[INFO] No longer allowing");
    if (isOfAChange) store().syncQueue()->async([&] { seen.push_back(platform_.propertyLists.value(kFile)); });
  });
  grant(kReport);
  platform_.queues.runAll();
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  platform_.queues.runAll();
  EXPECT_EQ(seen, (std::vector<std::optional<QXValue>>{QXValue(listOf(kCellar, kEditor, {"report"})), QXValue(QXDictionary())}));
}

TEST_F(DVAccessControlStoreTest, EveryLineOfASharedStoreIsLoggedOnItsQueue) {
  platform_.propertyLists.failWrite(3, FakeWriteFailure::once);
  (void)store();
  std::vector<std::string> elsewhere;
  std::size_t lines = 0;
  platform_.log.onWrite([&](const FakeLogEntry& entry) {
    ++lines;
    if (!store().syncQueue()->isCurrent()) elsewhere.push_back(entry.text);
  });
  grant(kReport);
  grant(kReport);
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  grant(kLetter);
  store().writeUnwrittenChanges();
  EXPECT_TRUE(store().allowWhereThereIsRoom({kAttic, kEditor, kReport}, DVGranter::writer(kEditor)));
  for (int i = 0; i < 2; ++i) {
    store().rereadAccessControl();
    platform_.queues.runAll();
    platform_.propertyLists.setCorrupt(kFile);
  }
  EXPECT_EQ(lines, 13U);
  EXPECT_EQ(elsewhere, std::vector<std::string>{});
}

TEST_F(DVAccessControlStoreTest, ACommitIsLoggedBeforeItIsWritten) {
  std::vector<std::size_t> writesAtCommits;
  platform_.log.onWrite([&](const FakeLogEntry& entry) {
    if (entry.text == "[INFO] Committing access control list") writesAtCommits.push_back(platform_.propertyLists.writeCount());
  });
  grant(kReport);
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  EXPECT_EQ(writesAtCommits, (std::vector<std::size_t>{0, 1}));
}

// --- Revoking

TEST_F(DVAccessControlStoreTest, RevokingIsLoggedThenCommittedAndOnDiskWhenTheCallReturns) {
  grant(kReport);
  grant(kLetter);
  platform_.log.clear();
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  EXPECT_EQ(platform_.log.entries(),
            (std::vector<FakeLogEntry>{{QXLogType::info,
                                        "[INFO] No longer allowing provider ID com.orvane.cellar to provide item ID “report” to consumer "
                                        "ID com.example.editor"},
                                       {QXLogType::info, "[INFO] Committing access control list"}}));
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"letter"})));
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_TRUE(isGranted(kLetter));
}

TEST_F(DVAccessControlStoreTest, RevokingTheOnlyItemLeavesNoTraceOfTheProvider) {
  grant(kReport);
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(QXDictionary()));
}

TEST_F(DVAccessControlStoreTest, RevokingWhatIsNotGrantedLogsAndWritesNothing) {
  grant(kReport);
  platform_.log.clear();
  store().disallowProviderWithIdentifier(kCellar, kLetter, kEditor);
  store().disallowProviderWithIdentifier(kAttic, kReport, kEditor);
  store().disallowProviderWithIdentifier(kCellar, kReport, ConsumerID{"com.example.picker"});
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
  EXPECT_TRUE(isGranted(kReport));
}

TEST_F(DVAccessControlStoreTest, ARevocationThatCannotBeWrittenHoldsInMemory) {
  grant(kReport);
  platform_.propertyLists.failWrite(2, FakeWriteFailure::once);
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  EXPECT_EQ(platform_.log.entries().back().text, std::string("[ERROR] Could not write to ") + kFile);
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report"})));
}

// --- What the administration asks

TEST_F(DVAccessControlStoreTest, TheWholeListIsACopy) {
  grant(kReport);
  store().allowProviderWithIdentifier(kAttic, kLetter, kEditor);
  const auto listed = store().grants();
  store().disallowProviderWithIdentifier(kCellar, kReport, kEditor);
  EXPECT_EQ(listed, (std::vector<DVGrant>{{kAttic, kEditor, kLetter}, {kCellar, kEditor, kReport}}));
  EXPECT_EQ(store().grants(), (std::vector<DVGrant>{{kAttic, kEditor, kLetter}}));
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_F(DVAccessControlStoreTest, ListingLogsNothingAndTouchesNoFile) {
  grant(kReport);
  platform_.log.clear();
  platform_.fileSystem.forgetCalls();
  EXPECT_EQ(store().grants().size(), 1U);
  EXPECT_FALSE(store().hasUnwrittenChanges());
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_TRUE(platform_.fileSystem.calls().empty());
}

TEST_F(DVAccessControlStoreTest, AChangeThatCouldNotBeWrittenIsUnwrittenUntilALaterOneIs) {
  EXPECT_FALSE(store().hasUnwrittenChanges());
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  EXPECT_TRUE(store().hasUnwrittenChanges());
  grant(kReport);
  EXPECT_TRUE(store().hasUnwrittenChanges()) << "nothing was written";
  grant(kLetter);
  EXPECT_FALSE(store().hasUnwrittenChanges());
}

TEST_F(DVAccessControlStoreTest, AnUnwrittenChangeIsWrittenOnDemandAndNothingElseIs) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  platform_.log.clear();
  store().writeUnwrittenChanges();
  EXPECT_FALSE(store().hasUnwrittenChanges());
  EXPECT_EQ(platform_.log.entries().size(), 1U) << "the list was committed once";
  store().writeUnwrittenChanges();
  EXPECT_EQ(platform_.log.entries().size(), 1U);
}

TEST_F(DVAccessControlStoreTest, ARereadThatTakesTheFilesListLeavesNothingUnwritten) {
  grant(kReport);
  platform_.propertyLists.failWrite(2, FakeWriteFailure::once);
  grant(kLetter);
  EXPECT_TRUE(store().hasUnwrittenChanges());
  store().rereadAccessControl();
  platform_.queues.runAll();
  EXPECT_FALSE(store().hasUnwrittenChanges());
}

TEST_F(DVAccessControlStoreTest, ARereadOfAMissingFileLeavesTheChangesUnwritten) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  store().rereadAccessControl();
  platform_.queues.runAll();
  EXPECT_TRUE(store().hasUnwrittenChanges());
}

TEST_F(DVAccessControlStoreTest, ARereadOfAFileThatCannotBeReadLeavesNothingToBeWrittenOverIt) {
  platform_.propertyLists.failWrite(1, FakeWriteFailure::once);
  grant(kReport);
  platform_.propertyLists.setCorrupt(kFile);
  store().rereadAccessControl();
  platform_.queues.runAll();
  EXPECT_FALSE(store().hasUnwrittenChanges());
  store().writeUnwrittenChanges();
  EXPECT_EQ(platform_.propertyLists.writeCount(), 1U);
}

// --- Asking

TEST_F(DVAccessControlStoreTest, AQueryLogsNothingAndTouchesNoFile) {
  grant(kReport);
  platform_.log.clear();
  platform_.fileSystem.forgetCalls();
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_TRUE(store().isProviderIdentifier(kCellar, kReport, kEditor));
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_TRUE(platform_.fileSystem.calls().empty());
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
}

TEST_F(DVAccessControlStoreTest, TheProtocolsQueryRefusesAbsentIdentifiersWithoutTheQueue) {
  store().syncQueue()->suspend();  // whoever waits for the queue now, waits for ever, and the fake says so
  EXPECT_FALSE(store().isProviderWithIdentifier(std::nullopt, kReport, kEditor));
  EXPECT_FALSE(store().isProviderWithIdentifier(kCellar, std::nullopt, kEditor));
  EXPECT_FALSE(store().isProviderWithIdentifier(kCellar, kReport, std::nullopt));
  store().syncQueue()->resume();
}

TEST_F(DVAccessControlStoreTest, TheProtocolsQueryLooksEmptyIdentifiersUp) {
  store().allowProviderWithIdentifier(ProviderID{}, ItemID{}, ConsumerID{});
  EXPECT_TRUE(store().isProviderWithIdentifier(ProviderID{}, ItemID{}, ConsumerID{}));
  const DVAccessControl& protocol = store();
  EXPECT_TRUE(protocol.isProviderWithIdentifier(ProviderID{}, ItemID{}, ConsumerID{}));
}

TEST_F(DVAccessControlStoreTest, TheOtherQueryRefusesEmptyProvidersAndItemsWithoutTheQueue) {
  store().allowProviderWithIdentifier(ProviderID{}, kReport, kEditor);
  store().allowProviderWithIdentifier(kCellar, ItemID{}, kEditor);
  store().syncQueue()->suspend();
  EXPECT_FALSE(store().isProviderIdentifier(ProviderID{}, kReport, kEditor));
  EXPECT_FALSE(store().isProviderIdentifier(kCellar, ItemID{}, kEditor));
  EXPECT_FALSE(store().isProviderIdentifier(std::nullopt, kReport, kEditor));
  EXPECT_FALSE(store().isProviderIdentifier(kCellar, std::nullopt, kEditor));
  EXPECT_FALSE(store().isProviderIdentifier(kCellar, kReport, std::nullopt));
  store().syncQueue()->resume();
}

TEST_F(DVAccessControlStoreTest, TheOtherQueryLooksAnEmptyConsumerUp) {
  EXPECT_FALSE(store().isProviderIdentifier(kCellar, kReport, ConsumerID{}));
  store().allowProviderWithIdentifier(kCellar, kReport, ConsumerID{});
  EXPECT_TRUE(store().isProviderIdentifier(kCellar, kReport, ConsumerID{}));
}

TEST_F(DVAccessControlStoreTest, AMissingLevelAtAnyDepthIsARefusal) {
  platform_.propertyLists.setValue(
      kFile, QXDictionary{{"no consumer", QXDictionary()}, {kCellar.value, QXDictionary{{"no items", QXDictionary()}}}});
  EXPECT_FALSE(store().isProviderWithIdentifier(kAttic, kReport, kEditor));
  EXPECT_FALSE(store().isProviderWithIdentifier(ProviderID{"no consumer"}, kReport, kEditor));
  EXPECT_FALSE(store().isProviderWithIdentifier(kCellar, kReport, ConsumerID{"no items"}));
}

// --- Rereading

TEST_F(DVAccessControlStoreTest, RereadingIsATaskOfItsQueue) {
  (void)store();
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  store().rereadAccessControl();
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_EQ(platform_.queues.pending(kQueue), 1U);
  platform_.queues.runAll();
  EXPECT_TRUE(isGranted(kReport));
}

TEST_F(DVAccessControlStoreTest, AQueryAfterARereadSeesWhatWasRead) {
  (void)store();
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  store().rereadAccessControl();
  EXPECT_TRUE(isGranted(kReport));
}

TEST_F(DVAccessControlStoreTest, TheListAfterARereadIsTheOneThatWasRead) {
  (void)store();
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  store().rereadAccessControl();
  EXPECT_EQ(store().grants(), (std::vector<DVGrant>{{kCellar, kEditor, kReport}}));
}

TEST_F(DVAccessControlStoreTest, WhetherAChangeIsUnwrittenAfterARereadIsSaidOfWhatWasRead) {
  grant(kReport);
  platform_.propertyLists.failWrite(2, FakeWriteFailure::once);
  grant(kLetter);
  store().rereadAccessControl();
  EXPECT_FALSE(store().hasUnwrittenChanges());
}

TEST_F(DVAccessControlStoreTest, WhateverStoreObservesTheFirstUnlockTheSharedOneRereads) {
  (void)store();
  const auto other = std::make_shared<DVAccessControlStore>();
  ASSERT_EQ(platform_.notificationCenter.observers().size(), 2U);
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  platform_.notificationCenter.post(kQXFirstUnlockNotification);
  platform_.queues.runAll();
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_FALSE(other->isProviderWithIdentifier(kCellar, kReport, kEditor));
}

TEST_F(DVAccessControlStoreTest, ObservesTheFirstUnlockWithImmediateDelivery) {
  (void)store();
  const auto observers = platform_.notificationCenter.observers();
  ASSERT_EQ(observers.size(), 1U);
  EXPECT_EQ(observers[0].notification, "com.orvane.mobile.gatewardd.first_unlock");
  EXPECT_EQ(observers[0].behavior, QXSuspensionBehavior::deliverImmediately);
}

TEST_F(DVAccessControlStoreTest, EachFirstUnlockRereadsTheFileLater) {
  (void)store();
  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"report"}));
  announceFirstUnlock();
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_EQ(platform_.queues.pending(kQueue), 1U);
  platform_.queues.runAll();
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[INFO] Successfully read access control from disk."});
  EXPECT_TRUE(isGranted(kReport));

  platform_.propertyLists.setValue(kFile, listOf(kCellar, kEditor, {"letter"}));
  announceFirstUnlock();
  platform_.queues.runAll();
  EXPECT_FALSE(isGranted(kReport));
  EXPECT_TRUE(isGranted(kLetter));
}

TEST_F(DVAccessControlStoreTest, AFileThatIsGoneAtTheFirstUnlockLeavesTheListAsItWas) {
  grant(kReport);
  platform_.fileSystem.remove(kFile);
  platform_.log.clear();
  announceFirstUnlock();
  platform_.queues.runAll();
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_TRUE(platform_.log.entries().empty());
}

TEST_F(DVAccessControlStoreTest, AFileThatIsCorruptAtTheFirstUnlockEmptiesTheList) {
  grant(kReport);
  platform_.propertyLists.setCorrupt(kFile);
  announceFirstUnlock();
  platform_.queues.runAll();
  EXPECT_FALSE(isGranted(kReport));
}

TEST_F(DVAccessControlStoreTest, AGrantRecordedBeforeTheFileCouldBeReadIsCommittedOverIt) {
  platform_.propertyLists.setNoStream(kFile);
  grant(kReport);
  EXPECT_EQ(platform_.propertyLists.value(kFile), QXValue(listOf(kCellar, kEditor, {"report"})));
}

// --- Log levels

TEST_F(DVAccessControlStoreTest, AllowsWhatItHasAlreadyAndWhatItsLimitsLeave) {
  const ItemID tooLong{std::string(kDVLongestGrantedItemID + 1, 'i')};
  for (const DVGranter& granter : {DVGranter::entitled(), DVGranter::writer(kEditor)}) {
    EXPECT_FALSE(store().allowWhereThereIsRoom({kCellar, kEditor, tooLong}, granter));
  }
  EXPECT_FALSE(isGranted(tooLong));
  EXPECT_TRUE(platform_.log.entries().empty());
  EXPECT_TRUE(platform_.propertyLists.writes().empty());
  EXPECT_TRUE(store().allowWhereThereIsRoom({kCellar, kEditor, kReport}, DVGranter::writer(kEditor)));
  EXPECT_TRUE(isGranted(kReport));
  EXPECT_EQ(platform_.propertyLists.writes().size(), 1U);
  grant(tooLong);
  EXPECT_TRUE(store().allowWhereThereIsRoom({kCellar, kEditor, tooLong}, DVGranter::writer(kEditor)));
}

// Each a bundle of its own, which adds one.
TEST_F(DVAccessControlStoreTest, WritersLeaveRoomForTheEntitled) {
  for (std::size_t i = 0; i < kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled; ++i) {
    const ConsumerID numbered{std::to_string(i)};
    ASSERT_TRUE(store().allowWhereThereIsRoom({kCellar, numbered, kReport}, DVGranter::writer(numbered))) << i;
  }
  EXPECT_FALSE(store().allowWhereThereIsRoom({kCellar, kEditor, kReport}, DVGranter::writer(kEditor)));
  EXPECT_TRUE(store().allowWhereThereIsRoom({kCellar, kEditor, kReport}, DVGranter::entitled()));
}

TEST_F(DVAccessControlStoreTest, AWriterLeavesRoomForOthersUntilItsGrantsAreTakenBack) {
  constexpr std::size_t kMost = (kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled) / 2;
  const DVGranter writer = DVGranter::writer(kEditor);
  const auto numbered = [](std::size_t number) { return ConsumerID{std::to_string(number)}; };
  for (std::size_t i = 0; i < kMost; ++i) ASSERT_TRUE(store().allowWhereThereIsRoom({kCellar, numbered(i), kReport}, writer)) << i;
  EXPECT_FALSE(store().allowWhereThereIsRoom({kCellar, numbered(kMost), kReport}, writer));
  EXPECT_TRUE(store().allowWhereThereIsRoom({kCellar, numbered(0), kReport}, DVGranter::writer(ConsumerID{"other"})))
      << "that is there already, and stays the first one's";
  EXPECT_FALSE(store().allowWhereThereIsRoom({kCellar, numbered(kMost), kReport}, writer));
  store().disallowProviderWithIdentifier(kCellar, kReport, numbered(0));
  EXPECT_TRUE(store().allowWhereThereIsRoom({kCellar, numbered(kMost), kReport}, writer));
  EXPECT_FALSE(store().allowWhereThereIsRoom({kCellar, numbered(0), kReport}, writer));
}

TEST_F(DVAccessControlStoreTest, WhatIsTakenBackFromAWriterAndAddedByTheEntitledIsNotTheWritersOwn) {
  constexpr std::size_t kMost = (kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled) / 2;
  const DVGranter writer = DVGranter::writer(kEditor);
  const auto numbered = [](std::size_t number) { return DVGrant{kCellar, ConsumerID{std::to_string(number)}, kReport}; };
  for (std::size_t i = 0; i < kMost; ++i) ASSERT_TRUE(store().allowWhereThereIsRoom(numbered(i), writer)) << i;
  store().disallowProviderWithIdentifier(kCellar, kReport, ConsumerID{"0"});
  ASSERT_TRUE(store().allowWhereThereIsRoom(numbered(0), DVGranter::entitled()));
  store().disallowProviderWithIdentifier(kCellar, kReport, ConsumerID{"1"});
  EXPECT_TRUE(store().allowWhereThereIsRoom(numbered(1), writer));
  EXPECT_TRUE(store().allowWhereThereIsRoom(numbered(kMost), writer));
  EXPECT_FALSE(store().allowWhereThereIsRoom(numbered(kMost + 1), writer));
}

TEST_F(DVAccessControlStoreTest, WhatAWriterWasRefusedIsNotItsOwnWhenTheEntitledAddIt) {
  constexpr std::size_t kMost = (kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled) / 2;
  const DVGranter writer = DVGranter::writer(kEditor);
  const auto numbered = [](std::size_t number) { return DVGrant{kCellar, ConsumerID{std::to_string(number)}, kReport}; };
  for (std::size_t i = 0; i < kMost; ++i) ASSERT_TRUE(store().allowWhereThereIsRoom(numbered(i), writer)) << i;
  ASSERT_FALSE(store().allowWhereThereIsRoom(numbered(kMost), writer));
  ASSERT_TRUE(store().allowWhereThereIsRoom(numbered(kMost), DVGranter::entitled()));
  store().disallowProviderWithIdentifier(kCellar, kReport, ConsumerID{"0"});
  EXPECT_TRUE(store().allowWhereThereIsRoom(numbered(0), writer));
}

TEST_F(DVAccessControlStoreTest, WhatIsGoneFromTheFileAtTheFirstUnlockIsNoWritersAnyMore) {
  constexpr std::size_t kMost = (kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled) / 2;
  const DVGranter writer = DVGranter::writer(kEditor);
  const auto numbered = [](std::size_t number) { return DVGrant{kCellar, ConsumerID{std::to_string(number)}, kReport}; };
  for (std::size_t i = 0; i < kMost; ++i) ASSERT_TRUE(store().allowWhereThereIsRoom(numbered(i), writer)) << i;
  ASSERT_FALSE(store().allowWhereThereIsRoom(numbered(kMost), writer));
  platform_.propertyLists.setValue(kFile, QXDictionary());
  announceFirstUnlock();
  platform_.queues.runAll();
  for (std::size_t i = 0; i < kMost; ++i) ASSERT_TRUE(store().allowWhereThereIsRoom(numbered(i), DVGranter::entitled())) << i;
  EXPECT_TRUE(store().allowWhereThereIsRoom(numbered(kMost), writer));
}

TEST_F(DVAccessControlStoreTest, WithoutInfoLoggingOnlyFaultsAreWritten) {
  platform_.log.setEnabled(QXLogType::info, FakeLogSwitch::off);
  platform_.propertyLists.failWrite(2, FakeWriteFailure::once);
  grant(kReport);
  EXPECT_EQ(platform_.log.writes(), 0U);
  grant(kLetter);
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{std::string("[ERROR] Could not write to ") + kFile});
}

// --- The order of creation

// Sees what was there when the store first looked at the file system.
class WatchingFileSystem final : public fake_platform::FakeFileSystem {
 public:
  explicit WatchingFileSystem(fake_platform::FakeNotificationCenter& notificationCenter, fake_platform::FakeQueues& queues)
      : notificationCenter_(notificationCenter), queues_(queues) {}

  bool exists(const std::string& path) override {
    if (!observersAtFirstLook) observersAtFirstLook = notificationCenter_.observers().size();
    if (!queuesAtFirstLook) queuesAtFirstLook = queues_.createdQueues().size();
    if (!queueOfFirstLook) queueOfFirstLook = queues_.currentLabel();
    return FakeFileSystem::exists(path);
  }

  std::optional<std::size_t> observersAtFirstLook;
  std::optional<std::size_t> queuesAtFirstLook;
  std::optional<std::string> queueOfFirstLook;

 private:
  fake_platform::FakeNotificationCenter& notificationCenter_;
  fake_platform::FakeQueues& queues_;
};

TEST(DVAccessControlStore, HasItsQueueAndObservesTheFirstUnlockBeforeItReadsWithoutAnyQueue) {
  fake_platform::FakeQueues queues;
  fake_platform::FakeLog log;
  fake_platform::FakeRpcService rpc;
  fake_platform::FakeApplicationRegistry applicationRegistry;
  fake_platform::FakeSandbox sandbox;
  fake_platform::FakeExtensionHost extensionHost;
  fake_platform::FakeFileCoordinator fileCoordinator;
  fake_platform::FakeDeviceLock deviceLock;
  fake_platform::FakeNotificationCenter notificationCenter{queues.mainRunLoop()};
  WatchingFileSystem fileSystem{notificationCenter, queues};
  fake_platform::FakePropertyLists propertyLists{fileSystem};
  fake_platform::FakeStatus status;
  QXPlatform::install({queues, log, rpc, applicationRegistry, sandbox, extensionHost, fileCoordinator, deviceLock, notificationCenter,
                       fileSystem, propertyLists, status});
  (void)DVAccessControlStore::sharedStore();
  EXPECT_EQ(fileSystem.observersAtFirstLook, 1U);
  EXPECT_EQ(fileSystem.queuesAtFirstLook, 1U);
  EXPECT_EQ(fileSystem.queueOfFirstLook, "");
}

}  // namespace
}  // namespace docuvend
