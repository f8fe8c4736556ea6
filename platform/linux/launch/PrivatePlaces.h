// Whether what the confinement hides lies where it shows everything.
//
// A launch shows the system's directories whole. A home below one of them would be shown with them, whoever it belongs to.
#pragma once

#include <optional>
#include <string>

#include "platform/linux/base/Paths.h"
#include "platform/linux/launch/HostLayout.h"

namespace docuvend::linux_platform {

// None when all is well, else a sentence about the first of the user's directories that every application would see. The home, what lies
// below it, and the run-time directory are looked at; the system's bundles are everybody's to see.
[[nodiscard]] std::optional<std::string> exposedPlace(const HostLayout& host, const Paths& paths);

}  // namespace docuvend::linux_platform
