// A mount namespace belongs to the user namespace in which it was made, for ever. The launcher's confinement makes both at once as a child
// of the launcher's user namespace, so: owned by a child of ours, made by somebody who was not confined. A process inside has no
// capability with which to make another, to mount over the description or to change its root. A deeper owner means that somebody inside a
// confinement made it; its description says nothing.
//
// Numbers of namespaces are given again as soon as one ends, so they are compared only while descriptors hold the namespaces.
#include "platform/linux/identity/ProcessReading.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <string_view>
#include <system_error>

#include "platform/linux/base/confinement.h"
#include "platform/linux/base/kernel.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kLongestProcessStatus = 4096;
constexpr int kStartTimeField = 22;  // counted from 1; the process's name, in parentheses, is the second

Unread unread(const std::string& what) {
  const int errnoValue = errno;
  return {what + ": " + std::system_category().message(errnoValue), isWantOfDescriptors(errnoValue)};
}

std::string processPath(pid_t pid, std::string_view entry) { return "/proc/" + std::to_string(pid) + "/" + std::string(entry); }

bool isSameObject(const UniqueDescriptor& one, const UniqueDescriptor& other) {
  struct stat a {};
  struct stat b {};
  return ::fstat(one.get(), &a) == 0 && ::fstat(other.get(), &b) == 0 && a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

// At most `limit` bytes; none when there are more, or when reading fails.
std::optional<std::string> readWhole(const UniqueDescriptor& file, std::size_t limit) {
  std::string text(limit + 1, '\0');
  std::size_t length = 0;
  while (length < text.size()) {
    const ssize_t count = ::read(file.get(), text.data() + length, text.size() - length);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return std::nullopt;
    if (count == 0) break;
    length += static_cast<std::size_t>(count);
  }
  if (length > limit) return std::nullopt;
  text.resize(length);
  return text;
}

UniqueDescriptor openMountNamespace(pid_t pid, const UniqueDescriptor& pidfd, const KernelFacilities& facilities) {
  if (facilities.pidfdNamespaces) return UniqueDescriptor(::ioctl(pidfd.get(), kernel::kPidfdGetMountNamespace, 0));
  return UniqueDescriptor(::open(processPath(pid, "ns/mnt").c_str(), O_RDONLY | O_CLOEXEC));
}

std::variant<Standing, Unread> readStanding(pid_t pid, const UniqueDescriptor& pidfd, const KernelFacilities& facilities) {
  const UniqueDescriptor own(::open("/proc/self/ns/user", O_RDONLY | O_CLOEXEC));
  if (!own) return unread("cannot open the own user namespace");
  const UniqueDescriptor mounts = openMountNamespace(pid, pidfd, facilities);
  if (!mounts) return unread("cannot open its mount namespace");
  const UniqueDescriptor owner(::ioctl(mounts.get(), kernel::kNamespaceGetOwner));
  if (!owner) return unread("cannot open the owner of its mount namespace");
  if (isSameObject(owner, own)) return Standing::unconfined;
  const UniqueDescriptor parent(::ioctl(owner.get(), kernel::kNamespaceGetParent));
  if (!parent) return unread("cannot open the parent of the owner of its mount namespace");
  if (isSameObject(parent, own)) return Standing::confined;
  return Unread{"its mount namespace was made inside a confinement"};
}

std::variant<LaunchDescription, Unread> readDescription(pid_t pid) {
  const UniqueDescriptor root(::open(processPath(pid, "root").c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!root) return unread("cannot open its root");
  struct statx status {};
  if (::statx(root.get(), "", AT_EMPTY_PATH, STATX_TYPE, &status) != 0) return unread("cannot examine its root");
  if ((status.stx_attributes & status.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) == 0) return Unread{"its root is not that of a mount"};

  open_how how{};
  how.flags = O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  how.resolve = RESOLVE_IN_ROOT | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  const UniqueDescriptor file(static_cast<int>(::syscall(SYS_openat2, root.get(), kDescriptionPath, &how, sizeof(how))));
  struct stat fileStatus {};
  if (!file || ::fstat(file.get(), &fileStatus) != 0) return unread("cannot open its description");
  if (!S_ISREG(fileStatus.st_mode)) return Unread{"its description is not a regular file"};
  const auto text = readWhole(file, kLongestDescription);
  if (!text) return Unread{"its description cannot be read, or is too long"};
  auto description = parseDescription(*text);
  if (!description) return Unread{"its description is malformed"};
  return std::move(*description);
}

// The process's name may hold anything, but the last parenthesis is the one that ends it.
std::optional<std::uint64_t> readStartTime(pid_t pid) {
  const UniqueDescriptor file(::open(processPath(pid, "stat").c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) return std::nullopt;
  const auto text = readWhole(file, kLongestProcessStatus);
  if (!text) return std::nullopt;
  std::size_t place = text->rfind(')');
  for (int field = 2; field < kStartTimeField && place != std::string::npos; ++field) place = text->find(' ', place + 1);
  if (place == std::string::npos) return std::nullopt;
  std::uint64_t ticks = 0;
  if (std::from_chars(text->data() + place + 1, text->data() + text->size(), ticks).ec != std::errc()) return std::nullopt;
  return ticks;
}

std::optional<std::uint64_t> readSerial(pid_t pid, const UniqueDescriptor& pidfd, const KernelFacilities& facilities) {
  if (!facilities.uniquePidfdInodes) return readStartTime(pid);
  struct stat status {};
  if (::fstat(pidfd.get(), &status) != 0) return std::nullopt;
  return status.st_ino;
}

}  // namespace

bool isAlive(const UniqueDescriptor& pidfd) {
  pollfd waiting{pidfd.get(), POLLIN, 0};
  return pidfd && ::poll(&waiting, 1, 0) == 0;
}

std::variant<ProcessReading, Unread> readProcess(pid_t pid, const UniqueDescriptor& pidfd, const KernelFacilities& facilities) {
  ProcessReading reading;
  const auto serial = readSerial(pid, pidfd, facilities);
  if (!serial) return unread("cannot tell it from others of its number");
  reading.serial = *serial;
  auto standing = readStanding(pid, pidfd, facilities);
  if (auto* reason = std::get_if<Unread>(&standing)) return std::move(*reason);
  reading.standing = std::get<Standing>(standing);
  if (reading.standing == Standing::confined) {
    auto description = readDescription(pid);
    if (auto* reason = std::get_if<Unread>(&description)) return std::move(*reason);
    reading.description = std::get<LaunchDescription>(std::move(description));
  }
  if (!isAlive(pidfd)) return Unread{"it has ended"};
  return reading;
}

}  // namespace docuvend::linux_platform
