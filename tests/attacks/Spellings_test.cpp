// Every operation that takes an item's URL, asked with every spelling of a way out of the provider's directory: single and double dots,
// doubled slashes, percent escapes of each. None reaches another provider's document; the same operation does its work for the honest URL.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <functional>

#include "tests/attacks/FileAttackTest.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;
using ::testing::Each;

// An operation, what it answers to the honest URL, and what to any other.
struct Operation {
  std::string name;
  std::function<std::string(const QXURL&)> ask;
  std::string honest;
  ::testing::Matcher<std::string> refusal;
};

class Spellings : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    fs::create_directory(place("sub"));
    storage_ = url(house_.storage(kColluder)).absoluteString();
    ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  }
  void TearDown() override { EXPECT_EQ(contentsOf(diary()), kDiaryText); }

  // Ways to the diary, if one goes them; from the colluder's storage.
  [[nodiscard]] std::vector<std::string> waysOut() const {
    const std::string there = kCellar + ".documents/Docuvend%20Storage/diary.txt";
    std::vector<std::string> ways;
    for (const char* up : {"/../../", "//..//..//", "/./.././../", "/%2e%2e/%2e%2e/", "/%2E%2E/%2E%2E/", "/.%2e/%2E./", "/sub/../../../",
                           "/letter.txt/../../../", "/missing/../../../", "%2F..%2F..%2F", "/..%2F..%2F", "/%2e%2e%2f%2e%2e%2f",
                           "//%2E%2E//%2e%2E//", "/sub%2F..%2F..%2F..%2F"}) {
      ways.push_back(storage_ + up + there);
    }
    ways.push_back(url(diary()).absoluteString());
    return ways;
  }
  // The directory itself, and what lies above it.
  [[nodiscard]] std::vector<std::string> directories() const {
    std::vector<std::string> ways;
    for (const char* end :
         {"", "/", "//", "/.", "/./", "/%2e", "/..", "/../", "/%2E%2e", "/sub/..", "/sub/%2e%2E/", "/../..", "%2F", "%2F.."}) {
      ways.push_back(storage_ + end);
    }
    return ways;
  }
  static QXURL parsed(const std::string& text) {
    const auto url = QXURL::fromString(text);
    EXPECT_TRUE(url) << text;
    return url.value_or(QXURL::fileURL("/", QXURLKind::directory));
  }

  [[nodiscard]] std::vector<Operation> operations() {
    const ProviderID provider{kColluder};
    const ConsumerID consumer{kAttacker};
    // What starting and stopping say of a URL that is another provider's, or nobody's.
    const auto notItsOwn = AnyOf("DVErrorDomain 5 < DVErrorDomain 4", "DVErrorDomain 5 < DVErrorDomain 5");
    return {
        {"grant",
         [this](const QXURL& url) {
           const Tokens tokens = grant(url);
           return tokens.outcome + (tokens.item || tokens.sibling ? " with tokens" : "");
         },
         "ok with tokens", "DVErrorDomain 9"},
        {"start",
         [this, provider, consumer](const QXURL& url) {
           return told(errorOf(picker_->ask<&DVDaemon::startProvidingItemAtURL>(url, provider, consumer)));
         },
         "ok", notItsOwn},
        {"stop",
         [this, provider, consumer](const QXURL& url) {
           return told(errorOf(picker_->ask<&DVDaemon::stopProvidingItemAtURL>(url, provider, consumer)));
         },
         "DVErrorDomain 7", notItsOwn},
        // The string names the provider in whose directory the file is, or there is none.
        {"name",
         [this](const QXURL& url) {
           const auto named = picker_->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(url);
           if (const auto error = errorOf(named)) return told(error);
           const auto& string = std::get<0>(std::get<0>(named));
           if (!string) return std::string("nobody's");
           return std::string(string->starts_with(stringFor("")) ? "the colluder's" : "another's");
         },
         "the colluder's", AnyOf("nobody's", "another's", "DVErrorDomain 7 < CellarErrorDomain 1")},
    };
  }

  std::string letter_;
  std::string storage_;
};

