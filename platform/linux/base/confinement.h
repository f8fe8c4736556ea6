// What a confined process finds at its start, and where: the launcher puts it there, the libraries look for it.
#pragma once

namespace docuvend::linux_platform {

// The description that says who runs there, at the root of the confinement's file system.
inline constexpr const char* kDescriptionPath = "/.docuvend-info";
// The number under which an extension finds its connection to the daemon.
inline constexpr int kExtensionSocketNumber = 3;

}  // namespace docuvend::linux_platform
