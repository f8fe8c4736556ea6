// How a bundle's process is started so that it is confined and recognised.
//
// The process tree: bubblewrap (own user, mount, process and IPC namespaces, new session, no capabilities, cleared environment, no further
// user namespaces) runs docuvend-confine (applies Landlock and an extension's limits), which runs the bundle's executable. A read-only
// description at the root of the mount namespace names the bundle, which of those that had its name it is, and this launch. The network
// stays the host's; where the kernel's Landlock leaves abstract sockets open, an application gets none. docs/confinement.md says what is
// closed against whom.
#pragma once

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/QXError.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/Bundle.h"

namespace docuvend::linux_platform {

enum class LaunchKind {
  application,  // sees the public sockets; terminal and working directory are the launcher's business
  extension,    // sees no socket but the one that it inherits
};

// Ready to execute: a program, its arguments and the descriptors that it must inherit under exactly these numbers.
struct LaunchPlan {
  std::vector<std::string> arguments;    // [0] is the absolute path of the program to execute
  std::vector<std::string> environment;  // the whole of it, "NAME=value"
  struct Inherited {
    int number;  // as the child must see it
    UniqueDescriptor descriptor;
  };
  std::vector<Inherited> inherited;  // besides 0, 1 and 2; everything else is closed
};

// Makes the containers that the bundle needs (mode 700) and the plan. Fails with a clear error when bubblewrap is missing, the kernel has
// no Landlock, a directory cannot be made, or the caller is root.
[[nodiscard]] std::variant<LaunchPlan, QXError> planLaunch(const Bundle& bundle, const std::vector<std::string>& arguments, LaunchKind kind,
                                                           std::optional<UniqueDescriptor> extensionSocket, const Paths& paths);

// Executes the plan in this process; returns only on failure.
[[nodiscard]] QXError execute(LaunchPlan plan);

}  // namespace docuvend::linux_platform
