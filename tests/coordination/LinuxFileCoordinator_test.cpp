#include "platform/linux/coordination/LinuxFileCoordinator.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeQueues.h"
#include "tests/coordination/RecordingProvider.h"

namespace docuvend::linux_platform {
namespace {

using testing::RecordingProvider;

QXURL directoryURL(const char* path) { return QXURL::fileURL(path, QXURLKind::directory); }
QXURL fileURL(const char* path) { return QXURL::fileURL(path, QXURLKind::file); }

struct LinuxFileCoordinatorTest : ::testing::Test {
  std::shared_ptr<RecordingProvider> added(const char* path) {
    fileSystem.addDirectory(path);
    auto provider = std::make_shared<RecordingProvider>(directoryURL(path));
    coordinator._addDocuvend(provider);
    return provider;
  }

  fake_platform::FakeFileSystem fileSystem;
  LinuxFileCoordinator coordinator{fileSystem};
};

TEST_F(LinuxFileCoordinatorTest, FindsTheObjectWhoseDirectoryContainsTheFile) {
  const auto first = added("/a/storage");
  const auto second = added("/b/storage");
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x/y.txt")), first);
  EXPECT_EQ(coordinator.providerOf(fileURL("/b/storage/x.txt")), second);
  EXPECT_EQ(coordinator.providerOf(fileURL("/c/x.txt")), nullptr);
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/x.txt")), nullptr);
}

TEST_F(LinuxFileCoordinatorTest, TakesTheDirectoryItselfForItsObjects) {
  const auto provider = added("/a/storage");
  EXPECT_EQ(coordinator.providerOf(directoryURL("/a/storage")), provider);
}

TEST_F(LinuxFileCoordinatorTest, DoesNotTakeTheDirectoryItselfWhereThatDoesNotCount) {
  const auto above = added("/a");
  const auto provider = added("/a/storage");
  using DirectoryItself = LinuxFileCoordinator::DirectoryItself;
  EXPECT_EQ(coordinator.providerOf(directoryURL("/a"), DirectoryItself::doesNotCount), nullptr);
  EXPECT_EQ(coordinator.providerOf(directoryURL("/a/storage"), DirectoryItself::doesNotCount), above);
  coordinator._removeDocuvend(above);
  EXPECT_EQ(coordinator.providerOf(directoryURL("/a/storage"), DirectoryItself::doesNotCount), nullptr);
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x.txt"), DirectoryItself::doesNotCount), provider);
}

TEST_F(LinuxFileCoordinatorTest, PassesOverObjectsWithoutADirectoryAndDirectoriesThatAreNotThere) {
  coordinator._addDocuvend(std::make_shared<RecordingProvider>());
  coordinator._addDocuvend(std::make_shared<RecordingProvider>(directoryURL("/missing")));
  coordinator._addDocuvend(nullptr);
  const auto provider = added("/a/storage");
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x.txt")), provider);
}

TEST_F(LinuxFileCoordinatorTest, PrefersTheObjectThatWasAddedFirstAndForgetsRemovedOnes) {
  const auto first = added("/a/storage");
  const auto second = added("/a/storage");
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x.txt")), first);
  coordinator._removeDocuvend(first);
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x.txt")), second);
  coordinator._removeDocuvend(second);
  EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x.txt")), nullptr);
}

TEST_F(LinuxFileCoordinatorTest, TellsAnObjectWithoutAQueueAtOnceAndNamesEveryWriterAnew) {
  const auto provider = added("/a/storage");
  int toldCount = 0;
  provider->onTold = [&toldCount] { EXPECT_EQ(toldCount, 0) << "answered before the object was told"; };
  coordinator.tellFinishedWriting(provider, 42, fileURL("/a/storage/x.txt"), [&toldCount] { ++toldCount; });
  EXPECT_EQ(toldCount, 1);
  provider->onTold = {};
  coordinator.tellFinishedWriting(provider, 42, fileURL("/a/storage/x.txt"), /*told=*/{});
  ASSERT_EQ(provider->told.size(), 2U);
  EXPECT_EQ(provider->told[0].first, "writer 42-1");
  EXPECT_EQ(provider->told[1].first, "writer 42-2");
  EXPECT_EQ(provider->told[1].second, fileURL("/a/storage/x.txt"));
}

TEST_F(LinuxFileCoordinatorTest, TellsAnObjectOnItsOwnQueue) {
  fake_platform::FakeQueues queues;
  const auto provider = std::make_shared<RecordingProvider>(directoryURL("/a"), queues.operationQueue());
  bool told = false;
  coordinator.tellFinishedWriting(provider, 42, fileURL("/a/x.txt"), [&told] { told = true; });
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
  coordinator.askToProvide(provider, 42, fileURL("/a/x.txt"), completion);
  coordinator.askToProvide(provider, 42, fileURL("/a/x.txt"), completion);
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
  coordinator.askToProvide(provider, 42, fileURL("/a/storage/x.txt"), /*completion=*/{});
  EXPECT_EQ(provider->asked.size(), 1U);
}

TEST_F(LinuxFileCoordinatorTest, HoldsNoLockWhileAnObjectIsTold) {
  const auto provider = added("/a/storage");
  provider->onTold = [this, &provider] {
    coordinator._addDocuvend(provider);
    EXPECT_EQ(coordinator.providerOf(fileURL("/a/storage/x.txt")), provider);
    coordinator._removeDocuvend(provider);
  };
  coordinator.tellFinishedWriting(provider, 42, fileURL("/a/storage/x.txt"), /*told=*/{});
  EXPECT_EQ(provider->told.size(), 1U);
}

}  // namespace
}  // namespace docuvend::linux_platform
