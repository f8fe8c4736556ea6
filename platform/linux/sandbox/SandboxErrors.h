// Every error of the sandbox service is made here.
#pragma once

#include <string>

#include "platform/QXError.h"
#include "platform/linux/sandbox/GroupContainers.h"
#include "platform/linux/wire/SandboxProtocol.h"

namespace docuvend::linux_platform {

[[nodiscard]] QXError sandboxError(SandboxErrorCode code, std::string description);

// What the system's refusal means for a client that wants the file.
[[nodiscard]] QXError sandboxErrorFor(SystemFailure failure, const std::string& attempt);

// A path that a good token names, but that does not name a file of the right kind any more.
[[nodiscard]] QXError sandboxErrorFor(PathRefusal refusal);

}  // namespace docuvend::linux_platform
