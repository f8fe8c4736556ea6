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
};

// A file by its key, and by the one URL whose way to the file's directory has no link.
struct KeyedFile {
  FileKey key;
  QXURL url;

  // The file need not be there, but its directory must: else the error of the system. A directory has a key like a file, with or without a
  // final slash; "/" has none. EILSEQ: the directory's path is not UTF-8.
  [[nodiscard]] static std::variant<KeyedFile, QXError> of(const QXURL& url);

  // The same for that name in a directory that is open. `url` is what errors name, and says whether the name is a directory's.
  [[nodiscard]] static std::variant<KeyedFile, QXError> in(int directory, const std::string& name, const QXURL& url);

  // The URL still leads to the same directory without a link, and what has the name there, if anything, is no link. Who owns a directory on
  // the way can exchange it: what was found out about the URL before holds only where this is so afterwards.
  [[nodiscard]] bool isInPlace() const;
};

}  // namespace docuvend::linux_platform
