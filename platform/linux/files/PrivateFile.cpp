#include "platform/linux/files/PrivateFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/files/FileReplacer.h"

namespace docuvend::linux_platform {
namespace {

constexpr unsigned kPermissionBits = 07777;
constexpr unsigned kOwnerReadWrite = 0600;

}  // namespace

std::variant<std::string, QXError> readPrivateFile(const std::string& path, std::size_t maximumLength) {
  const UniqueDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (!file) return QXError::system(errno, "cannot open " + path);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return QXError::system(errno, "cannot examine " + path);
  if (!S_ISREG(status.st_mode)) return QXError::system(EINVAL, path + " is not a regular file");
  if (status.st_uid != ::geteuid()) return QXError::system(EPERM, path + " belongs to another user");
  if ((status.st_mode & kPermissionBits) != kOwnerReadWrite) return QXError::system(EPERM, path + " must have mode 600");
  if (status.st_nlink != 1) return QXError::system(EPERM, path + " must have one link");
  if (status.st_size > static_cast<off_t>(maximumLength)) return QXError::system(EFBIG, path + " is too long");
  std::string contents(static_cast<std::size_t>(status.st_size), '\0');
  std::size_t length = 0;
  while (length < contents.size()) {
    const ssize_t got = ::pread(file.get(), contents.data() + length, contents.size() - length, static_cast<off_t>(length));
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) return QXError::system(got < 0 ? errno : EIO, "cannot read " + path);
    length += static_cast<std::size_t>(got);
  }
  return contents;
}

std::optional<QXError> writePrivateFile(const std::string& path, std::string_view contents) {
  auto begun = FileReplacer::begin(path);
  if (auto* error = std::get_if<QXError>(&begun)) return std::move(*error);
  auto& replacer = std::get<FileReplacer>(begun);
  // Whatever the process's mask took away.
  if (::fchmod(replacer.descriptor(), kOwnerReadWrite) != 0) return QXError::system(errno, "cannot set the mode of the new " + path);
  if (auto error = replacer.write(contents)) return error;
  return replacer.commit();
}

}  // namespace docuvend::linux_platform
