// What --help prints.
#pragma once

#include <string>

#include "sdk/Result.h"
#include "tools/docuvendctl/CommandTable.h"

namespace docuvend::ctl {

// Of all commands when the name is empty, of several when it is the first word of them. A usage error when there is none.
[[nodiscard]] Result<std::string> helpText(const CommandTable& table, const std::string& name);

}  // namespace docuvend::ctl
