// What providers have left behind: their documents stay when they are uninstalled, and so do the placeholders among them, which nobody
// fills any more.
#pragma once

#include <utility>

#include "platform/QXURL.h"
#include "platform/file_system.h"
#include "platform/linux/coordination/FileKey.h"

namespace docuvend::linux_platform {

class Remnants {
 public:
  // The file system outlives it. The directory has one directory for each group; it need not be there.
  Remnants(QXFileSystem& fileSystem, QXURL groupContainers) : fileSystem_(fileSystem), groupContainers_(std::move(groupContainers)) {}

  // Of a file of nobody's: it lies where a provider keeps its items, is not empty, and has nothing on the disk. A file of which a part was
  // brought is not told from a document with a hole in it.
  [[nodiscard]] bool hasPlaceholder(const KeyedFile& file) const;

 private:
  [[nodiscard]] bool isInStorage(const QXURL& file) const;

  QXFileSystem& fileSystem_;
  const QXURL groupContainers_;
};

}  // namespace docuvend::linux_platform
