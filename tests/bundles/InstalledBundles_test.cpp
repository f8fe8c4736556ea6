#include "platform/linux/bundles/InstalledBundles.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <thread>
#include <utility>

#include "platform/linux/bundles/BundleInstaller.h"
#include "tests/bundles/RegistryTest.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kMostTries = 20;

class InstalledBundlesTest : public RegistryTest {
 protected:
  using Clock = std::chrono::steady_clock;
  // Writes a bundle as a slow copy does, its entitlements last. True when there were pauses, since the first change, in which it may have
  // been looked at.
  static bool copyInPlace(const std::string& directory, const std::string& identifier, Clock::time_point begin = Clock::now()) {
    auto last = begin;
    Clock::duration longest{0};
    const auto step = [&last, &longest] {
      const auto now = Clock::now();
      longest = std::max(longest, now - std::exchange(last, now));
    };
    BundleHouse::install(directory, identifier);
    step();
    while (Clock::now() < begin + 2 * Settling::kQuietInPlace) {
      std::ofstream(directory + "/resource", std::ios::app) << "x";
      step();
    }
    BundleHouse::write(directory + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
    step();
    return longest > Settling::kQuietInPlace / 2;
  }

  std::atomic<bool> isSeenInPart_ = false;
};

TEST_F(InstalledBundlesTest, KnowsWhatIsInstalledFromItsCreationOn) {
  BundleHouse::install(user("b"), "org.b");
  BundleHouse::install(user("a"), "org.a");
  start();
  EXPECT_TRUE(bundles_->find("org.a"));
  EXPECT_FALSE(bundles_->find("org.c"));
  const auto all = bundles_->all();
  ASSERT_EQ(all.size(), 2U);
  EXPECT_EQ(all[0].identifier, "org.a");
  EXPECT_EQ(all[1].identifier, "org.b");
}

TEST_F(InstalledBundlesTest, NoticesABundleThatIsRenamedIntoPlace) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  BundleHouse::install(user(".a"), "org.a");
  std::filesystem::rename(user(".a"), user("a"));
  EXPECT_TRUE(appears("org.a"));
}

TEST_F(InstalledBundlesTest, NoticesTheFirstBundleOfAHomeThatHadNoDirectoryForThem) {
  start();
  BundleHouse::install(user("a"), "org.a");
  EXPECT_TRUE(appears("org.a"));
  BundleHouse::install(house_.paths.systemBundles + "/b", "org.b");
  EXPECT_TRUE(appears("org.b"));
}

TEST_F(InstalledBundlesTest, NoticesABundleThatIsWrittenInPlace) {
  std::filesystem::create_directories(user("a"));
  start();
  EXPECT_FALSE(bundles_->find("org.a"));
  BundleHouse::writeExecutable(user("a") + "/program", "#!/bin/sh\n");
  BundleHouse::write(user("a") + "/Info.plist", BundleHouse::propertyList(BundleHouse::identityEntries("org.a")));
  EXPECT_TRUE(appears("org.a"));
}

TEST_F(InstalledBundlesTest, NoticesARemovalAndAnUpdate) {
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::install(user("b"), "org.b");
  start();
  const std::string version = bundles_->find("org.a")->version;
  std::filesystem::remove_all(user("b"));
  EXPECT_TRUE(disappears("org.b"));
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  EXPECT_TRUE(changes_.waitFor([this, &version] {
    const auto bundle = bundles_->find("org.a");
    return bundle && bundle->version != version && !bundle->entitlements.empty();
  }));
}

TEST_F(InstalledBundlesTest, NoticesAnUpdateOfABundleThatCameLater) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  BundleHouse::install(user(".a"), "org.a");
  std::filesystem::rename(user(".a"), user("a"));
  ASSERT_TRUE(appears("org.a"));
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  EXPECT_TRUE(changes_.waitFor([this] { return !bundles_->find("org.a")->entitlements.empty(); }));
}

TEST_F(InstalledBundlesTest, CallsNobodyForWhatChangesNoBundle) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  BundleHouse::write(user("README"), "x");
  BundleHouse::install(user(".a"), "org.a");
  std::filesystem::rename(user(".a"), user("a"));
  ASSERT_TRUE(appears("org.a"));
  bundles_.reset();
  EXPECT_EQ(changes_.count(), 1);
}

TEST_F(InstalledBundlesTest, NoticesAProgramDeepInABundleThatIsCopiedInPlace) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  BundleHouse::write(user("a") + "/Info.plist",
                     BundleHouse::propertyList(BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.a")) +
                                               BundleHouse::entry("QXBundleExecutable", BundleHouse::text("bin/deep/program"))));
  const std::string complaint =
      "[ERROR] Ignoring the bundle at " + user("a") + ": its executable cannot be opened: No such file or directory.";
  ASSERT_TRUE(eventually([this, &complaint] { return !house_.log.texts().empty() && house_.log.texts().back() == complaint; }));
  BundleHouse::writeExecutable(user("a") + "/bin/deep/program", "#!/bin/sh\n");
  EXPECT_TRUE(appears("org.a"));
}

