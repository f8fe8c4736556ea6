// All descriptors that this process may have, until the object goes.
#pragma once

#include <fcntl.h>
#include <sys/resource.h>

#include <stdexcept>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class UsedUpDescriptors {
 public:
  UsedUpDescriptors() {
    if (::getrlimit(RLIMIT_NOFILE, &usual_) != 0) throw std::runtime_error("no limit");
    rlimit few = usual_;
    few.rlim_cur = kFew;
    if (::setrlimit(RLIMIT_NOFILE, &few) != 0) throw std::runtime_error("the limit stays");
    for (;;) {
      UniqueDescriptor taken(::fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0));
      if (!taken) return;
      taken_.push_back(std::move(taken));
    }
  }
  UsedUpDescriptors(const UsedUpDescriptors&) = delete;
  UsedUpDescriptors& operator=(const UsedUpDescriptors&) = delete;
  ~UsedUpDescriptors() { ::setrlimit(RLIMIT_NOFILE, &usual_); }

 private:
  static constexpr rlim_t kFew = 256;

  rlimit usual_{};
  std::vector<UniqueDescriptor> taken_;
};

}  // namespace docuvend::linux_platform
