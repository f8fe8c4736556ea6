#include "platform/linux/bundles/BundleScan.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Pair;

class BundleScanTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::string system(const std::string& name) const { return house_.paths.systemBundles + "/" + name; }
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }

  BundleHouse house_;
};

TEST_F(BundleScanTest, FindsNothingWhereThereAreNoDirectories) {
  EXPECT_THAT(house_.scan(), IsEmpty());
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  EXPECT_FALSE(std::filesystem::exists(house_.paths.userBundles));
}

TEST_F(BundleScanTest, FindsTheSystemsAndTheUsersBundles) {
  BundleHouse::install(system("one"), "org.one");
  BundleHouse::install(user("two"), "org.two");
  const auto bundles = house_.scan();
  ASSERT_EQ(bundles.size(), 2U);
  EXPECT_EQ(bundles.at("org.one").directory, system("one"));
  EXPECT_EQ(bundles.at("org.two").container, house_.paths.containers + "/org.two");
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  EXPECT_FALSE(std::filesystem::exists(house_.paths.containers));
}

TEST_F(BundleScanTest, PrefersTheSystemsAndSaysSoOnce) {
  BundleHouse::install(system("one"), "org.one");
  BundleHouse::install(user("one"), "org.one");
  EXPECT_EQ(house_.scan().at("org.one").directory, system("one"));
  EXPECT_THAT(house_.log.texts(),
              ElementsAre("[ERROR] Ignoring the bundle at " + user("one") + ": " + system("one") + " has the same identifier."));
}

TEST_F(BundleScanTest, PassesOverHalfCopiedBundles) {
  BundleHouse::install(user(".copying"), "org.one");
  BundleHouse::write(user("README"), "");
  EXPECT_THAT(house_.scan(), IsEmpty());
  EXPECT_THAT(house_.log.texts(), IsEmpty());
}

TEST_F(BundleScanTest, ABadBundleIsOneLineAndHarmsNoOther) {
  BundleHouse::install(user("good"), "org.good");
  std::filesystem::create_directories(user("bad"));
  EXPECT_TRUE(house_.scan().contains("org.good"));
  EXPECT_THAT(house_.log.entries(), ElementsAre(fake_platform::FakeLogEntry{
                                        QXLogType::fault, "[ERROR] Ignoring the bundle at " + user("bad") + ": has no Info.plist."}));
}

TEST_F(BundleScanTest, ALinkIsNoBundle) {
  BundleHouse::install(house_.root() + "/elsewhere", "org.one");
  std::filesystem::create_directories(house_.paths.userBundles);
  std::filesystem::create_symlink(house_.root() + "/elsewhere", user("link"));
  EXPECT_THAT(house_.scan(), IsEmpty());
  EXPECT_THAT(house_.log.texts(), ElementsAre("[ERROR] Ignoring the bundle at " + user("link") + ": it is a link."));
}

TEST_F(BundleScanTest, SaysTheSameAgainOnlyAfterItWasMended) {
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  std::filesystem::create_directories(user("bad"));
  EXPECT_THAT(scan.run(), IsEmpty());
  EXPECT_THAT(scan.run(), IsEmpty());
  EXPECT_EQ(house_.log.texts().size(), 1U);
  BundleHouse::install(user("bad"), "org.bad");
  EXPECT_EQ(scan.run().size(), 1U);
  std::filesystem::remove(user("bad") + "/Info.plist");
  EXPECT_THAT(scan.run(), IsEmpty());
  EXPECT_EQ(house_.log.texts().size(), 2U);
}

