// From inside a confinement at what all of the user's processes share: keys and their quota, files that others open, sockets that others
// close.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/keyctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdint>
#include <string>
#include <vector>

#include "tests/attacks/FileAttackTest.h"
#include "tests/support/KeyQuota.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;

constexpr const char* kSecretName = "docuvend-test-secret";
constexpr const char* kSecret = "hunter2";

// A keyring as that which all sessions of a user share, with a key: processes of the user may link it to their own.
void shareAKey() {
  constexpr std::uint32_t kLikeTheUsersKeyring = 0x1F3F0000U;
  const long keyring = ::syscall(SYS_add_key, "keyring", "docuvend-test-shared", nullptr, 0, KEY_SPEC_SESSION_KEYRING);
  ASSERT_GE(keyring, 0);
  ASSERT_EQ(::syscall(SYS_keyctl, KEYCTL_SETPERM, keyring, kLikeTheUsersKeyring), 0);
  ASSERT_GE(::syscall(SYS_add_key, "user", kSecretName, kSecret, std::string(kSecret).size(), keyring), 0);
}

using SharedThings = FileAttackTest;

TEST_F(SharedThings, OfKeysNoneIsFoundOrMadeInside) {
  const KeyQuota quota;
  shareAKey();
  const std::vector<std::string> acts = {"take-key", kSecretName, "make-key"};
  EXPECT_THAT(unconfined(acts), ElementsAre(kSecret, "ok"));
  EXPECT_THAT(attack(acts), ElementsAre("ENOSYS", "ENOSYS"));
  EXPECT_THAT(attackAsExtension(acts), ElementsAre("ENOSYS", "ENOSYS"));
}

TEST_F(SharedThings, OfKeysAnApplicationUsesNoneUpAndALaunchNeedsNone) {
  EXPECT_THAT(attack({"fill-keys"}), ElementsAre("0 ENOSYS"));

  KeyQuota quota;
  quota.useUp();
  EXPECT_THAT(attack({"make", "own"}), ElementsAre("ok")) << "an application";
  EXPECT_THAT(attackAsExtension({"make", "own"}), ElementsAre("ok")) << "an extension";
}

TEST_F(SharedThings, OfLeasesAnApplicationHasNoneOnItsBundle) {
  const std::string list = house_.bundles() + "/" + kAttacker + "/Info.plist";
  const auto attacker = holdingAttacker({"lease", list}, "leasing");
  EXPECT_EQ(house_.ctl({"uninstall", kAttacker}).status, 0) << "its bundle is found";
  EXPECT_THAT(letGo(*attacker, "leasing"), ElementsAre("EINVAL"));

  const std::string own = house_.home() + "/own";
  writeFile(own, "");
  EXPECT_THAT(unconfined({"lease", own}), ElementsAre("ok"));
}

TEST_F(SharedThings, OfLeasesAnApplicationHasNoneOnADocument) {
  const std::string letter = put("letter.txt");
  const Tokens tokens = grant(url(letter));
  ASSERT_TRUE(tokens.item);
  const auto attacker = holdingAttacker({"redeem", tokens.item->text(), "read", "lease-it"}, "leasing");
  EXPECT_EQ(redeem(tokens.item).contents(), kLetterText);
  EXPECT_THAT(letGo(*attacker, "leasing"), ElementsAre("ok", "EINVAL"));
  EXPECT_THAT(attack({"redeem", tokens.item->text(), "read", "contents"}), ElementsAre("ok", kLetterText));
}

TEST_F(SharedThings, OfSocketsNoneWaitsElsewhereOrLeadsToAHost) {
  const std::vector<std::string> acts = {"linger", "call-host", "ring"};
  const auto refused = ElementsAre("ENOPROTOOPT", "EAFNOSUPPORT", "ENOSYS");
  EXPECT_THAT(attack(acts), refused);
  EXPECT_THAT(attackAsExtension(acts), refused);
  // Not every kernel has the other two.
  EXPECT_THAT(unconfined({"linger"}), ElementsAre("ok"));
}

}  // namespace
}  // namespace docuvend::tests
