// A provider that exchanges names while the daemon looks at them: a directory with a link to another provider's documents, and a file with
// a link to one. The daemon must never open, make, rename or write anything where the links lead.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdio.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <future>
#include <iostream>
#include <map>
#include <optional>

#include "tests/attacks/FileAttackTest.h"
#include "tests/support/Sanitizers.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;

// Each round is a request to another process, and the provider exchanges the names several times during each. The check and the use by
// themselves go through the same races in one process in TokenRedeemer_test.cpp.
//
// There are as many rounds as fit in this time, or as many as the variable says.
constexpr std::chrono::seconds kTime{kSanitized ? 5 : 10};
constexpr int kFewestRounds = 50;
constexpr const char* kRoundsVariable = "DOCUVEND_SWAP_ROUNDS";
// What is asked of a provider is not to take longer than tests wait.
constexpr std::chrono::seconds kLongestExchange{20};

class Rounds {
 public:
  Rounds() {
    if (const char* number = std::getenv(kRoundsVariable)) wanted_ = std::atoi(number);
  }
  [[nodiscard]] int done() const { return done_; }
  // False when there have been enough.
  bool next() {
    if (done_ == 0) end_ = std::chrono::steady_clock::now() + kTime;
    const bool isEnough = wanted_ ? done_ >= *wanted_ : done_ >= kFewestRounds && std::chrono::steady_clock::now() >= end_;
    if (!isEnough) ++done_;
    return !isEnough;
  }

 private:
  std::optional<int> wanted_;
  std::chrono::steady_clock::time_point end_;
  int done_ = 0;
};

class Swaps : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    // The directory, and a link in its place behind which there are files of the same names.
    fs::create_directory(place("way"));
    letter_ = put("way/diary.txt");
    fs::create_directory_symlink(house_.storage(kCellar), place("way.decoy"));
    // The file, and a link in its place.
    note_ = put("note.txt");
    fs::create_symlink(diary(), place("note.txt.decoy"));
  }
  void TearDown() override {
    stopExchanging();
    RecordProperty("rounds", rounds_.done());
    std::cout << rounds_.done() << " rounds\n";
    EXPECT_EQ(contentsOf(diary()), kDiaryText);
    EXPECT_FALSE(fs::exists(house_.document(".diary.txt")));
  }

  // Has the provider exchange an item and its decoy from now on.
  void startExchanging(const std::string& name) {
    ASSERT_EQ(grant(url(place(name))).outcome, "ok");
    exchanged_ = name;
    since_ = std::chrono::steady_clock::now();
    exchanging_ = std::async(std::launch::async, [this, item = url(place(name))] {
      const auto accomplice = house_.client(kPicker);
      return errorOf(accomplice->ask<&DVDaemon::startProvidingItemAtURL>(item, ProviderID{kColluder}, ConsumerID{kAttacker}));
    });
  }
  void stopExchanging() {
    if (!exchanging_.valid()) return;
    whisper("enough", "");
    EXPECT_EQ(exchanging_.get(), std::nullopt);
    EXPECT_TRUE(house_.awaitLog("has exchanged "));
    fs::remove(house_.container(kColluder) + "/enough");
  }
  // Another round, while the names are exchanged.
  bool goesOn() {
    if (std::chrono::steady_clock::now() - since_ > kLongestExchange) {
      stopExchanging();
      const std::string name = place(exchanged_);
      if (fs::is_symlink(name)) {
        EXPECT_EQ(::renameat2(AT_FDCWD, name.c_str(), AT_FDCWD, (name + ".decoy").c_str(), RENAME_EXCHANGE), 0);
      }
      startExchanging(exchanged_);
    }
    return rounds_.next();
  }

  // Redeems the token many times; how often each outcome came.
  std::map<std::string, int> redeemAgainAndAgain(const std::optional<QXData>& token) {
    std::map<std::string, int> outcomes;
    while (goesOn()) {
      const Opened opened = redeem(token, rounds_.done() % 2 == 0 ? Access::read : Access::readWrite);
      ++outcomes[opened.file ? opened.contents() : opened.outcome];
    }
    return outcomes;
  }
  // The letter was opened, a link was seen and refused, and nothing else ever happened.
  static void expectOnlyTheLetter(const std::map<std::string, int>& outcomes) {
    for (const auto& [outcome, count] : outcomes) {
      EXPECT_THAT(outcome, AnyOf(kLetterText, kNotRegularFile, kBusy, kGone)) << count;
    }
    EXPECT_TRUE(outcomes.contains(kLetterText));
    EXPECT_TRUE(outcomes.contains(kNotRegularFile));
  }

  std::string letter_;
  std::string note_;
  Rounds rounds_;
  std::future<std::optional<QXError>> exchanging_;
  std::string exchanged_;
  std::chrono::steady_clock::time_point since_;
};

