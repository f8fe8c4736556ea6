// Descriptors that are sent over a socket. Nobody has a reason to send the daemon one, and whoever holds the last one of a file closes it:
// that takes as long as its sender likes, when the file is a socket that lingers.
#pragma once

#include <sys/socket.h>

#include "platform/linux/base/kernel.h"

namespace docuvend::linux_platform {

// From now on the kernel refuses, to whoever sends one, to pass a descriptor to this socket or to those that it accepts. What was sent
// before stays. False when the kernel cannot (before 6.16).
[[nodiscard]] inline bool refusePassedDescriptors(int socket) {
  const int isPassed = 0;
  return ::setsockopt(socket, SOL_SOCKET, SO_PASSRIGHTS, &isPassed, sizeof isPassed) == 0;
}

}  // namespace docuvend::linux_platform