TEST_F(InstalledBundlesTest, ACopyInPlaceThatMakesNoPauseIsNeverSeenInPart) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  bundles_->onChange([this] {
    for (const auto& bundle : bundles_->all()) isSeenInPart_ = isSeenInPart_ || bundle.entitlements.empty();
  });
  // A machine that makes the copy pause proves nothing; the next try does.
  for (int i = 0; i < kMostTries; ++i) {
    const std::string name = std::to_string(i);
    isSeenInPart_ = false;
    const bool pauses = copyInPlace(user(name), "org.a" + name);
    ASSERT_TRUE(appears("org.a" + name));
    ASSERT_TRUE(changes_.waitFor([this, &name] { return !bundles_->find("org.a" + name)->entitlements.empty(); }));
    if (pauses) continue;
    EXPECT_FALSE(isSeenInPart_);
    return;
  }
  FAIL() << "this machine is too slow to tell";
}

TEST_F(InstalledBundlesTest, WhatIsWrittenWhenTheLookIsDueAlreadyPutsTheBundleOff) {
  BundleHouse::install(user("a"), "org.a");
  start();
  const std::string version = bundles_->find("org.a")->version;
  auto lastWritten = Clock::now();
  int lateWrites = 0;
  watches_.beforeEach([this, &lastWritten, &lateWrites](const std::string& path) {
    if (path != user("a") || Clock::now() < lastWritten + Settling::kQuietInPlace || lateWrites == 2) return;
    ++lateWrites;
    BundleHouse::write(user("a") + "/resource", "x");
    lastWritten = Clock::now();
  });
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  EXPECT_TRUE(changes_.waitFor([this, &version] { return bundles_->find("org.a")->version != version; }));
  const auto seen = Clock::now();
  watches_.beforeEach({});
  EXPECT_EQ(lateWrites, 2);
  EXPECT_GE(seen - lastWritten, Settling::kQuietInPlace);
}

TEST_F(InstalledBundlesTest, ANewDirectoryIsNotQuietBeforeItIsWatched) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  std::optional<Clock::time_point> lastWritten;
  watches_.beforeEach([this, &lastWritten](const std::string& path) {
    if (path != user("a") || lastWritten) return;
    std::this_thread::sleep_for(Settling::kQuietInPlace);  // this is late for all that was told
    BundleHouse::install(user("a"), "org.a");
    lastWritten = Clock::now();
  });
  std::filesystem::create_directory(user("a"));
  EXPECT_TRUE(appears("org.a"));
  const auto seen = Clock::now();
  watches_.beforeEach({});
  ASSERT_TRUE(lastWritten);
  EXPECT_GE(seen - *lastWritten, Settling::kQuietInPlace);
}

TEST_F(InstalledBundlesTest, ABundleThatIsOverwrittenWithoutPauseCountsAsItWasUntilItIsWhole) {
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  start();
  bundles_->onChange([this] {
    const auto bundle = bundles_->find("org.a");
    isSeenInPart_ = isSeenInPart_ || !bundle || bundle->entitlements.empty();
  });
  for (int i = 0; i < kMostTries; ++i) {
    const std::string version = bundles_->find("org.a")->version;
    isSeenInPart_ = false;
    const auto begin = Clock::now();
    std::filesystem::remove(user("a") + "/Entitlements.plist");
    BundleHouse::write(user("a") + "/Info.plist", "half");
    const bool pauses = copyInPlace(user("a"), "org.a", begin);
    ASSERT_TRUE(changes_.waitFor([this, &version] {
      const auto bundle = bundles_->find("org.a");
      return bundle && bundle->version != version && !bundle->entitlements.empty();
    }));
    if (pauses) continue;
    EXPECT_FALSE(isSeenInPart_);
    return;
  }
  FAIL() << "this machine is too slow to tell";
}

TEST_F(InstalledBundlesTest, ABundleThatIsWrittenHoldsUpNoOther) {
  BundleHouse::install(user("busy"), "org.busy");
  start();
  // Written until the other one is seen, and never quiet long enough to be looked at itself.
  std::atomic<bool> isEnough = false;
  std::thread writer([this, &isEnough] {
    while (!isEnough) BundleHouse::write(user("busy") + "/note", "x");
  });
  BundleHouse::install(user(".a"), "org.a");
  std::filesystem::rename(user(".a"), user("a"));
  EXPECT_TRUE(appears("org.a"));
  isEnough = true;
  writer.join();
}

