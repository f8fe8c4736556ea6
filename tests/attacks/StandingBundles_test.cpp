// To be another bundle by what an Info.plist claims: its identifier, or its group.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>

#include <filesystem>

#include "tests/attacks/AttackTest.h"
#include "tests/attacks/namespaces.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;

const std::string kWrite = "com.orvane.docuvend.acl-write";
const std::string kGroup = kCellar + ".documents";
using Lines = std::vector<std::string>;

class BundleAttacks : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    if (HasFatalFailure()) return;
    house_.install(kCellar);
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
  }
  // A bundle of the attacker's program with that identifier, in a directory of that name.
  void claim(const std::string& directory, const std::string& identifier, const std::string& more, const std::string& entitlements) const {
    house_.install(directory, "docuvend-attacker", stringEntry("QXBundleIdentifier", identifier) + more, entitlements);
  }
  [[nodiscard]] Lines grantToItself(const std::string& bundle) const { return says(bundle, {"grant", letter_, kCellar, bundle}); }
  [[nodiscard]] Lines says(const std::string& bundle, const Lines& words) const {
    const Ending ending = house_.confined(bundle, words);
    EXPECT_EQ(ending.status, 0) << ending.errors;
    return {ending.output};
  }
  // A bundle that claims the cellar's group, and to say who its members are.
  void claimGroup(const std::string& identifier) const {
    claim(identifier, identifier,
          groupEntries_ + "<key>QXGroupMembers</key><dict><key>" + kGroup + "</key><array><string>" + kCellar + "</string></array></dict>",
          {});
  }
  // The daemon and the launcher agree that the bundle has nothing of the group.
  void expectNothingOfTheGroup(const std::string& identifier) {
    EXPECT_TRUE(
        house_.awaitLog("[ERROR] The bundle " + identifier + " may not belong to the group " + kGroup + ", which is " + kCellar + "'s."));
    EXPECT_EQ(says(identifier, {"put", house_.storage(kCellar) + "/stolen", "x"}), Lines{"ENOENT\n"});
    EXPECT_FALSE(fs::exists(house_.storage(kCellar) + "/stolen"));
  }
  void expectIgnored(const std::string& directory, const std::string& other) const {
    EXPECT_EQ(house_.logged("[ERROR] Ignoring the bundle at " + directory + ": " + other + " has the same identifier."), 1);
  }

  std::string letter_;
  const std::string groupEntries_ = "<key>QXGroups</key><array><string>" + kGroup + "</string></array>";
};

TEST_F(BundleAttacks, OfTwoBundlesThatClaimOneIdentifierTheSecondGainsNothing) {
  claim(kAttacker, kAttacker, {}, {});
  claim("zz.forged", kAttacker, {}, trueEntry(kWrite));
  claim("zz.honest", "zz.honest", {}, trueEntry(kWrite));
  house_.startDaemon();
  expectIgnored(house_.bundles() + "/zz.forged", house_.bundles() + "/" + kAttacker);
  EXPECT_EQ(grantToItself(kAttacker), Lines{"DVErrorDomain 1\n"});
  EXPECT_EQ(house_.accessControl(), "");
  EXPECT_EQ(grantToItself("zz.honest"), Lines{"ok\n"});
}

// The system's directory as this test sees it, and everything that it starts.
TEST_F(BundleAttacks, ABundleOfTheUsersThatClaimsTheIdentifierOfOneOfTheSystemsGainsNothing) {
  const std::string systems = "/usr/share/docuvend/bundles/" + kAttacker;
  ASSERT_TRUE(enterNamespaces(CLONE_NEWUSER | CLONE_NEWNS));
  ASSERT_EQ(::mount("tmpfs", "/usr/share", "tmpfs", 0, nullptr), 0);
  fs::create_directories(fs::path(systems).parent_path());
  claim(kAttacker, kAttacker, {}, {});
  fs::copy(house_.bundles() + "/" + kAttacker, systems, fs::copy_options::recursive);
  fs::remove_all(house_.bundles() + "/" + kAttacker);
  claim("aa.forged", kAttacker, {}, trueEntry(kWrite));
  claim("zz.honest", "zz.honest", {}, trueEntry(kWrite));
  house_.startDaemon();
  expectIgnored(house_.bundles() + "/aa.forged", systems);
  EXPECT_EQ(grantToItself(kAttacker), Lines{"DVErrorDomain 1\n"});
  EXPECT_EQ(house_.accessControl(), "");
  EXPECT_EQ(grantToItself("zz.honest"), Lines{"ok\n"});
}

