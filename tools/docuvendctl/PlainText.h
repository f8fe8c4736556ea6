// An answer as text for scripts, which is stable.
#pragma once

#include <string>

#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// A list is one line for each row, its values with tabs between them; a record is one line for each field, its name, a tab, its value or
// values. So that a value can forge neither line nor column, backslash, tab, line feed and carriage return in it are written "\\", "\t",
// "\n" and "\r". A line's text and a page stay as they are. Nothing is left out or cut. Of a file's contents there is no text.
[[nodiscard]] std::string plainText(const Answer& answer);

}  // namespace docuvend::ctl
