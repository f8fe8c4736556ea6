// Which bundle belongs to which group.
//
// A group has one owner: the bundle that is recorded, or, as long as none is, the one that the group's name begins with. To it belong the
// owner, while it is installed, and the bundles that the owner's QXGroupMembers names for that group.
#pragma once

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/linux/bundles/BundleParser.h"
#include "platform/linux/bundles/GroupOwners.h"

namespace docuvend::linux_platform {

// Of the bundles whose identifier and a dot begin the group's name, a bundle of the system's before one of the user's, and then the one
// with the longest identifier; null when there is none.
[[nodiscard]] const ParsedBundle* ownerByName(const std::string& group, const std::vector<ParsedBundle>& bundles);

// Both outlive it. `bundles` has each identifier once.
class GroupMembership {
 public:
  struct Admission {
    std::string owner;
    bool isRecorded;  // that it is the owner
  };
  struct Refusal {
    enum class Reason { noOwner, anothers, unknownOwner };
    Reason reason;
    std::string text;  // a sentence without its full stop
  };

  using Answer = std::variant<Admission, Refusal>;

  GroupMembership(const std::vector<ParsedBundle>& bundles, const GroupOwners& owners) : bundles_(bundles), owners_(owners) {}

  // Whether the bundle, which is one of them or about to be, may have the group's container.
  [[nodiscard]] Answer admit(const std::string& identifier, const std::string& group) const;

  // For each group of others whose members the bundle wants to name, a sentence without its full stop.
  [[nodiscard]] std::vector<std::string> foreignLists(const ParsedBundle& bundle) const;

 private:
  [[nodiscard]] std::variant<std::optional<Admission>, QXError> ownerOf(const std::string& group) const;
  [[nodiscard]] bool isNamed(const std::string& identifier, const std::string& group, const std::string& owner) const;

  const std::vector<ParsedBundle>& bundles_;
  const GroupOwners& owners_;
};

}  // namespace docuvend::linux_platform
