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
using ::testing::UnorderedElementsAre;

class BundleScanTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::string system(const std::string& name) const { return house_.paths.systemBundles + "/" + name; }
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }
  static fake_platform::FakeLogEntry fault(const std::string& text) { return {QXLogType::fault, text}; }

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
  EXPECT_THAT(house_.log.entries(),
              ElementsAre(fault("[ERROR] Ignoring the bundle at " + user("one") + ": " + system("one") + " has the same identifier.")));
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
  EXPECT_THAT(house_.log.entries(), ElementsAre(fault("[ERROR] Ignoring the bundle at " + user("bad") + ": has no Info.plist.")));
}

TEST_F(BundleScanTest, ALinkIsNoBundle) {
  BundleHouse::install(house_.root() + "/elsewhere", "org.one");
  std::filesystem::create_directories(house_.paths.userBundles);
  std::filesystem::create_symlink(house_.root() + "/elsewhere", user("link"));
  EXPECT_THAT(house_.scan(), IsEmpty());
  EXPECT_THAT(house_.log.entries(), ElementsAre(fault("[ERROR] Ignoring the bundle at " + user("link") + ": it is a link.")));
}

TEST_F(BundleScanTest, SaysTheSameAgainOnlyAfterItWasMended) {
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  std::filesystem::create_directories(user("bad"));
  EXPECT_THAT(scan.run().bundles, IsEmpty());
  EXPECT_THAT(scan.run().bundles, IsEmpty());
  EXPECT_EQ(house_.log.texts().size(), 1U);
  BundleHouse::install(user("bad"), "org.bad");
  EXPECT_EQ(scan.run().bundles.size(), 1U);
  std::filesystem::remove(user("bad") + "/Info.plist");
  EXPECT_THAT(scan.run().bundles, IsEmpty());
  EXPECT_EQ(house_.log.texts().size(), 2U);
}

TEST_F(BundleScanTest, AnUnsettledBundleCountsAsWhatItWas) {
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::install(user("b"), "org.b");
  const std::string before = scan.run().bundles.at("org.a").version;
  BundleHouse::write(user("a") + "/Info.plist", "half");
  fs::remove_all(user("b"));
  for (int look = 0; look < 2; ++look) {
    const auto bundles = scan.run({user("a"), user("b")}).bundles;
    ASSERT_TRUE(bundles.contains("org.a"));
    EXPECT_EQ(bundles.at("org.a").version, before);
    EXPECT_FALSE(bundles.contains("org.b")) << "what is not there any more counts as nothing";
  }
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  EXPECT_THAT(scan.run().bundles, IsEmpty());
  EXPECT_THAT(scan.run({user("a")}).bundles, IsEmpty()) << "what it was last is no bundle";
  EXPECT_EQ(house_.log.texts().size(), 1U);
}

TEST_F(BundleScanTest, AnUnsettledBundleThatWasNeverSeenIsPassedOverInSilence) {
  BundleHouse::install(user("a"), "org.a");
  fs::create_directories(user("b"));
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  EXPECT_THAT(scan.run({user("a"), user("b")}).bundles, IsEmpty());
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  EXPECT_EQ(scan.run({user("b")}).bundles.size(), 1U);
}

TEST_F(BundleScanTest, TheDirectoriesOfABundleAreThoseNearestFirstAndBounded) {
  const std::string bundle = user("a");
  fs::create_directories(bundle + "/x/y/z");
  fs::create_directories(bundle + "/w");
  fs::create_directory_symlink(house_.root(), bundle + "/link");
  BundleHouse::write(bundle + "/file", "");
  EXPECT_THAT(std::get<std::vector<std::string>>(directoriesOfBundle(bundle)),
              ElementsAre(bundle, bundle + "/w", bundle + "/x", bundle + "/x/y", bundle + "/x/y/z"));
  for (std::size_t i = 0; i < kMostBundleDirectories; ++i) fs::create_directory(bundle + "/x/" + std::to_string(i));
  const auto directories = std::get<std::vector<std::string>>(directoriesOfBundle(bundle));
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
  EXPECT_THAT(house_.log.entries(),
              ElementsAre(fault("[ERROR] The bundle org.stranger may not belong to the group org.owner.docs, which is org.owner's.")));
}

