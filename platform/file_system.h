// Files and directories, as the daemon asks about them.
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/QXURL.h"

namespace docuvend {

// How a directory and an item lie to each other; the values are the platform's.
enum class QXRelationship { contains = 0, same = 1, other = 2 };

class QXFileSystem {
 public:
  QXFileSystem() = default;
  QXFileSystem(const QXFileSystem&) = delete;
  QXFileSystem& operator=(const QXFileSystem&) = delete;
  virtual ~QXFileSystem() = default;

  // Absolute path of the daemon's user's home directory.
  [[nodiscard]] virtual std::string homeDirectory() = 0;
  // True when anything is there, of whatever type.
  [[nodiscard]] virtual bool exists(const std::string& path) = 0;
  // With missing intermediate directories and default attributes. None: done.
  [[nodiscard]] virtual std::optional<QXError> createDirectory(const std::string& path) = 0;
  // The file system's own view, not a comparison of texts: links are followed, and an item that does not exist yet is placed by its
  // deepest existing ancestor. A missing directory is kQXFileReadNoSuchFileError naming the directory's URL.
  [[nodiscard]] virtual std::variant<QXRelationship, QXError> relationship(const QXURL& directory, const QXURL& item) = 0;
};

}  // namespace docuvend
