#include "platform/linux/base/Paths.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

namespace docuvend::linux_platform {
namespace {

constexpr unsigned kPermissionBits = 07777;
constexpr unsigned kOwnerOnly = 0700;

std::optional<QXError> checkPrivateDirectory(const std::string& path) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return QXError::system(errno, "cannot examine " + path);
  if (!S_ISDIR(status.st_mode)) return QXError::system(ENOTDIR, path);
  if (status.st_uid != ::geteuid()) return QXError::system(EPERM, path + " belongs to another user");
  if ((status.st_mode & kPermissionBits) != kOwnerOnly) return QXError::system(EPERM, path + " must have mode 700");
  return std::nullopt;
}

std::optional<QXError> makePrivateDirectory(const std::string& path) {
  if (::mkdir(path.c_str(), kOwnerOnly) != 0 && errno != EEXIST) return QXError::system(errno, "cannot create " + path);
  return checkPrivateDirectory(path);
}

std::variant<std::string, QXError> absoluteFromEnvironment(const char* name) {
  const char* value = std::getenv(name);
  if (value == nullptr || value[0] != '/') return QXError::system(EINVAL, std::string(name) + " is not set to an absolute path");
  return std::string(value);
}

}  // namespace

std::variant<Paths, QXError> Paths::fromEnvironment() {
  auto home = absoluteFromEnvironment("HOME");
  if (auto* error = std::get_if<QXError>(&home)) return *error;
  auto runtime = absoluteFromEnvironment("XDG_RUNTIME_DIR");
  if (auto* error = std::get_if<QXError>(&runtime)) return *error;
  if (auto error = checkPrivateDirectory(std::get<std::string>(runtime))) return *error;

  Paths paths;
  paths.home = std::get<std::string>(home);
  paths.systemBundles = "/usr/share/docuvend/bundles";
  const std::string share = paths.home + "/.local/share/docuvend";
  paths.userBundles = share + "/bundles";
  paths.containers = share + "/containers";
  paths.groupContainers = share + "/groups";
  paths.runtime = std::get<std::string>(runtime) + "/docuvend";
  paths.publicSockets = paths.runtime + "/public";
  paths.lockState = paths.runtime + "/lock-state";
  paths.tokenKey = paths.runtime + "/token-key";
  paths.tokenFloors = paths.runtime + "/token-floors";
  return paths;
}

std::optional<QXError> prepareRuntimeDirectories(const Paths& paths) {
  if (auto error = makePrivateDirectory(paths.runtime)) return error;
  return makePrivateDirectory(paths.publicSockets);
}

}  // namespace docuvend::linux_platform