// Whoever is there first, and whoever stays: the one that was there first may have named the owner as a member.
TEST_F(BundleScanTest, AGroupIsItsOwnersInWhateverOrderBundlesAreInstalled) {
  const std::string group = "org.owner.one.docs";
  const std::string docs = BundleHouse::entry("QXGroups", BundleHouse::array({group, group}));
  const std::string list =
      BundleHouse::entry("QXGroupMembers", "<dict><key>" + group + "</key>" + BundleHouse::array({"org.owner.one"}) + "</dict>");
  const std::string whose = " the group " + group + ", which is org.owner.one's.";
  const auto expectNothingForOthers = [&] {
    const auto bundles = house_.scan();
    EXPECT_THAT(bundles.at("org.owner").groups, IsEmpty());
    EXPECT_THAT(bundles.at(group).groups, IsEmpty());
    EXPECT_THAT(house_.log.entries(), UnorderedElementsAre(fault("[ERROR] The bundle org.owner may not belong to" + whose),
                                                           fault("[ERROR] The bundle " + group + " may not belong to" + whose),
                                                           fault("[ERROR] The bundle org.owner may not name members of" + whose)));
    house_.log.clear();
  };
  BundleHouse::install(system("shorter"), "org.owner", docs + list);
  BundleHouse::install(user("equal"), group, docs);
  expectNothingForOthers();
  BundleHouse::install(user("owner"), "org.owner.one", docs);
  expectNothingForOthers();
  EXPECT_THAT(house_.scan().at("org.owner.one").groups, ElementsAre(Pair(group, house_.paths.groupContainers + "/" + group)));
  house_.log.clear();
  fs::remove_all(user("owner"));
  expectNothingForOthers();
  EXPECT_FALSE(fs::exists(house_.paths.groupContainers));
}

TEST_F(BundleScanTest, AWordAboutTheMembersOfAnothersGroupIsOneLineAndWorthNothing) {
  const std::string docs = BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.docs"}));
  BundleHouse::install(user("owner"), "org.owner", docs);
  BundleHouse::install(
      user("thief"), "org.thief",
      BundleHouse::entry("QXGroupMembers", "<dict><key>org.owner.docs</key>" + BundleHouse::array({"org.thief"}) + "</dict>"));
  EXPECT_EQ(house_.scan().at("org.owner").groups.size(), 1U);
  EXPECT_THAT(house_.log.entries(),
              ElementsAre(fault("[ERROR] The bundle org.thief may not name members of the group org.owner.docs, which is org.owner's.")));
}

TEST_F(BundleScanTest, WhatOthersCanWriteIsNoBundle) {
  const std::string program = BundleHouse::entry("QXBundleExecutable", BundleHouse::text("bin/program"));
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::write(user("a") + "/Info.plist",
                     BundleHouse::propertyList(BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.a")) + program));
  BundleHouse::writeExecutable(user("a") + "/bin/program", "#!/bin/sh\n");
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList(""));
  BundleHouse::install(system("b"), "org.b");
  ASSERT_EQ(house_.scan().size(), 2U);
  struct Case {
    std::string path;
    std::string line;
    std::size_t left;
  };
  const std::string inA = "[ERROR] Ignoring the bundle at " + user("a") + ": it";
  for (const auto& [path, line, left] : std::vector<Case>{
           {user("a"), inA + " can be written by others.", 1},
           {user("a") + "/Info.plist", inA + "s Info.plist can be written by others.", 1},
           {user("a") + "/Entitlements.plist", inA + "s Entitlements.plist can be written by others.", 1},
           {user("a") + "/bin", inA + "s bin can be written by others.", 1},
           {user("a") + "/bin/program", inA + "s bin/program can be written by others.", 1},
           {system("b"), "[ERROR] Ignoring the bundle at " + system("b") + ": it can be written by others.", 1},
           {house_.paths.userBundles, "[ERROR] Ignoring the bundles in " + house_.paths.userBundles + ": it can be written by others.", 1},
           {house_.paths.systemBundles, "[ERROR] Ignoring the bundles in " + house_.paths.systemBundles + ": it can be written by others.",
            1}}) {
    for (const auto others : {fs::perms::group_write, fs::perms::others_write}) {
      house_.log.clear();
      fs::permissions(path, others, fs::perm_options::add);
      EXPECT_EQ(house_.scan().size(), left) << path;
      EXPECT_THAT(house_.log.entries(), ElementsAre(fault(line)));
      fs::permissions(path, others, fs::perm_options::remove);
    }
  }
  EXPECT_EQ(house_.scan().size(), 2U);
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
