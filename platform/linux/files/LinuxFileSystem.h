// Files and directories of this machine. Without state of its own; may be used from any thread.
//
// A relationship is read off the kernel's names of the two places (see the source). One place seen through a bind mount elsewhere is
// another place. A directory that is itself a link is none. An item that is named through a link lies elsewhere, wherever the link leads
// (StraightURL.h). A missing directory is reported as such wherever the kernel knows of it without waiting; while somebody keeps the place
// locked in which it would be looked for, an item that does not lie in that place is answered for at once, as one that lies elsewhere or
// leads nowhere. Errors other than the missing directory are of the system's domain, with the errno value.
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "platform/file_system.h"
#include "platform/linux/base/Paths.h"

namespace docuvend::linux_platform {

class LinuxFileSystem : public QXFileSystem {
 public:
  explicit LinuxFileSystem(const Paths& paths) : home_(paths.home) {}

  std::string homeDirectory() override { return home_; }
  bool exists(const std::string& path) override;
  std::optional<QXError> createDirectory(const std::string& path) override;
  std::variant<QXRelationship, QXError> relationship(const QXURL& directory, const QXURL& item) override;

 private:
  const std::string home_;
};

}  // namespace docuvend::linux_platform
