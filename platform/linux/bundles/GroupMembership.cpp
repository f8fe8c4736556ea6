#include "platform/linux/bundles/GroupMembership.h"

#include <algorithm>

#include "platform/linux/bundles/BundleIdentifier.h"

namespace docuvend::linux_platform {

const ParsedBundle* ownerOfGroup(const std::string& group, const std::vector<ParsedBundle>& bundles) {
  const ParsedBundle* owner = nullptr;
  for (const auto& candidate : bundles) {
    if (!isBelowIdentifier(group, candidate.bundle.identifier)) continue;
    if (owner == nullptr || candidate.bundle.identifier.size() > owner->bundle.identifier.size()) owner = &candidate;
  }
  return owner;
}

bool mayBelongToGroup(const std::string& identifier, const std::string& group, const std::vector<ParsedBundle>& bundles) {
  const ParsedBundle* owner = ownerOfGroup(group, bundles);
  if (owner == nullptr) return false;
  if (owner->bundle.identifier == identifier) return true;
  const auto members = owner->groupMembers.find(group);
  return members != owner->groupMembers.end() &&
         std::find(members->second.begin(), members->second.end(), identifier) != members->second.end();
}

}  // namespace docuvend::linux_platform