TEST_F(Swaps, ADirectoryExchangedWithALinkIsNeverLeftOnRedemption) {
  const auto token = grant(url(letter_)).item;
  ASSERT_EQ(redeem(token).contents(), kLetterText);
  startExchanging("way");
  expectOnlyTheLetter(redeemAgainAndAgain(token));
}

TEST_F(Swaps, AFileExchangedWithALinkIsNeverFollowedOnRedemption) {
  const auto token = grant(url(note_)).item;
  ASSERT_EQ(redeem(token).contents(), kLetterText);
  startExchanging("note.txt");
  expectOnlyTheLetter(redeemAgainAndAgain(token));
}

TEST_F(Swaps, NoTokenIsIssuedForWhatLiesBehindALinkThatIsExchanged) {
  ASSERT_EQ(redeem(grant(url(letter_)).item).contents(), kLetterText);
  startExchanging("way");
  std::map<std::string, int> outcomes;
  std::vector<QXData> issued;
  while (goesOn()) {
    const Tokens tokens = grant(url(letter_));
    ++outcomes[tokens.item ? "issued" : tokens.outcome];
    // A token that was issued while a link was there could only be for where it leads.
    for (const auto& token : {tokens.item, tokens.sibling}) {
      EXPECT_TRUE(!token || token->text().find(kCellar + ".documents") == std::string::npos);
    }
    if (tokens.item) issued.push_back(*tokens.item);
  }
  stopExchanging();
  EXPECT_GT(outcomes["issued"], 0);
  // The file lay in another provider's storage, or the way to it was a link.
  EXPECT_GT(outcomes["DVErrorDomain 9"] + outcomes["ok"], 0);
  for (const auto& [outcome, count] : outcomes) EXPECT_THAT(outcome, AnyOf("issued", "ok", "DVErrorDomain 9")) << count;
  for (const QXData& token : issued) EXPECT_THAT(redeem(token).contents(), AnyOf(kLetterText, kNotRegularFile));
}

TEST_F(Swaps, NoHiddenSiblingIsMadeNorRenamedBehindALinkThatIsExchanged) {
  const Tokens tokens = grant(url(letter_));
  ASSERT_EQ(redeem(tokens.sibling, Access::readWrite).outcome, "ok");
  ASSERT_EQ(replace(tokens.item, tokens.sibling), "ok");
  writeFile(letter_, kLetterText);
  startExchanging("way");
  std::map<std::string, int> made;
  std::map<std::string, int> replaced;
  while (goesOn()) {
    const Opened sibling = redeem(tokens.sibling, Access::readWrite);
    ++made[sibling.outcome];
    if (sibling.file) {
      EXPECT_EQ(::pwrite(sibling.file->number, kLetterText, std::string(kLetterText).size(), 0), 8);
    }
    ++replaced[replace(tokens.item, tokens.sibling)];
  }
  for (const auto& outcomes : {made, replaced}) {
    EXPECT_TRUE(outcomes.contains("ok"));
    EXPECT_TRUE(outcomes.contains(kNotRegularFile));
    for (const auto& [outcome, count] : outcomes) EXPECT_THAT(outcome, AnyOf("ok", kNotRegularFile, kGone, kBusy)) << count;
  }
}

}  // namespace
}  // namespace docuvend::tests
