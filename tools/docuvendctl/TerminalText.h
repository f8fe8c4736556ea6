// An answer as a person reads it on a terminal.
#pragma once

#include <cstddef>
#include <string>

#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// Columns aligned below their names, shortened with an ellipsis where the terminal is too narrow; a record's values whole. Whatever would
// steer the terminal is made visible. Of a file's contents there is no text.
[[nodiscard]] std::string terminalText(const Answer& answer, std::size_t width);

}  // namespace docuvend::ctl
