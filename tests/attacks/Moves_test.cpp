// A provider that moves what it has, after it was granted: its storage, an item, the container of its group.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;
using ::testing::ElementsAre;

const std::string kOther = "com.orvane.other";

class Moves : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("diary.txt");
    tokens_ = grant(url(letter_));
    ASSERT_EQ(redeem(tokens_.item).contents(), kLetterText);
    ASSERT_TRUE(tokens_.sibling);
  }
  void TearDown() override {
    EXPECT_EQ(contentsOf(diary()), kDiaryText);
    EXPECT_FALSE(fs::exists(house_.document(".diary.txt")));
  }
  void expectNothingOpens(const char* outcome) {
    EXPECT_EQ(redeem(tokens_.item).outcome, outcome);
    EXPECT_EQ(redeem(tokens_.item, Access::readWrite).outcome, outcome);
    EXPECT_EQ(redeem(tokens_.sibling, Access::readWrite).outcome, outcome);
    EXPECT_EQ(replace(tokens_.item, tokens_.sibling), outcome);
  }

  std::string letter_;
  Tokens tokens_;
};

TEST_F(Moves, AStorageThatIsMovedAwayTakesItsTokensWithIt) {
  const std::string storage = house_.storage(kColluder);
  const std::string away = storage + ".away";
  fs::rename(storage, away);
  expectNothingOpens(kGone);
  // What stands in its place is not left by a link.
  fs::create_directory_symlink(house_.storage(kCellar), storage);
  expectNothingOpens(kNotRegularFile);
  EXPECT_EQ(grant(url(letter_)).outcome, "DVErrorDomain 9");
  EXPECT_THAT(attack({"resolve", stringFor("diary.txt")}), ElementsAre(kNotPermitted));
  fs::remove(storage);
  fs::rename(away, storage);
  EXPECT_EQ(redeem(tokens_.item).contents(), kLetterText);
  EXPECT_EQ(redeem(grant(url(letter_)).item).contents(), kLetterText);
}

TEST_F(Moves, AStorageMovedIntoAnotherProvidersDirectoryIsNotThatOnesAndItsTokensOpenNothing) {
  const std::string storage = house_.storage(kColluder);
  const std::string inside = house_.document("moved");
  fs::rename(storage, inside);
  expectNothingOpens(kGone);
  EXPECT_EQ(grant(url(inside + "/diary.txt")).outcome, "DVErrorDomain 9");
  EXPECT_EQ(grant(url(letter_)).outcome, "DVErrorDomain 9");
  whisper("url", url(inside + "/diary.txt").absoluteString());
  EXPECT_THAT(attack({"resolve", stringFor("diary.txt")}), ElementsAre(kNotPermitted));
  fs::rename(inside, storage);
  fs::remove(house_.container(kColluder) + "/url");
  EXPECT_THAT(attack({"resolve", stringFor("diary.txt"), "open", "read", "contents"}),
              ElementsAre(url(letter_).absoluteString(), "ok", kLetterText));
}

TEST_F(Moves, AnItemMovedToAnotherProviderIsGrantedByThatOneAlone) {
  installColluder(kOther);
  eventually("the other provider is known",
             [this] { return house_.loggedContaining("[INFO] Registered docuvend extension " + kOther + " for path ") == 1; });
  const std::string theirs = house_.storage(kOther) + "/diary.txt";
  fs::rename(letter_, theirs);
  EXPECT_EQ(redeem(tokens_.item).outcome, kGone);
  EXPECT_EQ(redeem(tokens_.sibling, Access::readWrite).outcome, kGone) << "it has no item any more";
  EXPECT_EQ(grant(url(theirs)).outcome, "DVErrorDomain 9");
  whisper("url", url(theirs).absoluteString());
  EXPECT_THAT(attack({"resolve", stringFor("diary.txt")}), ElementsAre(kNotPermitted));
  // Nor by another name of it at the old place.
  fs::create_symlink(theirs, letter_);
  EXPECT_EQ(redeem(tokens_.item).outcome, kNotRegularFile);
  fs::remove(letter_);
  fs::create_hard_link(theirs, letter_);
  EXPECT_EQ(redeem(tokens_.item).outcome, kNotRegularFile);
  fs::remove(letter_);

  const Tokens granted = grant(url(theirs), kOther);
  EXPECT_EQ(redeem(granted.item).contents(), kLetterText);
}

TEST_F(Moves, AnItemMovedOutOfEveryStorageIsNoItem) {
  for (const std::string& place : {house_.container(kColluder) + "/diary.txt", house_.home() + "/diary.txt"}) {
    fs::rename(letter_, place);
    EXPECT_EQ(redeem(tokens_.item).outcome, kGone);
    EXPECT_EQ(grant(url(place)).outcome, "DVErrorDomain 9");
    whisper("url", url(place).absoluteString());
    EXPECT_THAT(attack({"resolve", stringFor("diary.txt")}), ElementsAre(kNotPermitted)) << place;
    fs::create_symlink(place, letter_);
    EXPECT_EQ(redeem(tokens_.item).outcome, kNotRegularFile);
    fs::remove(letter_);
    fs::rename(place, letter_);
  }
  EXPECT_EQ(redeem(tokens_.item).contents(), kLetterText);
}

// Its containers are mounts where it runs.
TEST_F(Moves, AProviderCannotExchangeItsContainersForLinks) {
  const std::string identifier = kAttacker + ".extension1";
  const std::string group = fs::path(house_.storage(identifier)).parent_path();
  const std::string container = house_.container(identifier);
  const std::string cellars = fs::path(house_.storage(kCellar)).parent_path();
  const auto lines = attackAsExtension({"move",
                                        group,
                                        group + ".away",
                                        "move",
                                        container,
                                        container + ".away",
                                        "remove",
                                        group,
                                        "symlink",
                                        group,
                                        cellars,
                                        "move",
                                        group,
                                        container + "/away",
                                        "symlink",
                                        group + "/Docuvend Storage",
                                        cellars,
                                        "make",
                                        group + "/file",
                                        "make",
                                        container + "/file"});
  ASSERT_EQ(lines.size(), 8U);
  for (std::size_t i = 0; i < 5; ++i) EXPECT_THAT(lines[i], AnyOf("EBUSY", "EROFS", "EXDEV", "EACCES", "EEXIST", "ENOENT")) << i;
  EXPECT_EQ(std::vector(lines.begin() + 5, lines.end()), (std::vector<std::string>{"ok", "ok", "ok"}));
  for (const std::string& directory : {group, container}) EXPECT_TRUE(fs::is_directory(fs::symlink_status(directory))) << directory;
  // What it may do is in its own group, and no storage.
  EXPECT_EQ(grant(url(group + "/Docuvend Storage/Docuvend Storage/diary.txt"), identifier).outcome.substr(0, 13), "DVErrorDomain");
}

}  // namespace
}  // namespace docuvend::tests
