// Ends a confined process with all that it has started.
#pragma once

#include "platform/linux/extension_host/ProcessSpawner.h"

namespace docuvend::linux_platform {

// The process must not have been reaped, nor be reaped by another thread meanwhile; it is left to be reaped. Waits no longer than the
// kernel takes to deliver a signal.
void endProcessTree(const SpawnedProcess& process);

}  // namespace docuvend::linux_platform
