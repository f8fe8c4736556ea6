#include "platform/fake/FakeFileSystem.h"

#include <cerrno>
#include <filesystem>

namespace docuvend::fake_platform {
namespace {

std::string normal(const std::string& path) {
  std::string text = std::filesystem::path(path).lexically_normal().string();
  while (text.size() > 1 && text.back() == '/') text.pop_back();
  return text;
}

std::string parentOf(const std::string& path) { return std::filesystem::path(path).parent_path().string(); }

bool isBelow(const std::string& directory, const std::string& path) {
  const std::string prefix = directory == "/" ? directory : directory + "/";
  return path.size() > prefix.size() && path.starts_with(prefix);
}

}  // namespace

FakeFileSystem::FakeFileSystem() : home_("/home/fake") { add(home_, Kind::directory); }

std::string FakeFileSystem::homeDirectory() {
  const std::lock_guard lock(mutex_);
  return home_;
}

bool FakeFileSystem::exists(const std::string& path) {
  const std::lock_guard lock(mutex_);
  calls_.push_back("exists " + path);
  return entries_.contains(normal(path));
}

std::optional<QXError> FakeFileSystem::createDirectory(const std::string& path) {
  const std::lock_guard lock(mutex_);
  calls_.push_back("createDirectory " + path);
  if (createDirectoryError_) return createDirectoryError_;
  const std::string wanted = normal(path);
  for (std::string at = wanted; at != "/"; at = parentOf(at)) {
    const auto found = entries_.find(at);
    if (found == entries_.end() || found->second == Kind::directory) continue;
    return QXError::system(at == wanted ? EEXIST : ENOTDIR, "cannot create " + path);
  }
  add(wanted, Kind::directory);
  return std::nullopt;
}

FakeFileSystem::RelationshipAnswer FakeFileSystem::relationship(const QXURL& directory, const QXURL& item) {
  const std::lock_guard lock(mutex_);
  calls_.push_back("relationship " + directory.absoluteString() + " " + item.absoluteString());
  if (const auto found = relationships_.find({directory, item}); found != relationships_.end()) return found->second;
  if (const auto found = relationshipErrors_.find(directory); found != relationshipErrors_.end()) return found->second;
  const std::string directoryPath = normal(directory.fileSystemPath());
  const auto entry = entries_.find(directoryPath);
  if (entry == entries_.end()) return noSuchDirectory(directory);
  if (entry->second != Kind::directory) return QXError::system(ENOTDIR, "cannot examine " + directoryPath);
  const std::string itemPath = normal(item.fileSystemPath());
  if (itemPath == directoryPath) return QXRelationship::same;
  return isBelow(directoryPath, itemPath) ? QXRelationship::contains : QXRelationship::other;
}

void FakeFileSystem::addFile(const std::string& path) {
  const std::lock_guard lock(mutex_);
  add(normal(path), Kind::file);
}

void FakeFileSystem::addDirectory(const std::string& path) {
  const std::lock_guard lock(mutex_);
  add(normal(path), Kind::directory);
}

void FakeFileSystem::remove(const std::string& path) {
  const std::lock_guard lock(mutex_);
  const std::string gone = normal(path);
  std::erase_if(entries_, [&gone](const auto& entry) { return entry.first == gone || isBelow(gone, entry.first); });
}

bool FakeFileSystem::isFile(const std::string& path) const { return isOfKind(path, Kind::file); }

bool FakeFileSystem::isDirectory(const std::string& path) const { return isOfKind(path, Kind::directory); }

bool FakeFileSystem::isOfKind(const std::string& path, Kind kind) const {
  const std::lock_guard lock(mutex_);
  const auto found = entries_.find(normal(path));
  return found != entries_.end() && found->second == kind;
}

void FakeFileSystem::setHomeDirectory(std::string path) {
  const std::lock_guard lock(mutex_);
  home_ = std::move(path);
  add(normal(home_), Kind::directory);
}

void FakeFileSystem::setCreateDirectoryError(std::optional<QXError> error) {
  const std::lock_guard lock(mutex_);
  createDirectoryError_ = std::move(error);
}

void FakeFileSystem::setRelationship(const QXURL& directory, const QXURL& item, RelationshipAnswer answer) {
  const std::lock_guard lock(mutex_);
  relationships_.insert_or_assign({directory, item}, std::move(answer));
}

void FakeFileSystem::setRelationshipError(const QXURL& directory, QXError error) {
  const std::lock_guard lock(mutex_);
  relationshipErrors_.insert_or_assign(directory, std::move(error));
}

QXError FakeFileSystem::noSuchDirectory(const QXURL& directory) {
  QXError error = QXError::make(kQXGeneralErrorDomain, kQXFileReadNoSuchFileError, "The directory does not exist.");
  error.url = directory;
  return error;
}

std::vector<std::string> FakeFileSystem::calls() const {
  const std::lock_guard lock(mutex_);
  return calls_;
}

void FakeFileSystem::forgetCalls() {
  const std::lock_guard lock(mutex_);
  calls_.clear();
}

void FakeFileSystem::add(const std::string& path, Kind kind) {
  entries_.insert_or_assign(path, kind);
  for (std::string at = path; at != "/";) {
    at = parentOf(at);
    entries_.insert_or_assign(at, Kind::directory);
  }
}

}  // namespace docuvend::fake_platform
