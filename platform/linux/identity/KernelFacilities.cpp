#include "platform/linux/identity/KernelFacilities.h"

#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <array>

#include "platform/linux/base/PassedDescriptors.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/base/kernel.h"
#include "platform/linux/base/pidfd.h"
#include "platform/linux/identity/ProcessReading.h"
#include "platform/linux/launch/policy/Landlock.h"

namespace docuvend::linux_platform {
namespace {

constexpr long kPidFileSystem = 0x50494446;

bool probeRefusedDescriptors() {
  const UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return socket && refusePassedDescriptors(socket.get());
}

bool probePeerPidfd() {
  std::array<int, 2> ends{};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) return false;
  const UniqueDescriptor one(ends[0]);
  const UniqueDescriptor other(ends[1]);
  int number = -1;
  socklen_t size = sizeof(number);
  if (::getsockopt(one.get(), SOL_SOCKET, SO_PEERPIDFD, &number, &size) != 0) return false;
  const UniqueDescriptor pidfd(number);
  return true;
}

std::string describeConfinement(int level) {
  if (level < 1) return "The kernel has no Landlock: no application and no extension can be started.";
  const std::string name = "Landlock level " + std::to_string(level) + ": ";
  if (level >= kLandlockScopesLevel) return name + "files, abstract sockets and signals are closed to confined processes.";
  const std::string rest = "; applications have no network, and an extension can reach abstract sockets.";
  if (level >= kLandlockTruncateLevel) return name + "files are closed to confined processes" + rest;
  return name + "files are closed to confined processes, truncation by the mount namespace alone" + rest;
}

}  // namespace

KernelFacilities KernelFacilities::probe() {
  KernelFacilities facilities;
  facilities.peerPidfd = probePeerPidfd();
  facilities.refusedDescriptors = probeRefusedDescriptors();
  facilities.landlockLevel = docuvend::linux_platform::landlockLevel();
  const UniqueDescriptor self = openPidfd(::getpid());
  if (!self) return facilities;
  const UniqueDescriptor mountNamespace(::ioctl(self.get(), kernel::kPidfdGetMountNamespace, 0));
  facilities.pidfdNamespaces = static_cast<bool>(mountNamespace);
  struct statfs status {};
  facilities.uniquePidfdInodes = ::fstatfs(self.get(), &status) == 0 && status.f_type == kPidFileSystem;
  return facilities;
}

ProtectionLevels protectionLevels(const KernelFacilities& facilities) {
  ProtectionLevels levels;
  levels.peers = facilities.peerPidfd
                     ? "Peers are known by the process that connected."
                     : "Peers are known by process number: one that ends before it is looked at can be mistaken for the next "
                       "with its number.";
  levels.namespaces = facilities.pidfdNamespaces ? "Namespaces are read from the process itself."
                                                 : "Namespaces are read by process number, and the process is seen alive afterwards.";
  levels.tokens = facilities.uniquePidfdInodes
                      ? "Audit tokens never repeat while the machine runs."
                      : "Audit tokens hold start times: two processes with one number within one clock tick share one.";
  levels.descriptors = facilities.refusedDescriptors
                           ? "Descriptors that processes send are refused."
                           : "Descriptors that processes send are closed here: one whose closing takes long keeps a thread busy.";
  levels.confinement = describeConfinement(facilities.landlockLevel);
  return levels;
}

}  // namespace docuvend::linux_platform
