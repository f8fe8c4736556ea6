// What a provider may say: where an item lies, how it is called, and whose it is.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;

class Answers : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  }
  // What the attacker gets when the provider answers with a URL: what came of it, and then the tokens.
  [[nodiscard]] std::vector<std::string> resolve(const std::string& answer) const {
    whisper("url", answer);
    return attack({"resolve", stringFor("letter.txt"), "token", "item", "token", "sibling"});
  }

  std::string letter_;
};

TEST_F(Answers, NoURLOutsideTheProvidersDirectoryIsOpened) {
  const std::string storage = url(house_.storage(kColluder)).absoluteString();
  const std::string up = storage + "/../../" + kCellar + ".documents/Docuvend%20Storage/diary.txt";
  writeFile(house_.storage(kColluder) + "/../beside.txt", "");
  fs::create_symlink(diary(), place("link"));
  fs::create_directory_symlink(house_.storage(kCellar), place("folder"));
  std::string escaped = up;
  for (auto at = escaped.find("/../"); at != std::string::npos; at = escaped.find("/../")) escaped.replace(at, 4, "/%2e%2E/");
  for (const std::string& answer :
       {std::string("file:///etc/passwd"), std::string("file:///"), url(house_.home() + "/h").absoluteString(),
        url(diary()).absoluteString(), up, escaped, storage + "//..//../" + kCellar + ".documents/Docuvend%20Storage/diary.txt", storage,
        storage + "/", storage + "/.", storage + "/x/..", storage + "/../beside.txt", storage + "/link", storage + "/folder/diary.txt",
        storage + "%2Flink", url(house_.container(kColluder) + "/url").absoluteString()}) {
    EXPECT_THAT(resolve(answer), ElementsAre(kNotPermitted, "", "")) << answer;
  }
  const auto honest = resolve(url(letter_).absoluteString());
  ASSERT_EQ(honest.size(), 3U);
  EXPECT_EQ(honest[0], url(letter_).absoluteString());
  EXPECT_EQ(redeem(QXData::fromText(honest[1])).contents(), kLetterText);
}

TEST_F(Answers, AWayWithDotsIsTheStraightWay) {
  fs::create_directory(place("sub"));
  const std::string storage = url(house_.storage(kColluder)).absoluteString();
  for (const char* way : {"/sub/../letter.txt", "/./letter.txt", "/sub/%2e%2e/letter.txt", "//letter.txt"}) {
    const auto lines = resolve(storage + way);
    ASSERT_EQ(lines.size(), 3U);
    EXPECT_EQ(lines[0], url(letter_).absoluteString()) << way;
    EXPECT_EQ(redeem(QXData::fromText(lines[1])).contents(), kLetterText) << way;
  }
  // A directory is nothing that could be opened, by whatever name.
  for (const char* way : {"/sub/.", "/sub/%2E", "/sub"}) {
    const auto lines = resolve(storage + way);
    ASSERT_EQ(lines.size(), 3U);
    EXPECT_EQ(lines[1], "") << way;
  }
}

TEST_F(Answers, AnotherProvidersFileIsNotGrantedInThisOnesName) {
  whisper("identifier", "letter.txt");
  EXPECT_EQ(grant(url(diary())).outcome, "DVErrorDomain 9");
  EXPECT_EQ(grant(url("/etc/passwd")).outcome, "DVErrorDomain 9");
  EXPECT_EQ(grant(url(place("..") + "/../" + kCellar + ".documents/Docuvend Storage/diary.txt")).outcome, "DVErrorDomain 9");
  // By the bookmark grant the file's own provider is asked, and nobody else.
  EXPECT_THAT(attack({"extend", url(diary()).absoluteString(), kAttacker}), ElementsAre(kNotPermitted));
  EXPECT_EQ(grant(url(letter_)).outcome, "ok");
}

