// A provider goes, and another bundle comes in its place. What was granted of the first is the second's as far as it has the same
// identifier, unless it was taken back; and nobody else's.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;

// One that says it is the heir, and one that is installed after it and says nothing.
const std::string kHeir = "com.orvane.heir";
const std::string kOrdinary = "com.orvane.ordinary";

class Successors : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    tokens_ = grant(url(letter_));
    ASSERT_EQ(redeem(tokens_.item).contents(), kLetterText);
  }
  [[nodiscard]] int registrations(const std::string& identifier) const {
    return house_.loggedContaining("[INFO] Registered docuvend extension " + identifier + " for path ");
  }
  // Once more, under that identifier.
  void install(const std::string& identifier) const {
    const int before = registrations(identifier);
    installColluder(identifier);
    eventually("the provider is registered", [this, &identifier, before] { return registrations(identifier) > before; });
  }
  void awaitThatItIsGone() {
    // Without granting: what is granted while the provider is still known stays.
    eventually("the provider is not known any more", [this] { return house_.ctl({"bookmark", letter_}).status != 0; });
  }

  std::string letter_;
  Tokens tokens_;
};

TEST_F(Successors, WhatWasTakenBackWithTheFirstIsNothingToTheSecond) {
  const Ending uninstalled = house_.ctl({"uninstall", kColluder, "--remove-grants"});
  ASSERT_EQ(uninstalled.status, 0) << uninstalled.errors;
  awaitThatItIsGone();
  for (const auto& token : {tokens_.item, tokens_.sibling}) EXPECT_NE(redeem(token, Access::readWrite).outcome, "ok");
  install(kColluder);
  for (const auto& token : {tokens_.item, tokens_.sibling}) EXPECT_EQ(redeem(token, Access::readWrite).outcome, kBadToken);
  EXPECT_EQ(replace(tokens_.item, tokens_.sibling), kBadToken);
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt")}), ElementsAre(kNotPermitted));
  ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "read", "contents"}),
              ElementsAre(url(letter_).absoluteString(), "ok", kLetterText));
}

TEST_F(Successors, AGrantIsByIdentifierAndForItsItemsAlone) {
  fs::remove_all(house_.bundles() + "/" + kColluder);
  awaitThatItIsGone();
  EXPECT_EQ(redeem(tokens_.item).outcome, kBadToken);
  fs::remove_all(house_.storage(kColluder));
  install(kColluder);
  (void)put("letter.txt", "A new one");
  (void)put("secret.txt", "The new one's own");
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "read", "contents", "resolve", stringFor("secret.txt")}),
              ElementsAre(url(letter_).absoluteString(), "ok", "A new one", kNotPermitted));
  // A token ends with the membership under which it was issued.
  EXPECT_EQ(redeem(tokens_.item).outcome, kBadToken);
  EXPECT_EQ(redeem(grant(url(letter_)).item).contents(), "A new one");
}

TEST_F(Successors, ARevocationReachesTheGroupThatHadTheDocumentsBeforeAnUpdate) {
  const std::string old = kColluder + ".documents";
  const std::string present = kColluder + ".v2";
  const int before = registrations(kColluder);
  const std::string update = house_.bundles() + "/.update";
  house_.install(".update", "docuvend-colluder",
                 stringEntry("QXBundleIdentifier", kColluder) + "<key>QXGroups</key><array><string>" + old + "</string><string>" + present +
                     "</string></array><key>QXExtension</key><dict>" + stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
                     stringEntry("QXExtensionDocuvendDocumentGroup", present) + "</dict>",
                 {});
  const Ending installed = house_.ctl({"install", update});
  ASSERT_EQ(installed.status, 0) << installed.errors;
  eventually("the new version is registered", [this, before] { return registrations(kColluder) > before; });
  ASSERT_EQ(redeem(tokens_.item).contents(), kLetterText) << "the update alone ends nothing: the bundle has kept the group";
  const Ending revoked = house_.ctl({"revoke", kColluder, "letter.txt", kAttacker});
  ASSERT_EQ(revoked.status, 0) << revoked.errors;
  for (const auto& token : {tokens_.item, tokens_.sibling}) EXPECT_EQ(redeem(token, Access::readWrite).outcome, kBadToken);
  EXPECT_EQ(contentsOf(letter_), kLetterText);
}

TEST_F(Successors, AnotherIdentifierInheritsNeitherTheGroupNorTheGrantsNorTheTokens) {
  fs::remove_all(house_.bundles() + "/" + kColluder);
  awaitThatItIsGone();
  // It names the old one's group for its own.
  const std::string group = kColluder + ".documents";
  house_.install(kHeir, "docuvend-colluder",
                 stringEntry("QXBundleIdentifier", kHeir) + "<key>QXGroups</key><array><string>" + group +
                     "</string></array><key>QXExtension</key><dict>" + stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
                     stringEntry("QXExtensionDocuvendDocumentGroup", group) + "</dict>",
                 {});
  install(kOrdinary);
  EXPECT_EQ(redeem(tokens_.item).outcome, kBadToken);
  EXPECT_NE(grant(url(letter_), kHeir).outcome, "ok");
  // What is recorded of this one is a grant of its own item of that name.
  EXPECT_EQ(grant(url(letter_), kOrdinary).outcome, "DVErrorDomain 9");
  const std::string own = house_.storage(kOrdinary) + "/letter.txt";
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt", kHeir), "resolve", stringFor("letter.txt", kOrdinary)}),
              ElementsAre(kNotPermitted, url(own).absoluteString()));
  EXPECT_EQ(contentsOf(letter_), kLetterText);
  writeFile(own, "Its own");
  EXPECT_EQ(redeem(grant(url(own), kOrdinary).item).contents(), "Its own");
}

}  // namespace
}  // namespace docuvend::tests
