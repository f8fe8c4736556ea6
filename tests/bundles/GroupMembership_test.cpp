#include "platform/linux/bundles/GroupMembership.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::Field;
using ::testing::IsEmpty;
using Reason = GroupMembership::Refusal::Reason;

ParsedBundle named(const std::string& identifier) {
  ParsedBundle parsed;
  parsed.bundle.identifier = identifier;
  return parsed;
}

// Empty when the bundle may belong to the group.
std::string whoseOf(const std::optional<GroupMembership::Refusal>& refusal) { return refusal ? refusal->whose : ""; }

auto isList(const std::string& group, const std::string& whose) {
  return AllOf(Field(&GroupMembership::ForeignList::group, group), Field(&GroupMembership::ForeignList::whose, whose));
}

TEST(GroupMembership, TheNameTellsTheOneThatCanOwnAGroup) {
  EXPECT_EQ(ownerOfGroup("org.a.documents"), "org.a");
  EXPECT_EQ(ownerOfGroup("org.a.b.documents"), "org.a.b");
  EXPECT_EQ(ownerOfGroup("org.a.b"), "org.a");
  EXPECT_EQ(ownerOfGroup("org.a"), std::nullopt) << "its owner would have a single part";
  EXPECT_EQ(ownerOfGroup("documents"), std::nullopt);
}

TEST(GroupMembership, OnlyTheOwnerAndWhomItNamesBelong) {
  auto owner = named("org.a");
  owner.groupMembers["org.a.one"] = {"org.friend"};
  auto stranger = named("org.stranger");
  stranger.groupMembers["org.a.one"] = {"org.stranger"};
  const std::vector<ParsedBundle> bundles = {owner, stranger, named("org.friend")};
  const GroupMembership membership(bundles);
  EXPECT_FALSE(membership.refusal("org.a", "org.a.one"));
  EXPECT_FALSE(membership.refusal("org.friend", "org.a.one"));
  EXPECT_EQ(whoseOf(membership.refusal("org.friend", "org.a.two")), "which is org.a's");
  const auto refusal = membership.refusal("org.stranger", "org.a.one");
  EXPECT_EQ(whoseOf(refusal), "which is org.a's");
  EXPECT_EQ(refusal->reason, Reason::anothers);
}

TEST(GroupMembership, NeitherAShorterBeginningNorALongerOneNorTheWholeNameOwnsAGroup) {
  const std::string group = "org.a.b.documents";
  for (const std::string& identifier : {std::string("org.a"), std::string("org.a.b.documents"), std::string("org.a.b.documents.x"),
                                        std::string("org.a.bc"), std::string("org.a.b.document")}) {
    auto claimant = named(identifier);
    claimant.groupMembers[group] = {"org.a.b", identifier};
    const std::vector<ParsedBundle> alone = {claimant};
    const auto before = GroupMembership(alone).refusal(identifier, group);
    ASSERT_TRUE(before) << identifier;
    EXPECT_EQ(before->reason, Reason::ownerIsMissing);
    const std::vector<ParsedBundle> both = {claimant, named("org.a.b")};
    const auto after = GroupMembership(both).refusal(identifier, group);
    ASSERT_TRUE(after) << identifier;
    EXPECT_EQ(after->reason, Reason::anothers);
    EXPECT_FALSE(GroupMembership(both).refusal("org.a.b", group));
  }
}

TEST(GroupMembership, AGroupThatNobodyCanOwnHasNoMembers) {
  auto bundle = named("org.a");
  bundle.groupMembers["documents"] = {"org.a"};
  const std::vector<ParsedBundle> bundles = {bundle};
  const auto refusal = GroupMembership(bundles).refusal("org.a", "documents");
  const std::string whose = "which is nobody's: a group's name is its owner's identifier and one part more";
  EXPECT_EQ(whoseOf(refusal), whose);
  EXPECT_EQ(refusal->reason, Reason::nobodys);
  EXPECT_THAT(GroupMembership::foreignLists(bundle), ElementsAre(isList("documents", whose)));
}

TEST(GroupMembership, OnlyTheOwnerNamesMembers) {
  auto owner = named("org.a");
  owner.groupMembers["org.a.documents"] = {"org.c"};
  auto other = named("org.b");
  other.groupMembers["org.a.documents"] = {"org.c"};
  other.groupMembers["org.b.documents"] = {"org.c"};
  EXPECT_THAT(GroupMembership::foreignLists(owner), IsEmpty());
  EXPECT_THAT(GroupMembership::foreignLists(other), ElementsAre(isList("org.a.documents", "which is org.a's")));
}

}  // namespace
}  // namespace docuvend::linux_platform
