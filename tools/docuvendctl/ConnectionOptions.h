// How a command line wants its connections to be.
#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "sdk/Administrator.h"
#include "sdk/Consumer.h"

namespace docuvend::ctl {

// Without a deadline the libraries' own hold.
[[nodiscard]] Consumer::Options consumerOptions(const std::optional<std::string>& actAs, std::optional<std::chrono::milliseconds> deadline);
[[nodiscard]] Administrator::Options administratorOptions(std::optional<std::chrono::milliseconds> deadline);

}  // namespace docuvend::ctl
