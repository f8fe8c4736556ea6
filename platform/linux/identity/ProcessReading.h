// What the kernel says about one process: whether a launcher confined it, and as what.
#pragma once

#include <sys/types.h>

#include <cerrno>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/identity/KernelFacilities.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/launch/LaunchDescription.h"

namespace docuvend::linux_platform {

// True while the process has not ended.
[[nodiscard]] bool isAlive(const UniqueDescriptor& pidfd);

// Not confined: the reading found the process in this program's own user namespace.
struct ProcessReading {
  Standing standing = Standing::nobody;
  std::optional<LaunchDescription> description;  // present exactly when confined
  std::uint64_t serial = 0;                      // tells the process from others that had its number
};

// Why a process is nobody, in words.
struct Unread {
  std::string reason;
  bool isForWantOfDescriptors = false;  // of this process or of the machine: it says nothing of the process that was looked at
};
// Whether errno's value says that.
[[nodiscard]] inline bool isWantOfDescriptors(int errnoValue) { return errnoValue == EMFILE || errnoValue == ENFILE; }

// `pidfd` holds the process; everything read by its number counts only if the process is still alive when all has been read.
[[nodiscard]] std::variant<ProcessReading, Unread> readProcess(pid_t pid, const UniqueDescriptor& pidfd,
                                                               const KernelFacilities& facilities);

}  // namespace docuvend::linux_platform
