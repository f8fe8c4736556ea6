#include "platform/linux/coordination/LinuxFileCoordinator.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeQueues.h"
#include "tests/coordination/RecordingProvider.h"

namespace docuvend::linux_platform {
namespace {

using testing::RecordingProvider;

QXURL directoryURL(const char* path) { return QXURL::fileURL(path, QXURLKind::directory); }
QXURL fileURL(const char* path) { return QXURL::fileURL(path, QXURLKind::file); }

FileOwner ownedBy(std::shared_ptr<QXDocuvend> provider) {
  FileOwner owner;
  owner.provider = std::move(provider);
  return owner;
}

struct LinuxFileCoordinatorTest : ::testing::Test {
  std::shared_ptr<RecordingProvider> added(const char* path) {
    fileSystem.addDirectory(path);
    auto provider = std::make_shared<RecordingProvider>(directoryURL(path));
    coordinator._addDocuvend(provider);
    return provider;
  }

  using DirectoryItself = LinuxFileCoordinator::DirectoryItself;
  [[nodiscard]] std::shared_ptr<QXDocuvend> providerOf(const QXURL& url) const {
    return coordinator.ownerOf({FileKey{}, url}, DirectoryItself::counts).provider;
  }
  [[nodiscard]] std::shared_ptr<QXDocuvend> providerBelow(const QXURL& url) const {
    return coordinator.ownerOf({FileKey{}, url}, DirectoryItself::doesNotCount).provider;
  }

