// Connections as a command line wants them.
#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <string>

#include "sdk/Administrator.h"
#include "sdk/Consumer.h"

namespace docuvend::ctl {

// Without a deadline the libraries' own hold.
using Deadline = std::optional<std::chrono::milliseconds>;

[[nodiscard]] Result<std::unique_ptr<Consumer>> connectConsumer(const std::optional<std::string>& actAs, Deadline deadline);
[[nodiscard]] Result<std::unique_ptr<Administrator>> connectAdministrator(Deadline deadline);

}  // namespace docuvend::ctl