TEST_F(BundleAttacks, ABundleThatClaimsAGroupOfAnotherSeesNothingOfItsContainer) {
  const std::string groups = "<key>QXGroups</key><array><string>" + kGroup + "</string></array>";
  const std::string own = "<key>QXGroups</key><array><string>" + kAttacker + ".shared</string></array>";
  const std::string members =
      "<key>QXGroupMembers</key><dict><key>" + kAttacker + ".shared</key><array><string>zz.friend</string></array></dict>";
  claim(kAttacker, kAttacker, own + members, {});
  claim("zz.thief", "zz.thief", groups, {});
  claim("zz.friend", "zz.friend", own, {});
  claim("zz.stranger", "zz.stranger", own, {});
  house_.startDaemon();
  EXPECT_EQ(house_.logged("[ERROR] The bundle zz.thief may not belong to the group " + kGroup + ", which is " + kCellar + "'s."), 1);
  EXPECT_EQ(
      house_.logged("[ERROR] The bundle zz.stranger may not belong to the group " + kAttacker + ".shared, which is " + kAttacker + "'s."),
      1);
  ASSERT_TRUE(fs::exists(house_.storage(kCellar)));
  EXPECT_EQ(says("zz.thief", {"put", house_.storage(kCellar) + "/stolen", "x"}), Lines{"ENOENT\n"});
  EXPECT_FALSE(fs::exists(house_.storage(kCellar) + "/stolen"));

  const std::string shared = fs::path(house_.storage(kCellar)).parent_path().parent_path().string() + "/" + kAttacker + ".shared";
  EXPECT_EQ(says(kAttacker, {"put", shared + "/note", "x"}), Lines{"ok\n"});
  EXPECT_EQ(says("zz.stranger", {"put", shared + "/note", "y"}), Lines{"ENOENT\n"});
  EXPECT_EQ(contentsOf(shared + "/note"), "x");
  EXPECT_EQ(says("zz.friend", {"put", shared + "/note", "z"}), Lines{"ok\n"});
  EXPECT_EQ(contentsOf(shared + "/note"), "z");
}

TEST_F(BundleAttacks, AGroupIsTakenOverNeitherByItsNameNorByALongerOneNorByWhatComesWhenItsOwnerIsGone) {
  const std::string inside = kCellar + ".documents";  // the group's whole name
  house_.startDaemon();
  ASSERT_TRUE(fs::exists(house_.storage(kCellar)));
  claimGroup(inside);
  claimGroup("com.orvane");
  for (const std::string& thief : {inside, std::string("com.orvane")}) expectNothingOfTheGroup(thief);
  const Ending uninstalled = house_.ctl({"uninstall", kCellar});
  ASSERT_EQ(uninstalled.status, 0) << uninstalled.errors;
  for (const std::string& thief : {inside, std::string("com.orvane")}) expectNothingOfTheGroup(thief);
  house_.install(kCellar);
  eventually("the owner has its storage again", [this] { return house_.ctl({"bookmark", letter_}).status == 0; });
}

// The daemon sees the thief first, and the owner is named as a member.
TEST_F(BundleAttacks, AGroupIsNotTakenByWhoComesBeforeItsOwner) {
  const std::string thief = "com.orvane";
  fs::rename(house_.bundles() + "/" + kCellar, house_.home() + "/owner");
  claimGroup(thief);
  house_.startDaemon();
  EXPECT_TRUE(
      house_.awaitLog("[ERROR] The bundle " + thief + " may not name members of the group " + kGroup + ", which is " + kCellar + "'s."));
  EXPECT_EQ(says(thief, {"put", house_.storage(kCellar) + "/stolen", "x"}), Lines{"ENOENT\n"});
  const Ending installed = house_.ctl({"install", house_.home() + "/owner"});
  EXPECT_EQ(installed.status, 0) << installed.errors;
  eventually("the owner provides", [this] { return house_.ctl({"bookmark", letter_}).status == 0; });
  expectNothingOfTheGroup(thief);
  EXPECT_EQ(says(thief, {"read", letter_, "contents"}), Lines{"ENOENT\nEBADF\n"});
}

