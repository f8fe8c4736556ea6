// The kernel's Landlock, at whatever level it has.
#pragma once

#include <optional>
#include <vector>

#include "platform/QXError.h"
#include "platform/linux/launch/policy/ConfinePolicy.h"

namespace docuvend::linux_platform {

// From this level on it has a say over truncation; from this one over what is asked of devices.
inline constexpr int kLandlockTruncateLevel = 3;
inline constexpr int kLandlockDevicesLevel = 5;
// From this level on a confined process can no longer reach abstract sockets or send signals outside.
inline constexpr int kLandlockScopesLevel = 6;

// 0 when the kernel has none, or has it switched off.
[[nodiscard]] int landlockLevel();

// Takes from the calling thread, and from all it starts later, every access that no rule gives. To be called while there is one thread.
// Also gives up gaining privileges by executing. An error leaves the process as it was, or with fewer privileges.
[[nodiscard]] std::optional<QXError> restrictToRules(const std::vector<ConfinePolicy::Rule>& rules, int level);

}  // namespace docuvend::linux_platform
