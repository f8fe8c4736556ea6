// The store over this machine's files: what one store has written, the next one reads.
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "acl/DVAccessControlStore.h"
#include "platform/linux/base/Sanitizers.h"
#include "platform/linux/files/LinuxFileSystem.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "tests/files/TemporaryDirectory.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

const ProviderID kProvider{"com.orvane.cellar"};
const ConsumerID kConsumer{"com.example.editor"};

linux_platform::Paths pathsIn(const test::TemporaryDirectory& home) {
  linux_platform::Paths paths;
  paths.home = home.path();
  return paths;
}

class StoreOverFiles : public testing::Test {
 protected:
  StoreOverFiles() {
    QXPlatform::install({queues_, log_, rpc_, applicationRegistry_, sandbox_, extensionHost_, fileCoordinator_, deviceLock_,
                         notificationCenter_, fileSystem_, propertyLists_, status_});
  }

  // Reads the file anew, as the next process would.
  [[nodiscard]] static std::shared_ptr<DVAccessControlStore> nextStore() { return std::make_shared<DVAccessControlStore>(); }
  [[nodiscard]] std::string file() const { return home_.path("Library/Docuvend/AccessControl.plist"); }

  test::TemporaryDirectory home_;
  fake_platform::FakeQueues queues_;
  fake_platform::FakeLog log_;
  fake_platform::FakeRpcService rpc_;
  fake_platform::FakeApplicationRegistry applicationRegistry_;
  fake_platform::FakeSandbox sandbox_;
  fake_platform::FakeExtensionHost extensionHost_;
  fake_platform::FakeFileCoordinator fileCoordinator_;
  fake_platform::FakeDeviceLock deviceLock_;
  fake_platform::FakeNotificationCenter notificationCenter_{queues_.mainRunLoop()};
  linux_platform::LinuxFileSystem fileSystem_{pathsIn(home_)};
  linux_platform::LinuxPropertyLists propertyLists_;
  fake_platform::FakeStatus status_;
};

TEST_F(StoreOverFiles, WhatOneStoreWroteTheNextOneReads) {
  const std::set<std::string> items = {"plain", "", "a/b/", "<&>\"'", " spaces ", "two\nlines\r\n", "“ü€𝄞”", "]]>", "AllowedItemIDs"};
  for (const std::string& item : items) {
    DVAccessControlStore::sharedStore()->allowProviderWithIdentifier(kProvider, ItemID{item}, kConsumer);
  }
  const auto next = nextStore();
  for (const std::string& item : items) EXPECT_TRUE(next->isProviderWithIdentifier(kProvider, ItemID{item}, kConsumer)) << item;
  EXPECT_FALSE(next->isProviderWithIdentifier(kProvider, ItemID{"other"}, kConsumer));

  for (const std::string& item : items) next->disallowProviderWithIdentifier(kProvider, ItemID{item}, kConsumer);
  EXPECT_FALSE(nextStore()->isProviderWithIdentifier(kProvider, ItemID{"plain"}, kConsumer));
  EXPECT_TRUE(log_.texts(QXLogType::fault).empty());
}

TEST_F(StoreOverFiles, TheDirectoryIsThereFromTheStartAndTheFileFromTheFirstGrant) {
  (void)DVAccessControlStore::sharedStore();
  EXPECT_EQ(home_.names(), std::set<std::string>{"Library"});
  EXPECT_FALSE(fileSystem_.exists(file()));
  DVAccessControlStore::sharedStore()->allowProviderWithIdentifier(kProvider, ItemID{"1"}, kConsumer);
  EXPECT_TRUE(fileSystem_.exists(file()));
}

TEST_F(StoreOverFiles, AFileThatMayNotBeReadIsAnErrorAndAnEmptyListAndIsKeptBeside) {
  const auto store = DVAccessControlStore::sharedStore();
  store->allowProviderWithIdentifier(kProvider, ItemID{"old"}, kConsumer);
  std::filesystem::permissions(file(), std::filesystem::perms::none);
  log_.clear();
  const auto next = nextStore();
  EXPECT_EQ(log_.texts(), std::vector<std::string>{"[ERROR] Cannot read access control from disk. Error: QXGeneralErrorDomain 300: "
                                                   "The file cannot be read."});
  store->rereadAccessControl();
  queues_.runAll();
  for (const auto& other : {store, next}) EXPECT_FALSE(other->isProviderWithIdentifier(kProvider, ItemID{"old"}, kConsumer));

  next->allowProviderWithIdentifier(kProvider, ItemID{"new"}, kConsumer);
  std::filesystem::permissions(file() + ".unreadable-1", std::filesystem::perms::owner_read);
  EXPECT_NE(test::readText(file() + ".unreadable-1").find("old"), std::string::npos);
  EXPECT_EQ(test::readText(file()).find("old"), std::string::npos);
}

// The next grant would be all that is left of the list.
TEST_F(StoreOverFiles, AFileThatThereWasNoDescriptorToReadWithAtTheStartIsKeptBeside) {
  if (linux_platform::kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  ASSERT_EQ(fileSystem_.createDirectory(home_.path("Library/Docuvend")), std::nullopt);
  linux_platform::LinuxPropertyLists ofAnEarlierProcess;
  ASSERT_TRUE(ofAnEarlierProcess.writeXMLAtomically(
      {{kProvider.value, QXDictionary{{kConsumer.value, QXDictionary{{"AllowedItemIDs", QXArray{"old"}}}}}}}, file()));
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  const rlimit none{0, usual.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
  const auto next = nextStore();
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
  next->allowProviderWithIdentifier(kProvider, ItemID{"new"}, kConsumer);
  EXPECT_NE(test::readText(file() + ".unreadable-1").find("old"), std::string::npos);
  next->allowProviderWithIdentifier(kProvider, ItemID{"newer"}, kConsumer);
  EXPECT_FALSE(fileSystem_.exists(file() + ".unreadable-2")) << "once";
}

TEST_F(StoreOverFiles, TheFirstGrantReplacesAFileThatIsNoPropertyList) {
  ASSERT_EQ(fileSystem_.createDirectory(home_.path("Library/Docuvend")), std::nullopt);
  test::writeText(file(), "no property list");
  DVAccessControlStore::sharedStore()->allowProviderWithIdentifier(kProvider, ItemID{"1"}, kConsumer);
  const auto faults = log_.texts(QXLogType::fault);
  ASSERT_EQ(faults.size(), 1U);
  EXPECT_TRUE(faults[0].starts_with("[ERROR] Cannot read access control from disk. Error: ")) << faults[0];
  EXPECT_TRUE(nextStore()->isProviderWithIdentifier(kProvider, ItemID{"1"}, kConsumer));
  EXPECT_EQ(log_.texts(QXLogType::fault).size(), 1U);
}

TEST_F(StoreOverFiles, AnItemThatTheFileCannotCarryLeavesTheFileAsItWas) {
  const auto store = DVAccessControlStore::sharedStore();
  store->allowProviderWithIdentifier(kProvider, ItemID{"1"}, kConsumer);
  const std::string before = test::readText(file());
  store->allowProviderWithIdentifier(kProvider, ItemID{"\x01"}, kConsumer);
  EXPECT_EQ(log_.texts(QXLogType::fault), std::vector<std::string>{"[ERROR] Could not write to " + file()});
  EXPECT_EQ(test::readText(file()), before);
  EXPECT_TRUE(nextStore()->isProviderWithIdentifier(kProvider, ItemID{"1"}, kConsumer));
}

}  // namespace
}  // namespace docuvend
