#include "platform/linux/bundles/GroupMembership.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

ParsedBundle named(const std::string& identifier, BundleOrigin origin = BundleOrigin::user) {
  ParsedBundle parsed;
  parsed.bundle.identifier = identifier;
  parsed.origin = origin;
  return parsed;
}

std::string ownerOf(const std::string& group, const std::vector<ParsedBundle>& bundles) {
  const auto* owner = ownerByName(group, bundles);
  return owner == nullptr ? "" : owner->bundle.identifier;
}

class GroupMembershipTest : public ::testing::Test {
 protected:
  void record(const std::string& group, const std::string& owner) const {
    const auto recorded = owners_.record(group, owner);
    ASSERT_TRUE(std::holds_alternative<std::string>(recorded)) << std::get<QXError>(recorded).description();
  }
  // Empty when the bundle may belong to the group.
  [[nodiscard]] std::string refusal(const std::string& identifier, const std::string& group,
                                    const std::vector<ParsedBundle>& bundles) const {
    const auto answer = GroupMembership(bundles, owners_).admit(identifier, group);
    const auto* refusal = std::get_if<GroupMembership::Refusal>(&answer);
    return refusal == nullptr ? "" : refusal->text;
  }

  BundleHouse house_;
  const GroupOwners owners_{house_.paths.groupOwners};
};

TEST_F(GroupMembershipTest, TheLongestBeginningOwnsAGroupAndTheWholeNameIsNone) {
  const std::vector<ParsedBundle> bundles = {named("org.a"), named("org.a.b"), named("org.a.bc"), named("org.a.b.documents")};
  EXPECT_EQ(ownerOf("org.a.documents", bundles), "org.a");
  EXPECT_EQ(ownerOf("org.a.b.documents", bundles), "org.a.b");
  EXPECT_EQ(ownerOf("org.a.bc", bundles), "org.a");
  EXPECT_EQ(ownerOf("org.a", bundles), "");
  EXPECT_EQ(ownerOf("group.org.a", bundles), "");
  EXPECT_EQ(ownerOf("org.abc", bundles), "");
}

TEST_F(GroupMembershipTest, ABundleOfTheSystemsComesBeforeALongerOneOfTheUsers) {
  const auto users = named("org.a.b");
  const auto systems = named("org.a", BundleOrigin::system);
  const auto longer = named("org.a.b.c", BundleOrigin::system);
  for (const auto& bundles : {std::vector{users, systems}, std::vector{systems, users}}) {
    EXPECT_EQ(ownerOf("org.a.b.documents", bundles), "org.a");
  }
  EXPECT_EQ(ownerOf("org.a.b.c.documents", {longer, systems}), "org.a.b.c");
  EXPECT_EQ(ownerOf("org.a.b.c.documents", {systems, longer}), "org.a.b.c");
}

TEST_F(GroupMembershipTest, OnlyTheOwnerAndWhomItNamesBelong) {
  auto owner = named("org.a");
  owner.groupMembers["org.a.one"] = {"org.friend"};
  auto stranger = named("org.stranger");
  stranger.groupMembers["org.a.one"] = {"org.stranger"};
  const std::vector<ParsedBundle> bundles = {owner, stranger, named("org.friend")};
  EXPECT_EQ(refusal("org.a", "org.a.one", bundles), "");
  EXPECT_EQ(refusal("org.friend", "org.a.one", bundles), "");
  EXPECT_EQ(refusal("org.friend", "org.a.two", bundles), "The bundle org.friend may not belong to the group org.a.two, which is org.a's");
  EXPECT_EQ(refusal("org.stranger", "org.a.one", bundles),
            "The bundle org.stranger may not belong to the group org.a.one, which is org.a's");
  EXPECT_EQ(refusal("org.a", "com.b", bundles), "The bundle org.a may not belong to the group com.b");
}

TEST_F(GroupMembershipTest, TheRecordedOwnerKeepsItsGroupWhateverIsInstalled) {
  record("org.a.b.documents", "org.a");
  auto later = named("org.a.b", BundleOrigin::system);
  later.groupMembers["org.a.b.documents"] = {"org.friend"};
  auto owner = named("org.a");
  const std::string group = "org.a.b.documents";
  for (const std::string& other : {std::string("org.a.b"), std::string("org.friend")}) {
    const std::string expected = "The bundle " + other + " may not belong to the group " + group + ", which is org.a's";
    EXPECT_EQ(refusal(other, group, {owner, later}), expected);
    EXPECT_EQ(refusal(other, group, {later}), expected) << "the owner is not installed";
  }
  EXPECT_EQ(refusal("org.a", group, {owner, later}), "");
  owner.groupMembers[group] = {"org.friend"};
  EXPECT_EQ(refusal("org.friend", group, {owner, later}), "");
}

TEST_F(GroupMembershipTest, ARecordThatSaysNothingIsNobodysLeave) {
  record("org.a.documents", "org.a");
  BundleHouse::write(house_.paths.groupOwners + "/org.a.documents", "x");
  EXPECT_THAT(refusal("org.a", "org.a.documents", {named("org.a")}), HasSubstr("It is not known whose the group org.a.documents is: "));
}

TEST_F(GroupMembershipTest, OnlyTheOwnerNamesMembers) {
  auto owner = named("org.a");
  owner.groupMembers["org.a.documents"] = {"org.c"};
  auto other = named("org.b");
  other.groupMembers["org.a.documents"] = {"org.c"};
  other.groupMembers["org.z.documents"] = {"org.c"};
  const std::vector<ParsedBundle> bundles = {owner, other};
  const GroupMembership membership(bundles, owners_);
  EXPECT_THAT(membership.foreignLists(owner), IsEmpty());
  EXPECT_THAT(membership.foreignLists(other),
              ElementsAre("The bundle org.b may not name members of the group org.a.documents, which is org.a's"));
}

}  // namespace
}  // namespace docuvend::linux_platform