TEST_F(Spellings, NoSpellingOfAWayToAnothersDocumentIsServedByAnyOperation) {
  for (const Operation& operation : operations()) {
    for (const std::string& way : waysOut()) EXPECT_THAT(operation.ask(parsed(way)), operation.refusal) << operation.name << " " << way;
    EXPECT_EQ(operation.ask(url(letter_)), operation.honest) << operation.name;
  }
}

TEST_F(Spellings, TheProvidersDirectoryItselfAndWhatLiesAboveItAreNoItemsInAnySpelling) {
  for (const Operation& operation : operations()) {
    for (const std::string& way : directories()) EXPECT_THAT(operation.ask(parsed(way)), operation.refusal) << operation.name << " " << way;
    EXPECT_EQ(operation.ask(url(letter_)), operation.honest) << operation.name;
  }
}

// The provider is found by its identifier here, whatever the URL is: what it may do with it is what it may do anyway.
TEST_F(Spellings, APlaceholderIsAskedOfTheNamedProviderAloneWhateverTheURL) {
  for (const std::string& way : waysOut()) {
    const auto asked = picker_->ask<&DVDaemon::providePlaceholderForItemAtURL>(parsed(way), ProviderID{kColluder}, ConsumerID{kAttacker});
    EXPECT_THAT(told(errorOf(asked)), AnyOf("ok", kNotPermitted)) << way;
  }
  EXPECT_EQ(house_.loggedContaining("[DEBUG] Successfully got item ID “letter.txt”"), 1);
  EXPECT_EQ(
      told(errorOf(picker_->ask<&DVDaemon::providePlaceholderForItemAtURL>(url(letter_), ProviderID{kColluder}, ConsumerID{kAttacker}))),
      "ok");
  EXPECT_EQ(house_.loggedContaining("[DEBUG] Successfully got item ID “letter.txt”"), 2);
}

TEST_F(Spellings, ASecondSpellingOfAnItemIsThatItemOrGetsNoToken) {
  for (const char* way :
       {"//letter.txt", "/%6Cetter.txt", "/./letter.txt", "/sub/../letter.txt", "/%2e/letter.txt", "/sub/%2E%2e/letter.txt",
        "/../Docuvend%20Storage/letter.txt", "/letter.txt/", "/letter.txt/.", "/letter.txt//", "/letter%2Etxt"}) {
    const Tokens tokens = grant(parsed(storage_ + way));
    if (tokens.item) {
      EXPECT_EQ(redeem(tokens.item).contents(), kLetterText) << way;
    }
    if (tokens.sibling) {
      const Opened sibling = redeem(tokens.sibling, Access::readWrite);
      EXPECT_THAT(sibling.outcome, AnyOf("ok", kGone)) << way;
      EXPECT_EQ(fs::exists(place(".letter.txt")), sibling.file.has_value()) << way;
      fs::remove(place(".letter.txt"));
    }
  }
  EXPECT_EQ(redeem(grant(url(letter_)).item).contents(), kLetterText);
}

TEST_F(Spellings, AConfinedApplicationPassesOnAndTakesTurnsAtNothingByASpelling) {
  std::vector<std::string> words;
  std::size_t attempts = 0;
  for (const std::string& way : waysOut()) {
    words.insert(words.end(), {"extend", way, kPicker, "turn", "reading", way, "turn", "writing", way, "holders", way});
    attempts += 4;
  }
  const auto refused = attack(words);
  EXPECT_EQ(refused.size(), attempts);
  EXPECT_THAT(refused, Each(AnyOf(kNotPermitted, kNoTurn, "QXFileCoordinationErrorDomain 8")));
  const std::string own = url(house_.container(kAttacker) + "/own.txt").absoluteString();
  EXPECT_THAT(attack({"make", "own.txt", "turn", "writing", own, "turn", "reading", own, "holders", own}),
              ::testing::ElementsAre("ok", "ok", "ok", "0"));
}

}  // namespace
}  // namespace docuvend::tests
