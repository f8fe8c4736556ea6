// What the registry makes of bundles that cannot be looked at.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>

#include "platform/linux/base/Sanitizers.h"
#include "tests/bundles/RegistryTest.h"
#include "tests/bundles/UsedUpDescriptors.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

class InstalledBundlesUnseenTest : public RegistryTest {
 protected:
  [[nodiscard]] static fake_platform::FakeLogEntry begins(int error, const std::string& place) {
    return {QXLogType::fault, "[ERROR] Not every bundle can be looked at, so what cannot counts as it was and is tried every 3 seconds: " +
                                  QXError::system(error, "cannot look at " + place).description()};
  }
  const fake_platform::FakeLogEntry ends_{QXLogType::defaultType, "[NOTICE] Every bundle can be looked at again."};
};

TEST_F(InstalledBundlesUnseenTest, WithoutDescriptorsWhatWasInstalledStaysUntilThereAreSomeAgain) {
  if (kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  fs::create_directories(house_.paths.systemBundles);
  for (const std::string name : {"a", "b", ".c", ".d"}) BundleHouse::install(user(name), "org." + name.substr(name.find_first_not_of('.')));
  start();
  const std::string version = bundles_->find("org.a")->version;
  {
    const UsedUpDescriptors none;
    fs::rename(user(".c"), user("c"));
    const auto line = begins(EMFILE, house_.paths.systemBundles);
    ASSERT_TRUE(eventually([this, &line] { return logged(line) == 1; }));
    fs::rename(user("b"), user(".b"));
    EXPECT_TRUE(disappears("org.b")) << "that it went is seen all the same";
    std::atomic<int> tries = 0;
    looks_.failWith([this, &tries](const InterposedLooks::Call& call) {
      if (call.name == "opendir" && call.path == house_.paths.userBundles) ++tries;
      return 0;
    });
    EXPECT_TRUE(eventually([&tries] { return tries > 6; })) << "it looks again and again";
    looks_.failWith({});
    EXPECT_EQ(logged(line), 1) << "however often it looks";
    EXPECT_EQ(logged(ends_), 0);
    ASSERT_TRUE(bundles_->find("org.a"));
    EXPECT_EQ(bundles_->find("org.a")->version, version);
    EXPECT_FALSE(bundles_->find("org.c"));
    EXPECT_EQ(changes_.count(), 1) << "b went";
  }
  EXPECT_TRUE(appears("org.c"));
  EXPECT_TRUE(eventually([this] { return logged(ends_) == 1; }));
  EXPECT_EQ(bundles_->find("org.a")->version, version);
  fs::rename(user(".d"), user("d"));
  EXPECT_TRUE(appears("org.d"));
  bundles_.reset();
  EXPECT_EQ(changes_.count(), 3);
  EXPECT_EQ(logged(ends_), 1);
}

TEST_F(InstalledBundlesUnseenTest, AFirstLookThatDoesNotSeeEverythingIsMadeUpForAndTheLogSaysSo) {
  BundleHouse::install(user("a"), "org.a");
  looks_.failAt("open", user("a") + "/Info.plist", EMFILE);
  start();
  EXPECT_FALSE(bundles_->find("org.a"));
  EXPECT_EQ(logged(begins(EMFILE, user("a") + "/Info.plist")), 1);
  EXPECT_EQ(logged(ends_), 0);
  looks_.failWith({});
  EXPECT_TRUE(appears("org.a"));
  EXPECT_EQ(logged(ends_), 1);
  EXPECT_EQ(house_.log.entries().size(), 2U) << "every directory is watched all the time";
}

struct Unlisted {
  const char* name;
  const char* directory;  // below the user's
  const char* below;      // likewise; it was watched before
};

class InstalledBundlesUnlisted : public InstalledBundlesUnseenTest, public ::testing::WithParamInterface<Unlisted> {};

TEST_P(InstalledBundlesUnlisted, WhatIsBelowStaysWatched) {
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::write(user("a") + "/bin/data", "");
  BundleHouse::install(user(".b"), "org.b");
  start();
  std::atomic<bool> isAsked = false;
  looks_.failAt("opendir", house_.paths.userBundles + GetParam().directory, EIO);
  watches_.beforeEach([this, &isAsked](const std::string& path) {
    if (path == house_.paths.userBundles + GetParam().below) isAsked = true;
  });
  fs::rename(user(".b"), user("b"));
  EXPECT_TRUE(eventually([&isAsked] { return isAsked.load(); }));
  const fake_platform::FakeLogEntry unwatched{QXLogType::fault,
                                              "[ERROR] Not every bundle directory can be watched, so they are looked at every 3 seconds."};
  EXPECT_TRUE(eventually([this, &unwatched] { return logged(unwatched) == 1; })) << "there may be more";
  watches_.beforeEach({});
  looks_.failWith({});
  EXPECT_TRUE(appears("org.b"));
}

INSTANTIATE_TEST_SUITE_P(Directories, InstalledBundlesUnlisted,
                         ::testing::Values(Unlisted{"OfBundles", "", "/a/bin"}, Unlisted{"ABundle", "/a", "/a/bin"},
                                           Unlisted{"InABundle", "/a/bin", "/a/bin"}),
                         [](const auto& tested) { return tested.param.name; });

TEST_F(InstalledBundlesUnseenTest, ALinkedHomeThatCannotBeResolvedIsTheSameHome) {
  fs::create_directories(house_.root() + "/real/bundles");
  fs::create_directory_symlink(house_.root() + "/real", house_.root() + "/alias");
  house_.paths.userBundles = house_.root() + "/alias/bundles";
  BundleHouse::install(user("a"), "org.a");
  start();
  looks_.failAt("realpath", house_.paths.userBundles, ENOMEM);
  std::atomic<bool> isAsked = false;
  watches_.beforeEach([this, &isAsked](const std::string& path) {
    if (path == house_.root() + "/real/bundles/a") isAsked = true;
  });
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  EXPECT_TRUE(eventually([this] { return logged(begins(ENOMEM, house_.paths.userBundles)) == 1; }));
  EXPECT_TRUE(isAsked) << "it stays watched where it is";
  watches_.beforeEach({});
  EXPECT_EQ(bundles_->find("org.a")->directory, house_.root() + "/real/bundles/a");
  looks_.failWith({});
  EXPECT_TRUE(changes_.waitFor([this] { return !bundles_->find("org.a")->entitlements.empty(); }));
}

}  // namespace
}  // namespace docuvend::linux_platform
