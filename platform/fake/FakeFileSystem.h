// Files and directories in memory.
//
// Differs from the real one:
//  - Paths are compared as texts once "." and ".." and doubled slashes are taken out of them; there are no links and no mounts.
//  - A relationship is the one scripted for that pair of URLs, else it follows from the two paths alone.
//  - Permissions, full disks and the like happen only when they are scripted.
//
// May be used from any thread.
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/file_system.h"

namespace docuvend::fake_platform {

class FakeFileSystem : public QXFileSystem {
 public:
  using RelationshipAnswer = std::variant<QXRelationship, QXError>;

  // Only "/" and the home directory "/home/fake" are there.
  FakeFileSystem();

  std::string homeDirectory() override;
  bool exists(const std::string& path) override;
  std::optional<QXError> createDirectory(const std::string& path) override;
  RelationshipAnswer relationship(const QXURL& directory, const QXURL& item) override;

  // Puts a file or a directory there, with all directories above it.
  void addFile(const std::string& path);
  void addDirectory(const std::string& path);
  // Takes the path away, with everything below it.
  void remove(const std::string& path);
  // As `exists`, by type; not recorded as calls.
  [[nodiscard]] bool isFile(const std::string& path) const;
  [[nodiscard]] bool isDirectory(const std::string& path) const;
  void setHomeDirectory(std::string path);

  // Every creation fails with this error until none is set.
  void setCreateDirectoryError(std::optional<QXError> error);
  // Answers this pair of URLs, compared as texts, with this from now on.
  void setRelationship(const QXURL& directory, const QXURL& item, RelationshipAnswer answer);
  // Every question about this directory is answered with the error, whatever the item is.
  void setRelationshipError(const QXURL& directory, QXError error);

  // The error for a directory that is not there.
  [[nodiscard]] static QXError noSuchDirectory(const QXURL& directory);

  // What was asked, in order: "exists PATH", "createDirectory PATH", "relationship DIRECTORY-URL ITEM-URL".
  [[nodiscard]] std::vector<std::string> calls() const;
  void forgetCalls();

 private:
  enum class Kind { file, directory };

  void add(const std::string& path, Kind kind);
  [[nodiscard]] bool isOfKind(const std::string& path, Kind kind) const;

  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::string home_;
  std::map<std::string, Kind> entries_;
  std::optional<QXError> createDirectoryError_;
  std::map<std::pair<QXURL, QXURL>, RelationshipAnswer> relationships_;
  std::map<QXURL, QXError> relationshipErrors_;
  std::vector<std::string> calls_;
};

}  // namespace docuvend::fake_platform
