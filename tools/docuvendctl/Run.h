// One run of the program.
#pragma once

#include <string>
#include <vector>

#include "tools/docuvendctl/Outcome.h"

namespace docuvend::ctl {

// Does what the words ask for and prints the answer on the standard output, or one line on the standard error.
[[nodiscard]] ExitStatus run(const std::vector<std::string>& words);

}  // namespace docuvend::ctl
