#include "platform/linux/bundles/GroupMembership.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Reason = GroupMembership::Refusal::Reason;

ParsedBundle named(const std::string& identifier) {
  ParsedBundle parsed;
  parsed.bundle.identifier = identifier;
  return parsed;
}

// Empty when the bundle may belong to the group.
std::string textOf(const std::optional<GroupMembership::Refusal>& refusal) { return refusal ? refusal->text : ""; }

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
  EXPECT_EQ(textOf(membership.refusal("org.friend", "org.a.two")),
            "The bundle org.friend may not belong to the group org.a.two, which is org.a's");
  const auto refusal = membership.refusal("org.stranger", "org.a.one");
  EXPECT_EQ(textOf(refusal), "The bundle org.stranger may not belong to the group org.a.one, which is org.a's");
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
  EXPECT_EQ(textOf(refusal),
            "The bundle org.a may not belong to the group documents, which is nobody's: a group's name is its owner's identifier and one "
            "part more");
  EXPECT_EQ(refusal->reason, Reason::nobodys);
  EXPECT_THAT(GroupMembership::foreignLists(bundle),
              ElementsAre("The bundle org.a may not name members of the group documents, which is nobody's: a group's name is its owner's "
                          "identifier and one part more"));
}

TEST(GroupMembership, OnlyTheOwnerNamesMembers) {
  auto owner = named("org.a");
  owner.groupMembers["org.a.documents"] = {"org.c"};
  auto other = named("org.b");
  other.groupMembers["org.a.documents"] = {"org.c"};
  other.groupMembers["org.b.documents"] = {"org.c"};
  EXPECT_THAT(GroupMembership::foreignLists(owner), IsEmpty());
  EXPECT_THAT(GroupMembership::foreignLists(other),
              ElementsAre("The bundle org.b may not name members of the group org.a.documents, which is org.a's"));
}

}  // namespace
}  // namespace docuvend::linux_platform
