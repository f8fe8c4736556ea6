// To get the standing of a process that is not confined: to declare a bundle, to reach the administration, to announce the unlock.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "common/DVErrors.h"
#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/told.h"
#include "tests/system/knock.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;

const std::string kRefused = "QXRpcErrorDomain 9";
const std::string kNotThere = "not reached: QXSystemErrorDomain 2";

class StandingAttacks : public TwoApplications {
 protected:
  // The administration's socket by a name where the attacker can see it.
  [[nodiscard]] std::string door() const {
    const std::string path = house_.container(kAttacker) + "/door";
    fs::create_directories(house_.container(kAttacker));
    fs::permissions(house_.container(kAttacker), fs::perms::owner_all);
    fs::create_hard_link(house_.administrationSocket(), path);
    return path;
  }
  [[nodiscard]] int unlocksAnnounced() const { return house_.loggedContaining(" announces the first unlock."); }
  static inline const Lines kInNamespaces = {"/usr/bin/bwrap", "--unshare-user", "--die-with-parent", "--dev-bind", "/", "/", "--"};
};

TEST_F(StandingAttacks, AConfinedProcessCanDeclareNoBundleNotEvenItsOwn) {
  EXPECT_EQ(attack({"ask-as", kVictim, others_, "ask-as", kAttacker, own_, "ask", own_}), (Lines{kRefused, kRefused, "ok"}));
  EXPECT_EQ(house_.loggedContaining(" declares itself to be "), 0);
  // Of two processes: one acts for one bundle as long as the daemon has not heard of its connection's end.
  EXPECT_EQ(unconfined({"ask-as", kVictim, others_}), Lines{"ok"});
  EXPECT_EQ(unconfined({"ask-as", kAttacker, own_}), Lines{"ok"});
  EXPECT_EQ(house_.loggedContaining(" declares itself to be com.orvane.victim."), 1);
}

TEST_F(StandingAttacks, AnOrphanOfAConfinedProcessCanDeclareNoBundleEither) {
  EXPECT_EQ(attack({"orphan", "ask-as", kVictim, others_}), (Lines{"ok", kRefused}));
  EXPECT_EQ(unconfined({"orphan", "ask-as", kVictim, others_}), (Lines{"ok", "ok"}));
}

TEST_F(StandingAttacks, WhoIsInNamespacesOfItsOwnCanDeclareNoBundle) {
  EXPECT_EQ(unconfined({"ask-as", kVictim, others_}, kInNamespaces), Lines{kRefused});
  EXPECT_EQ(house_.loggedContaining(" declares itself to be "), 0);
  EXPECT_EQ(unconfined({"ask-as", kVictim, others_}), Lines{"ok"});
}

TEST_F(StandingAttacks, AConfinedProcessDoesNotSeeTheAdministration) {
  EXPECT_EQ(attack({"knock", house_.administrationSocket(), "status"}), Lines{kNotThere});
  EXPECT_EQ(unconfined({"knock", house_.administrationSocket(), "status"}), Lines{"answered"});
}

TEST_F(StandingAttacks, AConfinedProcessThatSeesTheAdministrationIsRefusedThere) {
  const std::string socket = door();
  EXPECT_EQ(attack({"knock", socket, "status", "orphan", "knock", socket, "status"}), (Lines{kRefused, "ok", kRefused}));
  EXPECT_EQ(unconfined({"knock", socket, "status"}), Lines{"answered"});
}

TEST_F(StandingAttacks, AConfinedProcessCannotAnnounceTheUnlock) {
  const std::string socket = door();
  EXPECT_EQ(attack({"knock", socket, "first-unlock"}), Lines{kRefused});
  EXPECT_EQ(unlocksAnnounced(), 0);
  EXPECT_EQ(unconfined({"knock", socket, "first-unlock"}), Lines{"answered"});
  EXPECT_EQ(unlocksAnnounced(), 1);
}

TEST_F(StandingAttacks, WhoIsInNamespacesOfItsOwnIsRefusedAtTheAdministration) {
  EXPECT_EQ(unconfined({"knock", house_.administrationSocket(), "first-unlock"}, kInNamespaces), Lines{kRefused});
  EXPECT_EQ(unlocksAnnounced(), 0);
  EXPECT_EQ(unconfined({"knock", house_.administrationSocket(), "first-unlock"}), Lines{"answered"});
  EXPECT_EQ(unlocksAnnounced(), 1);
}

TEST_F(StandingAttacks, AnExtensionIsRefusedAtTheAdministration) {
  const std::string socket = fs::path(house_.storage(kTrickster)).parent_path() / "door";
  fs::create_hard_link(house_.administrationSocket(), socket);
  writeFile(house_.storage(kTrickster) + "/knock", "");
  const auto named = house_.client()->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(url(house_.storage(kTrickster) + "/knock"));
  ASSERT_EQ(errorOf(named), std::nullopt);
  EXPECT_EQ(std::get<0>(std::get<0>(named)), "docuvend:com.orvane.trickster/" + kRefused);
  EXPECT_EQ(unlocksAnnounced(), 0);
  EXPECT_EQ(knock(socket, {"first-unlock"}), "answered");
}

}  // namespace
}  // namespace docuvend::tests
