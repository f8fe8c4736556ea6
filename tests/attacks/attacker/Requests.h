// What the attacker asks of the daemon, each request over a connection of its own, or over the one that was set aside for it.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {

// The domains and codes of an error and of what stands beneath it.
[[nodiscard]] std::string told(const QXError& error);
[[nodiscard]] std::string told(const std::optional<QXError>& error);

// Where a service of the daemon's listens, as this process's environment says.
[[nodiscard]] std::string publicSocket(const std::string& service);

// The next request goes over this connection, instead of one of its own.
void setAside(linux_platform::UniqueDescriptor connection);
[[nodiscard]] linux_platform::UniqueDescriptor takeSetAside();

[[nodiscard]] Acts requestActs();

}  // namespace docuvend::attacker
