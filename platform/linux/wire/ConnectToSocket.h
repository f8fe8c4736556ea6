// The way of a client to a named service.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// Connects to a named service's socket. Waits while the service has more clients waiting than it can queue; with EAGAIN no longer than
// that.
[[nodiscard]] std::variant<UniqueDescriptor, QXError> connectToSocket(const std::string& path,
                                                                      std::optional<std::chrono::milliseconds> patience = std::nullopt);

}  // namespace docuvend::linux_platform
