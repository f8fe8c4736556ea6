// To be taken for another bundle: by what a process runs, by what it was born of, by what it says of itself.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "platform/linux/base/confinement.h"
#include "platform/linux/bundles/BundleParser.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "platform/linux/launch/LaunchDescription.h"
#include "tests/attacks/TwoApplications.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

class IdentityAttacks : public TwoApplications {
 protected:
  // What describes a confinement of the victim's, in a file of this test.
  [[nodiscard]] std::string forgedDescription(const std::string& directory) const {
    fs::create_directories(directory);
    const std::string path = directory + linux_platform::kDescriptionPath;
    writeFile(path, linux_platform::descriptionText(
                        {kVictim, incarnationOf(kVictim), std::string(32, '0'), linux_platform::LaunchKind::application}));
    return path;
  }
  [[nodiscard]] std::string incarnationOf(const std::string& bundle) const {
    linux_platform::LinuxPropertyLists propertyLists;
    const auto parsed = linux_platform::parseBundle(house_.bundles() + "/" + bundle, propertyLists);
    return std::get<linux_platform::ParsedBundle>(parsed).bundle.incarnation;
  }
  // As a launcher would start it who is not confined: the least of a confinement, with that description.
  [[nodiscard]] static Lines confinement(const std::string& description) {
    return {"/usr/bin/bwrap",
            "--unshare-user",
            "--unshare-pid",
            "--die-with-parent",
            "--dev-bind",
            "/usr",
            "/usr",
            "--symlink",
            "usr/lib",
            "/lib",
            "--symlink",
            "usr/lib64",
            "/lib64",
            "--proc",
            "/proc",
            "--bind",
            rootOf(description),
            rootOf(description),
            "--ro-bind",
            DOCUVEND_BIN,
            DOCUVEND_BIN,
            "--ro-bind",
            description,
            "/.docuvend-info",
            "--"};
  }
  [[nodiscard]] static std::string rootOf(const std::string& description) { return fs::path(description).parent_path(); }
  // Namespaces of somebody's own around everything, as a process in a confinement would have made them.
  static inline const Lines kAround = {"/usr/bin/bwrap", "--unshare-user", "--die-with-parent", "--dev-bind", "/", "/", "--"};
  [[nodiscard]] std::string root() const { return fs::path(house_.home()).parent_path(); }
};

TEST_F(IdentityAttacks, AnotherBundlesExecutableRunByAnApplicationIsStillThatApplication) {
  EXPECT_EQ(attack({"execute", victimsProgram()}), Lines{"ENOENT"});
  ASSERT_TRUE(fs::equivalent(victimsProgram(), sameProgram()));
  EXPECT_EQ(attack(joined({"execute", sameProgram()}, whoAmI())), kIsAttacker);
  EXPECT_EQ(refusalsOf(kAttacker), 1);
  EXPECT_EQ(as(kVictim, whoAmI()), kIsVictim);
}

TEST_F(IdentityAttacks, ALibraryPreloadedIntoAnotherBundlesExecutableActsForTheApplicationThatLoadedIt) {
  const std::string library = house_.bundles() + "/" + kAttacker + "/library.so";
  fs::copy_file(std::string(DOCUVEND_BIN) + "/docuvend-preloaded.so", library);
  EXPECT_EQ(attack(joined({"execute-with", library, sameProgram()}, whoAmI())), joined({"preloaded"}, kIsAttacker));
  EXPECT_EQ(as(kVictim, whoAmI()), kIsVictim);
}

TEST_F(IdentityAttacks, AConfinedProcessCannotNameAnotherProgramAsTheOneThatItRuns) {
  EXPECT_EQ(attack(thenWhoAmI({"map-over", sameProgram()})), joined({"EPERM"}, kIsAttacker));
  EXPECT_EQ(as(kVictim, whoAmI()), kIsVictim);
}

TEST_F(IdentityAttacks, AnOrphanInASessionOfItsOwnIsTheApplicationThatItCameFrom) {
  EXPECT_EQ(attack(thenWhoAmI({"orphan"})), joined({"ok"}, kIsAttacker));
  EXPECT_EQ(as(kVictim, thenWhoAmI({"orphan"})), joined({"ok"}, kIsVictim));
}

TEST_F(IdentityAttacks, AProcessThatNobodyMayLookIntoIsStillTheApplication) {
  EXPECT_EQ(attack(thenWhoAmI({"undumpable"})), joined({"ok"}, kIsAttacker));
  EXPECT_EQ(as(kVictim, thenWhoAmI({"undumpable"})), joined({"ok"}, kIsVictim));
}

TEST_F(IdentityAttacks, AConfinedProcessCanMakeNoNamespacesAndDescribeItselfInNoOtherWay) {
  const std::string forged = forgedDescription(house_.container(kAttacker));
  EXPECT_EQ(attack(thenWhoAmI({"enter", "describe", forged, "chroot", house_.container(kAttacker), "put", linux_platform::kDescriptionPath,
                               "[Application]\n"})),
            joined({"ENOSPC", "EPERM", "EPERM", "EROFS"}, kIsAttacker));
  EXPECT_EQ(unconfined({"enter", "chroot", root()}), (Lines{"ok", "ok"}));
}

// As in a confinement that let its processes make namespaces.
TEST_F(IdentityAttacks, NestedNamespacesWithAForgedDescriptionAreNobodys) {
  const Lines command = confinement(forgedDescription(root()));
  EXPECT_EQ(unconfined(whoAmI(), joined(kAround, command)), kIsNobody);
  EXPECT_EQ(house_.loggedContaining("is nobody: its mount namespace was made inside a confinement."), 2);
  EXPECT_EQ(unconfined(whoAmI(), command), kIsVictim);
}

TEST_F(IdentityAttacks, NamespacesWithoutADescriptionAreNobodys) {
  EXPECT_EQ(unconfined(thenWhoAmI({"enter"})), joined({"ok"}, kIsNobody));
  EXPECT_EQ(house_.loggedContaining("is nobody: cannot open its description"), 2);
  EXPECT_EQ(unconfined(whoAmI(), confinement(forgedDescription(root()))), kIsVictim);
}

TEST_F(IdentityAttacks, ARootThatWasChangedToADirectoryWithAForgedDescriptionIsNotBelieved) {
  const Lines command = confinement(forgedDescription(root()));
  EXPECT_EQ(unconfined(thenWhoAmI({"enter", "chroot", root()}), {}, {"XDG_RUNTIME_DIR=/r"}), joined({"ok", "ok"}, kIsNobody));
  EXPECT_EQ(house_.loggedContaining("is nobody: its root is not that of a mount."), 2);
  EXPECT_EQ(unconfined(whoAmI(), command), kIsVictim);
}

}  // namespace
}  // namespace docuvend::tests