TEST_F(BundleAttacks, WhoComesBeforeTheOwnerOfTheGroupThatItClaimsIsNotInstalled) {
  house_.startDaemon();
  EXPECT_EQ(house_.ctl({"uninstall", kCellar}).status, 0);
  claimGroup("com.orvane");
  const std::string away = house_.home() + "/thief";
  fs::rename(house_.bundles() + "/com.orvane", away);
  const Ending refused = house_.ctl({"install", away});
  EXPECT_NE(refused.status, 0);
  EXPECT_NE(refused.errors.find("The bundle com.orvane may not name members of the group " + kGroup + ", which is " + kCellar + "'s."),
            std::string::npos)
      << refused.errors;
  EXPECT_FALSE(fs::exists(house_.bundles() + "/com.orvane"));
}

TEST_F(BundleAttacks, AnIdentifierOfOneWordIsNone) {
  claim("com", "com", groupEntries_, {});
  house_.startDaemon();
  EXPECT_EQ(house_.logged("[ERROR] Ignoring the bundle at " + house_.bundles() +
                          "/com: its identifier has a single part and needs two or more, like org.name."),
            1);
  EXPECT_EQ(house_.confined("com", {"put", house_.storage(kCellar) + "/stolen", "x"}).status, 127);
}

TEST_F(BundleAttacks, WhatClaimsAnothersGroupIsNotInstalled) {
  house_.startDaemon();
  const std::string thief = kCellar + ".documents";
  claimGroup(thief);
  const std::string away = house_.home() + "/thief";
  fs::rename(house_.bundles() + "/" + thief, away);
  for (const bool isOwnerThere : {true, false}) {
    const Ending ending = house_.ctl({"install", away});
    EXPECT_NE(ending.status, 0) << isOwnerThere;
    const std::string what = isOwnerThere ? "belong to" : "name members of";
    EXPECT_NE(ending.errors.find("may not " + what + " the group " + kGroup + ", which is " + kCellar + "'s."), std::string::npos)
        << ending.errors;
    EXPECT_FALSE(fs::exists(house_.bundles() + "/" + thief));
    if (isOwnerThere) {
      EXPECT_EQ(house_.ctl({"uninstall", kCellar}).status, 0);
    }
  }
}

TEST_F(BundleAttacks, WhatOthersCanWriteIsNoBundle) {
  claim("zz.open", "zz.open", {}, trueEntry(kWrite));
  fs::permissions(house_.bundles() + "/zz.open/Entitlements.plist", fs::perms::others_write, fs::perm_options::add);
  house_.startDaemon();
  EXPECT_EQ(
      house_.logged("[ERROR] Ignoring the bundle at " + house_.bundles() + "/zz.open: its Entitlements.plist can be written by others."),
      1);
  EXPECT_EQ(house_.confined("zz.open", {}).status, 127);
}

// As above, with the system's directory.
TEST_F(BundleAttacks, ABundleOfTheUsersDoesNotTakeOverTheGroupOfOneOfTheSystems) {
  const std::string systems = "/usr/share/docuvend/bundles/" + kCellar;
  ASSERT_TRUE(enterNamespaces(CLONE_NEWUSER | CLONE_NEWNS));
  ASSERT_EQ(::mount("tmpfs", "/usr/share", "tmpfs", 0, nullptr), 0);
  fs::create_directories(fs::path(systems).parent_path());
  fs::copy(house_.bundles() + "/" + kCellar, systems, fs::copy_options::recursive);
  fs::remove_all(house_.bundles() + "/" + kCellar);
  const std::string longer = kCellar + ".documents";
  claimGroup(longer);
  house_.startDaemon();
  ASSERT_TRUE(fs::exists(house_.storage(kCellar)));
  expectNothingOfTheGroup(longer);
}

}  // namespace
}  // namespace docuvend::tests
