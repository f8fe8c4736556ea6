// Remembers whose each group is, so that its container never comes to another owner by what is installed later.
//
// A record is a small file of the user's (mode 600) named like the group, in a directory that no confined process sees; its text is the
// owner's identifier and a newline. It is made once and never changed. Whoever can remove it, an unconfined process, gives the group free
// again. May be used from any thread and from several processes at once.
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

class GroupOwners {
 public:
  // The directory's path, absolute; it is made with the first record.
  explicit GroupOwners(std::string directory) : directory_(std::move(directory)) {}

  // None: nothing is recorded. An error when there is a record and it cannot be told what it says. Groups are well-formed
  // (BundleIdentifier.h).
  [[nodiscard]] std::variant<std::optional<std::string>, QXError> ownerOf(const std::string& group) const;

  // Makes the record, on disk when this returns, unless there is one; the owner that is recorded then, who may be another.
  [[nodiscard]] std::variant<std::string, QXError> record(const std::string& group, const std::string& owner) const;

 private:
  [[nodiscard]] std::string fileOf(const std::string& group) const { return directory_ + "/" + group; }

  const std::string directory_;
};

}  // namespace docuvend::linux_platform