  fake_platform::FakeFileSystem fileSystem;
  LinuxFileCoordinator coordinator{fileSystem};
};

TEST_F(LinuxFileCoordinatorTest, FindsTheObjectWhoseDirectoryContainsTheFile) {
  const auto first = added("/a/storage");
  const auto second = added("/b/storage");
  EXPECT_EQ(providerOf(fileURL("/a/storage/x/y.txt")), first);
  EXPECT_EQ(providerOf(fileURL("/b/storage/x.txt")), second);
  EXPECT_EQ(providerOf(fileURL("/c/x.txt")), nullptr);
  EXPECT_EQ(providerOf(fileURL("/a/x.txt")), nullptr);
}

TEST_F(LinuxFileCoordinatorTest, TakesTheDirectoryItselfForItsObjects) {
  const auto provider = added("/a/storage");
  EXPECT_EQ(providerOf(directoryURL("/a/storage")), provider);
}

TEST_F(LinuxFileCoordinatorTest, DoesNotTakeTheDirectoryItselfWhereThatDoesNotCount) {
  const auto above = added("/a");
  const auto provider = added("/a/storage");
  EXPECT_EQ(providerBelow(directoryURL("/a")), nullptr);
  EXPECT_EQ(providerBelow(directoryURL("/a/storage")), above);
  coordinator._removeDocuvend(above);
  EXPECT_EQ(providerBelow(directoryURL("/a/storage")), nullptr);
  EXPECT_EQ(providerBelow(fileURL("/a/storage/x.txt")), provider);
}

TEST_F(LinuxFileCoordinatorTest, PassesOverObjectsWithoutADirectoryAndDirectoriesThatAreNotThere) {
  coordinator._addDocuvend(std::make_shared<RecordingProvider>());
  coordinator._addDocuvend(std::make_shared<RecordingProvider>(directoryURL("/missing")));
  coordinator._addDocuvend(nullptr);
  const auto provider = added("/a/storage");
  EXPECT_EQ(providerOf(fileURL("/a/storage/x.txt")), provider);
}

TEST_F(LinuxFileCoordinatorTest, PrefersTheObjectThatWasAddedFirstAndForgetsRemovedOnes) {
  const auto first = added("/a/storage");
  const auto second = added("/a/storage");
  EXPECT_EQ(providerOf(fileURL("/a/storage/x.txt")), first);
  coordinator._removeDocuvend(first);
  EXPECT_EQ(providerOf(fileURL("/a/storage/x.txt")), second);
  coordinator._removeDocuvend(second);
  EXPECT_EQ(providerOf(fileURL("/a/storage/x.txt")), nullptr);
}

TEST_F(LinuxFileCoordinatorTest, TellsAnObjectWithoutAQueueAtOnceAndNamesEveryWriterAnew) {
  const auto provider = added("/a/storage");
  int toldCount = 0;
  provider->onTold = [&toldCount] { EXPECT_EQ(toldCount, 0) << "answered before the object was told"; };
  coordinator.tellFinishedWriting(ownedBy(provider), {42, {}}, {FileKey{}, fileURL("/a/storage/x.txt")}, [&toldCount] { ++toldCount; });
  EXPECT_EQ(toldCount, 1);
  provider->onTold = {};
  coordinator.tellFinishedWriting(ownedBy(provider), {42, {}}, {FileKey{}, fileURL("/a/storage/x.txt")}, /*told=*/{});
  ASSERT_EQ(provider->told.size(), 2U);
  EXPECT_EQ(provider->told[0].first, "writer 42-1");
  EXPECT_EQ(provider->told[1].first, "writer 42-2");
  EXPECT_EQ(provider->told[1].second, fileURL("/a/storage/x.txt"));
}

TEST_F(LinuxFileCoordinatorTest, TellsAnObjectOnItsOwnQueue) {
  fake_platform::FakeQueues queues;
  const auto provider = std::make_shared<RecordingProvider>(directoryURL("/a"), queues.operationQueue());
  bool told = false;
  coordinator.tellFinishedWriting(ownedBy(provider), {42, {}}, {FileKey{}, fileURL("/a/x.txt")}, [&told] { told = true; });
  EXPECT_TRUE(provider->told.empty());
  EXPECT_FALSE(told);
  queues.runAll();
  EXPECT_EQ(provider->told.size(), 1U);
  EXPECT_TRUE(told);
}

TEST_F(LinuxFileCoordinatorTest, AsksAnObjectOnItsOwnQueueAndNamesEveryReaderAnew) {
  fake_platform::FakeQueues queues;
  const auto provider = std::make_shared<RecordingProvider>(directoryURL("/a"), queues.operationQueue());
  std::vector<std::optional<QXError>> answers;
  const auto completion = [&answers](std::optional<QXError> error) { answers.push_back(std::move(error)); };
  coordinator.askToProvide(provider, {42, {}}, fileURL("/a/x.txt"), completion);
  coordinator.askToProvide(provider, {42, {}}, fileURL("/a/x.txt"), completion);
  EXPECT_TRUE(provider->asked.empty());
  queues.runAll();
  ASSERT_EQ(provider->asked.size(), 2U);
  EXPECT_EQ(provider->asked[0].reader, "reader 42-1");
  EXPECT_EQ(provider->asked[1].reader, "reader 42-2");
  EXPECT_EQ(provider->asked[1].url, fileURL("/a/x.txt"));
  provider->asked[0].completion(/*error=*/{});
  EXPECT_EQ(answers, std::vector<std::optional<QXError>>{std::nullopt});
}

TEST_F(LinuxFileCoordinatorTest, AsksAnObjectWithoutAQueueAtOnce) {
  const auto provider = added("/a/storage");
  coordinator.askToProvide(provider, {42, {}}, fileURL("/a/storage/x.txt"), /*completion=*/{});
  EXPECT_EQ(provider->asked.size(), 1U);
}

TEST_F(LinuxFileCoordinatorTest, HoldsNoLockWhileAnObjectIsTold) {
  const auto provider = added("/a/storage");
  provider->onTold = [this, &provider] {
    coordinator._addDocuvend(provider);
    EXPECT_EQ(providerOf(fileURL("/a/storage/x.txt")), provider);
    coordinator._removeDocuvend(provider);
  };
  coordinator.tellFinishedWriting(ownedBy(provider), {42, {}}, {FileKey{}, fileURL("/a/storage/x.txt")}, /*told=*/{});
  EXPECT_EQ(provider->told.size(), 1U);
}

struct AwaitedProviderTest : ::testing::Test {
  void SetUp() override {
    fileSystem.addDirectory("/a/storage");
    fileSystem.addDirectory("/b/storage");
  }
  [[nodiscard]] FileOwner ownerOf(const KeyedFile& file) const {
    return coordinator.ownerOf(file, LinuxFileCoordinator::DirectoryItself::counts);
  }
  static KeyedFile fileNamed(const std::string& path) { return {{/*directory=*/{}, path}, QXURL::fileURL(path, QXURLKind::file)}; }
  void finishWriting(const KeyedFile& file) {
    coordinator.tellFinishedWriting(ownerOf(file), {42, {}}, file, [this] { ++toldCount; });
  }

