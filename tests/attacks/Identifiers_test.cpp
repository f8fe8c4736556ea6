// A provider that answers an empty identifier: it is an identifier like any other in the list, names nothing in a string, and opens nothing
// but what the provider calls by it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/attacks/FileAttackTest.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class EmptyIdentifiers : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    other_ = put("other.txt", "Another one");
  }
  std::string start(const std::string& path) {
    return told(errorOf(picker_->ask<&DVDaemon::startProvidingItemAtURL>(url(path), ProviderID{kColluder}, ConsumerID{kAttacker})));
  }

  std::string letter_;
  std::string other_;
};

TEST_F(EmptyIdentifiers, AGrantOfOneIsForThatOneAlone) {
  whisper("identifier", "");
  const Tokens tokens = grant(url(letter_));
  ASSERT_EQ(tokens.outcome, "ok");
  EXPECT_EQ(redeem(tokens.item).contents(), kLetterText);
  EXPECT_EQ(start(letter_), "ok");
  whisper("identifier", "other.txt");
  EXPECT_EQ(start(other_), kNotPermitted);
  EXPECT_THAT(attack({"resolve", stringFor("other.txt")}), ElementsAre(kNotPermitted));
  EXPECT_EQ(grant(url(other_)).outcome, "ok");
  EXPECT_EQ(start(other_), "ok");
}

TEST_F(EmptyIdentifiers, AStringWithOneIsNone) {
  whisper("identifier", "");
  ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  for (const std::string& string : {stringFor(""), stringFor("/"), stringFor("/letter.txt"), std::string("docuvend:" + kColluder),
                                    std::string("docuvend:/letter.txt"), std::string("docuvend:")}) {
    EXPECT_THAT(attack({"resolve", string}), ElementsAre("DVErrorDomain 3")) << string;
  }
  whisper("identifier", "letter.txt");
  ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt")}), ElementsAre(url(letter_).absoluteString()));
}

TEST_F(EmptyIdentifiers, TheListKeepsOneAndItCanBeTakenBack) {
  whisper("identifier", "");
  const Tokens tokens = grant(url(letter_));
  ASSERT_EQ(tokens.outcome, "ok");
  house_.killDaemon();
  house_.startDaemon();
  picker_ = house_.client(kPicker);
  redeemer_ = house_.client(std::nullopt, linux_platform::kSandboxServiceName);
  EXPECT_EQ(start(letter_), "ok");
  const Ending grants = house_.ctl({"grants"});
  EXPECT_EQ(grants.status, 0) << grants.errors;
  EXPECT_THAT(grants.output, HasSubstr(kColluder));
  const Ending revoked = house_.ctl({"revoke", kColluder, "", kAttacker});
  EXPECT_EQ(revoked.status, 0) << revoked.errors;
  EXPECT_EQ(start(letter_), kNotPermitted);
  EXPECT_EQ(redeem(tokens.item).outcome, kBadToken);
  EXPECT_EQ(house_.accessControl().find(kColluder), std::string::npos);
}

}  // namespace
}  // namespace docuvend::tests
