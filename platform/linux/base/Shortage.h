// When a failed call says nothing of what it was about.
#pragma once

#include <cerrno>

namespace docuvend::linux_platform {

// It is this process, or the machine, that has no descriptor or no memory left.
[[nodiscard]] inline bool isShortage(int error) { return error == EMFILE || error == ENFILE || error == ENOMEM; }

}  // namespace docuvend::linux_platform
