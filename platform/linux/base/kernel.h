// Kernel interfaces that are newer than the headers this program is built with. Values are the kernel's own.
#pragma once

#include <linux/ioctl.h>
#include <sys/socket.h>

#include <cstdint>

#ifndef SO_PEERPIDFD
#define SO_PEERPIDFD 77
#endif
#ifndef SO_PASSRIGHTS
#define SO_PASSRIGHTS 83
#endif

namespace docuvend::linux_platform::kernel {

// Requests on a pidfd.
inline constexpr unsigned long kPidfdGetMountNamespace = _IO(0xFF, 3);
inline constexpr unsigned long kPidfdGetUserNamespace = _IO(0xFF, 9);

// Requests on a namespace.
inline constexpr unsigned long kNamespaceGetOwner = _IO(0xb7, 1);
inline constexpr unsigned long kNamespaceGetParent = _IO(0xb7, 2);

// A command of fcntl: a lease on a directory or file under another name (6.19).
inline constexpr int kSetDelegation = 1024 + 16;

// Landlock rights and scopes above those of the 6.1 headers.
inline constexpr std::uint64_t kLandlockTruncate = 1ULL << 14U;
inline constexpr std::uint64_t kLandlockIoctlDevice = 1ULL << 15U;
inline constexpr std::uint64_t kLandlockScopeAbstractUnixSocket = 1ULL << 0U;
inline constexpr std::uint64_t kLandlockScopeSignal = 1ULL << 1U;

// The whole attribute of landlock_create_ruleset at level 6.
struct LandlockRulesetAttribute {
  std::uint64_t handledAccessFileSystem = 0;
  std::uint64_t handledAccessNetwork = 0;
  std::uint64_t scoped = 0;
};

}  // namespace docuvend::linux_platform::kernel
