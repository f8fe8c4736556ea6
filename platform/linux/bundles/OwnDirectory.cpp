#include "platform/linux/bundles/OwnDirectory.h"

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <memory>

namespace docuvend::linux_platform {
namespace {

constexpr mode_t kOwnerOnly = 0700;
constexpr mode_t kWritableByOthers = S_IWGRP | S_IWOTH;
constexpr uid_t kRoot = 0;

QXError failure(const std::string& what) { return QXError::system(errno, what); }

}  // namespace

std::variant<std::string, QXError> makeOwnDirectory(const std::string& path) {
  for (std::size_t slash = path.find('/', 1);; slash = path.find('/', slash + 1)) {
    const std::string prefix = path.substr(0, slash);
    if (::mkdir(prefix.c_str(), kOwnerOnly) != 0 && errno != EEXIST && ::access(prefix.c_str(), F_OK) != 0) {
      return failure("cannot create " + prefix);
    }
    if (slash == std::string::npos) break;
  }
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return failure("cannot examine " + path);
  if (!S_ISDIR(status.st_mode)) return QXError::system(ENOTDIR, path + " is no directory");
  if (status.st_uid != ::geteuid()) return QXError::system(EPERM, path + " belongs to another user");
  const std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr), &std::free);
  if (!resolved) return failure("cannot resolve " + path);
  return std::string(resolved.get());
}

std::optional<std::string_view> distrust(const struct stat& status, TrustedOwner owner) {
  const bool isTrusted = status.st_uid == ::geteuid() || (owner == TrustedOwner::thisUserOrRoot && status.st_uid == kRoot);
  if (!isTrusted) return "belongs to another user";
  if ((status.st_mode & kWritableByOthers) != 0 && !S_ISLNK(status.st_mode)) return "can be written by others";
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
