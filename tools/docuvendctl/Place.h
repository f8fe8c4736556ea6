// Where the machine's things lie, for commands that touch them without the daemon.
#pragma once

#include "platform/linux/base/Paths.h"
#include "sdk/Result.h"

namespace docuvend::ctl {

// An error from inside a confinement, which has a home of its own and a part of the run-time directory: what is written there would reach
// nobody.
[[nodiscard]] Result<linux_platform::Paths> unconfinedPaths();

}  // namespace docuvend::ctl