TEST_F(InstalledBundlesTest, AHundredInstallationsInARowAreFewChanges) {
  std::filesystem::create_directories(house_.paths.userBundles);
  for (int i = 0; i < 20; ++i) BundleHouse::install(house_.root() + "/source" + std::to_string(i), "org.a" + std::to_string(i));
  start();
  for (int i = 0; i < 100; ++i) {
    const std::string number = std::to_string(i % 20);
    if (i % 3 == 2) {
      (void)uninstallBundle("org.a" + number, house_.paths, house_.propertyLists);
    } else {
      ASSERT_EQ(installBundle(house_.root() + "/source" + number, house_.paths, house_.propertyLists).index(), 0U);
    }
  }
  const auto expected = house_.scan();
  EXPECT_TRUE(changes_.waitFor([this, &expected] {
    const auto present = bundles_->all();
    return std::equal(present.begin(), present.end(), expected.begin(), expected.end(),
                      [](const Bundle& bundle, const auto& entry) { return bundle.version == entry.second.version; });
  }));
  bundles_.reset();
  EXPECT_LE(changes_.count(), 20);
}

TEST_F(InstalledBundlesTest, WatchesBundlesBehindALinkedHome) {
  std::filesystem::create_directories(house_.root() + "/real/bundles");
  std::filesystem::create_directory_symlink(house_.root() + "/real", house_.root() + "/alias");
  house_.paths.userBundles = house_.root() + "/alias/bundles";
  start();
  BundleHouse::install(user("a"), "org.a");
  EXPECT_TRUE(appears("org.a"));
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  EXPECT_TRUE(changes_.waitFor([this] { return !bundles_->find("org.a")->entitlements.empty(); }));
}

TEST_F(InstalledBundlesTest, NoticesThatItsDirectoryIsReplaced) {
  BundleHouse::install(user("a"), "org.a");
  start();
  std::filesystem::rename(house_.paths.userBundles, house_.paths.userBundles + "-old");
  EXPECT_TRUE(disappears("org.a"));
  BundleHouse::install(user("b"), "org.b");
  EXPECT_TRUE(appears("org.b"));
}

// What happens without watches is seen all the same, and when there are some again it is seen by them.
class InstalledBundlesWithoutWatches : public RegistryTest, public ::testing::WithParamInterface<std::atomic<bool> InterposedWatches::*> {
 protected:
  const fake_platform::FakeLogEntry begins_{QXLogType::fault,
                                            "[ERROR] Not every bundle directory can be watched, so they are looked at every 3 seconds."};
  const fake_platform::FakeLogEntry ends_{QXLogType::defaultType, "[NOTICE] Every bundle directory is watched again."};
};

TEST_P(InstalledBundlesWithoutWatches, LooksNowAndThenAndSaysSoOnceUntilTheyAreBack) {
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  watches_.*GetParam() = true;
  start();
  EXPECT_TRUE(bundles_->find("org.a"));
  EXPECT_EQ(logged(begins_), 1);
  std::filesystem::remove(user("a") + "/Entitlements.plist");
  EXPECT_TRUE(changes_.waitFor([this] { return bundles_->find("org.a")->entitlements.empty(); }));
  BundleHouse::install(user("b"), "org.b");
  EXPECT_TRUE(appears("org.b"));
  EXPECT_EQ(logged(begins_), 1) << "however often it looks";
  EXPECT_EQ(logged(ends_), 0);

  watches_.*GetParam() = false;
  EXPECT_TRUE(eventually([this] { return logged(ends_) == 1; }));
  const int refused = watches_.refused;
  for (const std::string& name : {std::string("c"), std::string("d")}) {
    BundleHouse::install(user(name), "org." + name);
    EXPECT_TRUE(appears("org." + name));
  }
  EXPECT_EQ(watches_.refused, refused);
  EXPECT_EQ(logged(begins_), 1);
  EXPECT_EQ(logged(ends_), 1);
}

INSTANTIATE_TEST_SUITE_P(OfEitherKind, InstalledBundlesWithoutWatches,
                         ::testing::Values(&InterposedWatches::refusesQueues, &InterposedWatches::refusesWatches),
                         [](const auto& tested) { return tested.param == &InterposedWatches::refusesQueues ? "Queues" : "Watches"; });

TEST_F(InstalledBundlesTest, AWatchThatIsRefusedLaterIsMadeUpForByLooks) {
  std::filesystem::create_directories(house_.paths.userBundles);
  start();
  watches_.refusesWatches = true;
  BundleHouse::install(user("a"), "org.a");
  ASSERT_TRUE(appears("org.a"));
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  EXPECT_TRUE(changes_.waitFor([this] { return !bundles_->find("org.a")->entitlements.empty(); }));
  EXPECT_GT(watches_.refused, 0);
}

TEST_F(InstalledBundlesTest, AnUpdateOfTheOwnerUpdatesItsGroupsMembers) {
  BundleHouse::install(user("member"), "org.member", BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.docs"})));
  start();
  const auto before = bundles_->find("org.member");
  EXPECT_TRUE(before->groups.empty());
  BundleHouse::install(
      user("owner"), "org.owner",
      BundleHouse::entry("QXGroupMembers", "<dict><key>org.owner.docs</key>" + BundleHouse::array({"org.member"}) + "</dict>"));
  EXPECT_TRUE(changes_.waitFor([this] { return bundles_->find("org.member")->groups.size() == 1; }));
  EXPECT_NE(bundles_->find("org.member")->version, before->version);
}

}  // namespace
}  // namespace docuvend::linux_platform
