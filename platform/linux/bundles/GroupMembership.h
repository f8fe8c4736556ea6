// Which bundle belongs to which group.
#pragma once

#include <string>
#include <vector>

#include "platform/linux/bundles/BundleParser.h"

namespace docuvend::linux_platform {

// The owner of a group is the bundle whose identifier is the group's name or its longest beginning that ends before a dot; null when
// there is none.
[[nodiscard]] const ParsedBundle* ownerOfGroup(const std::string& group, const std::vector<ParsedBundle>& bundles);

// True for the owner and for the bundles that the owner's QXGroupMembers names for that group.
[[nodiscard]] bool mayBelongToGroup(const std::string& identifier, const std::string& group, const std::vector<ParsedBundle>& bundles);

}  // namespace docuvend::linux_platform
