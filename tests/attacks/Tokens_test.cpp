// Tokens changed, exchanged and kept too long.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>
#include <sstream>

#include <cstdlib>
#include <filesystem>

#include "sdk/Administrator.h"
#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class Tokens : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    other_ = put("other.txt", "Another one");
    tokens_ = grant(url(letter_));
    otherTokens_ = grant(url(other_));
    ASSERT_TRUE(tokens_.item && tokens_.sibling && otherTokens_.item && otherTokens_.sibling);
  }

  static QXData withText(const std::string& text) { return QXData::fromText(text); }
  // The parts between a token's colons.
  static std::vector<std::string> partsOf(const QXData& token) {
    std::vector<std::string> parts;
    std::istringstream stream(token.text());
    for (std::string part; std::getline(stream, part, ':');) parts.push_back(part);
    return parts;
  }
  static QXData tokenOf(const std::vector<std::string>& parts) {
    std::string text;
    for (const std::string& part : parts) text.append(text.empty() ? "" : ":").append(part);
    return withText(text);
  }
  // Takes back the attacker's grant of that item.
  void revoke(const std::string& item) const {
    ::setenv("XDG_RUNTIME_DIR", house_.runtime().c_str(), 1);
    const auto administrator = Administrator::connect({});
    ASSERT_EQ(administrator.index(), 0U);
    ASSERT_EQ(std::get<0>(administrator)->revoke(ProviderID{kColluder}, ItemID{item}, ConsumerID{kAttacker}), std::nullopt);
  }
  enum Part : std::size_t { kVersion = 1, kKind, kNumber, kPath, kNonce, kTag, kParts };

  std::string letter_;
  std::string other_;
  FileAttackTest::Tokens tokens_;
  FileAttackTest::Tokens otherTokens_;
};

TEST_F(Tokens, ATokenWithAnyBitChangedOpensNothing) {
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "flip", "open", "read", "contents"}),
              ElementsAre(url(letter_).absoluteString(), kBadToken, "ok", kLetterText));
}

TEST_F(Tokens, ATokenThatIsCutOpensNothing) {
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "cut", "open", "read", "contents"}),
              ElementsAre(url(letter_).absoluteString(), kBadToken, "ok", kLetterText));
}

TEST_F(Tokens, NoPartOfATokenIsOfUseInAnother) {
  const auto parts = partsOf(*tokens_.item);
  const auto others = partsOf(*otherTokens_.item);
  ASSERT_EQ(parts.size(), kParts);
  for (const Part part : {kPath, kNonce, kTag}) {
    auto mixed = parts;
    ASSERT_NE(mixed[part], others[part]);
    mixed[part] = others[part];
    EXPECT_EQ(redeem(tokenOf(mixed)).outcome, kBadToken) << part;
  }
  EXPECT_EQ(redeem(tokenOf(parts)).contents(), kLetterText);
}

TEST_F(Tokens, ATokenIsOfItsOwnVersionKindSessionAndPathAlone) {
  const auto parts = partsOf(*tokens_.item);
  const std::string path = parts[kPath];
  const std::vector<std::pair<Part, std::vector<std::string>>> forgeries = {
      {kVersion, {"1", "3", ""}},
      {kKind, {"r", "w", "rwx", "RW", ""}},
      {kNumber, {"0", "999999999999999999", "0" + parts[kNumber], ""}},
      // The same path in other spellings, and others.
      {kPath, {path + "/", "/" + path, path.substr(0, path.rfind('/')) + "/./letter.txt", path + "%2E", path + "/../other.txt", ""}},
  };
  for (const auto& [part, texts] : forgeries) {
    for (const std::string& text : texts) {
      auto forged = parts;
      forged[part] = text;
      EXPECT_EQ(redeem(tokenOf(forged)).outcome, kBadToken) << text;
    }
  }
  EXPECT_EQ(redeem(tokenOf(parts)).contents(), kLetterText);
}

TEST_F(Tokens, ATokenOpensNothingWhenTheKeyWasRenewed) {
  ASSERT_EQ(redeem(tokens_.item).contents(), kLetterText);
  house_.killDaemon();
  ASSERT_EQ(::unlink((house_.runtime() + "/docuvend/token-key").c_str()), 0);
  house_.startDaemon();
  EXPECT_THAT(attack({"redeem", tokens_.item->text(), "read", "resolve", stringFor("letter.txt"), "open", "read", "contents"}),
              ElementsAre(kBadToken, url(letter_).absoluteString(), "ok", kLetterText));
}

