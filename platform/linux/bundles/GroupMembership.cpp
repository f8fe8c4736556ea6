#include "platform/linux/bundles/GroupMembership.h"

#include <algorithm>
#include <utility>

#include "platform/linux/bundles/BundleIdentifier.h"

namespace docuvend::linux_platform {
namespace {

std::string whose(const std::optional<std::string>& owner) {
  return owner ? "which is " + *owner + "'s" : "which is nobody's: a group's name is its owner's identifier and one part more";
}

bool names(const ParsedBundle& owner, const std::string& identifier, const std::string& group) {
  const auto members = owner.groupMembers.find(group);
  return members != owner.groupMembers.end() &&
         std::find(members->second.begin(), members->second.end(), identifier) != members->second.end();
}

}  // namespace

std::optional<std::string> ownerOfGroup(std::string_view group) {
  const auto owner = group.substr(0, group.rfind('.'));
  if (owner.size() == group.size() || !hasSeveralParts(owner)) return std::nullopt;
  return std::string(owner);
}

std::optional<GroupMembership::Refusal> GroupMembership::refusal(const std::string& identifier, const std::string& group) const {
  const auto owner = ownerOfGroup(group);
  if (owner == identifier) return std::nullopt;
  if (!owner) return Refusal{Refusal::Reason::nobodys, whose(owner)};
  const auto manifest =
      std::find_if(bundles_.begin(), bundles_.end(), [&owner](const ParsedBundle& parsed) { return parsed.bundle.identifier == *owner; });
  if (manifest == bundles_.end()) return Refusal{Refusal::Reason::ownerIsMissing, whose(owner)};
  if (names(*manifest, identifier, group)) return std::nullopt;
  return Refusal{Refusal::Reason::anothers, whose(owner)};
}

std::vector<GroupMembership::ForeignList> GroupMembership::foreignLists(const ParsedBundle& bundle) {
  std::vector<ForeignList> lists;
  for (const auto& [group, members] : bundle.groupMembers) {
    const auto owner = ownerOfGroup(group);
    if (owner != bundle.bundle.identifier) lists.push_back({group, whose(owner)});
  }
  return lists;
}

}  // namespace docuvend::linux_platform
