#include "platform/linux/bundles/InstalledBundles.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <mutex>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

// Only a registry that notices nothing waits so long.
constexpr std::chrono::seconds kLongestWait{30};

class Changes {
 public:
  void note() {
    const std::lock_guard lock(mutex_);
    ++count_;
    changed_.notify_all();
  }
  [[nodiscard]] int count() {
    const std::lock_guard lock(mutex_);
    return count_;
  }
  // Waits until the condition holds, looking after each change.
  template <class Condition>
  [[nodiscard]] bool waitFor(Condition condition) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, kLongestWait, condition);
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  int count_ = 0;
};

class InstalledBundlesTest : public ::testing::Test {
 protected:
  void start() {
    bundles_.emplace(house_.paths, house_.propertyLists, house_.log.defaultLog());
    bundles_->onChange([this] { changes_.note(); });  // the fixture outlives the registry
  }
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }
  [[nodiscard]] bool appears(const std::string& identifier) {
    return changes_.waitFor([this, &identifier] { return bundles_->find(identifier).has_value(); });
  }
  [[nodiscard]] bool disappears(const std::string& identifier) {
    return changes_.waitFor([this, &identifier] { return !bundles_->find(identifier).has_value(); });
  }

  BundleHouse house_;
  Changes changes_;
  std::optional<InstalledBundles> bundles_;
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

TEST_F(InstalledBundlesTest, NoticesThatItsDirectoryIsReplaced) {
  BundleHouse::install(user("a"), "org.a");
  start();
  std::filesystem::rename(house_.paths.userBundles, house_.paths.userBundles + "-old");
  EXPECT_TRUE(disappears("org.a"));
  BundleHouse::install(user("b"), "org.b");
  EXPECT_TRUE(appears("org.b"));
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