  std::vector<InstalledStorage> installed = {{"com.example.a", directoryURL("/a/storage")}, {"com.example.b", directoryURL("/b/storage")}};
  bool isInPlace = true;
  fake_platform::FakeFileSystem fileSystem;
  fake_platform::FakeLog log;
  LinuxFileCoordinator coordinator{fileSystem,
                                   {.installedStorages = [this] { return installed; },
                                    .isInPlace = [this](const KeyedFile&) { return isInPlace; },
                                    .log = &log.defaultLog()}};
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>(directoryURL("/b/storage"));
  const KeyedFile item = fileNamed("/b/storage/x.txt");
  int toldCount = 0;
};

TEST_F(AwaitedProviderTest, IsTheOwnerOfItsFilesUntilAndAfterItIsRegistered) {
  EXPECT_EQ(ownerOf(item).awaited, "com.example.b");
  EXPECT_EQ(ownerOf(fileNamed("/c/x.txt")).awaited, std::nullopt);
  coordinator._addDocuvend(provider);
  EXPECT_EQ(ownerOf(item).provider, provider);
  EXPECT_EQ(ownerOf(item).awaited, std::nullopt);
  coordinator._removeDocuvend(provider);
  EXPECT_EQ(ownerOf(item).awaited, "com.example.b");
  installed.clear();
  EXPECT_EQ(ownerOf(item).awaited, std::nullopt);
}

TEST_F(AwaitedProviderTest, IsToldWhenItIsRegisteredOfEachFileOnce) {
  finishWriting(item);
  finishWriting(item);
  finishWriting(fileNamed("/b/storage/y.txt"));
  finishWriting(fileNamed("/a/storage/z.txt"));
  finishWriting(fileNamed("/c/nobodys.txt"));
  EXPECT_EQ(toldCount, 5) << "nobody is kept waiting";
  coordinator._addDocuvend(provider);
  ASSERT_EQ(provider->told.size(), 2U);
  EXPECT_EQ(provider->told[0].second, item.url);
  EXPECT_EQ(provider->told[1].second, fileURL("/b/storage/y.txt"));
  coordinator._removeDocuvend(provider);
  coordinator._addDocuvend(provider);
  EXPECT_EQ(provider->told.size(), 2U);
  const auto other = std::make_shared<RecordingProvider>(directoryURL("/a/storage"));
  coordinator._addDocuvend(other);
  EXPECT_EQ(other->told.size(), 1U) << "the others' registrations have not lost it";
}

TEST_F(AwaitedProviderTest, IsToldAlsoWhenItIsRegisteredBetweenTheLookAndTheNote) {
  const FileOwner before = ownerOf(item);
  coordinator._addDocuvend(provider);
  coordinator.tellFinishedWriting(before, {42, {}}, item, /*told=*/{});
  EXPECT_EQ(provider->told.size(), 1U);
}

TEST_F(AwaitedProviderTest, IsToldOfEveryFileHoweverManyTheyAre) {
  constexpr std::size_t kMany = 5000;
  for (std::size_t i = 0; i < kMany; ++i) finishWriting(fileNamed("/b/storage/" + std::to_string(i)));
  finishWriting(fileNamed("/b/storage/0"));
  coordinator._addDocuvend(provider);
  EXPECT_EQ(provider->told.size(), kMany);
}

TEST_F(AwaitedProviderTest, AFileThatIsNotInItsPlaceAnyMoreIsNobodys) {
  coordinator._addDocuvend(provider);
  isInPlace = false;
  EXPECT_EQ(ownerOf(item).provider, nullptr);
  EXPECT_EQ(ownerOf(fileNamed("/a/storage/x.txt")).awaited, std::nullopt);
  finishWriting(item);
  EXPECT_EQ(toldCount, 1);
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(AwaitedProviderTest, OfAWriteOfAFileThatIsNotInItsPlaceAnyMoreTheLogSaysThatNobodyIsTold) {
  coordinator._addDocuvend(provider);
  finishWriting(item);
  isInPlace = false;
  finishWriting(fileNamed("/c/nobodys.txt"));
  EXPECT_TRUE(log.texts().empty());
  finishWriting(item);
  EXPECT_EQ(log.entries(), (std::vector<fake_platform::FakeLogEntry>{{QXLogType::fault, "[ERROR] Nobody can be told that the item at URL " +
                                                                                            item.url.absoluteString() +
                                                                                            " has changed: it is not where it was."}}));
  EXPECT_EQ(provider->told.size(), 1U);
}

TEST_F(AwaitedProviderTest, WhatCannotBeKnownOfAFileIsAFailureAndWhatCannotBeKnownOfADirectoryIsNone) {
  QXError churn = QXError::system(EAGAIN, "churn");
  churn.url = item.url;
  fileSystem.setRelationship(directoryURL("/b/storage"), item.url, churn);
  const FileOwner unknown = ownerOf(item);
  ASSERT_TRUE(unknown.failure);
  EXPECT_EQ(unknown.failure->code, EAGAIN);
  QXError link = QXError::system(ELOOP, "a link");
  link.url = directoryURL("/a/storage");
  fileSystem.setRelationshipError(directoryURL("/a/storage"), link);
  EXPECT_EQ(ownerOf(fileNamed("/c/x.txt")).failure, std::nullopt);
}

TEST_F(AwaitedProviderTest, OfAWriteWhoseFilesOwnerCannotBeKnownForWantOfMeansTheLogSaysThatNobodyIsTold) {
  coordinator._addDocuvend(provider);
  for (const int shortage : {EMFILE, ENFILE, ENOMEM}) {
    log.clear();
    QXError none = QXError::system(shortage, "cannot look");
    none.url = directoryURL("/b/storage");
    fileSystem.setRelationship(directoryURL("/b/storage"), item.url, none);
    EXPECT_EQ(ownerOf(item).failure, none);
    finishWriting(item);
    EXPECT_EQ(log.entries(), (std::vector<fake_platform::FakeLogEntry>{
                                 {QXLogType::fault, "[ERROR] Nobody can be told that the item at URL " + item.url.absoluteString() +
                                                        " has changed. Error: " + none.description()}}));
  }
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(AwaitedProviderTest, EveryChangeOfTheRegistrationsIsTold) {
  int changes = 0;
  coordinator.setRegistrationHandler([&changes] { ++changes; });
  const FileOwner before = ownerOf(item);
  EXPECT_FALSE(coordinator.hasChangedSince(before));
  coordinator._addDocuvend(provider);
  EXPECT_TRUE(coordinator.hasChangedSince(before));
  coordinator._addDocuvend(provider);
  coordinator._removeDocuvend(provider);
  coordinator._removeDocuvend(provider);
  EXPECT_EQ(changes, 3) << "one that only counts down changes nothing";
  coordinator._removeDocuvend(provider);
  EXPECT_EQ(changes, 4) << "the removal of one that was never added may mean that there is nobody to wait for";
  const FileOwner again = ownerOf(item);
  coordinator.installedStoragesChanged();
  EXPECT_EQ(changes, 5);
  EXPECT_TRUE(coordinator.hasChangedSince(again));
  coordinator.setRegistrationHandler({});
  coordinator._addDocuvend(provider);
  EXPECT_EQ(changes, 5);
}

}  // namespace
}  // namespace docuvend::linux_platform
