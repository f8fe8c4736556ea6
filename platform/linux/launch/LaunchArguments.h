// The two command lines of a launch, as functions of values: what bubblewrap builds, and what docuvend-confine takes away inside it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/Sanitizers.h"
#include "platform/linux/launch/ConfinedLaunch.h"
#include "platform/linux/launch/HostLayout.h"
#include "platform/linux/launch/policy/ConfinePolicy.h"

namespace docuvend::linux_platform {

// Threads count as processes. The kernel counts them per user and user namespace (from 5.14 on), so this is one extension's own number.
inline constexpr std::uint64_t kExtensionProcesses = 256;
// The same of one launch of an application. They count as the user's all the same, so it is never more than half of what the user who
// launches may have: one application leaves room for the daemon and its extensions.
inline constexpr std::uint64_t kApplicationProcesses = 1024;
// The first Landlock level of a kernel that counts so; below it no limit is set, for it would count all of the user's processes.
inline constexpr int kProcessLimitLevel = 2;
// Private writable memory of each process of an extension (RLIMIT_DATA: an address-space limit would count files that it maps). A build
// with a memory sanitizer reserves terabytes of it at the start of every process, so there is none then.
inline constexpr std::optional<std::uint64_t> kExtensionMemory =
    kSanitized ? std::nullopt : std::optional<std::uint64_t>(std::uint64_t{4} << 30U);

// Descriptors of each process of an extension. The kernel counts those that lie in sockets unread for all of a user's processes together,
// and refuses to pass more on to whoever's own limit is below that number. This one is below what every login gives the daemon, so an
// extension that hoards descriptors cannot keep the daemon from handing out files.
inline constexpr std::uint64_t kExtensionOpenFiles = 512;
// The same of an application, and never more than half of what the user may give a process, which the daemon takes. All applications
// together leave no more than this unread (and what they send at the same moment), since whoever is at his limit may send no more.
inline constexpr std::uint64_t kApplicationOpenFiles = 4096;

// Signals and timers that a launch may have pending. The kernel counts them for the user, in whatever confinement they are, so it is never
// more than half of what the user who launches may have, of an extension's launch too: on a small machine that is fewer.
inline constexpr std::uint64_t kConfinedPendingSignals = 4096;

// Bytes that a launch may lock into memory. Shared memory that is locked, and what a socket sends without copying it, the kernel counts for
// the user as well, so this too is never more than half. It is room enough for a library that keeps its secrets out of the swap.
inline constexpr std::uint64_t kConfinedLockedMemory = std::uint64_t{1} << 20U;

// Where docuvend-confine is found inside.
inline constexpr const char* kHelperPath = "/.docuvend-confine";

// A launch whose directories exist; every path is absolute and free of links.
struct LaunchSubject {
  LaunchKind kind = LaunchKind::application;
  std::string bundleDirectory;
  std::string executable;
  std::vector<std::string> arguments;  // for the executable
  std::string container;
  std::vector<std::string> groups;
  std::string publicSockets;      // for an application
  int descriptionDescriptor = 0;  // where bubblewrap reads the description
};

[[nodiscard]] ConfinePolicy confinePolicy(const LaunchSubject& subject, const HostLayout& host);
[[nodiscard]] std::vector<std::string> launchArguments(const LaunchSubject& subject, const HostLayout& host);

}  // namespace docuvend::linux_platform
