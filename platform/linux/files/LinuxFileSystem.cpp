#include "platform/linux/files/LinuxFileSystem.h"

#include <sys/stat.h>

#include <cerrno>

#include "platform/linux/files/FilePlace.h"

namespace docuvend::linux_platform {
namespace {

constexpr mode_t kDefaultMode = 0777;  // the process's mask takes its share

QXError noSuchDirectory(const QXURL& directory) {
  QXError error = QXError::make(kQXGeneralErrorDomain, kQXFileReadNoSuchFileError, "The directory does not exist.");
  error.url = directory;
  return error;
}

QXError systemError(int error, const QXURL& url) {
  QXError made = QXError::system(error, "cannot examine " + url.fileSystemPath());
  made.url = url;
  return made;
}

bool isDirectory(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

}  // namespace

bool LinuxFileSystem::exists(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0;
}

std::optional<QXError> LinuxFileSystem::createDirectory(const std::string& path) {
  if (!path.starts_with('/')) return QXError::system(EINVAL, "cannot create \"" + path + "\"");
  for (std::size_t end = 0; end != std::string::npos;) {
    end = path.find('/', end + 1);
    const std::string prefix = path.substr(0, end);
    if (::mkdir(prefix.c_str(), kDefaultMode) == 0) continue;
    const int error = errno;
    if (!isDirectory(prefix))
      return QXError::system(end == std::string::npos || error != EEXIST ? error : ENOTDIR, "cannot create " + path);
  }
  return std::nullopt;
}

std::variant<QXRelationship, QXError> LinuxFileSystem::relationship(const QXURL& directory, const QXURL& item) {
  // Whoever may write beside a directory of documents could make it a link to somebody else's, which would be his then.
  const auto directoryPlace = FilePlace::ofDirectory(directory.fileSystemPath(), LastLink::refused);
  if (const int* error = std::get_if<int>(&directoryPlace)) {
    return *error == ENOENT ? noSuchDirectory(directory) : systemError(*error, directory);
  }
  const auto itemPlace = FilePlace::ofItem(item.fileSystemPath());
  if (const int* error = std::get_if<int>(&itemPlace)) return systemError(*error, item);
  const auto& above = std::get<FilePlace>(directoryPlace);
  const auto& place = std::get<FilePlace>(itemPlace);
  // Who owns a link on the way can lead it elsewhere at once: what holds for such a name holds for a moment.
  if (!place.isNamedBy(item.fileSystemPath())) return QXRelationship::other;
  if (place == above) return QXRelationship::same;
  return place.isBelow(above) ? QXRelationship::contains : QXRelationship::other;
}

}  // namespace docuvend::linux_platform
