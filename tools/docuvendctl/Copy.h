// Moving bytes between descriptors.
#pragma once

#include <string_view>

#include "sdk/Result.h"

namespace docuvend::ctl {

// All of the text.
[[nodiscard]] Failure writeAll(int to, std::string_view text);

// Copies what is left of one file to another.
[[nodiscard]] Failure copyAll(int from, int to);

// The same, as Base64 text without line ends.
[[nodiscard]] Failure copyAllAsBase64(int from, int to);

}  // namespace docuvend::ctl
