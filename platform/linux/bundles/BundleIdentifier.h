// The form of bundle identifiers and group names, which are also names of directories and words on command lines.
#pragma once

#include <string>
#include <string_view>

namespace docuvend::linux_platform {

inline constexpr std::size_t kLongestIdentifier = 128;

// Parts of letters, digits and "-" joined by single dots, not beginning with "-", at most kLongestIdentifier bytes.
[[nodiscard]] bool isBundleIdentifier(std::string_view text);

// True when a well-formed identifier has a dot: a single word would be the name of everything that begins with it.
[[nodiscard]] bool hasSeveralParts(std::string_view identifier);

}  // namespace docuvend::linux_platform
