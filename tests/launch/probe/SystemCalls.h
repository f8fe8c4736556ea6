// System calls of the probe, each by a name of its own.
#pragma once

#include <string>

namespace docuvend::probe {

// "ok", or the name of errno's value; of a call that ends the process that makes it (a child's), the name of the signal. "unknown" of a
// name that is none, "another machine" of a call that this architecture does not have.
[[nodiscard]] std::string call(const std::string& name);

}  // namespace docuvend::probe
