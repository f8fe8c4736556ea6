// Which bundle belongs to which group.
//
// A group has one owner, which its name tells: the bundle whose identifier is the name without its last part. No other can become it, in
// whatever order bundles are installed and removed. To the group belong the owner, while it is installed, and the bundles that the owner's
// QXGroupMembers names for that group.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/bundles/BundleParser.h"

namespace docuvend::linux_platform {

// The identifier of the owner of a group of that well-formed name; none when no bundle can have it.
[[nodiscard]] std::optional<std::string> ownerOfGroup(std::string_view group);

// The bundles outlive it; each identifier is there once.
class GroupMembership {
 public:
  struct Refusal {
    enum class Reason { nobodys, ownerIsMissing, anothers };
    Reason reason;
    std::string whose;  // goes on after the group's name
  };

  explicit GroupMembership(const std::vector<ParsedBundle>& bundles) : bundles_(bundles) {}

  // Why the bundle, which is one of them or about to be, may not have the group's container; none when it may.
  [[nodiscard]] std::optional<Refusal> refusal(const std::string& identifier, const std::string& group) const;

  struct ForeignList {
    std::string group;
    std::string whose;  // goes on after the group's name
  };
  // The groups whose members the bundle wants to name without being their owner.
  [[nodiscard]] static std::vector<ForeignList> foreignLists(const ParsedBundle& bundle);

 private:
  const std::vector<ParsedBundle>& bundles_;
};

}  // namespace docuvend::linux_platform