TEST_F(Answers, AnIdentifierThatNoListCanHoldIsRefusedAndTheListStaysReadable) {
  for (const std::string& identifier : {std::string("one\x01two"), std::string("\xff\xfe"), std::string("\xed\xa0\x80"),
                                        std::string("nul\0nul", 7), std::string(70'000, 'x')}) {
    whisper("identifier", identifier);
    const Tokens refused = grant(url(letter_));
    EXPECT_EQ(refused.outcome, "DVErrorDomain 7") << identifier.substr(0, 20);
    EXPECT_FALSE(refused.item);
  }
  const std::vector<std::string> odd = {
      "a/b//c/", "..", "<key>&amp;</key>]]>", "line\nline\ttab\rreturn", " ", "\xe2\x80\xaegnp.exe", std::string(1'000, 'x')};
  for (const std::string& identifier : odd) {
    whisper("identifier", identifier);
    EXPECT_EQ(grant(url(letter_)).outcome, "ok") << identifier.substr(0, 20);
  }
  // What was saved is what the next daemon reads.
  house_.killDaemon();
  house_.startDaemon();
  whisper("url", url(letter_).absoluteString());
  for (const std::string& identifier : odd) {
    EXPECT_THAT(attack({"resolve", stringFor(identifier)}), ElementsAre(url(letter_).absoluteString())) << identifier.substr(0, 20);
  }
}

// --- The hidden sibling

TEST_F(Answers, TheSiblingsTokenOpensTheSiblingAlone) {
  (void)put(".letter.txt", "Hidden");
  (void)put("..letter.txt", "More hidden");
  const Tokens tokens = grant(url(letter_));
  EXPECT_EQ(redeem(tokens.sibling).contents(), "Hidden");
  EXPECT_EQ(redeem(tokens.item).contents(), kLetterText);
  // An item that is hidden itself has a sibling of its own.
  const Tokens hidden = grant(url(place(".letter.txt")));
  EXPECT_EQ(redeem(hidden.item).contents(), "Hidden");
  EXPECT_EQ(redeem(hidden.sibling).contents(), "More hidden");
}

TEST_F(Answers, ASiblingIsMadeBesideItsItemAlone) {
  const Tokens none = grant(url(place("missing.txt")));
  ASSERT_TRUE(none.sibling);
  EXPECT_EQ(redeem(none.sibling, Access::readWrite).outcome, kGone);
  EXPECT_EQ(redeem(none.item, Access::readWrite).outcome, kGone);
  EXPECT_FALSE(fs::exists(place(".missing.txt")));
  EXPECT_FALSE(fs::exists(place("missing.txt")));
  EXPECT_EQ(redeem(grant(url(letter_)).sibling, Access::readWrite).outcome, "ok");
  EXPECT_TRUE(fs::exists(place(".letter.txt")));
}

TEST_F(Answers, WhatIsNoSiblingOfTheItemGetsNoToken) {
  fs::create_directories(place("sub/deep"));
  fs::create_directory(place(".sub"));
  for (const char* name : {"sub/file", ".sub/file", "sub/deep/...", "sub/..", "..."}) {
    if (!fs::exists(place(name))) (void)put(name, "Foreign");
  }
  const std::string storage = url(house_.storage(kColluder)).absoluteString();
  // The text of the sibling's URL is the item's with a dot; here that names a file elsewhere, or another item.
  for (const char* name : {"sub%2Ffile", "sub/deep/..", "sub/deep/%2E%2E", "."}) {
    const Tokens tokens = grant(*QXURL::fromString(storage + "/" + name));
    EXPECT_FALSE(tokens.sibling) << name;
    const auto resolved = resolve(storage + "/" + name);
    EXPECT_EQ(resolved.back(), "") << name;
  }
  EXPECT_EQ(redeem(grant(url(place("sub/file"))).sibling, Access::readWrite).outcome, "ok");
}

}  // namespace
}  // namespace docuvend::tests
