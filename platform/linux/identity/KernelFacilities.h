// What this machine's kernel can do for identity and confinement, and what is still guaranteed when it cannot.
#pragma once

#include <string>

namespace docuvend::linux_platform {

struct KernelFacilities {
  bool peerPidfd = false;          // a socket tells its peer's pidfd (6.5)
  bool pidfdNamespaces = false;    // a pidfd tells its process's namespaces (6.11)
  bool uniquePidfdInodes = false;  // a pidfd's inode is the process's own for as long as the machine runs (6.9)
  bool refusedDescriptors = false;  // a socket takes no descriptors (6.16)
  int landlockLevel = 0;

  [[nodiscard]] static KernelFacilities probe();
};

// One sentence each, for the start-up log.
struct ProtectionLevels {
  std::string peers;
  std::string namespaces;
  std::string tokens;
  std::string descriptors;
  std::string confinement;
};

[[nodiscard]] ProtectionLevels protectionLevels(const KernelFacilities& facilities);

}  // namespace docuvend::linux_platform
