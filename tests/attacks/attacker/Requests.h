// What the attacker asks of the daemon, each request over a connection of its own, or over the one that was set aside for it.
#pragma once

#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/attacks/attacker/Acts.h"
#include "tests/attacks/told.h"

namespace docuvend::attacker {

using tests::told;

// Where a service of the daemon's listens, as this process's environment says.
[[nodiscard]] std::string publicSocket(const std::string& service);

// The next request goes over this connection, instead of one of its own.
void setAside(linux_platform::UniqueDescriptor connection);
[[nodiscard]] linux_platform::UniqueDescriptor takeSetAside();

// A connection made by a child of this process that has ended since; none when there is none.
[[nodiscard]] linux_platform::UniqueDescriptor connectionOfTheDead(const std::string& service);

[[nodiscard]] Acts requestActs();

}  // namespace docuvend::attacker
