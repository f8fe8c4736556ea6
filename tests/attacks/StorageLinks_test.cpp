// A provider whose storage is a link: what lies where it leads is not the provider's.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::Not;

// Providers are asked one after another whether a file is theirs, in the order of their identifiers: one before the cellar and one after
// it.
const std::string kFirst = "com.orvane.a";
const std::string kLast = "com.orvane.z";

class StorageLinks : public FileAttackTest {
 protected:
  // The provider, with its storage made a link by itself.
  void installLinked(const std::string& identifier, const std::string& target) const {
    whisper("storage", target, identifier);
    installColluder(identifier);
    eventually("the provider is known, and has run", [this, &identifier] { return fs::is_symlink(house_.storage(identifier)); });
    eventually("the provider is registered", [this, &identifier] {
      return house_.loggedContaining("[INFO] Registered docuvend extension " + identifier + " for path ") == 1;
    });
  }
};

TEST_F(StorageLinks, ALinkToAnotherProvidersDocumentsMakesThemNobodyElses) {
  const std::string own = put("own.txt");
  for (const std::string& identifier : {kFirst, kLast}) {
    // The accomplice has been granted an item of the provider's, and that item turns out to be the diary.
    installLinked(identifier, house_.storage(kCellar));
    const std::string theirs = house_.storage(identifier) + "/diary.txt";
    EXPECT_EQ(grant(url(theirs), identifier).outcome, "DVErrorDomain 9");
    for (const std::string& answer : {diary(), theirs}) {
      whisper("url", url(answer).absoluteString(), identifier);
      EXPECT_THAT(attack({"resolve", stringFor("diary.txt", identifier)}), ElementsAre(kNotPermitted)) << answer;
    }
  }
  ASSERT_EQ(grant(url(own)).outcome, "ok");
  EXPECT_THAT(attack({"resolve", stringFor("own.txt"), "open", "read", "contents"}),
              ElementsAre(url(own).absoluteString(), "ok", kLetterText));
}

TEST_F(StorageLinks, ALinkToTheUsersHomeMakesNoFileInItTheProviders) {
  installLinked(kFirst, house_.home());
  const std::string notes = house_.home() + "/notes.txt";
  writeFile(notes, "");
  // Nobody is asked for the contents, and nobody is told of the change.
  EXPECT_EQ(house_.ctl({"write", notes}, "mine").status, 0);
  EXPECT_EQ(house_.ctl({"read", notes}).output, "mine");
  EXPECT_EQ(contentsOf(notes), "mine");
  EXPECT_EQ(house_.ctl({"bookmark", notes}).output, "");
  EXPECT_EQ(house_.ctl({"bookmark", diary()}).output.substr(0, stringFor("", kCellar).size()), stringFor("", kCellar));
  EXPECT_EQ(house_.loggedContaining("[INFO] Resolved URL to provider " + kFirst), 0);
}

}  // namespace
}  // namespace docuvend::tests
