#include "tools/docuvendctl/WholeFile.h"

#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <optional>
#include <utility>
#include <variant>

#include "platform/linux/files/FileReplacer.h"
#include "sdk/ConsumerErrors.h"
#include "tools/docuvendctl/Copy.h"

namespace docuvend::ctl {
namespace {

using linux_platform::FileReplacer;
using linux_platform::UniqueDescriptor;

constexpr mode_t kPermissions = 07777;
constexpr mode_t kOfNewFiles = 0666;  // what the process's mask leaves of them

Failure refusalOf(const struct stat& status, const std::string& path) {
  if (S_ISREG(status.st_mode)) return std::nullopt;
  const int error = S_ISLNK(status.st_mode) ? ELOOP : S_ISDIR(status.st_mode) ? EISDIR : EINVAL;
  return QXError::system(error, path + " is no regular file");
}

mode_t maskedForNewFiles() {
  const mode_t mask = ::umask(0);
  ::umask(mask);
  return kOfNewFiles & ~mask;
}

}  // namespace

Result<QXDescriptor> openWholeFile(const std::string& path) {
  struct stat status {};
  UniqueDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (!file || ::fstat(file.get(), &status) != 0) return QXError::system(errno, "cannot open " + path);
  if (auto refusal = refusalOf(status, path)) return *std::move(refusal);
  return linux_platform::toValue(std::move(file));
}

Failure replaceWholeFile(const CoordinatedAccess& access, int contents) {
  const std::string path = access.url().fileSystemPath();
  struct stat status {};
  mode_t mode = maskedForNewFiles();
  if (::lstat(path.c_str(), &status) == 0) {
    if (auto refusal = refusalOf(status, path)) return refusal;
    mode = status.st_mode & kPermissions;
  } else if (errno != ENOENT) {
    return QXError::system(errno, "cannot replace " + path);
  }
  auto begun = FileReplacer::begin(path);
  if (auto* error = std::get_if<QXError>(&begun)) return std::move(*error);
  auto& replacer = std::get<FileReplacer>(begun);
  if (auto failure = copyAll(contents, replacer.descriptor())) return failure;
  if (::fchmod(replacer.descriptor(), mode) != 0) return QXError::system(errno, "cannot set the permissions of the new " + path);
  if (!access.isHeld()) return makeConsumerError(ConsumerErrorCode::connectionLost, "The turn at the file was lost.");
  return replacer.commit();
}

Result<UniqueDescriptor> temporaryFile() {
  const char* directory = ::getenv("TMPDIR");
  std::string name = std::string(directory != nullptr && directory[0] == '/' ? directory : "/tmp") + "/docuvendctl-XXXXXX";
  UniqueDescriptor file(::mkostemp(name.data(), O_CLOEXEC));
  if (!file || ::unlink(name.c_str()) != 0) return QXError::system(errno, "cannot make a temporary file");
  return file;
}

}  // namespace docuvend::ctl
