// The system's calls on pidfds, which the C library's header declares without C linkage in the versions that this is built with.
#pragma once

#include <sys/syscall.h>
#include <sys/types.h>
#include <unistd.h>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// Close-on-exec, as the kernel makes them. No descriptor: errno says why.
[[nodiscard]] inline UniqueDescriptor openPidfd(pid_t number) {
  return UniqueDescriptor(static_cast<int>(syscall(SYS_pidfd_open, number, 0)));
}

// A process that is gone cannot be signalled, which is just as well.
inline void signalPidfd(const UniqueDescriptor& process, int signal) {
  static_cast<void>(syscall(SYS_pidfd_send_signal, process.get(), signal, nullptr, 0));
}

}  // namespace docuvend::linux_platform
