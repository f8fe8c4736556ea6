#include "platform/linux/sandbox/Resolution.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>

namespace docuvend::linux_platform {
namespace {

// The kernel gives up on a walk that a rename may have led astray; whoever renames without end gets a refusal.
constexpr int kResolutionTries = 64;

OpenedPath resolve(int directory, const std::string& path, std::uint64_t flags, std::uint64_t restrictions) {
  if (path.find('\0') != std::string::npos) return SystemFailure{EINVAL};
  open_how how{};
  how.flags = flags | O_PATH | O_CLOEXEC;
  how.resolve = restrictions;
  for (int attempt = 0; attempt < kResolutionTries; ++attempt) {
    const long number = ::syscall(SYS_openat2, directory, path.c_str(), &how, sizeof how);
    if (number >= 0) return UniqueDescriptor(static_cast<int>(number));
    const bool isToBeTriedAgain = errno == EINTR || (errno == EAGAIN && (restrictions & RESOLVE_CACHED) == 0);
    if (!isToBeTriedAgain) return SystemFailure{errno};
  }
  return SystemFailure{EAGAIN};
}

}  // namespace

std::variant<ObjectStatus, SystemFailure> statusOf(int descriptor) {
  struct statx status {};
  if (::statx(descriptor, "", AT_EMPTY_PATH, STATX_BASIC_STATS | STATX_BTIME, &status) != 0) return SystemFailure{errno};
  ObjectStatus result;
  result.identity.device = makedev(status.stx_dev_major, status.stx_dev_minor);
  result.identity.inode = status.stx_ino;
  if ((status.stx_mask & STATX_BTIME) != 0) {
    result.identity.bornSeconds = status.stx_btime.tv_sec;
    result.identity.bornNanoseconds = status.stx_btime.tv_nsec;
  }
  result.mode = status.stx_mode;
  result.links = status.stx_nlink;
  return result;
}

OpenedPath openBeneath(int directory, const std::string& path, Expecting expecting, Lookup lookup) {
  constexpr std::uint64_t kBeneath = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS | RESOLVE_NO_XDEV;
  return resolve(directory, path, expecting == Expecting::directory ? O_DIRECTORY : 0,
                 lookup == Lookup::inCacheAlone ? kBeneath | RESOLVE_CACHED : kBeneath);
}

OpenedPath openInRoot(int root, const std::string& path, FinalLink finalLink) {
  return resolve(root, path, finalLink == FinalLink::itself ? O_NOFOLLOW : 0, RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS);
}

OpenedPath openDirectory(const std::string& path) {
  UniqueDescriptor directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!directory) return SystemFailure{errno};
  return directory;
}

std::optional<std::string> kernelPath(int descriptor) {
  std::array<char, PATH_MAX> buffer{};
  const ssize_t length = ::readlink(descriptorPath(descriptor).c_str(), buffer.data(), buffer.size());
  if (length <= 0 || length == static_cast<ssize_t>(buffer.size()) || buffer[0] != '/') return std::nullopt;
  return std::string(buffer.data(), static_cast<std::size_t>(length));
}

std::string descriptorPath(int descriptor) { return "/proc/self/fd/" + std::to_string(descriptor); }

bool liesBelow(const std::string& directory, const std::string& path) {
  return path.size() > directory.size() + 1 && path.starts_with(directory) && path[directory.size()] == '/';
}

}  // namespace docuvend::linux_platform