TEST_F(Tokens, ATokenOpensNothingWhenAGrantOfItsProviderWasRevoked) {
  ASSERT_EQ(redeem(tokens_.item).contents(), kLetterText);
  revoke("letter.txt");
  for (const auto& token : {tokens_.item, tokens_.sibling}) {
    EXPECT_THAT(attack({"redeem", token->text(), "read", "redeem", token->text(), "write"}), ElementsAre(kBadToken, kBadToken));
  }
  EXPECT_EQ(replace(tokens_.item, tokens_.sibling), kBadToken);
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt")}), ElementsAre(kNotPermitted));
  // Of the other document there is a grant still.
  EXPECT_THAT(attack({"resolve", stringFor("other.txt"), "open", "read", "contents"}),
              ElementsAre(url(other_).absoluteString(), "ok", "Another one"));
}

TEST_F(Tokens, WhatWasOpenedForWritingIsOfNoUseWhenAGrantOfItsProviderWasRevoked) {
  const std::string address = url(letter_).absoluteString();
  const std::vector<std::string> uses = {"turn", "writing", address, "extend", address, kPicker};
  std::vector<std::string> words = {
      std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker, "resolve", stringFor("letter.txt"), "open", "write"};
  words.insert(words.end(), uses.begin(), uses.end());
  words.insert(words.end(), {"hold", "revoked"});
  words.insert(words.end(), uses.begin(), uses.end());
  Process attacker({words, house_.environment(), {}});
  const std::string hold = house_.container(kAttacker) + "/revoked";
  eventually("the attacker has used the letter",
             [&hold, &attacker] { return std::filesystem::exists(hold + ".holding") || !attacker.isRunning(); });
  revoke("letter.txt");
  writeFile(hold + ".go", "");
  EXPECT_THAT(linesOf(attacker.wait().output), ElementsAre(address, "ok", "ok", stringFor("letter.txt"), "ok", kNoTurn, kNotPermitted));
}

TEST_F(Tokens, ATokenOfOneFileGivesNoTurnAtAnother) {
  const std::string letter = url(letter_).absoluteString();
  const std::string other = url(other_).absoluteString();
  EXPECT_THAT(attack({"resolve",   stringFor("letter.txt"),
                      "turn-with", "item",
                      "reading",   other,
                      "turn-with", "item",
                      "writing",   other,
                      "turn-with", "sibling",
                      "writing",   letter,
                      "turn",      "reading",
                      letter,      "turn-with",
                      "item",      "writing",
                      letter}),
              ElementsAre(letter, kNoTurn, kNoTurn, kNoTurn, kNoTurn, "ok"));
}

TEST_F(Tokens, OnlyAnItemAndItsOwnHiddenSiblingAreExchanged) {
  for (const auto& tokens : {tokens_, otherTokens_}) {
    const Opened sibling = redeem(tokens.sibling, Access::readWrite);
    ASSERT_EQ(sibling.outcome, "ok");
    ASSERT_EQ(::pwrite(sibling.file->number, "New", 3, 0), 3);
  }
  constexpr const char* kNotSiblings = "QXSandboxErrorDomain 6";
  EXPECT_EQ(replace(tokens_.item, otherTokens_.sibling), kNotSiblings);
  EXPECT_EQ(replace(tokens_.item, otherTokens_.item), kNotSiblings);
  EXPECT_EQ(replace(tokens_.sibling, tokens_.item), kNotSiblings);
  EXPECT_EQ(replace(tokens_.item, tokens_.item), kNotSiblings);
  EXPECT_EQ(contentsOf(letter_), kLetterText);
  EXPECT_EQ(replace(tokens_.item, tokens_.sibling), "ok");
  EXPECT_EQ(contentsOf(letter_), "New");
}

TEST_F(Tokens, NoTokenIsEverInTheLog) {
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "write", "redeem", tokens_.item->text() + "x", "read"}),
              ElementsAre(url(letter_).absoluteString(), "ok", kBadToken));
  ASSERT_TRUE(house_.awaitLog("[NOTICE] Refusing a sandbox token from PID "));
  for (const auto& token : {tokens_.item, tokens_.sibling}) {
    const auto parts = partsOf(*token);
    EXPECT_EQ(house_.loggedContaining(parts[kTag]), 0);
    EXPECT_EQ(house_.loggedContaining(parts[kNonce]), 0);
  }
}

}  // namespace
}  // namespace docuvend::tests
