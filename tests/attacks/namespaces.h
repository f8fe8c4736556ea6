// Namespaces of one's own, as any process may make them that is not confined, and the processes in them.
#pragma once

#include <fcntl.h>
#include <poll.h>
#include <sched.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <string>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/base/pidfd.h"

namespace docuvend::tests {

// Puts the calling process, which has one thread, into new namespaces: `kinds` are CLONE_NEWUSER and more. It keeps its user's number
// there. False with errno.
inline bool enterNamespaces(int kinds) {
  const std::string user = std::to_string(::geteuid());
  const std::string group = std::to_string(::getegid());
  if (::unshare(kinds) != 0) return false;
  const std::array<std::pair<const char*, std::string>, 3> files = {{{"/proc/self/setgroups", "deny"},
                                                                     {"/proc/self/uid_map", user + " " + user + " 1"},
                                                                     {"/proc/self/gid_map", group + " " + group + " 1"}}};
  for (const auto& [path, text] : files) {
    const linux_platform::UniqueDescriptor file(::open(path, O_WRONLY | O_CLOEXEC));
    if (::write(file.get(), text.data(), text.size()) < 0) return false;
  }
  return true;
}

[[nodiscard]] inline linux_platform::UniqueDescriptor openSelf() { return linux_platform::openPidfd(::getpid()); }

inline void awaitProcess(const linux_platform::UniqueDescriptor& process) {
  pollfd waiting{process.get(), POLLIN, 0};
  while (::poll(&waiting, 1, -1) < 0 && errno == EINTR) {
  }
}

}  // namespace docuvend::tests
