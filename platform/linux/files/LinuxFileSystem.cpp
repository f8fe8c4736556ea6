// Looking at a directory without waiting for its neighbours
//
// Whoever may write beside a directory of documents can take it away and then keep the place locked, so that a name that is not in the
// kernel's cache is waited for. The directory is therefore looked for in the cache first. Where that does not tell, the item is placed, and
// the place beside the directory: of a group, that is its container, whose own name nobody confined can change or lock. A directory that is
// no link lies where its name says, so an item that is not below that place is not in the directory either, whether there is one or not.
// Only the questions about what lies there wait with it.

#include "platform/linux/files/LinuxFileSystem.h"

#include <sys/stat.h>

#include <cerrno>
#include <optional>
#include <utility>

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

// Where the last name of the absolute path is looked up. None when that name is none of a thing that lies there.
std::optional<FilePlace> placeAround(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  const std::string name = path.substr(slash + 1);
  if (name.empty() || name == "." || name == "..") return std::nullopt;
  auto found = FilePlace::ofDirectory(path.substr(0, slash + 1));
  auto* place = std::get_if<FilePlace>(&found);
  if (place == nullptr) return std::nullopt;
  return std::move(*place);
}

bool isUnknown(const FilePlace::Result& place) {
  const int* error = std::get_if<int>(&place);
  return error != nullptr && *error == EAGAIN;
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
  const std::string directoryPath = directory.fileSystemPath();
  // Whoever may write beside a directory of documents could make it a link to somebody else's, which would be his then.
  auto directoryPlace = FilePlace::ofDirectory(directoryPath, LastLink::refused, Lookup::inCacheAlone);
  std::optional<FilePlace::Result> itemPlace;
  if (isUnknown(directoryPlace)) {
    if (const auto around = placeAround(directoryPath)) {
      itemPlace = FilePlace::ofItem(item.fileSystemPath());
      if (const int* error = std::get_if<int>(&*itemPlace)) return systemError(*error, item);
      if (!std::get<FilePlace>(*itemPlace).isBelow(*around)) return QXRelationship::other;
    }
    directoryPlace = FilePlace::ofDirectory(directoryPath, LastLink::refused);
  }
  if (const int* error = std::get_if<int>(&directoryPlace)) {
    return *error == ENOENT ? noSuchDirectory(directory) : systemError(*error, directory);
  }
  if (!itemPlace) itemPlace = FilePlace::ofItem(item.fileSystemPath());
  if (const int* error = std::get_if<int>(&*itemPlace)) return systemError(*error, item);
  const auto& above = std::get<FilePlace>(directoryPlace);
  const auto& place = std::get<FilePlace>(*itemPlace);
  // Who owns a link on the way can lead it elsewhere at once: what holds for such a name holds for a moment.
  if (!place.isNamedBy(item.fileSystemPath())) return QXRelationship::other;
  if (place == above) return QXRelationship::same;
  return place.isBelow(above) ? QXRelationship::contains : QXRelationship::other;
}

}  // namespace docuvend::linux_platform
