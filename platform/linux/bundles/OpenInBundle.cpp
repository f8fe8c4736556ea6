#include "platform/linux/bundles/OpenInBundle.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>

#include <cerrno>

namespace docuvend::linux_platform {

UniqueDescriptor openInBundle(int bundle, const std::string& path, LinksOnTheWay links) {
  open_how how{};
  how.flags = O_PATH | O_CLOEXEC;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_MAGICLINKS;
  if (links == LinksOnTheWay::none) how.resolve |= RESOLVE_NO_SYMLINKS;
  UniqueDescriptor end;
  for (int walk = 0; walk < kMostWalks; ++walk) {
    end.reset(static_cast<int>(::syscall(SYS_openat2, bundle, path.c_str(), &how, sizeof(how))));
    if (end || errno != EAGAIN) break;
  }
  return end;
}

}  // namespace docuvend::linux_platform
