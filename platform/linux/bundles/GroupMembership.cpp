#include "platform/linux/bundles/GroupMembership.h"

#include <algorithm>
#include <utility>

#include "platform/linux/bundles/BundleIdentifier.h"

namespace docuvend::linux_platform {
namespace {

bool comesBefore(const ParsedBundle& one, const ParsedBundle& other) {
  if (one.origin != other.origin) return one.origin == BundleOrigin::system;
  return one.bundle.identifier.size() > other.bundle.identifier.size();
}

}  // namespace

const ParsedBundle* ownerByName(const std::string& group, const std::vector<ParsedBundle>& bundles) {
  const ParsedBundle* owner = nullptr;
  for (const auto& candidate : bundles) {
    if (!isBelowIdentifier(group, candidate.bundle.identifier)) continue;
    if (owner == nullptr || comesBefore(candidate, *owner)) owner = &candidate;
  }
  return owner;
}

std::variant<std::optional<GroupMembership::Admission>, QXError> GroupMembership::ownerOf(const std::string& group) const {
  auto recorded = owners_.ownerOf(group);
  if (auto* error = std::get_if<QXError>(&recorded)) return std::move(*error);
  if (auto& owner = std::get<std::optional<std::string>>(recorded)) return Admission{*std::move(owner), /*isRecorded=*/true};
  const ParsedBundle* owner = ownerByName(group, bundles_);
  if (owner == nullptr) return std::nullopt;
  return Admission{owner->bundle.identifier, /*isRecorded=*/false};
}

bool GroupMembership::isNamed(const std::string& identifier, const std::string& group, const std::string& owner) const {
  const auto manifest =
      std::find_if(bundles_.begin(), bundles_.end(), [&owner](const ParsedBundle& parsed) { return parsed.bundle.identifier == owner; });
  if (manifest == bundles_.end()) return false;
  const auto members = manifest->groupMembers.find(group);
  return members != manifest->groupMembers.end() &&
         std::find(members->second.begin(), members->second.end(), identifier) != members->second.end();
}

GroupMembership::Answer GroupMembership::admit(const std::string& identifier, const std::string& group) const {
  auto found = ownerOf(group);
  if (const auto* error = std::get_if<QXError>(&found)) {
    return Refusal{Refusal::Reason::unknownOwner, "It is not known whose the group " + group + " is: " + error->description()};
  }
  std::string refusal = "The bundle " + identifier + " may not belong to the group " + group;
  auto& admission = std::get<std::optional<Admission>>(found);
  if (!admission) return Refusal{Refusal::Reason::noOwner, std::move(refusal)};
  const std::string& owner = admission->owner;
  if (owner == identifier || isNamed(identifier, group, owner)) return *std::move(admission);
  refusal += ", which is " + owner + "'s";
  return Refusal{Refusal::Reason::anothers, std::move(refusal)};
}

std::vector<std::string> GroupMembership::foreignLists(const ParsedBundle& bundle) const {
  const std::string& identifier = bundle.bundle.identifier;
  std::vector<std::string> lists;
  for (const auto& [group, members] : bundle.groupMembers) {
    const auto found = ownerOf(group);
    const auto* owner = std::get_if<std::optional<Admission>>(&found);
    if (owner == nullptr || !*owner || (*owner)->owner == identifier) continue;
    lists.push_back("The bundle " + identifier + " may not name members of the group " + group + ", which is " + (*owner)->owner + "'s");
  }
  return lists;
}

}  // namespace docuvend::linux_platform