TEST_F(BundleScanTest, AnUnsettledBundleCountsAsWhatItWas) {
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::install(user("b"), "org.b");
  const std::string before = scan.run().at("org.a").version;
  BundleHouse::write(user("a") + "/Info.plist", "half");
  fs::remove_all(user("b"));
  for (int look = 0; look < 2; ++look) {
    const auto bundles = scan.run({user("a"), user("b")});
    ASSERT_TRUE(bundles.contains("org.a"));
    EXPECT_EQ(bundles.at("org.a").version, before);
    EXPECT_FALSE(bundles.contains("org.b")) << "what is not there any more counts as nothing";
  }
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  EXPECT_THAT(scan.run(), IsEmpty());
  EXPECT_THAT(scan.run({user("a")}), IsEmpty()) << "what it was last is no bundle";
  EXPECT_EQ(house_.log.texts().size(), 1U);
}

TEST_F(BundleScanTest, AnUnsettledBundleThatWasNeverSeenIsPassedOverInSilence) {
  BundleHouse::install(user("a"), "org.a");
  fs::create_directories(user("b"));
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  EXPECT_THAT(scan.run({user("a"), user("b")}), IsEmpty());
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  EXPECT_EQ(scan.run({user("b")}).size(), 1U);
}

TEST_F(BundleScanTest, TheDirectoriesOfABundleAreThoseNearestFirstAndBounded) {
  const std::string bundle = user("a");
  fs::create_directories(bundle + "/x/y/z");
  fs::create_directories(bundle + "/w");
  fs::create_directory_symlink(house_.root(), bundle + "/link");
  BundleHouse::write(bundle + "/file", "");
  EXPECT_THAT(directoriesOfBundle(bundle), ElementsAre(bundle, bundle + "/w", bundle + "/x", bundle + "/x/y", bundle + "/x/y/z"));
  for (std::size_t i = 0; i < kMostBundleDirectories; ++i) fs::create_directory(bundle + "/x/" + std::to_string(i));
  const auto directories = directoriesOfBundle(bundle);
  EXPECT_EQ(directories.size(), kMostBundleDirectories);
  EXPECT_EQ(directories[2], bundle + "/x");
}

TEST_F(BundleScanTest, GivesGroupContainersToMembersAlone) {
  BundleHouse::install(
      user("owner"), "org.owner",
      BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.docs"})) +
          BundleHouse::entry("QXGroupMembers", "<dict><key>org.owner.docs</key>" + BundleHouse::array({"org.member"}) + "</dict>"));
  BundleHouse::install(user("member"), "org.member", BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.docs"})));
  BundleHouse::install(user("stranger"), "org.stranger", BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.docs"})));
  const auto bundles = house_.scan();
  const std::string container = house_.paths.groupContainers + "/org.owner.docs";
  EXPECT_THAT(bundles.at("org.owner").groups, ElementsAre(Pair("org.owner.docs", container)));
  EXPECT_THAT(bundles.at("org.member").groups, ElementsAre(Pair("org.owner.docs", container)));
  EXPECT_THAT(bundles.at("org.stranger").groups, IsEmpty());
  EXPECT_THAT(house_.log.texts(), ElementsAre("[ERROR] The bundle org.stranger may not belong to the group org.owner.docs."));
}

TEST_F(BundleScanTest, ContainersAreRealPaths) {
  std::filesystem::create_directory(house_.root() + "/real");
  std::filesystem::create_symlink(house_.root() + "/real", house_.root() + "/alias");
  const std::string share = house_.root() + "/alias/.local/share/docuvend";
  house_.paths.userBundles = share + "/bundles";
  house_.paths.containers = share + "/containers";
  house_.paths.groupContainers = share + "/groups";
  BundleHouse::install(user("a"), "org.a", BundleHouse::entry("QXGroups", BundleHouse::array({"org.a.g"})));
  const auto bundle = house_.scan().at("org.a");
  const std::string real = house_.root() + "/real/.local/share/docuvend";
  EXPECT_EQ(bundle.directory, real + "/bundles/a");
  EXPECT_EQ(bundle.container, real + "/containers/org.a");
  EXPECT_EQ(bundle.groups.at("org.a.g"), real + "/groups/org.a.g");
}

}  // namespace
}  // namespace docuvend::linux_platform
