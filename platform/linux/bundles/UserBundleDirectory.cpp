#include "platform/linux/bundles/UserBundleDirectory.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string_view>
#include <system_error>

#include "platform/linux/bundles/OwnDirectory.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

// Not the beginning of names that people give.
constexpr std::string_view kHiddenPrefix = ".docuvend-install-";

constexpr mode_t kNotWritableByOthers = 07755;

QXError failure(const std::string& what) { return QXError::system(errno, what); }

// The registry ignores a directory that others can write, as a lax mask may have left it.
std::optional<QXError> closeToOthers(const UniqueDescriptor& directory, const std::string& path) {
  struct stat status {};
  if (::fstat(directory.get(), &status) != 0) return failure("cannot examine " + path);
  if (status.st_uid != ::geteuid()) return QXError::system(EPERM, path + " belongs to another user");
  if (!distrust(status, TrustedOwner::thisUser)) return std::nullopt;
  if (::fchmod(directory.get(), status.st_mode & kNotWritableByOthers) != 0) return failure("cannot close " + path + " to others");
  return std::nullopt;
}

// A directory that its owner may not write can be removed only after he may.
void makeRemovable(const fs::path& path) {
  std::error_code ignored;
  if (fs::symlink_status(path, ignored).type() != fs::file_type::directory) return;
  fs::permissions(path, fs::perms::owner_all, fs::perm_options::add | fs::perm_options::nofollow, ignored);
  for (fs::directory_iterator entry(path, ignored), end; !ignored && entry != end; entry.increment(ignored)) makeRemovable(entry->path());
}

}  // namespace

std::variant<UserBundleDirectory, QXError> UserBundleDirectory::open(const Paths& paths, Absence absence) {
  std::error_code error;
  if (absence == Absence::isMended && !fs::exists(paths.userBundles, error)) {
    const auto made = makeOwnDirectory(paths.userBundles);
    if (const auto* failed = std::get_if<QXError>(&made)) return *failed;
  }
  const fs::path real = fs::canonical(paths.userBundles, error);
  if (error) return QXError::system(error.value(), "cannot find " + paths.userBundles);
  UniqueDescriptor directory(::open(real.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory) return failure("cannot open " + real.string());
  if (auto failed = closeToOthers(directory, real.string())) return *std::move(failed);
  while (::flock(directory.get(), LOCK_EX) != 0) {
    if (errno != EINTR) return failure("cannot lock " + real.string());
  }
  UserBundleDirectory result(real.string(), std::move(directory));
  result.clearLeftovers();
  return result;
}

std::variant<std::string, QXError> UserBundleDirectory::hiddenName() const {
  std::uint64_t number = 0;
  if (::getrandom(&number, sizeof(number), 0) != static_cast<ssize_t>(sizeof(number))) return failure("cannot get random bytes");
  return std::string(kHiddenPrefix) + std::to_string(number);
}

std::optional<QXError> UserBundleDirectory::rename(const std::string& from, const std::string& to) const {
  return renameWith(RENAME_NOREPLACE, from, to);
}

std::optional<QXError> UserBundleDirectory::exchange(const std::string& one, const std::string& other) const {
  return renameWith(RENAME_EXCHANGE, one, other);
}

std::optional<QXError> UserBundleDirectory::renameWith(unsigned flags, const std::string& from, const std::string& to) const {
  if (::renameat2(directory_.get(), from.c_str(), directory_.get(), to.c_str(), flags) != 0) {
    return failure("cannot rename " + from + " to " + to + " in " + path_);
  }
  if (::fsync(directory_.get()) != 0) return failure("cannot write " + path_ + " to disk");
  return std::nullopt;
}

void UserBundleDirectory::removeHidden(const std::string& name) const {
  const fs::path path = fs::path(path_) / name;
  makeRemovable(path);
  std::error_code ignored;
  fs::remove_all(path, ignored);
}

void UserBundleDirectory::clearLeftovers() const {
  std::error_code ignored;
  std::vector<std::string> leftovers;
  for (fs::directory_iterator entry(path_, ignored), end; !ignored && entry != end; entry.increment(ignored)) {
    const std::string name = entry->path().filename();
    if (name.starts_with(kHiddenPrefix)) leftovers.push_back(name);
  }
  for (const std::string& name : leftovers) removeHidden(name);
}

}  // namespace docuvend::linux_platform
