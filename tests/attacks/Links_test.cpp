// Links that an application makes in its own directory, to documents of a provider that goes by the last component of what it is asked:
// what the application may do with one document must not become a grant for another.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdio.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <thread>

#include "tests/attacks/FileAttackTest.h"
#include "tests/support/Sanitizers.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;
using ::testing::ElementsAre;

constexpr int kAttempts = 100;
constexpr int kRounds = kSanitized ? 5 : 20;

class Links : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    secret_ = put("secret.txt", kDiaryText);
    way_ = house_.container(kAttacker) + "/way";
    fs::create_directories(way_);
    writeFile(way_ + "/secret.txt", "mine");
  }
  void TearDown() override {
    EXPECT_THAT(attack({"resolve", stringFor("secret.txt")}), ElementsAre(kNotPermitted));
    EXPECT_EQ(contentsOf(secret_), kDiaryText);
  }
  // The words that pass a file on to the attacker itself.
  [[nodiscard]] static std::vector<std::string> passOn(const std::string& path) { return {"extend", url(path).absoluteString(), kAttacker}; }

  std::string letter_;
  std::string secret_;
  std::string way_;  // a directory in the attacker's container
};

TEST_F(Links, ALinkThatIsNamedLikeAnotherDocumentPassesOnTheDocumentBehindIt) {
  ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  const std::string link = way_ + "/renamed/secret.txt";
  fs::create_directory(way_ + "/renamed");
  fs::create_symlink(letter_, link);
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "write", "extend", url(link).absoluteString(), kAttacker}),
              ElementsAre(url(letter_).absoluteString(), "ok", stringFor("letter.txt")));
}

TEST_F(Links, DotsAfterALinkPassOnTheDocumentThatTheyLeadTo) {
  ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  // By its text the way leads from the container up and to the secret; over the link it leads back to a link to the letter.
  const std::string container = house_.container(kAttacker);
  const std::string inside = container + "/1/2";
  fs::create_directories(inside);
  fs::create_directory_symlink(inside, container + "/link");
  const std::string text = container + "/link/../secret.txt";
  fs::create_symlink(letter_, container + "/1/secret.txt");
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "write", "extend", "file://" + text, kAttacker}),
              ElementsAre(url(letter_).absoluteString(), "ok", stringFor("letter.txt")));
}

// A link in the attacker's container whose text is the name of a thing that the attacker cannot see.
TEST_F(Links, TheProviderLearnsNoNamesThatLinksLeadToOutsideOfDocuments) {
  const std::string secret = house_.home() + "/tax-2026.txt";
  writeFile(secret, "mine");
  const std::string link = way_ + "/peek";
  fs::create_symlink(secret, link);
  EXPECT_EQ(grant(url(link)).outcome, "DVErrorDomain 9");
  EXPECT_EQ(house_.loggedContaining("Successfully got item ID “peek”"), 1);
  EXPECT_EQ(house_.loggedContaining("tax-2026"), 0);
  EXPECT_EQ(grant(url(letter_)).outcome, "ok");
}

TEST_F(Links, AnOwnDirectoryExchangedWithALinkToTheProvidersPassesOnNothing) {
  const std::string decoy = way_ + ".decoy";
  fs::create_directory_symlink(house_.storage(kColluder), decoy);
  std::atomic<bool> isEnough = false;
  std::thread exchanging([this, &decoy, &isEnough] {
    while (!isEnough) ::renameat2(AT_FDCWD, way_.c_str(), AT_FDCWD, decoy.c_str(), RENAME_EXCHANGE);
  });
  std::vector<std::string> words;
  for (int i = 0; i < kAttempts; ++i) {
    for (const std::string& word : passOn(way_ + "/secret.txt")) words.push_back(word);
  }
  int unowned = 0;
  int refused = 0;
  for (int round = 0; round < kRounds; ++round) {
    for (const std::string& outcome : attack(words)) {
      EXPECT_THAT(outcome, AnyOf(kNotPermitted, "DVErrorDomain 6"));
      ++(outcome == kNotPermitted ? refused : unowned);
    }
  }
  isEnough = true;
  exchanging.join();
  EXPECT_GT(unowned, 0) << "it was the attacker's own file";
  EXPECT_GT(refused, 0) << "it was the provider's";
  EXPECT_EQ(house_.loggedContaining("got item ID"), 0) << "and the provider was never asked";
  // Who may write a document passes it on.
  ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  std::vector<std::string> honest = {"resolve", stringFor("letter.txt"), "open", "write"};
  for (const std::string& word : passOn(letter_)) honest.push_back(word);
  EXPECT_THAT(attack(honest), ElementsAre(url(letter_).absoluteString(), "ok", stringFor("letter.txt")));
}

}  // namespace
}  // namespace docuvend::tests
