// To fill what others need as well: the list of grants.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "acl/DVGrantLimits.h"
#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {
namespace {

using ::testing::Contains;
using ::testing::Each;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr const char* kRefused = "DVErrorDomain 2";
const std::string kAccomplice = "com.orvane.accomplice";

class LimitAttacks : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    installAttacker();
    house_.install(kAccomplice, "docuvend-attacker", stringEntry("QXBundleIdentifier", kAccomplice), {});
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    other_ = house_.putInCloud("other.txt", "Another one\n");
    house_.startDaemon();
    string_ = house_.granted(letter_, kAttacker);
  }

  static std::vector<std::string> numberedNames(const std::string& beginning, std::size_t count) {
    std::vector<std::string> names;
    for (std::size_t i = 1; i <= count; ++i) names.push_back(beginning + std::to_string(i));
    return names;
  }
  // What the attacker, who may write the letter, is told as it passes it on to each of those names.
  [[nodiscard]] std::vector<std::string> passOn(const std::vector<std::string>& consumers, const std::string& as = kAttacker) const {
    std::vector<std::string> words = {"redeem-for", "writing", string_};
    for (const std::string& consumer : consumers) words.insert(words.end(), {"pass-on", letter_, consumer});
    std::vector<std::string> outcomes = linesOf(house_.confined(as, words).output);
    if (outcomes.size() != consumers.size() + 1) {
      ADD_FAILURE() << outcomes.size() << " outcomes";
      return {};
    }
    EXPECT_EQ(outcomes.front(), "ok");
    outcomes.erase(outcomes.begin());
    return outcomes;
  }
  // Somebody else's grant is still written.
  void expectRoomForOthers() const {
    (void)house_.granted(other_, kEditor);
    EXPECT_THAT(house_.accessControl(), HasSubstr("<key>" + kEditor + "</key>"));
  }

  std::string letter_;
  std::string other_;
  std::string string_;
};

TEST_F(LimitAttacks, ANameOfGreatLengthDoesNotFillTheList) {
  const std::string longest(kDVLongestGrantedConsumerID, 'c');
  const auto outcomes = passOn({longest, longest + "c", std::string(std::size_t{1} << 15U, 'c')});
  EXPECT_EQ(outcomes, (std::vector<std::string>{"ok", kRefused, kRefused}));
  EXPECT_THAT(house_.accessControl(), HasSubstr("<key>" + longest + "</key>"));
  EXPECT_THAT(house_.accessControl(), Not(HasSubstr(longest + "c")));
  expectRoomForOthers();
}

TEST_F(LimitAttacks, OneDocumentPassedOnToManyNamesDoesNotFillTheList) {
  const auto names = numberedNames("com.example.", kDVMaximumConsumersOfItem + 3);
  auto outcomes = passOn(names);
  ASSERT_EQ(outcomes.size(), names.size());
  // Half of what there is for those who may write; the attacker is one of the letter's consumers itself.
  constexpr std::size_t kRoom = (kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled) / 2;
  const auto first = outcomes.begin() + static_cast<std::ptrdiff_t>(kRoom);
  EXPECT_THAT(std::vector<std::string>(outcomes.begin(), first), Each("ok"));
  EXPECT_THAT(std::vector<std::string>(first, outcomes.end()), Each(kRefused));
  EXPECT_EQ(house_.loggedContaining("The access control list cannot hold"), static_cast<long>(names.size() - kRoom));
  expectRoomForOthers();
  // Neither is the letter lost to those whom the picker names.
  (void)house_.granted(letter_, kEditor);
}

TEST_F(LimitAttacks, OneOfSeveralWhoMayWriteADocumentCannotUseUpTheRoomOfTheOthers) {
  (void)house_.granted(letter_, kAccomplice);
  const auto first = passOn(numberedNames("com.example.", kDVMaximumConsumersOfItem));
  EXPECT_THAT(first, Contains("ok"));
  EXPECT_THAT(first, Contains(kRefused));
  EXPECT_THAT(passOn(numberedNames("com.orvane.friend.", 3), kAccomplice), Each("ok"));
  // However often it comes back.
  EXPECT_THAT(passOn(numberedNames("com.example.more.", 3)), Each(kRefused));
  EXPECT_THAT(passOn({"com.orvane.friend.4"}, kAccomplice), Each("ok"));
}

}  // namespace
}  // namespace docuvend::tests
