#include "platform/linux/bundles/GroupMembership.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

ParsedBundle named(const std::string& identifier) {
  ParsedBundle parsed;
  parsed.bundle.identifier = identifier;
  return parsed;
}

TEST(GroupMembership, TheLongestBeginningOwnsAGroup) {
  const std::vector<ParsedBundle> bundles = {named("org.a"), named("org.a.b"), named("org.a.bc"), named("org")};
  struct Case {
    std::string group;
    std::string owner;
  };
  for (const auto& [group, owner] : std::vector<Case>{{"org.a", "org.a"},
                                                      {"org.a.documents", "org.a"},
                                                      {"org.a.b.documents", "org.a.b"},
                                                      {"org.a.bc", "org.a.bc"},
                                                      {"org.z", "org"}}) {
    const auto* found = ownerOfGroup(group, bundles);
    ASSERT_NE(found, nullptr) << group;
    EXPECT_EQ(found->bundle.identifier, owner) << group;
  }
  EXPECT_EQ(ownerOfGroup("group.org.a", bundles), nullptr);
  EXPECT_EQ(ownerOfGroup("organ", bundles), nullptr);
}

TEST(GroupMembership, OnlyTheOwnerAndWhomItNamesBelong) {
  auto owner = named("org.a");
  owner.groupMembers["org.a.one"] = {"org.friend"};
  auto stranger = named("org.stranger");
  stranger.groupMembers["org.a.one"] = {"org.stranger"};
  const std::vector<ParsedBundle> bundles = {owner, stranger, named("org.friend")};
  EXPECT_TRUE(mayBelongToGroup("org.a", "org.a.one", bundles));
  EXPECT_TRUE(mayBelongToGroup("org.friend", "org.a.one", bundles));
  EXPECT_FALSE(mayBelongToGroup("org.friend", "org.a.two", bundles));
  EXPECT_FALSE(mayBelongToGroup("org.stranger", "org.a.one", bundles));
  EXPECT_FALSE(mayBelongToGroup("org.a", "com.b", bundles));
}

}  // namespace
}  // namespace docuvend::linux_platform
