#include "platform/linux/coordination/FileKey.h"

#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "platform/linux/files/FilePlace.h"

namespace docuvend::linux_platform {
namespace {

QXError noDirectory(int error, const QXURL& url) {
  QXError made = QXError::system(error, "cannot find the directory of " + url.fileSystemPath());
  made.url = url;
  return made;
}

// "." and ".." are no names of anything.
bool endsInDots(const std::string& path) { return path.ends_with("/.") || path.ends_with("/.."); }

}  // namespace

std::variant<KeyedFile, QXError> KeyedFile::of(const QXURL& url) {
  std::string path = url.fileSystemPath();
  if (endsInDots(path)) {
    auto place = FilePlace::ofDirectory(path);
    if (const int* error = std::get_if<int>(&place)) return noDirectory(*error, url);
    path = std::get<FilePlace>(std::move(place)).existing;
  }
  if (path == "/") return noDirectory(EINVAL, url);
  const std::size_t slash = path.rfind('/');
  const OpenedPath opened = openDirectory(path.substr(0, slash + 1));
  if (const auto* failure = std::get_if<SystemFailure>(&opened)) return noDirectory(failure->code, url);
  const int directory = std::get<UniqueDescriptor>(opened).get();
  return in(directory, path.substr(slash + 1), url);
}

std::variant<KeyedFile, QXError> KeyedFile::in(int directory, const std::string& name, const QXURL& url) {
  const auto status = statusOf(directory);
  if (const auto* failure = std::get_if<SystemFailure>(&status)) return noDirectory(failure->code, url);
  auto straight = kernelPath(directory);
  if (!straight) return noDirectory(ENOENT, url);
  if (!qxIsValidUTF8(*straight)) return noDirectory(EILSEQ, url);
  if (*straight != "/") straight->append("/");
  const QXURLKind kind = url.hasDirectoryPath() ? QXURLKind::directory : QXURLKind::file;
  return KeyedFile{{std::get<ObjectStatus>(status).identity, name}, QXURL::fileURL(straight->append(name), kind)};
}

bool KeyedFile::isInPlace() const {
  const auto again = of(url);
  const auto* now = std::get_if<KeyedFile>(&again);
  if (now == nullptr || now->key != key || now->url != url) return false;
  struct stat status {};
  return ::lstat(url.fileSystemPath().c_str(), &status) != 0 || !S_ISLNK(status.st_mode);
}

}  // namespace docuvend::linux_platform
