// What is known of a terminal.
#pragma once

#include <cstddef>

namespace docuvend::ctl {

[[nodiscard]] bool isTerminal(int descriptor);

// Its columns, at least 2; 80 when it does not say.
[[nodiscard]] std::size_t terminalWidth(int descriptor);

}  // namespace docuvend::ctl
