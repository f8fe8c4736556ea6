#include "platform/linux/files/StraightURL.h"

#include <string>
#include <variant>

#include "platform/linux/files/FilePlace.h"

namespace docuvend::linux_platform {

QXURL straightURL(const QXURL& url) {
  const std::string path = url.fileSystemPath();
  const auto found = FilePlace::ofItem(path);
  const auto* place = std::get_if<FilePlace>(&found);
  if (place == nullptr) return url;
  const std::string straight = place->path();
  if (straight == path || !qxIsValidUTF8(straight)) return url;
  return QXURL::fileURL(straight, url.hasDirectoryPath() ? QXURLKind::directory : QXURLKind::file);
}

bool leadsBelow(const QXURL& straight, const std::string& directory) {
  const auto place = FilePlace::ofDirectory(directory);
  const auto* above = std::get_if<FilePlace>(&place);
  return above != nullptr && FilePlace{straight.fileSystemPath(), {}}.isBelow(*above);
}

}  // namespace docuvend::linux_platform
