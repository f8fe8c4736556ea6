// The commands: each asks one thing of the daemon through the consumer library.
#pragma once

#include <string>

#include "tools/docuvendctl/CommandLine.h"
#include "tools/docuvendctl/Outcome.h"

namespace docuvend::ctl {

[[nodiscard]] std::string helpText();

// Prints the result on the standard output, or one line on the standard error.
[[nodiscard]] ExitStatus runCommand(const CommandLine& line);

}  // namespace docuvend::ctl
