// Which installed bundles are extensions of a kind, and which are still the ones they were.
#pragma once

#include "platform/extension_host.h"
#include "platform/linux/bundles/Bundle.h"

namespace docuvend::linux_platform {

// True when the bundle's dictionary "QXExtension" holds every attribute with exactly that string.
[[nodiscard]] bool hasAttributes(const Bundle& bundle, const QXExtensionHost::Attributes& attributes);

// True when nothing has been installed, updated or decided anew between the two: a process started from one is as good as from the other.
[[nodiscard]] bool isSameInstallation(const Bundle& a, const Bundle& b);

// True when the bundle that is installed now is in the place of the one before, and a process that was started from that has nothing which
// this one has not: the container and the entitlements are the same, and it is still in all of its groups.
[[nodiscard]] bool isSuccessor(const Bundle& before, const Bundle& now);

}  // namespace docuvend::linux_platform
