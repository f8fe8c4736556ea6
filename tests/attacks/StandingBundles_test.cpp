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
  void expectIgnored(const std::string& directory, const std::string& other) const {
    EXPECT_EQ(house_.logged("[ERROR] Ignoring the bundle at " + directory + ": " + other + " has the same identifier."), 1);
  }

  std::string letter_;
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
  EXPECT_EQ(house_.logged("[ERROR] The bundle zz.thief may not belong to the group " + kGroup + "."), 1);
  EXPECT_EQ(house_.logged("[ERROR] The bundle zz.stranger may not belong to the group " + kAttacker + ".shared."), 1);
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

}  // namespace
}  // namespace docuvend::tests
