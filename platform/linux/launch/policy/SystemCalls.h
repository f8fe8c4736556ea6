// What a confined process may not ask of the kernel at all: calls that reach what all processes of its user share, past the mounts and past
// Landlock, which know files. The filter is written out here and uses no library: it compares numbers for equality and nothing else, and
// what runs inside a confinement depends on little.
//
// The rest is left as it is. A filter that lists what is allowed would break programs that are newer than it, and this one is no wall
// against faults of the kernel. Each refusal is an error that programs know from kernels or file systems which lack the thing.
#pragma once

#include <optional>

#include "platform/QXError.h"
#include "platform/linux/launch/policy/ConfinePolicy.h"

namespace docuvend::linux_platform {

// Takes the calls from the calling thread and from all it starts later, for good. To be called while there is one thread. Also gives up
// gaining privileges by executing. An error (a kernel without filters) leaves them all open.
[[nodiscard]] std::optional<QXError> refuseSystemCalls(Leases leases);

}  // namespace docuvend::linux_platform
