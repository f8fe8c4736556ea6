// The sockets that a service manager opened for this process before it started it (LISTEN_PID, LISTEN_FDS, LISTEN_FDNAMES).
#pragma once

#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

inline constexpr int kFirstActivatedDescriptor = 3;

struct ActivatedSocket {
  std::string name;  // what the manager calls it; may be empty
  std::string path;  // where it is bound; empty when that is no path
  UniqueDescriptor descriptor;
};

// Takes them over, close-on-exec, and removes the variables. To be called once, before this process has threads or opens anything. What is
// no listening Unix stream socket is closed, with one log line.
[[nodiscard]] std::vector<ActivatedSocket> takeActivatedSockets(QXLogHandle& log);

}  // namespace docuvend::linux_platform
