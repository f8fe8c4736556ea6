// What accesses to a file are counted by: its directory, whatever that is called, and its name there. Saving a file exchanges the file, not
// its key. The name is not followed when it is a symbolic link.
#pragma once

#include <compare>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/linux/sandbox/Resolution.h"

namespace docuvend::linux_platform {

struct FileKey {
  ObjectIdentity directory;
  std::string name;

  friend auto operator<=>(const FileKey&, const FileKey&) = default;

  // The file need not be there, but its directory must: else the error of the system. A directory has a key like a file, with or without a
  // final slash; "/" has none.
  [[nodiscard]] static std::variant<FileKey, QXError> of(const QXURL& url);
};

}  // namespace docuvend::linux_platform
